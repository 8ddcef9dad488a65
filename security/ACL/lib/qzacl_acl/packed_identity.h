// Identities as they stand packed in a buffer, compared at little more than the cost of the step from one to
// the next.
#ifndef QZACL_PACKED_IDENTITY_H
#define QZACL_PACKED_IDENTITY_H

#include "bytes.h"
#include "libqz_cu/posix_fold.h"

#include <bit>
#include <cstddef>
#include <cstdint>
#include <cstring>

#ifdef __SSE2__
#include <emmintrin.h>
#endif

namespace qz {

// The first sixteen bytes of an identity, folded. Behind the NUL of a shorter one stand whatever bytes follow
// it.
class identity_block {
public:
    static constexpr std::size_t size = 16;

#ifdef __SSE2__
    explicit identity_block(const unsigned char *bytes)
        : identity_block(_mm_loadu_si128(reinterpret_cast<const __m128i *>(bytes))) {}

    // The block of a string, padded with NULs. It is put together in registers: to read sixteen bytes right
    // after fewer were stored would stall a decision for as long as comparing some entries takes.
    static identity_block of_string(const char *text) {
        const std::size_t length = strnlen(text, size);
        std::uint64_t low = 0;
        std::uint64_t high = 0;
        if (length >= 8) {
            low = load8(text);
            if (length > 8)
                high = load8(text + length - 8) >> (8 * (size - length));
        } else if (length >= 4) {
            low = load4(text) | load4(text + length - 4) << (8 * (length - 4));
        } else {
            for (std::size_t index = 0; index < length; ++index)
                low |= std::uint64_t{static_cast<unsigned char>(text[index])} << (8 * index);
        }
        return identity_block(_mm_set_epi64x(static_cast<long long>(high), static_cast<long long>(low)));
    }

    // The place of the first byte that differs, where that byte sorts before the other's; else at least
    // `size`.
    unsigned lower_at(const identity_block &other) const {
        const unsigned equal = mask_of(_mm_cmpeq_epi8(bytes_, other.bytes_));
        const unsigned not_above = mask_of(_mm_cmpeq_epi8(_mm_min_epu8(bytes_, other.bytes_), bytes_));
        // Adding one carries through the equal bytes to the first that differs.
        return static_cast<unsigned>(std::countr_zero((equal + 1) & ~equal & not_above & 0xffff));
    }

    // The place of the first NUL; at least `size` where there is none.
    unsigned nul_at() const {
        return static_cast<unsigned>(std::countr_zero(mask_of(_mm_cmpeq_epi8(bytes_, _mm_setzero_si128()))));
    }

private:
    explicit identity_block(__m128i raw) {
        const __m128i is_upper = _mm_and_si128(_mm_cmpgt_epi8(raw, _mm_set1_epi8('A' - 1)),
                                               _mm_cmplt_epi8(raw, _mm_set1_epi8('Z' + 1)));
        bytes_ = _mm_or_si128(raw, _mm_and_si128(is_upper, _mm_set1_epi8('a' - 'A')));
    }

    static std::uint64_t load4(const char *at) {
        std::uint32_t word = 0;
        std::memcpy(&word, at, sizeof word);
        return word;
    }

    static unsigned mask_of(__m128i bytes) { return static_cast<unsigned>(_mm_movemask_epi8(bytes)); }

    __m128i bytes_;
#else
    explicit identity_block(const unsigned char *bytes) {
        for (std::size_t index = 0; index < size; ++index)
            bytes_[index] = fold(bytes[index]);
    }

    static identity_block of_string(const char *text) {
        unsigned char padded[size] = {};
        std::memcpy(padded, text, strnlen(text, size));
        return identity_block(padded);
    }

    unsigned lower_at(const identity_block &other) const {
        unsigned at = 0;
        while (at < size && bytes_[at] == other.bytes_[at])
            ++at;
        return at < size && bytes_[at] < other.bytes_[at] ? at : unsigned{size};
    }

    unsigned nul_at() const {
        const void *nul = std::memchr(bytes_, '\0', size);
        return nul == nullptr ? unsigned{size}
                              : static_cast<unsigned>(static_cast<const unsigned char *>(nul) - bytes_);
    }

private:
    unsigned char bytes_[size];
#endif
};

// The place of the first NUL among the sixteen bytes of a block; at least sixteen where there is none.
inline unsigned nul_in_block(const unsigned char *bytes) {
#ifdef __SSE2__
    const __m128i raw = _mm_loadu_si128(reinterpret_cast<const __m128i *>(bytes));
    const int nuls = _mm_movemask_epi8(_mm_cmpeq_epi8(raw, _mm_setzero_si128()));
    return static_cast<unsigned>(std::countr_zero(static_cast<unsigned>(nuls)));
#else
    return identity_block(bytes).nul_at();
#endif
}

// How one identity stands to another, without regard to letter case.
enum class identity_order : std::uint8_t {
    before,
    same,
    behind,
    unknown, // the stored field holds no string that ends inside it
};

// An identity that is looked for among many.
class wanted_identity {
public:
    explicit wanted_identity(const char *text) : text_(text), block_(identity_block::of_string(text)) {}

    // True for most entries that the wanted identity sorts behind, and for no others. `stored` is the entry's
    // field, of which the last byte is NUL, and `block` its start: what stands behind that NUL takes no part,
    // as the wanted identity differs before, or ends there too and is padded with bytes that nothing sorts
    // before.
    bool is_clearly_behind(const identity_block &block) const {
        return block.lower_at(block_) < identity_block::size;
    }

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
