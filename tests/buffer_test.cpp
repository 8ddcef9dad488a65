// Compiled buffers: made, checked, converted, listed, edited, released and dumped, and what each of these refuses. How
// every operation bears bytes that were cut short or changed is tested by fuzz/buffer_fuzz.cpp, and what edits do
// otherwise by fuzz/edit_fuzz.cpp.
#include "qzacl_acl/buffer.h"
#include "qzacl_acl/tree.h"
#include "qzacl_acl/validate.h"
#include "support.h"

using namespace support;

const std::string xyz = named(3, "xyz"), bare = packed_entry(1, ""), other = packed_subacl(2, "", 1, bare);

static std::string with(std::string bytes, std::size_t offset, unsigned value, std::size_t width = 1) {
    return bytes.replace(offset, width, number(value, width));
}
// The same of bytes in the other order.
static std::string foreign_with(std::string bytes, std::size_t offset, unsigned value, std::size_t width) {
    std::string field = number(value, width);
    std::ranges::reverse(field);
    return bytes.replace(offset, width, field);
}

TEST(buffers, are_made_or_taken_over_unexamined_and_released) {
    buffer held;
    held.acl.length = 77;
    const std::string reader = "sec_read_acl_from_data";
    EXPECT_EQ(after(sec_read_acl_from_data(0, nullptr, nullptr)), bad_parameter(reader, 1));
    EXPECT_EQ(after(sec_read_acl_from_data(-2, "x", &held.acl)), bad_parameter(reader, 1, "fffffffe"));
    EXPECT_EQ(after(sec_read_acl_from_data(1, nullptr, nullptr)), bad_parameter(reader, 2));
    EXPECT_EQ(after(sec_read_acl_from_data(1, "x", nullptr)), bad_parameter(reader, 3));
    EXPECT_EQ(held.acl.length, 77);
    EXPECT_EQ(after(sec_create_empty_acl(nullptr)), bad_parameter("sec_create_empty_acl", 1));
    EXPECT_EQ(sec_create_empty_acl(&held.acl), 0);
    EXPECT_EQ(held.bytes(), packed_acl(0, ""));
    EXPECT_EQ(sec_release_acl(&held.acl), 0);
    ASSERT_EQ(sec_read_acl_from_data(4, "junk", &held.acl), 0);
    EXPECT_EQ(after(sec_release_acl(&held.acl)), error_of(42, 93));
    ASSERT_EQ(held.bytes(), "junk");
    *static_cast<char *>(held.acl.data) = '\x85';
    EXPECT_EQ(sec_release_acl(&held.acl) + sec_release_acl(&held.acl) + sec_release_acl(nullptr), 0);
    EXPECT_TRUE(held.acl.length == 0 && held.acl.data == nullptr);
}

