// The syntax of ACL files: lines as a table of facts, whole texts, and random bytes against a second parser that is
// plain enough to be right at a glance.
#include "qzacl_acl/entry_parser.h"
#include "support.h"

#include <algorithm>
#include <random>

using namespace support;

namespace {

// What one call makes of a line.
struct parsed {
    int result = 1;
    int id = 0;
    arguments args = {};
    int type = 0;
    std::string mechanism = {};
    std::string identity = {};
    std::uint32_t mask = 0;
};

// The second parser. `length` becomes the line's, its end included.
parsed parse_plainly(const std::string &text, std::size_t at, unsigned line, std::size_t &length) {
    const std::size_t end = std::min(text.find_first_of("\n\f\r\0"s, at), text.size());
    const bool at_nul = end == text.size() || text[end] == '\0';
    length = end - at + 1;
    const std::string number = std::to_string(line);
    if (length > 1096)
        return {37, 145, {number}};
    std::vector<std::string> tokens;
    while ((at = std::min(text.find_first_not_of(" \t\v", at), end)) < end && text[at] != '#') {
        const std::size_t stop = std::min(text.find_first_of(" \t\v", at), end);
        tokens.push_back(text.substr(at, stop - at));
        at = stop;
    }
    const parsed done = at_nul && end != text.size() ? parsed{42, 131, {number}} : parsed{};
    if (tokens.empty())
        return done;
    parsed entry = done;
    const std::size_t kind = tokens[0].size() == 1 ? "nouegNOUEG"s.find(tokens[0]) : std::string::npos;
    if (kind == std::string::npos)
        return {42, 165, {number, tokens[0]}};
    entry.type = 1 << kind % 5;
    std::size_t next = 1;
    if (entry.type == 4 || entry.type == 8) {
        if (tokens.size() == next)
            return {42, 158, {number}};
        if (tokens[next].size() > 16)
            return {42, 132, {tokens[next], number}};
        for (char letter : tokens[next++])
            entry.mechanism += letter >= 'A' && letter <= 'Z' ? static_cast<char>(letter + 32) : letter;
    }
    if (entry.type > 2) {
        if (tokens.size() == next)
            return {42, 158, {number}};
        entry.identity = tokens[next++];
    }
    if (tokens.size() == next)
        return entry;
    for (char letter : tokens[next]) {
        const std::size_t bit = "rwcxCqledvsao"s.find(letter);
        if (bit == std::string::npos)
            return {36, 166, {number, tokens[next]}};
        entry.mask |= 1u << bit;
    }
    if (tokens.size() > next + 1)
        return {42, 159, {number}};
    return entry;
}

// A text on its way through the parser; it ends right before memory that nobody may touch.
struct walk {
    explicit walk(const std::string &source)
        : text(source + '\0'), cursor(text.data()), remaining(text.size()) {}

    int next(const sec_perm_set_t *set = nullptr) {
        std::memset(&acle, 0x5a, sizeof acle);
        return sec__read_acle_from_text(set, &cursor, &remaining, &line, &acle);
    }
    void expect(const parsed &wanted, const std::string &what) {
        SCOPED_TRACE(testing::PrintToString(what));
        EXPECT_EQ(next(), wanted.result);
        EXPECT_EQ(recorded_error(), wanted.id == 0 ? failure{} : error_of(wanted.result, wanted.id, wanted.args));
        if (wanted.result != 1)
            return;
        EXPECT_EQ(acle.type, wanted.type);
        EXPECT_STREQ(acle.mechanism, wanted.mechanism.c_str());
        EXPECT_EQ(acle.perm_mask, wanted.mask);
        EXPECT_EQ(acle.identity == nullptr ? "" : acle.identity, wanted.identity);
        EXPECT_EQ(acle.identity == nullptr, wanted.type < 4);
    }

