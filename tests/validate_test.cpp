// Tests of validation and byte order. How every operation bears bytes that were cut short or changed is tested by
// fuzz/buffer_fuzz.cpp.
#include "qzacl_acl/buffer.h"
#include "qzacl_acl/validate.h"
#include "support.h"

using namespace support;

const std::string xyz = named(3, "xyz"), bare = packed_entry(1, ""), other = packed_subacl(2, "", 1, bare);

static std::string with(std::string bytes, std::size_t offset, int value) {
    bytes[offset] = static_cast<char>(value);
    return bytes;
}

TEST(validate, checks_every_rule_in_its_order) {
    const std::string user = of_mechanism(4, "abcd", 1, xyz), endless = packed_entry(1, "xyz");
    const std::string group = packed_subacl(16, "", 4, named(~0u, "z") + xyz + xyz + named(0, ""));
    const std::string headless = with(packed_subacl(2, "", 1, ""), 0, 10);
    const failure structural = located(42, 97), bad_identity = located(43, 114);
    const std::tuple<const char *, std::string, failure> rows[] = {
        {"all types, and bytes behind the end", rich + "behind", no_error},
        {"repetitions and none", packed_acl(4, user + user + of_mechanism(8, "m", 0, "") + group), no_error},
        {"long mechanism", one(with(of_mechanism(8, std::string(254, 'm'), 1, xyz), 3, 9)), no_error},
        {"4 bytes", "\x85\1\2\0"s, located(42, 106, {"4"})},
        {"a sub-ACL too many", packed_acl(2, user), structural},
        {"a length that is too short", packed_acl(2, with(user, 0, 25) + other), structural},
        {"a length that is too long", packed_acl(2, with(user, 0, 27) + other), structural},
        {"a header cut short", one(user.substr(0, 9)), structural},
        {"a mechanism cut short", one(user.substr(0, 14)), structural},
        {"an entry cut short", one(user.substr(0, 21)), structural},
        {"the example with a length of 5", with(example, 25, 5), bad_identity},
        {"the same cut short", with(example, 25, 5).substr(0, 30), structural},
        {"entries beyond number", one(of_mechanism(4, "m", ~0u, xyz)), structural},
        {"type 132", one(packed_subacl(132, "m", 0, "")), located(42, 107, {"132"})},
        {"a group's mechanism", one(packed_subacl(16, "abcde", 1, xyz)), located(42, 108, {"16"})},
        {"an unauthenticated mechanism", one(packed_subacl(1, "m", 2, "")), located(42, 108, {"1"})},
        {"two unauthenticated", one(packed_subacl(1, "", 2, "")), located(42, 109)},
        {"no mechanism", one(packed_subacl(4, "", 1, xyz)), located(42, 110, {"0"})},
        {"an empty mechanism", one(packed_subacl(8, "\0"s, 1, xyz)), located(42, 110, {"1"})},
        {"a mechanism that ends early", one(packed_subacl(4, "ab\0\0"s, 1, xyz)), located(42, 111, {"ab"})},
        {"a mechanism that does not end", one(packed_subacl(4, "ab", 1, xyz)), located(42, 111, {"ab\1\3"})},
        {"any other with an identity", one(packed_subacl(2, "", 1, xyz)), located(43, 113)},
        {"an identity that ends late", one(packed_subacl(16, "", 2, endless + xyz)), bad_identity},
        {"no identity field", one(of_mechanism(8, "m", 1, bare)), bad_identity},
        {"two faults", one(of_mechanism(4, "m", 2, with(xyz, 0, 0) + endless)), located(43, 112, {"0"})},
        // After a faulty entry the walk stands at that entry, where no further sub-ACL starts.
        {"a faulty entry before a sub-ACL", packed_acl(2, with(other, 10, 2) + other), structural},
        {"one where a sub-ACL starts", packed_acl(2, headless + other), located(43, 112, {"17"})},
    };
    for (const auto &[name, bytes, error] : rows) {
        const guarded memory(bytes);
        sec_acl_buffer_t acl = memory.acl();
        EXPECT_EQ(after(sec__check_acl_buffer(&acl)), error) << name;
        EXPECT_EQ(after(sec_convert_acl_to_host(1, &acl)), error) << name;
        EXPECT_EQ(after(sec_convert_acl_to_host(0, &acl)), no_error) << name; // nothing to convert
        EXPECT_EQ(std::string(memory.data(), memory.size()), bytes) << name;
    }
    const sec_acl_buffer_t negative = {-7, nullptr};
    EXPECT_EQ(after(sec__check_acl_buffer(&negative)), located(42, 106, {"-7"}));
}

