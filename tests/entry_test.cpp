// Permissions in both directions, and entries: making, displaying and releasing them, also in other code sets.
#include "base/owned.h"
#include "qzacl_acl/entry.h"
#include "qzacl_acl/permission.h"
#include "support.h"

#include <clocale>
#include <dlfcn.h>
#include <langinfo.h>

using namespace support;
using testing::PrintToString;

// The code set that the process claims to use; null: that of its locale.
static const char *claimed_code_set = nullptr;

extern "C" char *nl_langinfo(nl_item item) noexcept {
    static const auto real = reinterpret_cast<decltype(&nl_langinfo)>(dlsym(RTLD_NEXT, "nl_langinfo"));
    return item == CODESET && claimed_code_set != nullptr ? const_cast<char *>(claimed_code_set) : real(item);
}

// The claimed result of converting code sets; 0: the real one.
static int claimed_result = 0;

extern "C" int cu_iconv_str_1(cu_iconv_t handle, std::uint32_t options, const char *in,
                              const std::size_t *in_length, char **out, std::size_t *out_length) {
    static const auto real = reinterpret_cast<decltype(&cu_iconv_str_1)>(dlsym(RTLD_NEXT, "cu_iconv_str_1"));
    if (claimed_result != 0)
        return claimed_result;
    return real(handle, options, in, in_length, out, out_length);
}

