// Opening a vetted file and reading it whole. Vetting examines a file by its name.
#ifndef QZACL_FILE_BYTES_H
#define QZACL_FILE_BYTES_H

#include "base/owned.h"

#include <cstddef>
#include <ctime>
#include <span>
#include <sys/stat.h>

namespace qz {

// True when both describe the same file, even under different names.
inline bool same_file(const struct stat &one, const struct stat &other) {
    return one.st_dev == other.st_dev && one.st_ino == other.st_ino;
}

inline bool same_time(const timespec &one, const timespec &other) {
    return one.tv_sec == other.tv_sec && one.tv_nsec == other.tv_nsec;
}

// True when a file has not been written in between. Copying with the time can keep the modification time, but nobody
// can set the change time.
inline bool has_same_times(const struct stat &one, const struct stat &other) {
    return same_time(one.st_mtim, other.st_mtim) && same_time(one.st_ctim, other.st_ctim);
}

// Opens a vetted file, so that exchanging it in between gains nothing: the descriptor must show the same regular file
// with the same owner, group and mode. On failure returns an empty descriptor and sets errno, to ESTALE for another
// file. A FIFO in its place does not block, and a terminal does not become the controlling one.
descriptor open_vetted(const char *path, int access, const struct stat &vetted);

// The readable bytes after the end of a text, starting with its NUL. From any byte of the text, and from the NUL,
// sixteen bytes can be loaded.
inline constexpr std::size_t text_padding = 16;

// The bytes of a file and a NUL after them. Null for an empty file.
struct file_bytes {
    owned<char[]> data;
    std::size_t length = 0;
    bool is_replaced = false; // the opened file was not the vetted one, so nothing was read

    // With the NUL.
    std::span<char> all() const { return {data.get(), data == nullptr ? 0 : length + 1}; }
};

// Why a file is locked.
enum class lock_purpose { reading, replacing };

// Calls the lock hook and reads the whole file. Returns the hook's result if that is not 0, else the read's.
int lock_and_read(const char *path, const descriptor &file, const struct stat &vetted, file_bytes &bytes);

} // namespace qz

// The hook for locking a file that is read or about to be replaced. It takes no lock. For any result but 0 the caller
// would close the file and return that result.
int acl__lock_acl_file(const char *file_name, int fd, qz::lock_purpose purpose);

// Reads the whole file and a NUL into a new block, with one read. An empty file gives a null block and length 0. The
// descriptor must show the vetted file with the same owner, group and mode; otherwise the message shows ESTALE. On
// failure records an error, returns SEC_S_FILE_ERROR or SEC_S_NO_MEMORY, and hands out no bytes.
int acl__read_acl_file(const char *file_name, int fd, const struct stat &vetted, qz::file_bytes &bytes);

#endif
