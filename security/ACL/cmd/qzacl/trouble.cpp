// Messages on standard error.
#include "trouble.h"

#include "qzacl_acl/dump.h"

#include <cstdio>

namespace qzacl {

void print_recorded_error() {
    static_cast<void>(qz::print_recorded(stderr, "\n"));
    std::fflush(stderr);
}

void print_message(const std::string &text) {
    std::fprintf(stderr, "qzacl: %s\n", text.c_str());
    std::fflush(stderr);
}

} // namespace qzacl
