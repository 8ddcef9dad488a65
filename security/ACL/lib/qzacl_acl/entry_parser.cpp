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

// Steps through the bytes of a text that are no plain signs: blanks, control characters, and bytes above ASCII.
class sign_scan {
public:
    // The bytes from `begin` up to `limit` end in a NUL.
    sign_scan(char *begin, const char *limit) : block_(begin), limit_(limit) { load(); }

    // The next such byte. The caller stops at the last NUL.
    char *next_other() {
        while (others_ == 0) {
            block_ += word_size;
            load();
        }
        char *const found = block_ + std::countr_zero(others_) / 8;
        others_ &= others_ - 1;
        return found;
    }

private:
    void load() {
        std::uint64_t word = 0;
        if (limit_ - block_ >= static_cast<std::ptrdiff_t>(word_size)) [[likely]]
            word = first_byte_lowest(load8(block_));
        else
            for (const char *at = limit_; at != block_;)
                word = word << 8 | static_cast<unsigned char>(*--at);
        // The high bit of each byte that is not above the blank, or above 127. No sum carries into the next byte.
        const std::uint64_t above_blank = (word & in_each_byte(0x7f)) + in_each_byte(0x7f - ' ');
        others_ = (~above_blank | word) & in_each_byte(0x80);
    }

    char *block_;
    const char *limit_;
    std::uint64_t others_ = 0;
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
    line_tokens(char *begin, const char *limit) : at_(begin), others_(begin, limit) {}

    // False when only blanks or a comment are left.
    bool next(line_word &out) {
        while (end_ == nullptr) {
            char *const stop = next_separator();
            if (ends_line(*stop))
                end_at(stop);
            if (stop != at_) {
                if (*at_ == '#')
                    return false;
                out = {at_, static_cast<std::size_t>(stop - at_)};
                *stop = '\0';
                at_ = stop + 1;
                return true;
            }
            if (end_ == nullptr && !is_blank(*stop)) {
                out = {at_, 0};
                at_ = stop + 1;
                *stop = '\0';
                return true;
            }
            ++at_;
        }
        return false;
    }

    // The end of the line, and whether it is a NUL.
    char *end() {
        while (end_ == nullptr) {
            char *const other = others_.next_other();
            if (ends_line(*other))
                end_at(other);
        }
        return end_;
    }
    bool ends_at_nul() const { return ends_at_nul_; }

private:
    static constexpr bool ends_line(char c) { return c == '\0' || is_line_end(c); }

    void end_at(char *stop) {
        end_ = stop;
        ends_at_nul_ = *stop == '\0';
    }

    // White space, a line end, or a NUL.
    char *next_separator() {
        for (;;) {
            char *const other = others_.next_other();
            if (*other == ' ' || ends_line(*other) || is_space_(*other))
                return other;
        }
    }

    char *at_;
    char *end_ = nullptr;
    bool ends_at_nul_ = false;
    sign_scan others_;
    space_class is_space_;
};

void fold_in_place(const line_word &word) {
    for (char &c : std::span(word.text, word.length))
        c = static_cast<char>(fold(static_cast<unsigned char>(c)));
}

// Fills the entry from the tokens of a line. Without any, its type stays 0.
int parse_line(line_tokens &tokens, const sec_perm_set_t &set, int line, parsed_acle &entry) {
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

    const auto shown_line = static_cast<int>(*line);
    line_tokens tokens(begin, begin + *remaining);
    int result = parse_line(tokens, set == nullptr ? acl__default_perm_set : *set, shown_line, *entry);
    char *const end = tokens.end();
    const std::size_t length = static_cast<std::size_t>(end - begin) + 1;
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
    *cursor = tokens.ends_at_nul() ? nullptr : end + 1;
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
