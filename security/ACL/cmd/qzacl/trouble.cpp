// Messages on standard error.
#include "trouble.h"

#include "base/owned.h"
#include "output.h"
#include "print_recorded.h"

#include <cstdio>
#include <unistd.h>

using namespace qz;

namespace qzacl {

namespace {

// Messages quote files, but the tabs in them are their own.
void print_recorded_on_terminal() {
    char *text = nullptr;
    std::size_t size = 0;
    std::FILE *const told = open_memstream(&text, &size);
    if (told == nullptr)
        return;
    static_cast<void>(print_recorded(told, "\n"));
    std::fclose(told);
    const owned<char> owner(text);
    std::fputs(shown_on(STDERR_FILENO, {text, size}, "\n\t").c_str(), stderr);
}

} // namespace

void print_recorded_error() {
    if (isatty(STDERR_FILENO) == 0)
        static_cast<void>(print_recorded(stderr, "\n"));
    else
        print_recorded_on_terminal();
    std::fflush(stderr);
}

void print_message(const std::string &text) {
    std::fprintf(stderr, "qzacl: %s\n", shown_on(STDERR_FILENO, text).c_str());
    std::fflush(stderr);
}

} // namespace qzacl
