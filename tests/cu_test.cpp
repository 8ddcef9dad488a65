// The platform utility library: errors and their texts, catalogs, code sets, letter case, clock, addresses.
#include "libqz_cu/posix_fold.h"
#include "qz/cu.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <climits>
#include <cstdint>
#include <cstdlib>
#include <fstream>
#include <random>
#include <sstream>
#include <string>
#include <sys/wait.h>
#include <thread>
#include <unistd.h>
#include <vector>

#if defined(__has_feature)
#if __has_feature(address_sanitizer) || __has_feature(thread_sanitizer)
#define CU_TEST_SANITIZED
#endif
#elif defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
#define CU_TEST_SANITIZED
#endif

// Allocations of the calling thread fail while the flag is set. The sanitizers have their own allocator.
static thread_local bool no_memory = false;
#if defined(__GLIBC__) && !defined(CU_TEST_SANITIZED)
#define CU_TEST_NO_MEMORY
extern "C" void *__libc_malloc(size_t);
extern "C" void *__libc_realloc(void *, size_t);
extern "C" void *malloc(size_t size) noexcept { return no_memory ? nullptr : __libc_malloc(size); }
extern "C" void *realloc(void *block, size_t size) noexcept {
    return no_memory ? nullptr : __libc_realloc(block, size);
}
#endif

