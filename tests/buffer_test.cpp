// Compiled buffers: made, checked, converted, listed, edited, released and dumped, and what each of these refuses.
// How every operation takes bytes that were cut short or changed is tested by fuzz/buffer_fuzz.cpp, and what edits
// do otherwise, also to bytes that no edit makes, by fuzz/edit_fuzz.cpp.
#include "qzacl_acl/buffer.h"
#include "qzacl_acl/tree.h"
#include "qzacl_acl/validate.h"
#include "support.h"

using namespace support;

// Entries and sub-ACLs that many rows are made of.
const std::string xyz = entry_bytes("xyz 3");
const std::string many = xyz + xyz + xyz + xyz + xyz + xyz + xyz + xyz;
const std::string unended = packed_entry(1, "xyz");
const std::string any_other = subacl_bytes("o: 1");
const std::string user_xyz = subacl_bytes("u abcd: xyz 3");

// Bytes in which a number was changed.
static std::string with_number(std::string bytes, std::size_t offset, unsigned value, std::size_t width = 1) {
    return bytes.replace(offset, width, number(value, width));
}

TEST(buffers, are_made_empty_or_of_any_bytes) {
    buffer held;
    const std::string reader = "sec_read_acl_from_data";
    EXPECT_EQ(outcome_of(sec_read_acl_from_data(0, nullptr, nullptr)), bad_parameter(reader, 1));
    EXPECT_EQ(outcome_of(sec_read_acl_from_data(-2, "x", &held.acl)), bad_parameter(reader, 1, "fffffffe"));
    EXPECT_EQ(outcome_of(sec_read_acl_from_data(1, nullptr, nullptr)), bad_parameter(reader, 2));
    EXPECT_EQ(outcome_of(sec_read_acl_from_data(1, "x", nullptr)), bad_parameter(reader, 3));
    EXPECT_EQ(outcome_of(sec_create_empty_acl(nullptr)), bad_parameter("sec_create_empty_acl", 1));
    EXPECT_EQ(sec_create_empty_acl(&held.acl), SEC_S_OK);
    EXPECT_EQ(held.bytes(), packed_acl(0, ""));
}

TEST(buffers, are_released_when_they_begin_as_an_acl) {
    buffer held("junk");
    EXPECT_EQ(outcome_of(sec_release_acl(&held.acl)), error_of(SEC_S_BAD_ACL, msg::acl_corrupted));
    ASSERT_EQ(held.bytes(), "junk");
    *static_cast<char *>(held.acl.data) = '\x85';
    EXPECT_EQ(sec_release_acl(&held.acl), SEC_S_OK);
    EXPECT_EQ(held.acl.length, 0);
    EXPECT_EQ(held.acl.data, nullptr);
    EXPECT_EQ(sec_release_acl(&held.acl), SEC_S_OK);
    EXPECT_EQ(sec_release_acl(nullptr), SEC_S_OK);
}

struct checked_bytes {
    const char *what;
    std::string bytes;
    failure error = no_error;
};

static void expect_check(const checked_bytes &row) {
    SCOPED_TRACE(row.what);
    buffer held(row.bytes);
    EXPECT_EQ(outcome_of(sec__check_acl_buffer(&held.acl)), row.error);
    EXPECT_EQ(outcome_of(sec_convert_acl_to_host(with_check, &held.acl)), row.error);
    EXPECT_EQ(outcome_of(sec_convert_acl_to_host(without_check, &held.acl)), no_error); // nothing to convert
    EXPECT_EQ(held.bytes(), row.bytes);
}

TEST(validate, accepts_what_is_sound) {
    const std::string long_mechanism =
        packed_subacl(SEC_ACLE_EXPANDED, text_field(std::string(254, 'm')), 1, xyz);
    expect_check({"all types, and bytes behind the end", rich + "behind"});
    expect_check({"a sub-ACL repeated", packed_acl(2, user_xyz + user_xyz)});
    expect_check({"no entries, and entries repeated", acl_bytes("e m:; g: z 4294967295, xyz 3, xyz 3")});
    expect_check({"a long mechanism", acl_of_one(with_number(long_mechanism, 3, 9))});
}

