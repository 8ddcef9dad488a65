// Where an ACL file is, which of it and its cache is read, and what the flags then say. Times are set, never waited
// for; the user database answers as a case wants it to.
#include "faults.h"
#include "qzacl_acl/file_name.h"
#include "support.h"

using namespace support;
namespace fs = std::filesystem;

constexpr unsigned text = SEC_READ_ACL_TEXT;
constexpr unsigned cache = SEC_READ_ACL_CACHE;
constexpr unsigned convert = SEC_READ_ACL_CONVERT;
constexpr unsigned others = 0xf8; // bits that are no flags
const std::string acl_text = "# users\nu unix alice@host r\n";
const std::string from_text = acl_bytes("u unix: alice@host 1");

struct read_acl_file : testing::Test {
    using reading = std::tuple<std::string, unsigned, failure>; // the bytes, the flags, and the error
    static reading given(const std::string &bytes, unsigned flags) { return {bytes, flags, no_error}; }
    static reading failed(const failure &error, unsigned flags) { return {"", flags, error}; }
    static reading read(const std::string &name, unsigned flags, const char *user = nullptr) {
        buffer held;
        held.acl = {7, &held}; // always overwritten
        const int result = sec_read_acl_file(name.c_str(), user, nullptr, flags, &held.acl, &flags);
        EXPECT_EQ(held.acl.data == nullptr, held.acl.length == 0);
        return {held.bytes(), flags, outcome_of(result)};
    }
    const temporary_folder folder;
    const std::string path = folder / "acl";
    const std::string cache_path = path + ".cacl";
};

TEST_F(read_acl_file, reads_the_cache_when_it_is_current) {
    constexpr int current = 99; // the text is 100 s old
    constexpr int stale = 100;
    const std::string cut = example.substr(0, 30);
    std::string unsound = foreign;
    unsound[20] = 9; // the version of its entry
    // The bytes of the cache, or nothing without one; its age; the flags in and out; the bytes that are read.
    const std::tuple<const char *, std::string, int, unsigned, unsigned, std::string> rows[] = {
        {"no cache", "", 0, convert | others, text | others, from_text},
        {"a current one", example, current, convert | cache | others, convert | others, example},
        {"the text is asked for", example, current, text | cache, text, from_text},
        {"a stale one", example, stale, 0, text, from_text},
        {"a cut one that nobody checks", cut, current, 0, 0, cut},
        {"a cut one, newer, so left alone", cut, current, convert | cache, text, from_text},
        {"one unsound when it is converted", unsound, current, convert, text, from_text},
        {"one in the other order that nobody converts", foreign, current, 0, 0, foreign},
        {"one in the other order", foreign, current, convert, convert, example},
        {"a stale one that is replaced", example, stale, cache | convert, text | cache, from_text},
    };
    for (const auto &[what, cached, age, in, out, bytes] : rows) {
        SCOPED_TRACE(what);
        fs::remove(cache_path);
        write_file(path, acl_text, 100);
        if (!cached.empty())
            write_file(cache_path, cached, age);
        EXPECT_EQ(read(path, in), given(bytes, out));
        EXPECT_EQ(read_file(cache_path), out == (text | cache) ? from_text : cached);
    }
}

TEST_F(read_acl_file, without_entries_gives_nothing) {
    write_file(cache_path, example);
    write_file(path, "", 100);
    EXPECT_EQ(read(path, cache | convert), given("", convert));
    write_file(path, "# nobody\n\n  \t\n", 100);
    EXPECT_EQ(read(path, text | cache), given("", text));
}

TEST_F(read_acl_file, reads_a_cache_of_the_same_owner_and_mode) {
    write_file(path, acl_text, 100);
    write_file(cache_path, example);
    EXPECT_EQ(read(path, 0), given(example, 0));
    fs::permissions(cache_path, fs::perms(01644));
    EXPECT_EQ(read(path, 0), given(from_text, text));
    fs::permissions(cache_path, fs::perms(0644));
    for (const auto &[user, group] : {std::pair(1u, 0u), {0u, 1u}}) {
        const bool is_given_away = chown(cache_path.c_str(), user, group) == 0; // the superuser only
        EXPECT_EQ(read(path, 0), is_given_away ? given(from_text, text) : given(example, 0));
    }
}

