// A file's POSIX ACL, which grants rights to named users and groups in addition to the mode.
#ifndef QZACL_POSIX_ACL_H
#define QZACL_POSIX_ACL_H

#include "base/owned.h"

#include <cstddef>

namespace qz {

// A POSIX ACL in the kernel's form. It is empty for a file whose mode says everything, and on a file system without
// POSIX ACLs.
class posix_acl {
public:
    // Read the POSIX ACL of an open file or of a path. On failure they return false and set errno.
    bool read(int fd);
    bool read(const char *path);

    // Sets it on a file without one. On failure returns false and sets errno.
    bool give_to(int fd) const;

    bool operator==(const posix_acl &other) const;

private:
    template <class Query>
    bool read_with(Query query);

    owned<char[]> bytes_;
    std::size_t length_ = 0;
};

// Removes the POSIX ACL that a new file inherits from its directory. On failure returns false and sets errno.
bool remove_posix_acl(int fd);

} // namespace qz

#endif