TEST(validate, converts_the_other_byte_order) {
    // Whatever is not the sign of this host's order, and not checked by the same call.
    buffer spelled("\x85\1\xff\0\1\0\0\0\x1a\4\0\0\0\1\5abcd\0\1\0\0\0\3\0\4xyz\0"s);
    const std::string foreign = with(spelled.bytes(), 2, 1);
    EXPECT_EQ(sec_convert_acl_to_host(0, &spelled.acl), 0);
    EXPECT_EQ(spelled.bytes(), example);
    // Bytes behind the end, and such as no check would take: the type, and the version of an entry.
    for (const auto &[offset, value] : {std::pair(9, 4), {9, 99}, {20, 9}}) {
        buffer held(with(foreign, static_cast<std::size_t>(offset), value) + "behind");
        EXPECT_EQ(sec_convert_acl_to_host(1, &held.acl), 0) << recorded_error();
        EXPECT_EQ(held.bytes(), with(example, static_cast<std::size_t>(offset), value) + "behind");
    }
    const std::pair<std::string, failure> rows[] = {
        {"\x84\1\1\0\0"s, error_of(42, 96)},
        {"\x85\2"s, error_of(42, 96)},
        {"\x85\1"s, located(42, 106, {"2"})},
        {with(foreign, 4, 2) + foreign.substr(5), no_error},
        {with(with(foreign, 4, 2), 8, 11) + foreign.substr(5), located(42, 97)},
        {foreign.substr(0, foreign.size() - 1), located(42, 97)},
    };
    for (const auto &[bytes, error] : rows) {
        buffer held(bytes);
        EXPECT_EQ(after(sec_convert_acl_to_host(1, &held.acl)), error);
        EXPECT_EQ(held.bytes().substr(0, 3) == bytes.substr(0, 3), error != no_error); // only success marks the order
    }
    for (sec_acl_buffer_t bad : {sec_acl_buffer_t{0, spelled.acl.data}, {5, nullptr}})
        EXPECT_EQ(after(sec_convert_acl_to_host(0, &bad)), error_of(42, 96));
    EXPECT_EQ(after(sec_convert_acl_to_host(1, nullptr)), bad_parameter("sec_convert_acl_to_host", 2));
}

TEST(list, refuses_what_it_cannot_list) {
    const char *const long_name = "seventeen-bytes-x", *const blank = "";
    const std::pair<std::string, failure> rows[] = {
        {packed_acl(2, other + packed_subacl(1, "", 2, bare + bare)), error_of(42, 98)},
        {packed_acl(2, other), located(42, 97)},
        {packed_acl(3, with(other, 0, 0)), located(42, 97)}, // would be listed three times
        {"\x85\1"s, located(42, 97)},
        {"\x85\2\2\0\0"s, error_of(42, 96)},
        {"\x85"s, error_of(42, 96)},
    };
    for (const auto &[bytes, error] : rows) {
        const buffer held(bytes);
        sec_aclelist_t list = {7, nullptr};
        EXPECT_EQ(after(sec_list_acl(&held.acl, &list)), error);
        EXPECT_EQ(list.count, error.id == 96 ? 7 : 0) << error; // touched once the first bytes are right
    }
    sec_acl_buffer_t empty = {}, no_length = {0, &empty};
    sec_aclelist_t list = {7, nullptr};
    EXPECT_EQ(after(sec_list_acl(nullptr, nullptr)), bad_parameter("sec_list_acl", 1));
    EXPECT_EQ(after(sec_list_acl(&no_length, nullptr)), bad_parameter("sec_list_acl", 2));
    EXPECT_EQ(after(sec_list_acl(&no_length, &list)), error_of(42, 96));
    EXPECT_EQ(sec_list_acl(&empty, &list) + list.count, 0);
    const std::string of = "sec_list_acl_by_type";
    EXPECT_EQ(after(sec_list_acl_by_type(nullptr, 0, blank, nullptr)), bad_parameter(of, 1));
    EXPECT_EQ(after(sec_list_acl_by_type(&no_length, 0x84, blank, nullptr)), bad_parameter(of, 2, "84"));
    for (const char *bad : {blank, long_name})
        EXPECT_EQ(after(sec_list_acl_by_type(&no_length, 4, bad, nullptr)), bad_parameter(of, 3, shown(bad)));
    EXPECT_EQ(after(sec_list_acl_by_type(&no_length, 16, long_name, nullptr)), bad_parameter(of, 4));
    EXPECT_EQ(after(sec_list_acl_by_type(&no_length, 1, blank, &list)), error_of(42, 96));
}
