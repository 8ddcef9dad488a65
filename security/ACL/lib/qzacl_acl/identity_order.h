// Comparing and hashing identities in words of eight bytes. Case folds as in the POSIX locale.
//
// An identity ends in a NUL. The seven bytes after the NUL must be readable, too, so that every word can be loaded
// whole.
#ifndef QZACL_IDENTITY_ORDER_H
#define QZACL_IDENTITY_ORDER_H

#include "base/posix_fold.h"
#include "base/wide_product.h"
#include "base/words.h"

#include <bit>
#include <cstddef>
#include <cstdint>

namespace qz {

inline constexpr std::size_t identity_word_size = word_size;

// The first eight bytes of an identity, folded, as a number that compares as they do: the first byte is the
// highest, and bytes from the NUL on are zero.
inline std::uint64_t ordered_word(const char *identity) {
    const std::uint64_t word = first_byte_lowest(load8(identity));
    return __builtin_bswap64(fold8(word & (lowest_zero(word) - 1)));
}

// True when the identity ends within this ordered word.
constexpr bool ends_within(std::uint64_t ordered) { return (ordered & 0xff) == 0; }

// The number of bytes before the NUL.
inline std::size_t identity_length(const char *identity) {
    for (std::size_t length = 0;; length += identity_word_size) {
        const std::uint64_t nul = lowest_zero(first_byte_lowest(load8(identity + length)));
        if (nul != 0)
            return length + static_cast<std::size_t>(std::countr_zero(nul)) / 8;
    }
}

// Negative, zero or positive as the first identity sorts before, equal to or after the second.
inline int compare_identities(const char *a, const char *b) {
    for (;; a += identity_word_size, b += identity_word_size) {
        const std::uint64_t left = ordered_word(a);
        const std::uint64_t right = ordered_word(b);
        if (left != right)
            return left < right ? -1 : 1;
        if (ends_within(left))
            return 0;
    }
}

// Secret multipliers, so that the writer of an ACL file cannot choose names that collide.
struct identity_hash_key {
    std::uint64_t first = 0;
    std::uint64_t second = 0;
};
identity_hash_key make_identity_hash_key();

// Mixes a word into the state of a hash. The state starts as the second multiplier and is finished by mixing that in.
inline std::uint64_t hash_word(std::uint64_t state, std::uint64_t word, const identity_hash_key &key) {
    const wide_number product = wide_product(state ^ word, key.first);
    return product.low ^ product.high;
}

// `first` is the identity's first word.
inline std::uint64_t hash_identity(const char *identity, std::uint64_t first, const identity_hash_key &key) {
    std::uint64_t state = hash_word(key.second, first, key);
    for (std::uint64_t word = first; !ends_within(word); state = hash_word(state, word, key)) {
        identity += identity_word_size;
        word = ordered_word(identity);
    }
    return hash_word(state, key.second, key);
}

} // namespace qz

#endif