TEST(validate, finds_what_is_cut_short_or_of_another_length) {
    const failure corrupted = bad_acl(msg::buffer_corrupted);
    const checked_bytes rows[] = {
        {"four bytes", example.substr(0, 4), bad_acl(msg::shorter_than_header, 4)},
        {"a sub-ACL too few", packed_acl(2, user_xyz), corrupted},
        {"a length too short", packed_acl(2, with_number(user_xyz, 0, 25, 4) + any_other), corrupted},
        {"a length too long", packed_acl(2, with_number(user_xyz, 0, 27, 4) + any_other), corrupted},
        {"an entry cut short", acl_of_one(user_xyz.substr(0, 21)), corrupted},
        {"entries beyond number", acl_of_one(packed_subacl(SEC_ACLE_USER, "m\0"s, ~0u, xyz)), corrupted},
        // After a faulty entry the walk stands at that entry, where no further sub-ACL starts.
        {"a faulty entry before a sub-ACL", packed_acl(2, with_number(any_other, 10, 2) + any_other),
         corrupted},
    };
    for (const checked_bytes &row : rows)
        expect_check(row);
    const sec_acl_buffer_t negative = {-7, nullptr};
    EXPECT_EQ(outcome_of(sec__check_acl_buffer(&negative)), bad_acl(msg::shorter_than_header, -7));
}

TEST(validate, names_the_first_rule_that_is_broken) {
    const failure bad_identity = bad_acle(msg::bad_identity_length);
    const std::string no_entry = with_number(packed_subacl(SEC_ACLE_ANYOTHER, "", 1, ""), 0, 10, 4);
    const int first_length_byte = is_low_byte_first ? 17 : 0;
    const checked_bytes rows[] = {
        {"a type that asks for a handler", acl_of_one(packed_subacl(by_handler, "m", 0, "")),
         bad_acl(msg::subacl_type_unknown, by_handler)},
        {"a group's mechanism", acl_of_one(packed_subacl(SEC_ACLE_GROUP, "abcde", 1, xyz)),
         bad_acl(msg::subacl_takes_no_mechanism, SEC_ACLE_GROUP)},
        {"an unauthenticated mechanism, and two entries",
         acl_of_one(packed_subacl(SEC_ACLE_UNAUTHENTICATED, "m", 2, "")),
         bad_acl(msg::subacl_takes_no_mechanism, SEC_ACLE_UNAUTHENTICATED)},
        {"two unauthenticated", acl_of_one(packed_subacl(SEC_ACLE_UNAUTHENTICATED, "", 2, "")),
         bad_acl(msg::more_than_one_acle)},
        {"no mechanism", acl_of_one(packed_subacl(SEC_ACLE_USER, "", 1, xyz)),
         bad_acl(msg::bad_mechanism_length, 0)},
        {"an empty mechanism", acl_of_one(packed_subacl(SEC_ACLE_EXPANDED, "\0"s, 1, xyz)),
         bad_acl(msg::bad_mechanism_length, 1)},
        {"a mechanism that ends early", acl_of_one(packed_subacl(SEC_ACLE_USER, "ab\0\0"s, 1, xyz)),
         bad_acl(msg::bad_mechanism, "ab")},
        {"a mechanism that does not end",
         acl_of_one(packed_subacl(SEC_ACLE_USER, "ab", 1, packed_entry(0x03000003, "xyz"))),
         bad_acl(msg::bad_mechanism, "ab\1\3")},
        {"any other with an identity", acl_bytes("o: xyz 3"), bad_acle(msg::unexpected_identity)},
        {"an identity that is too long", with_number(example, 25, 5, 2), bad_identity},
        {"an identity that does not end", acl_of_one(packed_subacl(SEC_ACLE_GROUP, "", 2, unended + xyz)),
         bad_identity},
        {"no identity", acl_bytes("e m: 1"), bad_identity},
        {"an unknown version before one that does not end",
         acl_of_one(packed_subacl(SEC_ACLE_USER, "m\0"s, 2, with_number(xyz, 0, 0) + unended)),
         bad_acle(msg::acle_version_unsupported, 0)},
        {"an unknown version before many",
         acl_of_one(packed_subacl(SEC_ACLE_GROUP, "", 9, with_number(xyz, 0, 9) + many)),
         bad_acle(msg::acle_version_unsupported, 9)},
        {"an unknown version where a sub-ACL starts", packed_acl(2, no_entry + any_other),
         bad_acle(msg::acle_version_unsupported, first_length_byte)},
    };
    for (const checked_bytes &row : rows)
        expect_check(row);
}

