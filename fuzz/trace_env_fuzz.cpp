// Compares the parser of the level setting with a regular expression, and checks which texts count as printable. An
// input is a line with the setting, then the text.
#include "fuzz.h"
#include "libqz_tr/levels.h"
#include "libqz_tr/text.h"
#include <regex>

int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
    static const std::regex levels("(?:^|;)_SEL:(?:[^;]*,)?API=0*(25[0-5]|2[0-4]\\d|1?\\d?\\d)(?=[,;]|$)");
    std::string_view from = fuzz::input(data, size);
    const std::string setting = fuzz::line(from).substr(0, 500); // expressions go deep in long ones
    const std::string text(from);
    int level = 0;
    std::sregex_iterator at(setting.begin(), setting.end(), levels);
    for (; at != std::sregex_iterator(); ++at)
        level = std::stoi(at->str(1)); // the last one holds
    EXPECT_EQ(qz::tr::configured_level(setting, "_SEL", "API"), level);

    const auto is_control = [](unsigned char byte, unsigned char next) {
        return byte < 0x20 || byte == 0x7f || (byte == 0xc2 && next < 0xa0);
    };
    const char *const end = text.c_str() + text.size() + 1; // after the NUL
    const bool has_controls = std::adjacent_find(text.c_str(), end, is_control) != end;
    const bool is_utf8 = fuzz::recoded("UTF-32LE", "UTF-8", text).has_value();
    EXPECT_EQ(qz::tr::is_printable(text), is_utf8 && !has_controls);
    return 0;
}
