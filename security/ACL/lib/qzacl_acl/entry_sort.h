// The small form of an entry that trees hold, and sorting it.
#ifndef QZACL_ENTRY_SORT_H
#define QZACL_ENTRY_SORT_H

#include "qzacl_acl/identity_store.h"

#include <cstdint>
#include <span>

namespace qz {

// An entry without its texts, and the record that is sorted.
struct small_entry {
    std::uint64_t key;            // eight bytes of the identity, as an ordered word
    std::uint32_t place : 31;     // of the identity in its store
    std::uint32_t is_deleted : 1; // it keeps its place all the same
    std::uint32_t perm_mask;
};
static_assert(sizeof(small_entry) == 16);

// Sorts entries, of which no two have equal identities, in ascending order of identity. Takes O(n log n) comparisons
// whatever the order of input, and a bounded depth of stack. Without memory for a second array it takes longer.
// Returns how many bytes, which all identities share, stand before those that the keys then hold.
std::size_t sort_by_identity(std::span<small_entry> entries, const identity_store &identities);

} // namespace qz

#endif
