// Messages on standard error.
#include "trouble.h"

#include "output.h"
#include "print_recorded.h"

#include <cstdio>
#include <unistd.h>

using namespace qz;

namespace qzacl {

void print_recorded_error() {
    static_cast<void>(print_recorded(stderr, "\n"));
    std::fflush(stderr);
}

void print_message(const std::string &text) {
    std::fprintf(stderr, "qzacl: %s\n", shown_on(STDERR_FILENO, text).c_str());
    std::fflush(stderr);
}

} // namespace qzacl
