// Compiling trees into the bytes of a buffer, and expanding the bytes into trees and lists.
#ifndef QZACL_COMPILE_H
#define QZACL_COMPILE_H

#include "base/owned.h"
#include "bytes.h"
#include "qz/acl.h"
#include "qzacl_acl/tree.h"

#include <cstddef>
#include <span>

namespace qz {

// A sub-ACL in a block of exactly its size; null without one.
struct loose_subacl {
    owned<unsigned char[]> data;
    std::size_t length = 0;
};

} // namespace qz

// Compiles the entries of a tree, in its order, into `out`, which stays empty for a null or empty tree. Returns
// SEC_S_OK, SEC_S_NO_MEMORY, or SEC_S_BAD_ACLE for an identity that the format cannot hold.
int sec__acltree_to_subacl(const sec_acltree_t *root, qz::loose_subacl &out);

// Compiles trees into a new buffer, the last tree first, omitting empty ones. Overwrites the descriptor, which is empty
// after a failure. Results as above.
int sec__acltrees_to_acl(std::span<sec_acltree_t *const> trees, sec_acl_buffer_t *acl);

// Expands the sub-ACL at the start of `bytes`, in host order, into a new tree, null without entries. Entries with equal
// identities become one with the last mask. Returns SEC_S_OK, SEC_S_NO_MEMORY, or SEC_S_BAD_ACL for a second entry of a
// type that allows one, a mechanism too long for an entry, or bytes that end too early.
int sec__subacl_to_acltree(qz::byte_span bytes, sec_acltree_t **root);

// Moves every entry of a tree, in its order, to the end of the list, whose owner frees them. Returns SEC_S_OK, or
// SEC_S_NO_MEMORY with some entries in the list and the rest in the tree.
int sec__acltree_to_aclelist(sec_acltree_t *root, sec_aclelist_t *list);

#endif
