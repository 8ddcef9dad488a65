// Tests of the trace facility. A process reads its configuration once, so whatever needs one runs in a child.
#include "libqz_tr/levels.h"
#include "qz/tr.h"

#include <cctype>
#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <filesystem>
#include <fstream>
#include <functional>
#include <gtest/gtest.h>
#include <string>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <thread>
#include <unistd.h>
#include <vector>

namespace {

using namespace std::string_literals;

TEST(Levels, AreReadPartByPart) {
    const struct {
        unsigned level; // of _SEL's category API
        std::vector<const char *> texts;
    } cases[] = {
        {8,
         {"_SEL:API=8", "_SEL:API=8,Perf=2", "_SEL:API=008", "_SEL:Perf=2;_SEL:API=8", "_SEL:API=1,API=8"}},
        {8, {"A:API=1;_SEL:API=8;B:API=3", ";;_SEL:,,API=8,;", "junk;_SEL:junk,=3,Perf=x,API=8"}},
        {7, {"_SEL:API=7,API=256,API=,API,API=-1,API=+1,API=1x,API= 1,API=1=1,API=4294967304"}},
        {255, {"_SEL:Perf=2,API=255"}},
        {0, {"", "API=8", "_SEL", "_SEL:API", "_sel:API=8", "_SEL:api=8", "_SEL: API=8", " _SEL:API=8"}},
        {0, {"_SELX:API=8;_SE:API=8", "_SEL:APIX=8,AP=8", "_SEL,API=8", "_SEL;API=8"}},
    };
    for (const auto &c : cases)
        for (const char *text : c.texts)
            EXPECT_EQ(qz::tr::configured_level(text, "_SEL", "API"), c.level) << text;
}

class Trace : public testing::Test {
protected:
    void SetUp() override {
        ASSERT_NE(mkdtemp(folder.data()), nullptr);
        file = folder + "/trace";
    }
    void TearDown() override { std::filesystem::remove_all(folder); }

    // Runs the body in a child that has the environment; the body's failed expectations are the child's
    // status.
    void in_child(const std::function<void()> &body) {
        std::fflush(nullptr);
        const pid_t child = fork();
        if (child == 0) {
            setenv("QZ_TRACE_LEVELS", "C:On=8,Max=255", 1);
            setenv("QZ_TRACE_FILE", file.c_str(), 1);
            body();
            std::fflush(nullptr);
            _exit(HasFailure() ? 1 : 0);
        }
        int status = 0;
        ASSERT_EQ(waitpid(child, &status, 0), child);
        EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0) << status;
    }

    int enlist(const char *component = "C") {
        static const tr_category_t table[] = {{0, "On", 0}, {1, "Off", 0}, {2, nullptr, 0}, {3, "Max", 0}};
        return tr_register_component_1(component, levels, table, 4);
    }
    std::string level_text() const {
        std::string text;
        for (const uint8_t level : levels)
            text += std::to_string(level) + " ";
        return text;
    }
    // The lines of the file, without what differs from run to run where that has its form.
    std::vector<std::string> lines() const {
        std::ifstream in(file);
        std::vector<std::string> all;
        for (std::string line; std::getline(in, line); all.push_back(line)) {
            std::string head = line.substr(0, line.find("\"component\""));
            for (char &character : head)
                character = std::isdigit(static_cast<unsigned char>(character)) ? '9' : character;
            if (head.starts_with(R"({"time":"9999-99-99T99:99:99.999999999Z","pid":9)"))
                line.erase(1, head.size() - 1);
        }
        return all;
    }

    std::string folder = testing::TempDir() + "tr_test." + std::string(6, 'X');
    std::string file;
    uint8_t levels[4] = {9, 9, 9, 9};
};