namespace {

TEST(messages, have_a_text_whatever_their_id) {
    for (const int unknown_id : {-1, 1, msg::table_size})
        EXPECT_EQ(msg::shown_text(unknown_id), cu_badid_qzseclib_msg);
    const int known_id = msg::incorrect_parameter.id;
    EXPECT_EQ(msg::shown_text(known_id), msg::default_text(known_id));
}

constexpr std::uint32_t highest_bit = 0x80000000;
constexpr std::uint32_t every_bit = 0xffffffff;
constexpr std::uint8_t no_type = 3;
const sec_perm_template_t own_templates[] = {
    {highest_bit, 'r', "", ""}, {1, '\xe9', "", ""}, {1, 'x', "", ""}, {2, 'r', "", ""}};
const sec_perm_set_t own_letters = {4, own_templates};

// After an error, the bits or letters before it are there.
TEST(permissions, turn_letters_into_bits) {
    const std::tuple<const char *, const sec_perm_set_t *, std::uint32_t, const char *> rows[] = {
        {nullptr, nullptr, 0, ""},
        {"oasvdelqCxcwr", nullptr, 0x1fff, ""},
        {"xr\xe9r", &own_letters, highest_bit | 1, ""},
        {"rR", nullptr, 1, "R"},
        {"xw", &own_letters, 1, "w"},
    };
    for (const auto &[letters, set, wanted, unknown] : rows) {
        const failure error = error_of(SEC_S_BAD_PERMISSION, msg::no_template_for_letter, unknown);
        std::uint32_t mask = every_bit;
        EXPECT_EQ(outcome_of(sec_translate_perms(letters, set, &mask)), *unknown == '\0' ? no_error : error);
        EXPECT_EQ(mask, wanted);
    }
    EXPECT_EQ(outcome_of(sec_translate_perms("", nullptr, nullptr)), bad_parameter("sec_translate_perms", 3));
}

TEST(permissions, turn_bits_into_letters) {
    const std::tuple<std::uint32_t, const sec_perm_set_t *, const char *, const char *> rows[] = {
        {0, nullptr, "", ""},
        {highest_bit | 1, &own_letters, "\xe9r", ""},
        {highest_bit, nullptr, "", "80000000"},
        {every_bit, nullptr, "rwcxCqledvsao", "00002000"},
        {5, &own_letters, "\xe9", "00000004"},
    };
    for (const auto &[mask, set, letters, unknown] : rows) {
        const failure error = error_of(SEC_S_BAD_PERMISSION, msg::no_template_for_bit, unknown);
        char text[qz::permission_text_size + 1] = {};
        EXPECT_EQ(outcome_of(sec_translate_bitmask(mask, set, text)), *unknown == '\0' ? no_error : error);
        EXPECT_STREQ(text, letters);
    }
    EXPECT_EQ(outcome_of(sec_translate_bitmask(1, nullptr, nullptr)), bad_parameter("sec_translate_mask", 3));
}

// The contents of an entry made from these parameters, or the error.
std::string made_of(std::uint8_t type, const char *mechanism, const char *identity) {
    auto *made = reinterpret_cast<sec_acle_t *>(0x10);
    const failure error = outcome_of(sec_create_acle(type, highest_bit, mechanism, identity, &made));
    const std::unique_ptr<sec_acle_t, void (*)(sec_acle_t *)> owner(made, sec_release_acle);
    if (made == nullptr)
        return PrintToString(error);
    EXPECT_EQ(error, no_error);
    EXPECT_EQ(made->type, type);
    EXPECT_EQ(made->perm_mask, highest_bit);
    return made->mechanism + "/"s + (made->identity == nullptr ? "none" : made->identity);
}

std::string refused(int position, const std::string &value) {
    return PrintToString(bad_parameter("sec_create_acle", position, value));
}

// The type, the mechanism and the identity; what is made of them, or the error.
using parameters = std::tuple<std::uint8_t, const char *, const char *, std::string>;

TEST(entries, are_made_with_addresses_in_their_short_form) {
    const parameters rows[] = {
        {SEC_ACLE_UNAUTHENTICATED, nullptr, nullptr, "/none"},
        {SEC_ACLE_GROUP, "seventeen-bytes-x", "a@::0", "/a@::0"},
        {SEC_ACLE_USER, "sixteen-bytes-xx", "x", "sixteen-bytes-xx/x"},
        {SEC_ACLE_USER, "unix", "alice@0:0:0:0:0:FFFF:a00:1", "unix/alice@::ffff:10.0.0.1"},
        {SEC_ACLE_USER, "hba2", "@FE80:0::1", "hba2/@fe80::1"},
        {SEC_ACLE_EXPANDED, "hba2", "1:2:3:4:5:6:7:888F", "hba2/1:2:3:4:5:6:7:888f"},
        {SEC_ACLE_USER, "unix", "a@b@::01", "unix/a@b@::01"},
        {SEC_ACLE_EXPANDED, "hba2", "alice", "hba2/alice"},
    };
    for (const auto &[type, mechanism, identity, made] : rows)
        EXPECT_EQ(made_of(type, mechanism, identity), made);
}

TEST(entries, are_not_made_from_bad_parameters) {
    const char long_mechanism[] = "seventeen-bytes-x";
    const char empty[] = "";
    const char no_host[] = "alice";
    const char empty_host[] = "alice@";
    const parameters rows[] = {
        {no_type, "unix", nullptr, refused(1, "3")},
        {SEC_ACLE_USER, nullptr, nullptr, refused(3, "0")},
        {SEC_ACLE_EXPANDED, empty, no_host, refused(3, address(empty))},
        {SEC_ACLE_USER, long_mechanism, no_host, refused(3, address(long_mechanism))},
        {SEC_ACLE_USER, "kdz", nullptr, refused(4, "0")},
        {SEC_ACLE_GROUP, nullptr, empty, refused(4, address(empty))},
        {SEC_ACLE_USER, "unix", no_host, refused(4, address(no_host))},
        {SEC_ACLE_USER, "hba2", empty_host, refused(4, address(empty_host))},
    };
    for (const auto &[type, mechanism, identity, error] : rows)
        EXPECT_EQ(made_of(type, mechanism, identity), error);
    EXPECT_EQ(outcome_of(sec_create_acle(SEC_ACLE_UNAUTHENTICATED, 0, "", "", nullptr)),
              bad_parameter("sec_create_acle", 5));
}

// An internal failure names the line of the call that failed.
TEST(entries, tell_where_a_conversion_failed) {
    std::ifstream file(QZ_SOURCES "/security/ACL/lib/qzacl_utils/code_set.cpp");
    std::string text;
    int line = 1;
    while (std::getline(file, text) && text.find("cu_iconv_str_1(") == std::string::npos)
        ++line;
    sec_acle_t *made = nullptr;
    claimed_result = CU_NO_RESOURCE;
    const failure error = outcome_of(sec_create_acle(SEC_ACLE_GROUP, 0, nullptr, "staff", &made));
    claimed_result = CU_OK;
    EXPECT_EQ(error, error_of(SEC_S_INTERNAL, msg::internal_failure, "security/ACL/lib/qzacl_utils", line,
                              CU_NO_RESOURCE));
}

// The two texts of an entry, or the error.
std::string shown_for(const sec_acle_t &acle) {
    char *mechanism = const_cast<char *>("left over");
    char *identity = nullptr;
    const failure error = outcome_of(sec_display_acle_id(&acle, &mechanism, &identity));
    const qz::owned<char> mechanism_owner(mechanism);
    const qz::owned<char> identity_owner(identity);
    if (error == no_error)
        return mechanism + "/"s + identity;
    return mechanism == nullptr && identity == nullptr ? PrintToString(error) : "a text";
}

TEST(entries, are_shown_when_they_are_whole) {
    const sec_acle_t good = user("kdz", "x", 1);
    const std::string name = "sec_display_acle_id";
    char *text = nullptr;
    EXPECT_EQ(outcome_of(sec_display_acle_id(nullptr, nullptr, nullptr)), bad_parameter(name, 1));
    EXPECT_EQ(outcome_of(sec_display_acle_id(&good, nullptr, &text)), bad_parameter(name, 2));
    EXPECT_EQ(outcome_of(sec_display_acle_id(&good, &text, nullptr)), bad_parameter(name, 3));
    const failure bad_type = bad_acle(msg::acle_type_not_displayable, no_type);
    EXPECT_EQ(shown_for(entry(no_type, "kdz", "x", 1)), PrintToString(bad_type));
    for (const sec_acle_t &part : {user("", "x", 1), expanded("kdz", "", 1), group(nullptr, 1)})
        EXPECT_EQ(shown_for(part), PrintToString(bad_acle(msg::acle_incomplete)));
    sec_release_aclelist(nullptr);
}

struct conversion {
    const char *code_set; // null: that of the locale
    const char *locale;
    const char *mechanism;
    const char *identity;
    std::string made; // of the two; nothing: the mechanism is too long
    std::string displayed;
};

// A process opens its converters once, so that each conversion has one of its own.
void expect_conversion(const conversion &row) {
    const int status = status_of_child([&] {
        claimed_code_set = row.code_set;
        std::setlocale(LC_ALL, row.locale);
        const std::string too_long = refused(3, address(row.mechanism));
        EXPECT_EQ(made_of(SEC_ACLE_USER, row.mechanism, row.identity),
                  row.made.empty() ? too_long : row.made);
        EXPECT_EQ(shown_for(user(row.mechanism, row.identity, 0)), row.displayed);
        std::exit(testing::Test::HasFailure());
    });
    EXPECT_EQ(status, 0) << row.mechanism << " in " << row.locale;
}

// These run before the other tests.
TEST(entries_DeathTest, are_converted_between_the_code_set_and_utf8) {
    const std::string failed = PrintToString(error_of(SEC_S_CODESET, msg::conversion_failed));
    const std::string no_set = PrintToString(error_of(SEC_S_CODESET, msg::conversion_unavailable));
    const char *const utf8 = "k\xc3\xa9/\xc3\xbf";
    const conversion rows[] = {
        {nullptr, "C", "kdz", "plain", "kdz/plain", "kdz/plain"},
        {nullptr, "C", "kdz", "\xc3\xa9", failed, failed},
        {nullptr, "C.UTF-8", "k\xc3\xa9", "\xc3\xbf", utf8, utf8},
        {nullptr, "C.UTF-8", "kdz", "a\xc3", failed, failed},
        {"ISO-8859-1", "C", "k\xc3\xa9", "\xc3\xbf", "k\xc3\x83\xc2\xa9/\xc3\x83\xc2\xbf", "k\xe9/\xff"},
        {"ISO-8859-1", "C", "abcdefghijklmn\xe9", "x", "abcdefghijklmn\xc3\xa9/x", failed},
        {"ISO-8859-1", "C", "abcdefghijklmno\xe9", "x", "", failed},
        {"no-such-code-set", "C", "kdz", "plain", no_set, no_set},
    };
    for (const conversion &row : rows)
        expect_conversion(row);
}

} // namespace
