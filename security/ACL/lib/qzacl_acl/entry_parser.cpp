// The syntax of an ACL file: one line of its text at a time becomes an entry.
//
//   n|o            [permissions]              letters of either case
//   u|e  mechanism identity [permissions]
//   g    identity  [permissions]
//
// Blanks separate tokens; '#' where a token would start begins a comment.
#include "qzacl_acl/entry_parser.h"

#include "libqz_cu/posix_fold.h"
#include "qzacl_acl/entry.h"
#include "qzacl_acl/permission.h"
#include "qzacl_trace.h"
#include "report.h"

#include <cstring>

namespace {

constexpr bool is_line_end(char c) { return c == '\n' || c == '\f' || c == '\r'; }

// True when one of the eight bytes is a NUL or a line end. A byte of the difference is zero where it matches;
// the borrow test may report a byte above a match, never miss one.
bool may_end_line(std::uint64_t word) {
    constexpr std::uint64_t ones = 0x0101010101010101;
    constexpr std::uint64_t highs = 0x8080808080808080;
    const auto has_zero = [](std::uint64_t bytes) { return (bytes - ones) & ~bytes & highs; };
    return (has_zero(word) | has_zero(word ^ (ones * '\n')) | has_zero(word ^ (ones * '\f')) |
            has_zero(word ^ (ones * '\r'))) != 0;
}

// The first line end or NUL at or behind `at`; a NUL stands inside the `size` bytes.
char *find_line_end(char *at, std::size_t size) {
    while (size >= sizeof(std::uint64_t)) {
        std::uint64_t word = 0;
        std::memcpy(&word, at, sizeof word);
        if (may_end_line(word))
            break;
        at += sizeof word;
        size -= sizeof word;
    }
    while (*at != '\0' && !is_line_end(*at))
        ++at;
    return at;
}

std::uint8_t type_of_letter(char letter) {
    switch (letter) {
    case 'n':
    case 'N':
        return SEC_ACLE_UNAUTHENTICATED;
    case 'o':
    case 'O':
        return SEC_ACLE_ANYOTHER;
    case 'u':
    case 'U':
        return SEC_ACLE_USER;
    case 'e':
    case 'E':
        return SEC_ACLE_EXPANDED;
    case 'g':
    case 'G':
        return SEC_ACLE_GROUP;
    default:
        return 0;
    }
}

// The next token, which is ended with a NUL in place.
bool cut_token(qz::line_tokens &tokens, qz::token &out) {
    if (!tokens.next(out))
        return false;
    out.text[out.length] = '\0';
    return true;
}

// Fills the entry from the tokens of a line; a line without any leaves its type 0.
int parse_line(qz::line_tokens tokens, const sec_perm_set_t &set, int line, sec_acle_t &entry) {
    qz::token type;
    if (!cut_token(tokens, type))
        return SEC_S_OK;
    entry.type = type.length == 1 ? type_of_letter(type.text[0]) : std::uint8_t{0};
    if (entry.type == 0)
        return qz::report(SEC_S_BAD_ACL, qz::msg::bad_type_token, line, type.text);

    if (qz::has_mechanism(entry.type)) {
        qz::token mechanism;
        if (!cut_token(tokens, mechanism))
            return qz::report(SEC_S_BAD_ACL, qz::msg::tokens_missing, line);
        if (mechanism.length > qz::mechanism_max)
            return qz::report(SEC_S_BAD_ACL, qz::msg::mechanism_too_long, mechanism.text, line);
        for (std::size_t index = 0; index < mechanism.length; ++index)
            mechanism.text[index] =
                static_cast<char>(qz::fold(static_cast<unsigned char>(mechanism.text[index])));
        std::memcpy(entry.mechanism, mechanism.text, mechanism.length);
    }
    if (qz::has_identity(entry.type)) {
        qz::token identity;
        if (!cut_token(tokens, identity))
            return qz::report(SEC_S_BAD_ACL, qz::msg::tokens_missing, line);
        entry.identity = identity.text;
    }

    qz::token permissions;
    if (!cut_token(tokens, permissions))
        return SEC_S_OK;
    if (const int result = sec__translate_perms(permissions.text, &set, &entry.perm_mask);
        result != SEC_S_OK) {
        // The message about the letter gives way to the one that names the line.
        cu_set_no_error_1();
        qz::report(result, qz::msg::bad_permission_token, line, permissions.text);
        return result;
    }
    qz::token excess;
    if (cut_token(tokens, excess))
        return qz::report(SEC_S_BAD_ACL, qz::msg::tokens_in_excess, line);
    return SEC_S_OK;
}

} // namespace

int sec__read_acle_from_text(const sec_perm_set_t *set, char **cursor, std::size_t *remaining,
                             std::uint32_t *line, sec_acle_t *entry) {
    constexpr int line_consumed = 1;
    *entry = {};
    char *begin = *cursor;
    if (begin == nullptr || *begin == '\0')
        return SEC_S_OK;

    char *end = find_line_end(begin, *remaining);
    const bool ends_at_nul = *end == '\0';
    const std::size_t length = static_cast<std::size_t>(end - begin) + 1;
    const auto shown_line = static_cast<int>(*line);

    int result = SEC_S_OK;
    if (length > qz::line_length_max) {
        if (qz::traces(qz::trace_category::errors))
            qz::trace_data(115, qz::number(*line), qz::number(length));
        result = qz::report(SEC_S_FILE_ERROR, qz::msg::line_too_long, shown_line);
    } else {
        result = parse_line(qz::line_tokens(begin, end), set == nullptr ? acl__default_perm_set : *set,
                            shown_line, *entry);
        // A NUL that is not the text's own end hides whatever follows it.
        if (result == SEC_S_OK && ends_at_nul && *remaining != length) {
            *cursor = nullptr;
            ++*line;
            return qz::report(SEC_S_BAD_ACL, qz::msg::line_corrupted, shown_line);
        }
    }
    *cursor = ends_at_nul ? nullptr : end + 1;
    *remaining -= length;
    ++*line;
    return result == SEC_S_OK ? line_consumed : result;
}
