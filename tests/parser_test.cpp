// The syntax of ACL files: texts and what their lines are, and random bytes, all of them also against a
// second parser that is plain enough to be right at a glance.
#include "qzacl_acl/entry_parser.h"
#include "support.h"

#include <algorithm>
#include <random>

using namespace support;

namespace {

// What a line is: "-" for none; an entry as its type, its mechanism, its identity and its mask; a failure as
// its message and the message's arguments.
using line_facts = std::string;

// The second parser. `length` becomes the line's, its end included.
line_facts parse_plainly(const std::string &text, std::size_t at, std::uint32_t number, std::size_t &length) {
    const std::size_t end = std::min(text.find_first_of("\n\f\r\0"s, at), text.size());
    const std::string line = " " + std::to_string(number);
    length = end - at + 1;
    if (length > 1096) return "145" + line;
    std::vector<std::string> tokens;
    while ((at = std::min(text.find_first_not_of(" \t\v", at), end)) < end && text[at] != '#') {
        const std::size_t stop = std::min(text.find_first_of(" \t\v", at), end);
        tokens.push_back(text.substr(at, stop - at));
        at = stop;
    }
    const bool is_cut = end < text.size() && text[end] == '\0';
    if (tokens.empty()) return is_cut ? "131" + line : "-";
    if (tokens[0].size() != 1 || "nouegNOUEG"s.find(tokens[0]) == std::string::npos)
        return "165" + line + " " + tokens[0];
    std::string facts = folded(tokens[0]);
    const bool has_mechanism = facts == "u" || facts == "e";
    const std::size_t named = has_mechanism ? 3 : facts == "g" ? 2 : 1;
    if (has_mechanism && tokens.size() > 1 && tokens[1].size() > 16) return "132 " + tokens[1] + line;
    if (tokens.size() < named) return "158" + line;
    for (std::size_t index = 1; index < named; ++index)
        facts += " " + (has_mechanism && index == 1 ? folded(tokens[index]) : tokens[index]);
    std::uint32_t mask = 0;
    for (char letter : tokens.size() > named ? tokens[named] : "") {
        const std::size_t bit = "rwcxCqledvsao"s.find(letter);
        if (bit == std::string::npos) return "166" + line + " " + tokens[named];
        mask |= 1u << bit;
    }
    if (tokens.size() > named + 1) return "159" + line;
    return is_cut ? "131" + line : facts + " " + std::to_string(mask);
}

// A text on its way through the parser; it ends right before memory that nobody may touch.
struct walk {
    explicit walk(const std::string &source) : text(source + '\0'), cursor(text.data()), remaining(text.size()) {}
    int next(const sec_perm_set_t *set = nullptr) {
        std::memset(&acle, 0x5a, sizeof acle);
        return sec__read_acle_from_text(set, &cursor, &remaining, &line, &acle);
    }
    std::string entry() const {
        if (acle.type == 0) return "-";
        std::string facts(1, "?no?u???e???????g"[acle.type]);
        for (const char *name : {acle.mechanism, static_cast<const char *>(acle.identity)})
            facts += name == nullptr || *name == '\0' ? "" : " "s + name;
        return facts + " " + std::to_string(acle.perm_mask);
    }
    guarded text;
    char *cursor;
    std::size_t remaining;
    std::uint32_t line = 1;
    sec_acle_t acle = {};
};

// The lines of a text by the second parser, with which the library must agree in everything.
std::vector<line_facts> lines_of(const std::string &text) {
    SCOPED_TRACE(testing::PrintToString(text));
    std::vector<line_facts> lines;
    walk at(text);
    for (std::size_t place = 0; place < text.size() && text[place] != '\0';) {
        std::size_t length = 0;
        const line_facts wanted = lines.emplace_back(parse_plainly(text, place, at.line, length));
        const int result = at.next();
        const failure error = recorded_error();
        if (error == no_error) {
            EXPECT_EQ(std::tuple(result, at.entry()), std::tuple(1, wanted));
        } else {
            EXPECT_EQ(result, error.id == 145 ? 37 : error.id == 166 ? 36 : 42);
            const arguments args = words(wanted);
            EXPECT_EQ(error, error_of(result, std::stoi(args[0]), {args.begin() + 1, args.end()}));
        }
        place += length;
        const bool is_last = place > text.size() || text[place - 1] == '\0';
        EXPECT_EQ(at.cursor, is_last ? nullptr : at.text.data() + place);
        EXPECT_EQ(at.line, lines.size() + 1);
        if (is_last || testing::Test::HasFailure()) break;
        EXPECT_EQ(at.remaining, text.size() + 1 - place);
    }
    const std::tuple end(at.cursor, at.remaining, at.line);
    EXPECT_EQ(at.next(), 0);
    EXPECT_EQ(std::tuple(at.cursor, at.remaining, at.line), end);
    EXPECT_EQ(at.entry(), "-");
    return lines;
}

std::string line_of(std::size_t length) { return "o r "s + std::string(length - 5, ' ') + "\n"; }

TEST(parser, takes_lines_for_what_they_are) {
    const std::string long17(17, 'M'), long16(16, 'M');
    const std::pair<std::string, std::vector<line_facts>> texts[] = {
        {"n\nN rw\no rw # anyone\n \t\vO\t\vwr \v\no rrrrwwwwr\nu unix alice\nu UNIX Alice@Host r\n \t\v# "
         "u\n \t",
         {"n 0", "n 3", "o 3", "o 3", "o 3", "u unix alice 0", "u unix Alice@Host 1", "-", "-"}},
        {"U K\xc4z \xc4\x80 rwcxCqledvsao\ng Staff C # why\nG a#b\ng a#b #rw\ne " + long16 + " x c",
         {"u k\xc4z \xc4\x80 8191", "g Staff 16", "g a#b 0", "g a#b 0", "e mmmmmmmmmmmmmmmm x 4"}},
        {"n#x\nnn r\n\x85 r\nx r\nu # unix alice\nu unix\ne unix # alice\ng",
         {"165 1 n#x", "165 2 nn", "165 3 \x85", "165 4 x", "158 5", "158 6", "158 7", "158 8"}},
        {"u " + long17 + "\nu " + long17 + " x q extra\nn rR\nE hba2 ::1 rR extra\ne hba2 ::1 C#",
         {"132 " + long17 + " 1", "132 " + long17 + " 2", "166 3 rR", "166 4 rR", "166 5 C#"}},
        {"n r w\ng staff rw extra\nu unix alice r w # x\no r", {"159 1", "159 2", "159 3", "o 1"}},
        {"\n\no r\r\no w\fo c\ro x\r\n", {"-", "-", "o 1", "-", "o 2", "o 4", "o 8", "-"}},
        {line_of(1096) + line_of(1097) + "o w\n" + line_of(5000), {"o 1", "145 2", "o 2", "145 4"}},
        {"\n"s + line_of(1096).substr(0, 1095), {"-", "o 1"}},
        {"\n"s + line_of(1097).substr(0, 1096), {"-", "145 2"}},
        {"o r\no\0r\no r\n"s, {"o 1", "131 2"}},
        {"x\0\no r\n"s, {"165 1 x"}},
        {"#\0"s, {"131 1"}},
        {"o r\n\0o r\n"s, {"o 1"}},
    };
    for (const auto &[text, lines] : texts) EXPECT_EQ(lines_of(text), lines) << text;
}

TEST(parser, agrees_with_the_plain_parser_on_random_texts) {
    std::mt19937 random(4711);
    const std::string filler = std::string(1080, 'x') + " ";
    const std::string_view pieces[] = {"u ", "e ", "g ", "n ", "o",    "r",    "rw",       "Unix ", "\n",  "\n",
                                       "\f", "\r", "#",  " ",  "\0"sv, "\t\v", "\x85\xa0", "q z",   filler};
    for (int round = 0; round < 20000 && !HasFailure(); ++round) {
        std::string text;
        for (auto count = random() % 24; count != 0; --count)
            text += round % 4 == 0 ? number(random(), 1) : std::string(pieces[random() % std::size(pieces)]);
        lines_of(text);
    }
}

TEST(parser, reads_permissions_by_the_templates_it_is_given) {
    const sec_perm_template_t templates[] = {{0x80000000, 'Z', "", ""}, {2, 'r', "", ""}, {4, 'r', "", ""}};
    const sec_perm_set_t own = {3, templates}, none = {0, nullptr};
    walk at("o rZ\no w\no r\no");
    EXPECT_EQ(at.next(&own), 1);
    EXPECT_EQ(at.acle.perm_mask, 0x80000002);
    EXPECT_EQ(at.next(&own), 36);
    EXPECT_EQ(recorded_error(), error_of(36, 166, {"2", "w"}));
    EXPECT_EQ(at.next(&none), 36);
    EXPECT_EQ(at.next(&none), 1);
}

} // namespace
