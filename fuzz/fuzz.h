// What the fuzzers share: taking an input apart, and a plain second reading of UTF-8.
#ifndef QZ_FUZZ_FUZZ_H
#define QZ_FUZZ_FUZZ_H
#include <algorithm>
#include <cstring>
#include <gtest/gtest.h>
#include <optional>

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size);

namespace fuzz {

// A failed expectation ends the run as a crash does, so that its input is kept.
inline std::string_view input(const std::uint8_t *data, std::size_t size) {
    GTEST_FLAG_SET(throw_on_failure, true);
    return {reinterpret_cast<const char *>(data), size};
}
// A choice: the place of the next byte among the letters, so that inputs can be written by hand.
inline unsigned one_of(std::string_view letters, std::string_view &from) {
    if (from.empty()) return 0;
    const auto at = std::min(letters.find(from[0]), letters.size() + static_cast<unsigned char>(from[0]));
    from.remove_prefix(1);
    return static_cast<unsigned>(at % letters.size());
}
inline std::string line(std::string_view &from) {
    const std::string taken(from.substr(0, from.find('\n')));
    from.remove_prefix(std::min(taken.size() + 1, from.size()));
    return taken;
}

// The characters of UTF-8, none for other bytes: what is read loosely must come out the same when it is written.
inline std::optional<std::u32string> characters(std::string_view bytes) {
    std::u32string all;
    for (unsigned more = 0; !bytes.empty(); bytes.remove_prefix(more + 1)) {
        const auto lead = static_cast<unsigned char>(bytes[0]);
        more = lead < 0xc0 ? 0 : lead < 0xe0 ? 1 : lead < 0xf0 ? 2 : 3;
        char32_t point = more == 0 ? lead : lead & (0x3fu >> more);
        for (const char c : bytes.substr(1, more)) point = point << 6 | (c & 0x3f);
        std::string again(1, static_cast<char>(more == 0 ? point : 0xff00u >> (more + 1) | point >> 6 * more));
        for (unsigned i = more; i-- != 0;) again += static_cast<char>(0x80 | (point >> 6 * i & 0x3f));
        const bool is_shortest = more == 0 ? point < 0x80 : point >= (more == 1 ? 0x80u : 1u << (5 * more + 1));
        if (!bytes.starts_with(again) || !is_shortest || point > 0x10ffff || point >> 11 == 0x1b) return {};
        all += point;
    }
    return all;
}

} // namespace fuzz
#endif