namespace {

using namespace std::literals;

std::string text_of(const cu_error_t *error) {
    char *text = nullptr;
    EXPECT_EQ(cu_get_errmsg_1(error, &text), CU_OK);
    std::string copy = text;
    cu_rel_errmsg_1(text);
    return copy;
}

cu_error_t *current() {
    cu_error_t *error = nullptr;
    EXPECT_EQ(cu_get_error_1(&error), CU_OK);
    return error;
}

std::string current_text() {
    cu_error_t *error = current();
    std::string text = text_of(error);
    cu_rel_error_1(error);
    return text;
}

template <class... Args>
std::string recorded(const char *text, Args... args) {
    EXPECT_EQ(cu_set_error_1(4, 0, nullptr, 1, 88, text, args...), CU_OK);
    return current_text();
}

TEST(Error, TextsAndArguments) {
    const char *none = nullptr;
    const std::pair<std::string, std::string> table[] = {
        {recorded(none), ""},
        {recorded("plain\n\ttext\n"), "plain\n\ttext\n"},
        {recorded("%1$s", "a"), "a"},
        {recorded("%1$s|", none), "(null)|"},
        {recorded("f %1$s p %2$d v 0x%3$x", "name", 2, -1), "f name p 2 v 0xffffffff"},
        {recorded("(0x%1$08x) %1$x", 0x80), "(0x00000080) 80"},
        {recorded("%2$c%1$c%3$c", 'b', 'a', 0), "ab"},
        {recorded("%1$u %1$d %2$d", INT_MIN, 0), "2147483648 -2147483648 0"},
        {recorded("%1$05d|%1$5d|%2$4s|%2$04s|%2$1s", -42, "xyz"), "-0042|  -42| xyz| xyz|xyz"},
        {recorded("%3$s %1$s", "one", 0, "three"), "three one"},
        {recorded("%1$s %1$s %1$d", "twice"), "twice twice %1$d"},
        {recorded("100%% %% %%1$s"), "100% % %1$s"},
        {recorded("% %d %s %0$s %1s %1$ %1$y %10$s %1$-3d %1$0012d %1$1000d %"),
         "% %d %s %0$s %1s %1$ %1$y %10$s %1$-3d %1$0012d %1$1000d %"},
        {recorded("%9$s%8$d", 1, 2, 3, 4, 5, 6, 7, 8, "%1$s%n"), "%1$s%n8"},
    };
    for (const auto &[made, wanted] : table)
        EXPECT_EQ(made, wanted);
}

TEST(Error, StatesAndHandles) {
    cu_set_error_1(42, 0, nullptr, 1, 97, "%1$s %2$d", "first", 1);
    cu_error_t *first = current();
    EXPECT_EQ(first->code, 42);
    EXPECT_EQ(first->message_id, 97);
    cu_set_no_error_1();
    cu_error_t *none = current();
    EXPECT_EQ(none->code, 0);
    EXPECT_EQ(none->message_id, 0);
    EXPECT_EQ(text_of(none), "");
    std::thread([&] {
        EXPECT_EQ(current_text(), "");
        EXPECT_EQ(cu_pset_error_1(first), CU_OK);
        EXPECT_EQ(current_text(), "first 1");
    }).join();
    EXPECT_EQ(current_text(), "");
    EXPECT_EQ(cu_pset_error_1(first), CU_OK);
    cu_rel_error_1(first);
    EXPECT_EQ(current_text(), "first 1");
    EXPECT_EQ(cu_pset_error_1(none), CU_OK);
    cu_rel_error_1(none);
    EXPECT_EQ(current_text(), "");

    char *text = nullptr;
    EXPECT_EQ(cu_get_error_1(nullptr), CU_BAD_PARAMETER);
    EXPECT_EQ(cu_get_errmsg_1(nullptr, &text), CU_BAD_PARAMETER);
    EXPECT_EQ(cu_pset_error_1(nullptr), CU_BAD_PARAMETER);
    cu_rel_error_1(nullptr);
    cu_rel_errmsg_1(nullptr);
}

// Around and far above what needs no allocation. The second thread ends with its allocated block in use.
TEST(Error, LongArguments) {
    const auto check = [] {
        for (const size_t length : {509u, 510u, 511u, 512u, 5000u, 3u, 1000000u}) {
            const std::string a(length, 'a');
            EXPECT_EQ(recorded("%2$s-%1$s", a.c_str(), "b"), "b-" + a);
            cu_error_t *error = current();
            cu_pset_error_1(error);
            EXPECT_EQ(text_of(error), current_text());
            cu_rel_error_1(error);
        }
    };
    check();
    std::thread(check).join();
}

TEST(Error, NoMemory) {
#ifndef CU_TEST_NO_MEMORY
    GTEST_SKIP() << "allocations cannot be made to fail";
#endif
    const std::string a(600, 'a');
    cu_error_t *error = current();
    cu_error_t *refused = error;
    char *text = const_cast<char *>("");
    errno = EDOM;
    no_memory = true;
    const int set = cu_set_error_1(6, 0, nullptr, 1, 89, "%1$s%2$s%3$d", a.c_str(), "b", 3);
    const int got = cu_get_error_1(&refused);
    const int made = cu_get_errmsg_1(error, &text);
    no_memory = false;
    EXPECT_EQ(errno, EDOM);
    EXPECT_EQ(set, CU_OK);
    EXPECT_EQ(got, CU_NO_MEMORY);
    EXPECT_EQ(made, CU_NO_MEMORY);
    EXPECT_EQ(refused, nullptr);
    EXPECT_EQ(text, nullptr);
    EXPECT_EQ(current_text(), a.substr(0, 511) + "3");
    cu_rel_error_1(error);
}

// In a process of its own, since a process opens a catalog once.
TEST(Catalog, TextsAreTakenOneByOne) {
    if (std::system("command -v gencat >/dev/null") != 0)
        GTEST_SKIP() << "no gencat";
    struct row {
        const char *in_catalog; // null: the catalog lacks the message
        const char *by_default;
        const char *wanted;
    };
    const row rows[] = {
        {"translated %1$s %2$d", "default %1$s %2$d", "translated S 7"},
        {"%2$d before %1$s", "default %1$s %2$d", "7 before S"},
        {nullptr, "default %1$s", "default S"},
        {"100%% %1$s", "default %1$s", "100% S"},
        {"no conversion", "default %1$s", "default S"},
        {"%1$s twice %1$s", "default %1$s", "default S"},
        {"%1$s %1$s %2$d", "default %1$s %2$d %2$d", "default S 7 7"},
        {"%1$d", "default %1$s", "default S"},
        {"%2$s", "default %1$s", "default S"},
        {"%2$x", "default %2$08x", "default 00000007"},
        {"%1$s %s", "default %1$s", "default S"},
        {"%1$s %n", "default %1$s", "default S"},
        {"%1$s 5%", "default %1$s", "default S"},
        {"%1$*2$s", "default %1$s", "default S"},
        {"plain", "", "plain"},
    };
    std::string folder = testing::TempDir() + "cu_test_" + std::string(6, 'X');
    ASSERT_NE(mkdtemp(folder.data()), nullptr);
    const std::string base = folder + "/cu_test";
    std::ofstream source(base + ".msg");
    source << "$set 1\n$quote \"\n";
    for (size_t i = 0; i < std::size(rows); ++i)
        if (rows[i].in_catalog != nullptr)
            source << i + 1 << " \"" << rows[i].in_catalog << "\"\n";
    source.close();
    ASSERT_EQ(std::system(("gencat " + base + ".cat " + base + ".msg").c_str()), 0);

    const pid_t child = fork();
    if (child == 0) {
        setenv("NLSPATH", (folder + "/%N").c_str(), 1);
        errno = EDOM;
        for (int i = 0; i < static_cast<int>(std::size(rows)); ++i) {
            cu_set_error_1(1, 0, "cu_test.cat", 1, i + 1, rows[i].by_default, "S", 7);
            EXPECT_EQ(current_text(), rows[i].wanted) << i + 1;
        }
        // No such catalog, more catalogs than are looked into, and a name that is too long.
        for (const std::string &name :
             {"1"s, "2"s, "3"s, "4"s, "5"s, "6"s, "7"s, "8"s, std::string(99, 'n')}) {
            cu_set_error_1(1, 0, name.c_str(), 1, 1, "default");
            EXPECT_EQ(current_text(), "default");
        }
        EXPECT_EQ(errno, EDOM);
        _exit(testing::Test::HasFailure() ? 1 : 0);
    }
    int status = 0;
    ASSERT_EQ(waitpid(child, &status, 0), child);
    EXPECT_EQ(status, 0);
    EXPECT_EQ(std::system(("rm -r " + folder).c_str()), 0);
}

constexpr uint32_t to_utf8 = 0, from_utf8 = CU_ICONV_FROM_UTF8, as_is = CU_ICONV_UTF8_UNMODIFIED,
                   bmp = CU_ICONV_BMP_ONLY;
const std::string refused = "(refused)";

// Handles are never closed; a place for them that outlives the test tells the leak checker so.
cu_iconv_t opened(const char *codeset, uint32_t flags) {
    static auto &handles = *new std::vector<cu_iconv_t>;
    cu_iconv_t handle = nullptr;
    // Systems differ in the code sets that they bring.
    const int code = cu_iconv_open_1(codeset, flags, &handle);
    EXPECT_EQ(code, handle != nullptr ? CU_OK : CU_ICONV_UNKNOWN_CODESET);
    handles.push_back(handle);
    return handle;
}

std::string converted(cu_iconv_t handle, std::string_view in) {
    char *out = nullptr;
    size_t length = in.size();
    size_t out_length = 99;
    errno = EDOM;
    const int code = cu_iconv_str_1(handle, 0, in.data(), &length, &out, &out_length);
    EXPECT_EQ(errno, EDOM);
    if (code == CU_ICONV_UNCONVERTIBLE && out == nullptr && out_length == 99)
        return refused;
    EXPECT_EQ(code, CU_OK);
    std::string copy(out, out_length);
    std::free(out);
    return copy;
}

TEST(Codeset, Conversions) {
    const std::string e_acute(3000, '\xe9'), ascii(3000, 'x');
    std::string e_acute_utf8;
    while (e_acute_utf8.size() < 6000)
        e_acute_utf8 += "\xc3\xa9";
    const struct {
        const char *codeset;
        uint32_t flags;
        std::string in, wanted;
    } table[] = {
        {"ANSI_X3.4-1968", to_utf8, "abc\0"s, "abc\0"s},
        {"ANSI_X3.4-1968", to_utf8, "abcdefg\x80", refused},
        {"ANSI_X3.4-1968", from_utf8, "\xc3\xa9", refused},
        {"UTF-8", to_utf8 | as_is, "\xff\xc0", "\xff\xc0"},
        {"UTF-8", from_utf8 | bmp, "\xef\xbf\xbf", "\xef\xbf\xbf"},
        {"UTF-8", from_utf8 | bmp, "a\xf0\x9f\x98\x80", refused},
        {"UTF-8", to_utf8 | as_is | bmp, "\xff\xf0\x9f\x98\x80", refused},
        {"ISO-8859-1", to_utf8, "\xe9\0"s, "\xc3\xa9\0"s},
        {"ISO-8859-1", from_utf8 | as_is, "\xc3\xa9", "\xe9"},
        {"ISO-8859-1", from_utf8, "\xe2\x82\xac", refused},
        {"ISO-8859-1", from_utf8, "\xc3", refused},
        {"ISO-8859-1", to_utf8, e_acute, e_acute_utf8},
        {"ISO-8859-1", from_utf8, e_acute_utf8 + ascii, e_acute + ascii},
        {"UTF-16LE", to_utf8, "a\0\x3d\xd8\0\xde"s, "a\xf0\x9f\x98\x80"},
        {"UTF-16LE", to_utf8 | bmp, "a\0\x3d\xd8\0\xde"s, refused},
        {"UTF-16LE", from_utf8 | bmp, "ab", "a\0b\0"s},
        {"UCS-4LE", to_utf8, "\0\0\x11\0"s, refused},
        // Shifts are undone at the end, and what looks like ASCII is not taken for it where it can shift.
        {"ISO-2022-JP", from_utf8, "a\xe6\x97\xa5", "a\x1b$BF|\x1b(B"},
        {"ISO-2022-JP", to_utf8, "a\x1b$BF|\x1b(B.", "a\xe6\x97\xa5."},
        {"ISO-2022-JP", to_utf8, "\x1b$BF", refused},
        {"UTF-7", to_utf8, "+AOk-", "\xc3\xa9"},
        {"EBCDIC-US", to_utf8, "\x81", "a"},
    };
    for (const auto &row : table) {
        cu_iconv_t handle = opened(row.codeset, row.flags);
        // The second time shows that a failure leaves nothing behind in the converter.
        for (int time = 1; handle != nullptr && time <= 2; ++time)
            EXPECT_EQ(converted(handle, row.in), row.wanted)
                << row.codeset << " " << row.flags << ", " << time;
    }

    // The first and last of each length; then what is no character, one after another.
    const std::string valid = "\0\x7f \xc2\x80\xdf\xbf \xe0\xa0\x80\xed\x9f\xbf \xee\x80\x80\xef\xbf\xbf "
                              "\xf0\x90\x80\x80\xf4\x8f\xbf\xbf"s;
    std::istringstream invalid(
        ascii + "\xff \x80 \xbf \xc0\x80 \xc1\xbf \xc3 \xc3\xc3 \xc3z \xe0\x9f\xbf \xed\xa0\x80 "
                "\xe2\x82 \xe2\x82z \xf0\x8f\xbf\xbf \xf4\x90\x80\x80 \xf5\x80\x80\x80 "
                "\xf8\x88\x80\x80\x80 \xfe");
    EXPECT_EQ(converted(opened("UTF-8", to_utf8), valid), valid);
    EXPECT_EQ(converted(opened("utf8", from_utf8), valid), valid);
    for (std::string in; invalid >> in;)
        EXPECT_EQ(converted(opened("UTF-8", to_utf8), in), refused) << testing::PrintToString(in);
}

TEST(Codeset, ThreadsShareAHandle) {
    cu_iconv_t handle = opened("ISO-8859-15", to_utf8);
    if (handle == nullptr)
        GTEST_SKIP() << "no such code set";
    std::vector<std::thread> threads;
    for (size_t t = 1; t <= 4; ++t)
        threads.emplace_back([=] {
            for (size_t i = 0; i < 300; ++i) {
                const std::string made = converted(handle, std::string(t * i % 100, '\xa4'));
                ASSERT_EQ(made.size(), t * i % 100 * 3);
                ASSERT_EQ(made.find_first_not_of("\xe2\x82\xac"), std::string::npos);
            }
        });
    for (std::thread &thread : threads)
        thread.join();
}

TEST(Codeset, Refusals) {
    const struct {
        const char *codeset;
        uint32_t flags;
        int code;
    } opens[] = {
        {nullptr, 0, CU_BAD_PARAMETER},           {"", 0, CU_BAD_PARAMETER},
        {"UTF-8", 2, CU_BAD_PARAMETER},           {"ISO-8859-1//TRANSLIT", 1, CU_BAD_PARAMETER},
        {"no-such", 0, CU_ICONV_UNKNOWN_CODESET}, {"no-such", 1, CU_ICONV_UNKNOWN_CODESET},
    };
    static char place;
    for (const auto &row : opens) {
        auto handle = reinterpret_cast<cu_iconv_t>(&place);
        EXPECT_EQ(cu_iconv_open_1(row.codeset, row.flags, &handle), row.code);
        EXPECT_EQ(handle, nullptr);
    }
    EXPECT_EQ(cu_iconv_open_1("UTF-8", 0, nullptr), CU_BAD_PARAMETER);

    cu_iconv_t handle = opened("ISO-8859-1", to_utf8);
    const size_t length = 1;
    char *out = nullptr;
    size_t out_length = 0;
    EXPECT_EQ(cu_iconv_str_1(nullptr, 0, "a", &length, &out, &out_length), CU_BAD_PARAMETER);
    EXPECT_EQ(cu_iconv_str_1(handle, 1, "a", &length, &out, &out_length), CU_BAD_PARAMETER);
    EXPECT_EQ(cu_iconv_str_1(handle, 0, nullptr, &length, &out, &out_length), CU_BAD_PARAMETER);
#ifdef CU_TEST_NO_MEMORY
    for (const char *in : {"a", "\xe9"}) {
        no_memory = true;
        const int code = cu_iconv_str_1(handle, 0, in, &length, &out, &out_length);
        no_memory = false;
        EXPECT_EQ(code, CU_ICONV_NO_MEMORY);
        EXPECT_EQ(out, nullptr);
    }
#endif
    EXPECT_EQ(cu_utf8_is_assumed_1() | cu_utf8_is_not_modified_1() | cu_utf8_is_limited_to_bmp_1(), 0);
}

int sign(int order) { return (order > 0) - (order < 0); }

// Every byte in every place of a word, its neighbours being what could carry into it.
TEST(Fold, WordsFoldLikeBytes) {
    for (unsigned byte = 0; byte < 256; ++byte) {
        const unsigned folded = byte >= 'A' && byte <= 'Z' ? byte + 32 : byte;
        EXPECT_EQ(qz::fold(static_cast<unsigned char>(byte)), folded);
        EXPECT_EQ(cu_tolower_posix_1(static_cast<int>(byte)), static_cast<int>(folded));
        for (unsigned place = 0; place < 64; place += 8)
            for (const uint64_t around : {0x0ull, ~0x0ull, 0x7f7f7f7f7f7f7f7full})
                EXPECT_EQ(qz::fold8((around & ~(0xffull << place)) | (uint64_t{byte} << place)),
                          (around & ~(0xffull << place)) | (uint64_t{folded} << place));
    }
    EXPECT_EQ(cu_tolower_posix_1(EOF), EOF);
    EXPECT_EQ(cu_tolower_posix_1('A' + 256), 'A' + 256);
}

TEST(Fold, ComparesLikeAModel) {
    std::mt19937 random(7);
    const std::string alphabet = "aAbBzZ@[`{\xe1\xc1\xff\x80";
    for (int round = 0; round < 20000; ++round) {
        std::string a(random() % 20, 'a');
        for (char &c : a)
            c = alphabet[random() % alphabet.size()];
        std::string b = a.substr(0, random() % 8 == 0 ? random() % (a.size() + 1) : a.size());
        for (char &c : b)
            c = random() % 12 == 0 ? alphabet[random() % alphabet.size()]
                                   : static_cast<char>((c >= 'A' && c <= 'Z') ? c + 32 : c);
        const auto model = [&](size_t n) {
            for (size_t i = 0; i < n; ++i) {
                int x = static_cast<unsigned char>(a.c_str()[i]),
                    y = static_cast<unsigned char>(b.c_str()[i]);
                x += x >= 'A' && x <= 'Z' ? 32 : 0;
                y += y >= 'A' && y <= 'Z' ? 32 : 0;
                if (x != y || x == 0)
                    return sign(x - y);
            }
            return 0;
        };
        const size_t n = random() % 24;
        EXPECT_EQ(sign(cu_strcasecmp_posix_1(a.c_str(), b.c_str())), model(SIZE_MAX));
        EXPECT_EQ(sign(cu_strncasecmp_posix_1(a.c_str(), b.c_str(), n)), model(n));
    }
    EXPECT_EQ(cu_strncasecmp_posix_1(nullptr, nullptr, 0), 0);
}

TEST(Clock, RunsForwardAndConverts) {
    uint64_t before = 0, after = 0;
    cu_timeinfo_t speed;
    ASSERT_EQ(cu_get_procspeed_1(&speed), CU_OK);
    cu_time_t start, end;
    ASSERT_EQ(cu_get_ctr_1(&before), CU_OK);
    usleep(20000);
    ASSERT_EQ(cu_get_ctr_1(&after), CU_OK);
    ASSERT_EQ(cu_cvt_time_1(before, &speed, &start), CU_OK);
    ASSERT_EQ(cu_cvt_time_1(after, &speed, &end), CU_OK);
    EXPECT_GE((end.seconds - start.seconds) * 1000000000 + end.nanoseconds - start.nanoseconds, 20000000);

    const struct {
        uint64_t counter;
        cu_timeinfo_t speed;
        int64_t seconds, nanoseconds;
    } table[] = {
        {0, {{1, 1}}, 0, 0},
        {1999999999, {{1, 1}}, 1, 999999999},
        {UINT64_MAX, {{1, 1}}, 18446744073, 709551615},
        {10, {{1, 3}}, 0, 3},
        {UINT64_MAX, {{1000000000, 1000000000}}, 18446744073, 709551615},
        {3000000001, {{1000000000, 3000000000}}, 1, 0},
    };
    for (const auto &row : table) {
        cu_time_t time;
        EXPECT_EQ(cu_cvt_time_1(row.counter, &row.speed, &time), CU_OK);
        EXPECT_EQ(time.seconds, row.seconds) << row.counter;
        EXPECT_EQ(time.nanoseconds, row.nanoseconds) << row.counter;
    }
    const cu_timeinfo_t unfilled = {};
    EXPECT_EQ(cu_cvt_time_1(1, &unfilled, &start), CU_BAD_PARAMETER);
    EXPECT_EQ(cu_get_ctr_1(nullptr), CU_BAD_PARAMETER);
}

TEST(Address, Texts) {
    const std::pair<std::string, const char *> table[] = {
        {std::string(16, '\0'), "::"},
        {std::string(15, '\0') + '\1', "::1"},
        {"\x20\x01\x0d\xb8\0\0\0\0\0\0\0\0\xAB\xCD\0\1"s, "2001:db8::abcd:1"},
        {"\0\1\0\0\0\0\0\2\0\0\0\0\0\0\0\3"s, "1:0:0:2::3"},
        {"\0\0\0\0\0\0\0\0\0\0\xff\xff\x7f\0\0\1"s, "::ffff:127.0.0.1"},
        {std::string(16, '\xff'), "ffff:ffff:ffff:ffff:ffff:ffff:ffff:ffff"},
    };
    for (const auto &[address, wanted] : table) {
        char out[46];
        EXPECT_EQ(cu_ipaddr_ntop_1(address.data(), out), CU_OK);
        EXPECT_STREQ(out, wanted);
    }
    EXPECT_EQ(cu_ipaddr_ntop_1(nullptr, nullptr), CU_BAD_PARAMETER);
}

} // namespace
