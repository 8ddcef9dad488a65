// Where an ACL file is, which of it and its cache is read, and what the flags then say. Times are set, never waited
// for; the user database answers as a case wants it to.
#include "faults.h"
#include "qzacl_acl/file_name.h"
#include "support.h"

using namespace support;
namespace fs = std::filesystem;

constexpr unsigned text = SEC_READ_ACL_TEXT, cache = SEC_READ_ACL_CACHE, convert = SEC_READ_ACL_CONVERT;
const std::string acl_text = "# users\nu unix alice@host r\n";
const std::string from_text = one(of_mechanism(4, "unix", 1, named(1, "alice@host")));

struct read_acl_file : testing::Test {
    using reading = std::tuple<std::string, unsigned, failure>; // the bytes, the flags, and the error
    static reading given(const std::string &bytes, unsigned flags) { return {bytes, flags, no_error}; }
    static reading read(const std::string &name, unsigned flags, const char *user = nullptr) {
        buffer held;
        held.acl = {7, &held}; // overwritten whatever comes
        const int result = sec_read_acl_file(name.c_str(), user, nullptr, flags, &held.acl, &flags);
        EXPECT_EQ(held.acl.data == nullptr, held.acl.length == 0);
        return {held.bytes(), flags, after(result)};
    }
    const temporary_folder folder;
    const std::string path = folder / "acl", cache_path = path + ".cacl";
};

TEST_F(read_acl_file, reads_the_cache_when_it_is_current) {
    const std::string cut = example.substr(0, 30);
    std::string unsound = foreign;
    unsound[20] = 9; // the version of its entry
    // The text, 100 s old; what is cached, its age and mode; the flags before and after; what is read.
    const std::tuple<std::string, std::string, int, unsigned, unsigned, unsigned, std::string> rows[] = {
        {acl_text, "", 0, 0, convert | 0xf8, text | 0xf8, from_text}, // no file
        {acl_text, "", 0, 0644, 0, text, from_text},
        {acl_text, example, 99, 0644, convert | cache | 0xf8, convert | 0xf8, example},
        {acl_text, example, 99, 0644, text | cache, text, from_text},
        {acl_text, example, 100, 0644, 0, text, from_text},
        {acl_text, example, 0, 01644, cache, text, from_text},
        {acl_text, cut, 0, 0644, 0, 0, cut},                        // nobody asked for a check
        {acl_text, cut, 0, 0644, convert | cache, text, from_text}, // newer, so left alone
        {"", example, 0, 0644, cache | convert, convert, ""},
        {"# nobody\n\n  \t\n", example, 0, 0644, text | cache, text, ""},
        {acl_text, unsound, 0, 0644, convert, text, from_text}, // once it is converted
        {acl_text, foreign, 0, 0644, 0, 0, foreign},
    };
    for (const auto &[written, cached, age, mode, in, out, bytes] : rows) {
        fs::remove(cache_path);
        write_file(path, written, 100);
        if (mode != 0) write_file(cache_path, cached, age, mode);
        EXPECT_EQ(read(path, in), given(bytes, out)) << written << age << ' ' << mode << ' ' << in;
        EXPECT_EQ(read_file(cache_path), cached) << written << age << ' ' << mode << ' ' << in;
    }
    EXPECT_EQ(read(path, convert), given(example, convert));
    for (const uid_t uid : {1u, 0u}) {
        const bool may = chown(cache_path.c_str(), uid, 1 - uid) == 0; // the superuser only
        EXPECT_EQ(read(path, cache), may ? given(from_text, text) : given(foreign, 0));
    }
    // A cache that is out of date is replaced, and protected like the text.
    fs::remove(cache_path);
    for (const unsigned mode : {0644u, 0600u}) {
        write_file(path, acl_text, 100, mode);
        write_file(cache_path, example, 200, mode);
        EXPECT_EQ(read(path, cache | convert), given(from_text, text | cache));
        EXPECT_EQ(fs::status(cache_path).permissions(), fs::perms(mode));
        EXPECT_EQ(read(path, cache | convert), given(from_text, convert));
    }
}

