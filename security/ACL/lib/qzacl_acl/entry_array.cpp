// A growing array of small entries.
#include "qzacl_acl/entry_array.h"

#include <algorithm>

namespace qz {

shortage entry_array::reserve(std::uint32_t capacity) {
    // With 32-bit sizes, more entries may be expected than a size can express. Allocating them fails in any case.
    constexpr std::size_t most = SIZE_MAX / sizeof(small_entry);
    const std::size_t size = std::min<std::size_t>(capacity, most) * sizeof(small_entry);
    void *const old = entries_ == &first_ ? nullptr : entries_;
    auto *grown = static_cast<small_entry *>(std::realloc(old, size));
    if (grown == nullptr)
        return shortage(size);
    if (old == nullptr)
        *grown = first_;
    entries_ = grown;
    capacity_ = capacity;
    return {};
}

} // namespace qz
