// The cached form of an ACL file: the compiled buffer beside it, owned and protected like it.
#ifndef QZACL_CACHE_FILE_H
#define QZACL_CACHE_FILE_H

#include "qz/acl.h"
#include "qzacl_acl/file_name.h"

#include <cstddef>
#include <ctime>

namespace qz {

inline constexpr char cache_extension[] = ".cacl";
// An ACL file's path that is as long as this has no cache.
inline constexpr std::size_t uncached_path_length = path_max - sizeof cache_extension;

// The time of files as the kernel takes it when it stamps them now. Taken before the text of an ACL file is
// read, it is what the cache made from that text is stamped with: an edit that comes later is never older
// than the cache.
timespec file_clock();

} // namespace qz

// Writes the buffer to the ACL file's cache, stamped with `text_time` (see file_clock), through a temporary
// file that takes the cache's place whole. Without `force` a cache that is later than the ACL file is left
// alone. Returns SEC_S_OK when a new cache is in place; SEC_S_ADVISORY, without a message, when the buffer is
// empty or the cache current; else SEC_S_FILE_ERROR, leaving a cache that was there as it was and nothing
// else behind.
int sec__cache_aclbuffer(const char *aclfname, const sec_acl_buffer_t *acl, int force,
                         const timespec &text_time);

#endif
