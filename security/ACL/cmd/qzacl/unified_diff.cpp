// The difference of two texts in the unified form.
#include "unified_diff.h"

#include <algorithm>
#include <vector>

namespace qzacl {

namespace {

using lines = std::vector<std::string_view>;

// Lines with their line feeds, which the last one may lack.
lines lines_of(std::string_view text) {
    lines found;
    while (!text.empty()) {
        const std::size_t size = std::min(text.find('\n'), text.size() - 1) + 1;
        found.push_back(text.substr(0, size));
        text.remove_prefix(size);
    }
    return found;
}

// Lines from one number to another, from 0.
struct range {
    std::size_t begin;
    std::size_t end;
};

// As patch counts: from 1, and a range without lines by the line before it.
std::string shown(const range &part) {
    const std::size_t count = part.end - part.begin;
    return std::to_string(part.begin + (count == 0 ? 0 : 1)) + "," + std::to_string(count);
}

void append(std::string &diff, char sign, const lines &of, const range &part) {
    for (std::size_t at = part.begin; at != part.end; ++at) {
        diff += sign;
        diff += of[at];
        if (of[at].back() != '\n')
            diff += "\n\\ No newline at end of file\n";
    }
}

} // namespace

std::string unified_diff(std::string_view before, std::string_view after, const std::string &name) {
    if (before == after)
        return {};
    constexpr std::size_t most_around = 3;
    const lines old_lines = lines_of(before);
    const lines new_lines = lines_of(after);
    const auto first = std::mismatch(old_lines.begin(), old_lines.end(), new_lines.begin(), new_lines.end());
    const auto begin = static_cast<std::size_t>(first.first - old_lines.begin());
    const std::size_t shorter = std::min(old_lines.size(), new_lines.size());
    std::size_t alike = 0; // lines at the end
    while (alike != shorter - begin && old_lines.rbegin()[static_cast<std::ptrdiff_t>(alike)] ==
                                           new_lines.rbegin()[static_cast<std::ptrdiff_t>(alike)])
        ++alike;

    const range removed = {begin, old_lines.size() - alike};
    const range added = {begin, new_lines.size() - alike};
    const std::size_t above = begin - std::min(begin, most_around);
    const std::size_t below = std::min(alike, most_around);
    std::string diff = "--- " + name + "\n+++ " + name + "\n@@ -" + shown({above, removed.end + below}) +
                       " +" + shown({above, added.end + below}) + " @@\n";
    append(diff, ' ', old_lines, {above, begin});
    append(diff, '-', old_lines, removed);
    append(diff, '+', new_lines, added);
    append(diff, ' ', old_lines, {removed.end, removed.end + below});
    return diff;
}

} // namespace qzacl