TEST(convert, marks_the_order_when_all_was_turned) {
    const std::string twice = with_number(foreign, 3, __builtin_bswap16(2), 2) + foreign.substr(5);
    const std::pair<std::string, failure> rows[] = {
        {twice, no_error},
        {with_number(foreign, 9, 99), no_error}, // what is wrong then is not looked for
        {"\x84\1\1\0\0"s, bad_acl(msg::not_an_acl_buffer)},
        {"\x85\2"s, bad_acl(msg::not_an_acl_buffer)},
        {"\x85\1"s, bad_acl(msg::shorter_than_header, 2)},
        {with_number(twice, 5, __builtin_bswap32(11), 4), bad_acl(msg::buffer_corrupted)},
        {foreign.substr(0, foreign.size() - 1), bad_acl(msg::buffer_corrupted)},
    };
    for (const auto &[bytes, error] : rows) {
        buffer held(bytes);
        EXPECT_EQ(outcome_of(sec_convert_acl_to_host(with_check, &held.acl)), error);
        const bool is_marked = held.bytes().substr(0, 3) != bytes.substr(0, 3);
        EXPECT_EQ(is_marked, error == no_error) << error;
    }
    sec_acl_buffer_t empty = {};
    EXPECT_EQ(outcome_of(sec_convert_acl_to_host(without_check, &empty)), bad_acl(msg::not_an_acl_buffer));
    EXPECT_EQ(outcome_of(sec_convert_acl_to_host(with_check, nullptr)),
              bad_parameter("sec_convert_acl_to_host", 2));
}

TEST(list, refuses_what_it_cannot_expand) {
    const failure corrupted = bad_acl(msg::buffer_corrupted);
    const checked_bytes rows[] = {
        {"a sub-ACL too few", packed_acl(2, any_other), corrupted},
        {"a length that leads nowhere", packed_acl(3, with_number(any_other, 0, 0, 4)), corrupted},
        {"a header cut short", example.substr(0, 4), corrupted},
        {"another version", "\x85\2\2\0\0"s, bad_acl(msg::not_an_acl_buffer)},
        {"no mechanism", acl_of_one(packed_subacl(SEC_ACLE_USER, "", 1, xyz)), corrupted},
        {"a long mechanism", acl_bytes("u seventeen-bytes-x: x 1"), bad_acl(msg::bad_mechanism_length, 18)},
        {"no identity", acl_bytes("u unix: x 1, 1"), corrupted},
        {"an identity that does not end", acl_of_one(packed_subacl(SEC_ACLE_GROUP, "", 2, xyz + unended)),
         corrupted},
    };
    for (const checked_bytes &row : rows) {
        SCOPED_TRACE(row.what);
        const buffer held(row.bytes);
        sec_aclelist_t list = {7, nullptr};
        EXPECT_EQ(outcome_of(sec_list_acl(&held.acl, &list)), row.error);
        // The list is touched once the first bytes are right.
        EXPECT_EQ(list.count, row.error.id == msg::not_an_acl_buffer.id ? 7 : 0);
    }
}

