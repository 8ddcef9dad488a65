// The syntax of an ACL file: parses one line into one entry.
//
//   n|o            [permissions]              letters in either case
//   u|e  mechanism identity [permissions]
//   g    identity  [permissions]
//
// Blanks separate tokens. A '#' at the start of a token begins a comment.
#include "qzacl_acl/entry_parser.h"

#include "base/posix_fold.h"
#include "base/words.h"
#include "qzacl_acl/entry.h"
#include "qzacl_acl/identity_order.h"
#include "qzacl_acl/line_words.h"
#include "qzacl_acl/permission.h"
#include "report.h"
#include "trace_points.h"

#include <algorithm>
#include <bit>
#include <cstring>

using namespace qz;

namespace {

constexpr bool is_line_end(char c) { return c == '\n' || c == '\f' || c == '\r'; }

// The first byte at or after `at` that satisfies `ends`; there must be one before `limit`. `may_end` tests eight
// bytes at a time and sets the high bits of candidates, the first byte being the lowest. After the first true
// candidate it may set too many bits, but it never misses one.
template <class MayEnd, class Ends>
char *find_end(char *at, const char *limit, const MayEnd &may_end, const Ends &ends) {
    for (; limit - at >= static_cast<std::ptrdiff_t>(word_size); at += word_size) {
        for (auto some = may_end(first_byte_lowest(load8(at))); some != 0; some &= some - 1) {
            char *const found = at + std::countr_zero(some) / 8;
            if (ends(*found))
                return found;
        }
    }
    while (!ends(*at))
        ++at;
    return at;
}

// The first line end or NUL.
char *find_line_end(char *at, const char *limit) {
    const auto is_low = [](std::uint64_t word) { // below 14
        return (word - in_each_byte(14)) & ~word & in_each_byte(0x80);
    };
    return find_end(at, limit, is_low, [](char c) { return c == '\0' || is_line_end(c); });
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

// Cuts the tokens out of one line of a text, ending each with a NUL in place.
class line_tokens {
public:
    line_tokens(char *begin, char *end, const char *limit) : at_(begin), end_(end), limit_(limit) {}

    // False when only blanks or a comment are left.
    bool next(line_word &out) {
        if (!find_word(at_, end_))
            return false;
        out.text = at_;
        at_ = find_token_end();
        out.length = static_cast<std::size_t>(at_ - out.text);
        *at_ = '\0';
        // A token that ends at the line end is the last one.
        if (at_ != end_)
            ++at_;
        return true;
    }

private:
    // White space, a line end, or a NUL.
    char *find_token_end() const {
        const auto is_no_sign = [](std::uint64_t word) { // blanks, control characters and non-ASCII bytes
            return ((word - in_each_byte(' ' + 1)) | word) & in_each_byte(0x80);
        };
        return find_end(at_, limit_, is_no_sign,
                        [this](char c) { return c == '\0' || is_line_end(c) || is_space_(c); });
    }

    char *at_;
    char *end_;
    const char *limit_;
    space_class is_space_;
};

void fold_in_place(const line_word &word) {
    for (char &c : std::span(word.text, word.length))
        c = static_cast<char>(fold(static_cast<unsigned char>(c)));
}

// Fills the entry from the tokens of a line. Without any, its type stays 0.
int parse_line(line_tokens tokens, const sec_perm_set_t &set, int line, parsed_acle &entry) {
    line_word type;
    if (!tokens.next(type))
        return SEC_S_OK;
    entry.type = type.length == 1 ? type_of_letter(type.text[0]) : std::uint8_t{0};
    if (entry.type == 0)
        return report(SEC_S_BAD_ACL, msg::bad_type_token, line, type.text);

    if (has_mechanism(entry.type)) {
        line_word mechanism;
        if (!tokens.next(mechanism))
            return report(SEC_S_BAD_ACL, msg::tokens_missing, line);
        if (mechanism.length > mechanism_max)
            return report(SEC_S_BAD_ACL, msg::mechanism_too_long, mechanism.text, line);
        fold_in_place(mechanism);
        entry.mechanism = {mechanism.text, mechanism.length};
    }
    if (has_identity(entry.type)) {
        line_word identity;
        if (!tokens.next(identity))
            return report(SEC_S_BAD_ACL, msg::tokens_missing, line);
        entry.identity = {identity.text, identity.length};
    }

    line_word permissions;
    if (!tokens.next(permissions))
        return SEC_S_OK;
    if (const int result = sec__translate_perms(permissions.text, &set, &entry.perm_mask);
        result != SEC_S_OK) {
        // This message replaces the one about the letter, because it names the line.
        cu_set_no_error_1();
        report(result, msg::bad_permission_token, line, permissions.text);
        return result;
    }
    line_word excess;
    if (tokens.next(excess))
        return report(SEC_S_BAD_ACL, msg::tokens_in_excess, line);
    return SEC_S_OK;
}

} // namespace

namespace qz {

sec_acle_t record_of(const parsed_acle &entry) {
    sec_acle_t record = {entry.perm_mask, {}, entry.type, entry.identity.data()};
    std::copy(entry.mechanism.begin(), entry.mechanism.end(), record.mechanism);
    return record;
}

} // namespace qz

int sec__read_acle_from_text(const sec_perm_set_t *set, char **cursor, std::size_t *remaining,
                             std::uint32_t *line, parsed_acle *entry) {
    *entry = {};
    char *begin = *cursor;
    if (begin == nullptr || *begin == '\0')
        return SEC_S_OK;

    const char *limit = begin + *remaining;
    char *end = find_line_end(begin, limit);
    const bool ends_at_nul = *end == '\0';
    const std::size_t length = static_cast<std::size_t>(end - begin) + 1;
    const auto shown_line = static_cast<int>(*line);

    int result = SEC_S_OK;
    if (length > line_length_max) {
        trace(point::line_too_long, *line, length);
        result = report(SEC_S_FILE_ERROR, msg::line_too_long, shown_line);
    } else {
        result = parse_line(line_tokens(begin, end, limit), set == nullptr ? acl__default_perm_set : *set,
                            shown_line, *entry);
        // A NUL before the end of the text would hide what follows.
        if (result == SEC_S_OK && ends_at_nul && *remaining != length) {
            *cursor = nullptr;
            ++*line;
            return report(SEC_S_BAD_ACL, msg::line_corrupted, shown_line);
        }
    }
    *cursor = ends_at_nul ? nullptr : end + 1;
    *remaining -= length;
    ++*line;
    return result == SEC_S_OK ? line_consumed : result;
}

int sec__read_acle_from_text(const sec_perm_set_t *set, char **cursor, std::size_t *remaining,
                             std::uint32_t *line, sec_acle_t *entry) {
    parsed_acle parsed;
    const int result = sec__read_acle_from_text(set, cursor, remaining, line, &parsed);
    *entry = record_of(parsed);
    return result;
}
