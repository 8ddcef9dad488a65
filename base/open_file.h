// Opening a file for a library, whose service may run without standard streams.
#ifndef QZ_OPEN_FILE_H
#define QZ_OPEN_FILE_H

#include "base/owned.h"

#include <cerrno>
#include <fcntl.h>
#include <optional>
#include <unistd.h>

namespace qz {

// Occupies the descriptors of closed standard streams for its scope. Printing to them still fails.
class taken_streams {
public:
    taken_streams() {
        for (int stream = STDIN_FILENO; stream <= STDERR_FILENO; ++stream) {
            if (fcntl(stream, F_GETFD) < 0)
                taken_[stream] = descriptor(open("/", O_PATH | O_CLOEXEC));
        }
    }

private:
    descriptor taken_[STDERR_FILENO + 1];
};

// Opens a file as open() does, but never on the descriptor of a standard stream: another thread must neither print
// into the file nor read from it. The descriptor is closed on exec, and a terminal does not become the controlling
// one. On failure the descriptor is empty and errno is set.
inline descriptor open_file(const char *path, int flags, mode_t mode = 0) {
    std::optional<taken_streams> streams;
    if ((flags & O_ACCMODE) != O_RDONLY)
        streams.emplace();
    // Another thread that occupies them too may have released them by now.
    descriptor low(open(path, flags | O_CLOEXEC | O_NOCTTY, mode));
    if (!low || low.get() > STDERR_FILENO)
        return low;
    descriptor high(fcntl(low.get(), F_DUPFD_CLOEXEC, STDERR_FILENO + 1));
    const int error = errno;
    low.close();
    // A thread that read or printed meanwhile has moved the file offset, which both descriptors share. lseek waits for
    // one that still does.
    const bool is_at_start = high && lseek(high.get(), 0, SEEK_SET) == 0;
    if ((flags & O_EXCL) != 0) {
        // A new file must be empty, even if another thread printed into it meanwhile. One that cannot be kept open must
        // not stay.
        if (!high)
            unlink(path);
        else if (!is_at_start || ftruncate(high.get(), 0) != 0)
            return {};
    }
    errno = error;
    return high;
}

} // namespace qz

#endif
