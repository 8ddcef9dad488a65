// Reads the level setting; a part that makes no sense must not spoil the parts around it.
#include "libqz_tr/levels.h"

#include <algorithm>
#include <charconv>

namespace qz::tr {
namespace {

// Takes what stands before the first `end` off the front of `rest`, and `end` with it.
std::string_view take(std::string_view &rest, char end) {
    const std::string_view part(rest.data(), std::min(rest.find(end), rest.size()));
    rest.remove_prefix(std::min(part.size() + 1, rest.size()));
    return part;
}

} // namespace

std::uint8_t configured_level(std::string_view text, std::string_view component, std::string_view category) {
    std::uint8_t level = 0;
    while (!text.empty()) {
        std::string_view settings = take(text, ';');
        if (take(settings, ':') != component)
            continue;
        while (!settings.empty()) {
            std::string_view value = take(settings, ',');
            if (take(value, '=') != category)
                continue;
            std::uint8_t read = 0;
            const auto [end, error] = std::from_chars(value.data(), value.data() + value.size(), read);
            if (error == std::errc() && end == value.data() + value.size())
                level = read;
        }
    }
    return level;
}

} // namespace qz::tr
