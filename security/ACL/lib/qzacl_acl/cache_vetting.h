// Whether a cache belongs to its text: whether it is later, and has the same owner, group, mode and entries of a
// POSIX ACL. Readers believe no other, and writers replace no other.
#ifndef QZACL_CACHE_VETTING_H
#define QZACL_CACHE_VETTING_H

#include "qzacl_acl/file_name.h"
#include "qzacl_acl/posix_acl.h"

#include <ctime>
#include <sys/stat.h>

namespace qz {

inline constexpr mode_t permission_bits = 07777;

// Where the text of a cache comes from: the file that is read, and the time, as the kernel stamps files now,
// before any of it is read. The cache is stamped with that time, so that an edit that comes later is never
// older than it; and no other file that was exchanged for the one read lends its owner and mode to the cache.
struct text_origin {
    explicit text_origin(const struct stat &vetted);

    struct stat file;
    timespec time;
};

// Whether the cache of a vetted text may be read instead of it. Two halves: before it is opened, whether it is
// there, later than the text, and has its owner, group and permission bits, which fills in `cache`; and of the
// opened cache, whether it has the text's entries. What is against it is traced; nothing is recorded.
bool cache_is_current(const vetted_file &text, vetted_file &cache);
bool cache_has_entries_of_text(const vetted_file &text, const vetted_file &cache, int cache_fd);

// How a text is protected when its cache is written. Each step returns SEC_S_OK, or records an error and returns
// SEC_S_FILE_ERROR.
struct text_protection {
    // Finds out; fails when the name leads no longer to the file that was read.
    int examine(const char *aclfname, const text_origin &origin);

    // Whether a cache that is there may be replaced. One that is protected otherwise is the owner's to mend.
    int vet_cache(const char *aclfname, const char *cache_name, const struct stat &cache) const;
    int vet_opened_cache(const char *aclfname, const char *cache_name, int cache_fd) const;

    struct stat status = {};
    posix_acl entries;
};

// Records that the status of the file or the cache, `queried`, could not be had from a call.
int query_failed(const char *queried, const char *call, const char *aclfname, int error);

} // namespace qz

#endif
