// Compiles a text so that its cache counts: that services read it, and in it what the text says.
#ifndef QZACL_COUNTING_CACHE_H
#define QZACL_COUNTING_CACHE_H

#include "permission_set.h"

#include <string>

namespace qzacl {

// Waits for the next second where the text was written in this one, and compiles as qzaclfck -s does, with the given
// permissions. Tells of what failed. False when the cache is not what services then read, or says
// something else than the text; a text without entries has no cache and needs none.
bool make_cache_count(const std::string &path, const permission_set &set);

} // namespace qzacl

#endif
