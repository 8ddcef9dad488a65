// The command line: a verb, its words, and options anywhere before "--".
#ifndef QZACL_CLI_H
#define QZACL_CLI_H

#include "verbs.h"

#include <optional>
#include <span>
#include <string>
#include <vector>

namespace qzacl {

struct command_line {
    const verb *chosen = nullptr; // null: help for all verbs is wanted
    bool wants_help = false;
    std::vector<std::string> words; // after the verb

    bool is_json = false;
    std::optional<std::string> permissions;
    std::string mechanism = "unix";
    std::vector<std::string> groups;
    std::optional<std::string> wanted;
    bool takes_sum = false;
    std::vector<std::string> handlers; // MECH=domain|exact|none

    // For edits.
    bool checks = false;   // --check: only show what would change
    bool compiles = false; // -s: also compile
    unsigned wait = 0;     // seconds for the lock
};

// Reads the arguments after the command's name. Throws wrong_use for invalid ones.
command_line read_command_line(std::span<const verb> verbs, const std::vector<std::string> &arguments);

// The output of --help, for one verb or for all.
std::string help_of(std::span<const verb> verbs, const verb *chosen);

} // namespace qzacl

#endif
