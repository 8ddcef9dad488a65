// The check of one ACL file: vet it, read it whole, parse every line, collect the entries, compile them, and write the
// cache.
#include "bulk_aclfile.h"

#include "base/owned.h"
#include "print_recorded.h"
#include "qzacl_acl/acl_text.h"
#include "qzacl_acl/cache_file.h"
#include "qzacl_acl/compile.h"
#include "qzacl_acl/file_name.h"
#include "qzacl_acl/trees.h"
#include "report.h"

#include <csignal>
#include <cstdio>
#include <iterator>
#include <unistd.h>

using namespace qz;

namespace {

// Released when an error cannot be printed for lack of memory.
owned<void> spare_memory;

// Finds and vets the file, and opens its text.
int aclfck__get_aclfile(const char *aclfname, const char *username, vetted_file &file, acl_text &text) {
    return text.open_again_while_replaced([&] {
        const int result = vet_acl_file(aclfname, username, by_commands, file);
        return result != SEC_S_OK ? result : text.open(file, by_commands);
    });
}

// Prints the current error, if any, and returns its code.
int printed(int code) {
    if (code != SEC_S_OK)
        aclfck__print_error();
    return code;
}

void warn_of_skipped_cache(unsigned flags) {
    if ((flags & ACLFCK_OPT_COMPILE) == 0)
        return;
    report(SEC_S_ADVISORY, msg::cache_skipped_after_errors);
    aclfck__print_error();
}

// Prints the current error and an empty line, without flushing.
void print_recorded_error() {
    if (!print_recorded(stderr, "\n")) {
        spare_memory.reset();
        static_cast<void>(print_recorded(stderr, "\n"));
    }
}

volatile std::sig_atomic_t noted_signal = 0;

// Prints the failures of lines. A terminal shows each at once. For a file or a pipe they are buffered, because a write
// costs more than checking a line. From the first buffered one on, a terminating signal takes effect after the current
// line, when everything is printed; a second one takes effect at once.
class line_failures {
public:
    explicit line_failures(bool may_gather) : may_gather_(may_gather && isatty(STDERR_FILENO) == 0) {}
    line_failures(const line_failures &) = delete;
    line_failures &operator=(const line_failures &) = delete;
    ~line_failures() {
        std::fflush(stderr);
        for (std::size_t i = 0; is_waiting_ && i != count; ++i)
            sigaction(ending_signals[i], &before_[i], nullptr);
        if (noted_signal != 0)
            std::raise(noted_signal);
    }

    void print() {
        if (!may_gather_)
            return aclfck__print_error();
        if (!is_waiting_)
            note_signals();
        print_recorded_error();
    }

    static bool must_end() { return noted_signal != 0; }

private:
    static constexpr int ending_signals[] = {SIGHUP, SIGINT, SIGQUIT, SIGTERM};
    static constexpr std::size_t count = std::size(ending_signals);

    void note_signals() {
        struct sigaction noting = {};
        noting.sa_handler = [](int signal) { noted_signal = signal; };
        // An interrupted write continues.
        noting.sa_flags = static_cast<int>(SA_RESTART | SA_RESETHAND);
        for (std::size_t i = 0; i != count; ++i) {
            sigaction(ending_signals[i], nullptr, &before_[i]);
            if (before_[i].sa_handler == SIG_DFL)
                sigaction(ending_signals[i], &noting, nullptr);
        }
        is_waiting_ = true;
    }

    const bool may_gather_;
    bool is_waiting_ = false;
    struct sigaction before_[count] = {};
};

// Collects the entries of every line. Returns the failure that ends the check. Failures that do not end it clear
// `is_clean`.
int read_entries(acl_text &text, unsigned flags, sec_acltree_array &trees, bool &is_clean) {
    const bool goes_on = (flags & ACLFCK_OPT_CONTINUE) != 0;
    const bool is_verbose = (flags & ACLFCK_OPT_VERBOSE) != 0;
    line_failures failures(goes_on);
    parsed_acle entry;
    while (!line_failures::must_end()) {
        const acl_line line = text.next(entry);
        if (line == acl_line::none)
            continue;
        int result = SEC_S_OK;
        bool may_go_on = goes_on;
        if (line == acl_line::entry) {
            const acle_view acle = view_of(entry);
            if (is_verbose) {
                trees.expect(acle);
                const sec_acle_t shown = record_of(entry);
                sec__dump_acle(&shown, nullptr, "");
            }
            result = trees.add(acle);
            may_go_on = goes_on && result == SEC_S_BAD_ACLE;
        } else {
            result = trees.settle(line == acl_line::bad ? text.failure() : SEC_S_OK);
        }
        if (result == SEC_S_OK && line == acl_line::end)
            return SEC_S_OK;
        if (result == SEC_S_OK)
            continue;
        failures.print();
        if (!may_go_on)
            return result;
        is_clean = false;
    }
    return SEC_S_OK;
}

// Blocks all signals for its scope, so that a terminating one leaves neither half a cache nor the temporary file.
// This is the command's business: the library does not touch the signals of a service.
class held_signals {
public:
    held_signals() {
        sigset_t all;
        sigfillset(&all);
        sigprocmask(SIG_BLOCK, &all, &before_);
    }
    held_signals(const held_signals &) = delete;
    held_signals &operator=(const held_signals &) = delete;
    ~held_signals() { sigprocmask(SIG_SETMASK, &before_, nullptr); }

private:
    sigset_t before_ = {};
};

int compile_and_cache(const vetted_file &file, const sec_acltree_array &trees, const text_origin &origin) {
    sec_acl_buffer_t buffer = {};
    if (const int result = sec__acltrees_to_acl(trees.trees(), &buffer); result != SEC_S_OK)
        return result;
    const owned<void> buffer_owner(buffer.data);
    const held_signals until_cache_is_whole;
    return sec__cache_aclbuffer(file.path.text, &buffer, cache_rewriting::always, origin);
}

} // namespace

int aclfck__bulk_aclfile(const char *aclfname, const char *username, unsigned flags) {
    vetted_file file;
    acl_text text(&acl__default_perm_set);
    if (const int result = aclfck__get_aclfile(aclfname, username, file, text); result != SEC_S_OK)
        return printed(result);
    if (text.is_empty()) {
        if ((flags & ACLFCK_OPT_VERBOSE) != 0) {
            report(SEC_S_ADVISORY, msg::acl_file_empty, file.path.text);
            aclfck__print_error();
        }
        return SEC_S_OK;
    }

    // With either option, the output shows the lines before a failure, or those after it.
    const bool shows_lines = (flags & (ACLFCK_OPT_CONTINUE | ACLFCK_OPT_VERBOSE)) != 0;
    sec_acltree_array trees(text.all(), shows_lines ? on_duplicate::report : on_duplicate::report_late);
    bool is_clean = true;
    if (const int result = read_entries(text, flags, trees, is_clean); result != SEC_S_OK) {
        warn_of_skipped_cache(flags);
        return result;
    }
    if (!is_clean)
        warn_of_skipped_cache(flags);
    else if ((flags & ACLFCK_OPT_COMPILE) != 0)
        return printed(compile_and_cache(file, trees, text.origin()));
    return SEC_S_OK;
}

int aclfck__stream_aclfile(const char * /*aclfname*/, const char * /*username*/) { return SEC_S_OK; }

void aclfck__keep_spare_memory() {
    constexpr std::size_t enough_for_a_message = 16384;
    spare_memory.reset(std::malloc(enough_for_a_message));
}

void aclfck__print_error() {
    print_recorded_error();
    std::fflush(stderr);
}
