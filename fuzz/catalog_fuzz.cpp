// Texts of catalogs against the text that they stand for: a line with the default text, and then the offered one. Only
// what takes the same arguments is used, and whatever the text, no argument is read that was not given.
#include "fuzz.h"
#include "libqz_cu/message_text.h"
#include <regex>

namespace {

using namespace fuzz;

const std::regex conversion("%(?:%|([1-9])\\$(0?)([1-9]\\d{0,2})?([sduxc]))");

std::vector<std::smatch> conversions(const std::string &text) {
    return {std::sregex_iterator(text.begin(), text.end(), conversion), std::sregex_iterator()};
}

// The conversions in order; none where something else begins with a percent sign, or there are too many.
std::optional<std::vector<std::string>> taken(const std::string &text) {
    std::vector<std::string> all;
    for (const std::smatch &each : conversions(text))
        if (each[1].matched) all.push_back(each.str());
    std::ranges::sort(all);
    const bool is_well_formed = std::regex_replace(text, conversion, "").find('%') == std::string::npos;
    return is_well_formed && all.size() <= 32 ? std::optional(all) : std::nullopt;
}

// A conversion carried out with its argument by the C library, which may not be asked to fill strings with zeros.
std::string shown(const std::smatch &of, const auto &argument) {
    const std::string form = "%" + (of[4] == "s" || of[4] == "c" ? "" : of[2].str()) + of[3].str() + of[4].str();
    char text[1100];
    return {text, static_cast<std::size_t>(std::snprintf(text, sizeof text, form.c_str(), argument))};
}

} // namespace

int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
    std::string_view from = input(data, size);
    const std::string by_default = line(from).c_str(), offered = std::string(from).c_str();
    std::string kinds(9, ' '); // what the default text takes, by the first that takes it
    for (const std::smatch &each : conversions(by_default))
        if (char *const kind = each[1].matched ? &kinds[static_cast<unsigned>(each.str()[1] - '1')] : nullptr)
            if (*kind == ' ') *kind = each[4] == "s" ? 's' : 'd';
    // What is not given holds a number, so that it would be a wild address.
    qz::cu::arguments given = {};
    qz::cu::find_arguments(by_default.c_str(), given);
    const auto count = kinds.find_last_not_of(' ') + 1;
    EXPECT_EQ(given.count, count);
    for (unsigned i = 0; i < 9; ++i) {
        EXPECT_EQ(given.is_string(i), kinds[i] == 's');
        given.values[i].number = i % 2 == 0 ? -1234567 - static_cast<int>(i) : static_cast<int>('a' + i);
        if (given.is_string(i)) given.values[i].text = i % 2 == 0 ? "" : "text";
    }
    EXPECT_EQ(qz::cu::has_conversions_of(offered.c_str(), by_default.c_str()),
              taken(offered) && taken(offered) == taken(by_default));
    for (const std::string &text : {by_default, offered}) {
        std::string wanted;
        auto rest = text.begin();
        for (const std::smatch &each : conversions(text)) {
            const unsigned at = each[1].matched ? static_cast<unsigned>(each.str()[1] - '1') : 9;
            wanted.append(rest, each[0].first);
            rest = each[0].second;
            if (at == 9 || at >= count || (each[4] == "s") != given.is_string(at))
                wanted += at == 9 ? "%" : each.str();
            else
                wanted += each[4] == "s" ? shown(each, given.values[at].text) : shown(each, given.values[at].number);
        }
        wanted.append(rest, text.end());
        std::vector<char> made(qz::cu::format_text(text.c_str(), given, nullptr));
        EXPECT_EQ(qz::cu::format_text(text.c_str(), given, made.data()), made.size());
        EXPECT_EQ(std::string(made.begin(), made.end()), wanted + '\0');
    }
    return 0;
}
