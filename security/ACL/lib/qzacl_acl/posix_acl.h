// The entries of a file's POSIX ACL, which give named users and groups rights beside the mode.
#ifndef QZACL_POSIX_ACL_H
#define QZACL_POSIX_ACL_H

#include "base/owned.h"

#include <cstddef>

namespace qz {

// The entries as the kernel hands them out. There are none on a file whose mode says everything, and on a file
// system without POSIX ACLs.
class posix_acl {
public:
    // Read the entries of an open file, or of the file that a name leads to. False, with errno set, when it
    // cannot be told whose rights they are.
    bool read(int fd);
    bool read(const char *path);

    // Gives the entries to a file that has none. False, with errno set, when the file cannot take them.
    bool give_to(int fd) const;

    bool operator==(const posix_acl &other) const;

private:
    template <class Query>
    bool read_with(Query query);

    owned<char[]> bytes_;
    std::size_t length_ = 0;
};

// Takes away the entries that a new file inherits from its folder. False, with errno set, when they stay.
bool remove_posix_acl(int fd);

} // namespace qz

#endif
