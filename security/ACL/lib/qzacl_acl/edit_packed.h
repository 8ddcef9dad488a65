// Adding and deleting one entry by changing its bytes in place, without a second copy of its sub-ACL.
//
// The stored entries must be what compiling a tree of them gives: well-formed, all of one version and in ascending
// order. Then the bytes that an edit in place leaves are those that the plain way, through a tree, would give.
// Every entry is looked at to prove this; that walk is what an edit spends its time in.
#ifndef QZACL_EDIT_PACKED_H
#define QZACL_EDIT_PACKED_H

#include "qz/acl.h"
#include "qzacl_acl/acle_report.h"
#include "qzacl_acl/buffer.h"

#include <cstddef>

namespace qz {

// Where an entry stands, or would stand, among the packed entries of a sub-ACL.
struct packed_place {
    std::size_t offset = 0; // in the sub-ACL
    std::size_t size = 0;   // of the entry found there, 0 when there is none with its identity
};

// Finds the place of an entry in the sub-ACL of its key, all bytes of which are there. False where the plain way must
// be gone, and nothing is said of the place.
bool find_packed(const sec_acl_buffer_t &acl, const stored_subacl &stored, const sec_acle_t &acle,
                 packed_place &place);

// Adds an entry, whose identity fits the format, at its place. Returns SEC_S_OK, or the code of what it
// recorded.
int add_packed(const sec_acle_t &acle, on_duplicate handling, const stored_subacl &stored,
               const packed_place &place, sec_acl_buffer_t &acl);

// Deletes the entry at the place, and with the last entry its sub-ACL. Returns as finish_deletion() does.
int delete_packed(const stored_subacl &stored, const packed_place &place, sec_acl_buffer_t &acl);

} // namespace qz

#endif
