// The numbers of entries by the hashes of their identities.
//
// Sixteen slots make a group, of which each slot has a tag of one byte and a number. The tags of a group, a part of the
// hashes, are tested at once, so that a look-up that finds nothing hardly ever has to look at an entry.
#ifndef QZACL_IDENTITY_TABLE_H
#define QZACL_IDENTITY_TABLE_H

#include "owned.h"
#include "qzacl_acl/identity_order.h"

#include <bit>
#include <cstddef>
#include <cstdint>
#include <cstring>

#ifdef __SSE2__
#include <emmintrin.h>
#endif

namespace qz {

class identity_table {
public:
    static constexpr std::uint32_t none = UINT32_MAX;

    // Makes an empty table with room for `count` entries. False, the bytes asked for in `refused`, when memory is
    // lacking; then the table is as before.
    bool reset(std::uint32_t count, std::size_t &refused);
    void release() { *this = {}; }
    // How many entries it has room for.
    std::uint64_t room() const { return tags_ == nullptr ? 0 : group_count() * group_size / 8 * 7; }

    std::uint64_t hash(const char *identity, std::uint64_t first_word) const {
        return hash_identity(identity, first_word, key_);
    }

    // The number among those with the given hash that `is_wanted` says yes to, or none.
    template <class Wanted>
    std::uint32_t find(std::uint64_t hash, const Wanted &is_wanted) const {
        for (std::size_t group = first_group(hash);; group = next_group(group)) {
            for (unsigned slots = slots_with(group, tag_of(hash)); slots != 0; slots &= slots - 1) {
                const std::uint32_t number = number_at(group, static_cast<unsigned>(std::countr_zero(slots)));
                if (is_wanted(number))
                    return number;
            }
            if (slots_with(group, free_slot) != 0)
                return none;
        }
    }

    // Enters a number; there is room for it.
    void enter(std::uint64_t hash, std::uint32_t number);

private:
    static constexpr std::size_t group_size = 16;
    static constexpr unsigned char free_slot = 0;

    std::size_t group_count() const { return std::size_t{1} << group_bits_; }
    // The high bits of a hash choose the group, the low ones the tag.
    std::size_t first_group(std::uint64_t hash) const { return (hash >> 1) >> (63 - group_bits_); }
    std::size_t next_group(std::size_t group) const { return (group + 1) & (group_count() - 1); }
    static unsigned char tag_of(std::uint64_t hash) {
        const auto tag = static_cast<unsigned char>(hash);
        return tag == free_slot ? 1 : tag;
    }

    // The slots of a group that have the tag, as bits.
    unsigned slots_with(std::size_t group, unsigned char tag) const {
        const unsigned char *const tags = tags_.get() + group * group_size;
#ifdef __SSE2__
        const __m128i held = _mm_load_si128(reinterpret_cast<const __m128i *>(tags));
        return static_cast<unsigned>(
            _mm_movemask_epi8(_mm_cmpeq_epi8(held, _mm_set1_epi8(static_cast<char>(tag)))));
#else
        unsigned slots = 0;
        for (unsigned slot = 0; slot < group_size; ++slot)
            slots |= static_cast<unsigned>(tags[slot] == tag) << slot;
        return slots;
#endif
    }

    // The numbers stand behind all tags.
    unsigned char *place_of_number(std::size_t group, unsigned slot) const {
        return tags_.get() + group_count() * group_size + (group * group_size + slot) * sizeof(std::uint32_t);
    }
    std::uint32_t number_at(std::size_t group, unsigned slot) const {
        std::uint32_t number = 0;
        std::memcpy(&number, place_of_number(group, slot), sizeof number);
        return number;
    }

    owned<unsigned char[]> tags_;
    unsigned group_bits_ = 0;
    identity_hash_key key_;
};

} // namespace qz

#endif
