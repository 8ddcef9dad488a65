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

// Steps through the bytes that may end a token: blanks, control characters, and bytes above ASCII.
class token_end_scan {
public:
    // The bytes from `begin` up to `limit` end in a NUL.
    token_end_scan(char *begin, const char *limit) : block_(begin), limit_(limit) { load(); }

    // The next such byte. The caller stops at the last NUL.
    char *next() {
        while (candidates_ == 0) {
            block_ += word_size;
            load();
        }
        char *const found = block_ + std::countr_zero(candidates_) / 8;
        candidates_ &= candidates_ - 1;
        return found;
    }

private:
    void load() {
        const auto left = static_cast<std::size_t>(limit_ - block_);
        const std::uint64_t word =
            left >= word_size ? first_byte_lowest(load8(block_)) : load_few(block_, left);
        // The high bit of each byte, unless the byte is above the blank and below 128. No sum carries into the next byte.
        const std::uint64_t above_blank = (word & in_each_byte(0x7f)) + in_each_byte(0x7f - ' ');
        candidates_ = (~above_blank | word) & in_each_byte(0x80);
    }

    char *block_; // of eight bytes
    const char *limit_;
    std::uint64_t candidates_ = 0; // the high bits of those bytes of the block that are left
};

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

// Cuts the tokens out of one line of a text, ending each with a NUL in place, and finds the end of the line.
class line_tokens {
public:
    // The bytes from `begin` up to `limit` end in a NUL.
    line_tokens(char *begin, const char *limit) : begin_(begin), at_(begin), candidates_(begin, limit) {}

    // False when only blanks or a comment are left.
    bool next(line_word &out) {
        while (end_ == nullptr) {
            char *const stop = next_separator();
            // White space of the locale that is no blank ends a token even if that is empty.
            if (stop == at_ && (end_ != nullptr || is_blank(*stop))) {
                ++at_;
                continue;
            }
            if (*at_ == '#')
                return false;
            out = {at_, static_cast<std::size_t>(stop - at_)};
            *stop = '\0';
            at_ = stop + 1;
            return true;
        }
        return false;
    }

    // The line end or NUL.
    char *end() {
        while (end_ == nullptr)
            note_end(candidates_.next());
        return end_;
    }
    std::size_t length() { return static_cast<std::size_t>(end() - begin_) + 1; }
    bool ends_at_nul() const { return ends_at_nul_; }

private:
    void note_end(char *stop) {
        if (*stop != '\0' && !is_line_end(*stop))
            return;
        end_ = stop;
        ends_at_nul_ = *stop == '\0';
    }

    // White space, a line end, or a NUL.
    char *next_separator() {
        for (;;) {
            char *const candidate = candidates_.next();
            note_end(candidate);
            if (end_ != nullptr || *candidate == ' ' || is_space_(*candidate))
                return candidate;
        }
    }

    char *begin_;
    char *at_;
    char *end_ = nullptr;
    bool ends_at_nul_ = false; // noted, because the NUL of the last token overwrites the line end
    token_end_scan candidates_;
    space_class is_space_;
};

void fold_in_place(const line_word &word) {
    for (char &c : std::span(word.text, word.length))
        c = static_cast<char>(fold(static_cast<unsigned char>(c)));
}

// Fills the entry from the tokens of a line. Without any, its type stays 0.
int parse_line(line_tokens &tokens, const sec_perm_set_t &set, int line, parsed_acle &entry) {
    // Of a line that is too long, nothing else is reported: its tokens may be as long as the text.
    const auto refuse = [&tokens](int code, const auto &message, auto... values) {
        return tokens.length() > line_length_max ? code : report(code, message, values...);
    };
    line_word type;
    if (!tokens.next(type))
        return SEC_S_OK;
    entry.type = type.length == 1 ? type_of_letter(type.text[0]) : std::uint8_t{0};
    if (entry.type == 0)
        return refuse(SEC_S_BAD_ACL, msg::bad_type_token, line, type.text);

    if (has_mechanism(entry.type)) {
        line_word mechanism;
        if (!tokens.next(mechanism))
            return refuse(SEC_S_BAD_ACL, msg::tokens_missing, line);
        if (mechanism.length > mechanism_max)
            return refuse(SEC_S_BAD_ACL, msg::mechanism_too_long, mechanism.text, line);
        fold_in_place(mechanism);
        entry.mechanism = {mechanism.text, mechanism.length};
    }
    if (has_identity(entry.type)) {
        line_word identity;
        if (!tokens.next(identity))
            return refuse(SEC_S_BAD_ACL, msg::tokens_missing, line);
        entry.identity = {identity.text, identity.length};
    }

    line_word permissions;
    if (!tokens.next(permissions))
        return SEC_S_OK;
    if (const int result = sec__translate_perms(permissions.text, &set, &entry.perm_mask);
        result != SEC_S_OK) {
        // This message replaces the one about the letter, because it names the line.
        cu_set_no_error_1();
        return refuse(result, msg::bad_permission_token, line, permissions.text);
    }
    line_word excess;
    if (tokens.next(excess))
        return refuse(SEC_S_BAD_ACL, msg::tokens_in_excess, line);
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

    const auto shown_line = static_cast<int>(*line);
    line_tokens tokens(begin, begin + *remaining);
    int result = parse_line(tokens, set == nullptr ? acl__default_perm_set : *set, shown_line, *entry);
    const std::size_t length = tokens.length();
    if (length > line_length_max) {
        *entry = {};
        trace(point::line_too_long, *line, length);
        result = report(SEC_S_FILE_ERROR, msg::line_too_long, shown_line);
    } else if (result == SEC_S_OK && tokens.ends_at_nul() && *remaining != length) {
        // A NUL before the end of the text would hide what follows.
        *cursor = nullptr;
        ++*line;
        return report(SEC_S_BAD_ACL, msg::line_corrupted, shown_line);
    }
    *cursor = tokens.ends_at_nul() ? nullptr : tokens.end() + 1;
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
