// The cached form of an ACL file: the compiled buffer beside it, owned and protected like it.
#ifndef QZACL_CACHE_FILE_H
#define QZACL_CACHE_FILE_H

#include "qz/acl.h"
#include "qzacl_acl/cache_vetting.h"
#include "qzacl_acl/file_name.h"

#include <cstddef>

namespace qz {

// For an ACL file's path that is as long as this, or longer, no cache is written.
inline constexpr std::size_t uncached_path_length = path_max - sizeof cache_extension;

// Which caches are written anew: a cache that is later than its ACL file is current.
enum class cache_rewriting { unless_current, always };

} // namespace qz

// Writes the buffer to the ACL file's cache, through a temporary file that takes the cache's place whole.
// Returns SEC_S_OK when a new cache is in place; SEC_S_ADVISORY, without a message, when the buffer is empty or the
// cache current and left alone; else SEC_S_FILE_ERROR, leaving a cache that was there as it was and nothing else
// behind.
int sec__cache_aclbuffer(const char *aclfname, const sec_acl_buffer_t *acl, qz::cache_rewriting rewriting,
                         const qz::text_origin &origin);

#endif
