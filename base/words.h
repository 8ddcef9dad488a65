// Words of eight bytes: loading, byte order, and finding zero bytes.
#ifndef QZ_WORDS_H
#define QZ_WORDS_H

#include <bit>
#include <cstddef>
#include <cstdint>
#include <cstring>

namespace qz {

inline constexpr std::size_t word_size = sizeof(std::uint64_t);

// A word with the value in each byte.
constexpr std::uint64_t in_each_byte(unsigned char value) {
    return value * std::uint64_t{0x0101010101010101};
}

// Eight bytes from any address, in host order.
inline std::uint64_t load8(const void *at) {
    std::uint64_t word;
    std::memcpy(&word, at, sizeof word);
    return word;
}

// A loaded word as a number whose lowest byte is the first in memory.
constexpr std::uint64_t first_byte_lowest(std::uint64_t loaded) {
    return std::endian::native == std::endian::little ? loaded : __builtin_bswap64(loaded);
}

// A loaded word as a number whose highest byte is the first in memory: it compares as the bytes do.
constexpr std::uint64_t first_byte_highest(std::uint64_t loaded) {
    return std::endian::native == std::endian::little ? __builtin_bswap64(loaded) : loaded;
}

// The bytes of a smaller type as a number whose lowest byte is the first in memory.
template <class Part>
std::uint64_t load_part(const unsigned char *at) {
    Part loaded;
    std::memcpy(&loaded, at, sizeof loaded);
    const std::uint64_t number = loaded;
    return std::endian::native == std::endian::little ? number
                                                      : __builtin_bswap64(number) >> (64 - 8 * sizeof loaded);
}

// Fewer than eight bytes as a number whose lowest byte is the first in memory, the rest zero. The parts that are loaded
// overlap, because a loop over bytes would take longer than a comparison.
inline std::uint64_t load_few(const void *at, std::size_t count) {
    const auto *const bytes = static_cast<const unsigned char *>(at);
    if (count >= 4)
        return load_part<std::uint32_t>(bytes) | load_part<std::uint32_t>(bytes + count - 4)
                                                     << (8 * (count - 4));
    if (count >= 2)
        return load_part<std::uint16_t>(bytes) | load_part<std::uint16_t>(bytes + count - 2)
                                                     << (8 * (count - 2));
    return count == 0 ? 0 : *bytes;
}

// The bits after the first `count` bytes of a number whose first byte is the highest; none for eight bytes.
constexpr std::uint64_t bits_after(std::size_t count) {
    return count < word_size ? UINT64_MAX >> (8 * count) : 0;
}

// The high bit of the lowest zero byte, or 0. Higher bits are masked off, because a borrow may have set some of them
// by mistake.
constexpr std::uint64_t lowest_zero(std::uint64_t word) {
    const std::uint64_t zeros = (word - in_each_byte(0x01)) & ~word & in_each_byte(0x80);
    return zeros & (~zeros + 1);
}

// The number of bytes before the first NUL of a loaded word, or eight.
constexpr unsigned bytes_before_nul(std::uint64_t loaded) {
    return static_cast<unsigned>(std::countr_zero(lowest_zero(first_byte_lowest(loaded)))) / 8;
}

} // namespace qz

#endif