TEST_F(Trace, LinesAreExact) {
    umask(022);
    in_child([&] {
        EXPECT_EQ(enlist(), TR_OK);
        EXPECT_EQ(level_text(), "8 0 0 255 ");
        EXPECT_EQ(tr_record_id_1("C", 9), TR_OK);
        const uint32_t number = 0x01020304;
        EXPECT_EQ(tr_record_data_1("C", -3, 3, "/etc/a.acl", size_t{11}, &number, sizeof number,
                                   static_cast<const void *>(nullptr), size_t{7}),
                  TR_OK);
        EXPECT_EQ(enlist("q\"\\"), TR_OK);
        EXPECT_EQ(level_text(), "0 0 0 0 ");
        EXPECT_EQ(tr_record_id_1("q\"\\", 2147483647), TR_OK);
    });
    EXPECT_EQ(lines(), (std::vector<std::string>{
                           R"({"component":"C","id":9,"items":[]})",
                           R"({"component":"C","id":-3,"items":[{"len":11,"hex":"2f6574632f612e61636c00",)"
                           R"("text":"/etc/a.acl"},{"len":4,"hex":"04030201"},{"len":0,"hex":""}]})",
                           R"({"component":"q\"\\","id":2147483647,"items":[]})",
                       }));
    struct stat status;
    ASSERT_EQ(stat(file.c_str(), &status), 0);
    EXPECT_EQ(status.st_mode, S_IFREG | 0600U);
}

TEST_F(Trace, TimeAndIdsAreTheMakers) {
    in_child([&] {
        enlist();
        const pid_t child = fork();
        if (child == 0)
            _exit(tr_record_id_1("C", 0));
        waitpid(child, nullptr, 0);
        std::thread([&] {
            const time_t before = time(nullptr);
            tr_record_id_1("C", 1);
            std::ifstream in(file);
            const std::pair<pid_t, pid_t> makers[] = {{child, child}, {getpid(), gettid()}};
            std::string line;
            for (const auto &[pid, tid] : makers) {
                std::getline(in, line);
                const auto ids = "\"pid\":" + std::to_string(pid) + ",\"tid\":" + std::to_string(tid) + ",";
                EXPECT_NE(line.find(ids), line.npos) << line;
            }
            tm parts{};
            ASSERT_NE(strptime(line.c_str(), "{\"time\":\"%Y-%m-%dT%H:%M:%S.", &parts), nullptr);
            EXPECT_TRUE(before <= timegm(&parts) && timegm(&parts) <= time(nullptr)) << line;
        }).join();
    });
}

TEST_F(Trace, TextOnlyForPrintableStrings) {
    const struct {
        const char *what;
        bool text;
        std::vector<std::string> items;
    } cases[] = {
        {"printable", true, {"\0"s, "a b~\0"s, "\xC2\xA0\0"s, "\xED\x9F\xBF\xEE\x80\x80\0"s}},
        {"printable at the ends", true, {"\xE0\xA0\x80\xF0\x90\x80\x80\xF4\x8F\xBF\xBF\0"s}},
        {"not one string", false, {""s, "abc"s, "a\0b\0"s, "\0\0"s}},
        {"control", false, {"a\x1F\0"s, "\n\0"s, "\x7F\0"s, "\xC2\x80\0"s, "\xC2\x9F\0"s}},
        {"follower alone or missing", false, {"\x80\0"s, "\xC3\0"s, "\xE2\x82\0"s, "\xC3\x28\0"s}},
        {"overlong", false, {"\xC1\xBF\0"s, "\xE0\x9F\xBF\0"s, "\xF0\x8F\xBF\xBF\0"s}},
        {"surrogate", false, {"\xED\xA0\x80\0"s, "\xED\xBF\xBF\0"s}},
        {"too high", false, {"\xF4\x90\x80\x80\0"s, "\xF8\x88\x80\x80\x80\0"s, "\xFF\xBF\xBF\xBF\0"s}},
    };
    in_child([&] {
        enlist();
        for (const auto &c : cases)
            for (const std::string &item : c.items)
                EXPECT_EQ(tr_record_data_1("C", 1, 1, item.data(), item.size()), TR_OK);
    });
    const auto all = lines();
    auto line = all.begin();
    for (const auto &c : cases)
        for (const std::string &item : c.items) {
            ASSERT_NE(line, all.end());
            const size_t at = line->find(",\"text\":");
            EXPECT_EQ(at == line->npos ? "" : line->substr(at),
                      c.text ? ",\"text\":\"" + item.substr(0, item.size() - 1) + "\"}]}" : "")
                << c.what << ": " << *line;
            ++line;
        }
}

