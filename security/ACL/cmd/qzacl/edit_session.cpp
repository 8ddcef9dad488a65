// An editor on an ACL file. Questions go to standard error, answers come from standard input.
#include "edit_session.h"

#include "lock_file.h"
#include "output.h"
#include "replaced_file.h"
#include "text_edit.h"
#include "unified_diff.h"

#include <cerrno>
#include <cstdio>
#include <unistd.h>

namespace qzacl {

namespace {

// The first letter of the next line, or 'd' at the end of input and after a signal. Reads no byte after the line, since
// an editor may need it.
char read_answer() {
    char first = '\0';
    for (;;) {
        if (noted_signals::any())
            return 'd';
        char c = '\0';
        const ssize_t count = read(STDIN_FILENO, &c, 1);
        if (count < 0 && errno == EINTR)
            continue;
        if (count <= 0)
            return first == '\0' ? 'd' : first;
        if (c == '\n')
            return first;
        if (first == '\0' && c != ' ')
            first = c;
    }
}

} // namespace

edit_session::edit_session(edited_file &file, const permission_set &set, std::chrono::seconds wait)
    : file_(file), set_(set), wait_(wait), base_(file.text()), copy_(file.leaf(), base_) {}

bool edit_session::run() {
    for (;;) {
        copy_.edit();
        const std::string text = copy_.text();
        if (!noted_signals::any() && is_right(text) && (text == base_ || write(text)))
            return text != base_;
        if (!asks_to_go_on(text))
            throw trouble(file_.path() + " was not changed");
    }
}

bool edit_session::is_right(const std::string &text) const {
    try {
        check_text({file_.path(), text}, set_);
        return true;
    } catch (const told_trouble &) {
    } catch (const trouble &found) {
        print_message(found.what());
    }
    return false;
}

// After any failure here the edited text is still there.
bool edit_session::write(const std::string &text) {
    try {
        const lock_file lock(file_, wait_);
        file_.read();
        if (file_.text() == base_) {
            replace_file(file_, text);
            return true;
        }
        base_ = file_.text();
        print_message(file_.path() + " changed while it was edited");
    } catch (const trouble &failure) {
        print_message(failure.what());
    }
    return false;
}

bool edit_session::asks_to_go_on(const std::string &text) const {
    for (;;) {
        std::fputs("What now? (e)dit again, (d)rop, (s)how: ", stderr);
        std::fflush(stderr);
        switch (read_answer()) {
        case 'e':
            return true;
        case 'd':
            return false;
        case 's':
            std::fputs(shown_on(STDERR_FILENO, unified_diff(base_, text, file_.path())).c_str(), stderr);
            static_cast<void>(is_right(text));
            break;
        default:
            break;
        }
    }
}

} // namespace qzacl
