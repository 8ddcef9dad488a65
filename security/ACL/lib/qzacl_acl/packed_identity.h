// Identities as they stand packed in a buffer, compared at little more than the cost of the step from one to
// the next.
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

// The first sixteen bytes of a packed identity, folded. Behind the NUL of a shorter one stand whatever bytes follow
// it in the buffer.
class identity_block {
public:
    static constexpr std::size_t size = 16;

#ifdef __x86_64__
    explicit identity_block(const unsigned char *bytes)
        : identity_block(_mm_loadu_si128(reinterpret_cast<const __m128i *>(bytes))) {}

    // The two halves as numbers of which the lesser is that of the string that sorts first.
    std::uint64_t first() const { return ordered(_mm_cvtsi128_si64(bytes_)); }
    std::uint64_t second() const { return ordered(_mm_cvtsi128_si64(_mm_unpackhi_epi64(bytes_, bytes_))); }

private:
    explicit identity_block(__m128i raw) {
        // Moved to where 'A' is the least of all signed values, the letters are those below a limit.
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

    std::uint64_t first() const { return first_byte_highest(words_[0]); }
    std::uint64_t second() const { return first_byte_highest(words_[1]); }

private:
    std::uint64_t words_[2];
#endif

public:
    // True when this block sorts before the other, and one of its first `count` bytes shows it.
    bool sorts_before_within(std::size_t count, const identity_block &other) const {
        const std::uint64_t front = first() ^ other.first();
        if (front != 0)
            return first() < other.first() && static_cast<unsigned>(std::countl_zero(front)) / 8 < count;
        const std::uint64_t back = second() ^ other.second();
        return second() < other.second() && 8 + static_cast<unsigned>(std::countl_zero(back)) / 8 < count;
    }
};

// The place of the first NUL among the sixteen bytes of a block; sixteen where there is none.
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

// True when the string of a field of which a whole block may be read ends where the field does. Most end within
// two blocks, and a call for each would cost more than all the rest of a walk.
inline bool ends_exactly(byte_span field) {
    constexpr std::size_t size = identity_block::size;
    if (const std::size_t nul = nul_in_block(field.data()); nul != size) [[likely]]
        return nul + 1 == field.size();
    // The block that ends with the field: no NUL is before it.
    if (field.size() > size && field.size() <= 2 * size)
        return nul_in_block(field.data() + field.size() - size) == size - 1;
    return format::holds_exact_string(field);
}

// How one identity stands to another, without regard to letter case.
enum class identity_order : std::uint8_t {
    before,
    same,
    behind,
    unknown, // the stored field holds no string that ends inside it
};

// The first sixteen bytes of an identity that is looked for, folded and padded with NULs, as two numbers that compare as
// they do.
class identity_start {
public:
    identity_start(const char *text, std::size_t length)
        : first_(fold8(first_word(text, length))), second_(fold8(second_word(text, length))) {}

    // True for most entries that the wanted identity sorts behind, and for no others. Two words of `stored`, the
    // identity of an entry, can be read even if it is shorter.
    //
    // The letters are not folded, but all bytes get the bit that tells lower case from upper case. That takes no
    // byte below its folded form. And what stands behind a short identity counts as the highest of all. So what
    // sorts before the wanted identity even so does sort before it.
    bool is_far_behind(byte_span stored) const {
        constexpr std::uint64_t case_bits = in_each_byte('a' - 'A');
        const std::uint64_t behind = stored.size() < word_size ? UINT64_MAX >> (8 * stored.size()) : 0;
        const std::uint64_t first = first_byte_highest(load8(stored.data()) | case_bits) | behind;
        if (first < first_) [[likely]]
            return true;
        return first == first_ && stored.size() >= 2 * word_size &&
               first_byte_highest(load8(stored.data() + word_size) | case_bits) < second_;
    }

    // The same at a closer look. `block` is the start of a field that ends in NUL: what stands behind that NUL takes no
    // part, as the wanted identity differs before, or ends there too and is padded with bytes that nothing sorts before.
    bool is_clearly_behind(const identity_block &block) const {
        const std::uint64_t first = block.first();
        return first == first_ ? block.second() < second_ : first < first_;
    }

private:
    // The words are put together in registers: to load one right after fewer bytes were stored would stall a decision
    // for as long as comparing some entries takes.
    static std::uint64_t first_word(const char *text, std::size_t length) {
        if (length >= word_size)
            return first_byte_highest(load8(text));
        std::uint64_t word = 0;
        for (std::size_t index = 0; index < length; ++index)
            word |= std::uint64_t{static_cast<unsigned char>(text[index])} << (8 * (word_size - 1 - index));
        return word;
    }

    static std::uint64_t second_word(const char *text, std::size_t length) {
        if (length <= word_size)
            return 0;
        // The last eight bytes; those that the first word has are shifted out.
        const std::size_t end = std::min(length, 2 * word_size);
        return first_byte_highest(load8(text + end - word_size)) << (8 * (2 * word_size - end));
    }

    std::uint64_t first_;
    std::uint64_t second_;
};

// An identity that is looked for among many.
class wanted_identity {
public:
    explicit wanted_identity(const char *text)
        : text_(text), length_(std::strlen(text)), start_(text, length_) {}

    const identity_start &start() const { return start_; }

    identity_order compare(byte_span stored) const {
        // As many bytes as both have, the NUL that ends the wanted identity among its own.
        const std::size_t shared = std::min(stored.size(), length_ + 1);
        const int order = fold_compare(text_, reinterpret_cast<const char *>(stored.data()), shared);
        if (order != 0)
            return order < 0 ? identity_order::before : identity_order::behind;
        return shared > length_ ? identity_order::same : identity_order::unknown;
    }

private:
    const char *text_;
    std::size_t length_;
    identity_start start_;
};

} // namespace qz

#endif
