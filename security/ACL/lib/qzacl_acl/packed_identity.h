// Comparing identities packed in a buffer, at little more than the cost of stepping from one to the next.
#ifndef QZACL_PACKED_IDENTITY_H
#define QZACL_PACKED_IDENTITY_H

#include "base/posix_fold.h"
#include "base/words.h"
#include "bytes.h"
#include "qzacl_acl/buffer_format.h"

#include <algorithm>
#include <bit>
#include <cstddef>
#include <cstdint>
#include <cstring>

#ifdef __x86_64__
#include <emmintrin.h>
#endif

namespace qz {

// The first sixteen bytes of an identity, folded. After the NUL of a shorter one come the bytes that follow it in the
// buffer, or NULs if it was made from a string.
class identity_block {
public:
    static constexpr std::size_t size = 16;

#ifdef __x86_64__
    explicit identity_block(const unsigned char *bytes)
        : identity_block(_mm_loadu_si128(reinterpret_cast<const __m128i *>(bytes))) {}

    // The block of a string, padded with NULs. It is assembled in registers: loading sixteen bytes right after storing
    // fewer would stall as long as comparing several entries takes.
    static identity_block of_string(const char *text) {
        const std::size_t length = strnlen(text, size);
        std::uint64_t low = 0;
        std::uint64_t high = 0;
        if (length >= 8) {
            low = load8(text);
            if (length > 8)
                high = load8(text + length - 8) >> (8 * (size - length));
        } else if (length >= 4) {
            low = load4(text) | std::uint64_t{load4(text + length - 4)} << (8 * (length - 4));
        } else {
            for (std::size_t index = 0; index < length; ++index)
                low |= std::uint64_t{static_cast<unsigned char>(text[index])} << (8 * index);
        }
        return identity_block(_mm_set_epi64x(static_cast<long long>(high), static_cast<long long>(low)));
    }

    // The two halves as numbers that compare as their bytes do.
    std::uint64_t first() const { return ordered(_mm_cvtsi128_si64(bytes_)); }
    std::uint64_t second() const { return ordered(_mm_cvtsi128_si64(_mm_unpackhi_epi64(bytes_, bytes_))); }

private:
    explicit identity_block(__m128i raw) {
        // With 'A' moved to the least signed value, upper-case letters are the values below a limit.
        constexpr int least = -128;
        const __m128i moved = _mm_add_epi8(raw, _mm_set1_epi8(static_cast<char>(least - 'A')));
        const __m128i is_upper = _mm_cmplt_epi8(moved, _mm_set1_epi8(static_cast<char>(least + 26)));
        bytes_ = _mm_or_si128(raw, _mm_and_si128(is_upper, _mm_set1_epi8('a' - 'A')));
    }

    static std::uint64_t ordered(long long word) {
        return first_byte_highest(static_cast<std::uint64_t>(word));
    }

    __m128i bytes_;
#else
    explicit identity_block(const unsigned char *bytes) {
        words_[0] = fold8(load8(bytes));
        words_[1] = fold8(load8(bytes + word_size));
    }

    static identity_block of_string(const char *text) {
        unsigned char padded[size] = {};
        std::memcpy(padded, text, strnlen(text, size));
        return identity_block(padded);
    }

    std::uint64_t first() const { return first_byte_highest(words_[0]); }
    std::uint64_t second() const { return first_byte_highest(words_[1]); }

private:
    std::uint64_t words_[2];
#endif

public:
    bool sorts_before(const identity_block &other) const {
        const std::uint64_t mine = first();
        const std::uint64_t others = other.first();
        if (mine == others)
            return second() < other.second();
        return mine < others;
    }

    // True when this block sorts before the other within its first `count` bytes.
    bool sorts_before_within(std::size_t count, const identity_block &other) const {
        const std::uint64_t front = first() ^ other.first();
        if (front != 0)
            return first() < other.first() && static_cast<unsigned>(std::countl_zero(front)) / 8 < count;
        const std::uint64_t back = second() ^ other.second();
        return second() < other.second() && 8 + static_cast<unsigned>(std::countl_zero(back)) / 8 < count;
    }
};

// The index of the first NUL in the sixteen bytes of a block, or sixteen.
inline unsigned nul_in_block(const unsigned char *bytes) {
#ifdef __x86_64__
    const __m128i raw = _mm_loadu_si128(reinterpret_cast<const __m128i *>(bytes));
    const int nuls = _mm_movemask_epi8(_mm_cmpeq_epi8(raw, _mm_setzero_si128()));
    return static_cast<unsigned>(std::countr_zero(static_cast<unsigned>(nuls) | 1U << identity_block::size));
#else
    const unsigned nul = bytes_before_nul(load8(bytes));
    return nul < word_size ? nul : nul + bytes_before_nul(load8(bytes + word_size));
#endif
}

// True when the string ends where its field does. A whole block of the field must be readable. Most strings end
// within two blocks; a call for each would cost more than the rest of a walk.
inline bool ends_exactly(byte_span field) {
    constexpr std::size_t size = identity_block::size;
    if (const std::size_t nul = nul_in_block(field.data()); nul != size) [[likely]]
        return nul + 1 == field.size();
    // No NUL precedes the block that ends with the field.
    if (field.size() > size && field.size() <= 2 * size)
        return nul_in_block(field.data() + field.size() - size) == size - 1;
    return format::holds_exact_string(field);
}

// How one identity compares with another, without regard to letter case.
enum class identity_order : std::uint8_t {
    before,
    same,
    behind,
    unknown, // the stored field has no NUL
};

// An identity to find among many.
class wanted_identity {
public:
    explicit wanted_identity(const char *text) : text_(text), block_(identity_block::of_string(text)) {}

    // True for most entries that sort before the wanted identity, and for no others. `block` is the start of an
    // entry's field, which ends in NUL. Bytes after that NUL do not matter: the wanted identity differs before it,
    // or ends there, too, and is padded with NULs, before which nothing sorts.
    bool is_clearly_behind(const identity_block &block) const { return block.sorts_before(block_); }

    identity_order compare(byte_span stored) const {
        for (std::size_t index = 0; index < stored.size(); ++index) {
            const unsigned wanted = fold(static_cast<unsigned char>(text_[index]));
            const unsigned held = fold(stored[index]);
            if (wanted != held)
                return wanted < held ? identity_order::before : identity_order::behind;
            if (wanted == 0)
                return identity_order::same;
        }
        return identity_order::unknown;
    }

private:
    const char *text_;
    identity_block block_;
};

} // namespace qz

#endif
