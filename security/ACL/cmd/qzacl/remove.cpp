// remove: deletes the line of an entry.
#include "cli.h"
#include "edit_answer.h"

#include <span>

namespace qzacl {

int remove(const call &call) {
    text_change change;
    change.action = edit_action::remove;
    read_entry_key(std::span(call.line.words).subspan(1), change.key, nullptr);
    return change_entry(call, change);
}

} // namespace qzacl
