// Permissions in both directions, and entries: making, displaying and releasing them, also in other code sets.
#include "owned.h"
#include "qzacl_acl/entry.h"
#include "qzacl_acl/permission.h"
#include "support.h"

#include <clocale>
#include <dlfcn.h>
#include <gmock/gmock.h>
#include <langinfo.h>

using namespace support;
using testing::PrintToString;

// The code set that the process claims to use; null: that of its locale.
static const char *claimed_code_set = nullptr;

extern "C" char *nl_langinfo(nl_item item) noexcept {
    static const auto real = reinterpret_cast<decltype(&nl_langinfo)>(dlsym(RTLD_NEXT, "nl_langinfo"));
    return item == CODESET && claimed_code_set != nullptr ? const_cast<char *>(claimed_code_set) : real(item);
}

namespace {

TEST(permissions, turn_letters_into_bits_and_back) {
    const sec_perm_template_t list[] = {{0x80000000, 'r', "", ""}, {1, '\xe9', "", ""}, {1, 'x', "", ""}};
    const sec_perm_set_t own = {3, list}, none = {0, nullptr};
    // After an error the result is what was found before it.
    const auto bits = [](const char *text, const sec_perm_set_t *set, unsigned wanted, const char *bad) {
        std::uint32_t mask = 0xffffffff;
        EXPECT_EQ(after(sec_translate_perms(text, set, &mask)), *bad == 0 ? no_error : error_of(36, 133, {bad}));
        EXPECT_EQ(mask, wanted) << text;
    };
    bits(nullptr, nullptr, 0, "");
    bits("", &none, 0, "");
    bits("oasvdelqCxcwr", nullptr, 0x1fff, "");
    bits("cC", nullptr, 0x14, "");
    bits("xr\xe9r", &own, 0x80000001, "");
    bits("rR", nullptr, 1, "R");
    bits("xw", &own, 1, "w");
    const auto letters = [](unsigned mask, const sec_perm_set_t *set, const char *wanted, const char *bad) {
        char text[qz::permission_text_size + 1] = {};
        EXPECT_EQ(after(sec_translate_bitmask(mask, set, text)), *bad == 0 ? no_error : error_of(36, 164, {bad}));
        EXPECT_STREQ(text, wanted);
    };
    letters(0, &none, "", "");
    letters(0x1fff, nullptr, "rwcxCqledvsao", "");
    letters(0x80000001, &own, "\xe9r", "");
    letters(0x80000000, nullptr, "", "80000000");
    letters(0xffffffff, nullptr, "rwcxCqledvsao", "00002000");
    letters(3, &own, "\xe9", "00000002");
    std::uint32_t mask = 1; // the inner operation adds to what is there
    EXPECT_EQ(sec__translate_perms("w", &acl__default_perm_set, &mask), 0);
    EXPECT_EQ(mask, 3u);
    EXPECT_EQ(after(sec_translate_perms("", nullptr, nullptr)), bad_parameter("sec_translate_perms", 3, "0"));
    EXPECT_EQ(after(sec_translate_bitmask(1, nullptr, nullptr)), bad_parameter("sec_translate_mask", 3, "0"));
}

// What an entry made of these parameters holds, or the error.
std::string made_of(std::uint8_t type, const char *mechanism, const char *identity) {
    auto *made = reinterpret_cast<sec_acle_t *>(0x10);
    const failure error = after(sec_create_acle(type, 1u << 31, mechanism, identity, &made));
    const qz::owned_acle owner(made);
    if (made == nullptr) return PrintToString(error);
    EXPECT_EQ(std::tuple(error, made->type, made->perm_mask), std::tuple(no_error, type, 1u << 31));
    return made->mechanism + "/"s + (made->identity == nullptr ? "none" : made->identity);
}

std::string refused(int position, const std::string &value) {
    return PrintToString(bad_parameter("sec_create_acle", position, value));
}

TEST(entries, are_made_from_sound_parameters) {
    const char mechanism17[] = "12345678901234567", empty[] = "", bare[] = "alice", no_host[] = "alice@";
    EXPECT_EQ(made_of(1, nullptr, nullptr), "/none");
    EXPECT_EQ(made_of(2, mechanism17, "ignored"), "/none");
    EXPECT_EQ(made_of(16, mechanism17, "a@::0"), "/a@::0");
    EXPECT_EQ(made_of(4, mechanism17 + 1, "x"), "2345678901234567/x");
    EXPECT_EQ(made_of(8, "UNIX", "a@::0"), "UNIX/a@::0");
    EXPECT_EQ(made_of(4, "unixx", no_host), "unixx/alice@");
    EXPECT_EQ(made_of(4, "unix", "alice@0:0:0:0:0:FFFF:a00:1"), "unix/alice@::ffff:10.0.0.1");
    EXPECT_EQ(made_of(4, "hba2", "@FE80:0::1"), "hba2/@fe80::1");
    EXPECT_EQ(made_of(8, "hba2", "1111:2222:3333:4444:5555:6666:7777:888F"),
              "hba2/1111:2222:3333:4444:5555:6666:7777:888f");
    EXPECT_EQ(made_of(4, "unix", "a@b@::01"), "unix/a@b@::01");
    EXPECT_EQ(made_of(8, "hba2", bare), "hba2/alice");
    EXPECT_EQ(made_of(0, "unix", bare), refused(1, "0"));
    EXPECT_EQ(made_of(3, mechanism17, nullptr), refused(1, "3"));
    EXPECT_EQ(made_of(4, nullptr, nullptr), refused(3, "0"));
    EXPECT_EQ(made_of(8, empty, bare), refused(3, shown(empty)));
    EXPECT_EQ(made_of(4, mechanism17, bare), refused(3, shown(mechanism17)));
    EXPECT_EQ(made_of(4, "kdz", nullptr), refused(4, "0"));
    EXPECT_EQ(made_of(16, nullptr, empty), refused(4, shown(empty)));
    EXPECT_EQ(made_of(4, "unix", bare), refused(4, shown(bare)));
    EXPECT_EQ(made_of(4, "hba2", no_host), refused(4, shown(no_host)));
    EXPECT_EQ(after(sec_create_acle(1, 0, "", "", nullptr)), bad_parameter("sec_create_acle", 5, "0"));
}

// The two texts of an entry, or the error.
std::string shown_for(const sec_acle_t &acle) {
    char *texts[2] = {const_cast<char *>("left over"), nullptr};
    const failure error = after(sec_display_acle_id(&acle, &texts[0], &texts[1]));
    const qz::owned<char> owners[] = {qz::owned<char>(texts[0]), qz::owned<char>(texts[1])};
    const auto text = [](const char *given) { return given == nullptr ? "none"s : given; };
    return text(texts[0]) + "/" + text(texts[1]) + (error == no_error ? "" : PrintToString(error));
}

// A process opens its converters once, so that each row has one of its own.
TEST(entries_DeathTest, are_converted_between_the_code_set_and_utf8) {
    GTEST_FLAG_SET(death_test_style, "threadsafe"); // runs this test alone in a new process
    const std::string failed = PrintToString(error_of(26, 130)), no_set = PrintToString(error_of(26, 129));
    const std::string none = "none/none";
    const auto known = [](const std::string &text) { return text.substr(0, text.find("\tParameter value")); };
    const auto check = [&](const char *claimed, const char *locale, const char *mechanism, const char *identity,
                           const std::string &made, const std::string &shown) {
        const auto show = [&] {
            claimed_code_set = claimed;
            std::setlocale(LC_ALL, locale);
            const std::string found = known(made_of(4, mechanism, identity)) + "][";
            std::fprintf(stderr, "[%s%s]", found.c_str(), shown_for(entry(4, mechanism, identity, 0)).c_str());
            std::exit(0);
        };
        EXPECT_EXIT(show(), testing::ExitedWithCode(0), testing::HasSubstr("[" + made + "][" + shown + "]"));
    };
    check(nullptr, "C", "kdz", "plain", "kdz/plain", "kdz/plain");
    check(nullptr, "C", "kdz", "\xc3\xa9", failed, none + failed);
    check(nullptr, "C", "k\xe9", "x", failed, none + failed);
    check(nullptr, "C.UTF-8", "k\xc3\xa9", "\xc3\xbf", "k\xc3\xa9/\xc3\xbf", "k\xc3\xa9/\xc3\xbf");
    check(nullptr, "C.UTF-8", "kdz", "a\xc3", failed, none + failed);
    check("ISO-8859-1", "C", "k\xc3\xa9", "\xc3\xbf", "k\xc3\x83\xc2\xa9/\xc3\x83\xc2\xbf", "k\xe9/\xff");
    check("ISO-8859-1", "C", "abcdefghijklmn\xe9", "x", "abcdefghijklmn\xc3\xa9/x", none + failed);
    check("ISO-8859-1", "C", "abcdefghijklmno\xe9", "x", known(refused(3, "")), none + failed);
    check("no-such-code-set", "C", "kdz", "plain", no_set, none + no_set);
}

TEST(entries, go_with_the_list_that_holds_them) {
    sec_aclelist_t list = {5, nullptr}; // an array that is not there is not looked at
    sec_release_aclelist(&list);
    EXPECT_EQ(list.count, 5);
    list = {3, static_cast<sec_acle_t **>(std::calloc(3, sizeof(sec_acle_t *)))};
    ASSERT_EQ(sec_create_acle(1, 0, nullptr, nullptr, &list.acles[0]), 0);
    ASSERT_EQ(sec_create_acle(4, 0, "kdz", "x", &list.acles[2]), 0);
    sec_release_aclelist(&list);
    EXPECT_TRUE(list.count == 0 && list.acles == nullptr);
}

} // namespace
