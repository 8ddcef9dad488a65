// Tests of reading an ACL file through its cache: which of the two files is read, what the flags then say,
// and what a cache that is written afterwards looks like. Times are set, never waited for.
#include "service_support.h"

#include <cerrno>
#include <cstdarg>
#include <ctime>
#include <fcntl.h>
#include <fstream>
#include <functional>
#include <pwd.h>
#include <sys/stat.h>
#include <sys/syscall.h>

namespace {

// What happens to files between two steps of a call is made to happen here.
std::function<int(const std::string &)> before_open; // the error that opening this path fails with, or 0
std::function<void()> after_read;

} // namespace

extern "C" int open(const char *path, int flags, ...) {
    va_list args;
    va_start(args, flags);
    const int mode = (flags & O_CREAT) != 0 ? va_arg(args, int) : 0;
    va_end(args);
    if (const int error = before_open ? before_open(path) : 0; error != 0) {
        errno = error;
        return -1;
    }
    return static_cast<int>(syscall(SYS_openat, AT_FDCWD, path, flags, mode));
}

// What open is called as in fortified builds.
extern "C" int __open_2(const char *path, int flags) { return open(path, flags); }

extern "C" ssize_t read(int fd, void *bytes, size_t count) {
    const ssize_t result = syscall(SYS_read, fd, bytes, count);
    if (after_read)
        after_read();
    return result;
}

