// Every allocation and every system call failing in turn, writers killed after each of their steps, files exchanged
// between any two, and torn caches: what is reported, what is left, and that no reader is ever told anything else
// than the text says.
#include "bulk_aclfile.h"
#include "faults.h"
#include "support.h"

#include <csignal>
#include <regex>
#include <set>
#include <sys/wait.h>

namespace {

using namespace support;
namespace fs = std::filesystem;

constexpr unsigned text_only = SEC_READ_ACL_TEXT;
constexpr unsigned cached = SEC_READ_ACL_CACHE;
constexpr unsigned checked = SEC_READ_ACL_CONVERT;
const std::string acl_text = "n r\nu unix alice@host rw\nu krb carl r\nu krb bob r\ne krb zoe q\ng staff q\n";
const std::string other_text = "u unix eve@host rwcx\ng other r\n";
const std::string no_cache;
const std::string stale_cache = "old";
const std::string both_caches[] = {no_cache, stale_cache};

std::set<std::string> names_in(const std::string &path) {
    std::set<std::string> names;
    for (const auto &item : fs::directory_iterator(path))
        names.insert(item.path().filename());
    return names;
}

struct outcome : failure { // of a read or a check, with the code that it gave and the buffer's bytes
    std::string bytes = {};
    bool operator==(const outcome &) const = default;
};

outcome recorded(int code, const std::string &bytes = "") {
    outcome found{recorded_error(), bytes};
    found.code = code;
    return found;
}
outcome read_acl(const std::string &path, unsigned flags, const char *user = nullptr) {
    buffer held;
    const int code = sec_read_acl_file(path.c_str(), user, nullptr, flags, &held.acl, nullptr);
    return recorded(code, held.bytes());
}
// The command's check with a cache written.
outcome check(const std::string &path, unsigned options = ACLFCK_OPT_COMPILE) {
    return recorded(aclfck__bulk_aclfile(path.c_str(), nullptr, options));
}

// Runs something watched, and keeps what it prints.
using faults_by_place = std::function<int(std::size_t)>;
std::string printed;
outcome watched(const faults_by_place &fault_of, const std::function<outcome()> &call) {
    testing::internal::CaptureStderr();
    const outcome result = faults::watched(fault_of, call);
    printed = testing::internal::GetCapturedStderr();
    return result;
}
// Does something before the call at a place.
faults_by_place before_step(std::size_t at, const std::function<void()> &act) {
    return [at, act](std::size_t index) {
        if (index == at)
            act();
        return faults::no_fault;
    };
}
bool is_about_to(const char *call) { return faults::calls.back() == call; }

// How a process ends that does this.
int status_of_child(const std::function<void()> &body) {
    const pid_t child = fork();
    if (child == 0) {
        body();
        _exit(0);
    }
    int status = -1;
    EXPECT_EQ(waitpid(child, &status, 0), child);
    return status;
}

const char *user_name() { return getpwuid(geteuid())->pw_name; }

struct files : testing::Test {
    const temporary_folder folder;
    const std::string path = folder / "acl";
    const std::string cache = path + ".cacl";
    outcome from_text;

    files() {
        lay_out();
        faults::home = folder.path;
        from_text = read_acl(path, text_only);
    }
    // The folder with the text of long ago, and beside it nothing, or a cache of the given bytes and age.
    void lay_out(const std::string &cache_bytes = no_cache, int cache_age = 200) const {
        fs::remove_all(folder.path);
        fs::create_directory(folder.path);
        fs::current_path(folder.path);
        write_file(path, acl_text, 100);
        if (!cache_bytes.empty())
            write_file(cache, cache_bytes, cache_age);
    }
    // Others than the owner may write the text and the cache. False where the file system has no such entries.
    bool give_both_entries() const {
        const bool has_cache = fs::exists(cache);
        return give_entries(path, 6, 6) && (!has_cache || give_entries(cache, 6, 6));
    }
    bool has_entries() const {
        lay_out();
        return give_both_entries();
    }
};

// ---- Memory ----

// What the operations make, each of which leaves nothing when it fails.
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
    std::string name; // or the functions of which the message names one
    std::function<int(sec_acl_buffer_t &)> call;
    bool is_tolerated = false; // fails or goes on without
};

struct allocations : files {
    made_things made;

