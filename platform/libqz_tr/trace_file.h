// The file to which the process appends all records.
#ifndef QZ_TR_TRACE_FILE_H
#define QZ_TR_TRACE_FILE_H

#include <string_view>
#include <sys/types.h>

namespace qz::tr::trace_file {

// The file's size in bytes, or -1 without a usable file. All functions here open the file unless that was tried
// before.
off_t size();

// The file's name, or null without a usable file.
const char *name();

// Appends one whole line. Returns TR_OK, TR_NO_FILE or TR_FILE_ERROR.
int append_line(std::string_view line);

} // namespace qz::tr::trace_file

#endif
