// Where an ACL file is, and reading it whole. The user database answers here as a case wants it to.
#include "qzacl_acl/file_name.h"
#include "qzacl_utils.h"
#include "support.h"

#include <cerrno>
#include <dlfcn.h>
#include <fcntl.h>
#include <fstream>
#include <pwd.h>

using namespace support;

namespace {

struct database_answer {
    int result = 0;
    const char *name = nullptr; // null: no such user
    std::string home = {};
};
const database_answer *staged = nullptr;

} // namespace

extern "C" int getpwnam_r(const char *name, passwd *user, char *buffer, std::size_t size, passwd **found) {
    if (staged == nullptr) {
        static const auto real = reinterpret_cast<decltype(&getpwnam_r)>(dlsym(RTLD_NEXT, "getpwnam_r"));
        return real(name, user, buffer, size, found);
    }
    *found = nullptr;
    if (staged->result != 0 || staged->name == nullptr)
        return staged->result;
    user->pw_name = const_cast<char *>(staged->name);
    user->pw_dir = const_cast<char *>(staged->home.c_str());
    user->pw_uid = 4242;
    *found = user;
    return 0;
}

namespace {

// Moves the process into a folder and back.
class working_in {
public:
    explicit working_in(const std::string &folder) : back_(open(".", O_PATH | O_DIRECTORY)) {
        EXPECT_EQ(chdir(folder.c_str()), 0);
    }
    working_in(const working_in &) = delete;
    working_in &operator=(const working_in &) = delete;
    ~working_in() {
        EXPECT_EQ(fchdir(back_), 0);
        close(back_);
    }

private:
    int back_;
};

struct resolved {
    int result;
    std::string path = {};
    std::uint32_t uid = 7;
    bool operator==(const resolved &) const = default;
};

std::ostream &operator<<(std::ostream &out, const resolved &shown) {
    return out << shown.result << " uid " << shown.uid << ' ' << shown.path.size() << ' ' << shown.path.substr(0, 99);
}

// An absolute path of a length.
std::string path_of(std::size_t length) {
    std::string path(length, 'x');
    path[0] = '/';
    return path;
}

resolved resolve(const std::string &name, const char *user = nullptr) {
    qz::path_buffer path;
    resolved made{0, ""};
    made.result = sec__get_aclfname(name.c_str(), user, path, &made.uid);
    if (made.result == 0)
        made.path = path.text;
    return made;
}

TEST(file_name, stands_as_it_is_or_behind_the_working_directory) {
    const temporary_folder folder;
    const struct {
        std::string directory, name, path;
    } rows[] = {
        {"/", "acl", "/acl"},
        {"/", "/etc//./acl", "/etc//./acl"},
        {folder.path(), "acl", folder / "acl"},
        {folder.path(), "sub/../acl", folder / "sub/../acl"},
        {folder.path(), "./a", folder / "./a"},
        {folder.path(), "/a", "/a"},
        {folder.path(), "", folder / ""},
        {"/", path_of(4096), path_of(4096)},
        {"/", std::string(4094, 'x'), path_of(4095)},
    };
    for (const auto &[directory, name, path] : rows) {
        const working_in there(directory);
        EXPECT_EQ(resolve(name), (resolved{0, path})) << directory << ' ' << name.substr(0, 20);
    }
}

TEST(file_name, refuses_paths_that_do_not_fit) {
    const std::string absolute = path_of(4097);
    EXPECT_EQ(resolve(absolute), (resolved{105, ""}));
    EXPECT_EQ(recorded_error(), error_of(105, 154, {absolute, std::to_string(ENAMETOOLONG)}));

    const working_in root("/"); // the separator counts although none is added
    EXPECT_EQ(resolve(std::string(4095, 'x')), (resolved{105, ""}));
    EXPECT_EQ(recorded_error(), error_of(105, 153, {"/", std::string(4095, 'x')}));

    const temporary_folder folder;
    const working_in top(folder.path());
    std::string deep = folder.path();
    while (deep.size() < 4090) {
        std::size_t length = std::min<std::size_t>(4090 - deep.size() - 1, 200);
        if (4090 - deep.size() - 1 - length == 1) // one byte left would be a separator without a name
            --length;
        const std::string part(length, 'd');
        ASSERT_EQ(mkdir(part.c_str(), 0700), 0);
        ASSERT_EQ(chdir(part.c_str()), 0);
        deep += "/" + part;
    }
    EXPECT_EQ(resolve("12345"), (resolved{0, deep + "/12345"}));
    EXPECT_EQ(resolve("123456"), (resolved{105, ""}));
    EXPECT_EQ(recorded_error(), error_of(105, 153, {deep, "123456"}));
}

TEST(file_name, needs_a_working_directory_for_a_relative_name) {
    const temporary_folder folder;
    const working_in start(".");
    const std::string gone = folder / "gone";
    ASSERT_EQ(mkdir(gone.c_str(), 0700), 0);
    ASSERT_EQ(chdir(gone.c_str()), 0);
    ASSERT_EQ(rmdir(gone.c_str()), 0);
    EXPECT_EQ(resolve("acl"), (resolved{105, ""}));
    EXPECT_EQ(recorded_error(), error_of(105, 152, {"getcwd()", std::to_string(ENOENT)}));
    EXPECT_EQ(resolve("/acl"), (resolved{0, "/acl"}));
}

TEST(file_name, lies_in_the_home_directory_of_a_user) {
    const struct {
        const char *name;
        const char *user;
        database_answer answer;
        resolved wanted;
        failure error;
    } rows[] = {
        {"acl", "alice", {0, "alice", "/home/alice"}, {0, "/home/alice/acl", 4242}, {}},
        {"acl", "alice", {0, "alice", "/"}, {0, "/acl", 4242}, {}},
        {"..", "alice", {0, "alice", "/h/"}, {0, "/h/..", 4242}, {}},
        {"acl", "", {0, "root", "/root"}, {0, "/root/acl", 4242}, {}},
        {"12345", "alice", {0, "alice", path_of(4090)}, {0, path_of(4090) + "/12345", 4242}, {}},
        {"123456", "alice", {0, "alice", path_of(4090)}, {4, "", 4242}, error_of(4, 151, {"123456", "alice"})},
        {"", "alice", {0, "alice", path_of(4096)}, {4, "", 4242}, error_of(4, 151, {"", "alice"})},
        {"a", "alice", {0, "alice", path_of(9000)}, {4, "", 4242}, error_of(4, 151, {"a", "alice"})},
        {"sub/acl", "alice", {EIO}, {4, ""}, error_of(4, 151, {"sub/acl", "alice"})},
        {"/acl", "nobody", {}, {4, ""}, error_of(4, 151, {"/acl", "nobody"})},
        {"acl/", "nobody", {}, {4, ""}, error_of(4, 151, {"acl/", "nobody"})},
        {"acl", "nobody", {}, {15, ""}, error_of(15, 127, {"nobody"})},
        {"acl", "alice", {EIO}, {15, ""}, error_of(15, 127, {"alice"})},
        {"acl", "alice", {0, "ALICE", "/h"}, {15, ""}, error_of(15, 127, {"alice"})},
        {"acl", "alice", {0, "alice2", "/h"}, {15, ""}, error_of(15, 127, {"alice"})},
    };
    for (const auto &row : rows) {
        staged = &row.answer;
        EXPECT_EQ(resolve(row.name, row.user), row.wanted) << row.name;
        EXPECT_EQ(recorded_error(), row.error);
        staged = nullptr;
    }
}

TEST(file_name, knows_the_users_of_this_system) {
    const passwd *self = getpwuid(getuid());
    ASSERT_NE(self, nullptr);
    const std::string home = self->pw_dir;
    EXPECT_EQ(resolve("acl", self->pw_name), (resolved{0, home + (home.back() == '/' ? "acl" : "/acl"), getuid()}));
    EXPECT_EQ(resolve("acl", "no such user").result, 15);
    EXPECT_EQ(recorded_error(), error_of(15, 127, {"no such user"}));
}

TEST(reading, takes_the_whole_file_or_nothing) {
    const temporary_folder folder;
    const std::string name = folder / "acl";
    std::ofstream(name) << "n r\0\n"sv;
    std::ofstream(folder / "empty");
    const auto failed = [](const char *count, const char *size, int error) {
        return error_of(37, 126, {count, size, std::to_string(error)});
    };
    const struct {
        std::string name;
        int flags;
        off_t start;
        std::string_view text; // with the NUL behind it
        std::size_t length;
        failure error;
    } rows[] = {
        {name, O_RDONLY, 0, "n r\0\n\0"sv, 5, {}},
        {folder / "empty", O_RDONLY, 0, "<null>", 0, {}},
        {name, O_RDONLY, 2, "<null>", 0, failed("3", "5", 0)},
        {name, O_RDONLY, 9, "<null>", 0, failed("0", "5", 0)},
        {name, O_WRONLY, 0, "<null>", 0, failed("-1", "5", EBADF)},
        {folder / "missing", O_RDONLY, 0, "<null>", 0,
         error_of(37, 122, {folder / "missing", std::to_string(ENOENT)})},
    };
    for (const auto &row : rows) {
        const qz::descriptor file(open(row.name.ends_with("missing") ? "/dev/null" : row.name.c_str(), row.flags));
        lseek(file.get(), row.start, SEEK_SET);
        errno = EPERM; // a stale number is not reported
        char *text = const_cast<char *>("left over");
        std::size_t length = 99;
        EXPECT_EQ(acl__read_acl_file(row.name.c_str(), file.get(), &text, &length), row.error.code);
        EXPECT_EQ(recorded_error(), row.error);
        EXPECT_EQ(text == nullptr ? "<null>"sv : std::string_view(text, length + 1), row.text);
        EXPECT_EQ(length, row.length);
        std::free(text);
    }
    EXPECT_EQ(acl__lock_acl_file("any", -1, 2), 0);
}

} // namespace