    int read(unsigned flags) {
        lay_out(from_text.bytes, 0);
        return sec_read_acl_file("acl", user_name(), nullptr, flags, &made.acl, nullptr);
    }

    // Lets one allocation fail, from 1, and those behind it, too; 0 fails none. Tells how many there were.
    std::size_t run(const use &row, std::size_t failing, bool and_on) {
        SCOPED_TRACE(testing::Message() << "allocation " << failing << (and_on ? " and all behind" : ""));
        buffer held(rich);
        const auto live = faults::allocations.live;
        faults::allocations_seen seen;
        const outcome now = watched({}, [&] {
            faults::allocations = {.fails_at = failing, .fails_on = and_on, .live = live};
            const int result = row.call(held.acl);
            seen = faults::allocations;
            faults::allocations = {.live = seen.live};
            return recorded(result);
        });
        EXPECT_TRUE(now.code == SEC_S_OK || made.is_empty());
        made.release();
        EXPECT_TRUE(failing == 0 || faults::allocations.live == live) << "leaks";
        if (failing == 0 || (row.is_tolerated && now.code == SEC_S_OK)) {
            EXPECT_EQ(now.code, SEC_S_OK) << now.text;
            return seen.count;
        }
        EXPECT_EQ(now.code, SEC_S_NO_MEMORY);
        // A deletion may have happened all the same, with the memory kept.
        EXPECT_TRUE(row.name.find("del") != std::string::npos || held.bytes() == rich);
        expect_told(row, now, seen.refused, and_on);
        return seen.count;
    }

    void fail_each(const use &row) {
        SCOPED_TRACE(row.name);
        run(row, 0, false); // which also makes what then stays
        const std::size_t count = run(row, 0, false);
        EXPECT_GT(count, 0u);
        for (std::size_t failing = 1; failing <= count; ++failing) {
            run(row, failing, false);
            run(row, failing, true);
        }
    }

    // The command prints, for which it sets memory aside, or says that it wrote no cache.
    static void expect_told(const use &row, const outcome &now, std::size_t size, bool and_on) {
        if (now.id != msg::no_memory.id) {
            const bool is_skipped = and_on && now.id == msg::cache_skipped_after_errors.id;
            EXPECT_TRUE(is_skipped || printed.find("3417-102") != std::string::npos) << now.text;
            return;
        }
        const auto is_told = [&](const std::string &fact) {
            return now.text.find(fact) != std::string::npos;
        };
        const bool is_public = row.name.find('_') != std::string::npos;
        EXPECT_TRUE(!is_public || std::ranges::any_of(words(row.name), is_told)) << now.text;
        // A text is read with room for a NUL, and what is converted is told without the converter's room.
        arguments sizes;
        for (const std::size_t room : {0u, 1u, 16u})
            sizes.push_back(" " + std::to_string(size - room) + " bytes");
        EXPECT_TRUE(and_on || std::ranges::any_of(sizes, is_told)) << size << " in " << now.text;
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
    // What is packed is changed in place; the rest is expanded and compiled again.
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
         true});
    fail_each({"sec_display_acle_id acl__convert_from_utf8",
               [&](acl_buffer &) { return sec_display_acle_id(&ann, &made.mechanism, &made.identity); },
               true});
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
    fail_each({"read the cache", [&](acl_buffer &) { return read(checked); }, true});
    fail_each({"check", check_and_tell, true});
}

