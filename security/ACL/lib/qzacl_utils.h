// Conversion of strings between the locale's code set and UTF-8, and reading a whole file.
#ifndef QZACL_UTILS_H
#define QZACL_UTILS_H

#include "base/owned.h"

#include <cstddef>
#include <span>
#include <sys/stat.h>

namespace qz {

// True when both tell of one file, whatever its names are.
inline bool same_file(const struct stat &one, const struct stat &other) {
    return one.st_dev == other.st_dev && one.st_ino == other.st_ino;
}

// Opens a file that was vetted by its name, so that whoever exchanges it in between gains nothing: the
// descriptor must show the same regular file, owned and protected as before. Returns an empty descriptor with
// errno set, to ESTALE for another file. A file that turned into a FIFO or a terminal neither blocks nor becomes the controlling one.
descriptor open_vetted(const char *path, int access, const struct stat &vetted);

// How many bytes a text that was read has behind its end, a NUL and others: sixteen may be read from each of its
// bytes on, and from the NUL.
inline constexpr std::size_t text_padding = 16;

// The bytes of a file, and a NUL behind them; none of an empty file.
struct file_bytes {
    owned<char[]> data;
    std::size_t length = 0;
    bool is_replaced = false; // nothing was read, because what was opened is not the file that was vetted

    // With the NUL.
    std::span<char> all() const { return {data.get(), data == nullptr ? 0 : length + 1}; }
};

// Asks the lock hook and reads the whole file. Returns SEC_S_OK, the hook's result, or that of the read.
int lock_and_read(const char *path, const descriptor &file, const struct stat &vetted, file_bytes &bytes);

} // namespace qz

// Convert the `*in_length` bytes at `in`, the terminating NUL included, into a new string that the caller
// frees. Both return SEC_S_OK, or record an error and return SEC_S_CODESET, SEC_S_NO_MEMORY or
// SEC_S_INTERNAL, leaving `*out` alone. Safe from several threads.
int acl__convert_to_utf8(const char *in, const std::size_t *in_length, char **out, std::size_t *out_length);
int acl__convert_from_utf8(const char *in, const std::size_t *in_length, char **out, std::size_t *out_length);

// The lock hook of every file that is read (mode 1) or about to be replaced (mode 2). No lock is taken; any
// result but 0 would make the caller close the file and return that result.
int acl__lock_acl_file(const char *file_name, int fd, int mode);

// Reads the whole file into a new block of its size and a NUL, with one read. An empty file gives a null
// block and length 0. The descriptor must show the regular file that was vetted, owned and protected as before;
// for any other the error number of the failure is ESTALE. On failure records an error, returns SEC_S_FILE_ERROR or
// SEC_S_NO_MEMORY, and hands out no bytes.
int acl__read_acl_file(const char *file_name, int fd, const struct stat &vetted, qz::file_bytes &bytes);

#endif
