// The verbs: what each takes and does.
#ifndef QZACL_VERBS_H
#define QZACL_VERBS_H

#include "output.h"
#include "permission_set.h"

#include <cstddef>
#include <string_view>

namespace qzacl {

struct command_line;

// What a verb works with.
struct call {
    const command_line &line;
    const permission_set &permissions;
    output &out;
};

struct verb {
    std::string_view name;
    std::string_view usage; // its words and options
    std::string_view purpose;
    std::string_view options; // besides --json and --permissions, separated by single blanks
    std::size_t least_words;
    std::size_t most_words;
    std::size_t files;            // how many of its first words may be "-"
    int (*run)(const call &call); // returns the exit status
};

inline constexpr std::size_t any_number = static_cast<std::size_t>(-1);

int ask(const call &call);
int cache(const call &call);
int diff(const call &call);
int edit(const call &call);
int grant(const call &call);
int lint(const call &call);
int remove(const call &call);
int revoke(const call &call);
int set(const call &call);
int show(const call &call);
int test(const call &call);
int who(const call &call);

} // namespace qzacl

#endif
