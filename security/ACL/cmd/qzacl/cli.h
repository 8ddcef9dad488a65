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
    const verb *chosen = nullptr; // null: help is wanted, of all verbs
    bool wants_help = false;
    std::vector<std::string> words; // after the verb

    bool is_json = false;
    std::optional<std::string> permissions;
    std::string mechanism = "unix";
    std::vector<std::string> groups;
    std::optional<std::string> wanted;
    bool takes_sum = false;
    std::vector<std::string> handlers; // MECH=domain|exact|none

    // Of edits.
    bool checks = false;   // what would change
    bool compiles = false; // so that the cache counts
    unsigned wait = 0;     // seconds for the lock
};

// Reads the arguments after the command's name. Throws wrong_use for invalid ones.
command_line read_command_line(std::span<const verb> verbs, const std::vector<std::string> &arguments);

// What --help prints: of one verb, or of all.
std::string help_of(std::span<const verb> verbs, const verb *chosen);

} // namespace qzacl

#endif
