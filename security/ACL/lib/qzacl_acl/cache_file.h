// Writing the cache of an ACL file: a compiled buffer next to it, with the same owner, mode and POSIX ACL.
#ifndef QZACL_CACHE_FILE_H
#define QZACL_CACHE_FILE_H

#include "qz/acl.h"
#include "qzacl_acl/cache_vetting.h"
#include "qzacl_acl/file_name.h"

#include <cstddef>

namespace qz {

// No cache is written for paths of this length or longer.
inline constexpr std::size_t uncached_path_length = path_max - sizeof cache_extension;

// Which caches are rewritten. A cache that is newer than its ACL file is current.
enum class cache_rewriting { unless_current, always };

} // namespace qz

// Writes the buffer to the ACL file's cache through a temporary file, which replaces the cache atomically. Returns
// SEC_S_OK when a new cache is in place; SEC_S_ADVISORY, without a message, when the buffer is empty or the cache is
// current and was left alone; otherwise SEC_S_FILE_ERROR: an existing cache is unchanged, and no other file is left.
int sec__cache_aclbuffer(const char *aclfname, const sec_acl_buffer_t *acl, qz::cache_rewriting rewriting,
                         const qz::text_origin &origin);

#endif
