// Messages on standard error.
#include "trouble.h"

#include "output.h"
#include "print_recorded.h"

#include <cstdio>
#include <unistd.h>

namespace qzacl {

void print_recorded_error() {
    static_cast<void>(qz::print_recorded(stderr, "\n"));
    std::fflush(stderr);
}

void print_message(const std::string &text) {
    const bool is_terminal = isatty(STDERR_FILENO) != 0;
    std::fprintf(stderr, "qzacl: %s\n", is_terminal ? escaped(text, false).c_str() : text.c_str());
    std::fflush(stderr);
}

} // namespace qzacl
