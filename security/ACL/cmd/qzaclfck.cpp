// The command qzaclfck: parses the options and shows help, reports a usage error, or runs a check.
#include "bulk_aclfile.h"

#include "report.h"

#include <clocale>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <unistd.h>

using namespace qz;

namespace {

char *aclfname;
char *username;
char *ptplname;

// The parsed options. Each event overwrites the status, so the last one decides.
struct option_state {
    static constexpr int help_wanted = 1;

    unsigned flags = 0;
    int status = 0;
    bool has_error = false;

    void fail(int code) {
        has_error = true;
        status = code;
    }
};

void set_flag(option_state &state, unsigned flag, const char *option) {
    if ((state.flags & flag) != 0)
        state.fail(report(SEC_S_BAD_PARAMETER, msg::option_repeated, option));
    else
        state.flags |= flag;
}

void set_help(option_state &state) {
    if ((state.flags & ACLFCK_OPT_HELP) == 0)
        state.status = option_state::help_wanted;
    set_flag(state, ACLFCK_OPT_HELP, "-h");
}

void set_name(option_state &state, char *&name, const char *option) {
    if (name != nullptr) {
        state.fail(report(SEC_S_BAD_PARAMETER, msg::option_repeated, option));
        return;
    }
    name = strdup(optarg);
    if (name == nullptr)
        state.fail(report_no_memory("main", std::strlen(optarg) + 1));
}

// The next option, including those after operands. Not every C library permutes them, so the '-' makes getopt return
// operands, too.
constexpr int operand = 1;
int next_option(int argc, char *argv[]) {
    for (;;) {
        const int option = getopt(argc, argv, "-cf:hsSt:u:v");
        // Some still stop at a lone "-".
        if (option != -1 || optind >= argc || std::strcmp(argv[optind], "-") != 0)
            return option;
        ++optind;
    }
}

option_state read_options(int argc, char *argv[]) {
    option_state state;
    opterr = 1;
    for (;;) {
        switch (next_option(argc, argv)) {
        case -1:
            return state;
        case operand:
            break;
        case 'c':
            set_flag(state, ACLFCK_OPT_CONTINUE, "-c");
            break;
        case 'f':
            set_name(state, aclfname, "-f");
            break;
        case 'h':
            set_help(state);
            break;
        case 's':
            set_flag(state, ACLFCK_OPT_COMPILE, "-s");
            break;
        case 'S':
            set_flag(state, ACLFCK_OPT_STREAM, "-S");
            break;
        case 't':
            set_name(state, ptplname, "-t");
            break;
        case 'u':
            set_name(state, username, "-u");
            break;
        case 'v':
            set_flag(state, ACLFCK_OPT_VERBOSE, "-v");
            break;
        default:
            state.fail(report(SEC_S_BAD_PARAMETER, msg::option_incorrect));
            break;
        }
    }
}

int print_usage() {
    const int status = report(SEC_S_BAD_PARAMETER, msg::usage);
    aclfck__print_error();
    return status;
}

int finish_without_check(const option_state &state) {
    if (!state.has_error) {
        report(SEC_S_BAD_PARAMETER, msg::help);
        aclfck__print_error();
        return EXIT_SUCCESS;
    }
    aclfck__print_error();
    if (state.status == SEC_S_BAD_PARAMETER)
        return print_usage();
    return state.status == option_state::help_wanted ? EXIT_SUCCESS : state.status;
}

void warn_not_implemented() {
    report(SEC_S_WARNING, msg::stream_not_implemented);
    aclfck__print_error();
    cu_set_no_error_1();
}

int check_file(unsigned flags) {
    if (aclfname == nullptr) {
        report(SEC_S_BAD_PARAMETER, msg::file_option_missing);
        aclfck__print_error();
        return print_usage();
    }
    const bool is_verbose = (flags & ACLFCK_OPT_VERBOSE) != 0;
    if (ptplname != nullptr && is_verbose)
        warn_not_implemented();
    if ((flags & ACLFCK_OPT_STREAM) != 0) {
        if (is_verbose)
            warn_not_implemented();
        flags &= ~unsigned{ACLFCK_OPT_STREAM};
    }
    if (username != nullptr && (flags & ACLFCK_OPT_COMPILE) != 0) {
        flags &= ~unsigned{ACLFCK_OPT_COMPILE};
        report(SEC_S_ADVISORY, msg::compile_option_ignored);
        aclfck__print_error();
        cu_set_no_error_1();
    }
    return aclfck__bulk_aclfile(aclfname, username, flags);
}

// A file opened later must not become a standard stream, or messages would end up in it.
void fill_standard_descriptors() {
    int fd = 0;
    do {
        fd = open("/dev/null", O_RDWR);
    } while (fd >= 0 && fd <= STDERR_FILENO);
    if (fd > STDERR_FILENO)
        close(fd);
}

} // namespace

int main(int argc, char *argv[]) {
    fill_standard_descriptors();
    aclfck__keep_spare_memory();
    std::setlocale(LC_ALL, "");
    // Entry lines are buffered, and so are failures of lines unless a terminal shows them. Other messages are flushed.
    static char stream_buffer[1 << 16];
    std::setvbuf(stderr, stream_buffer, _IOFBF, sizeof stream_buffer);

    const option_state state = read_options(argc, argv);
    const int status = state.status != 0 ? finish_without_check(state) : check_file(state.flags);
    std::fflush(stderr);
    return status;
}
