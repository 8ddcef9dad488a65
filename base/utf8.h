// Strict UTF-8: no overlong forms, no surrogates, nothing above U+10FFFF.
#ifndef QZ_UTF8_H
#define QZ_UTF8_H

#include <cstddef>
#include <cstdint>
#include <string_view>

namespace qz {

// Removes the first character from a non-empty string and hands out its code point. False when the string does not
// start with a valid one.
constexpr bool take_utf8(std::string_view &bytes, std::uint32_t &point) {
    const auto lead = static_cast<unsigned char>(bytes.front());
    std::size_t followers = 0;
    std::uint32_t least = 0;
    point = lead;
    if (lead >= 0xf0) {
        followers = 3;
        // A lead byte above 0xf7 leaves one bit too many, so the result exceeds the last code point.
        point = lead & 0x0fU;
        least = 0x10000;
    } else if (lead >= 0xe0) {
        followers = 2;
        point = lead & 0x0fU;
        least = 0x800;
    } else if (lead >= 0xc0) {
        followers = 1;
        point = lead & 0x1fU;
        least = 0x80;
    } else if (lead >= 0x80) {
        return false;
    }
    if (followers >= bytes.size())
        return false;
    for (std::size_t index = 1; index <= followers; ++index) {
        const auto follower = static_cast<unsigned char>(bytes[index]);
        if ((follower & 0xc0U) != 0x80)
            return false;
        point = point << 6 | (follower & 0x3fU);
    }
    bytes.remove_prefix(followers + 1);
    return point >= least && point <= 0x10ffff && (point < 0xd800 || point > 0xdfff);
}

} // namespace qz

#endif
