// The numbers of entries by the hashes of their identities.
#include "qzacl_acl/identity_table.h"

namespace qz {

bool identity_table::reset(std::uint32_t count, std::size_t &refused) {
    unsigned bits = 0;
    while ((group_size << bits) / 8 * 7 < count)
        ++bits;
    const std::size_t size = (group_size << bits) * (sizeof(unsigned char) + sizeof(std::uint32_t));
    owned<unsigned char[]> tags(static_cast<unsigned char *>(std::calloc(size, 1)));
    if (tags == nullptr) {
        refused = size;
        return false;
    }
    tags_ = std::move(tags);
    group_bits_ = bits;
    key_ = make_identity_hash_key();
    return true;
}

void identity_table::enter(std::uint64_t hash, std::uint32_t number) {
    for (std::size_t group = first_group(hash);; group = next_group(group)) {
        const unsigned slots = slots_with(group, free_slot);
        if (slots == 0)
            continue;
        const auto slot = static_cast<unsigned>(std::countr_zero(slots));
        tags_[group * group_size + slot] = tag_of(hash);
        std::memcpy(place_of_number(group, slot), &number, sizeof number);
        return;
    }
}

} // namespace qz