// Insertions wait for lines that come after them; what is told is the first mistake all the same.
TEST_F(files, tell_their_first_mistake) {
    const int duplicate = msg::duplicate_group.id;
    const int bad_type = msg::bad_type_token.id;
    const std::string twice = "g a\ng A\n";
    const std::string bad = "x y\n";
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
        {twice + good(14) + bad, duplicate},
        {twice + good(100) + bad, duplicate},
        {good(100) + twice + good(3), duplicate},
        {good(40) + "g MEMBER39\n", duplicate},
    };
    for (const auto &[text, id] : rows) {
        write_file(path, text);
        EXPECT_EQ(read_acl(path, text_only).id, id) << text;
        EXPECT_EQ(watched({}, [this] { return check(path, 0); }).id, id) << text;
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

// ---- System calls ----

// What a failing call leads to, by the name of the message.
struct told {
    int id;
    int code;
    const char *name;
    bool shows_error; // of the system, or 0 when the file is another
};
const told results[] = {
    {0, SEC_S_OK, "ok", false},
    {msg::unknown_user.id, SEC_S_UNKNOWN_USER, "unknown_user", false},
    {msg::working_directory_unknown.id, SEC_S_BAD_FILENAME, "working_directory_unknown", true},
    {msg::bad_acl_file_name.id, SEC_S_BAD_FILENAME, "bad_acl_file_name", true},
    {msg::cannot_open_acl_file.id, SEC_S_FILE_ERROR, "cannot_open_acl_file", true},
    {msg::bad_file_name.id, SEC_S_FILE_ERROR, "bad_file_name", true},
    {msg::cannot_open_file.id, SEC_S_FILE_ERROR, "cannot_open_file", true},
    {msg::short_read.id, SEC_S_FILE_ERROR, "short_read", true},
    {msg::cannot_open_for_writing.id, SEC_S_FILE_ERROR, "cannot_open_for_writing", false},
    {msg::cache_mode_differs.id, SEC_S_FILE_ERROR, "cache_mode_differs", false},
    {msg::short_write.id, SEC_S_FILE_ERROR, "short_write", true},
    {msg::cannot_set_owner.id, SEC_S_FILE_ERROR, "cannot_set_owner", false},
    {msg::cannot_set_mode.id, SEC_S_FILE_ERROR, "cannot_set_mode", false},
    {msg::cannot_rename_cache.id, SEC_S_FILE_ERROR, "cannot_rename_cache", false},
};
const told &result_of(const outcome &now) {
    const auto found = std::ranges::find(results, std::pair(now.id, now.code),
                                         [](const told &each) { return std::pair(each.id, each.code); });
    EXPECT_NE(found, std::end(results)) << now;
    return found == std::end(results) ? results[0] : *found;
}

struct way { // to pass through the system
    const char *name;
    std::string cache_bytes; // and that it is older than the text
    std::function<outcome()> call;
    std::string expected;     // each call, and the message when it fails
    bool is_full = false;     // so that nothing can be written, and what was begun is cleaned up
    bool has_entries = false; // of a POSIX ACL, the text and the cache
};

const std::string reading =
    "stat bad_file_name, open cannot_open_file, fstat bad_file_name, read short_read, close ok, ";
const std::string checking =
    "stat bad_acl_file_name, open cannot_open_acl_file, fstat bad_file_name, read short_read, ";
const std::string vetting = "stat bad_file_name, getxattr bad_file_name, ";
const std::string vetting_entries = "stat bad_file_name, getxattr bad_file_name, getxattr bad_file_name, ";
const std::string to_the_cache = "stat bad_file_name, stat bad_file_name, open cannot_open_for_writing, ";
const std::string first_cache = "fremovexattr cannot_set_mode, ";
const std::string next_cache = "fstat cannot_open_for_writing, fgetxattr cache_mode_differs, ";
const std::string writing = "stat cannot_open_for_writing, open cannot_open_for_writing, write short_write, ";
const std::string giving = "futimens short_write, fremovexattr cannot_set_mode, fchown cannot_set_owner, ";
const std::string finishing = "fchmod cannot_set_mode, fdatasync short_write, rename cannot_rename_cache, ";
const std::string removing = "fstat short_write, lstat short_write, unlink short_write, close short_write, ";
const std::string closing_both = "close ok, close ok, ";

struct system_calls : files {
    outcome run(const way &row, std::size_t at, int fault) const {
        lay_out(row.cache_bytes, row.cache_bytes == stale_cache ? 200 : 0);
        if (row.has_entries)
            give_both_entries();
        const auto fault_of = [&](std::size_t index) {
            if (index == at)
                return fault;
            return row.is_full && is_about_to("write") ? ENOSPC : faults::no_fault;
        };
        return watched(fault_of, row.call);
    }

    static void expect_error_shown(const outcome &now, int error) {
        const std::regex number("\\b" + std::to_string(error) + "\\b");
        EXPECT_TRUE(std::regex_search(now.text, number)) << now.text;
    }

    // What the failure of one call leads to, which the error makes no difference to.
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
            if (result_of(now).shows_error)
                expect_error_shown(now, is_clean_up || is_close ? ENOSPC : std::max(fault, 0));
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
            const bool is_clean_up = row.is_full && static_cast<long>(at) > written;
            found += calls[at] + " " + result_of_call(row, at, calls[at], is_clean_up) + ", ";
        }
        EXPECT_EQ(found, row.expected);
    }
};

