// Compares whole ACL texts, line by line, with a second parser that is simple enough to be obviously right.
// Accepted texts compile to the model's bytes, which are sound and list the entries written, even if memory runs out
// in between.
#include "faults.h"
#include "fuzz.h"
#include "model.h"
#include "qzacl_acl/compile.h"
#include "qzacl_acl/entry_parser.h"
#include "qzacl_acl/trees.h"

namespace {

using namespace fuzz;
using namespace support;

// The content of a line: nothing, an entry as text_of() shows it, or a failure.
struct line_facts {
    std::string entry = {};
    failure error = no_error;
    std::size_t length = 0; // its end included
};

// The permissions of some letters; none: one of them is unknown.
std::optional<std::uint32_t> mask_of(const std::string &letters) {
    std::uint32_t mask = 0;
    for (const char letter : letters) {
        const std::size_t bit = "rwcxCqledvsao"s.find(letter);
        if (bit == std::string::npos)
            return std::nullopt;
        mask |= 1u << bit;
    }
    return mask;
}

// The second parser, for a line that is neither too long nor empty. `is_cut` means by a NUL.
line_facts parse_tokens(const arguments &tokens, int line, bool is_cut) {
    const std::string type = folded(tokens[0]);
    if (type.size() != 1 || "noueg"s.find(type) == std::string::npos)
        return {.error = bad_acl(msg::bad_type_token, line, tokens[0])};
    const bool has_mechanism = type == "u" || type == "e";
    const std::size_t needed = has_mechanism ? 3 : type == "g" ? 2 : 1;
    if (has_mechanism && tokens.size() > 1 && tokens[1].size() > 16)
        return {.error = bad_acl(msg::mechanism_too_long, tokens[1], line)};
    if (tokens.size() < needed)
        return {.error = bad_acl(msg::tokens_missing, line)};
    std::string entry = type;
    for (std::size_t index = 1; index < needed; ++index)
        entry += " " + (has_mechanism && index == 1 ? folded(tokens[index]) : tokens[index]);
    const std::string letters = tokens.size() > needed ? tokens[needed] : "";
    const auto mask = mask_of(letters);
    if (!mask)
        return {.error = error_of(SEC_S_BAD_PERMISSION, msg::bad_permission_token, line, letters)};
    if (tokens.size() > needed + 1)
        return {.error = bad_acl(msg::tokens_in_excess, line)};
    if (is_cut)
        return {.error = bad_acl(msg::line_corrupted, line)};
    return {.entry = entry + " " + std::to_string(*mask)};
}

line_facts parse_plainly(const std::string &text, std::size_t at, int line) {
    const std::size_t end = std::min(text.find_first_of("\n\f\r\0"s, at), text.size());
    const std::size_t length = end - at + 1;
    if (length > 1096)
        return {.error = error_of(SEC_S_FILE_ERROR, msg::line_too_long, line), .length = length};
    arguments tokens;
    while ((at = std::min(text.find_first_not_of(" \t\v", at), end)) < end && text[at] != '#') {
        const std::size_t stop = std::min(text.find_first_of(" \t\v", at), end);
        tokens.push_back(text.substr(at, stop - at));
        at = stop;
    }
    const bool is_cut = end < text.size() && text[end] == '\0';
    line_facts facts;
    if (!tokens.empty())
        facts = parse_tokens(tokens, line, is_cut);
    else if (is_cut)
        facts.error = bad_acl(msg::line_corrupted, line);
    facts.length = length;
    return facts;
}

// Trees may read this many bytes after the text that they point into.
constexpr std::size_t readable_behind = 7;

// A text beside the model, line by line.
class text_reader {
public:
    explicit text_reader(const std::string &text)
        : text_(text), is_borrowed_(text.size() % 3 != 0),
          copy_(text_field(text) + std::string(is_borrowed_ ? readable_behind : 0, 'x')) {}

