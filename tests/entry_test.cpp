// Permissions in both directions, and entries: making, displaying and releasing them, also in other code sets.
#include "base/owned.h"
#include "qzacl_acl/entry.h"
#include "qzacl_acl/permission.h"
#include "support.h"

#include <clocale>
#include <dlfcn.h>
#include <langinfo.h>
#include <sys/wait.h>
#include <unistd.h>

using namespace support;
using testing::PrintToString;

// The code set that the process claims to use; null: that of its locale.
static const char *claimed_code_set = nullptr;

extern "C" char *nl_langinfo(nl_item item) noexcept {
    static const auto real = reinterpret_cast<decltype(&nl_langinfo)>(dlsym(RTLD_NEXT, "nl_langinfo"));
    return item == CODESET && claimed_code_set != nullptr ? const_cast<char *>(claimed_code_set) : real(item);
}

// What the conversion of code sets answers; 0: what it really does.
static int claimed_result = 0;

extern "C" int cu_iconv_str_1(cu_iconv_t handle, std::uint32_t options, const char *in, const std::size_t *in_length,
                              char **out, std::size_t *out_length) {
    static const auto real = reinterpret_cast<decltype(&cu_iconv_str_1)>(dlsym(RTLD_NEXT, "cu_iconv_str_1"));
    return claimed_result != 0 ? claimed_result : real(handle, options, in, in_length, out, out_length);
}

