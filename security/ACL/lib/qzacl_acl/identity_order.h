// Identities laid out for quick comparison, and sorting them. Case folds as in the POSIX locale everywhere.
//
// An identity held by a tree starts at a multiple of eight bytes and is padded with NULs to the next, so that
// it can be folded, hashed and compared eight bytes at a time without looking outside its own memory.
#ifndef QZACL_IDENTITY_ORDER_H
#define QZACL_IDENTITY_ORDER_H

#include "libqz_cu/posix_fold.h"
#include "qz/acl.h"

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <span>

namespace qz {

// The number of eight-byte words that an identity of `length` bytes takes with its NUL.
constexpr std::size_t identity_words(std::size_t length) { return length / sizeof(std::uint64_t) + 1; }

inline std::uint64_t folded_word(const char *padded, std::size_t word) {
    std::uint64_t bytes = 0;
    std::memcpy(&bytes, padded + word * sizeof bytes, sizeof bytes);
    return fold8(bytes);
}

// Secret multipliers: whoever writes an ACL file cannot choose names that collide.
struct identity_hash_key {
    std::uint64_t first = 0;
    std::uint64_t second = 0;
};
identity_hash_key make_identity_hash_key();

std::uint32_t hash_identity(const char *padded, std::size_t length, const identity_hash_key &key);

// Both padded; `length` is that of the first.
inline bool identities_are_equal(const char *padded, std::size_t length, const char *other) {
    for (std::size_t word = 0; word < identity_words(length); ++word) {
        // A shorter `other` differs in the word that holds its NUL, before its memory ends.
        if (folded_word(padded, word) != folded_word(other, word))
            return false;
    }
    return true;
}

// Negative, zero or positive as the first identity sorts before, with or behind the second; both padded.
int compare_identities(const char *padded, const char *other);

// An entry beside the part of its identity that decides most comparisons.
struct keyed_acle {
    std::uint64_t key;
    sec_acle_t *acle;
};

// Sorts entries, whose identities are padded and no two equal, in ascending order of identity. Both scratch
// arrays hold as many elements as there are entries. Takes O(n log n) comparisons whatever the order of
// input, and a bounded depth of stack.
void sort_by_identity(std::span<sec_acle_t *> acles, keyed_acle *scratch, keyed_acle *more_scratch);

} // namespace qz

#endif
