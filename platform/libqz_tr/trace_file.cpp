// Opens the trace file with care, because anyone with access to its folder may have planted something there, and
// writes so that no trouble with the file affects the traced program.
#include "libqz_tr/trace_file.h"

#include "base/limited_write.h"
#include "base/open_file.h"
#include "libqz_tr/environment.h"
#include "qz/tr.h"

#include <cerrno>
#include <fcntl.h>
#include <pthread.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

namespace qz::tr::trace_file {
namespace {

pthread_once_t once = PTHREAD_ONCE_INIT;
int descriptor = -1;
dev_t device;
ino_t inode;

// An existing file may have been planted by somebody who wants to read or write it, or be a second link to another
// file. A POSIX ACL shows in the group bits. A newly created file passes.
bool is_of_caller_alone(const struct stat &status) {
    return S_ISREG(status.st_mode) && status.st_uid == geteuid() && status.st_nlink == 1 &&
           (status.st_mode & (S_IWGRP | S_IWOTH)) == 0;
}

void open_trace_file() {
    const char *file = environment().file;
    if (file == nullptr)
        return;
    // With O_NONBLOCK, opening a FIFO without a reader does not block.
    qz::descriptor opened =
        open_file(file, O_WRONLY | O_APPEND | O_CREAT | O_NOFOLLOW | O_NONBLOCK, S_IRUSR | S_IWUSR);
    struct stat status;
    if (!opened || fstat(opened.get(), &status) != 0 || !is_of_caller_alone(status))
        return;
    device = status.st_dev;
    inode = status.st_ino;
    descriptor = opened.release();
}

// A daemon may have closed all its descriptors, and ours may then be another file.
bool is_ours(struct stat &status) {
    pthread_once(&once, open_trace_file);
    return descriptor >= 0 && fstat(descriptor, &status) == 0 && status.st_dev == device &&
           status.st_ino == inode;
}

using write_function = ssize_t(int fd, const void *bytes, std::size_t count);

bool write_line(write_function *write_some, std::string_view line) {
    ssize_t written = 0;
    do {
        written = write_some(descriptor, line.data(), line.size());
    } while (written < 0 && errno == EINTR);
    return written >= 0 && static_cast<std::size_t>(written) == line.size();
}

} // namespace

off_t size() {
    struct stat status;
    return is_ours(status) ? status.st_size : -1;
}

const char *name() {
    struct stat status;
    return is_ours(status) ? environment().file : nullptr;
}

int append_line(std::string_view line) {
    struct stat status;
    if (!is_ours(status))
        return TR_NO_FILE;
    rlimit limit{};
    const bool is_limited = getrlimit(RLIMIT_FSIZE, &limit) == 0 && limit.rlim_cur != RLIM_INFINITY;
    if (is_limited && static_cast<rlim_t>(status.st_size) + line.size() > limit.rlim_cur)
        return TR_FILE_ERROR;
    return write_line(is_limited ? limited_write : write, line) ? TR_OK : TR_FILE_ERROR;
}

} // namespace qz::tr::trace_file
