// The trace facility. A process reads its configuration once, so tests that need one run in a child.
#include "qz/tr.h"

#include <fcntl.h>
#include <filesystem>
#include <fstream>
#include <functional>
#include <gmock/gmock.h>
#include <regex>
#include <sys/resource.h>
#include <sys/wait.h>
#include <thread>
#include <unistd.h>

namespace {

using namespace std::string_literals;
namespace fs = std::filesystem;
using levels = std::vector<uint8_t>;
const levels off = {0, 0, 0, 0};
const levels on = {8, 0, 0, 255};

struct Trace : testing::Test {
    ~Trace() override { fs::remove_all(folder); }
    void in_child(const auto &body) const {
        setenv("QZ_TRACE_LEVELS", "C:On=8,Max=255", 1);
        setenv("QZ_TRACE_FILE", file.c_str(), 1);
        const pid_t child = fork();
        if (child == 0) {
            body();
            std::exit(HasFailure());
        }
        int status = -1;
        EXPECT_EQ(waitpid(child, &status, 0), child);
        EXPECT_EQ(status, 0);
    }
    const levels &enlist(const char *component = "C", int code = TR_OK) {
        EXPECT_EQ(tr_register_component_1(component, level.data(), table, 4), code);
        return level;
    }
    // The lines of the file, without well-formed parts that differ from run to run.
    std::vector<std::string> lines() const {
        const std::regex head(R"(^."time":"\d{4}(-\d\d){2}T\d\d(:\d\d){2}\.\d{9}Z","pid":\d+,"tid":\d+,)");
        std::ifstream in(file);
        std::vector<std::string> all;
        for (std::string line; std::getline(in, line);)
            all.push_back(std::regex_replace(line, head, "{"));
        return all;
    }
    const tr_category_t table[4] = {{0, "On", 0}, {1, "Off", 0}, {2, nullptr, 0}, {3, "Max", 0}};
    const std::string folder = mkdtemp((testing::TempDir() + "tr_test.XXXXXX").data());
    std::string file = folder + "/trace";
    levels level = {9, 9, 9, 9};
};

TEST_F(Trace, LinesAreExact) {
    in_child([&] {
        close(STDIN_FILENO);
        EXPECT_EQ(enlist("q\"\\"), off);
        EXPECT_FALSE(fs::exists(file)); // since nothing is traced
        EXPECT_EQ(tr_unregister_component_1("C"), TR_NOT_REGISTERED);
        EXPECT_EQ(tr_record_id_1("q\"\\", 2147483647), TR_OK);
        EXPECT_EQ(enlist(), on);
        EXPECT_EQ(fcntl(STDIN_FILENO, F_GETFD), -1); // nobody reads or prints where the file is
        EXPECT_EQ(tr_record_data_1("C", -3, 4, "e\"\\", 4UL, nullptr, 7UL, "a\0b", 4UL, "", 1UL), TR_OK);
        EXPECT_EQ(tr_unregister_component_1("C"), TR_OK);
        EXPECT_EQ(level, off);
        EXPECT_EQ(tr_record_id_1("C", 1), TR_NOT_REGISTERED);
    });
    EXPECT_EQ(fs::status(file).permissions(), fs::perms{0600});
    const std::string first = R"({"component":"q\"\\","id":2147483647,"items":[]})";
    const std::string second =
        R"({"component":"C","id":-3,"items":[{"len":4,"hex":"65225c00","text":"e\"\\"},)"
        R"({"len":0,"hex":""},{"len":4,"hex":"61006200"},{"len":1,"hex":"00","text":""}]})";
    EXPECT_THAT(lines(), testing::ElementsAre(first, second));
}

TEST_F(Trace, LinesComeFromAThreadThatIsCancelled) {
    in_child([&] {
        std::thread([&] {
            pthread_cancel(pthread_self());
            EXPECT_EQ(enlist(), on);
            EXPECT_EQ(tr_record_id_1("C", 1), TR_OK);
        }).join();
    });
    EXPECT_EQ(lines().size(), 1u);
}

