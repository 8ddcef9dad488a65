// Where an ACL file is. The user database answers here as a case wants it to.
#include "faults.h"
#include "qzacl_acl/file_name.h"
#include "support.h"

using namespace support;

// The path that a name stands for, behind the user's id where there is a user; or the failure.
static failure path_of(const std::string &name, const char *user = nullptr) {
    qz::path_buffer path;
    std::uint32_t uid = 0;
    const int result = sec__get_aclfname(name.c_str(), user, path, &uid);
    const failure error = recorded_error();
    EXPECT_EQ(result, error.code);
    return result != 0 ? error : failure{0, 0, (user == nullptr ? "" : std::to_string(uid) + " ") + path.text};
}

TEST(file_name, stands_as_it_is_or_behind_the_working_directory) {
    const temporary_folder folder;
    std::string deep = folder.path();
    while (deep.size() < 4090) { // the first part leaves whole hundreds to the others
        deep += "/" + std::string(50 + (4090 - deep.size() - 51) % 100, 'd');
        ASSERT_EQ(mkdir(deep.c_str(), 0700), 0);
    }
    const std::string gone = folder / "gone", x4094(4094, 'x'), x4095(4095, 'x');
    const std::tuple<std::string, std::string, failure> rows[] = {
        {"/", "acl", {0, 0, "/acl"}},
        {folder.path(), "/etc//./acl", {0, 0, "/etc//./acl"}},
        {folder.path(), "./sub/.//acl", {0, 0, folder / "./sub/.//acl"}},
        {"/", "/" + x4095, {0, 0, "/" + x4095}},
        {"/", "//" + x4095, error_of(105, 154, {"//" + x4095, std::to_string(ENAMETOOLONG)})},
        {"/", x4094, {0, 0, "/" + x4094}},
        {"/", x4095, error_of(105, 153, {"/", x4095})}, // the separator counts although none is added
        {deep, "12345", {0, 0, deep + "/12345"}},
        {deep, "123456", error_of(105, 153, {deep, "123456"})},
        {gone, "acl", error_of(105, 152, {"getcwd()", std::to_string(ENOENT)})},
        {gone, "/acl", {0, 0, "/acl"}},
    };
    for (const auto &[directory, name, path] : rows) {
        mkdir(gone.c_str(), 0700);
        ASSERT_EQ(chdir(directory.c_str()), 0);
        rmdir(gone.c_str());
        EXPECT_EQ(path_of(name), path);
    }
}

TEST(file_name, lies_in_the_home_directory_of_a_user) {
    const std::string h4090 = "/" + std::string(4089, 'h'), h9000(9000, 'h');
    const failure unknown = error_of(15, 127, {"alice"});
    // The name; what the database answers, and as whose home; the path or the failure.
    const std::tuple<const char *, std::pair<int, const char *>, std::string, failure> rows[] = {
        {"acl", {0, "alice"}, "/home/alice", {0, 0, "4242 /home/alice/acl"}},
        {"..", {0, "alice"}, "/h/", {0, 0, "4242 /h/.."}},
        {"12345", {0, "alice"}, h4090, {0, 0, "4242 " + h4090 + "/12345"}},
        {"123456", {0, "alice"}, h4090, error_of(4, 151, {"123456", "alice"})},
        {"", {0, "alice"}, h9000, error_of(4, 151, {"", "alice"})},
        {"sub/acl", {EIO, nullptr}, "", error_of(4, 151, {"sub/acl", "alice"})},
        {"acl", {}, "", unknown},
        {"acl", {EIO, "alice"}, "/h", unknown},
        {"acl", {0, "ALICE"}, "/h", unknown},
        {"acl", {0, "alice2"}, "/h", unknown},
    };
    for (const auto &[name, answer, home, path] : rows) {
        faults::answer = answer;
        faults::home = home;
        EXPECT_EQ(path_of(name, "alice"), path);
    }
}
