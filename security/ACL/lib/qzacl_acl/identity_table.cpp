// The numbers of entries by the hashes of their identities.
#include "qzacl_acl/identity_table.h"

#include <algorithm>
#include <new>

namespace qz {

bool identity_table::reset(std::uint32_t count, std::size_t &refused) {
    unsigned bits = 0;
    while (room_of(bits) < count)
        ++bits;
    // Where a size has 32 bits, it may be too small to say it; an allocation of that much fails.
    constexpr std::size_t most = SIZE_MAX - alignof(head);
    const std::uint64_t wanted_size = sizeof(head) + (std::uint64_t{sizeof(group)} << bits);
    const auto table_size = static_cast<std::size_t>(std::min<std::uint64_t>(wanted_size, most));
    std::size_t size = table_size + alignof(head);
    owned<void> memory(std::calloc(size, 1));
    if (memory == nullptr) {
        refused = size;
        return false;
    }
    release();
    void *aligned = memory.get();
    std::align(alignof(head), table_size, aligned, size);
    head_ = new (aligned) head{std::move(memory), make_identity_hash_key(), bits};
    return true;
}

void identity_table::release() {
    if (head_ != nullptr)
        const owned<void> memory = std::move(std::exchange(head_, nullptr)->memory);
}

void identity_table::enter(std::uint64_t hash, std::uint32_t number) {
    for (std::size_t at = first_group(hash);; at = next_group(at)) {
        const unsigned slots = groups()[at].slots_with(free_slot);
        if (slots == 0)
            continue;
        const int slot = std::countr_zero(slots);
        groups()[at].tags[slot] = tag_of(hash);
        groups()[at].numbers[slot] = number;
        return;
    }
}

} // namespace qz
