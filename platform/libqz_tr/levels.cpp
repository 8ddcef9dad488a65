// Parses the level setting. A malformed part must not affect the others.
#include "libqz_tr/levels.h"

#include <algorithm>
#include <charconv>

namespace qz::tr {
namespace {

// Removes the part before the first `end`, and `end` itself, from the front of `rest`.
std::string_view take_part(std::string_view &rest, char end) {
    const std::string_view part(rest.data(), std::min(rest.find(end), rest.size()));
    rest.remove_prefix(std::min(part.size() + 1, rest.size()));
    return part;
}

} // namespace

std::uint8_t configured_level(std::string_view text, std::string_view component, std::string_view category) {
    std::uint8_t level = 0;
    while (!text.empty()) {
        std::string_view settings = take_part(text, ';');
        if (take_part(settings, ':') != component)
            continue;
        while (!settings.empty()) {
            std::string_view value = take_part(settings, ',');
            if (take_part(value, '=') != category)
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
