// Tests of the trace facility. A process reads its configuration once, so whatever needs one runs in a child.
// What the checker records, and that it bears any file, is tested with the command.
#include "libqz_tr/levels.h"
#include "libqz_tr/text.h"
#include "qz/tr.h"

#include <cctype>
#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <fcntl.h>
#include <filesystem>
#include <fstream>
#include <functional>
#include <gmock/gmock.h>
#include <string>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <thread>
#include <unistd.h>
#include <vector>

namespace {

using namespace std::string_literals;
using levels = std::vector<uint8_t>;

TEST(Levels, AreReadPartByPart) {
    const std::pair<int, std::vector<const char *>> rows[] = {
        // the level of _SEL's category API
        {8, {"_SEL:API=8,Perf=2", "_SEL:API=008", "_SEL:Perf=2;_SEL:API=8", "_SEL:API=1,API=8"}},
        {8, {"A:API=1;_SEL:API=8;B:API=3", ";;_SEL:,,API=8,;", "junk;_SEL:junk,=3,Perf=x,API=8"}},
        {7, {"_SEL:API=7,API=256,API=,API,API=-1,API=+1,API=1x,API= 1,API=1=1,API=4294967304"}},
        {0, {"", "API=8", "_SEL", "_SEL:API", "_sel:API=8", "_SEL:api=8", "_SEL: API=8", " _SEL:API=8"}},
        {0, {"_SELX:API=8;_SE:API=8", "_SEL:APIX=8,AP=8", "_SEL,API=8", "_SEL;API=8"}},
    };
    for (const auto &[level, texts] : rows)
        for (const char *text : texts)
            EXPECT_EQ(qz::tr::configured_level(text, "_SEL", "API"), level) << text;
}

TEST(Text, IsPrintableUtf8) {
    for (const char *text :
         {"", "a b~", "\xC2\xA0", "\xED\x9F\xBF\xEE\x80\x80", "\xE0\xA0\x80\xF0\x90\x80\x80\xF4\x8F\xBF\xBF"})
        EXPECT_TRUE(qz::tr::is_printable(text)) << text;
    // Controls; followers that are alone or missing; what is too long, a surrogate, or too high.
    for (const char *text : {"a\x1F", "\n", "\x7F", "\xC2\x80", "\xC2\x9F", "\x80", "\xC3", "\xE2\x82",
                             "\xC3\x28", "\xC1\xBF", "\xE0\x9F\xBF", "\xF0\x8F\xBF\xBF", "\xED\xA0\x80",
                             "\xED\xBF\xBF", "\xF4\x90\x80\x80", "\xF8\x88\x80\x80\x80", "\xFF\xBF\xBF\xBF"})
        EXPECT_FALSE(qz::tr::is_printable(text)) << testing::PrintToString(text);
}

class Trace : public testing::Test {
protected:
    ~Trace() override { std::filesystem::remove_all(folder); }

    // Runs the body in a child that has the environment; whether its expectations held is the child's status.
    void in_child(const std::function<void()> &body) const {
        std::fflush(nullptr);
        const pid_t child = fork();
        if (child == 0) {
            setenv("QZ_TRACE_LEVELS", "C:On=8,Max=255", 1);
            setenv("QZ_TRACE_FILE", file.c_str(), 1);
            body();
            std::fflush(nullptr);
            _exit(HasFailure() ? 1 : 0);
        }
        int status = -1;
        EXPECT_EQ(waitpid(child, &status, 0), child);
        EXPECT_EQ(status, 0);
    }

