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

const sec_perm_template_t own_templates[] = {
    {0x80000000, 'r', "", ""}, {1, '\xe9', "", ""}, {1, 'x', "", ""}};
const sec_perm_set_t own = {3, own_templates};
const sec_perm_set_t none = {0, nullptr};

TEST(permissions, turn_letters_into_bits_and_back) {
    const struct {
        const char *text;
        const sec_perm_set_t *set;
        std::uint32_t mask; // after a failure, what was found before it
        const char *refused = nullptr;
    } letters[] = {
        {nullptr, nullptr, 0},        {"", &none, 0},
        {"C", nullptr, 0x10},         {"c", nullptr, 4},
        {"rwr", nullptr, 3},          {"oasvdelqCxcwr", nullptr, 0x1fff},
        {"xr\xe9", &own, 0x80000001}, {"rR", nullptr, 1, "R"},
        {"r w", nullptr, 1, " "},     {"xw", &own, 1, "w"},
        {"r", &none, 0, "r"},
    };
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
    } bits[] = {
        {0, &none, ""},
        {0x1003, nullptr, "rwo"},
        {0x1fff, nullptr, "rwcxCqledvsao"},
        {0x80000001, &own, "\xe9r"},
        {0x2001, nullptr, "r", "00002000"},
        {0x80000000, nullptr, "", "80000000"},
        {0xffffffff, nullptr, "rwcxCqledvsao", "00002000"},
        {3, &own, "\xe9", "00000002"},
        {1, &none, "", "00000001"},
    };
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
    EXPECT_EQ(recorded_error(), error_of(4, 88, {"sec_translate_perms", "3", "0"}));
    EXPECT_EQ(sec_translate_bitmask(1, nullptr, nullptr), 4);
    EXPECT_EQ(recorded_error(), error_of(4, 88, {"sec_translate_mask", "3", "0"}));
}

const char mechanism17[] = "12345678901234567";
const char *const mechanism16 = mechanism17 + 1;
const char empty[] = "";
const char bare[] = "alice";
const char no_host[] = "alice@";

// What an entry made of these parameters holds; or the position and the value of the parameter that was
// refused; or code and message.
std::string made_of(int type, const char *mechanism, const char *identity) {
    auto *made = reinterpret_cast<sec_acle_t *>(0x10);
    const int result =
        sec_create_acle(static_cast<std::uint8_t>(type), 0x80000001, mechanism, identity, &made);
    const qz::owned_acle owner(made);
    const failure error = recorded_error();
    EXPECT_EQ(result, error.code);
    EXPECT_EQ(made == nullptr, result != 0);
    if (made == nullptr && error.id != 88)
        return std::to_string(result) + " " + std::to_string(error.id);
    if (made == nullptr) {
        for (const char *position : {"1", "3", "4"}) {
            for (const std::string &value :
                 {shown(mechanism), shown(identity), shown(nullptr),
                  shown(reinterpret_cast<char *>(static_cast<std::intptr_t>(type)))}) {
                if (error == error_of(4, 88, {"sec_create_acle", position, value}))
                    return position + " "s + value;
            }
        }
        return error.text;
    }
    EXPECT_EQ(std::tuple(int{made->type}, made->perm_mask), std::tuple(type, 0x80000001));
    return made->mechanism + "/"s + (made->identity == nullptr ? "none" : made->identity);
}