TEST_F(Trace, LinesAroundTheStackBufferAndFarBeyondAreWhole) {
    std::string bytes(1 << 20, 'x');
    bytes.back() = '\0';
    in_child([&] {
        enlist();
        for (size_t length = 1960; length < 2060; ++length)
            EXPECT_EQ(tr_record_data_1("C", 1, 1, bytes.data(), length), TR_OK);
        EXPECT_EQ(tr_record_data_1("C", 2, 1, bytes.data(), bytes.size()), TR_OK);
        EXPECT_EQ(tr_record_data_1("C", 3, 1, bytes.data(), SIZE_MAX), TR_TOO_LARGE);
        EXPECT_EQ(tr_record_data_1("C", 3, 1, bytes.data(), size_t{TR_LINE_LIMIT} / 2), TR_TOO_LARGE);
    });
    const auto all = lines();
    ASSERT_EQ(all.size(), 101U);
    for (size_t i = 0; i < 100; ++i)
        EXPECT_EQ(all[i].size(),
                  R"({"component":"C","id":1,"items":[{"len":1960,"hex":""}]})"s.size() + 2 * (1960 + i));
    EXPECT_TRUE(all[100].ends_with("7800\",\"text\":\"" + bytes.substr(0, bytes.size() - 1) + "\"}]}"));
}

TEST_F(Trace, ThreadsDoNotMix) {
    in_child([&] {
        enlist();
        std::vector<std::thread> threads;
        for (char letter : {'a', 'b', 'c', 'd'})
            threads.emplace_back([letter] {
                for (size_t i = 0; i < 200; ++i)
                    EXPECT_EQ(tr_record_data_1("C", 1, 1, std::string(i * 30, letter).c_str(), i * 30 + 1),
                              TR_OK);
            });
        for (int i = 0; i < 200; ++i) // others come and go meanwhile, and must not be seen half-made
            EXPECT_EQ(enlist(std::to_string(i % 50).c_str()), TR_OK);
        for (auto &thread : threads)
            thread.join();
    });
    const auto all = lines();
    EXPECT_EQ(all.size(), 800U);
    for (const std::string &line : all) {
        const size_t at = line.find("text\":\"") + 7;
        EXPECT_TRUE(line.starts_with("{\"component\":\"C\",") && line.ends_with("\"}]}")) << line;
        EXPECT_GE(line.find_first_not_of(line[at], at), line.size() - 4) << line;
    }
}

// Whatever stands in the file's place: the levels are 0, the queries say so, nothing waits, errno is kept.
TEST_F(Trace, RefusesWhatIsNoRegularFile) {
    const std::string target = folder + "/target";
    const struct {
        const char *what;
        std::function<int()> make;
    } cases[] = {
        {"symbolic link", [&] { return symlink(target.c_str(), file.c_str()); }},
        {"FIFO without reader", [&] { return mkfifo(file.c_str(), 0600); }},
        {"FIFO with reader", [&] { return mkfifo(file.c_str(), 0600) + (open(file.c_str(), O_RDWR) < 0); }},
        {"folder", [&] { return mkdir(file.c_str(), 0700); }},
        {"device", [&] { return file = "/dev/null", 0; }},
        {"missing folder", [&] { return file = folder + "/none/trace", 0; }},
        {"unset", [&] { return file = "", 0; }},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.what);
        ASSERT_EQ(c.make(), 0);
        in_child([&] {
            errno = 4711;
            EXPECT_EQ(enlist(), TR_OK);
            EXPECT_EQ(level_text(), "0 0 0 0 ");
            EXPECT_EQ(tr_record_id_1("C", 1), TR_NO_FILE);
            uint32_t size = 1;
            char name[TR_FILENAME_SIZE];
            EXPECT_EQ(tr_get_size_1(&size), TR_NO_FILE);
            EXPECT_EQ(size, 0U);
            EXPECT_EQ(tr_get_filename_1(name), TR_NO_FILE);
            EXPECT_EQ(errno, 4711);
        });
        std::remove((folder + "/trace").c_str());
        EXPECT_NE(access(target.c_str(), F_OK), 0);
    }
}

TEST_F(Trace, OpensTheFileWhenNeededAndOffTheStandardStreams) {
    in_child([&] {
        close(STDIN_FILENO);
        enlist("Other");
        EXPECT_NE(access(file.c_str(), F_OK), 0);
        enlist();
        EXPECT_EQ(tr_record_id_1("C", 1), TR_OK);
        EXPECT_EQ(fcntl(STDIN_FILENO, F_GETFD), -1);
    });
    EXPECT_EQ(lines().size(), 1U);
}

