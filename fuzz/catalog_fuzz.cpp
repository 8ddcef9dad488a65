// Checks catalog texts against the default text. An input is a line with the default text, then the offered text,
// of up to 300 bytes. A text is used only if it takes the same arguments, and no missing argument is ever read.
#include "fuzz.h"
#include "libqz_cu/message_text.h"
#include <map>
#include <regex>

namespace {

constexpr std::size_t longest = 300;
constexpr int most_arguments = 9;

// A part of a text: a conversion, a doubled percent sign or a single byte.
struct piece {
    std::string bytes;
    int place = most_arguments; // of the argument of a conversion, from 0
    bool is_string = false;
    std::string form = {}; // of the conversion, for the C library
};

std::vector<piece> pieces_of(const std::string &text) {
    static const std::regex any("%([1-9])\\$(0?)([1-9]\\d{0,2})?([sduxc])|%%|[^]");
    std::vector<piece> all;
    for (std::sregex_iterator at(text.begin(), text.end(), any); at != std::sregex_iterator(); ++at) {
        piece &made = all.emplace_back(piece{at->str()});
        if (made.bytes.size() < 3)
            continue;
        const std::string kind = at->str(4);
        // The C library must not be asked to pad strings and characters with zeros.
        const std::string zeros = kind == "s" || kind == "c" ? "" : at->str(2);
        made.place = made.bytes[1] - '1';
        made.is_string = kind == "s";
        made.form = "%" + zeros + at->str(3) + kind;
    }
    return all;
}

// The conversions in order, with the percent signs that belong to nothing before them.
std::vector<std::string> sorted(const std::string &text) {
    std::vector<std::string> all;
    for (const piece &each : pieces_of(text))
        if (each.place < most_arguments || each.bytes == "%")
            all.push_back(each.bytes);
    std::ranges::sort(all);
    return all;
}

// Which arguments a text takes, and whether as strings: each by the first conversion that takes it.
std::map<int, bool> strings_in(const std::string &text) {
    std::map<int, bool> is_string;
    for (const piece &each : pieces_of(text))
        if (each.place < most_arguments)
            is_string.try_emplace(each.place, each.is_string);
    return is_string;
}

std::string shown(const piece &conversion, auto argument) {
    char text[1100];
    const int length = std::snprintf(text, sizeof text, conversion.form.c_str(), argument);
    return {text, static_cast<std::size_t>(length)};
}

// The output for a piece. Conversions of a missing argument, or one of the other kind, stay.
std::string expanded(const piece &part, const qz::cu::arguments &given) {
    const auto at = static_cast<unsigned>(part.place);
    if (at >= given.count || part.is_string != given.is_string(at))
        return part.bytes == "%%" ? "%" : part.bytes;
    const auto &value = given.values[at];
    return part.is_string ? shown(part, value.text) : shown(part, value.number);
}

} // namespace

int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
    std::string_view from = fuzz::input(data, size);
    const std::string by_default = fuzz::line(from).substr(0, longest).c_str();
    const std::string offered = std::string(from, 0, longest).c_str();
    std::map<int, bool> is_string = strings_in(by_default);
    qz::cu::arguments given = {};
    qz::cu::find_arguments(by_default.c_str(), given);
    EXPECT_EQ(given.count, is_string.empty() ? 0 : is_string.rbegin()->first + 1);
    for (int at = 0; at < most_arguments; ++at) {
        EXPECT_EQ(given.is_string(static_cast<unsigned>(at)), is_string[at]);
        // A missing argument holds a number, which would be a wild address.
        given.values[at].number = at % 2 == 0 ? -1234567 - at : 'a' + at;
        if (is_string[at])
            given.values[at].text = at % 2 == 0 ? "" : "text";
    }
    const std::vector<std::string> taken = sorted(offered);
    const bool is_sound = taken.size() <= 32 && (taken.empty() || taken[0] != "%");
    const bool is_usable = is_sound && taken == sorted(by_default);
    EXPECT_EQ(qz::cu::has_conversions_of(offered.c_str(), by_default.c_str()), is_usable);
    for (const std::string &text : {by_default, offered}) {
        std::string wanted;
        for (const piece &each : pieces_of(text))
            wanted += expanded(each, given);
        std::vector<char> made(qz::cu::format_text(text.c_str(), given, nullptr, 0));
        EXPECT_EQ(qz::cu::format_text(text.c_str(), given, made.data(), made.size()), made.size());
        EXPECT_EQ(std::string(made.begin(), made.end()), wanted + '\0');
    }
    return 0;
}
