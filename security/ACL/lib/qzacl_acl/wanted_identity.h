// One identity compared with many stored ones, at little more than the cost of the step from one to the next.
#ifndef QZACL_WANTED_IDENTITY_H
#define QZACL_WANTED_IDENTITY_H

#include "bytes.h"
#include "libqz_cu/posix_fold.h"

#include <cstddef>
#include <cstdint>
#include <cstring>

#ifdef __SSE2__
#include <emmintrin.h>
#endif

namespace qz {

// How a wanted identity stands to a stored one, without regard to letter case.
enum class identity_order : std::uint8_t {
    before,
    same,
    behind,
    unknown, // the stored field holds no string that ends inside it
};

class wanted_identity {
public:
    explicit wanted_identity(const char *text) : text_(text) {
        std::memcpy(block_, text, strnlen(text, block_size));
        std::uint64_t words[block_size / sizeof(std::uint64_t)];
        std::memcpy(words, block_, block_size);
        for (std::uint64_t &word : words)
            word = fold8(word);
        std::memcpy(block_, words, block_size);
    }

    // True for most entries that the wanted identity sorts behind, and for no others: the first byte that
    // differs, of sixteen, decides. `left` bytes may be looked at from the start of the stored field to the
    // end of the buffer.
    bool is_clearly_behind(byte_span stored, std::size_t left) const {
#ifdef __SSE2__
        // Bytes behind the stored NUL take no part: the wanted identity has a byte above NUL there, or ends
        // there too and then has no byte below what follows.
        if (left < block_size || stored.empty() || stored.back() != '\0')
            return false;
        const __m128i raw = _mm_loadu_si128(reinterpret_cast<const __m128i *>(stored.data()));
        const __m128i is_upper = _mm_and_si128(_mm_cmpgt_epi8(raw, _mm_set1_epi8('A' - 1)),
                                               _mm_cmplt_epi8(raw, _mm_set1_epi8('Z' + 1)));
        const __m128i held = _mm_or_si128(raw, _mm_and_si128(is_upper, _mm_set1_epi8('a' - 'A')));
        const __m128i wanted = _mm_load_si128(reinterpret_cast<const __m128i *>(block_));
        const auto equal = static_cast<unsigned>(_mm_movemask_epi8(_mm_cmpeq_epi8(held, wanted)));
        const auto not_above =
            static_cast<unsigned>(_mm_movemask_epi8(_mm_cmpeq_epi8(_mm_min_epu8(held, wanted), held)));
        // Adding one carries through the equal bytes to the first that differs.
        return ((equal + 1) & ~equal & not_above) != 0;
#else
        static_cast<void>(left);
        return compare(stored) == identity_order::behind;
#endif
    }

    identity_order compare(byte_span stored) const;

private:
    static constexpr std::size_t block_size = 16;

    const char *text_;
    alignas(block_size) unsigned char block_[block_size] = {}; // its start, folded and padded with NULs
};

inline identity_order wanted_identity::compare(byte_span stored) const {
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

} // namespace qz

#endif
