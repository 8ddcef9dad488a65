// The shape of the tree that plain insertion makes: a binary search tree of user or group entries, a chain of expanded
// ones.
//
// No links are kept. A node heads its subtree because its entry was inserted first among those that the subtree spans,
// so the shape follows from the order of the entries and from their places, which ascend with their insertion. What is
// said of search trees here holds for chains, too, whose order is that of insertion.
#ifndef QZACL_TREE_SHAPE_H
#define QZACL_TREE_SHAPE_H

#include "qzacl_acl/entry_sort.h"

#include <cstddef>
#include <span>
#include <utility>

namespace qz {

// The entry that a walk meets first which looks at every node before its left subtree, and at that before the right
// one: the root, or where it was deleted the topmost one that is left. Null when all were deleted.
const small_entry *topmost(std::span<const small_entry> in_order);

// Calls `release` with every node after those of its left and of its right subtree. The entries are lost.
template <class Release>
void in_post_order(std::span<small_entry> in_order, const Release &release) {
    // The nodes whose right subtrees are not finished, each on the right of the one before it. They stand in the part
    // of the array that has been passed.
    std::size_t unfinished = 0;
    for (std::size_t index = 0; index < in_order.size(); ++index) {
        const small_entry entry = in_order[index];
        while (unfinished != 0 && in_order[unfinished - 1].place > entry.place)
            release(std::as_const(in_order[--unfinished]));
        in_order[unfinished++] = entry;
    }
    while (unfinished != 0)
        release(std::as_const(in_order[--unfinished]));
}

} // namespace qz

#endif
