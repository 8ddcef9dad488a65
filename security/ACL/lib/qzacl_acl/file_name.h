// Where an ACL file is: the full path for a name, the user whose home directory holds it, and its cache.
#ifndef QZACL_FILE_NAME_H
#define QZACL_FILE_NAME_H

#include <cstddef>
#include <cstdint>
#include <sys/stat.h>

namespace qz {

// The longest path, without its NUL.
inline constexpr std::size_t path_max = 4096;
// What the name of a cache has behind that of its ACL file.
inline constexpr char cache_extension[] = ".cacl";

struct path_buffer {
    char text[path_max + 1] = {};
};

// A file that was found and vetted by its name; whatever is opened later must still be this one.
struct vetted_file {
    path_buffer path;
    struct stat status = {};
};

// Forms the name of a file's cache; false when it would be longer than a path.
bool make_cache_name(const char *aclfname, path_buffer &name);

} // namespace qz

// Looks a user up. Returns SEC_S_OK with the id and the home directory, of which no more is copied than a
// path may hold; or SEC_S_UNKNOWN_USER or SEC_S_NO_MEMORY.
int sec__get_user_info(const char *username, std::uint32_t *uid, qz::path_buffer &home);

// Makes the full path of an ACL file: in the user's home directory when `username` is given, which also sets
// `*uid`, else an absolute name as it stands or one relative to the current directory. Returns SEC_S_OK,
// SEC_S_BAD_PARAMETER, SEC_S_NO_MEMORY, SEC_S_UNKNOWN_USER or SEC_S_BAD_FILENAME.
int sec__get_aclfname(const char *aclfname, const char *username, qz::path_buffer &path, std::uint32_t *uid);

#endif