TEST(entries, are_made_from_sound_parameters) {
    const struct {
        int type;
        const char *mechanism;
        const char *identity;
        std::string made;
    } rows[] = {
        {1, nullptr, nullptr, "/none"},
        {2, mechanism17, "ignored", "/none"},
        {16, mechanism17, "Staff", "/Staff"},
        {16, nullptr, "a@::0", "/a@::0"},
        {4, mechanism16, "x", mechanism16 + "/x"s},
        {8, "UNIX", "a@::0", "UNIX/a@::0"},
        {4, "unixx", no_host, "unixx/alice@"},
        {4, "unix", "alice@::FFFF:0A00:0001", "unix/alice@::ffff:10.0.0.1"},
        {4, "unix", "alice@0:0:0:0:0:ffff:a00:1", "unix/alice@::ffff:10.0.0.1"},
        {4, "hba2", "@FE80:0::1", "hba2/@fe80::1"},
        {4, "unix", "a@b@::01", "unix/a@b@::01"},
        {4, "unix", "alice@10.0.0.1", "unix/alice@10.0.0.1"},
        {4, "unix", "alice@Host.Example", "unix/alice@Host.Example"},
        {4, "unix", "alice@::01%eth0", "unix/alice@::01%eth0"},
        {8, "hba2", "::FFFF:10.0.0.1", "hba2/::ffff:10.0.0.1"},
        {8, "hba2", bare, "hba2/alice"},
        {8, "unix", "@0::0", "unix/@::"},
        {0, "unix", bare, "1 0"},
        {3, mechanism17, nullptr, "1 3"},
        {32, nullptr, nullptr, "1 20"},
        {255, nullptr, nullptr, "1 ff"},
        {4, nullptr, nullptr, "3 0"},
        {8, empty, bare, "3 "s + shown(empty)},
        {4, mechanism17, bare, "3 "s + shown(mechanism17)},
        {4, "kdz", nullptr, "4 0"},
        {16, nullptr, empty, "4 "s + shown(empty)},
        {4, "unix", bare, "4 "s + shown(bare)},
        {4, "hba2", no_host, "4 "s + shown(no_host)},
        {8, "unix", no_host, "4 "s + shown(no_host)},
    };
    for (const auto &row : rows)
        EXPECT_EQ(made_of(row.type, row.mechanism, row.identity), row.made);
    EXPECT_EQ(sec_create_acle(1, 0, nullptr, nullptr, nullptr), 4);
    EXPECT_EQ(recorded_error(), error_of(4, 88, {"sec_create_acle", "5", "0"}));
}

// The two texts of an entry, or the failure.
std::string shown_for(const sec_acle_t &acle) {
    char *texts[2] = {const_cast<char *>("left over"), nullptr};
    const int result = sec_display_acle_id(&acle, &texts[0], &texts[1]);
    const qz::owned<char> owners[] = {qz::owned<char>(texts[0]), qz::owned<char>(texts[1])};
    const failure error = recorded_error();
    EXPECT_EQ(result, error.code);
    const auto text = [](const char *given) { return given == nullptr ? "none"s : given; };
    std::string shown = text(texts[0]) + "/" + text(texts[1]);
    if (result == 0)
        return shown;
    EXPECT_EQ(shown, "none/none");
    return std::to_string(error.code) + " " + std::to_string(error.id);
}

TEST(entries, show_what_their_type_has) {
    const std::pair<sec_acle_t, const char *> rows[] = {
        {entry(1, "unix", "x", 0), "none/none"},
        {entry(2, "", nullptr, 0), "none/none"},
        {entry(4, "unix", "Alice@Host", 0), "unix/Alice@Host"},
        {entry(8, "1234567890123456", "x", 0), "1234567890123456/x"},
        {entry(16, "unix", "staff", 0), "none/staff"},
        {entry(16, "", "", 0), "43 95"},
        {entry(16, "", nullptr, 0), "43 95"},
        {entry(4, "", "x", 0), "43 95"},
        {entry(4, "unix", "", 0), "43 95"},
        {entry(8, "unix", nullptr, 0), "43 95"},
        {entry(0, "unix", "x", 0), "43 94"},
        {entry(132, "unix", "x", 0), "43 94"},
    };
    for (const auto &[acle, texts] : rows)
        EXPECT_EQ(shown_for(acle), texts);
    char *out = nullptr;
    const auto missing = [](const char *position) {
        return error_of(4, 88, {"sec_display_acle_id", position, "0"});
    };
    EXPECT_EQ(sec_display_acle_id(nullptr, nullptr, nullptr), 4);
    EXPECT_EQ(recorded_error(), missing("1"));
    EXPECT_EQ(sec_display_acle_id(&rows[0].first, nullptr, nullptr), 4);
    EXPECT_EQ(recorded_error(), missing("2"));
    EXPECT_EQ(sec_display_acle_id(&rows[0].first, &out, nullptr), 4);
    EXPECT_EQ(recorded_error(), missing("3"));
}

