// Compiles a text so that its cache counts: services read it, and it says what the text says.
#ifndef QZACL_COUNTING_CACHE_H
#define QZACL_COUNTING_CACHE_H

#include "edited_file.h"
#include "permission_set.h"

#include <chrono>

namespace qzacl {

// Waits for the next second if the text was written in this one, takes the lock, and compiles as qzaclfck -s does,
// with the given permissions. Prints what failed. False if services do not read the cache then, or if it differs from
// the text. A text without entries needs no cache. Throws trouble if the lock cannot be taken.
bool make_cache_count(const edited_file &file, std::chrono::seconds wait, const permission_set &set);

} // namespace qzacl

#endif
