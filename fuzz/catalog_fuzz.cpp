// Checks catalog texts against the default text. An input is a line with the default text, then the offered text,
// of up to 300 bytes. A text is used only if it takes the same arguments, and no missing argument is ever read.
#include "fuzz.h"
#include "libqz_cu/message_text.h"
#include <map>
#include <regex>

namespace {

constexpr std::size_t longest = 300;
constexpr int most_arguments = 9;

// A text cut into conversions, doubled percent signs, and single bytes.
std::vector<std::smatch> pieces(const std::string &text) {
    static const std::regex piece("%([1-9])\\$(0?)([1-9]\\d{0,2})?([sduxc])|%%|[^]");
    return {std::sregex_iterator(text.begin(), text.end(), piece), std::sregex_iterator()};
}

// Of the argument of a conversion, from 0.
int place_of(const std::smatch &conversion) { return *conversion[1].first - '1'; }

// The conversions in order, with the percent signs that belong to nothing before them.
std::vector<std::string> sorted(const std::string &text) {
    std::vector<std::string> all;
    for (const std::smatch &each : pieces(text))
        if (each[1].matched || each.str() == "%")
            all.push_back(each.str());
    std::ranges::sort(all);
    return all;
}

// A conversion by the C library, which must not be asked to pad strings and characters with zeros.
std::string shown(const std::smatch &piece, const auto &argument) {
    const std::string kind = piece[4];
    const bool takes_zeros = kind != "s" && kind != "c";
    const std::string form = "%" + (takes_zeros ? piece[2].str() : "") + piece[3].str() + kind;
    char text[1100];
    const int length = std::snprintf(text, sizeof text, form.c_str(), argument);
    return {text, static_cast<std::size_t>(length)};
}

// Which arguments a text takes, and whether as strings: each by the first conversion that takes it.
std::map<int, bool> strings_in(const std::string &text) {
    std::map<int, bool> is_string;
    for (const std::smatch &each : pieces(text))
        if (each[1].matched)
            is_string.try_emplace(place_of(each), each[4] == "s");
    return is_string;
}

// The output for a conversion, a percent sign or a byte.
std::string expanded(const std::smatch &piece, const qz::cu::arguments &given,
                     std::map<int, bool> &is_string) {
    const int at = piece[1].matched ? place_of(piece) : most_arguments;
    const bool takes_string = piece[4] == "s";
    if (at >= given.count || takes_string != is_string[at])
        return piece.str() == "%%" ? "%" : piece.str();
    return takes_string ? shown(piece, given.values[at].text) : shown(piece, given.values[at].number);
}

} // namespace

int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
    std::string_view from = fuzz::input(data, size);
    const std::string by_default = fuzz::line(from).substr(0, longest).c_str();
    const std::string offered(std::string(from, 0, longest).c_str());
    std::map<int, bool> is_string = strings_in(by_default);
    qz::cu::arguments given = {};
    qz::cu::find_arguments(by_default.c_str(), given);
    EXPECT_EQ(given.count, is_string.empty() ? 0 : is_string.rbegin()->first + 1);
    for (int i = 0; i < most_arguments; ++i) {
        EXPECT_EQ(given.is_string(static_cast<unsigned>(i)), is_string[i]);
        // A missing argument holds a number, which would be a wild address.
        given.values[i].number = i % 2 == 0 ? -1234567 - i : 'a' + i;
        if (is_string[i])
            given.values[i].text = i % 2 == 0 ? "" : "text";
    }
    const std::vector<std::string> taken = sorted(offered);
    const bool is_sound = taken.size() <= 32 && (taken.empty() || taken[0] != "%");
    const bool is_usable = is_sound && taken == sorted(by_default);
    EXPECT_EQ(qz::cu::has_conversions_of(offered.c_str(), by_default.c_str()), is_usable);
    for (const std::string &text : {by_default, offered}) {
        std::string wanted;
        for (const std::smatch &each : pieces(text))
            wanted += expanded(each, given, is_string);
        std::vector<char> made(qz::cu::format_text(text.c_str(), given, nullptr, 0));
        EXPECT_EQ(qz::cu::format_text(text.c_str(), given, made.data(), made.size()), made.size());
        EXPECT_EQ(std::string(made.begin(), made.end()), wanted + '\0');
    }
    return 0;
}
