// Reports about entries that trees and packed sub-ACLs share: duplicates and missing entries.
#ifndef QZACL_ACLE_REPORT_H
#define QZACL_ACLE_REPORT_H

#include "qzacl_acl/entry.h"

namespace qz {

// What adding an entry does when its key already has an entry with its identity. A duplicate that is reported late is
// added, and found when all entries are sorted.
enum class on_duplicate : std::uint8_t { replace_mask, report, report_late };

} // namespace qz

// Records that no entry matches the given one. Returns `code`, SEC_S_ACLE_NOT_FOUND or SEC_S_BAD_ACLE.
int sec__acle_not_found(int code, const qz::acle_view &acle);

// Records that the given entry is a duplicate. Returns SEC_S_BAD_ACLE.
int sec__report_duplicate(const qz::acle_view &acle);

// Traces that the given entry's mask replaced that of a stored one.
void sec__trace_replacement(const qz::acle_view &acle);

#endif
