// Tests of reading an ACL file through its cache: which of the two files is read, what the flags then say,
// and what a cache that is written afterwards looks like. Times are set, never waited for.
#include "support.h"
#include <pwd.h>

namespace {

using namespace support;
namespace fs = std::filesystem;

constexpr unsigned text = SEC_READ_ACL_TEXT, cache = SEC_READ_ACL_CACHE, convert = SEC_READ_ACL_CONVERT;
const std::string acl_text = "# users\nu unix alice@host r\n";
const std::string from_text = one(of_mechanism(4, "unix", 1, named(1, "alice@host")));

using reading = std::tuple<std::string, unsigned, failure>; // the bytes, the flags, and the error
reading given(const std::string &bytes, unsigned flags) { return {bytes, flags, no_error}; }
reading refused(const failure &error, unsigned flags) { return {"", flags, error}; }
reading read_acl(const std::string &path, unsigned flags, const char *user = nullptr) {
    buffer held;
    held.acl = {7, &held}; // overwritten whatever comes
    const int result = sec_read_acl_file(path.c_str(), user, nullptr, flags, &held.acl, &flags);
    EXPECT_EQ(held.acl.data == nullptr, held.acl.length == 0);
    return {held.bytes(), flags, after(result)};
}

struct read_acl_file : testing::Test {
    const temporary_folder folder;
    const std::string path = folder / "acl", cache_path = path + ".cacl";
};

TEST_F(read_acl_file, reads_the_cache_when_it_is_current) {
    const std::string cut = example.substr(0, 30);
    const std::string foreign = "\x85\1\1\0\1\0\0\0\x1a\4\0\0\0\1\5abcd\0\1\0\0\0\3\0\4xyz\0"s;
    // The text, 100 s old; what is cached, its age and mode; the flags before and after; what is read.
    const std::tuple<std::string, std::string, int, unsigned, unsigned, unsigned, std::string> rows[] = {
        {acl_text, "", 0, 0, convert | 0xf8, text | 0xf8, from_text}, // no file
        {acl_text, "", 0, 0644, convert, text, from_text},
        {acl_text, example, 99, 0644, convert | cache | 0xf8, convert | 0xf8, example},
        {acl_text, example, 99, 0644, text | cache, text, from_text},
        {acl_text, example, 100, 0644, 0, text, from_text},
        {acl_text, example, 0, 01644, cache, text, from_text},
        {acl_text, cut, 0, 0644, 0, 0, cut},                        // nobody asked for a check
        {acl_text, cut, 0, 0644, convert | cache, text, from_text}, // newer, so left alone
        {"", example, 0, 0644, cache | convert, convert, ""},
        {"# nobody\n\n  \t\n", example, 0, 0644, text | cache, text, ""},
        {acl_text, foreign, 0, 0644, 0, 0, foreign},
    };
    for (const auto &[written, cached, age, mode, in, out, bytes] : rows) {
        fs::remove(cache_path);
        write_file(path, written, 100, 0644);
        if (mode != 0) write_file(cache_path, cached, age, mode);
        EXPECT_EQ(read_acl(path, in), given(bytes, out)) << written << age << ' ' << mode << ' ' << in;
        EXPECT_EQ(read_file(cache_path), cached) << written << age << ' ' << mode << ' ' << in;
    }
    EXPECT_EQ(read_acl(path, convert), given(example, convert));
    for (const uid_t uid : {1u, 0u}) {
        const bool may = chown(cache_path.c_str(), uid, 1 - uid) == 0; // the superuser only
        EXPECT_EQ(read_acl(path, cache), may ? given(from_text, text) : given(foreign, 0));
    }
}

TEST_F(read_acl_file, refreshes_a_cache_then_uses_it_and_leaves_no_other_file) {
    for (const unsigned mode : {0644u, 0600u}) {
        write_file(path, acl_text, 100, mode);
        write_file(cache_path, example, 200, mode);
        EXPECT_EQ(read_acl(path, cache | convert), given(from_text, text | cache));
        EXPECT_EQ(read_file(cache_path), from_text);
        EXPECT_EQ(fs::status(cache_path).permissions(), fs::perms(mode));
        EXPECT_EQ(read_acl(path, cache | convert), given(from_text, convert));
    }
    EXPECT_EQ(std::distance(fs::directory_iterator(folder.path()), fs::directory_iterator()), 2);
}

TEST_F(read_acl_file, reports_what_it_refuses) {
    const std::string missing = folder / "missing";
    EXPECT_EQ(read_acl(missing, 0xf2), refused(error_of(37, 122, {missing, std::to_string(ENOENT)}), 0xf2));
    EXPECT_EQ(read_acl(folder.path(), 0), refused(error_of(37, 122, {folder.path(), "0"}), 0));
    EXPECT_EQ(read_acl("acl", cache, ""), refused(error_of(4, 121), cache));
    write_file(path, "o r\no r\n", 100, 0644);
    EXPECT_EQ(read_acl(path, cache | convert), refused(error_of(43, 160, {"o"}), text | cache));
    EXPECT_FALSE(fs::exists(cache_path));
    unsigned flags = 9;
    sec_acl_buffer_t acl = {7, &flags};
    const char *const name = "sec_read_acl_file";
    EXPECT_EQ(after(sec_read_acl_file(nullptr, "", nullptr, 2, &acl, &flags)), bad_parameter(name, 1));
    EXPECT_EQ(flags, 2u);
    EXPECT_EQ(after(sec_read_acl_file("acl", "", nullptr, 4, nullptr, nullptr)), bad_parameter(name, 5));
}

TEST_F(read_acl_file, of_a_user_must_be_that_users_alone) {
    const passwd *user = getpwuid(geteuid());
    if (user == nullptr || access(user->pw_dir, W_OK) != 0) GTEST_SKIP() << "no home directory to write to";
    const std::string name = user->pw_name, base = ".qzacl-test-" + std::to_string(getpid());
    const std::string file = user->pw_dir + "/"s + base;
    const reading not_private = refused(error_of(36, 128, {file, name}), text);
    for (const auto &[mode, other] : {std::pair(0644u, 0u), {0620u, 0u}, {0602u, 0u}, {0600u, 1u}}) {
        write_file(file, acl_text, 100, mode);
        const bool is_given = other != 0 && chown(file.c_str(), geteuid() + other, 0) == 0; // by root
        const bool is_sound = (mode & 022) == 0 && !is_given;
        EXPECT_EQ(read_acl(base, text, name.c_str()), is_sound ? given(from_text, text) : not_private);
        EXPECT_EQ(read_acl(file, text), given(from_text, text)); // without a user nobody asks
    }
    write_file(file, "", 100, 0666); // nothing that could be trusted
    EXPECT_EQ(read_acl(base, 0, name.c_str()), given("", 0));
    fs::remove(file);
}

} // namespace
