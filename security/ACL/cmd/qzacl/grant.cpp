// grant: adds letters to an entry, which is added if there is none.
#include "edit_answer.h"

namespace qzacl {

int grant(const call &call) { return change_entry(call, change_of_letters(call, edit_action::grant)); }

} // namespace qzacl
