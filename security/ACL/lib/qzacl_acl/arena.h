// Memory that is handed out in pieces and freed as a whole.
#ifndef QZACL_ARENA_H
#define QZACL_ARENA_H

#include "base/owned.h"

#include <cstddef>
#include <cstdint>

namespace qz {

class arena {
public:
    arena() = default;
    arena(const arena &) = delete;
    arena &operator=(const arena &) = delete;
    ~arena();

    // Makes room for `size` bytes, aligned to eight. They are at room() until keep() claims them.
    shortage make_room(std::size_t size);
    unsigned char *room() { return at_; }
    void keep(std::size_t size);

private:
    struct alignas(std::uint64_t) chunk {
        chunk *previous;
    };

    unsigned char *at_ = nullptr;
    unsigned char *end_ = nullptr;
    chunk *last_ = nullptr;
    std::size_t next_size_ = 512;
};

} // namespace qz

#endif