TEST(entries, go_with_the_list_that_holds_them) {
    sec_release_aclelist(nullptr);
    sec_aclelist_t list = {};
    sec_release_aclelist(&list);
    list.count = 5; // an array that is not there is not looked at
    sec_release_aclelist(&list);
    EXPECT_EQ(list.count, 5);

    list = {3, static_cast<sec_acle_t **>(std::calloc(3, sizeof(sec_acle_t *)))};
    ASSERT_EQ(sec_create_acle(1, 0, nullptr, nullptr, &list.acles[0]), 0);
    ASSERT_EQ(sec_create_acle(4, 0, "kdz", "x", &list.acles[2]), 0);
    sec_release_aclelist(&list);
    EXPECT_EQ(list.count, 0);
    EXPECT_EQ(list.acles, nullptr);
}

// ---- Code sets. A process opens its converters once, so that each code set needs one of its own. ----

std::string shown_of(const char *mechanism, const char *identity) {
    return shown_for(entry(4, mechanism, identity, 0));
}

// Ends the process, with status 0 when all answers are the expected ones.
void check(const std::vector<std::pair<std::string, std::string>> &answers) {
    for (const auto &[found, wanted] : answers)
        EXPECT_EQ(found, wanted);
    std::exit(testing::Test::HasFailure() ? 1 : 0);
}

void check_c() {
    std::setlocale(LC_ALL, "C");
    check({{made_of(4, "kdz", "plain"), "kdz/plain"},
           {made_of(4, "kdz", "\xc3\xa9"), "26 130"},
           {made_of(4, "k\xe9", "x"), "26 130"},
           {shown_of("kdz", "plain"), "kdz/plain"},
           {shown_of("kdz", "\xc3\xa9"), "26 130"},
           {shown_of("\xc3\xa9", "x"), "26 130"}});
}

void check_utf8() {
    std::setlocale(LC_ALL, "C.UTF-8");
    check({{made_of(4, "k\xc3\xa9", "\xe4\xb8\xad"), "k\xc3\xa9/\xe4\xb8\xad"},
           {made_of(4, "kdz", "\xc3"), "26 130"},
           {shown_of("k\xc3\xa9", "\xf0\x9f\x98\x80"), "k\xc3\xa9/\xf0\x9f\x98\x80"},
           {shown_of("kdz", "a\x80"), "26 130"}});
}

void check_latin() {
    claimed_code_set = "ISO-8859-1";
    const char long_one[] = "abcdefghijklmno\xe9";
    check({{made_of(4, "k\xe9", "\xff"), "k\xc3\xa9/\xc3\xbf"},
           {made_of(4, "abcdefghijklmn\xe9", "x"), "abcdefghijklmn\xc3\xa9/x"},
           {made_of(4, long_one, "x"), "3 "s + shown(long_one)}, // grows beyond what an entry holds
           {shown_of("\xc3\xa9", "\xc3\xbf"), "\xe9/\xff"},
           {shown_of("kdz", "\xe4\xb8\xad"), "26 130"}});
}

void check_unknown() {
    claimed_code_set = "no-such-code-set";
    check({{made_of(4, "kdz", "plain"), "26 129"}, {shown_of("kdz", "plain"), "26 129"}});
}

TEST(entries_DeathTest, are_converted_between_the_code_set_and_utf8) {
    GTEST_FLAG_SET(death_test_style, "threadsafe"); // runs this test alone in a new process
    for (void (*const code_set)() : {check_c, check_utf8, check_latin, check_unknown})
        EXPECT_EXIT(code_set(), testing::ExitedWithCode(0), "");
}

} // namespace
