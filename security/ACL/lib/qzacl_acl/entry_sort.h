// The small form of entries in trees, and sorting it.
#ifndef QZACL_ENTRY_SORT_H
#define QZACL_ENTRY_SORT_H

#include "qzacl_acl/identity_store.h"

#include <cstdint>
#include <optional>
#include <span>

namespace qz {

// An entry without its texts.
struct small_entry {
    std::uint64_t key;            // eight bytes of the identity, as an ordered word
    std::uint32_t place : 31;     // of the identity in the identity store
    std::uint32_t is_deleted : 1; // deleted entries keep their place
    std::uint32_t perm_mask;
};
static_assert(sizeof(small_entry) == 16);

// Sorts entries by identity, and those with equal ones by place. Takes O(n log n) comparisons for any order of input, a
// logarithmic stack depth, and no memory. Returns whether the keys still hold the start of the identities. If not, they
// hold later bytes, from places that differ.
bool sort_by_identity(std::span<small_entry> entries, const identity_store &identities);

// Of sorted entries, the one with the lowest place that repeats the identity of an earlier one.
std::optional<small_entry> first_duplicate(std::span<const small_entry> sorted,
                                           const identity_store &identities);

} // namespace qz

#endif