TEST_F(read_acl_file, reads_the_cache_when_its_entries_are_those_of_the_text) {
    constexpr unsigned none = 8; // for user 1, else the permissions
    struct row {
        const char *name;
        unsigned of_text, of_cache;
        unsigned mode;
        bool is_believed;
    };
    const row rows[] = {
        {"neither has entries", none, none, 0664, true},
        {"both have the same", 6, 6, 0664, true},
        {"the group may write the cache", 6, none, 0664, false},
        {"the group may read the cache", 4, none, 0644, false},
        {"user 1 may write the cache", none, 6, 0664, false},
        {"user 1 may write the cache, not only read it", 4, 6, 0664, false},
    };
    for (const auto &[name, of_text, of_cache, mode, is_believed] : rows) {
        SCOPED_TRACE(name);
        const unsigned mask = mode >> 3 & 7;
        write_file(path, acl_text, 100, mode);
        write_file(cache_path, example, 0, mode);
        if (of_text != none && !give_entries(path, of_text, mask)) GTEST_SKIP() << "the file system has no POSIX ACLs";
        if (of_cache != none) { ASSERT_TRUE(give_entries(cache_path, of_cache, mask)); }
        EXPECT_EQ(read(path, convert), is_believed ? given(example, convert) : given(from_text, text));
        EXPECT_EQ(read(path, cache | convert), is_believed ? given(example, convert) : given(from_text, text));
        fs::remove(path);
        fs::remove(cache_path);
    }
}

TEST_F(read_acl_file, knows_times_after_2038) {
    constexpr time_t later = 4000000000;
    write_file(path, acl_text);
    write_file(cache_path, example);
    const auto stamp = [](const std::string &name, time_t seconds) {
        const timespec times[2] = {{seconds, 0}, {seconds, 0}};
        return utimensat(AT_FDCWD, name.c_str(), times, 0);
    };
    ASSERT_EQ(stamp(path, later) | stamp(cache_path, later + 1), 0);
    EXPECT_EQ(read(path, 0), given(example, 0));
    ASSERT_EQ(stamp(cache_path, later), 0);
    EXPECT_EQ(read(path, 0), given(from_text, text));
}

// A file of 4 GiB is none without bytes, and one of a byte less does not go into a block of none.
TEST_F(read_acl_file, larger_than_memory_can_be_does_not_fit) {
    if (sizeof(size_t) > 4) GTEST_SKIP() << "any file may fit";
    for (const off_t size : {off_t{1} << 32, (off_t{1} << 32) - 1}) {
        write_file(path, "");
        ASSERT_EQ(truncate(path.c_str(), size), 0);
        EXPECT_EQ(read(path, text), reading("", text, error_of(6, 89, {"sec_read_acl_file", "2147483647"})));
    }
}

TEST_F(read_acl_file, reports_what_it_refuses) {
    EXPECT_EQ(read(folder.path, 0xf2), reading("", 0xf2, error_of(37, 122, {folder.path, "0"})));
    EXPECT_EQ(read("acl", cache, ""), reading("", cache, error_of(4, 121)));
    write_file(path, "o r\no r\n");
    EXPECT_EQ(read(path, cache | convert), reading("", text | cache, error_of(43, 160, {"o"})));
    EXPECT_FALSE(fs::exists(cache_path));
    // Letters mean what the caller says.
    const sec_perm_template_t templates[] = {{0x80000000, 'Z', "", ""}, {2, 'r', "", ""}, {4, 'r', "", ""}};
    const sec_perm_set_t own = {3, templates};
    buffer held;
    write_file(path, "o rZ\n");
    EXPECT_EQ(after(sec_read_acl_file(path.c_str(), nullptr, &own, text, &held.acl, nullptr)), no_error);
    EXPECT_EQ(held.bytes(), one(packed_subacl(2, "", 1, packed_entry(0x80000002, ""))));
    unsigned flags = 9;
    sec_acl_buffer_t acl = {7, &flags};
    EXPECT_EQ(after(sec_read_acl_file(nullptr, "", nullptr, 2, &acl, &flags)), bad_parameter("sec_read_acl_file", 1));
    EXPECT_EQ(flags, 2u);
    EXPECT_EQ(after(sec_read_acl_file("", "", nullptr, 4, nullptr, nullptr)), bad_parameter("sec_read_acl_file", 5));
}

