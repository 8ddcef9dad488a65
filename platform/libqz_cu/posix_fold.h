// Letter case by the rules of the POSIX locale, inline: for loops over many strings that cannot afford calls.
#ifndef QZ_CU_POSIX_FOLD_H
#define QZ_CU_POSIX_FOLD_H

#include <bit>
#include <cstddef>
#include <cstdint>
#include <cstring>

namespace qz {

// The lower-case form of A to Z; any other byte, those above 127 among them, as it is.
constexpr unsigned char fold(unsigned char byte) {
    return static_cast<unsigned char>(byte - 'A') < 26 ? static_cast<unsigned char>(byte | 0x20) : byte;
}

// fold for each of the eight bytes of a word at once. Adding to the low seven bits of a byte carries into its
// own high bit only, so the high bits of the two sums say where "at least A" and "above Z" hold.
constexpr std::uint64_t fold8(std::uint64_t word) {
    constexpr std::uint64_t each = 0x0101010101010101;
    const std::uint64_t low = word & (each * 0x7f);
    const std::uint64_t from_a = low + each * (0x80 - 'A');
    const std::uint64_t above_z = low + each * (0x7f - 'Z');
    const std::uint64_t upper = from_a & ~above_z & ~word & (each * 0x80);
    return word | (upper >> 2);
}

// Eight bytes from any address.
inline std::uint64_t load8(const char *at) {
    std::uint64_t word;
    std::memcpy(&word, at, sizeof word);
    return word;
}

// Orders two runs of n bytes without regard to case, NUL being a byte like any other: below 0, 0 or above 0.
inline int fold_compare(const char *a, const char *b, std::size_t n) {
    for (; n >= 8; a += 8, b += 8, n -= 8) {
        const std::uint64_t left = fold8(load8(a));
        const std::uint64_t right = fold8(load8(b));
        if (left != right) {
            const std::uint64_t differ = left ^ right;
            const int shift = std::endian::native == std::endian::little
                                  ? std::countr_zero(differ) & ~7
                                  : 56 - (std::countl_zero(differ) & ~7);
            return static_cast<int>((left >> shift) & 0xff) - static_cast<int>((right >> shift) & 0xff);
        }
    }
    for (; n != 0; ++a, ++b, --n) {
        const int left = fold(static_cast<unsigned char>(*a));
        const int right = fold(static_cast<unsigned char>(*b));
        if (left != right)
            return left - right;
    }
    return 0;
}

// Orders two NUL-terminated strings without regard to case. It goes byte by byte, since a word might reach
// behind the end of the storage.
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
