// The syntax of an ACL file: parses one line into one entry.
#ifndef QZACL_ENTRY_PARSER_H
#define QZACL_ENTRY_PARSER_H

#include "qz/acl.h"
#include "qzacl_acl/entry.h"

#include <cstddef>
#include <cstdint>
#include <span>
#include <string_view>

namespace qz {

// The longest accepted line, including its line end.
inline constexpr std::size_t line_length_max = 1096;

// The result for a line that was read without an error.
inline constexpr int line_consumed = 1;

// The entry of one line. Its mechanism and identity point into the text; a NUL, which the lengths do not count, follows
// each. A type without one has a null span.
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
// The entry as a record that borrows the identity.
sec_acle_t record_of(const parsed_acle &entry);

} // namespace qz

// Reads the line at `*cursor` into `*entry`, which then points into the text. The text is writable and ends in a NUL;
// `*remaining` counts the bytes from the cursor to that NUL, inclusive; no others are read. A null `set` means the default templates.
//
// Returns SEC_S_OK when nothing is left, and line_consumed when it consumed a line; the entry's type is 0 for a line
// without one. Any other result is a recorded failure: SEC_S_BAD_PERMISSION, SEC_S_FILE_ERROR or SEC_S_BAD_ACL. That
// line was consumed, too, so the caller may continue. Consuming a line moves the cursor to the next one, or to null
// after the last, and adds 1 to `*line`.
int sec__read_acle_from_text(const sec_perm_set_t *set, char **cursor, std::size_t *remaining,
                             std::uint32_t *line, qz::parsed_acle *entry);
// The same into a record that borrows its identity.
int sec__read_acle_from_text(const sec_perm_set_t *set, char **cursor, std::size_t *remaining,
                             std::uint32_t *line, sec_acle_t *entry);

#endif
