// Measures parts that a service cannot call separately: a disabled trace point, and the phases of checking a file.
//
// usage: acl_bench FOLDER [--benchmark_...]
//
// The folder contains files made by generate.py. Sizes without a file are skipped.
#include "qzacl_acl/compile.h"
#include "qzacl_acl/entry_parser.h"
#include "qzacl_acl/trees.h"
#include "qzacl_utils/file_bytes.h"
#include "trace_points.h"

#include <benchmark/benchmark.h>

#include <cstdio>
#include <cstdlib>
#include <ctime>
#include <fstream>
#include <iterator>
#include <optional>
#include <string>
#include <vector>

namespace {

void bench_trace_point(benchmark::State &state) {
    const sec_acl_buffer_t *acl = nullptr;
    for (auto _ : state)
        qz::trace_entry(qz::operation::release_acl, std::tie(acl));
}

class stopwatch {
public:
    // The nanoseconds of this thread since the last call.
    double lap() {
        timespec now = {};
        clock_gettime(CLOCK_THREAD_CPUTIME_ID, &now);
        const double time = static_cast<double>(now.tv_sec) * 1e9 + static_cast<double>(now.tv_nsec);
        const double passed = time - last_;
        last_ = time;
        return passed;
    }

private:
    double last_ = 0;
};

// Runs each phase for the whole file, unlike the check, which goes line by line. All results are in nanoseconds per
// line.
void bench_phases(benchmark::State &state, const std::string &text) {
    double parsing = 0;
    double inserting = 0;
    double compiling = 0;
    double releasing = 0;
    std::size_t lines = 0;
    for (auto _ : state) {
        // With the padding of a text that was read from a file, because trees point into it.
        std::string consumed = text + std::string(qz::text_padding, '\0');
        const std::size_t size = text.size() + 1;
        std::vector<qz::parsed_acle> entries;
        entries.reserve(text.size() / 8);
        char *cursor = consumed.data();
        std::size_t remaining = size;
        std::uint32_t line = 1;
        stopwatch watch;
        watch.lap();
        for (qz::parsed_acle entry;
             sec__read_acle_from_text(nullptr, &cursor, &remaining, &line, &entry) == qz::line_consumed;)
            entries.push_back(entry);
        parsing += watch.lap();

        std::optional<sec_acltree_array> trees(std::in_place, std::span(consumed.data(), size),
                                               qz::on_duplicate::report_late);
        int result = SEC_S_OK;
        for (const qz::parsed_acle &entry : entries)
            result |= trees->add(qz::view_of(entry));
        result = trees->settle(result);
        inserting += watch.lap();

        sec_acl_buffer_t acl = {};
        result |= sec__acltrees_to_acl(trees->trees(), &acl);
        compiling += watch.lap();

        trees.reset();
        sec_release_acl(&acl);
        releasing += watch.lap();
        lines += entries.size();
        if (result != SEC_S_OK)
            state.SkipWithError("an entry was refused");
    }
    const auto count = static_cast<double>(lines);
    state.counters["parsing"] = parsing / count;
    state.counters["inserting"] = inserting / count;
    state.counters["compiling"] = compiling / count;
    state.counters["releasing"] = releasing / count;
}

} // namespace

int main(int argc, char *argv[]) {
    benchmark::Initialize(&argc, argv);
    if (argc != 2) {
        std::fprintf(stderr, "usage: acl_bench FOLDER [--benchmark_...]\n");
        return EXIT_FAILURE;
    }
    benchmark::RegisterBenchmark("trace_point", bench_trace_point);
    for (const char *size : {"1000", "100000", "1000000"}) {
        std::ifstream file(std::string(argv[1]) + "/rand-random-u-" + size + ".acl");
        const std::string text{std::istreambuf_iterator<char>(file), {}};
        if (!text.empty())
            benchmark::RegisterBenchmark((std::string("phases/") + size).c_str(), bench_phases, text);
    }
    benchmark::RunSpecifiedBenchmarks();
    benchmark::Shutdown();
}