const std::string to_full_disk = "close short_write, " + vetting + to_the_cache;
const std::string replacing = writing + giving + finishing + closing_both;

TEST_F(system_calls, of_readers_fail) {
    const auto read_text = [] { return read_acl("acl", text_only); };
    const auto read_text_of_user = [] { return read_acl("acl", text_only, user_name()); };
    const auto read_cache = [this] { return read_acl(path, checked); };
    const auto renew_cache = [this] { return read_acl(path, checked | cached); };
    expect_results(
        {"text by a relative name", no_cache, read_text, "getcwd working_directory_unknown, " + reading});
    expect_results({"text of a user", no_cache, read_text_of_user, "getpwnam_r unknown_user, " + reading});
    expect_results(
        {"cache", from_text.bytes, read_cache,
         "stat bad_file_name, stat ok, open ok, fgetxattr ok, getxattr ok, fstat ok, read ok, close ok, "});
    // Of a cache that cannot be written nothing is told.
    const std::string reading_what_was_vetted = reading.substr(reading.find("open"));
    expect_results(
        {"stale cache", stale_cache, renew_cache,
         "stat bad_file_name, stat ok, " + reading_what_was_vetted +
             "stat ok, getxattr ok, stat ok, stat ok, open ok, fstat ok, fgetxattr ok, stat ok, open ok, "
             "write ok, futimens ok, fremovexattr ok, fchown ok, fchmod ok, fdatasync ok, rename ok, " +
             closing_both});
}

TEST_F(system_calls, of_writers_fail) {
    const auto write_cache = [this] { return check(path); };
    const std::string first = checking + "close ok, " + vetting + to_the_cache + first_cache;
    const std::string next = checking + "close ok, " + vetting + to_the_cache + next_cache;
    expect_results({"first cache", no_cache, write_cache, first + replacing});
    expect_results({"next cache", stale_cache, write_cache, next + replacing});
    expect_results({"no room for the first cache", no_cache, write_cache,
                    checking + to_full_disk + first_cache + writing + removing + removing, true});
    expect_results({"no room for the next cache", stale_cache, write_cache,
                    checking + to_full_disk + next_cache + writing + removing + "close short_write, ", true});
}

TEST_F(system_calls, of_files_with_entries_fail) {
    if (!has_entries())
        GTEST_SKIP() << "the file system has no POSIX ACLs";
    way row = {"cache", from_text.bytes, [this] { return read_acl(path, checked); },
               "stat bad_file_name, stat ok, open ok, fgetxattr ok, fgetxattr ok, getxattr ok, getxattr ok, "
               "stat ok, fstat ok, read ok, close ok, "};
    row.has_entries = true;
    expect_results(row);
    row = {"first cache", no_cache, [this] { return check(path); },
           checking + "close ok, " + vetting_entries + to_the_cache + first_cache + writing + giving +
               "fsetxattr cannot_set_mode, " + finishing + closing_both};
    row.has_entries = true;
    expect_results(row);
}

// ---- Writers that end ----

TEST_F(files, writers_are_killed_after_each_step) {
    constexpr uid_t owner = 65534; // of the text, when root writes its cache
    constexpr int killed = 7;
    const bool is_root = geteuid() == 0;
    const int different = is_root ? msg::cache_owner_differs.id : msg::cache_mode_differs.id;
    const auto expect_mended = [&](const std::string &stale, std::size_t at) {
        SCOPED_TRACE(testing::Message() << "killed before step " << at);
        lay_out(stale);
        for (const std::string &name : {path, cache})
            EXPECT_TRUE(!is_root || !fs::exists(name) || chown(name.c_str(), owner, owner) == 0);
        const int status = status_of_child(
            [&] { faults::watched(before_step(at, [] { _exit(killed); }), [&] { return check(path); }); });
        EXPECT_EQ(read_acl(path, checked), from_text);
        EXPECT_LE(names_in(folder.path).size(), 3u);
        const bool is_blocked = stale.empty() && fs::exists(cache) && fs::file_size(cache) == 0;
        EXPECT_EQ(watched({}, [&] { return check(path); }).id, is_blocked ? different : 0);
        EXPECT_EQ(read_acl(path, checked), from_text);
        if (is_blocked) { // as an administrator would mend it
            fs::remove(cache);
            EXPECT_EQ(check(path).code, SEC_S_OK);
        }
        return WEXITSTATUS(status) == killed;
    };
    for (const std::string &stale : both_caches)
        for (std::size_t at = 0; expect_mended(stale, at);)
            ++at;
}

