// Readable printing of entries, trees and buffers, and of the recorded error.
#ifndef QZACL_DUMP_H
#define QZACL_DUMP_H

#include <cstdio>

namespace qz {

// Writes the text of the thread's current error and then `ending`; the error stays current.
void print_recorded(std::FILE *stream, const char *ending);

} // namespace qz

#endif