namespace {

TEST(messages, have_a_text_whatever_their_id) {
    for (const int id : {-1, 1, qz::msg::table_size}) EXPECT_EQ(qz::msg::shown_text(id), cu_badid_qzseclib_msg);
    EXPECT_EQ(qz::msg::shown_text(88), qz::msg::default_text(88));
}

TEST(permissions, turn_letters_into_bits_and_back) {
    const sec_perm_template_t list[] = {
        {0x80000000, 'r', "", ""}, {1, '\xe9', "", ""}, {1, 'x', "", ""}, {2, 'r', "", ""}};
    const sec_perm_set_t own = {4, list};
    // After an error the result is what was found before it.
    const auto bits = [](const char *text, const sec_perm_set_t *set, unsigned wanted, const char *bad) {
        std::uint32_t mask = 0xffffffff;
        EXPECT_EQ(after(sec_translate_perms(text, set, &mask)), *bad == 0 ? no_error : error_of(36, 133, {bad}));
        EXPECT_EQ(mask, wanted) << text;
    };
    bits(nullptr, nullptr, 0, "");
    bits("oasvdelqCxcwr", nullptr, 0x1fff, "");
    bits("xr\xe9r", &own, 0x80000001, "");
    bits("rR", nullptr, 1, "R");
    bits("xw", &own, 1, "w");
    const auto letters = [](unsigned mask, const sec_perm_set_t *set, const char *wanted, const char *bad) {
        char text[qz::permission_text_size + 1] = {};
        EXPECT_EQ(after(sec_translate_bitmask(mask, set, text)), *bad == 0 ? no_error : error_of(36, 164, {bad}));
        EXPECT_STREQ(text, wanted);
    };
    letters(0, nullptr, "", "");
    letters(0x80000001, &own, "\xe9r", "");
    letters(0x80000000, nullptr, "", "80000000");
    letters(0xffffffff, nullptr, "rwcxCqledvsao", "00002000");
    letters(5, &own, "\xe9", "00000004");
    EXPECT_EQ(after(sec_translate_perms("", nullptr, nullptr)), bad_parameter("sec_translate_perms", 3, "0"));
    EXPECT_EQ(after(sec_translate_bitmask(1, nullptr, nullptr)), bad_parameter("sec_translate_mask", 3, "0"));
}

// What an entry made of these parameters holds, or the error.
std::string made_of(std::uint8_t type, const char *mechanism, const char *identity) {
    auto *made = reinterpret_cast<sec_acle_t *>(0x10);
    const failure error = after(sec_create_acle(type, 1u << 31, mechanism, identity, &made));
    const std::unique_ptr<sec_acle_t, void (*)(sec_acle_t *)> owner(made, sec_release_acle);
    if (made == nullptr) return PrintToString(error);
    EXPECT_EQ(std::tuple(error, made->type, made->perm_mask), std::tuple(no_error, type, 1u << 31));
    return made->mechanism + "/"s + (made->identity == nullptr ? "none" : made->identity);
}

std::string refused(int position, const std::string &value) {
    return PrintToString(bad_parameter("sec_create_acle", position, value));
}

TEST(entries, are_made_from_sound_parameters) {
    const char mechanism17[] = "12345678901234567", empty[] = "", bare[] = "alice", no_host[] = "alice@";
    const std::tuple<std::uint8_t, const char *, const char *, std::string> rows[] = {
        {1, nullptr, nullptr, "/none"},
        {16, mechanism17, "a@::0", "/a@::0"},
        {4, mechanism17 + 1, "x", "2345678901234567/x"},
        {8, "UNIX", "a@::0", "UNIX/a@::0"},
        {4, "unix", "alice@0:0:0:0:0:FFFF:a00:1", "unix/alice@::ffff:10.0.0.1"},
        {4, "hba2", "@FE80:0::1", "hba2/@fe80::1"},
        {8, "hba2", "1111:2222:3333:4444:5555:6666:7777:888F", "hba2/1111:2222:3333:4444:5555:6666:7777:888f"},
        {4, "unix", "a@b@::01", "unix/a@b@::01"},
        {8, "hba2", bare, "hba2/alice"},
        {0, "unix", bare, refused(1, "0")},
        {3, mechanism17, nullptr, refused(1, "3")},
        {4, nullptr, nullptr, refused(3, "0")},
        {8, empty, bare, refused(3, shown(empty))},
        {4, mechanism17, bare, refused(3, shown(mechanism17))},
        {4, "kdz", nullptr, refused(4, "0")},
        {16, nullptr, empty, refused(4, shown(empty))},
        {4, "unix", bare, refused(4, shown(bare))},
        {4, "hba2", no_host, refused(4, shown(no_host))},
    };
    for (const auto &[type, mechanism, identity, made] : rows) EXPECT_EQ(made_of(type, mechanism, identity), made);
    EXPECT_EQ(after(sec_create_acle(1, 0, "", "", nullptr)), bad_parameter("sec_create_acle", 5, "0"));
}

// An internal failure names the line of the call that failed.
TEST(entries, tell_where_a_conversion_failed) {
    std::ifstream file(QZ_SOURCES "/security/ACL/lib/qzacl_utils/code_set.cpp");
    std::string line;
    int number = 1;
    while (std::getline(file, line) && line.find("cu_iconv_str_1(") == std::string::npos) ++number;
    sec_acle_t *made = nullptr;
    claimed_result = 17;
    const failure error = after(sec_create_acle(16, 0, nullptr, "staff", &made));
    claimed_result = 0;
    EXPECT_EQ(error, error_of(23, 91, {"security/ACL/lib/qzacl_utils", std::to_string(number), "17"}));
}

// The two texts of an entry, or the error.
std::string shown_for(const sec_acle_t &acle) {
    char *texts[2] = {const_cast<char *>("left over"), nullptr};
    const failure error = after(sec_display_acle_id(&acle, &texts[0], &texts[1]));
    const qz::owned<char> owners[] = {qz::owned<char>(texts[0]), qz::owned<char>(texts[1])};
    return error == no_error ? texts[0] + "/"s + texts[1] : texts[0] == texts[1] ? PrintToString(error) : "a text";
}

TEST(entries, are_shown_when_they_are_whole) {
    const sec_acle_t good = entry(4, "kdz", "x", 1);
    char *text = nullptr;
    const std::string of = "sec_display_acle_id";
    EXPECT_EQ(after(sec_display_acle_id(nullptr, nullptr, nullptr)), bad_parameter(of, 1));
    EXPECT_EQ(after(sec_display_acle_id(&good, nullptr, &text)), bad_parameter(of, 2));
    EXPECT_EQ(after(sec_display_acle_id(&good, &text, nullptr)), bad_parameter(of, 3));
    EXPECT_EQ(shown_for(entry(3, "kdz", "x", 1)), PrintToString(error_of(43, 94, {"3"})));
    for (const sec_acle_t &part : {entry(4, "", "x", 1), entry(8, "kdz", "", 1), entry(16, "kdz", nullptr, 1)})
        EXPECT_EQ(shown_for(part), PrintToString(error_of(43, 95)));
    sec_release_aclelist(nullptr);
}

// A process opens its converters once, so that each row has one of its own. These run before the other tests.
TEST(entries_DeathTest, are_converted_between_the_code_set_and_utf8) {
    const std::string failed = PrintToString(error_of(26, 130)), no_set = PrintToString(error_of(26, 129));
    // The code set; the locale; an entry's mechanism and identity, and what they are made and shown as.
    const std::tuple<const char *, const char *, const char *, const char *, std::string, std::string> rows[] = {
        {nullptr, "C", "kdz", "plain", "kdz/plain", "kdz/plain"},
        {nullptr, "C", "kdz", "\xc3\xa9", failed, failed},
        {nullptr, "C.UTF-8", "k\xc3\xa9", "\xc3\xbf", "k\xc3\xa9/\xc3\xbf", "k\xc3\xa9/\xc3\xbf"},
        {nullptr, "C.UTF-8", "kdz", "a\xc3", failed, failed},
        {"ISO-8859-1", "C", "k\xc3\xa9", "\xc3\xbf", "k\xc3\x83\xc2\xa9/\xc3\x83\xc2\xbf", "k\xe9/\xff"},
        {"ISO-8859-1", "C", "abcdefghijklmn\xe9", "x", "abcdefghijklmn\xc3\xa9/x", failed},
        {"ISO-8859-1", "C", "abcdefghijklmno\xe9", "x", "", failed}, // too long
        {"no-such-code-set", "C", "kdz", "plain", no_set, no_set},
    };
    for (const auto &[code_set, locale, mechanism, identity, made, display] : rows) {
        if (fork() == 0) {
            claimed_code_set = code_set;
            std::setlocale(LC_ALL, locale);
            EXPECT_EQ(made_of(4, mechanism, identity), made.empty() ? refused(3, shown(mechanism)) : made);
            EXPECT_EQ(shown_for(entry(4, mechanism, identity, 0)), display);
            std::exit(HasFailure());
        }
        int status = -1;
        EXPECT_TRUE(wait(&status) > 0 && status == 0) << mechanism << " in " << locale;
    }
}

} // namespace