TEST_F(Trace, LinesComeUntilTheFileIsLost) {
    in_child([&] {
        enlist();
        EXPECT_EQ(tr_record_id_1("C", 1), TR_OK);
        rlimit limit{fs::file_size(file) + 9, RLIM_INFINITY};
        EXPECT_EQ(setrlimit(RLIMIT_FSIZE, &limit), 0);
        EXPECT_EQ(tr_record_id_1("C", 2), TR_FILE_ERROR);
        limit.rlim_cur = RLIM_INFINITY;
        EXPECT_EQ(setrlimit(RLIMIT_FSIZE, &limit), 0);
        EXPECT_EQ(tr_record_id_1("C", 3), TR_OK);
        closefrom(3); // as a daemon does; its next file gets the number
        const std::string next = file + "2";
        EXPECT_EQ(open(next.c_str(), O_WRONLY | O_CREAT, 0600), 3);
        EXPECT_EQ(tr_record_id_1("C", 4), TR_NO_FILE);
        EXPECT_EQ(fs::file_size(next), 0u);
    });
    EXPECT_EQ(lines().at(1), R"({"component":"C","id":3,"items":[]})");
}

TEST_F(Trace, LinesTellTheirTimeAndThread) {
    const auto record = [&] {
        tm parts{};
        const time_t before = time(nullptr);
        EXPECT_EQ(tr_record_id_1("C", 9), TR_OK);
        std::ifstream in(file);
        std::string line;
        std::getline(in, line);
        std::getline(in, line);
        const std::string ids = std::to_string(getpid()) + ",\"tid\":" + std::to_string(gettid());
        EXPECT_THAT(line, testing::HasSubstr(",\"pid\":" + ids + ","));
        strptime(line.c_str(), "{\"time\":\"%Y-%m-%dT%H:%M:%S.", &parts);
        EXPECT_LE(before, timegm(&parts));
        EXPECT_LE(timegm(&parts), time(nullptr) + 1); // the clock of time() is coarse
    };
    in_child([&] {
        enlist();
        tr_record_id_1("C", 1); // must not fix the ids for children of this process
        in_child([&] { std::thread(record).join(); });
    });
}

// From threads at once, around the size that needs no allocation and far beyond, while components fill the table.
TEST_F(Trace, LinesAreWhole) {
    const std::string ids[] = {"1", "10", "100"}; // so that lines of every length come
    std::vector<std::string> texts;
    std::vector<std::string> wanted;
    for (size_t size = 1250; size < 1000000; size = size < 1350 ? size + 1 : size * 100) {
        const std::string &text = texts.emplace_back(size, '3');
        const std::string hex(2 * size, '3');
        const std::string item =
            R"({"len":)" + std::to_string(size + 1) + R"(,"hex":")" + hex + R"(00","text":")" + text + "\"}";
        for (const std::string &id : ids)
            wanted.push_back(R"({"component":"C","id":)" + id + R"(,"items":[)" + item + "]}");
    }
    in_child([&] {
        enlist();
        std::vector<std::jthread> threads;
        for (const std::string &id : ids)
            threads.emplace_back([&] {
                for (const std::string &text : texts)
                    EXPECT_EQ(tr_record_data_1("C", std::stoi(id), 1, text.c_str(), text.size() + 1), TR_OK);
            });
        for (int i = 1; i < TR_COMPONENT_LIMIT; ++i)
            enlist(std::to_string(i).c_str());
        EXPECT_EQ(enlist("one too many", TR_NO_MEMORY), off);
        for (const size_t size : {SIZE_MAX / 2 + 1, size_t{TR_LINE_LIMIT} / 2})
            EXPECT_EQ(tr_record_data_1("C", 3, 1, "", size), TR_TOO_LARGE);
    });
    EXPECT_THAT(lines(), testing::UnorderedElementsAreArray(wanted));
}

