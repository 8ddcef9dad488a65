// What a new entry hides: the permissions that other entries granted its party until then.
#ifndef QZACL_HIDDEN_GRANT_H
#define QZACL_HIDDEN_GRANT_H

#include "permission_set.h"
#include "text_edit.h"

#include <string>

namespace qzacl {

// Describes the permissions that a party loses when grant adds an entry for it, because the new entry hides others;
// empty if there are none. A user's own entry hides the first expanded entry for the host, and every new entry hides
// that of any other. The groups of a party are not known here.
std::string hidden_by(const named_text &text, const permission_set &set, const text_change &change);

} // namespace qzacl

#endif