TEST(list, refuses_bad_parameters_and_a_header_cut_short) {
    const std::string by_type = "sec_list_acl_by_type";
    sec_acl_buffer_t empty = {};
    sec_acl_buffer_t no_length = {0, &empty};
    sec_aclelist_t list = {7, nullptr};
    EXPECT_EQ(outcome_of(sec_list_acl(nullptr, nullptr)), bad_parameter("sec_list_acl", 1));
    EXPECT_EQ(outcome_of(sec_list_acl(&no_length, nullptr)), bad_parameter("sec_list_acl", 2));
    EXPECT_EQ(sec_list_acl(&empty, &list), SEC_S_OK);
    EXPECT_EQ(list.count, 0);
    EXPECT_EQ(outcome_of(sec_list_acl_by_type(nullptr, 0, "", nullptr)), bad_parameter(by_type, 1));
    EXPECT_EQ(outcome_of(sec_list_acl_by_type(&no_length, by_handler, "", nullptr)),
              bad_parameter(by_type, 2, "84"));
    for (const char *bad : {"", "seventeen-bytes-x"}) {
        const failure error = bad_parameter(by_type, 3, address(bad));
        EXPECT_EQ(outcome_of(sec_list_acl_by_type(&no_length, SEC_ACLE_USER, bad, nullptr)), error);
    }
    EXPECT_EQ(outcome_of(sec_list_acl_by_type(&no_length, SEC_ACLE_GROUP, "", nullptr)),
              bad_parameter(by_type, 4));
    EXPECT_EQ(outcome_of(sec_list_acl_by_type(&no_length, SEC_ACLE_GROUP, "", &list)),
              bad_acl(msg::not_an_acl_buffer));
    const buffer cut(example.substr(0, 4));
    for (const char *mechanism : {static_cast<const char *>(nullptr), "unix"})
        EXPECT_EQ(outcome_of(sec_list_acl_by_type(&cut.acl, SEC_ACLE_USER, mechanism, &list)),
                  bad_acl(msg::buffer_corrupted));
}

TEST(edit, reports_what_it_refuses_and_leaves_the_buffer_alone) {
    const sec_acle_t al = user("unix", "al", 1);
    const std::tuple<std::string, sec_acle_t, failure> rows[] = {
        {rich, entry(by_handler, "unix", "a", 1), bad_acle(msg::acle_type_unknown, by_handler)},
        {rich, user("", "a", 1), bad_acle(msg::acle_lacks_key, SEC_ACLE_USER)},
        {"no ACL", group(nullptr, 1),
         bad_acle(msg::acle_lacks_key, SEC_ACLE_GROUP)}, // the entry before the buffer
        {foreign, al, bad_acl(msg::wrong_byte_order)},
        {"\x84\2\1"s, al, bad_acl(msg::second_argument_not_acl)},
        {"\x85\2\1"s, al, bad_acl(msg::buffer_version_unsupported)},
        {example.substr(0, 4), al, bad_acl(msg::buffer_corrupted)},
        {with_number(example, 5, 27, 4), user("abcd", "b", 1),
         bad_acl(msg::buffer_corrupted)}, // a byte too long
        {acl_bytes("n: 1, 1"), entry(SEC_ACLE_UNAUTHENTICATED, "", nullptr, 1),
         bad_acl(msg::single_acle_repeated)},
    };
    for (const auto edit : {sec_add_acle_to_acl, sec_add_acle_to_acl2, sec_del_acle_from_acl}) {
        for (const auto &[bytes, acle, error] : rows) {
            buffer held(bytes);
            EXPECT_EQ(outcome_of(edit(&acle, &held.acl)), error);
            EXPECT_EQ(held.bytes(), bytes) << error;
        }
        const char *name = edit == sec_del_acle_from_acl ? "sec_del_acle_from_acl" : "sec_add_acle_to_acl";
        EXPECT_EQ(outcome_of(edit(nullptr, nullptr)), bad_parameter(name, 1));
        EXPECT_EQ(outcome_of(edit(&al, nullptr)), bad_parameter(name, 2));
    }
}