    guarded text;
    char *cursor;
    std::size_t remaining;
    std::uint32_t line = 1;
    sec_acle_t acle;
};

const std::pair<const char *, parsed> lines[] = {
    {"n", {1, 0, {}, 1, "", "", 0}},
    {"N rw", {1, 0, {}, 1, "", "", 3}},
    {"o rw # anyone", {1, 0, {}, 2, "", "", 3}},
    {" \t\vO\t\vwr \v", {1, 0, {}, 2, "", "", 3}},
    {"u unix alice", {1, 0, {}, 4, "unix", "alice", 0}},
    {"u UNIX Alice@Host r", {1, 0, {}, 4, "unix", "Alice@Host", 1}},
    {"U k\xc4z \xc4\x80 rwcxCqledvsao", {1, 0, {}, 4, "k\xc4z", "\xc4\x80", 0x1fff}},
    {"e MMMMMMMMMMMMMMMM x c", {1, 0, {}, 8, "mmmmmmmmmmmmmmmm", "x", 4}},
    {"E hba2 ::1 C#", {36, 166, {"1", "C#"}}},
    {"g staff C # why", {1, 0, {}, 16, "", "staff", 0x10}},
    {"G a#b", {1, 0, {}, 16, "", "a#b", 0}},
    {"g staff #rw", {1, 0, {}, 16, "", "staff", 0}},
    {"o rrrrwwwwr", {1, 0, {}, 2, "", "", 3}},
    {"#", {}},
    {" \t\v# u unix", {}},
    {" \t\v", {}},
    {"n#x", {42, 165, {"1", "n#x"}}},
    {"x r", {42, 165, {"1", "x"}}},
    {"nn r", {42, 165, {"1", "nn"}}},
    {"\x85 r", {42, 165, {"1", "\x85"}}},
    {"u", {42, 158, {"1"}}},
    {"u # unix alice", {42, 158, {"1"}}},
    {"u unix", {42, 158, {"1"}}},
    {"e unix # alice", {42, 158, {"1"}}},
    {"g", {42, 158, {"1"}}},
    {"u MMMMMMMMMMMMMMMMM", {42, 132, {"MMMMMMMMMMMMMMMMM", "1"}}},
    {"u MMMMMMMMMMMMMMMMM x q extra", {42, 132, {"MMMMMMMMMMMMMMMMM", "1"}}},
    {"n rz", {36, 166, {"1", "rz"}}},
    {"n rR extra", {36, 166, {"1", "rR"}}},
    {"n r w", {42, 159, {"1"}}},
    {"g staff rw extra", {42, 159, {"1"}}},
    {"u unix alice r w # x", {42, 159, {"1"}}},
};

TEST(parser, takes_each_line_as_the_table_says) {
    for (const auto &[text, wanted] : lines) {
        for (const char *end : {"", "\n", "\f", "\r"}) {
            walk at(std::string(text) + end);
            at.expect(wanted, std::string(text) + end);
            EXPECT_EQ(at.line, 2u);
            // Behind a line end stands the text's NUL; without one nothing is left to point at.
            EXPECT_EQ(at.cursor, *end == '\0' ? nullptr : at.text.data() + std::strlen(text) + 1) << text;
            if (*end != '\0') {
                EXPECT_EQ(at.remaining, 1u) << text;
            }
            EXPECT_EQ(at.next(), 0) << text;
            EXPECT_EQ(at.line, 2u);
            EXPECT_EQ(at.acle.type, 0);
        }
        // The second parser holds to the same facts.
        std::size_t length = 0;
        const parsed plain = parse_plainly(text, 0, 1, length);
        EXPECT_EQ(std::tie(plain.result, plain.id, plain.args), std::tie(wanted.result, wanted.id, wanted.args));
    }
}

TEST(parser, numbers_the_lines_of_whole_texts) {
    const parsed blank;
    const parsed any{1, 0, {}, 2, "", "", 1};
    const auto line_of = [](std::size_t length) { return "o r "s + std::string(length - 5, ' ') + "\n"; };
    const struct {
        std::string text;
        std::vector<parsed> calls;
    } texts[] = {
        {"", {}},
        {"\n\n", {blank, blank}},
        {"o r\r\no r\r\n", {any, blank, any, blank}},
        {"o r\fo r\ro r", {any, any, any}},
        {"o r\n ", {any, blank}},
        {"x\nu\nn z\no r", {{42, 165, {"1", "x"}}, {42, 158, {"2"}}, {36, 166, {"3", "z"}}, any}},
        {line_of(1096) + "o r", {any, any}},
        {line_of(1097) + "o r", {{37, 145, {"1"}}, any}},
        {"\n"s + line_of(1096).substr(0, 1095), {blank, any}},
        {"\n"s + line_of(1097).substr(0, 1096), {blank, {37, 145, {"2"}}}},
        {std::string(5000, '#') + "\n", {{37, 145, {"1"}}}},
        {"o r\no\0r\no r\n"s, {any, {42, 131, {"2"}}}},
        {"x\0\no r\n"s, {{42, 165, {"1", "x"}}}},
        {"\0o r\n"s, {}},
        {"o r\n\0o r\n"s, {any}},
        {"#\0"s, {{42, 131, {"1"}}}},
    };
    for (const auto &[text, calls] : texts) {
        walk at(text);
        for (const parsed &wanted : calls)
            at.expect(wanted, text);
        EXPECT_EQ(at.next(), 0) << text;
        EXPECT_EQ(at.line, calls.size() + 1) << text;
        EXPECT_EQ(recorded_error(), failure{});
    }
}

TEST(parser, leaves_everything_but_the_entry_alone_when_nothing_is_left) {
    walk at("");
    at.line = 77;
    for (char *cursor : {static_cast<char *>(nullptr), at.text.data()}) {
        at.cursor = cursor;
        EXPECT_EQ(at.next(), 0);
        EXPECT_EQ(at.cursor, cursor);
        EXPECT_EQ(at.remaining, 1u);
        EXPECT_EQ(at.line, 77u);
        EXPECT_EQ(at.acle.identity, nullptr);
    }
}

TEST(parser, reads_permissions_by_the_templates_it_is_given) {
    const sec_perm_template_t templates[] = {{0x80000000, 'Z', "", ""}, {2, 'r', "", ""}, {4, 'r', "", ""}};
    const sec_perm_set_t own = {3, templates};
    const sec_perm_set_t none = {0, nullptr};
    walk at("o rZ\no w\no r\no");
    EXPECT_EQ(at.next(&own), 1);
    EXPECT_EQ(at.acle.perm_mask, 0x80000002);
    EXPECT_EQ(at.next(&own), 36);
    EXPECT_EQ(recorded_error(), error_of(36, 166, {"2", "w"}));
    EXPECT_EQ(at.next(&none), 36);
    EXPECT_EQ(recorded_error(), error_of(36, 166, {"3", "r"}));
    EXPECT_EQ(at.next(&none), 1);
}

TEST(parser, agrees_with_the_plain_parser_on_random_texts) {
    std::mt19937 random(4711);
    const std::string pieces[] = {"u ", "e ", "g ", "n ",    "o",    "r",         "rw", "Unix ",     "\n", "\n",  "\f",
                                  "\r", "#",  " ",  "\0"s, "\t\v", "\x85\xa0", "q z", std::string(1080, 'x') + " "};
    for (int round = 0; round < 20000; ++round) {
        std::string text;
        for (auto count = random() % 24; count != 0; --count)
            text += round % 4 == 0 ? std::string(1, static_cast<char>(random())) : pieces[random() % std::size(pieces)];
        walk at(text);
        std::size_t place = 0;
        while (at.cursor != nullptr && *at.cursor != '\0' && !HasFailure()) {
            const std::uint32_t line = at.line;
            std::size_t length = 0;
            const parsed wanted = parse_plainly(text, place, line, length);
            at.expect(wanted, text);
            place += length;
            const bool ended = place > text.size() || text[place - 1] == '\0';
            ASSERT_EQ(at.cursor, ended ? nullptr : at.text.data() + place) << testing::PrintToString(text);
            ASSERT_EQ(at.line, line + 1);
            if (!ended) {
                ASSERT_EQ(at.remaining, text.size() + 1 - place);
            }
        }
        ASSERT_FALSE(HasFailure());
    }
}

} // namespace
