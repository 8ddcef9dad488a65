// Compiling trees into the bytes of a buffer, and expanding those bytes back into trees and lists.
#ifndef QZACL_COMPILE_H
#define QZACL_COMPILE_H

#include "base/owned.h"
#include "bytes.h"
#include "qz/acl.h"
#include "qzacl_acl/tree.h"

#include <cstddef>
#include <span>

namespace qz {

// A sub-ACL in memory of its own, of exactly its size; null when there is none.
struct loose_subacl {
    owned<unsigned char[]> data;
    std::size_t length = 0;
};

} // namespace qz

// Compiles every entry of a tree, in its order, into `out`; a tree without entries, and a null root, leave it
// empty. Returns SEC_S_OK, SEC_S_NO_MEMORY, or SEC_S_BAD_ACLE for an identity that the format cannot hold.
int sec__acltree_to_subacl(const sec_acltree_t *root, qz::loose_subacl &out);

// Compiles trees into a new buffer, the last tree first; trees without entries are left out. The descriptor's
// previous contents are overwritten; on failure it holds nothing. Results as above.
int sec__acltrees_to_acl(std::span<sec_acltree_t *const> trees, sec_acl_buffer_t *acl);

// Expands the sub-ACL at the start of `bytes`, in host order, into a new tree, null when it has no entries.
// Entries with equal identities become one, with the last mask. Returns SEC_S_OK, SEC_S_NO_MEMORY, or
// SEC_S_BAD_ACL for a second entry of a type that allows one, a mechanism that no entry can hold, or bytes
// that end too early.
int sec__subacl_to_acltree(qz::byte_span bytes, sec_acltree_t **root);

// Moves every entry of a tree, in its order, to the end of the list, whose owner then frees them. Returns
// SEC_S_OK or SEC_S_NO_MEMORY, some entries then being in the list and the rest still in the tree.
int sec__acltree_to_aclelist(sec_acltree_t *root, sec_aclelist_t *list);

#endif
