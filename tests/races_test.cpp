// Files exchanged, edited or removed between any two steps of a reader or a writer: no reader ever gets anything but
// what the text says.
#include "acl_files.h"

namespace {

using namespace support;

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

// A change of the ACL file or its cache by someone else during an operation.
struct disturbance {
    std::string name;
    std::function<void(const std::string &)> act;
    bool is_replacement = false; // of the text by another
};
constexpr bool by_another = true;
const disturbance disturbances[] = {
    {"exchanged", [](auto &path) { put(other_text, path, 0); }, by_another},
    {"exchanged by an old file", [](auto &path) { put(other_text, path, 50); }, by_another},
    {"exchanged by an equally old file", [](auto &path) { put(other_text, path, 100); }, by_another},
    {"edited", [](auto &path) { write_file(path, other_text); }},
    {"edited like an old file", [](auto &path) { write_file(path, other_text, 50); }},
    {"edited like an equally old file", [](auto &path) { write_file(path, other_text, 100); }},
    {"grown", append},
    {"emptied", [](auto &path) { write_file(path, ""); }},
    {"removed", [](auto &path) { fs::remove(path); }},
    {"a FIFO", put_fifo},
    {"a folder", put_folder},
    {"a dangling link", [](auto &path) { put_link(path); }},
    {"a link to another", link_to_another, by_another},
    {"a FIFO at the cache", [](auto &path) { put_fifo(path + ".cacl"); }},
    {"a folder at the cache", [](auto &path) { put_folder(path + ".cacl"); }},
    {"a link at the cache", [](auto &path) { put_link(path + ".cacl"); }},
    {"a link at the name that is opened", link_at_what_is_opened},
    {"cached by another", [](auto &path) { check(path); }},
    {"a foreign cache", [](auto &path) { write_file(path + ".cacl", rich); }},
};

// What happens to a file between its vetting and its opening, and how often; the messages that follow.
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
        watched(replace, [&] { return recorded(aclfck__bulk_aclfile("acl", user_name(), no_options)); });
        EXPECT_EQ(printed.substr(0, 8), row.command_shows);
    }
}

struct races : files {
    // Disturbs a reader, or the command, and returns the number of its steps.
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
        // The result is the text as it was, the text as it is now, or the cache that someone put in place.
        const outcome now = read_acl(path, text_only);
        const bool is_known = found == from_text || found == now || found.bytes == rich;
        EXPECT_TRUE(by_command || found.code != SEC_S_OK || is_known) << found;
        EXPECT_TRUE(by_command || !row.is_replacement || found.code == SEC_S_OK) << found;
        // The writer detects an old file by its inode number, as long as it checks.
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

void lose_entries(const std::string &path) {
    removexattr(path.c_str(), "system.posix_acl_access");
    fs::permissions(path, fs::perms(0644));
}
void give_away(const std::string &path) {
    constexpr uid_t nobody = 65534;
    EXPECT_TRUE(chown(path.c_str(), nobody, 0) == 0 || geteuid() != 0);
}
void put_with_entries(const std::string &path) {
    constexpr int newer_than_the_cache = -50;
    put(other_text, path, newer_than_the_cache, 0664);
    give_entries(path, 6, 6);
}

// A user who could write only the cache gains nothing when the text changes while their entries are compared.
TEST_F(files, change_while_the_entries_of_a_cache_are_compared) {
    constexpr bool with_entries = true;
    constexpr bool without = false;
    put(other_text, path, 50);
    const outcome other = read_acl(path, text_only);
    outcome from_cache = from_text;
    from_cache.bytes = rich;
    const outcome given_away = geteuid() == 0 ? from_text : from_cache; // by root alone
    const std::tuple<const char *, bool, bool, void (*)(const std::string &), outcome> rows[] = {
        {"the text loses its entries", with_entries, without, lose_entries, from_text},
        {"the text is given away", with_entries, with_entries, give_away, given_away},
        {"another text has the entries of the cache", without, with_entries, put_with_entries, other},
    };
    if (!has_entries())
        GTEST_SKIP() << "the file system has no POSIX ACLs";
    for (const auto &[what, of_text, of_cache, change, wanted] : rows) {
        SCOPED_TRACE(what);
        lay_out(rich, 0);
        fs::permissions(path, fs::perms(0664));
        fs::permissions(cache, fs::perms(0664));
        EXPECT_TRUE(of_text == without || give_entries(path, 6, 6));
        EXPECT_TRUE(of_cache == without || give_entries(cache, 6, 6));
        bool is_changed = false;
        const auto change_once = [&, act = change](std::size_t) {
            if (is_about_to("getxattr") && !std::exchange(is_changed, true))
                act(path);
            return faults::no_fault;
        };
        EXPECT_EQ(watched(change_once, [&] { return read_acl(path, checked); }), wanted);
    }
}

} // namespace
