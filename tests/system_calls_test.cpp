// Each system call fails in turn with several errors: what each failure leads to, and what is left.
#include "acl_files.h"

#include <regex>

namespace {

using namespace support;

// The result of a failing call, with the name of its message.
struct told {
    int id;
    int code;
    const char *name;
    bool shows_error; // of the system, or 0 when the file is another
};
constexpr bool shows_errno = true;
constexpr bool shows_none = false;
const told results[] = {
    {0, SEC_S_OK, "ok", shows_none},
    {msg::unknown_user.id, SEC_S_UNKNOWN_USER, "unknown_user", shows_none},
    {msg::working_directory_unknown.id, SEC_S_BAD_FILENAME, "working_directory_unknown", shows_errno},
    {msg::bad_acl_file_name.id, SEC_S_BAD_FILENAME, "bad_acl_file_name", shows_errno},
    {msg::cannot_open_acl_file.id, SEC_S_FILE_ERROR, "cannot_open_acl_file", shows_errno},
    {msg::bad_file_name.id, SEC_S_FILE_ERROR, "bad_file_name", shows_errno},
    {msg::cannot_open_file.id, SEC_S_FILE_ERROR, "cannot_open_file", shows_errno},
    {msg::short_read.id, SEC_S_FILE_ERROR, "short_read", shows_errno},
    {msg::cannot_open_for_writing.id, SEC_S_FILE_ERROR, "cannot_open_for_writing", shows_none},
    {msg::cache_mode_differs.id, SEC_S_FILE_ERROR, "cache_mode_differs", shows_none},
    {msg::short_write.id, SEC_S_FILE_ERROR, "short_write", shows_errno},
    {msg::cannot_set_owner.id, SEC_S_FILE_ERROR, "cannot_set_owner", shows_none},
    {msg::cannot_set_mode.id, SEC_S_FILE_ERROR, "cannot_set_mode", shows_none},
    {msg::cannot_rename_cache.id, SEC_S_FILE_ERROR, "cannot_rename_cache", shows_none},
};
const told &result_of(const outcome &now) {
    const auto found = std::ranges::find(results, std::pair(now.id, now.code),
                                         [](const told &each) { return std::pair(each.id, each.code); });
    EXPECT_NE(found, std::end(results)) << now;
    return found == std::end(results) ? results[0] : *found;
}

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

std::string section(const std::string &name) {
    const std::string all = read_file(QZ_TESTS "/system_calls.results");
    const std::string head = "[" + name + "]\n";
    const std::size_t found = all.find(head);
    EXPECT_NE(found, std::string::npos) << name;
    const std::size_t start = found + head.size();
    return all.substr(start, all.find("\n\n", start) + 1 - start);
}

struct system_calls : files {
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
            told_names.insert(result_of(now).name);
            const int error = is_clean_up || is_close ? ENOSPC : std::max(fault, 0);
            const std::regex number("\\b" + std::to_string(error) + "\\b");
            EXPECT_TRUE(!result_of(now).shows_error || std::regex_search(now.text, number)) << now.text;
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
        EXPECT_EQ(found, section(row.name));
    }
};

TEST_F(system_calls, of_readers_fail) {
    const auto read_text = [] { return read_acl("acl", text_only); };
    const auto read_text_of_user = [] { return read_acl("acl", text_only, user_name()); };
    const auto read_cache = [this] { return read_acl(path, checked); };
    const auto renew_cache = [this] { return read_acl(path, checked | cached); };
    expect_results({"a text by a relative name is read", no_cache, read_text});
    expect_results({"a text of a user is read", no_cache, read_text_of_user});
    expect_results({"a cache is read", from_text.bytes, read_cache});
    expect_results({"a stale cache is replaced by a reader", stale_cache, renew_cache});
}

TEST_F(system_calls, of_writers_fail) {
    const auto write_cache = [this] { return check(path); };
    expect_results({"the first cache is written", no_cache, write_cache});
    expect_results({"the next cache is written", stale_cache, write_cache});
    expect_results({"there is no room for the first cache", no_cache, write_cache, disk::is_full});
    expect_results({"there is no room for the next cache", stale_cache, write_cache, disk::is_full});
}

TEST_F(system_calls, of_files_with_entries_fail) {
    if (!has_entries())
        GTEST_SKIP() << "the file system has no POSIX ACLs";
    const auto read_cache = [this] { return read_acl(path, checked); };
    const auto write_cache = [this] { return check(path); };
    expect_results(
        {"a cache with entries is read", from_text.bytes, read_cache, disk::has_room, posix_acl::of_both});
    expect_results({"the first cache with entries is written", no_cache, write_cache, disk::has_room,
                    posix_acl::of_both});
}

} // namespace
