// Each allocation of each operation fails in turn, once and from then on: what is reported, and what is left. Also,
// the number of allocations for a text is small.
#include "acl_files.h"

namespace {

using namespace support;

// The results of operations. A failed one leaves nothing.
struct made_things {
    sec_acl_buffer_t acl = {};
    sec_aclelist_t list = {};
    sec_acle_t *acle = nullptr;
    char *mechanism = nullptr;
    char *identity = nullptr;

    bool is_empty() const {
        return acl.data == nullptr && list.acles == nullptr && acle == nullptr && mechanism == nullptr &&
               identity == nullptr;
    }
    void release() {
        std::free(acl.data);
        sec_release_aclelist(&list);
        sec_release_acle(acle);
        std::free(mechanism);
        std::free(identity);
        *this = {};
    }
};

struct use {
    std::string name; // or the functions that the message may name
    std::function<int(sec_acl_buffer_t &)> call;
    bool is_tolerated = false; // may succeed without the memory
};
constexpr bool tolerated = true;

struct allocations : files {
    made_things made;

    int read(unsigned flags) {
        lay_out(from_text.bytes, 0);
        return sec_read_acl_file("acl", user_name(), nullptr, flags, &made.acl, nullptr);
    }

    // Returns the number of allocations.
    std::size_t run(const use &row, const faults::allocations_seen &failing) {
        SCOPED_TRACE(testing::Message()
                     << "allocation " << failing.fails_at << (failing.fails_on ? " and on" : ""));
        buffer held(rich);
        const auto live = faults::allocations.live;
        faults::allocations_seen seen;
        const outcome now = watched({}, [&] {
            faults::allocations = failing;
            faults::allocations.live = live;
            const int result = row.call(held.acl);
            seen = faults::allocations;
            faults::allocations = {.live = seen.live};
            return recorded(result);
        });
        EXPECT_TRUE(now.code == SEC_S_OK || made.is_empty());
        made.release();
        EXPECT_TRUE(failing.fails_at == 0 || faults::allocations.live == live) << "leaks";
        if (failing.fails_at == 0 || (row.is_tolerated && now.code == SEC_S_OK)) {
            EXPECT_EQ(now.code, SEC_S_OK) << now.text;
            return seen.count;
        }
        EXPECT_EQ(now.code, SEC_S_NO_MEMORY);
        // A deletion may have happened all the same, with the memory kept.
        EXPECT_TRUE(row.name.find("del") != std::string::npos || held.bytes() == rich);
        expect_told(row, now, seen.refused, failing);
        return seen.count;
    }

    void fail_each(const use &row) {
        SCOPED_TRACE(row.name);
        run(row, {}); // also makes what stays allocated afterwards
        const std::size_t count = run(row, {});
        EXPECT_GT(count, 0u);
        for (std::size_t at = 1; at <= count; ++at) {
            run(row, {.fails_at = at});
            run(row, {.fails_at = at, .fails_on = true});
        }
    }

