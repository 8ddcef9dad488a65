// Memory that is handed out in pieces and freed as a whole.
#include "qzacl_acl/arena.h"

#include <algorithm>
#include <cstdlib>
#include <new>

namespace qz {
namespace {

std::size_t aligned(std::size_t size) {
    constexpr std::size_t alignment = alignof(std::uint64_t);
    return (size + alignment - 1) / alignment * alignment;
}

} // namespace

arena::~arena() {
    for (chunk *at = last_; at != nullptr;) {
        chunk *previous = at->previous;
        std::free(at);
        at = previous;
    }
}

shortage arena::make_room(std::size_t size) {
    constexpr std::size_t largest_chunk = std::size_t{1} << 20;
    if (aligned(size) <= static_cast<std::size_t>(end_ - at_))
        return {};
    const std::size_t chunk_size = std::max(next_size_, aligned(size) + sizeof(chunk));
    auto *memory = static_cast<unsigned char *>(std::malloc(chunk_size));
    if (memory == nullptr)
        return shortage(chunk_size);
    last_ = new (memory) chunk{last_};
    at_ = memory + sizeof(chunk);
    end_ = memory + chunk_size;
    next_size_ = std::min(next_size_ * 2, largest_chunk);
    return {};
}

void arena::keep(std::size_t size) { at_ += aligned(size); }

} // namespace qz
