// Adding and deleting one entry in place, without a second copy of its sub-ACL.
//
// The stored entries must be exactly what compiling a tree of them gives: well-formed, of the current version and
// in ascending order. Then an edit in place gives the same bytes as the general method through a tree. Checking
// this takes a walk over all entries, which is where an edit spends its time.
#ifndef QZACL_EDIT_PACKED_H
#define QZACL_EDIT_PACKED_H

#include "qz/acl.h"
#include "qzacl_acl/acle_report.h"
#include "qzacl_acl/buffer.h"

#include <cstddef>

namespace qz {

// The place of an entry, or for a new one, among the entries of a sub-ACL.
struct packed_place {
    std::size_t offset = 0; // in the sub-ACL
    std::size_t size = 0;   // of the entry with this identity, or 0
};

// Finds the place of an entry in the sub-ACL of its key, which must be complete. False if the general method must
// be used; the place is then undefined.
bool find_packed(const sec_acl_buffer_t &acl, const stored_subacl &stored, const sec_acle_t &acle,
                 packed_place &place);

// Adds an entry, whose identity must fit the format, at its place. Returns SEC_S_OK, or the code of what it
// recorded.
int add_packed(const sec_acle_t &acle, on_duplicate handling, const stored_subacl &stored,
               const packed_place &place, sec_acl_buffer_t &acl);

// Deletes the entry at the place. Deleting the last entry removes its sub-ACL. Returns the result of finish_deletion().
int delete_packed(const stored_subacl &stored, const packed_place &place, sec_acl_buffer_t &acl);

} // namespace qz

#endif
