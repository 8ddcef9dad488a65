// Printing the recorded error, for dumps and commands: the library itself prints nothing else.
#ifndef QZ_PRINT_RECORDED_H
#define QZ_PRINT_RECORDED_H

#include <cstdio>

namespace qz {

// Writes the text of the thread's current error and then `ending`; the error stays current. False when there
// is no memory for the text, and nothing was written.
bool print_recorded(std::FILE *stream, const char *ending);

} // namespace qz

#endif
