// Opening a file for a library, whose service may run without standard streams.
#ifndef QZ_OPEN_FILE_H
#define QZ_OPEN_FILE_H

#include "base/owned.h"

#include <cerrno>
#include <fcntl.h>
#include <optional>
#include <unistd.h>

namespace qz {

// Takes, for its scope, the numbers of the standard streams that are closed. Printing to them fails as it did.
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

// Opens a file as open() does, on a descriptor that is none of a standard stream's: what another thread prints
// must not end up in the file, nor what it reads come from there. The descriptor does not survive an exec, and a
// terminal does not become the controlling one. On failure the descriptor is empty and errno set.
inline descriptor open_file(const char *path, int flags, mode_t mode = 0) {
    std::optional<taken_streams> streams;
    if ((flags & O_ACCMODE) != O_RDONLY)
        streams.emplace();
    // Another thread that does the same may give the numbers back first.
    descriptor low(open(path, flags | O_CLOEXEC | O_NOCTTY, mode));
    if (!low || low.get() > STDERR_FILENO)
        return low;
    descriptor high(fcntl(low.get(), F_DUPFD_CLOEXEC, STDERR_FILENO + 1));
    const int error = errno;
    low.close();
    // Whoever read or printed meanwhile moved the place in the file, which both numbers share; moving back to its start
    // waits for one who still does.
    const bool is_at_start = high && lseek(high.get(), 0, SEEK_SET) == 0;
    if ((flags & O_EXCL) != 0) {
        // A file that was just made stays empty, whatever was printed into it meanwhile. If it cannot be kept open,
        // nobody is to find it.
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
