// The file that all records of the process are appended to.
#ifndef QZ_TR_TRACE_FILE_H
#define QZ_TR_TRACE_FILE_H

#include <string_view>
#include <sys/types.h>

namespace qz::tr::trace_file {

// The file's size in bytes, or -1 when there is no usable file. Like the others, it opens the file when
// that has not been tried yet.
off_t size();

// The file's name, or null when there is no usable file.
const char *name();

// Appends one whole line: TR_OK, TR_NO_FILE or TR_FILE_ERROR.
int append(std::string_view line);

} // namespace qz::tr::trace_file

#endif
