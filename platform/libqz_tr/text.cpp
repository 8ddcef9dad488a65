// A trace line shown on a terminal must not smuggle in control characters.
#include "libqz_tr/text.h"

#include "base/utf8.h"

namespace qz::tr {
namespace {

constexpr bool is_control(std::uint32_t point) { return point < 0x20 || (point >= 0x7f && point < 0xa0); }

} // namespace

bool is_printable(std::string_view bytes) {
    while (!bytes.empty()) {
        std::uint32_t point = 0;
        if (!take_utf8(bytes, point) || is_control(point))
            return false;
    }
    return true;
}

} // namespace qz::tr
