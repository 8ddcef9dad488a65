// Where an ACL file is: its full path, the user whose home directory holds it, and the name of its cache.
#include "qzacl_acl/file_name.h"

#include "base/owned.h"
#include "report.h"

#include <cerrno>
#include <cstring>
#include <pwd.h>
#include <unistd.h>

using namespace qz;

namespace {

// True when a directory, a separator and a name fit into a path. The separator counts even if none is needed.
bool fits(std::size_t directory_length, std::size_t name_length) {
    return directory_length + 1 <= path_max && name_length <= path_max - (directory_length + 1);
}

// Appends a name, which must fit, to a directory.
void join(path_buffer &path, std::size_t directory_length, const char *name) {
    if (directory_length == 0 || path.text[directory_length - 1] != '/')
        path.text[directory_length++] = '/';
    std::memcpy(path.text + directory_length, name, std::strlen(name) + 1);
}

int in_home_directory(const char *aclfname, const char *username, path_buffer &path, std::uint32_t *uid) {
    if (std::strchr(aclfname, '/') != nullptr)
        return report(SEC_S_BAD_PARAMETER, msg::path_with_user_name, aclfname, username);
    if (const int result = sec__get_user_info(username, uid, path); result != SEC_S_OK)
        return result;
    const std::size_t directory_length = std::strlen(path.text);
    if (!fits(directory_length, std::strlen(aclfname)))
        return report(SEC_S_BAD_PARAMETER, msg::path_with_user_name, aclfname, username);
    join(path, directory_length, aclfname);
    return SEC_S_OK;
}

} // namespace

namespace qz {

bool make_cache_name(const char *aclfname, path_buffer &name) {
    const std::size_t length = strnlen(aclfname, path_max);
    if (length + sizeof cache_extension > sizeof name.text)
        return false;
    std::memcpy(name.text, aclfname, length);
    std::memcpy(name.text + length, cache_extension, sizeof cache_extension);
    return true;
}

} // namespace qz

int sec__get_user_info(const char *username, std::uint32_t *uid, path_buffer &home) {
    constexpr long usual_size = 1024; // if the system suggests none
    const long suggested = sysconf(_SC_GETPW_R_SIZE_MAX);
    const auto entry_size = static_cast<std::size_t>(suggested > 0 ? suggested : usual_size);
    const std::size_t size = entry_size * 2;
    const auto buffer = allocate<char>(size);
    if (buffer == nullptr)
        return report_no_memory("sec__get_user_info", size);

    passwd user = {};
    passwd *found = nullptr;
    if (getpwnam_r(username, &user, buffer.get(), size, &found) != 0 || found == nullptr)
        return report(SEC_S_UNKNOWN_USER, msg::unknown_user, username);
    // A user database may return an entry with another name.
    if (*username != '\0' && std::strncmp(username, user.pw_name, entry_size) != 0)
        return report(SEC_S_UNKNOWN_USER, msg::unknown_user, username);
    *uid = user.pw_uid;
    // A directory truncated here leaves no room for a file name, so callers reject it.
    const std::size_t length = strnlen(user.pw_dir, path_max);
    std::memcpy(home.text, user.pw_dir, length);
    home.text[length] = '\0';
    return SEC_S_OK;
}

int sec__get_aclfname(const char *aclfname, const char *username, path_buffer &path, std::uint32_t *uid) {
    if (username != nullptr)
        return in_home_directory(aclfname, username, path, uid);

    const std::size_t name_length = std::strlen(aclfname);
    if (aclfname[0] == '/') {
        if (name_length > path_max)
            return report(SEC_S_BAD_FILENAME, msg::bad_acl_file_name, aclfname, ENAMETOOLONG);
        std::memcpy(path.text, aclfname, name_length + 1);
        return SEC_S_OK;
    }
    if (getcwd(path.text, sizeof path.text) == nullptr)
        return report(SEC_S_BAD_FILENAME, msg::working_directory_unknown, "getcwd()", errno);
    const std::size_t directory_length = std::strlen(path.text);
    if (!fits(directory_length, name_length))
        return report(SEC_S_BAD_FILENAME, msg::working_directory_too_long, path.text, aclfname);
    join(path, directory_length, aclfname);
    return SEC_S_OK;
}