TEST_F(read_acl_file, reads_the_cache_when_its_entries_are_those_of_the_text) {
    constexpr unsigned none = 8; // for user 1, else the permissions
    constexpr unsigned read_only = 4;
    constexpr unsigned read_write = 6;
    constexpr bool believed = true;
    constexpr bool not_believed = false;
    // The entry of the text, that of the cache, and the mode of both.
    const std::tuple<const char *, unsigned, unsigned, unsigned, bool> rows[] = {
        {"neither has entries", none, none, 0664, believed},
        {"both have the same", read_write, read_write, 0664, believed},
        {"the group may write the cache", read_write, none, 0664, not_believed},
        {"the group may read the cache", read_only, none, 0644, not_believed},
        {"user 1 may write the cache", none, read_write, 0664, not_believed},
        {"user 1 may write the cache, not only read it", read_only, read_write, 0664, not_believed},
    };
    for (const auto &[what, of_text, of_cache, mode, is_believed] : rows) {
        SCOPED_TRACE(what);
        const unsigned mask = mode >> 3 & 7;
        fs::remove(path);
        fs::remove(cache_path);
        write_file(path, acl_text, 100, mode);
        write_file(cache_path, example, 0, mode);
        if (of_text != none && !give_entries(path, of_text, mask))
            GTEST_SKIP() << "the file system has no POSIX ACLs";
        EXPECT_TRUE(of_cache == none || give_entries(cache_path, of_cache, mask));
        EXPECT_EQ(read(path, cache | convert),
                  is_believed ? given(example, convert) : given(from_text, text));
    }
}

TEST_F(read_acl_file, knows_times_after_2038) {
    constexpr time_t later = 4000000000;
    const auto stamp = [](const std::string &name, time_t seconds) {
        const timespec times[2] = {{seconds, 0}, {seconds, 0}};
        ASSERT_EQ(utimensat(AT_FDCWD, name.c_str(), times, 0), 0);
    };
    write_file(path, acl_text);
    write_file(cache_path, example);
    stamp(path, later);
    stamp(cache_path, later + 1);
    EXPECT_EQ(read(path, 0), given(example, 0));
    stamp(cache_path, later);
    EXPECT_EQ(read(path, 0), given(from_text, text));
}

// A file of 4 GiB does not count as empty, and one of a byte less does not get a block without bytes.
TEST_F(read_acl_file, larger_than_memory_can_be_does_not_fit) {
    if (sizeof(size_t) > 4)
        GTEST_SKIP() << "any file may fit";
    const failure error = error_of(SEC_S_NO_MEMORY, msg::no_memory, "sec_read_acl_file", 2147483647);
    for (const off_t size : {off_t{1} << 32, (off_t{1} << 32) - 1}) {
        write_file(path, "");
        ASSERT_EQ(truncate(path.c_str(), size), 0);
        EXPECT_EQ(read(path, text), failed(error, text));
    }
}

TEST_F(read_acl_file, reports_what_it_refuses) {
    const failure no_file = error_of(SEC_S_FILE_ERROR, msg::bad_file_name, folder.path, 0);
    EXPECT_EQ(read(folder.path, cache | others), failed(no_file, cache | others));
    EXPECT_EQ(read("acl", cache, ""), failed(error_of(SEC_S_BAD_PARAMETER, msg::bad_user_name), cache));
    write_file(path, "o r\no r\n");
    EXPECT_EQ(read(path, cache | convert), failed(bad_acle(msg::duplicate_single_acle, "o"), text | cache));
    EXPECT_FALSE(fs::exists(cache_path));
    unsigned flags = others;
    sec_acl_buffer_t acl = {7, &flags};
    const std::string name = "sec_read_acl_file";
    EXPECT_EQ(outcome_of(sec_read_acl_file(nullptr, "", nullptr, cache, &acl, &flags)),
              bad_parameter(name, 1));
    EXPECT_EQ(flags, cache);
    EXPECT_EQ(outcome_of(sec_read_acl_file("", "", nullptr, convert, nullptr, nullptr)),
              bad_parameter(name, 5));
}

