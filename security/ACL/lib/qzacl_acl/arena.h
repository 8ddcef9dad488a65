// Memory that is handed out piece by piece and given back as a whole.
#ifndef QZACL_ARENA_H
#define QZACL_ARENA_H

#include <cstddef>
#include <cstdint>

namespace qz {

class arena {
public:
    arena() = default;
    arena(const arena &) = delete;
    arena &operator=(const arena &) = delete;
    ~arena();

    // Room for `size` bytes, aligned for numbers of eight bytes, or null; only keep() takes it.
    unsigned char *room(std::size_t size);
    void keep(std::size_t size);

    // What a failed room() asked for.
    std::size_t refused() const { return refused_; }

private:
    struct alignas(std::uint64_t) chunk {
        chunk *previous;
    };

    unsigned char *at_ = nullptr;
    unsigned char *end_ = nullptr;
    chunk *last_ = nullptr;
    std::size_t next_size_ = 512;
    std::size_t refused_ = 0;
};

} // namespace qz

#endif
