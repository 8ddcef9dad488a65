// What the fuzzers share: taking an input apart, and the conversions of the C library.
#ifndef QZ_TESTS_FUZZ_H
#define QZ_TESTS_FUZZ_H
#include <algorithm>
#include <cstring>
#include <gtest/gtest.h>
#include <iconv.h>
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
    if (from.empty())
        return 0;
    const auto at = std::min(letters.find(from[0]), letters.size() + static_cast<unsigned char>(from[0]));
    from.remove_prefix(1);
    return static_cast<unsigned>(at % letters.size());
}
inline std::string line(std::string_view &from) {
    const std::string taken(from.substr(0, from.find('\n')));
    from.remove_prefix(std::min(taken.size() + 1, from.size()));
    return taken;
}

// Bytes of one code set in another as the C library converts them, none when it cannot do so with all of them.
inline std::optional<std::string> recoded(const char *to, const char *from, std::string bytes) {
    const iconv_t converter = iconv_open(to, from);
    std::string made(8 * bytes.size() + 16, '\0');
    char *in = bytes.data();
    char *out = made.data();
    std::size_t left = bytes.size();
    std::size_t room = made.size();
    const bool is_whole = iconv(converter, &in, &left, &out, &room) == 0;
    const bool is_ended = iconv(converter, nullptr, nullptr, &out, &room) == 0;
    iconv_close(converter);
    if (!is_whole || !is_ended)
        return std::nullopt;
    return made.substr(0, made.size() - room);
}

} // namespace fuzz
#endif
