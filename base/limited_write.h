// Writing files in a process that may have a file size limit.
#ifndef QZ_LIMITED_WRITE_H
#define QZ_LIMITED_WRITE_H

#include <cerrno>
#include <csignal>
#include <cstddef>
#include <ctime>
#include <pthread.h>
#include <unistd.h>

namespace qz {

// Writes once, as write() does. Past the file size limit it fails, as on a full disk: SIGXFSZ, which would kill an
// unprepared process, is blocked during the write and consumed if this write raised it.
inline ssize_t limited_write(int fd, const void *bytes, std::size_t count) {
    sigset_t limit_signal;
    sigset_t before;
    sigset_t pending;
    sigemptyset(&limit_signal);
    sigaddset(&limit_signal, SIGXFSZ);
    pthread_sigmask(SIG_BLOCK, &limit_signal, &before);
    sigpending(&pending);
    const ssize_t written = write(fd, bytes, count);
    const int error = errno;
    if (written < 0 && error == EFBIG && sigismember(&pending, SIGXFSZ) == 0) {
        const timespec at_once = {};
        while (sigtimedwait(&limit_signal, nullptr, &at_once) < 0 && errno == EINTR) {
        }
    }
    pthread_sigmask(SIG_SETMASK, &before, nullptr);
    errno = error;
    return written;
}

} // namespace qz

#endif
