// Whole compiled buffers, and what the dump prints of entries, sub-ACLs and buffers, hostile ones included.
#include "qzacl_acl/buffer.h"
#include "qzacl_acl/tree.h"
#include "support.h"

using namespace support;

const std::string alice = packed_subacl(4, "unix\0"sv, 1, packed_entry(3, "alice\0"sv));
const std::string bob = packed_subacl(4, "KDZ\0"sv, 1, packed_entry(1, "bob\0"sv));
const std::string expanded = packed_subacl(8, "unix\0"sv, 1, packed_entry(4, "*@host\0"sv));
const std::string groups = packed_subacl(16, "", 2, packed_entry(1, "adm\0"sv) + packed_entry(2, "Staff\0"sv));
const std::string any = packed_subacl(2, "", 1, packed_entry(0x1000, ""));
const std::string all = packed_acl(5, alice + bob + expanded + groups + any);

TEST(buffers, are_made_or_taken_over_unexamined_and_released) {
    sec_acl_buffer_t acl = {77, nullptr};
    const auto held = [&] { return std::string(static_cast<char *>(acl.data), static_cast<std::size_t>(acl.length)); };
    const std::string reader = "sec_read_acl_from_data";
    EXPECT_EQ(after(sec_read_acl_from_data(0, nullptr, nullptr)), bad_parameter(reader, 1));
    EXPECT_EQ(after(sec_read_acl_from_data(-2, "x", &acl)), bad_parameter(reader, 1, "fffffffe"));
    EXPECT_EQ(after(sec_read_acl_from_data(1, nullptr, nullptr)), bad_parameter(reader, 2));
    EXPECT_EQ(after(sec_read_acl_from_data(1, "x", nullptr)), bad_parameter(reader, 3));
    EXPECT_EQ(acl.length, 77);
    EXPECT_EQ(sec_create_empty_acl(nullptr), 4);
    EXPECT_EQ(sec_create_empty_acl(&acl), 0); // which leaves the error
    EXPECT_EQ(recorded_error(), bad_parameter("sec_create_empty_acl", 1));
    EXPECT_EQ(held(), "\x85\1\2\0\0"sv);
    EXPECT_EQ(sec_release_acl(&acl), 0);

    ASSERT_EQ(sec_read_acl_from_data(4, "junk", &acl), 0);
    EXPECT_EQ(after(sec_release_acl(&acl)), error_of(42, 93));
    ASSERT_EQ(held(), "junk");
    *static_cast<char *>(acl.data) = '\x85';
    for (int time : {1, 2}) {
        EXPECT_EQ(sec_release_acl(&acl), 0) << time;
        EXPECT_EQ(std::pair(acl.length, acl.data), std::pair(0, static_cast<void *>(nullptr)));
    }
    EXPECT_EQ(sec_release_acl(nullptr), 0);
}

TEST(dump, prints_buffers_and_subacls) {
    const auto acl_line = [](std::size_t length, const char *count) {
        return "ACL descriptor: " + std::to_string(length) +
               " byte(s) long\n\tVersion: 1\n\tByte Ordering: 2\n\tNumber of sub-ACLs: " + count + "\n";
    };
    const auto head = [](std::string tab, const std::string &subacl, auto type, auto mechanism, auto count) {
        const std::string length = std::to_string(subacl.size());
        return error_of(0, 84, {tab, tab, length, type, mechanism, count}).text + "\n" + tab + "\ttype = ";
    };
    const std::string alice_line = "u; mech = unix; id = alice; permission = rw\n";
    const std::string any_lines = head("\t", any, "2", "", "1") + "o; permission = o\n";
    const std::string repeated = packed_subacl(2, "", 2, packed_entry(1, "") + packed_entry(2, ""));
    const std::string without_entries = head("\t", repeated, "2", "", "2");
    const std::string partly = packed_acl(2, repeated + any);
    const std::pair<std::string, output> rows[] = {
        {"", {}},
        {"\x85\1\2\0\0"s, {"", acl_line(5, "0")}},
        {"\x84\1\2\0\0"s, {"", "The ACL provided is not valid!\n\n"}},
        {"x", {"", "The ACL provided is not valid!\n\n"}},
        {all,
         {"", acl_line(all.size(), "5") + head("\t", alice, "4", "unix", "1") + alice_line +
                  head("\t", bob, "4", "KDZ", "1") + "u; mech = KDZ; id = bob; permission = r\n" +
                  head("\t", expanded, "8", "unix", "1") + "e; mech = unix; id = *@host; permission = c\n" +
                  head("\t", groups, "16", "", "2") + "g; id = adm; permission = r\n" +
                  "\t\ttype = g; id = Staff; permission = w\n" + any_lines}},
        // What cannot be expanded gives its reason on the other stream, and the dump goes on.
        {partly,
         {error_of(42, 98).text,
          acl_line(partly.size(), "2") + without_entries.substr(0, without_entries.rfind('\n') + 1) + any_lines}},
    };
    for (const auto &[bytes, printed] : rows) {
        const guarded copy(bytes);
        const sec_acl_buffer_t acl = copy.acl();
        EXPECT_EQ(output_of([&] { sec__dump_acl(&acl); }), printed);
        EXPECT_EQ(recorded_error(), failure{});
    }
    const guarded copy(alice);
    const output printed = output_of([&] {
        sec__dump_subacl(copy.data(), "123456");
        sec__dump_acle(nullptr, nullptr, ""); // nothing of nothing
        sec__dump_acltree(nullptr, "");
        sec__dump_subacl(nullptr, "");
        sec__dump_acl(nullptr);
    });
    EXPECT_EQ(printed, output("", head("123456", alice, "4", "unix", "1") + alice_line));
}
