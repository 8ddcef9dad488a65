// The numbers of entries by the hashes of their identities.
#include "qzacl_acl/identity_table.h"

#include <new>

namespace qz {

bool identity_table::reset(std::uint32_t count, std::size_t &refused) {
    unsigned bits = 0;
    while (room_of(bits) < count)
        ++bits;
    const std::size_t table_size = sizeof(head) + (sizeof(group) << bits);
    const std::size_t size = table_size + alignof(head);
    owned<void> memory(std::calloc(size, 1));
    if (memory == nullptr) {
        refused = size;
        return false;
    }
    release();
    const std::size_t misaligned = reinterpret_cast<std::uintptr_t>(memory.get()) % alignof(head);
    void *const aligned = static_cast<char *>(memory.get()) + (alignof(head) - misaligned);
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
