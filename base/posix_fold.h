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

// Orders two words, whose first byte is the lowest, without regard to case: below 0, 0 or above 0.
inline int fold_compare8(std::uint64_t a, std::uint64_t b) {
    const std::uint64_t left = __builtin_bswap64(fold8(a));
    const std::uint64_t right = __builtin_bswap64(fold8(b));
    return left == right ? 0 : left < right ? -1 : 1;
}

// Orders two runs of n bytes without regard to case, NUL being a byte like any other: below 0, 0 or above 0.
inline int fold_compare(const char *a, const char *b, std::size_t n) {
    if (n < word_size)
        return fold_compare8(load_few(a, n), load_few(b, n));
    const auto compare_at = [a, b](std::size_t at) {
        return fold_compare8(first_byte_lowest(load8(a + at)), first_byte_lowest(load8(b + at)));
    };
    // The last word may overlap the one before it, whose bytes are then known to be alike.
    const std::size_t last = n - word_size;
    for (std::size_t at = 0; at < last; at += word_size) {
        if (const int order = compare_at(at); order != 0)
            return order;
    }
    return compare_at(last);
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
