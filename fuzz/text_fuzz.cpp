// Whole ACL texts, line by line against a second parser that is plain enough to be right at a glance: what is accepted
// compiles to the model's bytes, which are sound, list what was written, and come out of trees again; also where memory
// runs out meanwhile.
#include "faults.h"
#include "fuzz.h"
#include "model.h"
#include "qzacl_acl/compile.h"
#include "qzacl_acl/entry_parser.h"

namespace {

using namespace fuzz;
using namespace support;

// What a line is: "-" for none; an entry as its type, its mechanism, its identity and its mask; a failure as
// its message and the message's arguments.
using line_facts = std::string;

// The second parser. `length` becomes the line's, its end included.
line_facts parse_plainly(const std::string &text, std::size_t at, std::uint32_t number, std::size_t &length) {
    const std::size_t end = std::min(text.find_first_of("\n\f\r\0"s, at), text.size());
    const std::string line = " " + std::to_string(number);
    length = end - at + 1;
    if (length > 1096)
        return "145" + line;
    std::vector<std::string> tokens;
    while ((at = std::min(text.find_first_not_of(" \t\v", at), end)) < end && text[at] != '#') {
        const std::size_t stop = std::min(text.find_first_of(" \t\v", at), end);
        tokens.push_back(text.substr(at, stop - at));
        at = stop;
    }
    const bool is_cut = end < text.size() && text[end] == '\0';
    if (tokens.empty())
        return is_cut ? "131" + line : "-";
    if (tokens[0].size() != 1 || "nouegNOUEG"s.find(tokens[0]) == std::string::npos)
        return "165" + line + " " + tokens[0];
    std::string facts = folded(tokens[0]);
    const bool has_mechanism = facts == "u" || facts == "e";
    const std::size_t named = has_mechanism ? 3 : facts == "g" ? 2 : 1;
    if (has_mechanism && tokens.size() > 1 && tokens[1].size() > 16)
        return "132 " + tokens[1] + line;
    if (tokens.size() < named)
        return "158" + line;
    for (std::size_t index = 1; index < named; ++index)
        facts += " " + (has_mechanism && index == 1 ? folded(tokens[index]) : tokens[index]);
    std::uint32_t mask = 0;
    for (char letter : tokens.size() > named ? tokens[named] : "") {
        const std::size_t bit = "rwcxCqledvsao"s.find(letter);
        if (bit == std::string::npos)
            return "166" + line + " " + tokens[named];
        mask |= 1u << bit;
    }
    if (tokens.size() > named + 1)
        return "159" + line;
    return is_cut ? "131" + line : facts + " " + std::to_string(mask);
}

// Compiles a text beside the model, which in the end is as the bytes are.
model compile(const std::string &text, buffer &out) {
    const buffer copy(text_field(text));
    char *const start = static_cast<char *>(copy.acl.data), *cursor = start;
    const std::size_t size = text.size() + 1;
    std::size_t left = size;
    std::uint32_t line = 1;
    model plain;
    sec_acltree_array array;
    sec_acle_t acle;
    for (std::size_t place = 0, length = 0; place < text.size() && text[place] != '\0'; place += length) {
        const std::uint32_t number = line;
        const line_facts wanted = parse_plainly(text, place, number, length);
        const int result = sec__read_acle_from_text(nullptr, &cursor, &left, &line, &acle);
        if (result != 1) {
            const arguments facts = words(wanted);
            const int code = facts[0] == "145" ? 37 : facts[0] == "166" ? 36 : 42;
            EXPECT_EQ(result, code);
            EXPECT_EQ(recorded_error(),
                      error_with(code, std::stoi(facts[0]), {facts.begin() + 1, facts.end()}));
        } else {
            EXPECT_EQ(acle.type == 0 ? "-" : text_of(acle), wanted);
        }
        EXPECT_EQ(line, number + 1);
        if (result == 1 && acle.type != 0) {
            const int added = faults::patiently([&] { return sec__add_acle_to_trees(&acle, array); });
            const failure refused = plain.edit(sec_add_acle_to_acl2, acle);
            EXPECT_TRUE(added == refused.code && recorded_error() == refused) << refused;
        }
        const std::size_t end = place + length;
        const bool is_last = end > text.size() || text[end - 1] == '\0';
        EXPECT_EQ(cursor, is_last ? nullptr : start + end);
        if (is_last)
            break;
        EXPECT_EQ(left, size - end);
    }
    EXPECT_EQ(sec__read_acle_from_text(nullptr, &cursor, &left, &line, &acle), 0);
    // The trees, in the order in which their keys appeared, are compiled the last first.
    std::ranges::reverse(plain.subacls);
    EXPECT_EQ(faults::patiently([&] { return sec__acltrees_to_acl(array.trees(), &out.acl); }), 0);
    EXPECT_EQ(out.bytes(), plain.bytes());
    return plain;
}

} // namespace

int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
    buffer held, recompiled;
    const model plain = compile(std::string(input(data, size)), held);
    EXPECT_EQ(outcome_of(sec_convert_acl_to_host(1, &held.acl)), no_error);
    EXPECT_EQ(list_of(held.acl), plain.entries(0, nullptr));
    std::vector<sec_acltree_t *> trees;
    std::vector<qz::owned_acltree> owners;
    const auto *at = static_cast<const unsigned char *>(held.acl.data) + 5;
    for (const model_subacl &each : plain.subacls) {
        sec_acltree_t *root = nullptr;
        const qz::byte_span bytes(at, each.bytes().size());
        EXPECT_EQ(faults::patiently([&] { return sec__subacl_to_acltree(bytes, &root); }), 0);
        at += bytes.size();
        owners.emplace_back(*trees.insert(trees.begin(), root));
    }
    EXPECT_EQ(sec__acltrees_to_acl(trees, &recompiled.acl), 0);
    EXPECT_EQ(recompiled.bytes(), held.bytes());
    return 0;
}
