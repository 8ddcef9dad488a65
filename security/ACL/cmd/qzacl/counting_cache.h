// Compiles a text so that its cache counts: that services read it, and in it what the text says.
#ifndef QZACL_COUNTING_CACHE_H
#define QZACL_COUNTING_CACHE_H

#include "edited_file.h"
#include "permission_set.h"

#include <chrono>

namespace qzacl {

// Waits for the next second where the text was written in this one, takes the lock, and compiles as qzaclfck -s does,
// with the given permissions. Tells of what failed. False when the cache is not what services then read, or says
// something else than the text; a text without entries has no cache and needs none. Throws trouble without the lock.
bool make_cache_count(const edited_file &file, std::chrono::seconds wait, const permission_set &set);

} // namespace qzacl

#endif
