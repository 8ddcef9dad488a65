// Letter case by the rules of the POSIX locale, inline: for loops over many strings that cannot afford calls.
#ifndef QZ_POSIX_FOLD_H
#define QZ_POSIX_FOLD_H

#include "base/words.h"

#include <cstddef>
#include <cstdint>

namespace qz {

// The lower-case form of A to Z; any other byte, those above 127 among them, as it is.
constexpr unsigned char fold(unsigned char byte) {
    return static_cast<unsigned char>(byte - 'A') < 26 ? static_cast<unsigned char>(byte | 0x20) : byte;
}

// fold for each of the eight bytes of a word at once. Adding to the low seven bits of a byte carries into its
// own high bit only, so the high bits of the two sums say where "at least A" and "above Z" hold.
constexpr std::uint64_t fold8(std::uint64_t word) {
    const std::uint64_t low = word & in_each_byte(0x7f);
    const std::uint64_t from_a = low + in_each_byte(0x80 - 'A');
    const std::uint64_t above_z = low + in_each_byte(0x7f - 'Z');
    const std::uint64_t upper = from_a & ~above_z & ~word & in_each_byte(0x80);
    return word | (upper >> 2);
}

// Orders two runs of n bytes without regard to case, NUL being a byte like any other: below 0, 0 or above 0.
inline int fold_compare(const char *a, const char *b, std::size_t n) {
    for (; n >= word_size; a += word_size, b += word_size, n -= word_size) {
        const std::uint64_t left = first_byte_highest(fold8(load8(a)));
        const std::uint64_t right = first_byte_highest(fold8(load8(b)));
        if (left != right)
            return left < right ? -1 : 1;
    }
    for (; n != 0; ++a, ++b, --n) {
        const int left = fold(static_cast<unsigned char>(*a));
        const int right = fold(static_cast<unsigned char>(*b));
        if (left != right)
            return left - right;
    }
    return 0;
}

// Orders two NUL-terminated strings without regard to case: below 0, 0 or above 0. It goes byte by byte, since a
// word might reach behind the end of the storage.
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