namespace {

using namespace support;

constexpr unsigned text = SEC_READ_ACL_TEXT, cache = SEC_READ_ACL_CACHE, convert = SEC_READ_ACL_CONVERT;

const std::string acl_text = "# users\nu unix alice@host r\n";
const std::string from_text = one(of_mechanism(4, "unix", 1, named(1, "alice@host")));

void write_file(const std::string &path, const std::string &bytes, time_t age, mode_t mode) {
    std::ofstream(path, std::ios::binary) << bytes;
    static const time_t now = time(nullptr); // one moment for all files
    const timespec times[2] = {{now - age, 0}, {now - age, 0}};
    EXPECT_EQ(utimensat(AT_FDCWD, path.c_str(), times, 0), 0);
    EXPECT_EQ(chmod(path.c_str(), mode), 0);
}

std::string read_file(const std::string &path) {
    std::ifstream file(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
}

struct stat status_of(const std::string &path) {
    struct stat status = {};
    EXPECT_EQ(stat(path.c_str(), &status), 0) << path;
    return status;
}

struct reading {
    int result;
    std::string bytes;
    unsigned flags;
    failure error = {};
    bool operator==(const reading &) const = default;
};

std::ostream &operator<<(std::ostream &out, const reading &shown) {
    return out << shown.result << ", " << shown.bytes.size() << " bytes, flags " << shown.flags << ", "
               << shown.error;
}

reading read_acl(const std::string &path, unsigned flags, const char *user = nullptr) {
    buffer held;
    held.acl = {7, &held}; // overwritten whatever comes
    reading made{0, "", 0xabad1dea};
    made.result = sec_read_acl_file(path.c_str(), user, nullptr, flags, &held.acl, &made.flags);
    EXPECT_EQ(held.acl.data == nullptr, held.acl.length == 0);
    made.bytes = held.bytes();
    made.error = recorded_error();
    return made;
}

class read_acl_file : public testing::Test {
protected:
    void TearDown() override {
        before_open = nullptr;
        after_read = nullptr;
    }

    const temporary_folder folder;
    const std::string path = folder / "acl";
    const std::string cache_path = path + ".cacl";
};

TEST_F(read_acl_file, reads_the_cache_when_it_is_current) {
    constexpr time_t age = 100; // of the ACL file
    constexpr unsigned other = 0xfffffff8;
    const struct cached {
        const char *name;
        std::string bytes;
        time_t age;
        mode_t mode = 0644;
    } none{"none", "", -1}, current{"current", example, age - 1}, as_old{"of the same second", example, age},
        older{"older", example, age + 1}, empty{"empty", "", 0}, private_one{"private", example, 0, 0640},
        sticky{"sticky", example, 0, 01644}, corrupt{"corrupt", example.substr(0, 30), 0},
        junk{"junk", "junk", 0};
    const struct {
        const cached &cache_file;
        unsigned in, out;
        const std::string &bytes;
    } rows[] = {
        {none, 0, text, from_text},
        {none, text, text, from_text},
        {none, convert | other, text | other, from_text},
        {current, 0, 0, example},
        {current, cache, 0, example},
        {current, convert | cache | other, convert | other, example},
        {current, text, text, from_text},
        {current, text | cache, text, from_text},
        {current, text | convert, text, from_text},
        {as_old, 0, text, from_text},
        {older, convert, text, from_text},
        {empty, convert, text, from_text},
        {private_one, 0, text, from_text},
        {private_one, cache, text, from_text},
        {sticky, cache, text, from_text},
        {corrupt, 0, 0, corrupt.bytes}, // nobody asked for a check
        {corrupt, convert, text, from_text},
        {corrupt, convert | cache, text, from_text}, // newer, so left alone
        {junk, convert, text, from_text},
    };
    for (const auto &[cache_file, in, out, bytes] : rows) {
        std::filesystem::remove(cache_path);
        write_file(path, acl_text, age, 0644);
        if (cache_file.age >= 0)
            write_file(cache_path, cache_file.bytes, cache_file.age, cache_file.mode);
        EXPECT_EQ(read_acl(path, in), (reading{0, bytes, out})) << cache_file.name << ", flags " << in;
        EXPECT_EQ(read_file(cache_path), cache_file.bytes) << cache_file.name << ", flags " << in;
    }
    write_file(cache_path, foreign(example), 0, 0644);
    EXPECT_EQ(read_acl(path, convert), (reading{0, example, convert}));
    EXPECT_EQ(read_acl(path, 0), (reading{0, foreign(example), 0}));
    if (geteuid() == 0) {
        write_file(cache_path, example, 0, 0644);
        for (const auto &[uid, gid] : {std::pair(1, 0), std::pair(0, 1)}) {
            EXPECT_EQ(chown(cache_path.c_str(), static_cast<uid_t>(uid), static_cast<gid_t>(gid)), 0);
            EXPECT_EQ(read_acl(path, cache), (reading{0, from_text, text}));
        }
    }
}

TEST_F(read_acl_file, refreshes_a_cache_and_then_uses_it) {
    for (const mode_t mode : {0644u, 0600u, 0640u}) {
        for (const bool is_stale : {false, true}) {
            std::filesystem::remove(cache_path);
            write_file(path, acl_text, 100, mode);
            if (is_stale)
                write_file(cache_path, example, 200, mode);
            EXPECT_EQ(read_acl(path, cache | convert), (reading{0, from_text, text | cache}));
            EXPECT_EQ(read_file(cache_path), from_text);
            EXPECT_EQ(status_of(cache_path).st_mode & 07777, mode);
            EXPECT_EQ(read_acl(path, cache | convert), (reading{0, from_text, convert}));
        }
    }
    std::size_t files = 0;
    for (const auto &file : std::filesystem::directory_iterator(folder.path()))
        files += file.is_regular_file();
    EXPECT_EQ(files, 2u); // nothing temporary is left
}

// An edit while the text is being parsed must not leave a cache that looks later than the edit.
TEST_F(read_acl_file, never_takes_an_edited_text_for_cached) {
    write_file(path, acl_text, 100, 0600);
    after_read = [this] {
        after_read = nullptr;
        std::ofstream(path) << "g staff r\n";
        // Whatever is stamped from here on is later than the edit, even from the clock that moves in ticks.
        const timespec edited = status_of(path).st_mtim;
        timespec now = {};
        do
            clock_gettime(CLOCK_REALTIME_COARSE, &now);
        while (std::tie(now.tv_sec, now.tv_nsec) <= std::tie(edited.tv_sec, edited.tv_nsec));
    };
    EXPECT_EQ(read_acl(path, cache), (reading{0, from_text, text | cache}));
    const timespec edited = status_of(path).st_mtim, cached = status_of(cache_path).st_mtim;
    EXPECT_TRUE(std::tie(cached.tv_sec, cached.tv_nsec) <= std::tie(edited.tv_sec, edited.tv_nsec));
    EXPECT_EQ(read_acl(path, 0), (reading{0, one(packed_subacl(16, "", 1, named(1, "staff"))), text}));
}

TEST_F(read_acl_file, bears_files_that_cannot_be_opened_or_were_exchanged) {
    write_file(path, acl_text, 100, 0644);
    write_file(cache_path, example, 0, 0644);
    std::string victim = cache_path;
    before_open = [&](const std::string &opened) { return opened == victim ? EACCES : 0; };
    EXPECT_EQ(read_acl(path, cache | convert), (reading{0, from_text, text}));
    victim = path;
    EXPECT_EQ(read_acl(path, convert), (reading{0, example, convert})); // not needed
    EXPECT_EQ(read_acl(path, text | cache),
              (reading{37, "", text | cache, error_of(37, 124, {path, std::to_string(EACCES)})}));

    before_open = [&](const std::string &opened) {
        if (opened == victim) {
            write_file(folder / "other", acl_text, 0, 0644);
            std::filesystem::rename(folder / "other", opened);
        }
        return 0;
    };
    EXPECT_EQ(read_acl(path, text),
              (reading{37, "", text, error_of(37, 124, {path, std::to_string(ESTALE)})}));
    victim = cache_path;
    write_file(path, acl_text, 100, 0644);
    EXPECT_EQ(read_acl(path, 0), (reading{0, from_text, text}));
}

TEST_F(read_acl_file, gives_no_bytes_for_no_entries) {
    write_file(cache_path, example, 0, 0644);
    write_file(path, "", 100, 0644);
    EXPECT_EQ(read_acl(path, cache | convert), (reading{0, "", convert})); // no cache was written
    write_file(path, "# nobody\n\n  \t\n", 100, 0644);
    EXPECT_EQ(read_acl(path, text | cache), (reading{0, "", text}));
    EXPECT_EQ(read_file(cache_path), example);
}

TEST_F(read_acl_file, reports_what_it_refuses) {
    const std::string missing = folder / "missing";
    const struct {
        std::string name;
        const char *user;
        failure error;
    } names[] = {
        {missing, nullptr, error_of(37, 122, {missing, std::to_string(ENOENT)})},
        {folder.path(), nullptr, error_of(37, 122, {folder.path(), "0"})},
        {"acl", "", error_of(4, 121)},
    };
    for (const auto &[name, user, error] : names)
        EXPECT_EQ(read_acl(name, 0xf0 | cache, user), (reading{error.code, "", 0xf0 | cache, error}));

    const struct {
        std::string text;
        int code, id;
    } texts[] = {
        {"o r\no r\n", 43, 160},  {"u unix a@b r\nU UNIX A@B q\n", 43, 144},
        {"o r\nx r\n", 42, 165},  {"o r\no \0r\n"s, 42, 131},
        {"g staff z\n", 36, 166},
    };
    for (const auto &[bad, code, id] : texts) {
        write_file(path, bad, 100, 0644);
        const reading made = read_acl(path, cache | convert);
        EXPECT_EQ(made.result, code) << bad;
        EXPECT_EQ(made.error.id, id) << bad << made.error;
        EXPECT_EQ(made.bytes, "") << bad;
        EXPECT_EQ(made.flags, text | cache) << bad;
        EXPECT_FALSE(std::filesystem::exists(cache_path)) << bad;
    }

    unsigned flags = 9;
    sec_acl_buffer_t acl = {7, &flags};
    EXPECT_EQ(after(sec_read_acl_file(nullptr, "", nullptr, 2, &acl, &flags)),
              bad_parameter("sec_read_acl_file", 1, "0"));
    EXPECT_EQ(flags, 2u);
    EXPECT_EQ(after(sec_read_acl_file("acl", "", nullptr, 4, nullptr, &flags)),
              bad_parameter("sec_read_acl_file", 5, "0"));
    EXPECT_EQ(flags, 4u);
    EXPECT_EQ(sec_read_acl_file(missing.c_str(), nullptr, nullptr, 0, &acl, nullptr), 37);
}

TEST_F(read_acl_file, of_a_user_must_be_that_users_alone) {
    const passwd *user = getpwuid(geteuid());
    if (user == nullptr || access(user->pw_dir, W_OK) != 0)
        GTEST_SKIP() << "no home directory to write to";
    const std::string name = user->pw_name;
    const std::string base = ".qzacl-test-"s.append(std::to_string(getpid()));
    const std::string file = user->pw_dir + "/"s + base;
    for (const mode_t mode : {0600u, 0644u, 0620u, 0602u, 0666u}) {
        write_file(file, acl_text, 100, mode);
        EXPECT_EQ(read_acl(base, text, name.c_str()),
                  (mode & 022) == 0 ? (reading{0, from_text, text})
                                    : (reading{36, "", text, error_of(36, 128, {file, name})}));
    }
    EXPECT_EQ(read_acl(file, 0).result, 0); // without a user nobody asks
    write_file(file, "", 100, 0666);
    EXPECT_EQ(read_acl(base, 0, name.c_str()), (reading{0, "", 0})); // nothing that could be trusted
    const passwd *other = getpwuid(geteuid() + 1);
    if (geteuid() == 0 && other != nullptr) {
        write_file(file, acl_text, 100, 0600);
        EXPECT_EQ(chown(file.c_str(), other->pw_uid, 0), 0);
        EXPECT_EQ(read_acl(base, 0, name.c_str()).error, error_of(36, 128, {file, name}));
    }
    std::filesystem::remove(file);
}

// The longest paths have no room for the name of a cache; one that is there all the same is not looked at.
TEST_F(read_acl_file, leaves_out_the_cache_of_a_long_path) {
    std::string deep = folder.path();
    while (deep.size() < 4080) {
        deep.append("/").append(std::min<std::size_t>(4080 - deep.size(), 200), 'd');
        std::filesystem::create_directory(deep);
    }
    for (const std::size_t length : {4089u, 4090u}) {
        const std::string file = std::string(deep).append("/").append(length - deep.size() - 1, 'f');
        write_file(file, acl_text, 100, 0644);
        const bool has_cache = length < 4090;
        EXPECT_EQ(read_acl(file, cache), (reading{0, from_text, has_cache ? text | cache : text}));
        write_file(file + ".cacl", example, 0, 0644);
        EXPECT_EQ(read_acl(file, cache),
                  has_cache ? (reading{0, example, 0}) : (reading{0, from_text, text}));
    }
}

} // namespace
