// Measures what a service calls in the shared library: decisions, edits and reads, each next to the plainest code
// that does the same.
//
// usage: service_bench FOLDER [--benchmark_...]
//
// The folder contains files made by generate.py. Sizes and families without a file are skipped.
#include "plain_walks.h"
#include "posix_acls.h"
#include "qz/acl.h"

#include <benchmark/benchmark.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <fcntl.h>
#include <memory>
#include <pthread.h>
#include <string>
#include <strings.h>
#include <sys/stat.h>
#include <unistd.h>
#include <vector>

namespace {

using namespace measured;

constexpr char mechanism[] = "unix";

// ---- Decisions ----

using buffer = std::shared_ptr<compiled>;

void bench_decision(benchmark::State &state, const buffer &held, const std::string &identity, int expected) {
    std::uint32_t mask = 0;
    for (auto _ : state) {
        const int result =
            sec__single_acle_perm(&held->acl, SEC_ACLE_USER, mechanism, nullptr, identity.c_str(), &mask);
        benchmark::DoNotOptimize(result);
        benchmark::DoNotOptimize(mask);
        if (result != expected) {
            state.SkipWithError("unexpected result");
            break;
        }
    }
}

void bench_walk(benchmark::State &state, const buffer &held, std::uint32_t steps) {
    for (auto _ : state) {
        const unsigned char *at = held->first;
        benchmark::DoNotOptimize(at);
        for (std::uint32_t left = steps; left != 0; --left)
            at = behind(at);
        benchmark::DoNotOptimize(at);
    }
}

template <class Compare>
void bench_scan(benchmark::State &state, const buffer &held, const std::string &identity, Compare compare) {
    for (auto _ : state) {
        const char *wanted = identity.c_str();
        benchmark::DoNotOptimize(wanted);
        benchmark::DoNotOptimize(scan(held->first, held->count, wanted, compare));
    }
}

void add_decisions(const std::string &family, std::uint32_t count, const std::string &path) {
    const auto held = std::make_shared<compiled>(path);
    const std::uint32_t middle = count / 2;
    const std::string identity = respelled(held->entry(middle));
    const auto add = [&](const std::string &what, auto function, auto... arguments) {
        const std::string name = what + "/" + family + "/" + std::to_string(count);
        benchmark::RegisterBenchmark(name.c_str(), function, held, arguments...);
    };
    add("decision", bench_decision, identity, SEC_S_OK);
    add("walk", bench_walk, middle);
    add("table_scan", bench_scan<decltype(&compare_by_table)>, identity, &compare_by_table);
    add("strcasecmp_scan", bench_scan<decltype(&strcasecmp)>, identity, &strcasecmp);
    // Identities not in the ACL: after all others, and next to a stored one.
    add("denial_at_end", bench_decision, std::string(10, '~'), SEC_S_BAD_ACLE);
    std::string almost = identity;
    almost.pop_back();
    add("denial_in_middle", bench_decision, almost, SEC_S_BAD_ACLE);
    add("decision_at_end", bench_decision, respelled(held->entry(count - 1)), SEC_S_OK);
}

// 32 groups in no order. Every other one has an entry.
void bench_groups(benchmark::State &state, const buffer &held) {
    constexpr std::uint32_t group_count = 32;
    std::vector<std::string> names;
    names.reserve(group_count);
    for (std::uint32_t index = 0; index < group_count; ++index) {
        const std::uint32_t scattered = index * 7 % group_count;
        names.push_back(respelled(held->entry(held->count / group_count * scattered)) +
                        (index % 2 == 0 ? "" : "x"));
    }
    std::vector<sec_group_ref_t> groups;
    groups.reserve(group_count);
    for (const std::string &name : names)
        groups.push_back({0, name.c_str()});
    std::uint32_t mask = 0;
    for (auto _ : state) {
        if (sec__group_acles_perm(&held->acl, static_cast<std::int32_t>(groups.size()), groups.data(),
                                  &mask) != SEC_S_OK)
            state.SkipWithError("no group found");
        benchmark::DoNotOptimize(mask);
    }
}

// ---- Decisions through a handler, and in several threads on one buffer ----

// The plainest handler: it accepts equal identities.
int is_same(const char *requested, const char *entry) { return std::strcmp(requested, entry); }

// Expanded entries of a mechanism with a handler, which is called for each entry up to the match.
buffer handled_buffer(const std::string &path) {
    require(sec__register_id_handler(SEC_ID_HANDLER_EXPANDED, mechanism, is_same) == SEC_S_OK,
            "cannot register");
    return std::make_shared<compiled>(path);
}

void bench_last_by_handler(benchmark::State &state, const buffer &held) {
    const std::string identity = identity_of(held->entry(held->count - 1));
    std::uint32_t mask = 0;
    for (auto _ : state) {
        const int result =
            sec__single_acle_perm(&held->acl, SEC_ACLE_EXPANDED, mechanism, nullptr, identity.c_str(), &mask);
        benchmark::DoNotOptimize(mask);
        if (result != SEC_S_OK) {
            state.SkipWithError("unexpected result");
            break;
        }
    }
}

// An upper bound for the work that a decision with a handler does under the library's lock.
void bench_lock(benchmark::State &state) {
    static pthread_mutex_t lock = PTHREAD_MUTEX_INITIALIZER;
    for (auto _ : state) {
        pthread_mutex_lock(&lock);
        pthread_mutex_unlock(&lock);
    }
}

void add_threads(const std::string &users, const std::string &expanded) {
    const auto held = std::make_shared<compiled>(users);
    const auto handled = handled_buffer(expanded);
    const std::string identity = respelled(held->entry(held->count / 2));
    benchmark::RegisterBenchmark("handler/10", bench_last_by_handler, handled);
    benchmark::RegisterBenchmark("threads", bench_decision, held, identity, SEC_S_OK)
        ->ThreadRange(1, 2)
        ->UseRealTime();
    benchmark::RegisterBenchmark("handler_threads", bench_last_by_handler, handled)
        ->ThreadRange(1, 2)
        ->UseRealTime();
    benchmark::RegisterBenchmark("lock", bench_lock)->ThreadRange(1, 2)->UseRealTime();
}

// ---- Edits ----

double thread_seconds() {
    timespec now = {};
    clock_gettime(CLOCK_THREAD_CPUTIME_ID, &now);
    return static_cast<double>(now.tv_sec) + static_cast<double>(now.tv_nsec) / 1e9;
}

// Adds an entry in the middle and deletes it again. One of the two is timed.
void bench_edit(benchmark::State &state, const buffer &held, bool times_adding) {
    std::string identity = identity_of(held->entry(held->count / 2));
    identity += "x";
    sec_acle_t acle = {};
    acle.type = SEC_ACLE_USER;
    acle.perm_mask = 1;
    std::memcpy(acle.mechanism, mechanism, sizeof mechanism);
    acle.identity = identity.data();
    for (auto _ : state) {
        const double start = thread_seconds();
        const int added = sec_add_acle_to_acl2(&acle, &held->acl);
        const double between = thread_seconds();
        const int deleted = sec_del_acle_from_acl(&acle, &held->acl);
        const double end = thread_seconds();
        if (added != SEC_S_OK || deleted != SEC_S_OK) {
            state.SkipWithError("an edit failed");
            break;
        }
        state.SetIterationTime(times_adding ? between - start : end - between);
    }
}

void add_edits(const std::string &family, const std::string &path) {
    const auto held = std::make_shared<compiled>(path);
    const auto add = [&](const std::string &what, bool times_adding) {
        const std::string name = what + "/" + family + "/100000";
        benchmark::RegisterBenchmark(name.c_str(), bench_edit, held, times_adding)->UseManualTime();
    };
    add("adding", true);
    add("deleting", false);
}

// ---- Reads ----

void bench_read(benchmark::State &state, const std::string &path, std::uint32_t flags) {
    for (auto _ : state) {
        sec_acl_buffer_t acl = {};
        std::uint32_t out_flags = 0;
        const int result = sec_read_acl_file(path.c_str(), nullptr, nullptr, flags, &acl, &out_flags);
        if (result != SEC_S_OK || out_flags != flags) {
            state.SkipWithError("read in another way than wanted");
            break;
        }
        sec_release_acl(&acl);
    }
}

// Opens a file and reads it into a block of its size.
void bench_plain_read(benchmark::State &state, const std::string &path) {
    for (auto _ : state) {
        const int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC);
        struct stat status = {};
        if (fstat(fd, &status) != 0) {
            state.SkipWithError("no such file");
            break;
        }
        const auto size = static_cast<std::size_t>(status.st_size);
        void *memory = std::malloc(size);
        if (read(fd, memory, size) != status.st_size)
            state.SkipWithError("a short read");
        benchmark::DoNotOptimize(memory);
        std::free(memory);
        close(fd);
    }
}

