// Files that are read and written whole.
#ifndef QZACL_WHOLE_FILE_H
#define QZACL_WHOLE_FILE_H

#include "qzacl_acl/acl_text.h"

#include <string>
#include <string_view>

namespace qzacl {

// How standard input is named; a file of that name is "./-".
inline constexpr char standard_input[] = "-";

// Reads a file, or standard input, to its end. Throws trouble.
std::string read_whole(const std::string &name);

// The same for an open file; `name` is for messages.
std::string read_whole(int fd, const std::string &name);

// Finds an ACL file and reads it into the text. Returns SEC_S_OK or the code of the recorded error.
int read_acl_text(const std::string &path, qz::vetted_file &file, qz::acl_text &text);

// Writes all bytes. On failure returns false and sets errno.
bool write_all(int fd, std::string_view bytes);

} // namespace qzacl

#endif
