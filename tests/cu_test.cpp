// The platform utility library: errors and their texts, catalogs, code sets, letter case, clock, addresses.
#include "faults.h"
#include "libqz_cu/posix_fold.h"
#include "qz/cu.h"

#include <gmock/gmock.h>
#include <map>
#include <random>
#include <strings.h>
#include <thread>

namespace {

using namespace std::literals;
using error_handle = std::unique_ptr<cu_error_t, void (*)(cu_error_t *)>;

std::string times(size_t count, std::string_view text) {
    std::string all;
    while (count-- != 0) all += text;
    return all;
}

error_handle current() {
    cu_error_t *error = nullptr;
    EXPECT_EQ(cu_get_error_1(&error), CU_OK);
    return {error, cu_rel_error_1};
}

std::string text_of(const error_handle &error) {
    char *text = nullptr;
    EXPECT_EQ(cu_get_errmsg_1(error.get(), &text), CU_OK);
    std::string copy = text;
    cu_rel_errmsg_1(text);
    return copy;
}

template <class... Args>
std::string recorded(const char *text, Args... args) {
    EXPECT_EQ(cu_set_error_1(4, 0, nullptr, 1, 88, text, args...), CU_OK);
    return text_of(current());
}

TEST(Error, TextsAndArguments) {
    const char *none = nullptr, *plain = "% %d %s %0$s %1s %1$ %1$y %10$s %1$-3d %1$0012d %1$1000d %";
    EXPECT_EQ(recorded(plain), plain);
    EXPECT_EQ(recorded(none), "");
    EXPECT_EQ(recorded("%1$s %2$d %2$u %3$x", none, INT_MIN, -1), "(null) -2147483648 2147483648 ffffffff");
    EXPECT_EQ(recorded("%2$c%1$c%3$c%3$d", 'b', 'a', 0), "ab0");
    EXPECT_EQ(recorded("%3$s %1$s %1$s %1$d", "one", 0, "three"), "three one one %1$d");
    EXPECT_EQ(recorded("%9$s%8$d%% %%1$s", 1, 2, 3, 4, 5, 6, 7, 8, "%1$s%%"), "%1$s%%8% %1$s");
}

TEST(Error, StatesAndHandles) {
    cu_set_error_1(42, 0, nullptr, 1, 97, "%1$s %2$d", "first", 1);
    error_handle first = current();
    cu_set_no_error_1();
    const error_handle none = current();
    EXPECT_EQ(std::tuple(first->code, first->message_id), std::tuple(42, 97));
    EXPECT_EQ(std::tuple(none->code, none->message_id), std::tuple(0, 0));
    std::thread([&] {
        EXPECT_EQ(text_of(current()), "");
        cu_pset_error_1(first.get());
        EXPECT_EQ(text_of(current()), "first 1");
    }).join();
    EXPECT_EQ(text_of(current()), "");
    cu_pset_error_1(first.get());
    first.reset();
    EXPECT_EQ(text_of(current()), "first 1");
    cu_pset_error_1(none.get());
    EXPECT_EQ(text_of(current()), "");
}

// Around and far above what needs no allocation. The thread ends with its allocated block in use.
TEST(Error, LongArguments) {
    std::thread([] {
        for (const size_t length : {509u, 510u, 511u, 512u, 5000u, 3u, 1000000u}) {
            const std::string a(length, 'a');
            EXPECT_EQ(recorded("%2$s-%1$s", a.c_str(), "b"), "b-" + a);
            const error_handle error = current();
            cu_pset_error_1(error.get());
            EXPECT_EQ(text_of(error), text_of(current()));
        }
    }).join();
}

// How catalogs are opened and shown is tested with the command.
TEST(Catalog, FilesThatAreNotThereAreDoneWithout) {
    // No such catalogs, a name that is too long for the last place, and more than are looked into.
    static const std::string names[] = {"1", "2", "3", "4", "5", "6", "7", std::string(99, 'n'), "8", "9"};
    errno = EDOM;
    for (const std::string &name : names) {
        cu_set_error_1(1, 0, name.c_str(), 1, 1, "default");
        EXPECT_EQ(text_of(current()), "default");
    }
    EXPECT_EQ(errno, EDOM);
}

constexpr uint32_t to_utf8 = 0, from_utf8 = CU_ICONV_FROM_UTF8, as_is = CU_ICONV_UTF8_UNMODIFIED;
const std::string refused = "(refused)";

// Null for a code set that the system lacks. Handles are never closed; a place for them that outlives the
// test tells the leak checker so.
cu_iconv_t opened(const char *codeset, uint32_t flags) {
    static auto &handles = *new std::map<std::pair<std::string, uint32_t>, cu_iconv_t>;
    cu_iconv_t &handle = handles[{codeset, flags}];
    const int code = handle != nullptr ? CU_OK : cu_iconv_open_1(codeset, flags, &handle);
    EXPECT_EQ(code, handle != nullptr ? CU_OK : CU_ICONV_UNKNOWN_CODESET);
    return handle;
}

std::string converted(cu_iconv_t handle, std::string_view in) {
    char *out = nullptr;
    size_t length = in.size(), made = 99;
    errno = EDOM;
    const int code = cu_iconv_str_1(handle, 0, in.data(), &length, &out, &made);
    EXPECT_EQ(errno, EDOM);
    if (code == CU_ICONV_UNCONVERTIBLE && out == nullptr && made == 99) return refused;
    EXPECT_EQ(code, CU_OK);
    const std::unique_ptr<char, void (*)(void *)> owner(out, std::free);
    return {out, made};
}

TEST(Codeset, Conversions) {
    const std::string e_acute = times(3000, "\xe9"), e_acute_utf8 = times(3000, "\xc3\xa9");
    const std::tuple<const char *, uint32_t, std::string, std::string> table[] = {
        {"utf8", to_utf8 | as_is, "\xff\xc0", "\xff\xc0"},
        {"UTF-8", to_utf8 | as_is | CU_ICONV_BMP_ONLY, "\xff\xf0\x9f\x98\x80", refused},
        {"ISO-8859-1", to_utf8, e_acute + '\0', e_acute_utf8 + '\0'},
        {"ISO-8859-1", from_utf8 | as_is, e_acute_utf8, e_acute},
        {"ISO-8859-1", from_utf8, "\xe2\x82\xac", refused},
        {"UTF-16LE", to_utf8, "a\0\x3d\xd8\0\xde"s, "a\xf0\x9f\x98\x80"},
        {"UTF-16LE", to_utf8 | CU_ICONV_BMP_ONLY, "a\0\x3d\xd8\0\xde"s, refused},
        {"UTF-16LE", from_utf8 | CU_ICONV_BMP_ONLY, "ab", "a\0b\0"s},
        {"UCS-4LE", to_utf8, "\0\0\x11\0"s, refused},
        // Shifts are undone at the end and after a failure; what can shift is not taken for ASCII.
        {"ISO-2022-JP", from_utf8, "a\xe6\x97\xa5", "a\x1b$BF|\x1b(B"},
        {"ISO-2022-JP", to_utf8, "\x1b$BF", refused},
        {"ISO-2022-JP", to_utf8, "a\x1b$BF|\x1b(B.", "a\xe6\x97\xa5."},
        {"UTF-7", to_utf8, "+AOk-", "\xc3\xa9"},
    };
    for (const auto &[codeset, flags, in, wanted] : table) {
        cu_iconv_t handle = opened(codeset, flags);
        EXPECT_EQ(handle == nullptr ? wanted : converted(handle, in), wanted) << codeset << " " << flags;
    }
}

TEST(Codeset, ThreadsShareAHandle) {
    cu_iconv_t handle = opened("ISO-8859-1", to_utf8);
    std::vector<std::thread> threads;
    for (size_t step = 1; step <= 4; ++step)
        threads.emplace_back([=] {
            for (size_t i = 0; i < 1000; i += step)
                ASSERT_EQ(converted(handle, times(i % 99, "\xe9")), times(i % 99, "\xc3\xa9"));
        });
    for (std::thread &thread : threads) thread.join();
}

TEST(Parameters, AreChecked) {
    cu_iconv_t held = opened("ISO-8859-1", to_utf8), handle = held;
    EXPECT_EQ(cu_iconv_open_1("no-such", from_utf8, &handle), CU_ICONV_UNKNOWN_CODESET);
    EXPECT_EQ(handle, nullptr);
    const cu_timeinfo_t unfilled = {}, speed = {{1, 1}};
    cu_time_t time;
    char text[46] = "", *out = nullptr;
    size_t n = 1;
    const auto bad = [](auto... c) { EXPECT_THAT((std::vector{c...}), testing::Each(CU_BAD_PARAMETER)); };
    bad(cu_get_error_1(nullptr), cu_pset_error_1(nullptr), cu_get_errmsg_1(nullptr, &out),
        cu_get_errmsg_1(current().get(), nullptr), cu_get_ctr_1(nullptr), cu_get_procspeed_1(nullptr),
        cu_cvt_time_1(1, &unfilled, &time), cu_cvt_time_1(1, nullptr, &time), cu_cvt_time_1(1, &speed, nullptr),
        cu_ipaddr_ntop_1(nullptr, text), cu_ipaddr_ntop_1(text, nullptr), cu_iconv_open_1("UTF-8", 0, nullptr),
        cu_iconv_open_1(nullptr, 0, &handle), cu_iconv_open_1("", 0, &handle), cu_iconv_open_1("UTF-8", 2, &handle),
        cu_iconv_open_1("ISO-8859-1//TRANSLIT", 1, &handle), cu_iconv_str_1(nullptr, 0, "a", &n, &out, &n),
        cu_iconv_str_1(held, 1, "a", &n, &out, &n), cu_iconv_str_1(held, 0, nullptr, &n, &out, &n),
        cu_iconv_str_1(held, 0, "a", nullptr, &out, &n), cu_iconv_str_1(held, 0, "a", &n, nullptr, &n),
        cu_iconv_str_1(held, 0, "a", &n, &out, nullptr));
}

TEST(Fold, BytesWordsAndStringsAgreeWithTheCLibraryInItsOwnLocale) {
    // Every byte in every place of a word, its neighbours being what could carry into it.
    for (int byte = 0; byte < 256; ++byte) {
        const int folded = std::tolower(byte);
        EXPECT_EQ(cu_tolower_posix_1(byte), folded);
        EXPECT_EQ(qz::fold(static_cast<unsigned char>(byte)), folded);
        for (unsigned place = 0; place < 64; place += 8)
            for (const uint64_t around : {0x0ull, ~0x0ull, 0x7f7f7f7f7f7f7f7full}) {
                const uint64_t word = (around & ~(0xffull << place)) | static_cast<uint64_t>(byte) << place;
                EXPECT_EQ(qz::fold8(word), word ^ static_cast<uint64_t>(byte ^ folded) << place);
            }
    }
    EXPECT_EQ(cu_tolower_posix_1(EOF), EOF);
    std::mt19937 random(7);
    const auto text = [&] {
        std::string made(random() % 20, 'a');
        for (char &c : made) c = random() % 20 == 0 ? "bBzZ@[`{\xe1\xc1\xff\x80"[random() % 12] : "aA"[random() % 2];
        return made;
    };
    const auto sign = [](int order) { return (order > 0) - (order < 0); };
    for (int round = 0; round < 20000; ++round) {
        const std::string a = text(), b = text();
        const size_t n = random() % 24, both = std::min(a.size(), b.size());
        const int order = sign(strncasecmp(a.c_str(), b.c_str(), n));
        EXPECT_EQ(sign(cu_strcasecmp_posix_1(a.c_str(), b.c_str())), sign(strcasecmp(a.c_str(), b.c_str())));
        EXPECT_EQ(sign(cu_strncasecmp_posix_1(a.c_str(), b.c_str(), n)), order);
        if (n <= both) { EXPECT_EQ(sign(qz::fold_compare(a.c_str(), b.c_str(), n)), order); }
    }
    EXPECT_EQ(cu_strncasecmp_posix_1(nullptr, nullptr, 0), 0);
}

TEST(Clock, RunsForwardAndConverts) {
    cu_timeinfo_t own = {}, large = {{2000000000, 1000000000}};
    uint64_t before = 0, after = 0;
    cu_time_t time;
    EXPECT_EQ(cu_get_procspeed_1(&own) | cu_get_ctr_1(&before), CU_OK);
    std::this_thread::sleep_for(20ms);
    EXPECT_EQ(cu_get_ctr_1(&after), CU_OK);
    EXPECT_EQ(cu_cvt_time_1(after - before, &own, &time), CU_OK);
    EXPECT_GE(time.seconds * 1000000000 + time.nanoseconds, 20000000);
    EXPECT_EQ(cu_cvt_time_1(UINT64_MAX / 2, &large, &time), CU_OK);
    EXPECT_EQ(std::tuple(time.seconds, time.nanoseconds), std::tuple(18446744073, 709551614));
}

TEST(Error, NoMemory) {
    const std::string a(600, 'a');
    const error_handle error = current();
    cu_iconv_t handle = opened("ISO-8859-1", to_utf8);
    cu_error_t *got = error.get();
    char *text = const_cast<char *>(""), *out = nullptr;
    size_t n = 1;
    errno = EDOM;
    faults::allocations = {.fails_at = 1, .fails_on = true};
    cu_set_error_1(6, 0, nullptr, 1, 89, "%1$s%2$s%3$d", a.c_str(), "b", 3);
    const int codes[] = {cu_get_error_1(&got), cu_get_errmsg_1(error.get(), &text),
                         cu_iconv_str_1(handle, 0, "a", &n, &out, &n), cu_iconv_str_1(handle, 0, "\xe9", &n, &out, &n)};
    faults::allocations = {};
    EXPECT_EQ(errno, EDOM);
    EXPECT_THAT(codes, testing::ElementsAre(CU_NO_MEMORY, CU_NO_MEMORY, CU_ICONV_NO_MEMORY, CU_ICONV_NO_MEMORY));
    EXPECT_TRUE(got == nullptr && text == nullptr && out == nullptr);
    EXPECT_EQ(text_of(current()), a.substr(0, 511) + "3");
}

} // namespace