TEST_F(files, writers_that_are_ended_by_a_signal_leave_nothing) {
    constexpr int signals[] = {SIGINT, SIGTERM, SIGHUP, SIGALRM};
    const auto expect_clean = [&](const std::string &stale, std::size_t at) {
        SCOPED_TRACE(testing::Message() << "ended before step " << at);
        lay_out(stale);
        const int signal = signals[at % std::size(signals)];
        const int status = status_of_child(
            [&] { faults::watched(before_step(at, [&] { raise(signal); }), [&] { return check(path); }); });
        const std::string left = read_file(cache);
        EXPECT_TRUE(left == stale || left == from_text.bytes) << left;
        EXPECT_EQ(names_in(folder.path).size(), left.empty() ? 1u : 2u);
        EXPECT_TRUE(status == 0 || WTERMSIG(status) == signal);
        return status != 0;
    };
    for (const std::string &stale : both_caches)
        for (std::size_t at = 0; expect_clean(stale, at);)
            ++at;
}

TEST_F(files, torn_caches_are_not_believed) {
    constexpr std::size_t block = 512; // the least that a disk writes at once
    std::string large = acl_text;
    for (int index = 0; index < 200; ++index)
        large += "u unix user" + std::to_string(index) + "@host rw\n";
    write_file(path, large, 100);
    const outcome whole = read_acl(path, text_only);
    const auto expect_torn = [&](std::string bytes, std::size_t from, std::size_t to) {
        bytes.replace(from, to - from, to - from, '\0');
        write_file(cache, bytes);
        EXPECT_EQ(read_acl(path, checked), whole)
            << bytes.size() << " with zeros from " << from << " to " << to;
    };
    const std::size_t size = whole.bytes.size();
    for (std::size_t end = 1; end <= size; ++end)
        expect_torn(whole.bytes.substr(0, end), end, end);
    for (std::size_t from = 0; from < size; from += block)
        for (std::size_t to = from + block; to < size + block; to += block)
            expect_torn(whole.bytes, from, std::min(to, size));
}

// ---- Files that change meanwhile ----

void put(const std::string &text, const std::string &path, int age, unsigned mode = 0644) {
    write_file(path + "2", text, age, mode);
    fs::rename(path + "2", path);
}
void put_fifo(const std::string &path) {
    fs::remove(path);
    mkfifo(path.c_str(), 0644);
}
void put_folder(const std::string &path) {
    fs::remove(path);
    fs::create_directory(path);
}
void put_link(const std::string &path, const char *target = "nowhere") {
    fs::remove(path);
    fs::create_symlink(target, path);
}
void link_to_another(const std::string &path) {
    put(other_text, path + "3", 0);
    put_link(path, "acl3");
}
void link_at_what_is_opened(const std::string & /*path*/) {
    if (is_about_to("open") && !fs::exists(faults::opened))
        put_link(faults::opened);
}
void append(const std::string &path) { std::ofstream(path, std::ios::app) << "u unix more@host r\n"; }

// What somebody does to the ACL file or its cache while another works.
struct disturbance {
    std::string name;
    std::function<void(const std::string &)> act;
    bool is_replacement = false; // of the text by another
};
const disturbance disturbances[] = {
    {"exchanged", [](auto &path) { put(other_text, path, 0); }, true},
    {"exchanged by an old file", [](auto &path) { put(other_text, path, 50); }, true},
    {"exchanged by an equally old file", [](auto &path) { put(other_text, path, 100); }, true},
    {"edited", [](auto &path) { write_file(path, other_text); }},
    {"edited like an old file", [](auto &path) { write_file(path, other_text, 50); }},
    {"grown", append},
    {"emptied", [](auto &path) { write_file(path, ""); }},
    {"removed", [](auto &path) { fs::remove(path); }},
    {"a FIFO", put_fifo},
    {"a folder", put_folder},
    {"a dangling link", [](auto &path) { put_link(path); }},
    {"a link to another", link_to_another, true},
    {"a FIFO at the cache", [](auto &path) { put_fifo(path + ".cacl"); }},
    {"a folder at the cache", [](auto &path) { put_folder(path + ".cacl"); }},
    {"a link at the cache", [](auto &path) { put_link(path + ".cacl"); }},
    {"a link at the name that is opened", link_at_what_is_opened},
    {"cached by another", [](auto &path) { check(path); }},
    {"a foreign cache", [](auto &path) { write_file(path + ".cacl", rich); }},
};

