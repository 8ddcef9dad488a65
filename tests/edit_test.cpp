// Tests of adding and deleting entries: refusals, limits, and bytes that nothing checks. What edits do otherwise is
// compared with a plain model by fuzz/edit_fuzz.cpp.
#include "support.h"

using namespace support;

TEST(edit, reports_what_it_refuses_and_leaves_the_buffer_alone) {
    const sec_acle_t user = entry(4, "unix", "al", 1);
    const std::tuple<std::string, sec_acle_t, failure> rows[] = {
        {rich, entry(0x84, "unix", "a", 1), error_of(43, 103, {"132"})},
        {rich, entry(4, "", "a", 1), error_of(43, 104, {"4"})},
        {"no ACL", entry(16, "", nullptr, 1), error_of(43, 104, {"16"})}, // the entry before the buffer
        {"\x85\1\1\0\0"s, user, error_of(42, 102)},
        {"\x84\2\1"s, user, error_of(42, 100)},
        {"\x85\2\1"s, user, error_of(42, 101)},
        {"\x85\1\2\0"s, user, located(42, 97)},
        {one(packed_subacl(1, "", 2, packed_entry(1, "") + packed_entry(2, ""))), entry(1, "", nullptr, 1),
         error_of(42, 98)},
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
    EXPECT_TRUE(held.bytes() == full);
    EXPECT_EQ(sec_del_acle_from_acl(&last, &held.acl) + sec_add_acle_to_acl(&more, &held.acl), 0);
    EXPECT_TRUE(held.bytes() == full.substr(0, full.size() - 25) + added);
}

// Nothing compares the last sub-ACL's length with where its entries end. An edit replaces the bytes that the
// length names by all of the entries that it counts.
TEST(edit, replaces_as_many_bytes_as_the_stored_length_says) {
    const std::string a = named(1, "a"), c = named(3, "c"), first = packed_subacl(1, "", 0, "");
    const std::string stored = of_mechanism(4, "unix", 2, a + c) + "behind";
    for (std::size_t length = 0; length <= stored.size() + 2; ++length)
        for (const auto edit : {sec_add_acle_to_acl, sec_del_acle_from_acl}) {
            const bool adds = edit == sec_add_acle_to_acl, is_inside = length <= stored.size();
            const std::string last = number(length, 4) + stored.substr(4);
            const std::string changed =
                adds ? of_mechanism(4, "unix", 3, a + named(2, "b") + c) : of_mechanism(4, "unix", 1, a);
            buffer held(packed_acl(2, first + last));
            const sec_acle_t acle = entry(4, "unix", adds ? "b" : "C", 2);
            EXPECT_EQ(after(edit(&acle, &held.acl)), is_inside ? no_error : located(42, 97)) << length;
            EXPECT_EQ(held.bytes(), packed_acl(2, first + (is_inside ? changed + last.substr(length) : last)));
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
