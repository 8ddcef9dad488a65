// Puts a new file in the place of one that is edited, whole or not at all.
#include "replaced_file.h"

#include "base/owned.h"
#include "qzacl_acl/posix_acl.h"
#include "whole_file.h"

#include <cerrno>
#include <fcntl.h>
#include <optional>
#include <string>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

using namespace qz;

namespace qzacl {

namespace {

// The new file, under a temporary name beside the old one. It is removed at the end of the scope unless it was
// renamed.
class new_file {
public:
    // The lock is held, so that a file of this name is what a killed edit left.
    explicit new_file(const edited_file &file) : folder_(file.folder()), name_("." + file.leaf() + ".qzacl") {
        constexpr int making = O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC;
        constexpr mode_t owner_alone = 0600;
        unlinkat(folder_, name_.c_str(), 0);
        file_ = descriptor(openat(folder_, name_.c_str(), making, owner_alone));
        if (!file_)
            throw system_failure("cannot make a new file beside " + file.path());
    }
    new_file(const new_file &) = delete;
    new_file &operator=(const new_file &) = delete;
    ~new_file() {
        if (!has_moved_)
            unlinkat(folder_, name_.c_str(), 0);
    }

    int fd() const { return file_.get(); }

    void move_to(const std::string &name) {
        if (renameat(folder_, name_.c_str(), folder_, name.c_str()) != 0)
            throw system_failure("cannot rename the new file to " + name);
        has_moved_ = true;
    }

private:
    int folder_;
    std::string name_;
    descriptor file_;
    bool has_moved_ = false;
};

// The value of an attribute, or the names of all: first their size is queried, and again if they grow in between.
// Empty if there is none, or if the file system has no attributes.
template <class Query>
std::optional<std::string> read_attribute(const Query &query) {
    for (;;) {
        const ssize_t size = query(nullptr, 0);
        std::string value(size > 0 ? static_cast<std::size_t>(size) : 0, '\0');
        const ssize_t count = size > 0 ? query(value.data(), value.size()) : size;
        if (count >= 0) {
            value.resize(static_cast<std::size_t>(count));
            return value;
        }
        if (errno == ENODATA || errno == EOPNOTSUPP)
            return std::nullopt;
        if (errno != ERANGE)
            throw system_failure("cannot read the extended attributes");
    }
}

std::optional<std::string> attribute_of(int fd, const char *name) {
    return read_attribute([=](char *out, std::size_t size) { return fgetxattr(fd, name, out, size); });
}

// Attributes that the new file already has, such as labels of the system, are not set: not every user may.
void copy_attributes(int from, int to) {
    const auto names =
        read_attribute([=](char *out, std::size_t size) { return flistxattr(from, out, size); });
    for (std::size_t at = 0; names && at < names->size();) {
        const std::string name = names->c_str() + at;
        at += name.size() + 1;
        const auto value = attribute_of(from, name.c_str());
        if (name == "system.posix_acl_access" || !value || value == attribute_of(to, name.c_str()))
            continue;
        if (fsetxattr(to, name.c_str(), value->data(), value->size(), 0) != 0)
            throw system_failure("cannot keep the extended attribute " + name);
    }
}

// The mode comes last, because a change of the owner clears bits of it.
void protect_like(const edited_file &file, int fd) {
    posix_acl entries;
    const struct stat &status = file.status();
    if (fchown(fd, status.st_uid, status.st_gid) != 0)
        throw system_failure("cannot keep the owner of " + file.path());
    copy_attributes(file.fd(), fd);
    if (!entries.read(file.fd()) || !entries.give_to(fd))
        throw system_failure("cannot keep the access control entries of " + file.path());
    constexpr mode_t permission_bits = 07777;
    if (fchmod(fd, status.st_mode & permission_bits) != 0)
        throw system_failure("cannot keep the mode of " + file.path());
}

} // namespace

void replace_file(const edited_file &file, std::string_view bytes) {
    new_file made(file);
    // The replaced file may lack what the new one inherits from the folder.
    if (!remove_posix_acl(made.fd()))
        throw system_failure("cannot protect the new file");
    if (!write_all(made.fd(), bytes))
        throw system_failure("cannot write the new file");
    protect_like(file, made.fd());
    if (fsync(made.fd()) != 0)
        throw system_failure("cannot sync the new file");
    if (!file.is_as_read())
        throw trouble(file.path() + " changed meanwhile");
    made.move_to(file.leaf());
    if (fsync(file.folder()) != 0 && errno != EINVAL && errno != EROFS)
        throw system_failure("cannot sync the folder of " + file.path());
}

} // namespace qzacl