TEST_F(Trace, FailedWritesLeaveTheProgramAlone) {
    in_child([&] {
        enlist();
        const rlimit limit{150, 150};
        ASSERT_EQ(setrlimit(RLIMIT_FSIZE, &limit), 0);
        errno = 4711;
        EXPECT_EQ(tr_record_id_1("C", 1), TR_OK);
        EXPECT_EQ(tr_record_id_1("C", 2), TR_FILE_ERROR);
        sigset_t pending;
        sigpending(&pending);
        EXPECT_EQ(sigismember(&pending, SIGXFSZ), 0);
        EXPECT_EQ(errno, 4711);
        closefrom(3); // as a daemon does, whose next file then takes the number
        const std::string other = folder + "/other";
        ASSERT_EQ(open(other.c_str(), O_WRONLY | O_CREAT, 0600), 3);
        EXPECT_EQ(tr_record_id_1("C", 3), TR_NO_FILE);
        struct stat status;
        EXPECT_EQ(fstat(3, &status), 0);
        EXPECT_EQ(status.st_size, 0);
    });
    EXPECT_EQ(lines().size(), 1U);
}

TEST_F(Trace, UnregisteringStopsRecords) {
    in_child([&] {
        EXPECT_EQ(tr_unregister_component_1("C"), TR_NOT_REGISTERED);
        EXPECT_EQ(tr_record_id_1("C", 1), TR_NOT_REGISTERED);
        enlist();
        EXPECT_EQ(tr_unregister_component_1("C"), TR_OK);
        EXPECT_EQ(level_text(), "0 0 0 0 ");
        EXPECT_EQ(tr_record_data_1("C", 1, 1, "", size_t{1}), TR_NOT_REGISTERED);
        EXPECT_EQ(enlist(), TR_OK);
        EXPECT_EQ(level_text(), "8 0 0 255 ");
        EXPECT_EQ(tr_record_id_1("C", 2), TR_OK);
    });
    EXPECT_EQ(lines(), std::vector<std::string>{R"({"component":"C","id":2,"items":[]})"});
}

TEST_F(Trace, QueriesTellSizeAndName) {
    std::ofstream(file) << std::string(100, '\n');
    in_child([&] {
        uint32_t size = 0;
        char name[TR_FILENAME_SIZE] = "";
        EXPECT_EQ(tr_get_size_1(&size), TR_OK);
        EXPECT_EQ(size, 100U);
        EXPECT_EQ(tr_get_filename_1(name), TR_OK);
        EXPECT_EQ(name, file);
        ASSERT_EQ(truncate(file.c_str(), off_t{1} << 33), 0);
        EXPECT_EQ(tr_get_size_1(&size), TR_OK);
        EXPECT_EQ(size, UINT32_MAX);
    });
    for (const size_t length : {size_t{256}, size_t{257}}) {
        file = folder + "/" + std::string(length - folder.size() - 2, '/') + "t";
        in_child([&] {
            char name[TR_FILENAME_SIZE] = "as it was";
            EXPECT_EQ(tr_get_filename_1(name), length == 256 ? TR_OK : TR_TOO_LARGE);
            EXPECT_EQ(name, length == 256 ? file : "as it was");
        });
    }
}

TEST_F(Trace, BadParametersAreRefused) {
    const tr_category_t table[] = {{0, "On", 0}};
    for (const char *name : {static_cast<const char *>(nullptr), "", "a\n", "\xFF"})
        EXPECT_EQ(tr_register_component_1(name, levels, table, 1), TR_BAD_PARAMETER);
    const int codes[] = {tr_register_component_1(std::string(64, 'n').c_str(), levels, table, 1),
                         tr_register_component_1("C", nullptr, table, 1),
                         tr_register_component_1("C", levels, nullptr, 1),
                         tr_register_component_1("C", levels, table, -1),
                         tr_unregister_component_1(nullptr),
                         tr_record_id_1(nullptr, 1),
                         tr_record_data_1("C", 1, -1),
                         tr_get_size_1(nullptr),
                         tr_get_filename_1(nullptr)};
    for (const int &code : codes)
        EXPECT_EQ(code, TR_BAD_PARAMETER) << &code - codes;
    EXPECT_EQ(level_text(), "9 9 9 9 ");
    in_child([&] {
        for (int i = 0; i < TR_COMPONENT_LIMIT; ++i)
            EXPECT_EQ(tr_register_component_1(std::to_string(i).c_str(), nullptr, nullptr, 0), TR_OK);
        EXPECT_EQ(enlist(), TR_NO_MEMORY);
        EXPECT_EQ(level_text(), "0 0 0 0 ");
    });
}

} // namespace
