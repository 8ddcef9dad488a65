// set: gives an entry exactly the named letters, and adds it if there is none.
#include "cli.h"
#include "edit_answer.h"

#include <span>

namespace qzacl {

int set(const call &call) {
    text_change change;
    std::string letters;
    read_entry_key(std::span(call.line.words).subspan(1), change.key, &letters);
    // An entry without letters is a denial.
    if (!letters.empty())
        change.permissions = call.permissions.mask_of(letters);
    return change_entry(call, change);
}

} // namespace qzacl
