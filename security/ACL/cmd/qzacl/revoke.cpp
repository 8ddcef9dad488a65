// revoke: takes letters from an entry.
#include "edit_answer.h"

namespace qzacl {

int revoke(const call &call) { return change_entry(call, change_of_letters(call, edit_action::revoke)); }

} // namespace qzacl
