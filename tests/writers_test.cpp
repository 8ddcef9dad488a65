// Writers of caches that are killed or ended by a signal at each step, or disturbed by others: what they leave, and
// that no reader ever gets anything but what the text says.
#include "acl_files.h"

#include <csignal>

namespace {

using namespace support;

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

constexpr int streams[] = {STDIN_FILENO, STDOUT_FILENO, STDERR_FILENO};
const std::string longer_than_the_cache(1000, 'x');

// The threads of a service without standard streams print and read all the same.
TEST_F(files, have_no_descriptor_of_a_standard_stream) {
    bool is_taken = false;
    const auto print_and_read = [&](std::size_t) {
        for (const int stream : streams)
            is_taken |= write(stream, longer_than_the_cache.data(), longer_than_the_cache.size()) >= 0 ||
                        errno != EBADF;
        char part[4];
        [[maybe_unused]] const ssize_t part_size = read(STDIN_FILENO, part, sizeof part);
        return faults::no_fault;
    };
    for (const std::string &stale : both_caches) {
        lay_out(stale);
        const int status = status_of_child([&] {
            for (const int stream : streams)
                close(stream);
            faults::watched(print_and_read, [&] { return check(path); });
            if (is_taken)
                _exit(1);
        });
        EXPECT_EQ(status, 0);
        EXPECT_EQ(read_file(cache), from_text.bytes);
        EXPECT_EQ(read_file(path), acl_text);
    }
}

// Another thread that also held the numbers of the streams releases them before a file is opened.
TEST_F(files, keep_nothing_that_was_printed_while_they_had_the_number_of_a_stream) {
    bool is_printed = false;
    const auto give_back_and_print = [&](std::size_t) {
        const bool is_opening = is_about_to("open") && faults::opened != "/";
        const bool is_closing = is_about_to("close");
        for (const int stream : streams) {
            if (is_opening)
                close(stream);
            if (is_closing)
                is_printed |= write(stream, longer_than_the_cache.data(), longer_than_the_cache.size()) > 0;
        }
        return faults::no_fault;
    };
    const int status = status_of_child([&] {
        faults::watched(give_back_and_print, [&] { return check(path); });
        _exit(is_printed ? 0 : 1);
    });
    EXPECT_EQ(status, 0);
    EXPECT_EQ(read_file(cache), from_text.bytes);
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

// A text that is edited while it is read must not be older than its cache.
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

// When the disk is full and another file has taken the temporary name, that file is not removed.
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
