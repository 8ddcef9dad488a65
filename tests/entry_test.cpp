// Permissions in both directions, and entries: making, displaying and releasing them, also in other code
// sets.
#include "owned.h"
#include "qzacl_acl/entry.h"
#include "qzacl_acl/permission.h"
#include "support.h"

#include <clocale>
#include <dlfcn.h>
#include <langinfo.h>

using namespace support;

// The code set that the process claims to use; null: that of its locale.
static const char *claimed_code_set = nullptr;

extern "C" char *nl_langinfo(nl_item item) noexcept {
    static const auto real = reinterpret_cast<decltype(&nl_langinfo)>(dlsym(RTLD_NEXT, "nl_langinfo"));
    return item == CODESET && claimed_code_set != nullptr ? const_cast<char *>(claimed_code_set) : real(item);
}

namespace {

failure missing(const char *function, const char *position) {
    return error_of(4, 88, {function, position, "0"});
}

TEST(permissions, turn_letters_into_bits_and_back) {
    const sec_perm_template_t templates[] = {
        {0x80000000, 'r', "", ""}, {1, '\xe9', "", ""}, {1, 'x', "", ""}};
    const sec_perm_set_t own = {3, templates}, none = {0, nullptr};
    const struct {
        const char *text;
        const sec_perm_set_t *set;
        std::uint32_t mask; // after a failure, what was found before it
        const char *refused = nullptr;
    } letters[] = {{nullptr, nullptr, 0},
                   {"", &none, 0},
                   {"oasvdelqCxcwr", nullptr, 0x1fff},
                   {"cC", nullptr, 0x14},
                   {"xr\xe9r", &own, 0x80000001},
                   {"rR", nullptr, 1, "R"},
                   {"xw", &own, 1, "w"},
                   {"r", &none, 0, "r"}};
    for (const auto &row : letters) {
        std::uint32_t mask = 0xffffffff;
        EXPECT_EQ(sec_translate_perms(row.text, row.set, &mask), row.refused == nullptr ? 0 : 36);
        EXPECT_EQ(recorded_error(), row.refused == nullptr ? failure{} : error_of(36, 133, {row.refused}));
        EXPECT_EQ(mask, row.mask) << row.text;
    }
    const struct {
        std::uint32_t mask;
        const sec_perm_set_t *set;
        std::string_view text;
        const char *refused = nullptr;
    } bits[] = {{0, &none, ""},
                {0x1fff, nullptr, "rwcxCqledvsao"},
                {0x80000001, &own, "\xe9r"},
                {0x80000000, nullptr, "", "80000000"},
                {0xffffffff, nullptr, "rwcxCqledvsao", "00002000"},
                {3, &own, "\xe9", "00000002"}};
    for (const auto &row : bits) {
        char text[qz::permission_text_size + 1] = {};
        EXPECT_EQ(sec_translate_bitmask(row.mask, row.set, text), row.refused == nullptr ? 0 : 36);
        EXPECT_EQ(recorded_error(), row.refused == nullptr ? failure{} : error_of(36, 164, {row.refused}));
        EXPECT_EQ(text, row.text);
    }
    std::uint32_t mask = 1; // the inner operation adds to what is there
    EXPECT_EQ(sec__translate_perms("w", &acl__default_perm_set, &mask), 0);
    EXPECT_EQ(mask, 3u);
    EXPECT_EQ(sec_translate_perms("r", nullptr, nullptr), 4);
    EXPECT_EQ(recorded_error(), missing("sec_translate_perms", "3"));
    EXPECT_EQ(sec_translate_bitmask(1, nullptr, nullptr), 4);
    EXPECT_EQ(recorded_error(), missing("sec_translate_mask", "3"));
}

// What an entry made of these parameters holds, or the error.
std::string made_of(int type, const char *mechanism, const char *identity) {
    auto *made = reinterpret_cast<sec_acle_t *>(0x10);
    const int result =
        sec_create_acle(static_cast<std::uint8_t>(type), 0x80000001, mechanism, identity, &made);
    const qz::owned_acle owner(made);
    const failure error = recorded_error();
    EXPECT_EQ(result, error.code);
    EXPECT_EQ(made == nullptr, result != 0);
    if (made == nullptr)
        return testing::PrintToString(error);
    EXPECT_EQ(std::tuple(int{made->type}, made->perm_mask), std::tuple(type, 0x80000001));
    return made->mechanism + "/"s + (made->identity == nullptr ? "none" : made->identity);
}

std::string refused(const char *position, const std::string &value) {
    return testing::PrintToString(error_of(4, 88, {"sec_create_acle", position, value}));
}

TEST(entries, are_made_from_sound_parameters) {
    const char mechanism17[] = "12345678901234567", empty[] = "", bare[] = "alice", no_host[] = "alice@";
    const char *const mechanism16 = mechanism17 + 1;
    const std::tuple<int, const char *, const char *, std::string> rows[] = {
        {1, nullptr, nullptr, "/none"},
        {2, mechanism17, "ignored", "/none"},
        {16, mechanism17, "a@::0", "/a@::0"},
        {4, mechanism16, "x", mechanism16 + "/x"s},
        {8, "UNIX", "a@::0", "UNIX/a@::0"},
        {4, "unixx", no_host, "unixx/alice@"},
        {4, "unix", "alice@0:0:0:0:0:FFFF:a00:1", "unix/alice@::ffff:10.0.0.1"},
        {4, "hba2", "@FE80:0::1", "hba2/@fe80::1"},
        {8, "hba2", "1111:2222:3333:4444:5555:6666:7777:08888",
         "hba2/1111:2222:3333:4444:5555:6666:7777:08888"},
        {8, "hba2", "1111:2222:3333:4444:5555:6666:7777:888F",
         "hba2/1111:2222:3333:4444:5555:6666:7777:888f"},
        {4, "unix", "a@b@::01", "unix/a@b@::01"},
        {4, "unix", "alice@10.0.0.1", "unix/alice@10.0.0.1"},
        {4, "unix", "alice@::01%eth0", "unix/alice@::01%eth0"},
        {8, "hba2", bare, "hba2/alice"},
        {8, "unix", "@0::0", "unix/@::"},
        {0, "unix", bare, refused("1", "0")},
        {3, mechanism17, nullptr, refused("1", "3")},
        {32, nullptr, nullptr, refused("1", "20")},
        {255, nullptr, nullptr, refused("1", "ff")},
        {4, nullptr, nullptr, refused("3", "0")},
        {8, empty, bare, refused("3", shown(empty))},
        {4, mechanism17, bare, refused("3", shown(mechanism17))},
        {4, "kdz", nullptr, refused("4", "0")},
        {16, nullptr, empty, refused("4", shown(empty))},
        {4, "unix", bare, refused("4", shown(bare))},
        {4, "hba2", no_host, refused("4", shown(no_host))},
        {8, "unix", no_host, refused("4", shown(no_host))},
    };
    for (const auto &[type, mechanism, identity, made] : rows)
        EXPECT_EQ(made_of(type, mechanism, identity), made);
    EXPECT_EQ(sec_create_acle(1, 0, nullptr, nullptr, nullptr), 4);
    EXPECT_EQ(recorded_error(), missing("sec_create_acle", "5"));
}

// The two texts of an entry, or the message.
std::string shown_for(const sec_acle_t &acle) {
    char *texts[2] = {const_cast<char *>("left over"), nullptr};
    const int result = sec_display_acle_id(&acle, &texts[0], &texts[1]);
    const qz::owned<char> owners[] = {qz::owned<char>(texts[0]), qz::owned<char>(texts[1])};
    const failure error = recorded_error();
    EXPECT_EQ(result, error.code);
    if (result != 0)
        return testing::PrintToString(error) +
               (texts[0] == nullptr && texts[1] == nullptr ? "" : " and texts");
    return (texts[0] == nullptr ? "none" : texts[0]) + "/"s + (texts[1] == nullptr ? "none" : texts[1]);
}

TEST(entries, show_what_their_type_has) {
    const std::string incomplete = testing::PrintToString(error_of(43, 95));
    const std::pair<sec_acle_t, std::string> rows[] = {
        {entry(1, "unix", "x", 0), "none/none"},
        {entry(2, "", nullptr, 0), "none/none"},
        {entry(8, "1234567890123456", "x@Y", 0), "1234567890123456/x@Y"},
        {entry(16, "unix", "staff", 0), "none/staff"},
        {entry(16, "", nullptr, 0), incomplete},
        {entry(4, "", "x", 0), incomplete},
        {entry(4, "unix", "", 0), incomplete},
        {entry(0, "unix", "x", 0), testing::PrintToString(error_of(43, 94, {"0"}))},
        {entry(132, "unix", "x", 0), testing::PrintToString(error_of(43, 94, {"132"}))},
    };
    for (const auto &[acle, texts] : rows)
        EXPECT_EQ(shown_for(acle), texts);
    char *out = nullptr;
    EXPECT_EQ(sec_display_acle_id(nullptr, nullptr, nullptr), 4);
    EXPECT_EQ(recorded_error(), missing("sec_display_acle_id", "1"));
    EXPECT_EQ(sec_display_acle_id(&rows[0].first, nullptr, nullptr), 4);
    EXPECT_EQ(recorded_error(), missing("sec_display_acle_id", "2"));
    EXPECT_EQ(sec_display_acle_id(&rows[0].first, &out, nullptr), 4);
    EXPECT_EQ(recorded_error(), missing("sec_display_acle_id", "3"));
}

TEST(entries, go_with_the_list_that_holds_them) {
    sec_release_aclelist(nullptr);
    sec_aclelist_t list = {5, nullptr}; // an array that is not there is not looked at
    sec_release_aclelist(&list);
    EXPECT_EQ(list.count, 5);
    list = {3, static_cast<sec_acle_t **>(std::calloc(3, sizeof(sec_acle_t *)))};
    ASSERT_EQ(sec_create_acle(1, 0, nullptr, nullptr, &list.acles[0]), 0);
    ASSERT_EQ(sec_create_acle(4, 0, "kdz", "x", &list.acles[2]), 0);
    sec_release_aclelist(&list);
    EXPECT_TRUE(list.count == 0 && list.acles == nullptr);
}

// A process opens its converters once, so that each code set needs one of its own. It ends with status 0 when all
// entries are made and shown as expected.
struct code_set {
    const char *claimed, *locale;
    struct answer {
        const char *mechanism, *identity;
        std::string made, shown;
    };
    std::vector<answer> answers;
};

void check(const code_set &set) {
    claimed_code_set = set.claimed;
    std::setlocale(LC_ALL, set.locale);
    for (const auto &[mechanism, identity, made, shown] : set.answers) {
        EXPECT_EQ(made_of(4, mechanism, identity), made);
        EXPECT_EQ(shown_for(entry(4, mechanism, identity, 0)), shown);
    }
    std::exit(testing::Test::HasFailure() ? 1 : 0);
}

TEST(entries_DeathTest, are_converted_between_the_code_set_and_utf8) {
    GTEST_FLAG_SET(death_test_style, "threadsafe"); // runs this test alone in a new process
    const std::string failed = testing::PrintToString(error_of(26, 130)),
                      unknown = testing::PrintToString(error_of(26, 129));
    const char *const grows = "abcdefghijklmno\xe9"; // beyond what an entry holds
    const code_set sets[] = {
        {nullptr,
         "C",
         {{"kdz", "plain", "kdz/plain", "kdz/plain"},
          {"kdz", "\xc3\xa9", failed, failed},
          {"k\xe9", "x", failed, failed}}},
        {nullptr,
         "C.UTF-8",
         {{"k\xc3\xa9", "\xf0\x9f\x98\x80", "k\xc3\xa9/\xf0\x9f\x98\x80", "k\xc3\xa9/\xf0\x9f\x98\x80"},
          {"kdz", "a\xc3", failed, failed}}},
        {"ISO-8859-1",
         "C",
         {{"k\xe9", "\xff", "k\xc3\xa9/\xc3\xbf", failed},
          {"abcdefghijklmn\xe9", "x", "abcdefghijklmn\xc3\xa9/x", failed},
          {grows, "x", refused("3", shown(grows)), failed},
          {"k\xc3\xa9", "\xc3\xbf", "k\xc3\x83\xc2\xa9/\xc3\x83\xc2\xbf", "k\xe9/\xff"},
          {"kdz", "\xe4\xb8\xad", "kdz/\xc3\xa4\xc2\xb8\xc2\xad", failed}}},
        {"no-such-code-set", "C", {{"kdz", "plain", unknown, unknown}}}};
    for (const code_set &set : sets)
        EXPECT_EXIT(check(set), testing::ExitedWithCode(0), "");
}

} // namespace
