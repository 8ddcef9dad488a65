// The level setting against a plain second reading, and which names of components and texts pass as printable: a line
// with the setting, one with the component, and the category.
#include "fuzz.h"
#include "libqz_tr/levels.h"
#include "libqz_tr/text.h"
#include <sstream>

namespace {

using namespace fuzz;

// The parts of a text that begin with the head, without it.
std::vector<std::string> parts(const std::string &text, char end, const std::string &head) {
    std::istringstream stream(text);
    std::vector<std::string> all;
    for (std::string part; std::getline(stream, part, end);)
        if (part.starts_with(head)) all.push_back(part.substr(head.size()));
    return all;
}

int level_of(const std::string &setting, const std::string &component, const std::string &category) {
    int level = 0;
    for (const std::string &part : parts(setting, ';', component + ":"))
        for (const std::string &value : parts(part, ',', category + "=")) {
            const bool is_number = !value.empty() && value.find_first_not_of("0123456789") == std::string::npos;
            const std::string digits = value.substr(std::min(value.find_first_not_of('0'), value.size()));
            if (is_number && digits.size() < 4 && std::atoi(digits.c_str()) < 256) level = std::atoi(digits.c_str());
        }
    return level;
}

} // namespace

int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
    std::string_view from = input(data, size);
    const std::string setting = line(from), component = line(from), category(from);
    for (const std::string &text : {setting, component, category}) {
        const auto all = characters(text);
        const auto is_control = [](char32_t c) { return c < 0x20 || (c >= 0x7f && c < 0xa0); };
        EXPECT_EQ(qz::tr::is_printable(text), all.has_value() && std::ranges::none_of(*all, is_control));
    }
    EXPECT_EQ(qz::tr::configured_level(setting, "_SEL", "API"), level_of(setting, "_SEL", "API"));
    // Names of neither hold the signs behind them.
    if (component.find_first_of(":;") != std::string::npos || category.find_first_of("=,;") != std::string::npos)
        return 0;
    EXPECT_EQ(qz::tr::configured_level(setting, component, category), level_of(setting, component, category));
    return 0;
}
