// Conversion of any bytes: what comes out of one to UTF-8 is UTF-8 by a plain reading, of the characters allowed; it
// goes back to the same bytes; and what is refused was no text. An input is the code set, whether only characters of
// 16 bits are allowed (b) and the bytes.
#include "fuzz.h"
#include "qz/cu.h"

namespace {

using namespace fuzz;

// A code set and the first character that is not in it, as far as a plain reading can tell: 0 when it cannot.
constexpr std::pair<const char *, char32_t> codesets[] = {
    {"UTF-8", 0x110000}, {"ANSI_X3.4-1968", 0x80}, {"ISO-8859-1", 0x100}, {"EUC-JP", 0}};

using text = std::optional<std::string>;

text converted(unsigned codeset, bool bmp_only, bool from_utf8, const std::string &in) {
    static cu_iconv_t handles[4][4];
    cu_iconv_t &handle = handles[codeset][bmp_only * 2 + from_utf8];
    const std::uint32_t flags = (from_utf8 ? CU_ICONV_FROM_UTF8 : 0) | (bmp_only ? CU_ICONV_BMP_ONLY : 0);
    if (handle == nullptr && cu_iconv_open_1(codesets[codeset].first, flags, &handle) != CU_OK) std::abort();
    const std::vector<char> bytes(in.begin(), in.end());
    std::size_t length = in.size();
    char *out = nullptr;
    const int code = cu_iconv_str_1(handle, 0, in.empty() ? "" : bytes.data(), &length, &out, &length);
    EXPECT_TRUE(code == CU_OK || (code == CU_ICONV_UNCONVERTIBLE && out == nullptr)) << code;
    text made;
    if (code == CU_OK) made.emplace(out, length);
    std::free(out);
    return made;
}

} // namespace

int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
    std::string_view from = input(data, size);
    const unsigned codeset = one_of("ualj", from);
    const bool bmp_only = one_of("-b", from) == 1;
    const std::string bytes(from);
    const char32_t end = std::min<char32_t>(codesets[codeset].second, bmp_only ? 0x10000 : 0x110000);
    const auto fits = [&](auto all) { return all && std::ranges::all_of(*all, [&](char32_t c) { return c < end; }); };

    const text utf8 = converted(codeset, bmp_only, false, bytes);
    if (utf8) {
        EXPECT_TRUE(characters(*utf8) && (end == 0 || fits(characters(*utf8))));
        EXPECT_EQ(converted(codeset, bmp_only, true, *utf8), bytes);
    }
    const bool is_ascii = std::ranges::all_of(bytes, [](char c) { return (c & 0x80) == 0; });
    if (codeset < 3) { EXPECT_EQ(utf8.has_value(), codeset == 0 ? fits(characters(bytes)) : codeset == 2 || is_ascii); }
    const text back = converted(codeset, bmp_only, true, bytes);
    EXPECT_TRUE(!back || characters(bytes));
    // The system's EUC-JP gives a yen sign as the backslash that stands in its place there.
    if (end != 0) {
        EXPECT_EQ(back.has_value(), fits(characters(bytes)));
        if (back) { EXPECT_EQ(converted(codeset, bmp_only, false, *back), bytes); }
    }
    return 0;
}
