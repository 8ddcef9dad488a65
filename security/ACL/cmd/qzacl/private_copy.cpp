// A copy of a text for an editor.
#include "private_copy.h"

#include "base/owned.h"
#include "edited_file.h"
#include "whole_file.h"

#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <fcntl.h>
#include <filesystem>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

using namespace qz;

namespace qzacl {

namespace {

// What the shell runs: the words of the variable, and the name of the copy.
std::string editor_command() {
    for (const char *variable : {"VISUAL", "EDITOR"}) {
        const char *editor = std::getenv(variable);
        if (editor != nullptr && *editor != '\0')
            return std::string(editor) + " \"$@\"";
    }
    return "if command -v editor >/dev/null; then editor \"$@\"; else vi \"$@\"; fi";
}

// Interrupts from the terminal are the editor's while it runs.
class ignored_interrupts {
public:
    ignored_interrupts() {
        struct sigaction ignoring = {};
        ignoring.sa_handler = SIG_IGN;
        sigaction(SIGINT, &ignoring, &interrupt_before_);
        sigaction(SIGQUIT, &ignoring, &quit_before_);
    }
    ignored_interrupts(const ignored_interrupts &) = delete;
    ignored_interrupts &operator=(const ignored_interrupts &) = delete;
    ~ignored_interrupts() { put_back(); }

    void put_back() const {
        sigaction(SIGINT, &interrupt_before_, nullptr);
        sigaction(SIGQUIT, &quit_before_, nullptr);
    }

private:
    struct sigaction interrupt_before_ = {};
    struct sigaction quit_before_ = {};
};

} // namespace

private_folder::private_folder() {
    const char *place = std::getenv("TMPDIR");
    path_ = std::string(place == nullptr || *place == '\0' ? "/tmp" : place) + "/qzacl.XXXXXX";
    if (mkdtemp(path_.data()) == nullptr)
        throw system_failure("cannot make a folder for the editor");
}

private_folder::~private_folder() {
    std::error_code ignored;
    std::filesystem::remove_all(path_, ignored);
}

private_copy::private_copy(const std::string &name, std::string_view text)
    : path_(folder_.path() + "/" + name) {
    constexpr mode_t owner_alone = 0600;
    const descriptor file(open(path_.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, owner_alone));
    if (!file)
        throw system_failure("cannot make " + path_);
    if (!write_all(file.get(), text))
        throw system_failure("cannot write " + path_);
}

void private_copy::edit() const {
    const std::string command = editor_command();
    const ignored_interrupts interrupts;
    const pid_t child = fork();
    if (child < 0)
        throw system_failure("cannot start the editor");
    if (child == 0) {
        interrupts.put_back();
        execl("/bin/sh", "sh", "-c", command.c_str(), "editor", path_.c_str(), nullptr);
        _exit(127);
    }
    int status = 0;
    while (waitpid(child, &status, 0) < 0 && errno == EINTR) {
    }
    if (status != 0)
        throw trouble("the editor failed");
}

std::string private_copy::text() const {
    const descriptor file(open(path_.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC));
    struct stat status = {};
    if (!file || fstat(file.get(), &status) != 0)
        throw system_failure("cannot open " + path_);
    if (!S_ISREG(status.st_mode))
        throw trouble(path_ + " is no regular file");
    return read_whole(file.get(), path_);
}

} // namespace qzacl