    // The command prints the failure, from memory that it reserved, or reports that it wrote no cache.
    static void expect_told(const use &row, const outcome &now, std::size_t size,
                            const faults::allocations_seen &failing) {
        if (now.id != msg::no_memory.id) {
            const bool is_skipped = failing.fails_on && now.id == msg::cache_skipped_after_errors.id;
            EXPECT_TRUE(is_skipped || printed.find("3417-102") != std::string::npos) << now.text;
            return;
        }
        const auto is_told = [&](const std::string &fact) {
            return now.text.find(fact) != std::string::npos;
        };
        const bool is_public = row.name.find('_') != std::string::npos;
        EXPECT_TRUE(!is_public || std::ranges::any_of(words(row.name), is_told)) << now.text;
        // The size in a message may lack the NUL after a text, or the converter's reserve.
        arguments sizes;
        for (const std::size_t room : {0u, 1u, 16u})
            sizes.push_back(" " + std::to_string(size - room) + " bytes");
        EXPECT_TRUE(failing.fails_on || std::ranges::any_of(sizes, is_told)) << size << " in " << now.text;
    }
};

using acl_buffer = sec_acl_buffer_t;

TEST_F(allocations, of_buffers_and_edits_fail) {
    const std::string long_name(5000, 'x');
    const sec_acle_t ann = user("krb", "Ann", 3);
    const sec_acle_t present = user("unix", "al", 1);
    const sec_acle_t large = user("unix", long_name.c_str(), 1);
    const sec_acle_t m = expanded("kRb5", "m", 1);
    const sec_acle_t z = expanded("krb5", "z", 0);
    fail_each({"sec_create_empty_acl", [&](acl_buffer &) { return sec_create_empty_acl(&made.acl); }});
    fail_each({"sec_read_acl_from_data",
               [&](acl_buffer &acl) { return sec_read_acl_from_data(acl.length, acl.data, &made.acl); }});
    fail_each({"list", [&](acl_buffer &acl) { return sec_list_acl(&acl, &made.list); }});
    fail_each({"list type", [&](acl_buffer &acl) {
                   return sec_list_acl_by_type(&acl, SEC_ACLE_EXPANDED, "krb5", &made.list);
               }});
    // Packed sub-ACLs are changed in place; the rest is expanded and compiled again.
    fail_each({"sec_add_acle_to_acl", [&](acl_buffer &acl) { return sec_add_acle_to_acl(&large, &acl); }});
    fail_each(
        {"sec_del_acle_from_acl", [&](acl_buffer &acl) { return sec_del_acle_from_acl(&present, &acl); }});
    fail_each({"add", [&](acl_buffer &acl) { return sec_add_acle_to_acl2(&m, &acl); }});
    fail_each({"add a sub-ACL", [&](acl_buffer &acl) { return sec_add_acle_to_acl(&ann, &acl); }});
    fail_each({"delete", [&](acl_buffer &acl) { return sec_del_acle_from_acl(&z, &acl); }});
}

TEST_F(allocations, of_entries_and_handlers_fail) {
    const sec_acle_t ann = user("krb", "Ann", 3);
    fail_each(
        {"sec_create_acle sec__create_acle acl__convert_to_utf8",
         [&](acl_buffer &) { return sec_create_acle(SEC_ACLE_USER, 1, "unix", "ann@0::1", &made.acle); },
         tolerated});
    fail_each({"sec_display_acle_id acl__convert_from_utf8",
               [&](acl_buffer &) { return sec_display_acle_id(&ann, &made.mechanism, &made.identity); },
               tolerated});
    fail_each({"sec__register_id_handler acl__register_id_handler", [](acl_buffer &) {
                   return sec__register_id_handler(SEC_ID_HANDLER_EXPANDED, "faulty", std::strcmp);
               }});
}

TEST_F(allocations, of_files_fail) {
    const auto check_and_tell = [&](acl_buffer &) {
        lay_out();
        return aclfck__bulk_aclfile(path.c_str(), nullptr, ACLFCK_OPT_COMPILE | ACLFCK_OPT_VERBOSE);
    };
    fail_each({"read the text", [&](acl_buffer &) { return read(text_only); }});
    fail_each({"read and cache", [&](acl_buffer &) { return read(text_only | cached); }});
    fail_each({"read the cache", [&](acl_buffer &) { return read(checked); }, tolerated});
    fail_each({"check", check_and_tell, tolerated});
}

// Duplicates are reported late; the first mistake is reported all the same.
TEST_F(files, tell_their_first_mistake) {
    const int duplicate = msg::duplicate_group.id;
    const int bad_type = msg::bad_type_token.id;
    const std::string twice = "g a\ng A\n";
    const std::string bad = "x y\n";
    const auto repeated = [](int times, const std::string &lines) {
        std::string all;
        while (times-- != 0)
            all += lines;
        return all;
    };
    const auto good = [](int count) {
        std::string lines;
        while (count-- != 0)
            lines += "g member" + std::to_string(count) + "\n";
        return lines;
    };
    const std::pair<std::string, int> rows[] = {
        {twice, duplicate},
        {twice + bad, duplicate},
        {bad + twice, bad_type},
        {"g a\n" + bad + "g A\n", bad_type},
        {twice + std::string(1200, 'x'), duplicate},
        {twice + good(100) + bad, duplicate},
        {good(100) + twice + good(3), duplicate},
        {good(40) + "g MEMBER39\n", duplicate},
        {good(3) + repeated(100, twice) + bad, duplicate},
    };
    for (const auto &[text, id] : rows) {
        write_file(path, text);
        EXPECT_EQ(read_acl(path, text_only).id, id) << text;
        EXPECT_EQ(watched({}, [this] { return check(path, no_options); }).id, id) << text;
    }
}

TEST_F(files, are_read_with_few_allocations) {
    std::string lines;
    std::size_t counts[2];
    for (std::size_t &count : counts) { // 1,000 entries, then twice as many
        for (int index = 0; index < 1000; ++index)
            lines += "u unix user" + std::to_string(lines.size()) + "@host r\n";
        write_file(path, lines);
        faults::allocations.count = 0;
        EXPECT_EQ(read_acl(path, text_only).code, SEC_S_OK);
        count = faults::allocations.count;
    }
    EXPECT_LT(counts[1], 100u);
    EXPECT_LE(counts[1], counts[0] + 10);
}

// They may be as long as the text.
TEST_F(files, are_read_without_copying_the_tokens_of_a_line_that_is_too_long) {
    std::vector<std::size_t> counts;
    for (const char filling : {' ', 'x'}) {
        write_file(path, std::string(2000, filling));
        faults::allocations.count = 0;
        EXPECT_EQ(read_acl(path, text_only).id, msg::line_too_long.id);
        counts.push_back(faults::allocations.count);
    }
    EXPECT_EQ(counts[0], counts[1]);
}

} // namespace
