// Tests of validation and byte order, and of how every operation bears bytes that were cut short or changed.
#include "service_support.h"

#include "qzacl_acl/buffer.h"
#include "qzacl_acl/validate.h"

namespace {

using namespace support;

const std::string user_xyz = named(3, "xyz");

// A user sub-ACL with a mechanism field as given, and one entry.
std::string with_mechanism(int type, std::string_view field) {
    return packed_subacl(type, field, 1, user_xyz);
}

// An entry whose length field says something else than its identity field takes.
std::string entry_of_length(std::size_t length, std::string_view field) {
    return "\1\3\0\0\0"s + number(length, 2) + std::string(field);
}

std::string of_length(std::size_t length, const std::string &subacl) {
    return number(length, 4) + subacl.substr(4);
}

TEST(validate, checks_every_rule_in_its_order) {
    const std::string user = with_mechanism(4, text_field("abcd"));
    const std::string group = packed_subacl(16, "", 1, user_xyz);
    const std::string other = packed_subacl(2, "", 1, packed_entry(1, ""));
    const std::string bad_version = packed_subacl(2, "", 1, with(packed_entry(1, ""), 0, 2));
    const failure structural = located(42, 97);
    const struct {
        std::string name, bytes;
        failure error;
    } rows[] = {
        {"no sub-ACL", packed_acl(0, ""), no_error},
        {"bytes behind the end", packed_acl(0, "behind"), no_error},
        {"the example", example, no_error},
        {"all types", rich, no_error},
        {"types as often as they like", packed_acl(3, group + group + user), no_error},
        {"any order, mask and repetition", one(packed_subacl(16, "", 2, named(~0u, "b") + user_xyz)),
         no_error},
        {"a group of many", one(packed_subacl(16, "", 3, user_xyz + user_xyz + user_xyz)), no_error},
        {"an empty identity", one(packed_subacl(16, "", 1, named(0, ""))), no_error},
        {"no entries", packed_acl(2, packed_subacl(1, "", 0, "") + of_mechanism(8, "m", 0, "")), no_error},
        {"a mechanism of 254 bytes", one(with_mechanism(8, text_field(std::string(254, 'm')))), no_error},
        {"a last length that is too short", one(of_length(25, user)), no_error},
        {"a last length that is too long", one(of_length(~0u, user)), no_error},

        {"4 bytes", "\x85\1\2\0"s, located(42, 106, {"4"})},
        {"3 bytes", "\x85\1\2"s, located(42, 106, {"3"})},
        {"a sub-ACL too many", packed_acl(2, user), structural},
        {"a length that is too short", packed_acl(2, of_length(25, user) + other), structural},
        {"a length that is too long", packed_acl(2, of_length(27, user) + other), structural},
        {"a header cut short", one(user.substr(0, 9)), structural},
        {"a mechanism cut short", one(user.substr(0, 14)), structural},
        {"an entry cut short", one(user.substr(0, 21)), structural},
        {"an identity cut short", one(user.substr(0, 25)), structural},
        {"an entry too many", one(of_mechanism(4, "m", 2, user_xyz)), structural},
        {"entries beyond number", one(of_mechanism(4, "m", ~0u, user_xyz)), structural},

        {"type 0", one(packed_subacl(0, "", 9, "")), located(42, 107, {"0"})},
        {"type 3", one(packed_subacl(3, "", 0, "")), located(42, 107, {"3"})},
        {"type 32", one(packed_subacl(32, "m", 0, "")), located(42, 107, {"32"})},
        {"type 132", one(packed_subacl(132, "", 0, "")), located(42, 107, {"132"})},
        {"a group's mechanism", one(with_mechanism(16, "abcde")), located(42, 108, {"16"})},
        {"an unauthenticated mechanism", one(packed_subacl(1, "m", 2, "")), located(42, 108, {"1"})},
        {"two unauthenticated", one(packed_subacl(1, "", 2, "")), located(42, 109)},
        {"two of any other", one(packed_subacl(2, "", 2, packed_entry(1, "") + packed_entry(1, ""))),
         located(42, 109)},
        {"no mechanism", one(with_mechanism(4, "")), located(42, 110, {"0"})},
        {"an empty mechanism", one(with_mechanism(8, "\0"s)), located(42, 110, {"1"})},
        {"a mechanism that ends early", one(with_mechanism(4, "ab\0\0"s)), located(42, 111, {"ab"})},
        {"a mechanism that does not end", one(with_mechanism(4, "abcd")), located(42, 111, {"abcd\1\3"})},

        {"version 0", one(of_mechanism(4, "m", 1, with(user_xyz, 0, 0))), located(43, 112, {"0"})},
        {"version 2", one(of_mechanism(4, "m", 1, with(user_xyz, 0, 2))), located(43, 112, {"2"})},
        {"any other with an identity", one(packed_subacl(2, "", 1, user_xyz)), located(43, 113)},
        {"an identity shorter than its length", one(of_mechanism(4, "m", 1, entry_of_length(5, "xyz\0\0"s))),
         located(43, 114)},
        {"an identity longer than its length", one(packed_subacl(16, "", 1, entry_of_length(3, "xyz\0"s))),
         located(43, 114)},
        {"no identity field", one(of_mechanism(8, "m", 1, packed_entry(1, ""))), located(43, 114)},
        {"a faulty entry before another",
         one(packed_subacl(16, "", 2, with(user_xyz, 0, 7) + entry_of_length(3, "xyz\0"s))),
         located(43, 112, {"7"})},
        // After a faulty entry the walk stands at that entry, where no further sub-ACL starts.
        {"a faulty entry before a sub-ACL", packed_acl(2, bad_version + other), structural},
        {"a faulty entry where a sub-ACL starts",
         packed_acl(2, of_length(10, packed_subacl(2, "", 1, "")) + other), located(43, 112, {"17"})},
    };
    for (const auto &[name, bytes, error] : rows) {
        const guarded memory(bytes);
        sec_acl_buffer_t acl = {static_cast<std::int32_t>(bytes.size()), memory.data()};
        EXPECT_EQ(after(sec__check_acl_buffer(&acl)), error) << name;
        EXPECT_EQ(after(sec_convert_acl_to_host(1, &acl)), error) << name;
        EXPECT_EQ(std::string(memory.data(), memory.size()), bytes) << name;
        EXPECT_EQ(sec_convert_acl_to_host(0, &acl), 0) << name; // nothing to convert
    }
    sec_acl_buffer_t negative = {-7, const_cast<char *>(rich.data())};
    EXPECT_EQ(after(sec__check_acl_buffer(&negative)), located(42, 106, {"-7"}));
}

TEST(validate, converts_the_other_byte_order) {
    for (const int order : {0, 1, 3, 255}) {
        std::string bytes = "\x85\1\1\0\1\0\0\0\x1a\4\0\0\0\1\5abcd\0\1\0\0\0\3\0\4xyz\0"s;
        bytes[2] = static_cast<char>(order);
        for (const int check : {0, 1}) {
            buffer held(bytes);
            EXPECT_EQ(sec_convert_acl_to_host(check, &held.acl), 0);
            EXPECT_EQ(held.bytes(), "\x85\1\2\1\0\x1a\0\0\0\4\1\0\0\0\5abcd\0\1\3\0\0\0\4\0xyz\0"s);
        }
    }
    const std::string unsound = packed_acl(2, packed_subacl(99, "mm", 1, with(packed_entry(1, "id"), 0, 9)) +
                                                  packed_subacl(1, "", 0, ""));
    for (const std::string &bytes : {rich, packed_acl(0, ""), packed_acl(0, "behind"), unsound}) {
        buffer held(foreign(bytes));
        EXPECT_EQ(sec_convert_acl_to_host(1, &held.acl), 0) << recorded_error();
        EXPECT_EQ(held.bytes(), bytes); // not checked by the same call
    }
}

TEST(validate, refuses_what_cannot_be_converted) {
    const std::string last = packed_subacl(1, "", 0, "");
    const struct {
        std::string bytes;
        failure error;
    } rows[] = {
        {"\x84\1\1\0\0"s, error_of(42, 96)},
        {"\x85\2\2\0\0"s, error_of(42, 96)},
        {"\x84\1"s, error_of(42, 96)},
        {"\x85\2"s, error_of(42, 96)},
        {"\x85\1"s, located(42, 106, {"2"})},
        {"\x85\1\1\0"s, located(42, 97)},
        {with(foreign(packed_acl(2, last + last)), 8, 11), located(42, 97)},
        {foreign(rich).substr(0, rich.size() - 1), located(42, 97)},
        {with(foreign(rich), 4, 7), located(42, 97)},
    };
    for (const auto &[bytes, error] : rows) {
        buffer held(bytes);
        EXPECT_EQ(after(sec_convert_acl_to_host(1, &held.acl)), error);
        EXPECT_EQ(held.bytes()[0], bytes[0]);
        EXPECT_EQ(held.bytes().substr(2, 1), bytes.substr(2, 1)) << error; // only success marks the order
    }
    sec_acl_buffer_t none = {0, const_cast<char *>(rich.data())};
    EXPECT_EQ(after(sec_convert_acl_to_host(0, &none)), error_of(42, 96));
    none = {5, nullptr};
    EXPECT_EQ(after(sec_convert_acl_to_host(0, &none)), error_of(42, 96));
    EXPECT_EQ(after(sec_convert_acl_to_host(1, nullptr)), bad_parameter("sec_convert_acl_to_host", 2, "0"));
}

TEST(list, refuses_what_it_cannot_list) {
    const std::string good = packed_subacl(2, "", 1, packed_entry(1, ""));
    const std::string twice = packed_subacl(1, "", 2, packed_entry(1, "") + packed_entry(2, ""));
    const std::string unnamed = with_mechanism(4, text_field("seventeen-bytes-x"));
    const struct {
        std::string bytes;
        failure error;
    } rows[] = {
        {packed_acl(3, good + good + twice), error_of(42, 98)},
        {packed_acl(2, good + unnamed), located(42, 110, {"18"})},
        {packed_acl(2, good), located(42, 97)},
        {packed_acl(3, of_length(0, good)), located(42, 97)}, // would be listed three times
        {packed_acl(2, good + packed_subacl(16, "", 1, packed_entry(1, "x"))), located(42, 97)},
        {"\x85\1"s, located(42, 97)},
        {"\x85\2\2\0\0"s, error_of(42, 96)},
        {"\x84\1\2\0\0"s, error_of(42, 96)},
        {"\x85"s, error_of(42, 96)},
    };
    for (const auto &[bytes, error] : rows) {
        const buffer held(bytes);
        sec_aclelist_t list = {7, nullptr};
        EXPECT_EQ(after(sec_list_acl(&held.acl, &list)), error);
        EXPECT_EQ(list.count, error.id == 96 ? 7 : 0) << error; // touched once the first bytes are right
        EXPECT_EQ(list.acles, nullptr);
    }
    const buffer held(rich);
    sec_aclelist_t list = {7, nullptr};
    const sec_acl_buffer_t empty = {}, no_length = {0, held.acl.data};
    EXPECT_EQ(after(sec_list_acl(&no_length, &list)), error_of(42, 96));
    const std::string long_name = "seventeen-bytes-x";
    const struct {
        const sec_acl_buffer_t *acl;
        int type;
        const char *mechanism;
        sec_aclelist_t *list;
        failure error;
    } calls[] = {
        {nullptr, 0, "", nullptr, bad_parameter("sec_list_acl_by_type", 1, "0")},
        {&no_length, 0, "", nullptr, bad_parameter("sec_list_acl_by_type", 2, "0")},
        {&no_length, 0x84, "", nullptr, bad_parameter("sec_list_acl_by_type", 2, "84")},
        {&no_length, 4, long_name.c_str(), nullptr,
         bad_parameter("sec_list_acl_by_type", 3, shown(long_name.c_str()))},
        {&no_length, 16, long_name.c_str(), nullptr, bad_parameter("sec_list_acl_by_type", 4, "0")},
        {&no_length, 1, "", &list, error_of(42, 96)},
    };
    for (const auto &[acl, type, mechanism, out, error] : calls) {
        EXPECT_EQ(after(sec_list_acl_by_type(acl, static_cast<std::uint8_t>(type), mechanism, out)), error);
    }
    EXPECT_EQ(list.count, 7);
    const char *const blank = "";
    EXPECT_EQ(after(sec_list_acl_by_type(&held.acl, 8, blank, &list)),
              bad_parameter("sec_list_acl_by_type", 3, shown(blank)));
    EXPECT_EQ(after(sec_list_acl(nullptr, nullptr)), bad_parameter("sec_list_acl", 1, "0"));
    EXPECT_EQ(after(sec_list_acl(&held.acl, nullptr)), bad_parameter("sec_list_acl", 2, "0"));
    EXPECT_EQ(sec_list_acl(&empty, &list), 0);
    EXPECT_EQ(list.count, 0);
    EXPECT_EQ(sec_list_acl_by_type(&empty, 4, nullptr, &list), 0);
    EXPECT_EQ(all_entries(held.acl).size(), 9u);
}

int accept_anything(const char *, const char *held) { return held[0] == '\0' ? 0 : 1; }

// Every operation on the same bytes: none may look behind them, run for ever, or fail otherwise than it may.
void use_everywhere(const std::string &bytes, const std::string &shown, bool dumps) {
    const guarded memory(bytes);
    sec_acl_buffer_t acl = {static_cast<std::int32_t>(bytes.size()), memory.data()};
    const auto is_one_of = [&](int result, std::initializer_list<int> codes, const char *operation) {
        EXPECT_TRUE(std::find(codes.begin(), codes.end(), result) != codes.end())
            << operation << " of " << shown << " returned " << result;
        EXPECT_EQ(recorded_error().code, result) << operation << " of " << shown;
    };
    const bool is_host_order = bytes.size() > 2 && bytes[2] == 2;
    if (is_host_order)
        is_one_of(sec__check_acl_buffer(&acl), {0, 42, 43}, "check");
    sec_aclelist_t list = {};
    is_one_of(sec_list_acl(&acl, &list), {0, 42}, "list");
    sec_release_aclelist(&list);
    for (const char *mechanism : {static_cast<const char *>(nullptr), "UNIX"}) {
        is_one_of(sec_list_acl_by_type(&acl, 4, mechanism, &list), {0, 42}, "list by type");
        sec_release_aclelist(&list);
    }
    const unsigned char *found = nullptr;
    EXPECT_EQ(sec__find_subacl(&acl, 8, "krb5", &found), 0);
    std::uint32_t mask = 0;
    for (const int type : {1, 2, 4, 8, 0x84})
        for (const char *mechanism : {"unix", "hba2", "krb5"})
            is_one_of(sec__single_acle_perm(&acl, static_cast<std::uint8_t>(type), mechanism, nullptr,
                                            "bob@host.example", &mask),
                      {0, 42, 43}, "evaluate");
    const sec_group_ref_t groups[] = {{0, "staff"}, {0, "admins"}, {0, "none"}};
    is_one_of(sec__group_acles_perm(&acl, 3, groups, &mask), {0, 42, 43}, "groups");
    if (dumps)
        sec__dump_acl(&acl);
    EXPECT_EQ(std::string(memory.data(), memory.size()), bytes) << shown;

    for (const auto &acle :
         {entry(4, "unix", "BOB@host.example", 9), entry(4, "unix", "new", 9), entry(8, "krb5", "a", 9),
          entry(16, "", "admins", 9), entry(1, "", nullptr, 9)}) {
        for (const auto edit : {sec_add_acle_to_acl, sec_add_acle_to_acl2, sec_del_acle_from_acl}) {
            buffer held(bytes);
            const int result = edit(&acle, &held.acl);
            is_one_of(result, {0, 18, 42, 43}, "edit");
            EXPECT_TRUE(result == 0 || held.bytes() == bytes) << shown;
        }
    }
    is_one_of(sec_convert_acl_to_host(1, &acl), {0, 42, 43}, "convert");
    EXPECT_TRUE(!is_host_order || std::string(memory.data(), memory.size()) == bytes) << shown;
}

TEST(every_operation, stays_inside_its_bytes) {
    EXPECT_EQ(sec__register_id_handler(1, "krb5", accept_anything), 0);
    EXPECT_EQ(sec__register_id_handler(2, "hba2", accept_anything), 0);
    const auto [failures, dumped] = output_of([] {
        for (const std::string &whole : {rich, foreign(rich)}) {
            for (std::size_t length = 1; length <= whole.size(); ++length)
                use_everywhere(whole.substr(0, length), "the first " + std::to_string(length) + " bytes",
                               true);
            for (std::size_t at = 0; at < whole.size(); ++at) {
                for (const int change : {1, 2, 3, 4, 5, 7, 8, 16, 32, 64, 127, 128, 129, 254, 255}) {
                    std::string bytes = whole;
                    bytes[at] = static_cast<char>(bytes[at] + change);
                    use_everywhere(bytes, "byte " + std::to_string(at) + " plus " + std::to_string(change),
                                   change == 1);
                }
            }
        }
    });
    EXPECT_NE(dumped.find("bob@host.example"), std::string::npos);
    EXPECT_FALSE(HasFailure()) << failures;
}

} // namespace
