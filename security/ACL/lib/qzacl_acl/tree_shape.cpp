// The shape of a linked tree built by plain insertion.
#include "qzacl_acl/tree_shape.h"

#include <algorithm>

namespace qz {

const small_entry *topmost(std::span<const small_entry> in_order) {
    const auto is_held = [](const small_entry &entry) { return entry.is_deleted == 0; };
    auto at = std::find_if(in_order.begin(), in_order.end(), is_held);
    if (at == in_order.end())
        return nullptr;
    // A pre-order walk heads for the first held entry, because all entries before it were deleted. An entry after
    // it is its ancestor if it was inserted before everything in between. The last such entry that is held is met
    // first.
    const small_entry *found = &*at;
    std::uint32_t earliest = at->place;
    for (; at != in_order.end(); ++at) {
        if (at->place >= earliest)
            continue;
        earliest = at->place;
        if (is_held(*at))
            found = &*at;
    }
    return found;
}

} // namespace qz
