// The shape of the tree that plain insertion makes.
#include "qzacl_acl/tree_shape.h"

#include <algorithm>

namespace qz {

const small_entry *topmost(std::span<const small_entry> in_order) {
    const auto is_held = [](const small_entry &entry) { return entry.is_deleted == 0; };
    auto at = std::find_if(in_order.begin(), in_order.end(), is_held);
    if (at == in_order.end())
        return nullptr;
    // The walk goes left wherever something is left there, so down to this first one. What heads it from the right was
    // inserted before everything in between; all that heads it from the left was deleted.
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