TEST(validate, checks_every_rule_in_its_order) {
    const std::string user = of_mechanism(4, "abcd", 1, xyz), endless = packed_entry(1, "xyz");
    const std::string group = packed_subacl(16, "", 4, named(~0u, "z") + xyz + xyz + named(0, ""));
    const std::string headless = with(packed_subacl(2, "", 1, ""), 0, 10, 4);
    const failure structural = located(42, 97), bad_identity = located(43, 114);
    const std::tuple<const char *, std::string, failure> rows[] = {
        {"all types, and bytes behind the end", rich + "behind", no_error},
        {"repetitions and none", packed_acl(4, user + user + of_mechanism(8, "m", 0, "") + group), no_error},
        {"long mechanism", one(with(of_mechanism(8, std::string(254, 'm'), 1, xyz), 3, 9)), no_error},
        {"4 bytes", example.substr(0, 4), located(42, 106, {"4"})},
        {"a sub-ACL too many", packed_acl(2, user), structural},
        {"a length that is too short", packed_acl(2, with(user, 0, 25, 4) + other), structural},
        {"a length that is too long", packed_acl(2, with(user, 0, 27, 4) + other), structural},
        {"a header cut short", one(user.substr(0, 9)), structural},
        {"a mechanism cut short", one(user.substr(0, 14)), structural},
        {"an entry cut short", one(user.substr(0, 21)), structural},
        {"the example with a length of 5", with(example, 25, 5, 2), bad_identity},
        {"the same cut short", with(example, 25, 5, 2).substr(0, 30), structural},
        {"entries beyond number", one(of_mechanism(4, "m", ~0u, xyz)), structural},
        {"type 132", one(packed_subacl(132, "m", 0, "")), located(42, 107, {"132"})},
        {"a group's mechanism", one(packed_subacl(16, "abcde", 1, xyz)), located(42, 108, {"16"})},
        {"an unauthenticated mechanism", one(packed_subacl(1, "m", 2, "")), located(42, 108, {"1"})},
        {"two unauthenticated", one(packed_subacl(1, "", 2, "")), located(42, 109)},
        {"no mechanism", one(packed_subacl(4, "", 1, xyz)), located(42, 110, {"0"})},
        {"an empty mechanism", one(packed_subacl(8, "\0"s, 1, xyz)), located(42, 110, {"1"})},
        {"a mechanism that ends early", one(packed_subacl(4, "ab\0\0"s, 1, xyz)), located(42, 111, {"ab"})},
        {"a mechanism that does not end", one(packed_subacl(4, "ab", 1, named(0x03000003, "xyz"))),
         located(42, 111, {"ab\1\3"})},
        {"any other with an identity", one(packed_subacl(2, "", 1, xyz)), located(43, 113)},
        {"an identity that ends late", one(packed_subacl(16, "", 2, endless + xyz)), bad_identity},
        {"no identity field", one(of_mechanism(8, "m", 1, bare)), bad_identity},
        {"two faults", one(of_mechanism(4, "m", 2, with(xyz, 0, 0) + endless)), located(43, 112, {"0"})},
        // After a faulty entry the walk stands at that entry, where no further sub-ACL starts.
        {"a faulty entry before a sub-ACL", packed_acl(2, with(other, 10, 2) + other), structural},
        {"one where a sub-ACL starts", packed_acl(2, headless + other),
         located(43, 112, {is_low_byte_first ? "17" : "0"})}, // the first byte of its length
    };
    for (const auto &[name, bytes, error] : rows) {
        buffer held(bytes);
        EXPECT_EQ(after(sec__check_acl_buffer(&held.acl)), error) << name;
        EXPECT_EQ(after(sec_convert_acl_to_host(1, &held.acl)), error) << name;
        EXPECT_EQ(after(sec_convert_acl_to_host(0, &held.acl)), no_error) << name; // nothing to convert
        EXPECT_EQ(held.bytes(), bytes) << name;
    }
    const sec_acl_buffer_t negative = {-7, nullptr};
    EXPECT_EQ(after(sec__check_acl_buffer(&negative)), located(42, 106, {"-7"}));
}

TEST(validate, converts_the_other_byte_order) {
    EXPECT_EQ(one(of_mechanism(4, "abcd", 1, xyz)), example);
    // What is not the sign of this host's order is the other one; what is wrong then is not looked for by this call.
    for (const auto &[offset, value] : {std::pair(2u, 255), {9u, 99}, {20u, 9}}) {
        buffer held(with(foreign, offset, value) + "behind");
        EXPECT_EQ(after(sec_convert_acl_to_host(1, &held.acl)), no_error);
        EXPECT_EQ(held.bytes(), offset == 2 ? example + "behind" : with(example, offset, value) + "behind");
    }
    const std::string twice = foreign_with(foreign, 3, 2, 2) + foreign.substr(5);
    const std::pair<std::string, failure> rows[] = {
        {"\x84\1\1\0\0"s, error_of(42, 96)},
        {"\x85\2"s, error_of(42, 96)},
        {"\x85\1"s, located(42, 106, {"2"})},
        {twice, no_error},
        {foreign_with(twice, 5, 11, 4), located(42, 97)},
        {foreign.substr(0, foreign.size() - 1), located(42, 97)},
    };
    for (const auto &[bytes, error] : rows) {
        buffer held(bytes);
        EXPECT_EQ(after(sec_convert_acl_to_host(1, &held.acl)), error);
        EXPECT_EQ(held.bytes().substr(0, 3) == bytes.substr(0, 3), error != no_error); // only success marks the order
    }
    sec_acl_buffer_t empty = {};
    EXPECT_EQ(after(sec_convert_acl_to_host(0, &empty)), error_of(42, 96));
    EXPECT_EQ(after(sec_convert_acl_to_host(1, nullptr)), bad_parameter("sec_convert_acl_to_host", 2));
}

