// The shape of a linked tree built by plain insertion: a binary search tree of user or group entries, or a chain of
// expanded ones.
//
// No links are stored. The root of a subtree is the entry inserted first among those in the subtree. So the shape
// follows from the order of the entries and from their places, which ascend in order of insertion. All of this
// holds for chains, too, whose order is that of insertion.
#ifndef QZACL_TREE_SHAPE_H
#define QZACL_TREE_SHAPE_H

#include "qzacl_acl/entry_sort.h"

#include <cstddef>
#include <span>
#include <utility>

namespace qz {

// The first entry in a pre-order walk that is not deleted. Null if all are.
const small_entry *topmost(std::span<const small_entry> in_order);

// Calls `release` with every entry in post-order. Destroys the order of the entries.
template <class Release>
void in_post_order(std::span<small_entry> in_order, const Release &release) {
    // A stack of the nodes whose right subtrees are unfinished, each in the right subtree of the one below it. It
    // is kept in the part of the array that has been read.
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
