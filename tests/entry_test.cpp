// Permissions in both directions, and entries: making, displaying and releasing them, also in other code sets.
#include "qzacl_acl/entry.h"
#include "qzacl_acl/permission.h"
#include "support.h"

#include <clocale>
#include <dlfcn.h>
#include <iostream>
#include <langinfo.h>

using namespace support;

// The code set that the process claims to use; null: that of its locale.
static const char *claimed_code_set = nullptr;

extern "C" char *nl_langinfo(nl_item item) noexcept {
    static const auto real = reinterpret_cast<decltype(&nl_langinfo)>(dlsym(RTLD_NEXT, "nl_langinfo"));
    return item == CODESET && claimed_code_set != nullptr ? const_cast<char *>(claimed_code_set) : real(item);
}

namespace {

const sec_perm_template_t own_templates[] = {{0x80000000, 'r', "", ""}, {1, '\xe9', "", ""}, {1, 'x', "", ""}};
const sec_perm_set_t own = {3, own_templates};
const sec_perm_set_t none = {0, nullptr};

failure no_letter(const char *letter) { return error_of(36, 133, {letter}); }
failure no_bit(const char *bit) { return error_of(36, 164, {bit}); }

TEST(permissions, turn_letters_into_bits) {
    const struct {
        const char *text;
        const sec_perm_set_t *set;
        std::uint32_t mask;
        failure error;
    } rows[] = {
        {nullptr, nullptr, 0, {}},
        {"", nullptr, 0, {}},
        {"C", nullptr, 0x10, {}},
        {"c", nullptr, 4, {}},
        {"rwr", nullptr, 3, {}},
        {"oasvdelqCxcwr", nullptr, 0x1fff, {}},
        {"rR", nullptr, 1, no_letter("R")},
        {"r w", nullptr, 1, no_letter(" ")},
        {"xr\xe9", &own, 0x80000001, {}},
        {"xw", &own, 1, no_letter("w")},
        {"r", &none, 0, no_letter("r")},
        {"", &none, 0, {}},
    };
    for (const auto &row : rows) {
        std::uint32_t mask = 0xffffffff;
        EXPECT_EQ(sec_translate_perms(row.text, row.set, &mask), row.error.code);
        EXPECT_EQ(mask, row.mask) << row.text;
        EXPECT_EQ(recorded_error(), row.error);
    }
    std::uint32_t mask = 1; // the inner operation adds to what is there
    EXPECT_EQ(sec__translate_perms("w", &acl__default_perm_set, &mask), 0);
    EXPECT_EQ(mask, 3u);
    EXPECT_EQ(sec_translate_perms("r", nullptr, nullptr), 4);
    EXPECT_EQ(recorded_error(), error_of(4, 88, {"sec_translate_perms", "3", "0"}));
}

TEST(permissions, turn_bits_into_letters) {
    const struct {
        std::uint32_t mask;
        const sec_perm_set_t *set;
        std::string_view text; // after a failure, what was written before it
        failure error;
    } rows[] = {
        {0, nullptr, "", {}},
        {0, &none, "", {}},
        {0x1003, nullptr, "rwo", {}},
        {0x1fff, nullptr, "rwcxCqledvsao", {}},
        {0x80000001, &own, "\xe9r", {}},
        {0x2001, nullptr, "r", no_bit("00002000")},
        {0x80000000, nullptr, "", no_bit("80000000")},
        {0xffffffff, nullptr, "rwcxCqledvsao", no_bit("00002000")},
        {3, &own, "\xe9", no_bit("00000002")},
        {1, &none, "", no_bit("00000001")},
    };
    for (const auto &row : rows) {
        char text[qz::permission_text_size];
        EXPECT_EQ(sec_translate_bitmask(row.mask, row.set, text), row.error.code);
        EXPECT_EQ(std::string_view(text, row.text.size()), row.text);
        EXPECT_EQ(recorded_error(), row.error);
        if (row.error.code == 0) {
            EXPECT_EQ(text[row.text.size()], '\0');
        }
    }
    EXPECT_EQ(sec_translate_bitmask(1, nullptr, nullptr), 4);
    EXPECT_EQ(recorded_error(), error_of(4, 88, {"sec_translate_mask", "3", "0"}));
}

const char mechanism17[] = "12345678901234567";
const char *const mechanism16 = mechanism17 + 1;
const char empty[] = "";
const char bare[] = "alice";
const char no_host[] = "alice@";

failure bad_parameter(const char *position, const std::string &value) {
    return error_of(4, 88, {"sec_create_acle", position, value});
}

TEST(entries, are_made_from_sound_parameters_only) {
    const struct {
        int type;
        const char *mechanism;
        const char *identity;
        const char *made_mechanism; // null: no entry
        const char *made_identity;  // null: none
        failure error;
    } rows[] = {
        {1, nullptr, nullptr, "", nullptr, {}},
        {2, nullptr, nullptr, "", nullptr, {}},
        {2, mechanism17, "ignored", "", nullptr, {}},
        {16, mechanism17, "Staff", "", "Staff", {}},
        {16, nullptr, "a@::0", "", "a@::0", {}},
        {4, mechanism16, "x", mechanism16, "x", {}},
        {8, "UNIX", "a@::0", "UNIX", "a@::0", {}},
        {4, "unixx", no_host, "unixx", no_host, {}},
        {4, "unix", "alice@::FFFF:0A00:0001", "unix", "alice@::ffff:10.0.0.1", {}},
        {4, "unix", "alice@0:0:0:0:0:ffff:a00:1", "unix", "alice@::ffff:10.0.0.1", {}},
        {4, "hba2", "@FE80:0::1", "hba2", "@fe80::1", {}},
        {4, "unix", "a@b@::1", "unix", "a@b@::1", {}},
        {4, "unix", "alice@10.0.0.1", "unix", "alice@10.0.0.1", {}},
        {4, "unix", "alice@Host.Example", "unix", "alice@Host.Example", {}},
        {4, "unix", "alice@::1%eth0", "unix", "alice@::1%eth0", {}},
        {8, "hba2", "::FFFF:10.0.0.1", "hba2", "::ffff:10.0.0.1", {}},
        {8, "hba2", bare, "hba2", bare, {}},
        {8, "unix", "@0::0", "unix", "@::", {}},
        {0, "unix", bare, nullptr, nullptr, bad_parameter("1", "0")},
        {3, "unix", bare, nullptr, nullptr, bad_parameter("1", "3")},
        {32, nullptr, nullptr, nullptr, nullptr, bad_parameter("1", "20")},
        {255, nullptr, nullptr, nullptr, nullptr, bad_parameter("1", "ff")},
        {4, nullptr, nullptr, nullptr, nullptr, bad_parameter("3", "0")},
        {8, empty, bare, nullptr, nullptr, bad_parameter("3", shown(empty))},
        {4, mechanism17, bare, nullptr, nullptr, bad_parameter("3", shown(mechanism17))},
        {4, "kdz", nullptr, nullptr, nullptr, bad_parameter("4", "0")},
        {16, nullptr, empty, nullptr, nullptr, bad_parameter("4", shown(empty))},
        {4, "unix", bare, nullptr, nullptr, bad_parameter("4", shown(bare))},
        {4, "hba2", no_host, nullptr, nullptr, bad_parameter("4", shown(no_host))},
        {8, "unix", no_host, nullptr, nullptr, bad_parameter("4", shown(no_host))},
    };
    for (const auto &row : rows) {
        SCOPED_TRACE(testing::Message() << row.type << ' ' << row.identity);
        const auto type = static_cast<std::uint8_t>(row.type);
        auto *made = reinterpret_cast<sec_acle_t *>(0x10);
        EXPECT_EQ(sec_create_acle(type, 0x80000001, row.mechanism, row.identity, &made), row.error.code);
        EXPECT_EQ(recorded_error(), row.error);
        ASSERT_EQ(made == nullptr, row.made_mechanism == nullptr);
        if (made != nullptr) {
            EXPECT_EQ(made->type, row.type);
            EXPECT_EQ(made->perm_mask, 0x80000001);
            EXPECT_STREQ(made->mechanism, row.made_mechanism);
            EXPECT_STREQ(made->identity, row.made_identity);
            sec_release_acle(made);
        }
        // Without a place for the entry the other parameters are still looked at first.
        if (row.error.code == 0) {
            EXPECT_EQ(sec_create_acle(type, 0, row.mechanism, row.identity, nullptr), 4);
            EXPECT_EQ(recorded_error(), bad_parameter("5", "0"));
        }
    }
}

TEST(entries, clear_the_recorded_error) {
    sec_acle_t *made = nullptr;
    EXPECT_EQ(sec_create_acle(9, 0, nullptr, nullptr, &made), 4);
    EXPECT_EQ(sec_create_acle(1, 0, nullptr, nullptr, &made), 0);
    EXPECT_EQ(recorded_error(), failure{});
    sec_release_acle(made);
    sec_release_acle(nullptr);
}

TEST(entries, show_what_their_type_has) {
    const failure incomplete = error_of(43, 95);
    const struct {
        sec_acle_t acle;
        const char *mechanism;
        const char *identity;
        failure error;
    } rows[] = {
        {entry(1, "unix", "x", 0), nullptr, nullptr, {}},
        {entry(2, "", nullptr, 0), nullptr, nullptr, {}},
        {entry(4, "unix", "Alice@Host", 0), "unix", "Alice@Host", {}},
        {entry(8, "1234567890123456", "x", 0), "1234567890123456", "x", {}},
        {entry(16, "unix", "staff", 0), nullptr, "staff", {}},
        {entry(16, "", "", 0), nullptr, nullptr, incomplete},
        {entry(16, "", nullptr, 0), nullptr, nullptr, incomplete},
        {entry(4, "", "x", 0), nullptr, nullptr, incomplete},
        {entry(4, "unix", "", 0), nullptr, nullptr, incomplete},
        {entry(8, "unix", nullptr, 0), nullptr, nullptr, incomplete},
        {entry(0, "unix", "x", 0), nullptr, nullptr, error_of(43, 94, {"0"})},
        {entry(132, "unix", "x", 0), nullptr, nullptr, error_of(43, 94, {"132"})},
    };
    for (const auto &row : rows) {
        char *mechanism = const_cast<char *>("left");
        char *identity = mechanism;
        EXPECT_EQ(sec_display_acle_id(&row.acle, &mechanism, &identity), row.error.code);
        EXPECT_EQ(recorded_error(), row.error);
        EXPECT_STREQ(mechanism, row.mechanism);
        EXPECT_STREQ(identity, row.identity);
        std::free(mechanism);
        std::free(identity);
    }
    char *out = nullptr;
    const sec_acle_t *const any = &rows[0].acle;
    const auto missing = [](const char *position) {
        return error_of(4, 88, {"sec_display_acle_id", position, "0"});
    };
    EXPECT_EQ(sec_display_acle_id(nullptr, nullptr, nullptr), 4);
    EXPECT_EQ(recorded_error(), missing("1"));
    EXPECT_EQ(sec_display_acle_id(any, nullptr, nullptr), 4);
    EXPECT_EQ(recorded_error(), missing("2"));
    EXPECT_EQ(sec_display_acle_id(any, &out, nullptr), 4);
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

const char nine_letters[] = "\xe9\xe9\xe9\xe9\xe9\xe9\xe9\xe9\xe9";

// The bytes of an identity, or the failure, on the way into an entry and out of one.
std::string made_from(const char *mechanism, const char *identity) {
    sec_acle_t *made = nullptr;
    const int result = sec_create_acle(4, 0, mechanism, identity, &made);
    const qz::owned_acle owner(made);
    const failure error = recorded_error();
    if (made != nullptr)
        return made->mechanism + "/"s + made->identity;
    return result == error.code ? std::to_string(result) + "/" + std::to_string(error.id) : "another code";
}

std::string shown_for(const char *mechanism, const char *identity) {
    const sec_acle_t acle = entry(4, mechanism, identity, 0);
    char *texts[2];
    const int result = sec_display_acle_id(&acle, &texts[0], &texts[1]);
    const failure error = recorded_error();
    std::string shown = std::to_string(result) + "/" + std::to_string(error.id);
    if (result != 0)
        return texts[0] == nullptr && texts[1] == nullptr ? shown : "left-overs";
    shown = texts[0] + "/"s + texts[1];
    std::free(texts[0]);
    std::free(texts[1]);
    return shown;
}

// Ends the process, with status 0 when all answers are the expected ones.
[[noreturn]] void check(const std::vector<std::pair<std::string, std::string>> &answers) {
    int status = 0;
    for (const auto &[found, wanted] : answers) {
        if (found != wanted) {
            std::cerr << "found <" << found << ">, wanted <" << wanted << ">\n";
            status = 1;
        }
    }
    std::exit(status);
}

void check_c() {
    std::setlocale(LC_ALL, "C");
    check({
        {made_from("kdz", "plain"), "kdz/plain"},
        {made_from("kdz", "\xc3\xa9"), "26/130"},
        {made_from("k\xe9", "x"), "26/130"},
        {shown_for("kdz", "plain"), "kdz/plain"},
        {shown_for("kdz", "\xc3\xa9"), "26/130"},
        {shown_for("\xc3\xa9", "x"), "26/130"},
    });
}

void check_utf8() {
    std::setlocale(LC_ALL, "C.UTF-8");
    check({
        {made_from("k\xc3\xa9", "\xe4\xb8\xad"), "k\xc3\xa9/\xe4\xb8\xad"},
        {made_from("kdz", "\xc3"), "26/130"},
        {made_from("kdz", "\xff"), "26/130"},
        {shown_for("k\xc3\xa9", "\xf0\x9f\x98\x80"), "k\xc3\xa9/\xf0\x9f\x98\x80"},
        {shown_for("kdz", "a\x80"), "26/130"},
    });
}

void check_latin() {
    claimed_code_set = "ISO-8859-1";
    check({
        {made_from(nine_letters + 1, "\xff"), "\xc3\xa9\xc3\xa9\xc3\xa9\xc3\xa9\xc3\xa9\xc3\xa9\xc3\xa9\xc3\xa9/\xc3\xbf"},
        {made_from(nine_letters, "x"), "4/88"}, // grows beyond what an entry holds
        {shown_for("\xc3\xa9", "\xc3\xbf"), "\xe9/\xff"},
        {shown_for("kdz", "\xe4\xb8\xad"), "26/130"},
    });
}

void check_unknown() {
    claimed_code_set = "no-such-code-set";
    check({{made_from("kdz", "plain"), "26/129"}, {shown_for("kdz", "plain"), "26/129"}});
}

TEST(entries_DeathTest, are_converted_between_the_code_set_and_utf8) {
    GTEST_FLAG_SET(death_test_style, "threadsafe"); // runs this test alone in a new process
    for (void (*const code_set)() : {check_c, check_utf8, check_latin, check_unknown})
        EXPECT_EXIT(code_set(), testing::ExitedWithCode(0), "");
}

} // namespace
