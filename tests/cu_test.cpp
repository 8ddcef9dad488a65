// The platform utility library: errors and their texts, missing catalogs, letter case, the clock, and shared handles.
// The fuzzers test the formatting of texts and the conversion of code sets.
#include "base/posix_fold.h"
#include "faults.h"
#include "qz/cu.h"

#include <gtest/gtest.h>
#include <strings.h>
#include <thread>

namespace {

constexpr int some_code = 42; // of a library above this one
constexpr int some_message = 97;
constexpr std::uint32_t unknown_flag = 2;

std::unique_ptr<cu_error_t, void (*)(cu_error_t *)> current() {
    cu_error_t *error = nullptr;
    EXPECT_EQ(cu_get_error_1(&error), CU_OK);
    return {error, cu_rel_error_1};
}

std::string current_text() {
    char *text = nullptr;
    EXPECT_EQ(cu_get_errmsg_1(current().get(), &text), CU_OK);
    return std::unique_ptr<char, void (*)(char *)>(text, cu_rel_errmsg_1).get();
}

std::string recorded(const char *text, auto... arguments) {
    EXPECT_EQ(cu_set_error_1(some_code, 0, nullptr, 1, some_message, text, arguments...), CU_OK);
    return current_text();
}

TEST(Error, TextsAndArguments) {
    const char *none = nullptr;
    EXPECT_EQ(recorded(none), "");
    EXPECT_EQ(recorded("%1$s %2$d %2$u %3$x%4$c%4$d", none, INT_MIN, -1, 0),
              "(null) -2147483648 2147483648 ffffffff0");
    EXPECT_EQ(recorded("%9$s%8$d%% %%1$s", 1, 2, 3, 4, 5, 6, 7, 8, "%1$s%%"), "%1$s%%8% %1$s");
}

TEST(Error, IsOfItsThreadAndKeptByAHandle) {
    cu_set_error_1(some_code, 0, nullptr, 1, some_message, "%1$s %2$d", "first", 1);
    auto first = current();
    EXPECT_EQ(first->code, some_code);
    EXPECT_EQ(first->message_id, some_message);
    cu_set_no_error_1();
    const auto none = current();
    EXPECT_EQ(none->code, CU_OK);
    cu_pset_error_1(first.get());
    first.reset();
    std::thread([] {
        EXPECT_EQ(current_text(), "");
        EXPECT_EQ(recorded("of another thread"), "of another thread");
    }).join();
    EXPECT_EQ(current_text(), "first 1");
    cu_pset_error_1(none.get());
    EXPECT_EQ(current_text(), "");
}

// Around and far above the size that needs no allocation, with every remainder by 16. The thread ends with a block in
// use.
TEST(Error, LongArguments) {
    std::thread([] {
        for (const size_t first : {999990u, 500u})
            for (size_t length = first; length < first + 20; ++length) {
                const std::string a(length, 'a');
                EXPECT_EQ(recorded("%2$s-%1$s", a.c_str(), "b"), "b-" + a);
                cu_pset_error_1(current().get());
                EXPECT_EQ(current_text(), "b-" + a);
            }
    }).join();
}

TEST(Catalog, FilesThatAreNotThereAreDoneWithout) {
    // One too long for the last place, and more than there are places.
    static const std::string long_name(99, 'n');
    errno = EDOM;
    for (const char *name : {"1", "2", "3", "4", "5", "6", "7", long_name.c_str(), "8", "9"}) {
        cu_set_error_1(1, 0, name, 1, 1, "default");
        EXPECT_EQ(current_text(), "default");
    }
    EXPECT_EQ(errno, EDOM);
}

// Handles are never closed: this one lies where the leak checker finds it.
cu_iconv_t from_latin1 = nullptr;
const int opened = cu_iconv_open_1("ISO-8859-1", 0, &from_latin1);

TEST(Codeset, ThreadsShareAHandle) {
    const auto convert = [] {
        for (size_t in = 0, made = 0; in < 1000; ++in) {
            const std::string text(in, '\xe9');
            char *out = nullptr;
            ASSERT_EQ(cu_iconv_str_1(from_latin1, 0, text.c_str(), &in, &out, &made), CU_OK);
            ASSERT_EQ(std::count(out, out + made, '\xc3'), in);
            std::free(out);
        }
    };
    std::vector<std::jthread> threads;
    for (int count = 0; count < 4; ++count)
        threads.emplace_back(convert);
}

TEST(Fold, AgreesWithTheCLibraryInItsOwnLocale) {
    for (int c = EOF; c < 256; ++c)
        EXPECT_EQ(cu_tolower_posix_1(c), std::tolower(c));
    const auto sign = [](int order) { return (order > 0) - (order < 0); };
    // Any two bytes at every place of a word and after it, among others that fold or only seem to.
    for (unsigned at = 0; at < 10; ++at)
        for (unsigned pair = 1; pair < 0x10000; ++pair) {
            char a[] = "aZ@[\x7f\xc1\xff{zBq";
            char b[] = "Az@[\x7f\xc1\xff{Zbr";
            a[at] = static_cast<char>(pair);
            b[at] = static_cast<char>(pair >> 8);
            const int order = sign(strcasecmp(a, b));
            ASSERT_EQ(sign(cu_strcasecmp_posix_1(a, b)), order);
            ASSERT_EQ(sign(cu_strncasecmp_posix_1(a, b, sizeof a)), order);
            ASSERT_EQ(cu_strncasecmp_posix_1(a, b, at), 0);
            ASSERT_EQ(qz::fold8(qz::load8(a)) == qz::fold8(qz::load8(b)), strncasecmp(a, b, 8) == 0);
        }
}

TEST(Clock, RunsForwardAndConverts) {
    cu_timeinfo_t own = {};
    const cu_timeinfo_t large = {{2000000000, 1000000000}};
    uint64_t before = 0;
    uint64_t after = 0;
    cu_time_t time;
    EXPECT_EQ(cu_get_procspeed_1(&own), CU_OK);
    EXPECT_EQ(cu_get_ctr_1(&before), CU_OK);
    std::this_thread::sleep_for(std::chrono::milliseconds(20));
    EXPECT_EQ(cu_get_ctr_1(&after), CU_OK);
    EXPECT_EQ(cu_cvt_time_1(after - before, &own, &time), CU_OK);
    EXPECT_GE(time.seconds * 1000000000 + time.nanoseconds, 20000000);
    EXPECT_EQ(cu_cvt_time_1(UINT64_MAX / 2, &large, &time), CU_OK);
    EXPECT_EQ(time.seconds, 18446744073);
    EXPECT_EQ(time.nanoseconds, 709551614);
}

TEST(Failures, BadParametersAreRefused) {
    const cu_timeinfo_t unfilled = {};
    const cu_timeinfo_t speed = {{1, 1}};
    const auto error = current();
    cu_time_t time;
    char address[46] = "";
    char *out = nullptr;
    cu_iconv_t handle = nullptr;
    size_t n = 1;
    EXPECT_EQ(cu_iconv_open_1("no-such", CU_ICONV_FROM_UTF8, &handle), CU_ICONV_UNKNOWN_CODESET);
    EXPECT_EQ(handle, nullptr);
    const int results[] = {
        cu_get_error_1(nullptr),
        cu_pset_error_1(nullptr),
        cu_get_errmsg_1(nullptr, &out),
        cu_get_errmsg_1(error.get(), nullptr),
        cu_get_ctr_1(nullptr),
        cu_get_procspeed_1(nullptr),
        cu_cvt_time_1(1, &unfilled, &time),
        cu_cvt_time_1(1, nullptr, &time),
        cu_cvt_time_1(1, &speed, nullptr),
        cu_ipaddr_ntop_1(nullptr, address),
        cu_ipaddr_ntop_1(address, nullptr),
        cu_iconv_open_1("UTF-8", 0, nullptr),
        cu_iconv_open_1(nullptr, 0, &handle),
        cu_iconv_open_1("", 0, &handle),
        cu_iconv_open_1("UTF-8", unknown_flag, &handle),
        cu_iconv_open_1("ISO-8859-1//TRANSLIT", CU_ICONV_FROM_UTF8, &handle),
        cu_iconv_str_1(nullptr, 0, "a", &n, &out, &n),
        cu_iconv_str_1(from_latin1, unknown_flag, "a", &n, &out, &n),
        cu_iconv_str_1(from_latin1, 0, nullptr, &n, &out, &n),
        cu_iconv_str_1(from_latin1, 0, "a", nullptr, &out, &n),
        cu_iconv_str_1(from_latin1, 0, "a", &n, nullptr, &n),
        cu_iconv_str_1(from_latin1, 0, "a", &n, &out, nullptr),
    };
    for (std::size_t at = 0; at < std::size(results); ++at)
        EXPECT_EQ(results[at], CU_BAD_PARAMETER) << "call " << at;
}

TEST(Failures, WithoutMemoryMakeNothing) {
    const auto error = current();
    const std::string a(600, 'a');
    cu_error_t *got = error.get();
    char *text = const_cast<char *>("left over");
    char *out = nullptr;
    size_t n = 1;
    faults::allocations = {.fails_at = 1, .fails_on = true};
    cu_set_error_1(some_code, 0, nullptr, 1, some_message, "%1$s%2$s%3$d", a.c_str(), "b", 3);
    const int got_code = cu_get_error_1(&got);
    const int text_code = cu_get_errmsg_1(error.get(), &text);
    const int converted_code = cu_iconv_str_1(from_latin1, 0, "\xe9", &n, &out, &n);
    faults::allocations = {};
    EXPECT_EQ(got_code, CU_NO_MEMORY);
    EXPECT_EQ(got, nullptr);
    EXPECT_EQ(text_code, CU_NO_MEMORY);
    EXPECT_EQ(text, nullptr);
    EXPECT_EQ(converted_code, CU_ICONV_NO_MEMORY);
    EXPECT_EQ(out, nullptr);
    EXPECT_EQ(current_text(), a.substr(0, 511) + "3");
}

} // namespace
