// Strict UTF-8: a trace line shown on a terminal must not carry control characters in, in whatever disguise.
#include "libqz_tr/text.h"

#include <cstddef>
#include <cstdint>

namespace qz::tr {

bool is_printable(std::string_view bytes) {
    while (!bytes.empty()) {
        const auto lead = static_cast<unsigned char>(bytes.front());
        bytes.remove_prefix(1);
        std::size_t followers = 0;
        std::uint32_t point = lead;
        std::uint32_t least = 0x20;
        if (lead >= 0xF0) {
            followers = 3;
            // A lead byte above 0xF7 leaves a bit too many and ends beyond the last code point.
            point = lead & 0x0FU;
            least = 0x10000;
        } else if (lead >= 0xE0) {
            followers = 2;
            point = lead & 0x0FU;
            least = 0x800;
        } else if (lead >= 0xC0) {
            followers = 1;
            point = lead & 0x1FU;
            least = 0xA0; // shorter forms exist below 0x80, and controls stand from there to 0x9F
        } else if (lead >= 0x7F) {
            return false;
        }
        if (bytes.size() < followers)
            return false;
        for (; followers > 0; --followers) {
            const auto follower = static_cast<unsigned char>(bytes.front());
            bytes.remove_prefix(1);
            if ((follower & 0xC0U) != 0x80)
                return false;
            point = point << 6 | (follower & 0x3FU);
        }
        if (point < least || point > 0x10FFFF || (point >= 0xD800 && point <= 0xDFFF))
            return false;
    }
    return true;
}

} // namespace qz::tr