void add_reads(std::uint32_t count, const std::string &path) {
    // The cache is used only if it is newer in whole seconds.
    const timespec long_ago[2] = {{1, 0}, {1, 0}};
    require(utimensat(AT_FDCWD, path.c_str(), long_ago, 0) == 0, "cannot set the time of " + path);
    sec_acl_buffer_t acl = {};
    sec_read_acl_file(path.c_str(), nullptr, nullptr, SEC_READ_ACL_CACHE, &acl, nullptr);
    sec_release_acl(&acl);

    const auto add = [&](const std::string &what, auto function, const std::string &file, auto... arguments) {
        const std::string name = what + "/" + std::to_string(count);
        benchmark::RegisterBenchmark(name.c_str(), function, file, arguments...);
    };
    add("cached_read", bench_read, path, std::uint32_t{SEC_READ_ACL_CONVERT});
    add("text_read", bench_read, path, std::uint32_t{SEC_READ_ACL_TEXT});
    add("plain_read", bench_plain_read, path + ".cacl");
}

// ---- Registration ----

void add_all(const std::string &folder) {
    const auto file = [&](const std::string &family, const char *type, std::uint32_t count) {
        return folder + "/" + family + "-random-" + type + "-" + std::to_string(count) + ".acl";
    };
    const auto is_there = [](const std::string &path) { return access(path.c_str(), R_OK) == 0; };
    for (const char *family : {"rand", "prefixed"}) {
        for (const std::uint32_t count : {10u, 100u, 1000u, 10000u, 100000u}) {
            const std::string path = file(family, "u", count);
            if (is_there(path))
                add_decisions(family, count, path);
        }
    }
    if (const std::string path = file("rand", "g", 1000); is_there(path))
        benchmark::RegisterBenchmark("groups/1000", bench_groups, std::make_shared<compiled>(path));
    if (const std::string users = file("rand", "u", 10), expanded = file("rand", "e", 10);
        is_there(users) && is_there(expanded))
        add_threads(users, expanded);
    for (const char *family : {"rand", "prefixed"}) {
        const std::string path = file(family, "u", 100000);
        if (is_there(path))
            add_edits(family, path);
    }
    for (const std::uint32_t count : {1000u, 100000u, 1000000u}) {
        const std::string path = file("rand", "u", count);
        if (is_there(path))
            add_reads(count, path);
    }
#ifdef QZ_BENCH_LIBACL
    benchmark::RegisterBenchmark("posix_parse/1000", bench_posix_parse, 1000);
    for (const std::uint32_t count : {10u, 100u, 1000u, 10000u}) {
        const std::string name = "posix_look_up/" + std::to_string(count);
        benchmark::RegisterBenchmark(name.c_str(), bench_posix_look_up, count);
    }
#endif
}

} // namespace

int main(int argc, char *argv[]) {
    benchmark::Initialize(&argc, argv);
    if (argc != 2)
        give_up("usage: service_bench FOLDER [--benchmark_...]");
    add_all(argv[1]);
    benchmark::RunSpecifiedBenchmarks();
    benchmark::Shutdown();
}
