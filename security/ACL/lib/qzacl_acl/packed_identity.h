// Comparing identities in a buffer, at little more than the cost of stepping from one to the next.
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

// The first sixteen bytes of a packed identity, folded; a shorter one is padded with NULs. Sixteen bytes must be
// readable.
class identity_block {
public:
    static constexpr std::size_t size = 16;

#ifdef __x86_64__
    explicit identity_block(byte_span identity) {
        static constexpr unsigned char kept[2 * size] = {255, 255, 255, 255, 255, 255, 255, 255,
                                                         255, 255, 255, 255, 255, 255, 255, 255};
        const __m128i is_kept = load(kept + (identity.size() < size ? size - identity.size() : 0));
        const __m128i raw = _mm_and_si128(load(identity.data()), is_kept);
        // With 'A' moved to the least signed value, upper-case letters are the values below a limit.
        constexpr int least = -128;
        const __m128i moved = _mm_add_epi8(raw, _mm_set1_epi8(static_cast<char>(least - 'A')));
        const __m128i is_upper = _mm_cmplt_epi8(moved, _mm_set1_epi8(static_cast<char>(least + 26)));
        const __m128i folded = _mm_or_si128(raw, _mm_and_si128(is_upper, _mm_set1_epi8('a' - 'A')));
        first_ = ordered(_mm_cvtsi128_si64(folded));
        second_ = ordered(_mm_cvtsi128_si64(_mm_unpackhi_epi64(folded, folded)));
    }

private:
    static __m128i load(const unsigned char *bytes) {
        return _mm_loadu_si128(reinterpret_cast<const __m128i *>(bytes));
    }
    static std::uint64_t ordered(long long word) {
        return first_byte_highest(static_cast<std::uint64_t>(word));
    }
#else
    explicit identity_block(byte_span identity)
        : first_(folded(identity.data(), identity.size())),
          second_(
              folded(identity.data() + word_size, identity.size() - std::min(identity.size(), word_size))) {}

private:
    static std::uint64_t folded(const unsigned char *bytes, std::size_t count) {
        return fold8(first_byte_highest(load8(bytes))) & ~bits_after(count);
    }
#endif

public:
    // The two halves as numbers that compare as their bytes do.
    std::uint64_t first() const { return first_; }
    std::uint64_t second() const { return second_; }

    bool sorts_before(const identity_block &other) const {
        if (first_ != other.first_) [[likely]]
            return first_ < other.first_;
        return second_ < other.second_;
    }

private:
    std::uint64_t first_;
    std::uint64_t second_;
};

// A bit for each NUL among the sixteen bytes of a block, the lowest bit for the first byte. The first NUL is always
// reported; later ones may be missing.
inline unsigned nuls_in_block(const unsigned char *bytes) {
#ifdef __x86_64__
    const __m128i raw = _mm_loadu_si128(reinterpret_cast<const __m128i *>(bytes));
    return static_cast<unsigned>(_mm_movemask_epi8(_mm_cmpeq_epi8(raw, _mm_setzero_si128())));
#else
    const unsigned front = bytes_before_nul(load8(bytes));
    const unsigned nul = front < word_size ? front : front + bytes_before_nul(load8(bytes + word_size));
    return nul < identity_block::size ? 1U << nul : 0;
#endif
}

// True when the string ends where its field does. A whole block of the field must be readable. Most strings end
// within two blocks; a call for each would cost more than the rest of a walk.
inline bool ends_exactly(byte_span field) {
    constexpr std::size_t size = identity_block::size;
    const unsigned nuls = nuls_in_block(field.data());
    if (field.size() <= size) [[likely]]
        return static_cast<std::size_t>(std::countr_zero(nuls | 1U << size)) + 1 == field.size();
    // No NUL precedes the block that ends with the field.
    if (field.size() <= 2 * size)
        return nuls == 0 && nuls_in_block(field.data() + field.size() - size) == 1U << (size - 1);
    return format::holds_exact_string(field);
}

// How one identity compares with another, without regard to letter case.
enum class identity_order : std::uint8_t {
    before,
    same,
    after,
    unknown, // the stored field has no NUL
};

// The first sixteen bytes of a wanted identity, folded and padded with NULs, as two numbers that compare as the
// bytes do.
class identity_start {
public:
    identity_start(const char *text, std::size_t length)
        : first_(fold8(first_word(text, length))), second_(fold8(second_word(text, length))) {}

    // Sorts after every identity that does not start with sixteen bytes of 0xff.
    static identity_start after_all() { return {UINT64_MAX, UINT64_MAX}; }

    // True for most entries that sort before the wanted identity, and for no others. Two words of `stored`, an
    // entry's identity, must be readable even if it is shorter.
    //
    // Instead of folding letters, this sets the case bit in every byte, which makes no byte less than its folded
    // form. Bytes after a short identity count as 0xff. So an identity that is less even then sorts before.
    bool is_far_after(byte_span stored) const {
        constexpr std::uint64_t case_bits = in_each_byte('a' - 'A');
        const std::uint64_t first =
            first_byte_highest(load8(stored.data()) | case_bits) | bits_after(stored.size());
        if (first < first_) [[likely]]
            return true;
        return first == first_ && stored.size() >= 2 * word_size &&
               first_byte_highest(load8(stored.data() + word_size) | case_bits) < second_;
    }

    // The same for more entries, at a higher cost. Holds only for a field that ends in NUL: without one, a stored
    // identity that the wanted one starts with counts as well.
    bool is_clearly_after(const identity_block &stored) const {
        const std::uint64_t first = stored.first();
        if (first < first_) [[likely]]
            return true;
        return first == first_ && stored.second() < second_;
    }

private:
    identity_start(std::uint64_t first, std::uint64_t second) : first_(first), second_(second) {}

    // The words are assembled in registers: loading one right after storing fewer bytes would stall as long as
    // comparing several entries takes.
    static std::uint64_t first_word(const char *text, std::size_t length) {
        return length >= word_size ? first_byte_highest(load8(text))
                                   : __builtin_bswap64(load_few(text, length));
    }

    static std::uint64_t second_word(const char *text, std::size_t length) {
        if (length <= word_size)
            return 0;
        // The last eight bytes, without those in the first word.
        const std::size_t end = std::min(length, 2 * word_size);
        return first_byte_highest(load8(text + end - word_size)) << (8 * (2 * word_size - end));
    }

    std::uint64_t first_;
    std::uint64_t second_;
};

// An identity to find among many.
class wanted_identity {
public:
    explicit wanted_identity(const char *text)
        : text_(text), length_(std::strlen(text)), start_(text, length_) {}

    const identity_start &start() const { return start_; }

    identity_order compare(byte_span stored) const {
        // The terminating NUL of the wanted identity is compared like its other bytes.
        const std::size_t shared = std::min(stored.size(), length_ + 1);
        const int order = fold_compare(text_, reinterpret_cast<const char *>(stored.data()), shared);
        if (order != 0)
            return order < 0 ? identity_order::before : identity_order::after;
        return shared > length_ ? identity_order::same : identity_order::unknown;
    }

private:
    const char *text_;
    std::size_t length_;
    identity_start start_;
};

} // namespace qz

#endif
