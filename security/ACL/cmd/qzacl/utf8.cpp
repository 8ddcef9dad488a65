// Whether bytes are UTF-8.
#include "utf8.h"

namespace qzacl {

namespace {

// What may follow the first byte: how many bytes, and in which range the first of them lies.
struct sequence {
    std::size_t size;
    unsigned char lowest;
    unsigned char highest;
};

sequence sequence_of(unsigned char first) {
    if (first < 0x80)
        return {1, 0, 0};
    if (first >= 0xc2 && first <= 0xdf)
        return {2, 0x80, 0xbf};
    if (first >= 0xe0 && first <= 0xef) {
        const auto lowest = static_cast<unsigned char>(first == 0xe0 ? 0xa0 : 0x80);
        const auto highest = static_cast<unsigned char>(first == 0xed ? 0x9f : 0xbf);
        return {3, lowest, highest};
    }
    if (first >= 0xf0 && first <= 0xf4) {
        const auto lowest = static_cast<unsigned char>(first == 0xf0 ? 0x90 : 0x80);
        const auto highest = static_cast<unsigned char>(first == 0xf4 ? 0x8f : 0xbf);
        return {4, lowest, highest};
    }
    return {0, 0, 0};
}

// The bytes that are ASCII, and so valid, before the first that is not.
std::size_t ascii_size(std::string_view text) {
    std::size_t at = 0;
    while (at < text.size() && static_cast<unsigned char>(text[at]) < 0x80)
        ++at;
    return at;
}

} // namespace

std::size_t character_size(std::string_view text) {
    if (text.empty())
        return 0;
    const sequence wanted = sequence_of(static_cast<unsigned char>(text[0]));
    if (wanted.size > text.size())
        return 0;
    for (std::size_t at = 1; at < wanted.size; ++at) {
        const auto byte = static_cast<unsigned char>(text[at]);
        const unsigned char lowest = at == 1 ? wanted.lowest : 0x80;
        const unsigned char highest = at == 1 ? wanted.highest : 0xbf;
        if (byte < lowest || byte > highest)
            return 0;
    }
    return wanted.size;
}

bool is_utf8(std::string_view text) {
    for (text.remove_prefix(ascii_size(text)); !text.empty(); text.remove_prefix(ascii_size(text))) {
        const std::size_t size = character_size(text);
        if (size == 0)
            return false;
        text.remove_prefix(size);
    }
    return true;
}

std::string valid_utf8(std::string_view text) {
    std::string valid;
    while (!text.empty()) {
        const std::size_t size = character_size(text);
        valid += size == 0 ? std::string_view("\xef\xbf\xbd") : text.substr(0, size);
        text.remove_prefix(size == 0 ? 1 : size);
    }
    return valid;
}

} // namespace qzacl
