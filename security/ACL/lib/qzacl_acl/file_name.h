// Where an ACL file is: its full path, the user whose home directory holds it, and the name of its cache.
#ifndef QZACL_FILE_NAME_H
#define QZACL_FILE_NAME_H

#include <cstddef>
#include <cstdint>
#include <sys/stat.h>

namespace qz {

// The longest path, without its NUL.
inline constexpr std::size_t path_max = 4096;
// A cache has the name of its ACL file plus this extension.
inline constexpr char cache_extension[] = ".cacl";

struct path_buffer {
    char text[path_max + 1] = {};
};

// A file that was examined by its name. A file opened later must still be this one.
struct vetted_file {
    path_buffer path;
    struct stat status = {};
};

// Forms the name of a file's cache. False when it exceeds the length of a path.
bool make_cache_name(const char *aclfname, path_buffer &name);

} // namespace qz

// Looks up a user. Returns SEC_S_OK with the user id and the home directory, truncated to the length of a path; or
// SEC_S_UNKNOWN_USER or SEC_S_NO_MEMORY.
int sec__get_user_info(const char *username, std::uint32_t *uid, qz::path_buffer &home);

// Makes the full path of an ACL file. With `username`, the file is in that user's home directory, and `*uid` is set.
// Otherwise a relative name is resolved against the current directory. Returns SEC_S_OK, SEC_S_BAD_PARAMETER,
// SEC_S_NO_MEMORY, SEC_S_UNKNOWN_USER or SEC_S_BAD_FILENAME.
int sec__get_aclfname(const char *aclfname, const char *username, qz::path_buffer &path, std::uint32_t *uid);

#endif
