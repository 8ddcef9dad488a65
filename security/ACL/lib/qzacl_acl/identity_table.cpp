// The numbers of entries by the hashes of their identities.
#include "qzacl_acl/identity_table.h"

namespace qz {

bool identity_table::reset(std::uint32_t count, std::size_t &refused) {
    unsigned bits = 0;
    while (room_of(bits) < count)
        ++bits;
    std::size_t size = (sizeof(group) << bits) + alignof(group);
    owned<void> memory(std::calloc(size, 1));
    if (memory == nullptr) {
        refused = size;
        return false;
    }
    void *aligned = memory.get();
    groups_ = static_cast<group *>(std::align(alignof(group), sizeof(group) << bits, aligned, size));
    memory_ = std::move(memory);
    group_bits_ = bits;
    key_ = make_identity_hash_key();
    return true;
}

void identity_table::enter(std::uint64_t hash, std::uint32_t number) {
    for (std::size_t at = first_group(hash);; at = next_group(at)) {
        const unsigned slots = groups_[at].slots_with(free_slot);
        if (slots == 0)
            continue;
        const int slot = std::countr_zero(slots);
        groups_[at].tags[slot] = tag_of(hash);
        groups_[at].numbers[slot] = number;
        return;
    }
}

} // namespace qz
