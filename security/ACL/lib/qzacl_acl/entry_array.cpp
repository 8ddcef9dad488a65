// A growing array of small entries.
#include "qzacl_acl/entry_array.h"

namespace qz {

bool entry_array::reserve(std::uint32_t capacity, std::size_t &refused) {
    if (!reallocate(more_, capacity)) {
        refused = capacity * sizeof(small_entry);
        return false;
    }
    if (entries_ == &first_)
        more_[0] = first_;
    entries_ = more_.get();
    capacity_ = capacity;
    return true;
}

} // namespace qz