TEST(list, refuses_what_it_cannot_expand) {
    const std::string x1 = named(1, "x"), twice = packed_subacl(1, "", 2, bare + bare);
    const std::pair<std::string, failure> rows[] = {
        {packed_acl(2, other + twice), error_of(42, 98)},
        {packed_acl(2, other), located(42, 97)},
        {packed_acl(3, with(other, 0, 0, 4)), located(42, 97)}, // would be listed three times
        {"\x85\1"s, located(42, 97)},
        {"\x85\2\2\0\0"s, error_of(42, 96)},
        {one(packed_subacl(0, "", 1, x1)), located(42, 97)},
        {one(packed_subacl(16, "", 0xffffffff, x1)), located(42, 97)},
        {one(packed_subacl(4, "", 1, x1)), located(42, 97)},
        {one(packed_subacl(4, std::string(17, 'm'), 1, x1)), located(42, 110, {"17"})},
        {one(of_mechanism(4, "unix", 2, x1 + bare)), located(42, 97)},
        {one(packed_subacl(16, "", 2, x1 + packed_entry(1, "y"))), located(42, 97)},
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
    EXPECT_EQ(sec_list_acl(&empty, &list) + list.count, 0);
    const std::string of = "sec_list_acl_by_type";
    EXPECT_EQ(after(sec_list_acl_by_type(nullptr, 0, "", nullptr)), bad_parameter(of, 1));
    EXPECT_EQ(after(sec_list_acl_by_type(&no_length, 0x84, "", nullptr)), bad_parameter(of, 2, "84"));
    for (const char *bad : {"", "seventeen-bytes-x"})
        EXPECT_EQ(after(sec_list_acl_by_type(&no_length, 4, bad, nullptr)), bad_parameter(of, 3, shown(bad)));
    EXPECT_EQ(after(sec_list_acl_by_type(&no_length, 16, "", nullptr)), bad_parameter(of, 4));
    EXPECT_EQ(after(sec_list_acl_by_type(&no_length, 1, "", &list)), error_of(42, 96));
    const buffer cut("\x85\1\2\0"s);
    for (const char *mechanism : {static_cast<const char *>(nullptr), "unix"})
        EXPECT_EQ(after(sec_list_acl_by_type(&cut.acl, 4, mechanism, &list)), located(42, 97));
}

TEST(edit, reports_what_it_refuses_and_leaves_the_buffer_alone) {
    const sec_acle_t user = entry(4, "unix", "al", 1);
    const std::tuple<std::string, sec_acle_t, failure> rows[] = {
        {rich, entry(0x84, "unix", "a", 1), error_of(43, 103, {"132"})},
        {rich, entry(4, "", "a", 1), error_of(43, 104, {"4"})},
        {"no ACL", entry(16, "", nullptr, 1), error_of(43, 104, {"16"})}, // the entry before the buffer
        {foreign, user, error_of(42, 102)},
        {"\x84\2\1"s, user, error_of(42, 100)},
        {"\x85\2\1"s, user, error_of(42, 101)},
        {example.substr(0, 4), user, located(42, 97)},
        {one(packed_subacl(1, "", 2, bare + bare)), entry(1, "", nullptr, 1), error_of(42, 98)},
    };
    for (const auto edit : {sec_add_acle_to_acl, sec_add_acle_to_acl2, sec_del_acle_from_acl}) {
        for (const auto &[bytes, acle, error] : rows) {
            buffer held(bytes);
            EXPECT_EQ(after(edit(&acle, &held.acl)), error);
            EXPECT_EQ(held.bytes(), bytes) << error;
        }
        const char *name = edit == sec_del_acle_from_acl ? "sec_del_acle_from_acl" : "sec_add_acle_to_acl";
        EXPECT_EQ(after(edit(nullptr, nullptr)), bad_parameter(name, 1, "0"));
        EXPECT_EQ(after(edit(&user, nullptr)), bad_parameter(name, 2, "0"));
    }
}

TEST(edit, holds_at_most_65534_bytes_of_identity_and_65535_subacls) {
    const std::string longest(65534, 'i'), too_long = longest + "i", a = named(1, "a"), b = named(2, "b");
    const sec_acle_t refused = entry(16, "", too_long.c_str(), 7), fitting = entry(16, "", longest.c_str(), 7);
    // A buffer that the call makes, which goes with its failure; one changed in place, one rebuilt.
    for (const std::string &entries : {""s, a + b, b + a}) {
        const std::string bytes = entries.empty() ? "" : one(packed_subacl(16, "", 2, entries));
        buffer held(bytes);
        EXPECT_EQ(after(sec_add_acle_to_acl(&refused, &held.acl)), error_of(43, 104, {"16"}));
        EXPECT_EQ(held.bytes(), bytes);
        EXPECT_EQ(sec_del_acle_from_acl(&refused, &held.acl), bytes.empty() ? 42 : 18);
        EXPECT_EQ(after(sec_add_acle_to_acl(&fitting, &held.acl)), no_error);
        EXPECT_TRUE(held.bytes().ends_with((bytes.empty() ? "" : a + b) + named(7, longest)));
    }
    std::string subacls;
    for (int number = 10000; number < 75535; ++number) subacls += of_mechanism(8, std::to_string(number), 1, a);
    const std::string full = packed_acl(65535, subacls), added = of_mechanism(4, "more", 1, a);
    buffer held(full);
    const sec_acle_t more = entry(4, "more", "a", 1), last = entry(8, "75534", "A", 1);
    EXPECT_EQ(after(sec_add_acle_to_acl(&more, &held.acl)),
              error_of(6, 89, {"sec_add_acle_to_acl", std::to_string(full.size() + added.size())}));
    EXPECT_EQ(sec_del_acle_from_acl(&last, &held.acl) + sec_add_acle_to_acl(&more, &held.acl), 0);
    EXPECT_TRUE(held.bytes() == full.substr(0, full.size() - 25) + added);
}

// Nothing compares the last sub-ACL's length with where its entries end. An edit replaces the bytes that the
// length names by all of the entries that it counts.
TEST(edit, replaces_as_many_bytes_as_the_stored_length_says) {
    const std::string a = named(1, "a"), c = named(3, "c"), stored = of_mechanism(4, "unix", 2, a + c) + "behind";
    const std::string changed = of_mechanism(4, "unix", 3, a + named(2, "b") + c);
    const sec_acle_t acle = entry(4, "unix", "b", 2);
    for (std::size_t length = 0; length <= stored.size() + 2; ++length) {
        const std::string last = number(length, 4) + stored.substr(4);
        buffer held(packed_acl(2, other + last));
        const bool is_inside = length <= stored.size();
        EXPECT_EQ(after(sec_add_acle_to_acl(&acle, &held.acl)), is_inside ? no_error : located(42, 97)) << length;
        EXPECT_EQ(held.bytes(), packed_acl(2, other + (is_inside ? changed + last.substr(length) : last)));
    }
}

// Bytes behind the last counted sub-ACL are out of force, and stay so.
TEST(edit, adds_a_sub_acl_where_the_counted_ones_end) {
    const std::string everything = packed_subacl(2, "", 1, packed_entry(~0u, ""));
    const std::string stored = of_mechanism(8, "krb5", 2, named(1, "a") + named(2, "b"));
    const std::string added = of_mechanism(4, "unix", 1, named(3, "al"));
    const sec_acle_t acle = entry(4, "unix", "al", 3);
    buffer none_counted(packed_acl(0, everything));
    EXPECT_EQ(after(sec_add_acle_to_acl(&acle, &none_counted.acl)), no_error);
    EXPECT_EQ(none_counted.bytes(), packed_acl(1, added + everything));
    // Where the last one ends must be sure.
    for (std::size_t length = 0; length <= stored.size() + everything.size(); ++length) {
        const std::string last = number(length, 4) + stored.substr(4);
        buffer held(packed_acl(2, other + last + everything));
        const bool is_sure = length == stored.size();
        EXPECT_EQ(after(sec_add_acle_to_acl(&acle, &held.acl)), is_sure ? no_error : located(42, 97)) << length;
        EXPECT_EQ(held.bytes(), is_sure ? packed_acl(3, other + last + added + everything)
                                        : packed_acl(2, other + last + everything));
    }
    for (const std::string &bytes : {packed_acl(2, other), one(of_mechanism(8, "krb5", 3, named(1, "a")))}) {
        buffer cut(bytes);
        EXPECT_EQ(after(sec_add_acle_to_acl(&acle, &cut.acl)), located(42, 97));
        EXPECT_EQ(cut.bytes(), bytes);
    }
}

// A handler is shown identities where they stand, and may keep one to add it: the buffer moves while that is done.
TEST(edit, adds_an_identity_that_lies_in_the_buffer) {
    const std::string stored = named(1, "of a long name that makes the buffer move");
    buffer held(packed_acl(1, of_mechanism(4, "unix", 1, stored)));
    sec_acle_t acle = entry(4, "unix", "", 2);
    acle.identity = static_cast<char *>(held.acl.data) + held.acl.length - 5;
    EXPECT_EQ(after(sec_add_acle_to_acl(&acle, &held.acl)), no_error);
    EXPECT_EQ(held.bytes(), packed_acl(1, of_mechanism(4, "unix", 2, named(2, "move") + stored)));
}

TEST(dump, prints_buffers_and_subacls) {
    const auto head = [](const arguments &facts) {
        return error_of(0, 84, {"\t", "\t", facts[0], facts[1], facts[2], facts[3]}).text + "\n";
    };
    const auto top = [](const char *length, const char *count) {
        return "ACL descriptor: "s + length +
               " byte(s) long\n\tVersion: 1\n\tByte Ordering: " + std::to_string(this_order) +
               "\n\tNumber of sub-ACLs: " + count + "\n";
    };
    const std::string any = head({"17", "2", "", "1"}) + "\t\ttype = o; permission = rwc\n";
    const std::pair<std::string, std::string> rows[] = {
        {"", ""},
        {"\x84\1\2\0\0"s, "The ACL provided is not valid!\n\n"},
        {rich, top("182", "6") + head({"37", "16", "", "2"}) +
                   "\t\ttype = g; id = Admins; permission = rC\n\t\ttype = g; id = staff; permission = wC\n" +
                   head({"49", "4", "unix", "2"}) + "\t\ttype = u; mech = unix; id = al; permission = r\n" +
                   "\t\ttype = u; mech = unix; id = bob@host.example; permission = w\n" +
                   head({"33", "8", "kRb5", "2"}) + "\t\ttype = e; mech = kRb5; id = z; permission = c\n" +
                   "\t\ttype = e; mech = kRb5; id = a; permission = rc\n" + head({"24", "4", "hba2", "1"}) +
                   "\t\ttype = u; mech = hba2; id = x; permission = wc\n" + any + head({"17", "1", "", "1"}) +
                   "\t\ttype = n; permission = x\n"},
        // What cannot be expanded gives its reason on standard output, and the dump goes on.
        {packed_acl(2, packed_subacl(2, "", 2, bare + bare) + packed_subacl(2, "", 1, packed_entry(7, ""))),
         error_of(42, 98).text + top("46", "2") + head({"24", "2", "", "2"}) + any},
    };
    const auto printed = [](const auto &call) {
        testing::internal::CaptureStdout();
        testing::internal::CaptureStderr();
        call();
        const std::string out = testing::internal::GetCapturedStdout();
        return out + testing::internal::GetCapturedStderr();
    };
    for (const auto &[bytes, wanted] : rows) {
        const buffer held(bytes);
        EXPECT_EQ(printed([&] { sec__dump_acl(&held.acl); }), wanted);
        EXPECT_EQ(recorded_error(), no_error);
    }
    const auto parts = [] {
        sec__dump_acl(nullptr);
        sec__dump_subacl(nullptr, "");
        sec__dump_acltree(nullptr, "");
        sec__dump_acle(nullptr, nullptr, "");
        sec__dump_subacl(example.data() + 5, nullptr);
    };
    const std::string heading = error_of(0, 84, {"", "", "26", "4", "abcd", "1"}).text;
    EXPECT_EQ(printed(parts), heading + "\n\ttype = u; mech = abcd; id = xyz; permission = rw\n");
}