// What happens to a file between its vetting and its opening, and how often; what is then told.
struct replacement {
    const char *name;
    int times;
    std::function<void(const std::string &)> act;
    int read_id = 0;                // the message of a read
    const char *command_shows = ""; // the number of the command's
};
const replacement replacements[] = {
    {"by one after the other", 9, [](auto &path) { put(other_text, path, 50); }},
    {"again and again", 1000, [](auto &path) { put(other_text, path, 50); }, msg::bad_file_name.id,
     "3417-135"},
    {"by one that others may write", 1, [](auto &path) { put(other_text, path, 50, 0666); },
     msg::file_not_private.id, "3417-169"},
    {"by giving others the right to write", 1, [](auto &path) { fs::permissions(path, fs::perms(0666)); },
     msg::file_not_private.id, "3417-169"},
    {"by a folder", 1, put_folder, msg::bad_file_name.id, "3417-168"},
};

TEST_F(files, are_read_anew_when_they_are_replaced) {
    put(other_text, path, 50);
    const outcome other = read_acl(path, text_only);
    for (const replacement &row : replacements) {
        SCOPED_TRACE(row.name);
        int replaced = 0;
        const auto replace = [&](std::size_t) {
            if (is_about_to("open") && faults::opened == path && replaced++ < row.times)
                row.act(path);
            return faults::no_fault;
        };
        lay_out();
        const outcome found =
            watched(replace, [&] { return read_acl("acl", checked | cached, user_name()); });
        EXPECT_EQ(found.id, row.read_id);
        EXPECT_EQ(found.bytes, row.read_id == 0 ? other.bytes : "");
        EXPECT_EQ(read_file(cache), found.bytes);
        EXPECT_LT(replaced, 100);

        lay_out();
        replaced = 0;
        watched(replace, [&] { return recorded(aclfck__bulk_aclfile("acl", user_name(), 0)); });
        EXPECT_EQ(printed.substr(0, 8), row.command_shows);
    }
}

struct races : files {
    // Disturbs a reader, or the command, and gives the number of its steps.
    std::size_t run(const std::string &stale, bool by_command, const disturbance &row, std::size_t at) const {
        SCOPED_TRACE(testing::Message() << row.name << " before step " << at);
        lay_out(stale);
        const outcome found = watched(before_step(at, [&] { row.act(path); }), [&] {
            return by_command ? check(path) : read_acl(path, checked | cached);
        });
        const arguments calls = faults::calls;
        EXPECT_FALSE(fs::exists(folder / "nowhere"));
        // A temporary file gets another name then.
        const bool is_cache_linked =
            row.name == "a link at the name that is opened" && faults::opened == cache;
        EXPECT_TRUE(!by_command || !is_cache_linked || found.id == msg::cannot_open_for_writing.id) << found;
        // What is read is the text as it was, as it is now, or what somebody put in the place of the cache.
        const outcome now = read_acl(path, text_only);
        const bool is_known = found == from_text || found == now || found.bytes == rich;
        EXPECT_TRUE(by_command || found.code != SEC_S_OK || is_known) << found;
        EXPECT_TRUE(by_command || !row.is_replacement || found.code == SEC_S_OK) << found;
        // An old file is told from the text by its number, for as long as the writer looks.
        const auto closed = std::ranges::find(calls, "close") - calls.begin();
        const bool is_late = row.name.ends_with("old file") && static_cast<long>(at) > closed + 1;
        const bool is_foreign = fs::is_regular_file(cache) && read_file(cache) == rich;
        EXPECT_TRUE(is_late || is_foreign || read_acl(path, checked) == now);
        return calls.size();
    }
};

TEST_F(races, are_won_before_every_step) {
    for (const std::string &stale : both_caches)
        for (const bool by_command : {false, true})
            for (const disturbance &row : disturbances)
                for (std::size_t at = 0, steps = 1; at < steps; ++at)
                    steps = std::max(steps, run(stale, by_command, row, at));
}

