// A growing array of small entries.
#include "qzacl_acl/entry_array.h"

namespace qz {

bool entry_array::reserve(std::uint32_t capacity, std::size_t &refused) {
    const std::size_t size = capacity * sizeof(small_entry);
    void *const old = entries_ == &first_ ? nullptr : entries_;
    auto *grown = static_cast<small_entry *>(std::realloc(old, size));
    if (grown == nullptr) {
        refused = size;
        return false;
    }
    if (old == nullptr)
        *grown = first_;
    entries_ = grown;
    capacity_ = capacity;
    return true;
}

} // namespace qz
