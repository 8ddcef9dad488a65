// Owners of memory from malloc and of file descriptors.
#ifndef QZ_OWNED_H
#define QZ_OWNED_H

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <memory>
#include <type_traits>
#include <unistd.h>
#include <utility>

namespace qz {

struct free_memory {
    void operator()(void *memory) const { std::free(memory); }
};

// Memory from malloc. release() passes it to a caller, who frees it with free().
template <class T>
using owned = std::unique_ptr<T, free_memory>;

// The size of an allocation that failed, for its message; none where all succeeded.
class [[nodiscard]] shortage {
public:
    constexpr shortage() = default;
    explicit constexpr shortage(std::size_t bytes) : bytes_(bytes) {}

    explicit constexpr operator bool() const { return bytes_ != 0; }
    constexpr std::size_t bytes() const { return bytes_; }

private:
    std::size_t bytes_ = 0;
};

// Uninitialised memory for `count` objects of a trivial type, or null.
template <class T>
owned<T[]> allocate(std::size_t count) {
    static_assert(std::is_trivial_v<T>);
    if (count > SIZE_MAX / sizeof(T))
        return nullptr;
    return owned<T[]>(static_cast<T *>(std::malloc(count * sizeof(T))));
}

// Resizes an owned array. On failure returns false and leaves the array unchanged.
template <class T>
bool reallocate(owned<T[]> &array, std::size_t count) {
    static_assert(std::is_trivial_v<T>);
    if (count > SIZE_MAX / sizeof(T))
        return false;
    auto *grown = static_cast<T *>(std::realloc(static_cast<void *>(array.get()), count * sizeof(T)));
    if (grown == nullptr)
        return false;
    static_cast<void>(array.release());
    array.reset(grown);
    return true;
}

// An open file descriptor, closed at the end of its scope.
class descriptor {
public:
    descriptor() = default;
    explicit descriptor(int fd) : fd_(fd) {}
    descriptor(descriptor &&other) noexcept : fd_(std::exchange(other.fd_, -1)) {}
    descriptor &operator=(descriptor &&other) noexcept {
        if (this != &other) {
            close();
            fd_ = std::exchange(other.fd_, -1);
        }
        return *this;
    }
    descriptor(const descriptor &) = delete;
    descriptor &operator=(const descriptor &) = delete;
    ~descriptor() { close(); }

    explicit operator bool() const { return fd_ >= 0; }
    int get() const { return fd_; }
    int release() { return std::exchange(fd_, -1); }

    void close() {
        if (fd_ >= 0)
            ::close(release());
    }

private:
    int fd_ = -1;
};

} // namespace qz

#endif
