// The syntax of an ACL file: one line of its text at a time becomes an entry.
#ifndef QZACL_ENTRY_PARSER_H
#define QZACL_ENTRY_PARSER_H

#include "qz/acl.h"

#include <cstddef>
#include <cstdint>

namespace qz {

// The longest line that is accepted, its line end included.
inline constexpr std::size_t line_length_max = 1096;

} // namespace qz

// Reads the line at `*cursor` into `*entry`, whose identity then points into the text. The text is writable
// and ends in a NUL; `*remaining` counts the bytes from the cursor to that NUL, itself included. A null `set`
// means the default templates.
//
// Returns 0 when nothing is left. Returns 1 when a line was consumed: the entry's type is 0 for a line that
// holds none. Any other result is a failure whose message was recorded, SEC_S_BAD_PERMISSION,
// SEC_S_FILE_ERROR or SEC_S_BAD_ACL; its line was consumed too, so that the caller may go on. A consumed line
// moves the cursor to the next one, or to null behind the last, and adds 1 to `*line`.
int sec__read_acle_from_text(const sec_perm_set_t *set, char **cursor, std::size_t *remaining,
                             std::uint32_t *line, sec_acle_t *entry);

#endif