TEST_F(Trace, OnlyRegularFilesAreWrittenTo) {
    const std::string link = folder + "/link";
    const std::string fifo = folder + "/fifo";
    const std::string too_long = folder + std::string(TR_FILENAME_SIZE, '/') + "t";
    ASSERT_EQ(symlink("target", link.c_str()), 0);
    ASSERT_EQ(mkfifo(fifo.c_str(), 0600), 0);
    const int reader = open(fifo.c_str(), O_RDWR); // without a reader it could not be opened
    for (const std::string &name : {link, fifo, folder, "/dev/null"s, ""s}) {
        SCOPED_TRACE(file = name);
        in_child([&] {
            char text[TR_FILENAME_SIZE] = "as it was";
            uint32_t size = 1;
            errno = 4711;
            EXPECT_EQ(enlist(), off);
            EXPECT_EQ(tr_record_id_1("C", 1), TR_NO_FILE);
            EXPECT_EQ(tr_get_filename_1(text), TR_NO_FILE);
            EXPECT_STREQ(text, "as it was");
            EXPECT_EQ(tr_get_size_1(&size), TR_NO_FILE);
            EXPECT_EQ(size, 0u);
            EXPECT_EQ(errno, 4711);
        });
    }
    close(reader);
}

TEST_F(Trace, TheFileTellsItsNameAndSize) {
    const std::string longest = folder + std::string(TR_FILENAME_SIZE - 2 - folder.size(), '/') + "t";
    for (const std::string &name : {longest, longest + "t"}) {
        file = name;
        in_child([&] {
            char text[TR_FILENAME_SIZE] = "as it was";
            uint32_t size = 1;
            EXPECT_EQ(enlist(), on);
            EXPECT_EQ(tr_get_filename_1(text), name == longest ? TR_OK : TR_TOO_LARGE);
            EXPECT_EQ(text, name == longest ? name : "as it was");
            fs::resize_file(file, 100);
            EXPECT_EQ(tr_get_size_1(&size), TR_OK);
            EXPECT_EQ(size, 100u);
            fs::resize_file(file, uintmax_t{1} << 33);
            EXPECT_EQ(tr_get_size_1(&size), TR_OK);
            EXPECT_EQ(size, UINT32_MAX);
        });
    }
}

TEST_F(Trace, FilesOfOthersAreNotWrittenTo) {
    const std::tuple<const char *, bool, std::function<int()>> rows[] = {
        {"readable", true, [&] { return chmod(file.c_str(), 0644); }},
        {"writable by its group, or by a user in a POSIX ACL", false,
         [&] { return chmod(file.c_str(), 0620); }},
        {"writable by others", false, [&] { return chmod(file.c_str(), 0602); }},
        {"with a second name", false, [&] { return link(file.c_str(), (file + "2").c_str()); }},
        {"of somebody else", false, [&] { return chown(file.c_str(), 1, 1); }},
    };
    for (const auto &[how, is_used, change] : rows) {
        SCOPED_TRACE(how);
        fs::remove(file);
        std::ofstream(file) << "before\n";
        fs::permissions(file, fs::perms{0600});
        if (change() != 0)
            continue; // only root can change the owner
        in_child([&, is_used = is_used] {
            EXPECT_EQ(enlist(), is_used ? on : off);
            EXPECT_EQ(tr_record_id_1("C", 1), is_used ? TR_OK : TR_NO_FILE);
        });
        EXPECT_EQ(lines().size(), is_used ? 2u : 1u);
    }
}

TEST_F(Trace, BadParametersAreRefused) {
    for (const std::string &name : {""s, "a\n"s, "\xFF"s, std::string(64, 'n')})
        EXPECT_EQ(enlist(name.c_str(), TR_BAD_PARAMETER), levels(4, 9));
    uint8_t *const own = level.data();
    EXPECT_EQ(tr_register_component_1(nullptr, own, table, 1), TR_BAD_PARAMETER);
    EXPECT_EQ(tr_register_component_1("C", nullptr, table, 1), TR_BAD_PARAMETER);
    EXPECT_EQ(tr_register_component_1("C", own, nullptr, 1), TR_BAD_PARAMETER);
    EXPECT_EQ(tr_register_component_1("C", own, table, -1), TR_BAD_PARAMETER);
    EXPECT_EQ(tr_unregister_component_1(nullptr), TR_BAD_PARAMETER);
    EXPECT_EQ(tr_record_id_1(nullptr, 1), TR_BAD_PARAMETER);
    EXPECT_EQ(tr_record_data_1("C", 1, -1), TR_BAD_PARAMETER);
    EXPECT_EQ(tr_get_size_1(nullptr), TR_BAD_PARAMETER);
    EXPECT_EQ(tr_get_filename_1(nullptr), TR_BAD_PARAMETER);
}

} // namespace