    // Returns the model, whose bytes are the compiled ones.
    model compile(buffer &out) {
        while (at_ < text_.size() && text_[at_] != '\0' && read_line())
            ;
        EXPECT_EQ(sec__read_acle_from_text(nullptr, &cursor_, &left_, &line_, &parsed_), 0);
        // The tree of the latest key is compiled first.
        std::ranges::reverse(plain_.subacls);
        EXPECT_EQ(faults::patiently([&] { return sec__acltrees_to_acl(trees_.trees(), &out.acl); }),
                  SEC_S_OK);
        EXPECT_EQ(out.bytes(), plain_.bytes());
        return plain_;
    }
    failure first_failure() const { return first_failure_; }

private:
    void note(const failure &error) {
        if (first_failure_ == no_error)
            first_failure_ = error;
    }

    // Whether another line may follow.
    bool read_line() {
        const std::uint32_t number = line_;
        const line_facts wanted = parse_plainly(text_, at_, static_cast<int>(number));
        const int result = sec__read_acle_from_text(nullptr, &cursor_, &left_, &line_, &parsed_);
        const sec_acle_t acle = qz::record_of(parsed_);
        const bool is_read = result == qz::line_consumed;
        const bool is_entry = is_read && acle.type != 0;
        EXPECT_EQ(is_read ? no_error : outcome_of(result), wanted.error);
        EXPECT_EQ(is_entry ? text_of(acle) : "", wanted.entry);
        EXPECT_EQ(line_, number + 1);
        note(wanted.error);
        if (is_entry) {
            const int added = faults::patiently([&] { return trees_.add(qz::view_of(parsed_)); });
            const failure duplicate = plain_.edit(sec_add_acle_to_acl2, acle);
            EXPECT_EQ(outcome_of(added), duplicate);
            note(duplicate);
        }
        at_ += wanted.length;
        const bool is_last = at_ > text_.size() || text_[at_ - 1] == '\0';
        EXPECT_EQ(cursor_, is_last ? nullptr : start_ + at_);
        EXPECT_TRUE(is_last || left_ == text_.size() + 1 - at_);
        return !is_last;
    }

    const std::string &text_;
    const bool is_borrowed_;
    const buffer copy_;
    char *const start_ = static_cast<char *>(copy_.acl.data);
    char *cursor_ = start_;
    std::size_t left_ = text_.size() + 1;
    std::size_t at_ = 0;
    std::uint32_t line_ = 1;
    failure first_failure_ = no_error;
    model plain_;
    sec_acltree_array trees_{is_borrowed_ ? std::span(start_, left_) : std::span<char>()};
    qz::parsed_acle parsed_;
};

// Reads the text up to its first failure, which reports duplicates late. Compiles it if there is none.
failure read_at_once(const std::string &text, buffer &out) {
    const buffer copy(text_field(text) + std::string(readable_behind, 'x'));
    char *cursor = static_cast<char *>(copy.acl.data);
    std::size_t left = text.size() + 1;
    std::uint32_t line = 1;
    sec_acltree_array trees(std::span(cursor, left), qz::on_duplicate::report_late);
    qz::parsed_acle parsed;
    qz::acle_view last;
    int result = qz::line_consumed;
    while (result == qz::line_consumed) {
        result = sec__read_acle_from_text(nullptr, &cursor, &left, &line, &parsed);
        if (result != qz::line_consumed || parsed.type == 0)
            continue;
        last = qz::view_of(parsed);
        if (const int added = trees.add(last); added != SEC_S_OK)
            return outcome_of(added);
    }
    // Without memory for a copy, expanded entries are sorted another way.
    const auto settles = [&] { return trees.settle(result); };
    const bool is_patient = text.size() % 2 == 0;
    if (const failure first = outcome_of(is_patient ? faults::patiently(settles) : settles());
        first != no_error)
        return first;
    const failure compiled = outcome_of(sec__acltrees_to_acl(trees.trees(), &out.acl));
    EXPECT_TRUE(trees.trees().empty() || outcome_of(trees.settle(trees.add(last))) != no_error);
    return compiled;
}

} // namespace

int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
    buffer held;
    const std::string text(input(data, size));
    text_reader reader(text);
    const model plain = reader.compile(held);
    EXPECT_EQ(outcome_of(sec_convert_acl_to_host(with_check, &held.acl)), no_error);
    EXPECT_EQ(list_of(held.acl), plain.entries(0, nullptr));

    buffer at_once;
    EXPECT_EQ(read_at_once(text, at_once), reader.first_failure());
    EXPECT_EQ(at_once.bytes(), reader.first_failure() == no_error ? plain.bytes() : "");
    return 0;
}