    int enlist(const char *component = "C") {
        static const tr_category_t table[] = {{0, "On", 0}, {1, "Off", 0}, {2, nullptr, 0}, {3, "Max", 0}};
        return tr_register_component_1(component, level.data(), table, 4);
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

    const std::string folder = mkdtemp((testing::TempDir() + "tr_test." + std::string(6, 'X')).data());
    std::string file = folder + "/trace";
    levels level = {9, 9, 9, 9};
};

TEST_F(Trace, LinesAreExact) {
    in_child([&] {
        close(STDIN_FILENO);
        EXPECT_EQ(tr_unregister_component_1("C"), TR_NOT_REGISTERED);
        EXPECT_EQ(enlist("q\"\\"), TR_OK);
        EXPECT_EQ(level, (levels{0, 0, 0, 0}));
        EXPECT_NE(access(file.c_str(), F_OK), 0); // nothing is traced yet
        EXPECT_EQ(tr_record_id_1("C", 1), TR_NOT_REGISTERED);
        EXPECT_EQ(tr_record_id_1("q\"\\", 2147483647), TR_OK);
        EXPECT_EQ(enlist(), TR_OK);
        EXPECT_EQ(level, (levels{8, 0, 0, 255}));
        EXPECT_EQ(
            tr_record_data_1("C", -3, 3, "/etc/\"\\", size_t{8}, "\4\3\2\1", size_t{4}, nullptr, size_t{7}),
            TR_OK);
        EXPECT_EQ(
            tr_record_data_1("C", 0, 4, "", size_t{1}, "", size_t{0}, "a\0b", size_t{4}, "a\n", size_t{3}),
            TR_OK);
        EXPECT_EQ(tr_unregister_component_1("C"), TR_OK);
        EXPECT_EQ(level, (levels{0, 0, 0, 0}));
        EXPECT_EQ(tr_record_data_1("C", 1, 1, "", size_t{1}), TR_NOT_REGISTERED);
        EXPECT_EQ(enlist(), TR_OK);
        EXPECT_EQ(level, (levels{8, 0, 0, 255}));
        EXPECT_EQ(fcntl(STDIN_FILENO, F_GETFD), -1); // where others print is not where the file is
    });
    EXPECT_EQ(
        lines(),
        (std::vector<std::string>{
            R"({"component":"q\"\\","id":2147483647,"items":[]})",
            R"({"component":"C","id":-3,"items":[{"len":8,"hex":"2f6574632f225c00","text":"/etc/\"\\"},)"
            R"({"len":4,"hex":"04030201"},{"len":0,"hex":""}]})",
            R"({"component":"C","id":0,"items":[{"len":1,"hex":"00","text":""},{"len":0,"hex":""},)"
            R"({"len":4,"hex":"61006200"},{"len":3,"hex":"610a00"}]})",
        }));
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
            std::string line;
            for (const auto &[pid, tid] : {std::pair(child, child), std::pair(getpid(), gettid())}) {
                std::getline(in, line);
                EXPECT_THAT(line, testing::HasSubstr("\"pid\":" + std::to_string(pid) +
                                                     ",\"tid\":" + std::to_string(tid) + ","));
            }
            tm parts{};
            ASSERT_NE(strptime(line.c_str(), "{\"time\":\"%Y-%m-%dT%H:%M:%S.", &parts), nullptr);
            EXPECT_TRUE(before <= timegm(&parts) && timegm(&parts) <= time(nullptr)) << line;
        }).join();
    });
}

TEST_F(Trace, LinesAroundTheStackBufferAndFarBeyondAreWhole) {
    const std::string bytes((1 << 20) - 1, 'x');
    in_child([&] {
        enlist();
        for (size_t length = 1960; length < 2060; ++length)
            EXPECT_EQ(tr_record_data_1("C", 1, 1, bytes.data(), length), TR_OK);
        EXPECT_EQ(tr_record_data_1("C", 2, 1, bytes.data(), bytes.size() + 1), TR_OK);
        EXPECT_EQ(tr_record_data_1("C", 3, 1, bytes.data(), SIZE_MAX), TR_TOO_LARGE);
        EXPECT_EQ(tr_record_data_1("C", 3, 1, bytes.data(), size_t{TR_LINE_LIMIT} / 2), TR_TOO_LARGE);
    });
    const auto all = lines();
    ASSERT_EQ(all.size(), 101U);
    for (size_t i = 0; i < 100; ++i)
        EXPECT_EQ(all[i].size(),
                  R"({"component":"C","id":1,"items":[{"len":1960,"hex":""}]})"s.size() + 2 * (1960 + i));
    EXPECT_TRUE(all[100].ends_with("7800\",\"text\":\"" + bytes + "\"}]}"));
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
    ASSERT_EQ(symlink("target", (folder + "/link").c_str()) | mkfifo((folder + "/fifo").c_str(), 0600) |
                  mkfifo((folder + "/read").c_str(), 0600),
              0);
    const int reader = open((folder + "/read").c_str(), O_RDWR | O_CLOEXEC);
    for (const std::string &name :
         {folder + "/link", folder + "/fifo", folder + "/read", folder, "/dev/null"s, ""s}) {
        SCOPED_TRACE(file = name);
        in_child([&] {
            errno = 4711;
            EXPECT_EQ(enlist(), TR_OK);
            EXPECT_EQ(level, (levels{0, 0, 0, 0}));
            EXPECT_EQ(tr_record_id_1("C", 1), TR_NO_FILE);
            uint32_t size = 1;
            char text[TR_FILENAME_SIZE];
            EXPECT_EQ(tr_get_size_1(&size), TR_NO_FILE);
            EXPECT_EQ(size, 0U);
            EXPECT_EQ(tr_get_filename_1(text), TR_NO_FILE);
            EXPECT_EQ(errno, 4711);
        });
    }
    close(reader);
    EXPECT_FALSE(std::filesystem::exists(folder + "/target"));
}

