// The syntax of an ACL file: one line of its text at a time becomes an entry.
#ifndef QZACL_ENTRY_PARSER_H
#define QZACL_ENTRY_PARSER_H

#include "qz/acl.h"

#include <cctype>
#include <cstddef>
#include <cstdint>

namespace qz {

// The longest line that is accepted, its line end included.
inline constexpr std::size_t line_length_max = 1096;

// White space by the locale of the process. The class table is fetched once for a line, because one call for
// each byte would cost more than all the rest of the parse.
class space_class {
public:
#ifdef __GLIBC__
    bool operator()(char c) const { return (table_[static_cast<unsigned char>(c)] & _ISspace) != 0; }

private:
    const unsigned short *table_ = *__ctype_b_loc();
#else
    bool operator()(char c) const { return std::isspace(static_cast<unsigned char>(c)) != 0; }
#endif
};

// The tokens of one line, where they stand in it.
struct token {
    char *text = nullptr;
    std::size_t length = 0;
};

class line_tokens {
public:
    // The line end, or the NUL that takes its place, stands at `end`.
    line_tokens(char *begin, char *end) : at_(begin), end_(end) {}

    // False when only blanks and a comment are left.
    bool next(token &out) {
        while (at_ != end_ && is_blank(*at_))
            ++at_;
        if (at_ == end_ || *at_ == '#')
            return false;
        out.text = at_;
        while (at_ != end_ && !is_space_(*at_))
            ++at_;
        out.length = static_cast<std::size_t>(at_ - out.text);
        // A token that ended at the line end was the last one.
        if (at_ != end_)
            ++at_;
        return true;
    }

private:
    static constexpr bool is_blank(char c) { return c == ' ' || c == '\t' || c == '\v'; }

    char *at_;
    char *end_;
    space_class is_space_;
};

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
