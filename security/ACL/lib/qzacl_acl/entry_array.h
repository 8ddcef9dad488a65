// A growing array of small entries. Its first entry needs no allocation: with many mechanisms, most trees hold just
// one.
#ifndef QZACL_ENTRY_ARRAY_H
#define QZACL_ENTRY_ARRAY_H

#include "base/owned.h"
#include "qzacl_acl/entry_sort.h"

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <span>

namespace qz {

class entry_array {
public:
    entry_array() = default;
    entry_array(const entry_array &) = delete;
    entry_array &operator=(const entry_array &) = delete;
    ~entry_array() {
        if (entries_ != &first_)
            std::free(entries_);
    }

    std::uint32_t count() const { return count_; }
    bool is_full() const { return count_ == capacity_; }
    shortage reserve(std::uint32_t capacity);
    // Appends an entry. There must be room.
    small_entry &append(const small_entry &entry) { return entries_[count_++] = entry; }

    std::span<small_entry> all() { return {entries_, count_}; }
    std::span<const small_entry> all() const { return {entries_, count_}; }

private:
    small_entry first_ = {};
    small_entry *entries_ = &first_; // or a block
    std::uint32_t count_ = 0;
    std::uint32_t capacity_ = 1;
};

} // namespace qz

#endif
