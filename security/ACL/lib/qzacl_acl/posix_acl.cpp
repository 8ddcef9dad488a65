// A file's POSIX ACL, which grants rights to named users and groups in addition to the mode.
#include "qzacl_acl/posix_acl.h"

#include <cerrno>
#include <cstring>
#include <sys/xattr.h>

namespace {

constexpr char attribute[] = "system.posix_acl_access";

// The file has no POSIX ACL, or its file system has none.
bool means_none(int error) { return error == ENODATA || error == EOPNOTSUPP; }

} // namespace

namespace qz {

// Most files have none, which takes one call to find out.
template <class Query>
bool posix_acl::read_with(Query query) {
    length_ = 0;
    const ssize_t size = query(nullptr, 0);
    if (size <= 0)
        return size == 0 || means_none(errno);
    bytes_ = allocate<char>(static_cast<std::size_t>(size));
    if (bytes_ == nullptr) {
        errno = ENOMEM;
        return false;
    }
    const ssize_t count = query(bytes_.get(), static_cast<std::size_t>(size));
    if (count < 0)
        return false;
    length_ = static_cast<std::size_t>(count);
    return true;
}

bool posix_acl::read(int fd) {
    return read_with([=](char *out, std::size_t size) { return fgetxattr(fd, attribute, out, size); });
}

bool posix_acl::read(const char *path) {
    return read_with([=](char *out, std::size_t size) { return getxattr(path, attribute, out, size); });
}

bool posix_acl::give_to(int fd) const {
    return length_ == 0 || fsetxattr(fd, attribute, bytes_.get(), length_, 0) == 0;
}

bool posix_acl::operator==(const posix_acl &other) const {
    return length_ == other.length_ &&
           (length_ == 0 || std::memcmp(bytes_.get(), other.bytes_.get(), length_) == 0);
}

bool remove_posix_acl(int fd) { return fremovexattr(fd, attribute) == 0 || means_none(errno); }

} // namespace qz
