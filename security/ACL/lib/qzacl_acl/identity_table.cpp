// A hash table from identities to entry numbers.
#include "qzacl_acl/identity_table.h"

#include <algorithm>
#include <new>

namespace qz {

shortage identity_table::reset(std::uint32_t count) {
    unsigned bits = 0;
    while (room_of(bits) < count)
        ++bits;
    // With 32-bit sizes this may not fit. Allocating SIZE_MAX bytes fails in any case.
    const std::uint64_t wanted = alignof(head) + sizeof(head) + (std::uint64_t{sizeof(group)} << bits);
    const auto size = static_cast<std::size_t>(std::min<std::uint64_t>(wanted, SIZE_MAX));
    owned<void> memory(std::calloc(size, 1));
    if (memory == nullptr)
        return shortage(size);
    release();
    const std::size_t misaligned = reinterpret_cast<std::uintptr_t>(memory.get()) % alignof(head);
    void *const aligned = static_cast<char *>(memory.get()) + (alignof(head) - misaligned);
    head_ = new (aligned) head{std::move(memory), make_identity_hash_key(), bits};
    return {};
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
