// Case folding by the rules of the POSIX locale, inline, for loops that cannot afford a call per string.
#ifndef QZ_POSIX_FOLD_H
#define QZ_POSIX_FOLD_H

#include "base/words.h"

#include <cstddef>
#include <cstdint>

namespace qz {

// The lower case of A to Z; every other byte, including those above 127, unchanged.
constexpr unsigned char fold(unsigned char byte) {
    return static_cast<unsigned char>(byte - 'A') < 26 ? static_cast<unsigned char>(byte | 0x20) : byte;
}

// Folds the eight bytes of a word at once. An addition to the low seven bits of a byte carries only into its own high
// bit, so the high bits of the two sums mean "at least A" and "above Z".
constexpr std::uint64_t fold8(std::uint64_t word) {
    const std::uint64_t low = word & in_each_byte(0x7f);
    const std::uint64_t from_a = low + in_each_byte(0x80 - 'A');
    const std::uint64_t above_z = low + in_each_byte(0x7f - 'Z');
    const std::uint64_t upper = from_a & ~above_z & ~word & in_each_byte(0x80);
    return word | (upper >> 2);
}

// Compares two NUL-terminated strings without regard to case: below 0, 0 or above 0. It reads single bytes, because a
// word could reach past the end of the storage.
constexpr int fold_compare(const char *a, const char *b) {
    for (;; ++a, ++b) {
        const unsigned char left = fold(static_cast<unsigned char>(*a));
        const unsigned char right = fold(static_cast<unsigned char>(*b));
        if (left != right)
            return left - right;
        if (left == 0)
            return 0;
    }
}

} // namespace qz

#endif
