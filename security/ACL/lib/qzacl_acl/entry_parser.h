// The syntax of an ACL file: one line of its text at a time becomes an entry.
#ifndef QZACL_ENTRY_PARSER_H
#define QZACL_ENTRY_PARSER_H

#include "qz/acl.h"
#include "qzacl_acl/entry.h"

#include <cstddef>
#include <cstdint>
#include <span>
#include <string_view>

namespace qz {

// The longest line that is accepted, its line end included.
inline constexpr std::size_t line_length_max = 1096;

// The entry of one line. Its mechanism and identity are pieces of the text, each with a NUL behind it that does
// not count; what a type has none of is empty, without an address.
struct parsed_acle {
    std::uint32_t perm_mask = 0;
    std::uint8_t type = 0; // 0 for a line without an entry
    std::span<char> mechanism;
    std::span<char> identity;
};

inline acle_view view_of(const parsed_acle &entry) {
    const auto text = [](std::span<char> token) {
        return token.data() == nullptr ? std::string_view("") : std::string_view(token.data(), token.size());
    };
    return {entry.perm_mask, entry.type, text(entry.mechanism), text(entry.identity)};
}
// A record that borrows the identity.
sec_acle_t record_of(const parsed_acle &entry);

} // namespace qz

// Reads the line at `*cursor` into `*entry`, which then points into the text. The text is writable
// and ends in a NUL; `*remaining` counts the bytes from the cursor to that NUL, itself included. A null `set`
// means the default templates.
//
// Returns 0 when nothing is left. Returns 1 when a line was consumed: the entry's type is 0 for a line that
// holds none. Any other result is a failure whose message was recorded, SEC_S_BAD_PERMISSION,
// SEC_S_FILE_ERROR or SEC_S_BAD_ACL; its line was consumed too, so that the caller may go on. A consumed line
// moves the cursor to the next one, or to null behind the last, and adds 1 to `*line`.
int sec__read_acle_from_text(const sec_perm_set_t *set, char **cursor, std::size_t *remaining,
                             std::uint32_t *line, qz::parsed_acle *entry);
// The same into a record, which borrows its identity.
int sec__read_acle_from_text(const sec_perm_set_t *set, char **cursor, std::size_t *remaining,
                             std::uint32_t *line, sec_acle_t *entry);

#endif
