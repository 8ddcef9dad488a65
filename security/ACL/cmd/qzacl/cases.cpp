// A file of cases.
#include "cases.h"

#include "trouble.h"

namespace qzacl {

std::vector<std::string> words_of(std::string_view line) {
    constexpr std::string_view blanks = " \t\v\f\r";
    std::vector<std::string> words;
    for (;;) {
        const std::size_t begin = line.find_first_not_of(blanks);
        if (begin == std::string_view::npos || line[begin] == '#')
            return words;
        line.remove_prefix(begin);
        const std::size_t size = std::min(line.find_first_of(blanks), line.size());
        words.emplace_back(line.substr(0, size));
        line.remove_prefix(size);
    }
}

test_case case_of(const std::vector<std::string> &words) {
    if (words.size() < 4)
        throw trouble("a case is MECHANISM IDENTITY [+GROUP]... LETTERS yes|no");
    test_case made;
    made.mechanism = words[0];
    made.identity = words[1];
    made.letters = words[words.size() - 2];
    const std::string &expected = words.back();
    if (expected != "yes" && expected != "no")
        throw trouble("\"" + expected + "\" is neither yes nor no");
    made.is_expected = expected == "yes";
    for (std::size_t at = 2; at < words.size() - 2; ++at) {
        if (words[at].size() < 2 || words[at][0] != '+')
            throw trouble("\"" + words[at] + "\" is no +GROUP");
        made.groups.push_back(words[at].substr(1));
    }
    if ((made.mechanism == "-") != (made.identity == "-"))
        throw trouble("\"-\" stands for both names");
    if (!made.is_user() && !made.groups.empty())
        throw trouble("who did not authenticate is in no group");
    for (const std::string &word : words) {
        if (word.find('\0') != std::string::npos)
            throw trouble("a word has a NUL");
    }
    return made;
}

} // namespace qzacl