TEST_F(read_acl_file, takes_letters_to_mean_what_the_caller_says) {
    const sec_perm_template_t templates[] = {{0x80000000, 'Z', "", ""}, {2, 'r', "", ""}, {4, 'r', "", ""}};
    const sec_perm_set_t own = {3, templates};
    buffer held;
    write_file(path, "o rZ\n");
    EXPECT_EQ(sec_read_acl_file(path.c_str(), nullptr, &own, text, &held.acl, nullptr), SEC_S_OK);
    EXPECT_EQ(held.bytes(), acl_bytes("o: 2147483650"));
}

TEST_F(read_acl_file, of_a_user_must_be_that_users_alone) {
    const char *const name = getpwuid(geteuid())->pw_name;
    const failure not_private = error_of(SEC_S_BAD_PERMISSION, msg::file_not_private, path, name);
    faults::home = folder.path;
    for (const auto &[mode, owner] : {std::pair(0644u, 0u), {0620u, 0u}, {0602u, 0u}, {0600u, 1u}}) {
        write_file(path, acl_text, 100, mode);
        const bool is_given_away = owner != 0 && chown(path.c_str(), owner, 0) == 0; // by root
        const bool is_private = (mode & 022) == 0 && !is_given_away;
        EXPECT_EQ(read("acl", text, name), is_private ? given(from_text, text) : failed(not_private, text));
        EXPECT_EQ(read(path, text), given(from_text, text)); // without a user nobody asks
    }
    write_file(path, "", 100, 0666); // nothing that could be trusted
    EXPECT_EQ(read("acl", 0, name), given("", 0));
}

// The path of a name, after the user's id if there is a user; or the failure.
failure path_of(const std::string &name, const char *user = nullptr) {
    qz::path_buffer path;
    std::uint32_t uid = 0;
    const failure error = outcome_of(sec__get_aclfname(name.c_str(), user, path, &uid));
    const std::string id = user == nullptr ? "" : std::to_string(uid) + " ";
    return error == no_error ? failure{SEC_S_OK, 0, id + path.text} : error;
}
failure found(const std::string &path) { return {SEC_S_OK, 0, path}; }

TEST(file_name, is_absolute_or_in_the_working_directory) {
    const temporary_folder folder;
    const std::string x4094(4094, 'x');
    const std::string x4095(4095, 'x');
    const failure too_long = error_of(SEC_S_BAD_FILENAME, msg::bad_acl_file_name, "//" + x4095, ENAMETOOLONG);
    // The separator counts although none is added.
    const failure too_long_together =
        error_of(SEC_S_BAD_FILENAME, msg::working_directory_too_long, "/", x4095);
    const std::tuple<std::string, std::string, failure> rows[] = {
        {folder.path, "/etc//./acl", found("/etc//./acl")},
        {folder.path, "./sub/.//acl", found(folder / "./sub/.//acl")},
        {"/", "/" + x4095, found("/" + x4095)},
        {"/", "//" + x4095, too_long},
        {"/", x4094, found("/" + x4094)},
        {"/", x4095, too_long_together},
    };
    for (const auto &[directory, name, path] : rows) {
        fs::current_path(directory);
        EXPECT_EQ(path_of(name), path);
    }
}

TEST(file_name, lies_in_the_home_directory_of_a_user) {
    const std::string h4090 = "/" + std::string(4089, 'h');
    const std::string h9000(9000, 'h');
    const failure unknown = error_of(SEC_S_UNKNOWN_USER, msg::unknown_user, "alice");
    const auto unusable = [](const char *name) {
        return error_of(SEC_S_BAD_PARAMETER, msg::path_with_user_name, name, "alice");
    };
    // The name; the answer of the user database; the home directory; the path or the failure.
    const std::tuple<const char *, std::pair<int, const char *>, std::string, failure> rows[] = {
        {"..", {0, "alice"}, "/h/", found("4242 /h/..")},
        {"12345", {0, "alice"}, h4090, found("4242 " + h4090 + "/12345")},
        {"123456", {0, "alice"}, h4090, unusable("123456")},
        {"", {0, "alice"}, h9000, unusable("")},
        {"sub/acl", {EIO, nullptr}, "", unusable("sub/acl")},
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
