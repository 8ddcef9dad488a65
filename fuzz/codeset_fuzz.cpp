// Compares conversions to and from UTF-8 with the C library's by way of UTF-32, which it validates strictly. An
// input is the code set, the flags and the bytes.
#include "fuzz.h"
#include "qz/cu.h"

int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
    static const char *const codesets[] = {"UTF-8",    "utf8",    "ANSI_X3.4-1968", "ISO-8859-1", "EUC-JP",
                                           "UTF-16LE", "UCS-4LE", "ISO-2022-JP",    "UTF-7"};
    static cu_iconv_t handles[std::size(codesets)][8];
    std::string_view from = fuzz::input(data, size);
    const unsigned codeset = fuzz::one_of("uUalj24s7", from);
    const unsigned flags = fuzz::one_of("01234567", from);
    const bool from_utf8 = (flags & 1) != 0;
    const bool as_is = (flags & 2) != 0;
    const bool bmp_only = (flags & 4) != 0;

    const char *const source = from_utf8 ? "UTF-8" : codesets[codeset];
    const char *const target = from_utf8 ? codesets[codeset] : "UTF-8";
    const std::string bytes(from);
    std::optional<std::string> wanted = fuzz::recoded("UTF-32LE", source, bytes);
    if (wanted)
        wanted = fuzz::recoded(target, "UTF-32LE", *wanted);
    if (codeset < 2 && as_is)
        wanted = bytes;
    // Such bytes begin the characters beyond 16 bits.
    const auto is_far = [](char c) { return static_cast<unsigned char>(c) >= 0xf0; };
    if (wanted && bmp_only && std::ranges::any_of(from_utf8 ? bytes : *wanted, is_far))
        wanted.reset();

    cu_iconv_t &handle = handles[codeset][flags];
    std::uint32_t options = from_utf8 ? CU_ICONV_FROM_UTF8 : 0;
    options |= as_is ? CU_ICONV_UTF8_UNMODIFIED : 0;
    options |= bmp_only ? CU_ICONV_BMP_ONLY : 0;
    EXPECT_TRUE(handle != nullptr || cu_iconv_open_1(codesets[codeset], options, &handle) == CU_OK);
    std::size_t length = bytes.size();
    char *out = nullptr;
    errno = EDOM;
    const int code = cu_iconv_str_1(handle, 0, from.empty() ? "" : from.data(), &length, &out, &length);
    const std::unique_ptr<char, void (*)(void *)> owner(out, std::free);
    EXPECT_EQ(errno, EDOM);
    EXPECT_EQ(code, wanted ? CU_OK : CU_ICONV_UNCONVERTIBLE);
    EXPECT_EQ(out != nullptr, wanted.has_value());
    EXPECT_TRUE(!wanted || std::string(out, length) == *wanted);
    return 0;
}
