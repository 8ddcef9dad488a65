// Exceptions that end a verb; main() prints their message and returns the status for trouble.
#ifndef QZACL_TROUBLE_H
#define QZACL_TROUBLE_H

#include <stdexcept>
#include <string>

namespace qzacl {

// The exit statuses, as those of grep and diff.
enum status : int { yes = 0, no = 1, failed = 2 };

// With the message to print.
struct trouble : std::runtime_error {
    using std::runtime_error::runtime_error;
};

// An invalid command line; printed with a hint to the usage.
struct wrong_use : trouble {
    using trouble::trouble;
};

// The library recorded an error, which main() prints.
struct recorded_trouble : std::exception {};

// All messages were printed.
struct told_trouble : std::exception {};

// Throws when the library's operation failed.
inline void require(int code) {
    if (code != 0)
        throw recorded_trouble();
}

// Prints the library's recorded error as qzaclfck does, followed by an empty line.
void print_recorded_error();

// Prints a line of this command's own on standard error.
void print_message(const std::string &text);

} // namespace qzacl

#endif
