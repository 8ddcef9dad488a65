// grant: letters more for an entry, which is added where it is not there.
#include "edit_answer.h"

namespace qzacl {

int grant(const call &call) { return change_entry(call, change_of_letters(call, edit_action::grant)); }

} // namespace qzacl