TEST(edit, holds_at_most_65534_bytes_of_identity) {
    const std::string longest(65534, 'i');
    const std::string too_long = longest + "i";
    const sec_acle_t refused = group(too_long.c_str(), 7);
    const sec_acle_t fitting = group(longest.c_str(), 7);
    const std::string sorted = entry_bytes("a 1") + entry_bytes("b 2");
    // A buffer that the call makes, which goes with its failure; one changed in place, one rebuilt.
    for (const std::string &bytes : {""s, acl_bytes("g: a 1, b 2"), acl_bytes("g: b 2, a 1")}) {
        buffer held(bytes);
        EXPECT_EQ(outcome_of(sec_add_acle_to_acl(&refused, &held.acl)),
                  bad_acle(msg::acle_lacks_key, SEC_ACLE_GROUP));
        EXPECT_EQ(held.bytes(), bytes);
        EXPECT_EQ(outcome_of(sec_add_acle_to_acl(&fitting, &held.acl)), no_error);
        EXPECT_TRUE(
            held.bytes().ends_with((bytes.empty() ? "" : sorted) + packed_entry(7, text_field(longest))));
    }
}

TEST(edit, holds_at_most_65535_subacls) {
    std::string subacls;
    for (int number = 10000; number < 75535; ++number)
        subacls += subacl_bytes("e " + std::to_string(number) + ": a 1");
    const std::string full = packed_acl(65535, subacls);
    const std::string added = subacl_bytes("u more: a 1");
    const std::string size = std::to_string(full.size() + added.size());
    const sec_acle_t more = user("more", "a", 1);
    const sec_acle_t last = expanded("75534", "A", 1);
    buffer held(full);
    EXPECT_EQ(outcome_of(sec_add_acle_to_acl(&more, &held.acl)),
              error_of(SEC_S_NO_MEMORY, msg::no_memory, "sec_add_acle_to_acl", size));
    EXPECT_EQ(sec_del_acle_from_acl(&last, &held.acl), SEC_S_OK);
    EXPECT_EQ(sec_add_acle_to_acl(&more, &held.acl), SEC_S_OK);
    EXPECT_TRUE(held.bytes() == full.substr(0, full.size() - 25) + added);
}

// A handler is shown identities where they stand, and may keep one to add it: the buffer moves while that is done.
TEST(edit, adds_an_identity_that_lies_in_the_buffer) {
    buffer held(acl_bytes("u unix: of-a-long-name-that-makes-the-buffer-move 1"));
    sec_acle_t acle = user("unix", "", 2);
    acle.identity = static_cast<char *>(held.acl.data) + held.acl.length - 5;
    EXPECT_EQ(outcome_of(sec_add_acle_to_acl(&acle, &held.acl)), no_error);
    EXPECT_EQ(held.bytes(), acl_bytes("u unix: move 2, of-a-long-name-that-makes-the-buffer-move 1"));
}

// What cannot be expanded is named on standard output.
TEST(dump, prints_acls_and_their_parts) {
    const buffer repeated(acl_bytes("o: 1, 1; n: 7; g: Admins 17, staff 18; e kRb5: z 4"));
    const buffer no_acl("\x84\1\2\0\0"s);
    std::string wanted = read_file(QZ_TESTS "/dumps.txt");
    wanted.replace(wanted.find("ORDER"), 5, std::to_string(this_order));
    testing::internal::CaptureStdout();
    testing::internal::CaptureStderr();
    sec__dump_acl(nullptr);
    sec__dump_subacl(nullptr, "");
    sec__dump_acltree(nullptr, "");
    sec__dump_acle(nullptr, nullptr, "");
    sec__dump_acl(&repeated.acl);
    sec__dump_acl(&no_acl.acl);
    sec__dump_subacl(example.data() + 5, nullptr);
    EXPECT_EQ(testing::internal::GetCapturedStdout(), bad_acl(msg::single_acle_repeated).text);
    EXPECT_EQ(testing::internal::GetCapturedStderr(), wanted);
    EXPECT_EQ(recorded_error(), no_error);
}
