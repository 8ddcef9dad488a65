// The end of every edit, and the common part of edits of one entry.
#include "edit_answer.h"

#include "cli.h"
#include "counting_cache.h"
#include "hidden_grant.h"
#include "lock_file.h"
#include "replaced_file.h"
#include "trouble.h"
#include "unified_diff.h"
#include "whole_file.h"

#include <chrono>
#include <span>

namespace qzacl {

namespace {

void say_whether_changed(const call &call, bool has_changed) {
    if (!call.out.is_json())
        return call.out.line(has_changed ? "changed" : "unchanged");
    json object;
    object["file"] = json_text(call.line.words[0]);
    object["changed"] = has_changed;
    call.out.object(object);
}

// Returns the text after the change; prints a message if it hides a grant.
std::string text_after(const call &call, const edited_file &file, const text_change &change) {
    const named_text text = {file.path(), file.text()};
    const auto entry = find_entry(text, call.permissions, change.key);
    if (!entry && adds_entry(change) && change.key.is_refused)
        throw trouble(change.key.identity + " has no host, which the mechanism " + change.key.mechanism +
                      " wants");
    std::string changed = changed_text(text, call.permissions, change, entry);
    if (!entry && change.action == edit_action::grant) {
        if (const std::string hidden = hidden_by(text, call.permissions, change); !hidden.empty())
            print_message(hidden);
    }
    return changed;
}

int show_change(const call &call, const edited_file &file, const text_change &change) {
    const std::string after = text_after(call, file, change);
    const bool would_change = after != file.text();
    if (call.out.is_json())
        say_whether_changed(call, would_change);
    else
        call.out.lines(unified_diff(file.text(), after, file.path()));
    return would_change ? no : yes;
}

} // namespace

edited_file file_to_edit(const call &call) {
    const std::string &name = call.line.words[0];
    if (name == standard_input)
        throw wrong_use("only a file can be edited");
    edited_file file(name);
    file.read();
    return file;
}

int answer_edit(const call &call, const edited_file &file, bool has_changed) {
    say_whether_changed(call, has_changed);
    call.out.flush();
    if (!call.line.compiles || make_cache_count(file, std::chrono::seconds(call.line.wait), call.permissions))
        return yes;
    print_message(file.path() + ": services do not read the cache, or it does not say what the text says");
    return failed;
}

int change_entry(const call &call, const text_change &change) {
    edited_file file = file_to_edit(call);
    if (call.line.checks)
        return show_change(call, file, change);
    bool has_changed = false;
    {
        const lock_file lock(file, std::chrono::seconds(call.line.wait));
        file.read();
        const std::string after = text_after(call, file, change);
        has_changed = after != file.text();
        if (has_changed)
            replace_file(file, after);
    }
    return answer_edit(call, file, has_changed);
}

text_change change_of_letters(const call &call, edit_action action) {
    text_change change;
    change.action = action;
    change.permissions = call.permissions.mask_of(call.line.words[1]);
    read_entry_key(std::span(call.line.words).subspan(2), change.key, nullptr);
    return change;
}

} // namespace qzacl
