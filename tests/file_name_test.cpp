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
    const char *home = nullptr;
};
const database_answer *staged = nullptr;

} // namespace

extern "C" int getpwnam_r(const char *name, passwd *resultbuf, char *buffer, size_t buflen, passwd **result) {
    if (staged == nullptr) {
        static const auto real = reinterpret_cast<decltype(&getpwnam_r)>(dlsym(RTLD_NEXT, "getpwnam_r"));
        return real(name, resultbuf, buffer, buflen, result);
    }
    resultbuf->pw_name = const_cast<char *>(staged->name);
    resultbuf->pw_dir = const_cast<char *>(staged->home);
    resultbuf->pw_uid = 4242;
    *result = staged->name == nullptr ? nullptr : resultbuf;
    return staged->result;
}

namespace {

// The path that a name stands for, behind the user's id where there is a user; nothing after a failure.
std::string path_of(const std::string &name, const char *user = nullptr) {
    qz::path_buffer path;
    std::uint32_t uid = 0;
    const int result = sec__get_aclfname(name.c_str(), user, path, &uid);
    return result != 0 ? "" : (user == nullptr ? "" : std::to_string(uid) + " ") + path.text;
}

// An absolute path of a length.
std::string long_path(std::size_t length) {
    std::string path(length, 'x');
    path[0] = '/';
    return path;
}

TEST(file_name, stands_as_it_is_or_behind_the_working_directory) {
    const temporary_folder folder;
    const struct {
        std::string directory, name, path;
        failure error = {};
    } rows[] = {
        {"/", "acl", "/acl"},
        {"/", "/etc//./acl", "/etc//./acl"},
        {folder.path(), "sub/.//acl", folder / "sub/.//acl"},
        {folder.path(), "./a", folder / "./a"},
        {folder.path(), "/a", "/a"},
        {"/", long_path(4096), long_path(4096)},
        {"/", long_path(4097), "", error_of(105, 154, {long_path(4097), std::to_string(ENAMETOOLONG)})},
        {"/", std::string(4094, 'x'), long_path(4095)},
        // The separator counts although none is added.
        {"/", std::string(4095, 'x'), "", error_of(105, 153, {"/", std::string(4095, 'x')})},
    };
    for (const auto &row : rows) {
        ASSERT_EQ(chdir(row.directory.c_str()), 0);
        EXPECT_EQ(path_of(row.name), row.path);
        EXPECT_EQ(recorded_error(), row.error);
    }
}

TEST(file_name, fits_behind_a_deep_working_directory_or_not) {
    const temporary_folder folder;
    ASSERT_EQ(chdir(folder.path().c_str()), 0);
    std::string deep = folder.path();
    while (deep.size() < 4090) {
        // Whatever is left over must still make a name.
        const std::size_t left = 4090 - deep.size();
        const std::string part(left > 202 ? 200 : left > 101 ? left / 2 : left - 1, 'd');
        ASSERT_EQ(mkdir(part.c_str(), 0700), 0);
        ASSERT_EQ(chdir(part.c_str()), 0);
        deep += "/"s + part;
    }
    EXPECT_EQ(path_of("12345"), deep + "/12345");
    EXPECT_EQ(path_of("123456"), "");
    EXPECT_EQ(recorded_error(), error_of(105, 153, {deep, "123456"}));
}

TEST(file_name, needs_a_working_directory_when_it_is_relative) {
    {
        const temporary_folder folder;
        ASSERT_EQ(chdir(folder.path().c_str()), 0);
    }
    EXPECT_EQ(path_of("acl"), "");
    EXPECT_EQ(recorded_error(), error_of(105, 152, {"getcwd()", std::to_string(ENOENT)}));
    EXPECT_EQ(path_of("/acl"), "/acl");
}

TEST(file_name, lies_in_the_home_directory_of_a_user) {
    const std::string h4090 = long_path(4090), h4096 = long_path(4096), h9000 = long_path(9000);
    const struct {
        const char *name;
        const char *user;
        database_answer answer;
        std::string path;
        failure error = {};
    } rows[] = {
        {"acl", "alice", {0, "alice", "/home/alice"}, "4242 /home/alice/acl"},
        {"acl", "alice", {0, "alice", "/"}, "4242 /acl"},
        {"..", "alice", {0, "alice", "/h/"}, "4242 /h/.."},
        {"12345", "alice", {0, "alice", h4090.c_str()}, "4242 "s + h4090 + "/12345"},
        {"123456", "alice", {0, "alice", h4090.c_str()}, "", error_of(4, 151, {"123456", "alice"})},
        {"", "alice", {0, "alice", h4096.c_str()}, "", error_of(4, 151, {"", "alice"})},
        {"a", "alice", {0, "alice", h9000.c_str()}, "", error_of(4, 151, {"a", "alice"})},
        {"sub/acl", "alice", {EIO}, "", error_of(4, 151, {"sub/acl", "alice"})},
        {"/acl", "nobody", {}, "", error_of(4, 151, {"/acl", "nobody"})},
        {"acl", "nobody", {}, "", error_of(15, 127, {"nobody"})},
        {"acl", "alice", {EIO, "alice", "/h"}, "", error_of(15, 127, {"alice"})},
        {"acl", "alice", {0, "ALICE", "/h"}, "", error_of(15, 127, {"alice"})},
        {"acl", "alice", {0, "alice2", "/h"}, "", error_of(15, 127, {"alice"})},
    };
    for (const auto &row : rows) {
        staged = &row.answer;
        EXPECT_EQ(path_of(row.name, row.user), row.path);
        EXPECT_EQ(recorded_error(), row.error);
    }
    staged = nullptr; // and now the users of this system
    const passwd *self = getpwuid(getuid());
    ASSERT_NE(self, nullptr);
    EXPECT_EQ(path_of("x", self->pw_name), std::to_string(getuid()) + " " + self->pw_dir + "/x");
    EXPECT_EQ(path_of("x", "no such user"), "");
    EXPECT_EQ(recorded_error(), error_of(15, 127, {"no such user"}));
}

TEST(reading, takes_the_whole_file_or_nothing) {
    const temporary_folder folder;
    const std::string name = folder / "acl";
    const std::string missing = folder / "missing";
    std::ofstream(name) << "n r\0\n"sv;
    std::ofstream(folder / "empty") << "";
    const struct {
        std::string opened, named;
        int flags;
        off_t start;
        std::string_view text; // with the NUL behind it
        failure error = {};
    } rows[] = {
        {name, name, O_RDONLY, 0, "n r\0\n\0"sv},
        {folder / "empty", folder / "empty", O_RDONLY, 0, ""},
        {name, name, O_RDONLY, 2, "", error_of(37, 126, {"3", "5", "0"})},
        {name, name, O_RDONLY, 9, "", error_of(37, 126, {"0", "5", "0"})},
        {name, name, O_WRONLY, 0, "", error_of(37, 126, {"-1", "5", std::to_string(EBADF)})},
        {name, missing, O_RDONLY, 0, "", error_of(37, 122, {missing, std::to_string(ENOENT)})},
    };
    for (const auto &row : rows) {
        const qz::descriptor file(open(row.opened.c_str(), row.flags));
        lseek(file.get(), row.start, SEEK_SET);
        errno = EPERM; // a stale number is not reported
        char *text = const_cast<char *>("left over");
        std::size_t length = 99;
        EXPECT_EQ(acl__read_acl_file(row.named.c_str(), file.get(), &text, &length), row.error.code);
        EXPECT_EQ(recorded_error(), row.error);
        EXPECT_EQ(text == nullptr ? ""sv : std::string_view(text, length + 1), row.text);
        EXPECT_EQ(length, row.text.empty() ? 0 : row.text.size() - 1);
        std::free(text);
    }
}

} // namespace
