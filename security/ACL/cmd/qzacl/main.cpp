// The command qzacl: asks, explains, compares and tests ACL files. From its arguments to its exit status.
#include "cli.h"
#include "trouble.h"

#include <clocale>
#include <fcntl.h>
#include <new>
#include <unistd.h>

namespace {

using namespace qzacl;

constexpr char edit_options[] = "--check -s --wait";

constexpr verb verbs[] = {
    {"ask",
     "[-m MECH] [-g GROUP]... [-w LETTERS] [--order closest|sum] [--handler MECH=domain|exact|none]... FILE "
     "[IDENTITY]",
     "what a party would be granted, and why", "-m -g -w --order --handler", 1, 2, 1, ask},
    {"who", "FILE LETTERS", "the entries that hold all the letters", "", 2, 2, 1, who},
    {"set", "[--check] [-s] [--wait SECONDS] FILE ENTRY",
     "makes the entry what ENTRY says, adding it where it is not there", edit_options, 2, 5, 0, set},
    {"remove", "[--check] [-s] [--wait SECONDS] FILE KEY", "takes the entry out", edit_options, 2, 4, 0,
     remove},
    {"grant", "[--check] [-s] [--wait SECONDS] FILE LETTERS KEY",
     "adds letters to the entry, or adds the entry", edit_options, 3, 5, 0, grant},
    {"revoke", "[--check] [-s] [--wait SECONDS] FILE LETTERS KEY", "takes letters away from the entry",
     edit_options, 3, 5, 0, revoke},
    {"edit", "[-s] [--wait SECONDS] FILE", "opens the file in an editor and checks it before it counts",
     "-s --wait", 1, 1, 0, edit},
    {"show", "FILE", "the entries as a text, in stored order", "", 1, 1, 1, show},
    {"diff", "A B", "what changes from one ACL to another", "", 2, 2, 2, diff},
    {"cache", "FILE...", "what services read, and whether it is right", "", 1, any_number, any_number, cache},
    {"test", "[--order closest|sum] [--handler MECH=domain|exact|none]... FILE CASES",
     "whether an ACL grants what a file of cases says", "--order --handler", 2, 2, 2, test},
    {"lint", "FILE...", "what a check lets through and nobody meant", "", 1, any_number, any_number, lint},
};

// A file that is opened later must not become one of the standard streams. A closed one stays unusable, so that
// reading or writing it fails.
void fill_standard_descriptors() {
    for (int fd = open("/dev/null", O_RDWR); fd >= 0; fd = open("/dev/null", O_RDWR)) {
        if (fd > STDERR_FILENO) {
            close(fd);
            return;
        }
        if (fd == STDERR_FILENO)
            continue;
        const int useless = open("/dev/null", fd == STDIN_FILENO ? O_WRONLY : O_RDONLY);
        if (useless >= 0) {
            dup2(useless, fd);
            close(useless);
        }
    }
}

int run(const command_line &line) {
    output out(line.is_json);
    if (line.wants_help) {
        out.lines(help_of(verbs, line.chosen));
        out.flush();
        return yes;
    }
    const permission_set permissions =
        line.permissions ? permission_set(*line.permissions) : permission_set();
    const int status = line.chosen->run({line, permissions, out});
    out.flush();
    return status;
}

// Prints the message of the current exception.
void tell() {
    try {
        throw;
    } catch (const told_trouble &) {
        // Its messages were printed.
    } catch (const recorded_trouble &) {
        print_recorded_error();
    } catch (const wrong_use &found) {
        print_message(std::string(found.what()) + "; see qzacl --help");
    } catch (const std::bad_alloc &) {
        print_message("out of memory");
    } catch (const std::exception &found) {
        print_message(found.what());
    }
}

} // namespace

int main(int argc, char *argv[]) {
    fill_standard_descriptors();
    std::setlocale(LC_ALL, "");
    try {
        return run(read_command_line(verbs, {argv + (argc > 0 ? 1 : 0), argv + argc}));
    } catch (...) {
        tell();
        return failed;
    }
}
