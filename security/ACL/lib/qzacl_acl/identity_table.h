// A hash table from identities to entry numbers.
//
// A group of twelve slots fills a cache line. Each slot has a number and a one-byte tag, which is a part of the
// hash. The tags of a group are compared at once, so a look-up that finds nothing rarely touches an entry.
#ifndef QZACL_IDENTITY_TABLE_H
#define QZACL_IDENTITY_TABLE_H

#include "base/owned.h"
#include "qzacl_acl/identity_order.h"

#include <bit>
#include <cstddef>
#include <cstdint>

#ifdef __SSE2__
#include <emmintrin.h>
#endif

namespace qz {

class identity_table {
public:
    static constexpr std::uint32_t none = UINT32_MAX;

    identity_table() = default;
    identity_table(const identity_table &) = delete;
    identity_table &operator=(const identity_table &) = delete;
    ~identity_table() { release(); }

    // Makes an empty table with room for `count` entries. Without memory the table stays as it is.
    shortage reset(std::uint32_t count);
    void release();
    // How many entries it has room for; 0 before reset().
    std::uint64_t room() const { return head_ == nullptr ? 0 : room_of(head_->group_bits); }

    // `first_word` is the identity's first ordered word. Requires a table.
    std::uint64_t hash(const char *identity, std::uint64_t first_word) const {
        return hash_identity(identity, first_word, head_->key);
    }

    // The memory that a look-up of the hash reads first. Requires a table.
    const void *first_look(std::uint64_t hash) const { return &groups()[first_group(hash)]; }

    // The number with the given hash that `is_wanted` accepts, or none. Requires a table.
    template <class Wanted>
    std::uint32_t find(std::uint64_t hash, const Wanted &is_wanted) const {
        for (std::size_t at = first_group(hash);; at = next_group(at)) {
            const group &here = groups()[at];
            for (unsigned slots = here.slots_with(tag_of(hash)); slots != 0; slots &= slots - 1) {
                const std::uint32_t number = here.numbers[std::countr_zero(slots)];
                if (is_wanted(number))
                    return number;
            }
            if (here.slots_with(free_slot) != 0)
                return none;
        }
    }

    // Enters a number. There must be room.
    void enter(std::uint64_t hash, std::uint32_t number);

private:
    static constexpr unsigned slot_count = 12;
    static constexpr unsigned char free_slot = 0;

    struct alignas(64) group {
        unsigned char tags[16]; // the last four are unused
        std::uint32_t numbers[slot_count];

        // The slots that have the tag, as bits.
        unsigned slots_with(unsigned char tag) const {
            constexpr unsigned used = (1u << slot_count) - 1;
#ifdef __SSE2__
            const __m128i held = _mm_load_si128(reinterpret_cast<const __m128i *>(tags));
            const __m128i equal = _mm_cmpeq_epi8(held, _mm_set1_epi8(static_cast<char>(tag)));
            return static_cast<unsigned>(_mm_movemask_epi8(equal)) & used;
#else
            unsigned slots = 0;
            for (unsigned slot = 0; slot < slot_count; ++slot)
                slots |= static_cast<unsigned>(tags[slot] == tag) << slot;
            return slots & used;
#endif
        }
    };
    static_assert(sizeof(group) == 64);

    // One slot in eight stays free.
    static constexpr std::uint64_t room_of(unsigned group_bits) {
        return (std::uint64_t{slot_count} << group_bits) / 8 * 7;
    }

    // The high bits of a hash select the group, the low ones are the tag.
    std::size_t first_group(std::uint64_t hash) const {
        return static_cast<std::size_t>((hash >> 1) >> (63 - head_->group_bits));
    }
    std::size_t next_group(std::size_t at) const {
        return (at + 1) & ((std::size_t{1} << head_->group_bits) - 1);
    }
    static unsigned char tag_of(std::uint64_t hash) {
        const auto tag = static_cast<unsigned char>(hash);
        return tag == free_slot ? 1 : tag;
    }

    // Precedes the groups, so that the many trees without a table spend only one pointer on it.
    struct alignas(group) head {
        owned<void> memory; // of the head and the groups
        identity_hash_key key;
        unsigned group_bits;
    };
    group *groups() const { return reinterpret_cast<group *>(head_ + 1); }

    head *head_ = nullptr;
};

} // namespace qz

#endif
