// Whole compiled buffers, and what the dump prints of entries, trees, sub-ACLs and buffers, hostile ones
// included.
#include "qzacl_acl/buffer.h"
#include "qzacl_acl/tree.h"
#include "support.h"

#include <random>

using namespace support;

namespace {

sec_acl_buffer_t descriptor_of(const guarded &bytes) {
    return {static_cast<std::int32_t>(bytes.size()), bytes.data()};
}

const std::string alice = packed_subacl(4, "unix\0"sv, 1, packed_entry(3, "alice\0"sv));
const std::string bob = packed_subacl(4, "KDZ\0"sv, 1, packed_entry(1, "bob\0"sv));
const std::string expanded = packed_subacl(8, "unix\0"sv, 1, packed_entry(4, "*@host\0"sv));
const std::string groups =
    packed_subacl(16, "", 2, packed_entry(1, "adm\0"sv) + packed_entry(2, "Staff\0"sv));
const std::string any = packed_subacl(2, "", 1, packed_entry(0x1000, ""));
const std::string all = packed_acl(5, alice + bob + expanded + groups + any);

TEST(buffers, are_made_empty) {
    sec_acl_buffer_t acl = {77, nullptr};
    EXPECT_EQ(sec_create_empty_acl(nullptr), 4);
    EXPECT_EQ(sec_create_empty_acl(&acl), 0); // which leaves the error
    EXPECT_EQ(recorded_error(), error_of(4, 88, {"sec_create_empty_acl", "1", "0"}));
    ASSERT_EQ(acl.length, 5);
    EXPECT_EQ(std::memcmp(acl.data, "\x85\1\2\0\0", 5), 0);
    EXPECT_EQ(sec_release_acl(&acl), 0);
}

TEST(buffers, are_taken_over_unexamined) {
    const auto refused = [](const char *position, const char *value) {
        return error_of(4, 88, {"sec_read_acl_from_data", position, value});
    };
    sec_acl_buffer_t acl = {77, nullptr};
    const struct {
        int length;
        const char *data;
        sec_acl_buffer_t *acl;
        failure error;
    } rows[] = {
        {0, nullptr, nullptr, refused("1", "0")},
        {-2, "x", &acl, refused("1", "fffffffe")},
        {1, nullptr, nullptr, refused("2", "0")},
        {1, "x", nullptr, refused("3", "0")},
        {4, "junk", &acl, {}},
    };
    for (const auto &row : rows) {
        EXPECT_EQ(acl.length, 77);
        EXPECT_EQ(sec_read_acl_from_data(row.length, row.data, row.acl), row.error.code);
        EXPECT_EQ(recorded_error(), row.error);
    }
    ASSERT_EQ(acl.length, 4);
    EXPECT_EQ(std::memcmp(acl.data, "junk", 4), 0);

    void *const junk = acl.data;
    EXPECT_EQ(sec_release_acl(&acl), 42);
    EXPECT_EQ(recorded_error(), error_of(42, 93));
    EXPECT_EQ(acl.length, 4);
    ASSERT_EQ(acl.data, junk);
    *static_cast<char *>(junk) = '\x85';
    for (int time : {1, 2}) {
        EXPECT_EQ(sec_release_acl(&acl), 0) << time;
        EXPECT_EQ(acl.length, 0);
        EXPECT_EQ(acl.data, nullptr);
    }
    EXPECT_EQ(sec_release_acl(nullptr), 0);
}

TEST(buffers, give_the_first_subacl_of_a_key) {
    const std::string twice = packed_acl(3, any + alice + packed_subacl(4, "unix\0"sv, 0, ""));
    // A length that leads back into the sub-ACL's own header, where another one could be read.
    const std::string inner = packed_acl(2, number(5, 4) + "\4"s + number(0, 4) + "\2x\0"s + number(0, 8));
    constexpr std::ptrdiff_t nowhere = -1;
    const struct {
        std::string bytes;
        int type;
        const char *mechanism;
        std::ptrdiff_t offset;
    } rows[] = {
        {all, 4, "UNIX", 5},
        {all, 4, "kdz", 5 + std::ssize(alice)},
        {all, 4, "kd", nowhere},
        {all, 4, "kdzz", nowhere},
        {all, 8, "Unix", 5 + std::ssize(alice + bob)},
        {all, 8, "kdz", nowhere},
        {all, 16, "whatever", 5 + std::ssize(alice + bob + expanded)},
        {all, 2, nullptr, 5 + std::ssize(alice + bob + expanded + groups)},
        {all, 1, nullptr, nowhere},
        {twice, 4, "unix", 5 + std::ssize(any)},
        {packed_acl(0, alice), 4, "unix", nowhere},
        {packed_acl(1, alice + any), 2, nullptr, nowhere},
        {packed_acl(9, alice), 2, nullptr, nowhere},
        {inner, 2, nullptr, nowhere},
        {"\x85\1\2", 2, nullptr, nowhere},
    };
    for (const auto &row : rows) {
        const guarded bytes(row.bytes);
        const sec_acl_buffer_t acl = descriptor_of(bytes);
        const auto *found = reinterpret_cast<const unsigned char *>(&acl);
        EXPECT_EQ(sec__find_subacl(&acl, static_cast<std::uint8_t>(row.type), row.mechanism, &found), 0);
        const std::ptrdiff_t offset =
            found == nullptr ? nowhere : reinterpret_cast<const char *>(found) - bytes.data();
        EXPECT_EQ(offset, row.offset) << row.type << ' ' << row.mechanism;
    }
}

// ---- The dump ----

TEST(dump, prints_an_entry_by_its_type) {
    const std::string bad_bit = error_of(36, 164, {"00002000"}).text;
    const sec_perm_template_t templates[] = {{0x2000, 'Z', "", ""}};
    const sec_perm_set_t own = {1, templates};
    const struct {
        sec_acle_t acle;
        const sec_perm_set_t *set;
        const char *indentation;
        std::string line;
    } rows[] = {
        {entry(1, "", nullptr, 0), nullptr, "", "type = n; permission = \n"},
        {entry(2, "", nullptr, 0x1fff), nullptr, "\t", "\ttype = o; permission = rwcxCqledvsao\n"},
        {entry(4, "unix", "alice", 3), nullptr, "", "type = u; mech = unix; id = alice; permission = rw\n"},
        {entry(8, "hba2", "%s%1$s", 4), nullptr, " ",
         " type = e; mech = hba2; id = %s%1$s; permission = c\n"},
        {entry(16, "", "staff", 0x10), nullptr, "", "type = g; id = staff; permission = C\n"},
        {entry(16, "", "staff", 0x2000), &own, "", "type = g; id = staff; permission = Z\n"},
        {entry(16, "", "staff", 0x2001), nullptr, "x", bad_bit},
        {entry(4, "unix", "", 1), nullptr, "x", error_of(43, 95).text},
        {entry(9, "unix", "x", 1), nullptr, "x", error_of(43, 94, {"9"}).text},
    };
    for (const auto &row : rows)
        EXPECT_EQ(output_of([&] { sec__dump_acle(&row.acle, row.set, row.indentation); }),
                  output("", row.line));
    EXPECT_EQ(recorded_error(), failure{});
}

TEST(dump, prints_nothing_of_nothing) {
    cu_set_error_1(42, 0, "", 1, 93, "kept");
    const sec_acl_buffer_t empty = {};
    EXPECT_EQ(output_of([&] {
                  sec__dump_acle(nullptr, nullptr, "");
                  sec__dump_acltree(nullptr, "");
                  sec__dump_subacl(nullptr, "");
                  sec__dump_acl(nullptr);
                  sec__dump_acl(&empty);
              }),
              output{});
    recorded_error();
}

std::string head_line(const char *indentation, std::size_t length, int type, const char *mechanism,
                      int count) {
    return error_of(0, 84,
                    {indentation, indentation, std::to_string(length), std::to_string(type), mechanism,
                     std::to_string(count)})
               .text +
           "\n";
}

TEST(dump, prints_buffers_and_subacls) {
    const auto acl_line = [](std::size_t length, int subacls) {
        return "ACL descriptor: " + std::to_string(length) +
               " byte(s) long\n\tVersion: 1\n\tByte Ordering: 2\n" +
               "\tNumber of sub-ACLs: " + std::to_string(subacls) + "\n";
    };
    const std::string not_valid = "The ACL provided is not valid!\n\n";
    const std::string repeated = packed_subacl(2, "", 2, packed_entry(1, "") + packed_entry(2, ""));
    const struct {
        std::string bytes;
        output printed;
    } rows[] = {
        {"\x85\1\2\0\0"s, {"", acl_line(5, 0)}},
        {"\x84\1\2\0\0"s, {"", not_valid}},
        {"x", {"", not_valid}},
        {all,
         {"", acl_line(all.size(), 5) + head_line("\t", alice.size(), 4, "unix", 1) + //
                  "\t\ttype = u; mech = unix; id = alice; permission = rw\n" +        //
                  head_line("\t", bob.size(), 4, "KDZ", 1) +                          //
                  "\t\ttype = u; mech = KDZ; id = bob; permission = r\n" +            //
                  head_line("\t", expanded.size(), 8, "unix", 1) +                    //
                  "\t\ttype = e; mech = unix; id = *@host; permission = c\n" +        //
                  head_line("\t", groups.size(), 16, "", 2) +                         //
                  "\t\ttype = g; id = adm; permission = r\n" +                        //
                  "\t\ttype = g; id = Staff; permission = w\n" +                      //
                  head_line("\t", any.size(), 2, "", 1) +                             //
                  "\t\ttype = o; permission = o\n"}},
        // What cannot be expanded gives its reason on the other stream, and the dump goes on.
        {packed_acl(2, repeated + any),
         {error_of(42, 98).text,
          acl_line(5 + repeated.size() + any.size(), 2) + head_line("\t", repeated.size(), 2, "", 2) +
              head_line("\t", any.size(), 2, "", 1) + "\t\ttype = o; permission = o\n"}},
    };
    for (const auto &[bytes, printed] : rows) {
        const guarded copy(bytes);
        const sec_acl_buffer_t acl = descriptor_of(copy);
        EXPECT_EQ(output_of([&] { sec__dump_acl(&acl); }), printed);
        EXPECT_EQ(recorded_error(), failure{});
    }
    const guarded copy(alice);
    EXPECT_EQ(output_of([&] { sec__dump_subacl(copy.data(), "123456"); }).second,
              head_line("123456", alice.size(), 4, "unix", 1) +
                  "123456\ttype = u; mech = unix; id = alice; permission = rw\n");
}

TEST(dump, and_search_stay_inside_hostile_bytes) {
    std::mt19937 random(99);
    const output printed = output_of([&] {
        for (int round = 0; round < 20000; ++round) {
            std::string bytes = all;
            if (round % 2 == 0)
                bytes.resize(random() % (all.size() + 1));
            for (auto edits = random() % 4; edits != 0 && !bytes.empty(); --edits) {
                const std::string values = "\0\1\2\x08\x10\x11\x7f\xff"s + static_cast<char>(random());
                bytes[random() % bytes.size()] = values[random() % values.size()];
            }
            const guarded copy(bytes);
            const sec_acl_buffer_t acl = descriptor_of(copy);
            sec__dump_acl(&acl);
            const unsigned char *found = nullptr;
            sec__find_subacl(&acl, 4, "nobody", &found);
        }
    });
    EXPECT_FALSE(printed.second.empty());
    EXPECT_EQ(recorded_error(), failure{});
}

} // namespace
