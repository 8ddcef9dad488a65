// Printing the recorded error, for dumps and commands. The library prints nothing else.
#ifndef QZ_PRINT_RECORDED_H
#define QZ_PRINT_RECORDED_H

#include <cstdio>

namespace qz {

// Writes the text of the thread's current error, which stays current, and then `ending`. Without memory for the text it
// writes nothing and returns false.
bool print_recorded(std::FILE *stream, const char *ending);

} // namespace qz

#endif
