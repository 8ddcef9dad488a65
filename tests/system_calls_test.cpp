// Each system call fails in turn with several errors: what each failure leads to, and what is left.
#include "acl_files.h"

#include <regex>

namespace {

using namespace support;

// On a full disk, a partial file is cleaned up.
enum class disk : std::uint8_t { has_room, is_full };
// Whether the text and the cache have the entries of a POSIX ACL.
enum class posix_acl : std::uint8_t { none, of_both };

struct way { // to pass through the system, with a section of system_calls.results
    std::string name;
    std::string cache_bytes; // and that it is older than the text
    std::function<outcome()> call;
    disk room = disk::has_room;
    posix_acl entries = posix_acl::none;
};

std::string text_between(const std::string &text, const std::string &head, const std::string &end) {
    const std::size_t found = text.find(head);
    EXPECT_NE(found, std::string::npos) << head;
    const std::size_t start = found + head.size();
    return text.substr(start, text.find(end, start) - start);
}
const std::string results = read_file(QZ_TESTS "/system_calls.results");

// The name of the message, by its number, the code, and whether it shows the error.
std::string name_of(const outcome &now, int error) {
    if (now.code == SEC_S_OK && now.id == 0)
        return "ok";
    const std::regex number(" " + std::to_string(error) + "\\b");
    const std::string shown = std::regex_search(now.text, number) ? ", shows errno" : "";
    const std::string code = ", code " + std::to_string(now.code);
    return text_between(results, now.text.substr(0, 8) + code + shown + ": ", "\n");
}

struct system_calls : files {
    const std::function<outcome()> read_cache = [this] { return read_acl(path, checked); };
    const std::function<outcome()> write_cache = [this] { return check(path); };

    outcome run(const way &row, std::size_t at, int fault) const {
        lay_out(row.cache_bytes, row.cache_bytes == stale_cache ? 200 : 0);
        if (row.entries == posix_acl::of_both)
            give_both_entries();
        const auto fault_of = [&](std::size_t index) {
            if (index == at)
                return fault;
            return row.room == disk::is_full && is_about_to("write") ? ENOSPC : faults::no_fault;
        };
        return watched(fault_of, row.call);
    }

    // The result of one failing call, which must not depend on the error.
    std::string result_of_call(const way &row, std::size_t at, const std::string &call,
                               bool is_clean_up) const {
        const bool is_transfer = call == "read" || call == "write";
        const bool is_close = call == "close";
        // Only what could not be removed is left.
        const std::size_t names = (row.cache_bytes.empty() ? 1 : 2) + (is_clean_up && !is_close ? 1 : 0);
        std::set<std::string> told_names;
        for (const int fault :
             {EACCES, EIO, ENOSPC, EDQUOT, EROFS, EMFILE, ENAMETOOLONG, ESTALE, faults::short_transfer}) {
            if (fault == faults::short_transfer && !is_transfer)
                continue;
            SCOPED_TRACE(testing::Message() << call << " fails with " << fault);
            const std::size_t descriptors = names_in("/proc/self/fd").size();
            const outcome now = run(row, at, fault);
            told_names.insert(name_of(now, is_clean_up || is_close ? ENOSPC : std::max(fault, 0)));
            EXPECT_EQ(names_in("/proc/self/fd").size(), descriptors);
            const bool is_read = now.code == SEC_S_OK;
            EXPECT_TRUE(!is_read || now.bytes.empty() || now.bytes == from_text.bytes);
            const std::string kept = read_file(cache);
            EXPECT_TRUE(kept == row.cache_bytes || (is_read && kept == from_text.bytes));
            const std::size_t left = names_in(folder.path).size();
            EXPECT_TRUE(left == names || (is_read && left == 2));
        }
        EXPECT_EQ(told_names.size(), 1u) << call;
        return *told_names.begin();
    }

    void expect_results(const way &row) const {
        SCOPED_TRACE(row.name);
        run(row, SIZE_MAX, faults::no_fault);
        const arguments calls = faults::calls;
        const auto written = std::ranges::find(calls, "write") - calls.begin();
        std::string found;
        for (std::size_t at = 0; at < calls.size(); ++at) {
            const bool is_clean_up = row.room == disk::is_full && static_cast<long>(at) > written;
            found += calls[at] + ": " + result_of_call(row, at, calls[at], is_clean_up) + "\n";
        }
        EXPECT_EQ(found, text_between(results, "[" + row.name + "]\n", "\n\n") + "\n");
    }
};

TEST_F(system_calls, of_readers_fail) {
    const auto read_text = [] { return read_acl("acl", text_only); };
    const auto read_text_of_user = [] { return read_acl("acl", text_only, user_name()); };
    const auto renew_cache = [this] { return read_acl(path, checked | cached); };
    expect_results({"a text by a relative name is read", no_cache, read_text});
    expect_results({"a text of a user is read", no_cache, read_text_of_user});
    expect_results({"a cache is read", from_text.bytes, read_cache});
    expect_results({"a stale cache is replaced by a reader", stale_cache, renew_cache});
}

TEST_F(system_calls, of_writers_fail) {
    expect_results({"the first cache is written", no_cache, write_cache});
    expect_results({"the next cache is written", stale_cache, write_cache});
    expect_results({"there is no room for the first cache", no_cache, write_cache, disk::is_full});
    expect_results({"there is no room for the next cache", stale_cache, write_cache, disk::is_full});
}

TEST_F(system_calls, of_files_with_entries_fail) {
    if (!has_entries())
        GTEST_SKIP() << "the file system has no POSIX ACLs";
    expect_results(
        {"a cache with entries is read", from_text.bytes, read_cache, disk::has_room, posix_acl::of_both});
    expect_results({"the first cache with entries is written", no_cache, write_cache, disk::has_room,
                    posix_acl::of_both});
}

} // namespace
