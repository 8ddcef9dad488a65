// Whether a cache belongs to its text: it must be newer and have the same owner, group, mode and POSIX ACL. Readers use
// no other cache, and writers replace no other.
#ifndef QZACL_CACHE_VETTING_H
#define QZACL_CACHE_VETTING_H

#include "qzacl_acl/file_name.h"
#include "qzacl_acl/posix_acl.h"

#include <ctime>
#include <sys/stat.h>

namespace qz {

inline constexpr mode_t permission_bits = 07777;

// The origin of a cache: the file that is read, and the kernel's file time before any of it is read. The cache gets
// that time, so that no later edit is older than the cache. It gets its owner and mode only from the file that was
// read, not from one that has replaced it.
struct text_origin {
    explicit text_origin(const struct stat &vetted);

    struct stat file;
    timespec time;
};

// Whether the cache of a vetted text may be read instead of it, in two parts. The first fills in `cache` before it is
// opened: it must exist, be newer than the text, and have its owner, group and permission bits. The second examines the
// opened cache: it must have the text's POSIX ACL. Reasons against it are traced, not recorded.
bool cache_is_current(const vetted_file &text, vetted_file &cache);
bool cache_has_entries_of_text(const vetted_file &text, const vetted_file &cache, int cache_fd);

// The protection of a text whose cache is written. Each step returns SEC_S_OK, or records an error and returns
// SEC_S_FILE_ERROR.
struct text_protection {
    // Reads it. Fails when the name no longer leads to the file that was read.
    int examine(const char *aclfname, const text_origin &origin);

    // Whether an existing cache may be replaced. One with other protection is for its owner to remove.
    int vet_cache(const char *aclfname, const char *cache_name, const struct stat &cache) const;
    int vet_opened_cache(const char *aclfname, const char *cache_name, int cache_fd) const;

    struct stat status = {};
    posix_acl entries;
};

// Records that `call` failed on `queried`, the ACL file or its cache.
int query_failed(const char *queried, const char *call, const char *aclfname, int error);

} // namespace qz

#endif