TEST_F(Trace, FailedWritesLeaveTheProgramAlone) {
    in_child([&] {
        enlist();
        const rlimit limit{150, 150};
        ASSERT_EQ(setrlimit(RLIMIT_FSIZE, &limit), 0);
        errno = 4711;
        EXPECT_EQ(tr_record_id_1("C", 1), TR_OK);
        EXPECT_EQ(tr_record_id_1("C", 2), TR_FILE_ERROR);
        EXPECT_EQ(errno, 4711);
        closefrom(3); // as a daemon does, whose next file then takes the number
        ASSERT_EQ(open((folder + "/other").c_str(), O_WRONLY | O_CREAT, 0600), 3);
        EXPECT_EQ(tr_record_id_1("C", 3), TR_NO_FILE);
    });
    EXPECT_EQ(lines().size(), 1U);
    EXPECT_EQ(std::filesystem::file_size(folder + "/other"), 0U);
}

TEST_F(Trace, QueriesTellSizeAndName) {
    const std::string longest = folder + "/" + std::string(TR_FILENAME_SIZE - folder.size() - 3, '/') + "t";
    for (const std::string &name :
         {longest, longest.substr(0, folder.size()) + "/" + longest.substr(folder.size())}) {
        file = name;
        in_child([&] {
            uint32_t size = 1;
            char text[TR_FILENAME_SIZE] = "as it was";
            EXPECT_EQ(tr_get_filename_1(text), name == longest ? TR_OK : TR_TOO_LARGE);
            EXPECT_EQ(text, name == longest ? name : "as it was");
            for (const off_t bytes : {off_t{0}, off_t{100}, off_t{1} << 33}) {
                ASSERT_EQ(truncate(name.c_str(), bytes), 0);
                EXPECT_EQ(tr_get_size_1(&size), TR_OK);
                EXPECT_EQ(size, std::min(bytes, off_t{UINT32_MAX}));
            }
        });
    }
}

TEST_F(Trace, BadParametersAreRefused) {
    const tr_category_t table[] = {{0, "On", 0}};
    const auto bad = [](auto... c) { EXPECT_THAT((std::vector{c...}), testing::Each(TR_BAD_PARAMETER)); };
    bad(enlist(nullptr), enlist(""), enlist("a\n"), enlist("\xFF"), enlist(std::string(64, 'n').c_str()),
        tr_register_component_1("C", nullptr, table, 1),
        tr_register_component_1("C", level.data(), nullptr, 1),
        tr_register_component_1("C", level.data(), table, -1), tr_unregister_component_1(nullptr),
        tr_record_id_1(nullptr, 1), tr_record_data_1("C", 1, -1), tr_get_size_1(nullptr),
        tr_get_filename_1(nullptr));
    EXPECT_EQ(level, (levels{9, 9, 9, 9}));
    in_child([&] {
        for (int i = 0; i < TR_COMPONENT_LIMIT; ++i)
            EXPECT_EQ(tr_register_component_1(std::to_string(i).c_str(), nullptr, nullptr, 0), TR_OK);
        EXPECT_EQ(enlist(), TR_NO_MEMORY);
        EXPECT_EQ(level, (levels{0, 0, 0, 0}));
    });
}

} // namespace
