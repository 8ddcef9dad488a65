/*
 * A file in memory: the part of <qz/service.hpp> that hands texts to the library. Nothing here is for callers.
 */
#ifndef QZ_MEMORY_FILE_HPP
#define QZ_MEMORY_FILE_HPP

#include <cerrno>
#include <pthread.h>
#include <string_view>
#include <sys/mman.h>
#include <unistd.h>

namespace qz::detail {

class descriptor {
public:
    explicit descriptor(int number) noexcept : number_(number) {}
    descriptor(const descriptor &) = delete;
    descriptor &operator=(const descriptor &) = delete;
    ~descriptor() {
        if (number_ >= 0)
            close(number_);
    }
    [[nodiscard]] int number() const noexcept { return number_; }

    /* Writes all bytes; false on failure. */
    [[nodiscard]] bool write_all(std::string_view bytes) const noexcept {
        while (!bytes.empty()) {
            const ssize_t written = write(number_, bytes.data(), bytes.size());
            if (written < 0 && errno == EINTR)
                continue;
            if (written <= 0)
                return false;
            bytes.remove_prefix(static_cast<std::size_t>(written));
        }
        return true;
    }

private:
    int number_;
};

/*
 * Creates a file in memory on a descriptor above those of the standard streams, so that output of other threads
 * cannot end up in it. Negative on failure.
 */
inline int make_memory_file() noexcept {
    const int made = memfd_create("acl", MFD_CLOEXEC);
    if (made < 0 || made > STDERR_FILENO)
        return made;
    const descriptor kept(made); /* keeps its number taken until there is one with a higher number */
    return make_memory_file();
}

/* Disables cancellation of the thread for its scope: no operation is a cancellation point. */
class uncancelled {
public:
    uncancelled() noexcept { pthread_setcancelstate(PTHREAD_CANCEL_DISABLE, &before_); }
    uncancelled(const uncancelled &) = delete;
    uncancelled &operator=(const uncancelled &) = delete;
    ~uncancelled() { pthread_setcancelstate(before_, nullptr); }

private:
    int before_ = PTHREAD_CANCEL_ENABLE;
};

} // namespace qz::detail

#endif
