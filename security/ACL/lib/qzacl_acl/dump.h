// Readable printing of entries, trees and buffers, and of the recorded error.
#ifndef QZACL_DUMP_H
#define QZACL_DUMP_H

#include <cstdio>

namespace qz {

// Writes the text of the thread's current error and then `ending`; the error stays current. False when there
// is no memory for the text, and nothing was written.
bool print_recorded(std::FILE *stream, const char *ending);

} // namespace qz

#endif
