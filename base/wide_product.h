// 128-bit products, also for compilers without a 128-bit type.
#ifndef QZ_WIDE_PRODUCT_H
#define QZ_WIDE_PRODUCT_H

#include <cstdint>

namespace qz {

struct wide_number {
    std::uint64_t high;
    std::uint64_t low;
};

constexpr wide_number wide_product(std::uint64_t a, std::uint64_t b) {
#ifdef __SIZEOF_INT128__
    __extension__ using wide = unsigned __int128;
    const wide product = static_cast<wide>(a) * b;
    return {static_cast<std::uint64_t>(product >> 64), static_cast<std::uint64_t>(product)};
#else
    // The four products of halves. No sum of them exceeds 64 bits.
    constexpr std::uint64_t low_half = 0xffffffff;
    const std::uint64_t low = (a & low_half) * (b & low_half);
    const std::uint64_t first = (a >> 32) * (b & low_half) + (low >> 32);
    const std::uint64_t second = (a & low_half) * (b >> 32) + (first & low_half);
    const std::uint64_t high = (a >> 32) * (b >> 32) + (first >> 32) + (second >> 32);
    return {high, second << 32 | (low & low_half)};
#endif
}

} // namespace qz

#endif
