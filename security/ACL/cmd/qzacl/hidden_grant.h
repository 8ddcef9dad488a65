// What a new entry hides: the permissions that its party was granted by others until then.
#ifndef QZACL_HIDDEN_GRANT_H
#define QZACL_HIDDEN_GRANT_H

#include "permission_set.h"
#include "text_edit.h"

#include <string>

namespace qzacl {

// What a grant that adds an entry hides of what others granted its party until now, for people; empty for nothing. An
// entry of its own takes the place of their answers: of a user that of the first expanded entry for the host, of any
// that of any other. Which groups a party is in is not known here.
std::string hidden_by(const named_text &text, const permission_set &set, const text_change &change);

} // namespace qzacl

#endif