// The threads of a service without standard streams print all the same.
TEST_F(files, have_no_descriptor_of_a_standard_stream) {
    constexpr std::array streams = {STDIN_FILENO, STDOUT_FILENO, STDERR_FILENO};
    const std::string longer_than_the_cache(1000, 'x');
    bool is_taken = false;
    const auto print = [&](std::size_t) {
        for (const int stream : streams)
            is_taken |= write(stream, longer_than_the_cache.data(), longer_than_the_cache.size()) >= 0 ||
                        errno != EBADF;
        return faults::no_fault;
    };
    for (const std::string &stale : both_caches) {
        lay_out(stale);
        const int status = status_of_child([&] {
            for (const int stream : streams)
                close(stream);
            faults::watched(print, [&] { return check(path); });
            if (is_taken)
                _exit(1);
        });
        EXPECT_EQ(status, 0);
        EXPECT_EQ(read_file(cache), from_text.bytes);
        EXPECT_EQ(read_file(path), acl_text);
    }
}

// Nor do those that read their standard input take a part of a file away.
TEST_F(files, are_read_whole_while_another_thread_reads_its_input) {
    const auto take_a_part = [](std::size_t) {
        char part[4];
        [[maybe_unused]] const ssize_t taken = read(STDIN_FILENO, part, sizeof part);
        return faults::no_fault;
    };
    const int status = status_of_child([&] {
        close(STDIN_FILENO);
        const outcome found = faults::watched(take_a_part, [this] { return read_acl(path, text_only); });
        if (found != from_text)
            _exit(1);
    });
    EXPECT_EQ(status, 0);
}

TEST_F(files, nobody_may_use_a_new_file_before_it_is_its_owners) {
    constexpr uid_t owner = 65534;
    if (geteuid() != 0 || !has_entries())
        GTEST_SKIP() << "needs root, and a file system with POSIX ACLs";
    ASSERT_EQ(chown(path.c_str(), owner, owner), 0);
    const auto look = [&](std::size_t) {
        for (const std::string &name : names_in(folder.path)) {
            struct stat status = {};
            EXPECT_EQ(stat(name.c_str(), &status), 0);
            const bool is_its_owners = status.st_uid == owner && status.st_gid == owner;
            EXPECT_TRUE(is_its_owners || (status.st_mode & 0777) == 0)
                << name << " at " << faults::calls.back();
        }
        return faults::no_fault;
    };
    EXPECT_EQ(watched(look, [&] { return check(path); }).code, SEC_S_OK);
    EXPECT_EQ(read_acl(path, checked), from_text);
}

// Whoever could write the cache, but not the text, gains nothing when the text gives up its entries meanwhile.
TEST_F(files, lose_their_entries_while_a_cache_is_vetted) {
    lay_out(rich, 0);
    if (!give_entries(path, 6, 6))
        GTEST_SKIP() << "the file system has no POSIX ACLs";
    fs::permissions(cache, fs::perms(0664));
    const auto lose = [&](std::size_t) {
        if (is_about_to("getxattr")) {
            removexattr(path.c_str(), "system.posix_acl_access");
            fs::permissions(path, fs::perms(0644));
        }
        return faults::no_fault;
    };
    EXPECT_EQ(watched(lose, [&] { return read_acl(path, checked); }), from_text);
}

// What is edited while it is read must not be older than its cache.
TEST_F(files, caches_are_as_old_as_what_they_are_made_from) {
    fs::file_time_type read_at;
    const auto wait = [&](std::size_t) {
        if (is_about_to("read")) {
            read_at = fs::file_time_type::clock::now();
            usleep(10000);
        }
        return faults::no_fault;
    };
    EXPECT_EQ(watched(wait, [&] { return check(path); }).code, SEC_S_OK);
    EXPECT_LE(fs::last_write_time(cache), read_at);
}

// When the disk is full and another file stands at the temporary name meanwhile, that is not removed.
TEST_F(files, temporary_names_are_taken) {
    const auto take = [&](std::size_t) {
        if (!is_about_to("write"))
            return faults::no_fault;
        fs::remove(faults::opened);
        write_file(faults::opened, other_text);
        return ENOSPC;
    };
    EXPECT_EQ(watched(take, [&] { return check(path); }).id, msg::short_write.id);
    EXPECT_EQ(read_file(faults::opened), other_text);
}

} // namespace
