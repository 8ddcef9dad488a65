// Runs a fuzzer as an ordinary test: on each file of its corpus, truncated and changed at every place, and on many
// reproducible random inputs derived from them.
#include "fuzz.h"
#include <filesystem>
#include <fstream>
#include <random>

static void run(const std::string &input) {
    // In a separate block, so that sanitizers detect reads beyond its end.
    const std::vector<std::uint8_t> bytes(input.begin(), input.end());
    try {
        LLVMFuzzerTestOneInput(bytes.data(), bytes.size());
    } catch (const std::exception &) {
        std::printf("failed with the input %s\n", testing::PrintToString(input).c_str());
        std::exit(1);
    }
}

using bytes_of_files = std::vector<std::string>;

static bytes_of_files files_in(const char *folder) {
    bytes_of_files corpus;
    for (const auto &each : std::filesystem::directory_iterator(folder)) {
        std::ifstream file(each.path(), std::ios::binary);
        corpus.emplace_back(std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>());
    }
    std::ranges::sort(corpus); // folders are in any order
    return corpus;
}

static void run_cut_and_changed(const std::string &input) {
    for (std::size_t at = 0; at < input.size(); ++at) {
        run(input.substr(0, at + 1));
        for (const int change : {1, 2, 3, 4, 5, 7, 8, 16, 32, 64, 127, 128, 129, 254, 255}) {
            std::string changed = input;
            changed[at] = static_cast<char>(input[at] + change);
            run(changed);
        }
    }
}

static void run_mixed(const bytes_of_files &corpus) {
    std::mt19937 random(1);
    const auto below = [&](std::size_t limit) { return random() % limit; };
    for (int left = 4000; left != 0; --left) {
        std::string made = corpus[below(corpus.size())];
        for (auto changes = 1 + below(6); changes != 0; --changes) {
            const std::string other = below(2) == 0 ? made : corpus[below(corpus.size())];
            const std::string piece = other.substr(below(other.size() + 1), below(8));
            made.replace(below(made.size() + 1), below(12), piece);
        }
        run(made);
    }
}

int main(int, char **arguments) {
    const bytes_of_files corpus = files_in(arguments[1]);
    for (const std::string &input : corpus)
        run_cut_and_changed(input);
    run_mixed(corpus);
}