TEST_F(read_acl_file, of_a_user_must_be_that_users_alone) {
    const char *const name = getpwuid(geteuid())->pw_name;
    const reading not_private = {"", text, error_of(36, 128, {path, name})};
    faults::home = folder.path;
    for (const auto &[mode, owner] : {std::pair(0644u, 0u), {0620u, 0u}, {0602u, 0u}, {0600u, 1u}}) {
        write_file(path, acl_text, 100, mode);
        const bool is_given = owner != 0 && chown(path.c_str(), owner, 0) == 0; // by root
        EXPECT_EQ(read("acl", text, name), (mode & 022) != 0 || is_given ? not_private : given(from_text, text));
        EXPECT_EQ(read(path, text), given(from_text, text)); // without a user nobody asks
    }
    write_file(path, "", 100, 0666); // nothing that could be trusted
    EXPECT_EQ(read("acl", 0, name), given("", 0));
    // The home directory may be a link, or missing.
    fs::remove(path);
    write_file(path, acl_text);
    fs::create_directory_symlink(folder.path, folder / "link");
    EXPECT_EQ(read((faults::home = folder / "link", "acl"), text, name), given(from_text, text));
    faults::home = folder / "nowhere";
    const failure missing = error_of(37, 122, {folder / "nowhere/acl", std::to_string(ENOENT)});
    EXPECT_EQ(read("acl", text, name), reading("", text, missing));
}

// The path that a name stands for, behind the user's id where there is a user; or the failure.
failure path_of(const std::string &name, const char *user = nullptr) {
    qz::path_buffer path;
    std::uint32_t uid = 0;
    const int result = sec__get_aclfname(name.c_str(), user, path, &uid);
    const failure error = recorded_error();
    EXPECT_EQ(result, error.code);
    return result != 0 ? error : failure{0, 0, (user == nullptr ? "" : std::to_string(uid) + " ") + path.text};
}

TEST(file_name, stands_as_it_is_or_behind_the_working_directory) {
    const temporary_folder folder;
    const std::string x4094(4094, 'x'), x4095(4095, 'x');
    const std::tuple<std::string, std::string, failure> rows[] = {
        {folder.path, "/etc//./acl", {0, 0, "/etc//./acl"}},
        {folder.path, "./sub/.//acl", {0, 0, folder / "./sub/.//acl"}},
        {"/", "/" + x4095, {0, 0, "/" + x4095}},
        {"/", "//" + x4095, error_of(105, 154, {"//" + x4095, std::to_string(ENAMETOOLONG)})},
        {"/", x4094, {0, 0, "/" + x4094}},
        {"/", x4095, error_of(105, 153, {"/", x4095})}, // the separator counts although none is added
    };
    for (const auto &[directory, name, path] : rows) {
        fs::current_path(directory);
        EXPECT_EQ(path_of(name), path);
    }
}

TEST(file_name, lies_in_the_home_directory_of_a_user) {
    const std::string h4090 = "/" + std::string(4089, 'h'), h9000(9000, 'h');
    const failure unknown = error_of(15, 127, {"alice"});
    // The name; what the database answers, and as whose home; the path or the failure.
    const std::tuple<const char *, std::pair<int, const char *>, std::string, failure> rows[] = {
        {"..", {0, "alice"}, "/h/", {0, 0, "4242 /h/.."}},
        {"12345", {0, "alice"}, h4090, {0, 0, "4242 " + h4090 + "/12345"}},
        {"123456", {0, "alice"}, h4090, error_of(4, 151, {"123456", "alice"})},
        {"", {0, "alice"}, h9000, error_of(4, 151, {"", "alice"})},
        {"sub/acl", {EIO, nullptr}, "", error_of(4, 151, {"sub/acl", "alice"})},
        {"acl", {}, "", unknown},
        {"acl", {0, "ALICE"}, "/h", unknown},
        {"acl", {0, "alice2"}, "/h", unknown},
    };
    for (const auto &[name, answer, home, path] : rows) {
        faults::answer = answer;
        faults::home = home;
        EXPECT_EQ(path_of(name, "alice"), path);
    }
}
