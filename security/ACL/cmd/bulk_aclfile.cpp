// The check of one ACL file: vet it, read it whole, parse every line, collect the entries, and cache what
// they compile to.
#include "bulk_aclfile.h"

#include "owned.h"
#include "qzacl_acl/cache_file.h"
#include "qzacl_acl/compile.h"
#include "qzacl_acl/dump.h"
#include "qzacl_acl/entry_parser.h"
#include "qzacl_acl/file_name.h"
#include "qzacl_acl/trees.h"
#include "qzacl_utils.h"
#include "report.h"

#include <cerrno>
#include <fcntl.h>
#include <sys/stat.h>

namespace {

// Given back when there is none left to say so.
qz::owned<void> spare_memory;

int aclfck__get_aclfile(const char *aclfname, const char *username, qz::vetted_file &file) {
    std::uint32_t user_id = 0;
    if (const int result = sec__get_aclfname(aclfname, username, file.path, &user_id); result != SEC_S_OK)
        return result;
    errno = 0;
    if (stat(file.path.text, &file.status) != 0 || !S_ISREG(file.status.st_mode))
        return qz::report(SEC_S_BAD_FILENAME, qz::msg::bad_acl_file_name, file.path.text, errno);
    if (username == nullptr)
        return SEC_S_OK;
    if (file.status.st_uid == user_id && (file.status.st_mode & (S_IWGRP | S_IWOTH)) == 0)
        return SEC_S_OK;
    return qz::report(SEC_S_BAD_PERMISSION, qz::msg::acl_file_not_private, file.path.text, username);
}

int read_contents(const qz::vetted_file &file, qz::file_bytes &contents) {
    const qz::descriptor opened = qz::open_vetted(file.path.text, O_RDONLY, file.status);
    if (!opened)
        return qz::report(SEC_S_FILE_ERROR, qz::msg::cannot_open_acl_file, file.path.text, errno);
    return qz::lock_and_read(file.path.text, opened, contents);
}

// Prints the current error and passes its code on.
int printed(int code) {
    if (code != SEC_S_OK)
        aclfck__print_error();
    return code;
}

void warn_of_skipped_cache(unsigned flags) {
    if ((flags & ACLFCK_OPT_COMPILE) == 0)
        return;
    qz::report(SEC_S_ADVISORY, qz::msg::cache_skipped_after_errors);
    aclfck__print_error();
}

// Collects the entries of every line. Returns the failure that ends the check; failures that are passed over
// clear `is_clean` instead.
int read_entries(qz::file_bytes &contents, unsigned flags, sec_acltree_array &trees, bool &is_clean) {
    constexpr int line_consumed = 1;
    const bool goes_on = (flags & ACLFCK_OPT_CONTINUE) != 0;
    const bool is_verbose = (flags & ACLFCK_OPT_VERBOSE) != 0;
    const bool may_wait = !goes_on && !is_verbose;
    char *cursor = contents.data.get();
    std::size_t remaining = contents.length + 1;
    std::uint32_t line = 1;
    qz::parsed_acle entry;
    for (;;) {
        int result = sec__read_acle_from_text(&acl__default_perm_set, &cursor, &remaining, &line, &entry);
        if (result != line_consumed)
            result = trees.settle(result);
        if (result == SEC_S_OK)
            return SEC_S_OK;
        bool may_go_on = goes_on;
        if (result == line_consumed) {
            if (entry.type == 0)
                continue;
            if (is_verbose) {
                const sec_acle_t shown = qz::record_of(entry);
                sec__dump_acle(&shown, nullptr, "");
            }
            const qz::acle_view acle = qz::view_of(entry);
            result = may_wait ? trees.add_soon(acle) : trees.add(acle);
            if (result == SEC_S_OK)
                continue;
            may_go_on = goes_on && result == SEC_S_BAD_ACLE;
        }
        aclfck__print_error();
        if (!may_go_on)
            return result;
        is_clean = false;
    }
}

int compile_and_cache(const qz::vetted_file &file, const sec_acltree_array &trees,
                      const qz::text_origin &origin) {
    constexpr int even_when_current = 1;
    sec_acl_buffer_t buffer = {};
    if (const int result = sec__acltrees_to_acl(trees.trees(), &buffer); result != SEC_S_OK)
        return result;
    const qz::owned<void> buffer_owner(buffer.data);
    return sec__cache_aclbuffer(file.path.text, &buffer, even_when_current, origin);
}

} // namespace

int aclfck__bulk_aclfile(const char *aclfname, const char *username, unsigned flags) {
    qz::vetted_file file;
    if (const int result = aclfck__get_aclfile(aclfname, username, file); result != SEC_S_OK)
        return printed(result);
    const qz::text_origin origin(file.status);
    qz::file_bytes contents;
    if (const int result = read_contents(file, contents); result != SEC_S_OK)
        return printed(result);
    if (contents.length == 0) {
        if ((flags & ACLFCK_OPT_VERBOSE) != 0) {
            qz::report(SEC_S_ADVISORY, qz::msg::acl_file_empty, file.path.text);
            aclfck__print_error();
        }
        return SEC_S_OK;
    }

    sec_acltree_array trees(contents.all());
    bool is_clean = true;
    if (const int result = read_entries(contents, flags, trees, is_clean); result != SEC_S_OK) {
        warn_of_skipped_cache(flags);
        return result;
    }
    if (!is_clean)
        warn_of_skipped_cache(flags);
    else if ((flags & ACLFCK_OPT_COMPILE) != 0)
        return printed(compile_and_cache(file, trees, origin));
    return SEC_S_OK;
}

int aclfck__stream_aclfile(const char * /*aclfname*/, const char * /*username*/) { return SEC_S_OK; }

void aclfck__keep_spare_memory() {
    constexpr std::size_t enough_for_a_message = 16384;
    spare_memory.reset(std::malloc(enough_for_a_message));
}

void aclfck__print_error() {
    if (!qz::print_recorded(stderr, "\n")) {
        spare_memory.reset();
        static_cast<void>(qz::print_recorded(stderr, "\n"));
    }
    std::fflush(stderr);
}
