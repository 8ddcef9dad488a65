// Compiles a text so that its cache counts.
#include "counting_cache.h"

#include "trouble.h"

#include "base/owned.h"
#include "qzacl_acl/acl_text.h"
#include "qzacl_acl/cache_file.h"
#include "qzacl_acl/compile.h"
#include "qzacl_acl/tree.h"

#include <csignal>
#include <cstring>
#include <ctime>
#include <sys/stat.h>

namespace qzacl {

namespace {

constexpr qz::acl_file_use by_edit = {
    .not_found = {SEC_S_BAD_FILENAME, qz::msg::bad_acl_file_name},
    .not_private = {SEC_S_BAD_PERMISSION, qz::msg::acl_file_not_private},
    .cannot_open = {SEC_S_FILE_ERROR, qz::msg::cannot_open_acl_file},
    .takes_empty_of_anybody = false,
    .is_traced = false,
};

enum class outcome { counts, does_not_count, failed };

// A cache counts when it is later than its text in whole seconds.
void wait_until_later_than(const std::string &path) {
    struct stat text = {};
    timespec now = {};
    while (stat(path.c_str(), &text) == 0 && clock_gettime(CLOCK_REALTIME_COARSE, &now) == 0 &&
           text.st_mtim.tv_sec == now.tv_sec) {
        constexpr long second = 1'000'000'000;
        const timespec rest = {0, second - now.tv_nsec};
        clock_nanosleep(CLOCK_REALTIME, 0, &rest, nullptr);
    }
}

int read_trees(qz::acl_text &text, sec_acltree_array &trees) {
    sec_acle_t entry = {};
    for (;;) {
        const qz::acl_line line = text.next(entry);
        if (line == qz::acl_line::end)
            return SEC_S_OK;
        if (line == qz::acl_line::bad)
            return text.failure();
        if (line == qz::acl_line::none)
            continue;
        if (const int result = sec__add_acle_to_trees(&entry, trees); result != SEC_S_OK)
            return result;
    }
}

// A signal that ends the command would leave half a cache behind.
int write_cache(const char *path, const sec_acl_buffer_t &compiled, const qz::text_origin &origin) {
    constexpr int even_when_current = 1;
    sigset_t all;
    sigset_t before;
    sigfillset(&all);
    sigprocmask(SIG_BLOCK, &all, &before);
    const int result = sec__cache_aclbuffer(path, &compiled, even_when_current, origin);
    sigprocmask(SIG_SETMASK, &before, nullptr);
    return result;
}

// Of a text without entries there is no cache; nor may one that says anything be left that is read.
bool is_what_services_read(const std::string &path, const sec_perm_set_t &set,
                           const sec_acl_buffer_t &compiled) {
    sec_acl_buffer_t served = {};
    std::uint32_t flags = 0;
    const int result = sec_read_acl_file(path.c_str(), nullptr, &set, 0, &served, &flags);
    const qz::owned<void> owner(served.data);
    const bool is_text = (flags & SEC_READ_ACL_TEXT) != 0;
    if (result != SEC_S_OK || compiled.length == 0)
        return result == SEC_S_OK && is_text;
    return !is_text && served.length == compiled.length &&
           std::memcmp(served.data, compiled.data, static_cast<std::size_t>(compiled.length)) == 0;
}

outcome compile_once(const std::string &path, const sec_perm_set_t &set) {
    qz::vetted_file file;
    qz::acl_text text(&set);
    const int opened = text.open_again_while_replaced([&] {
        const int result = qz::vet_acl_file(path.c_str(), nullptr, by_edit, file);
        return result != SEC_S_OK ? result : text.open(file, by_edit);
    });
    sec_acltree_array trees;
    if (opened != SEC_S_OK || (!text.is_empty() && read_trees(text, trees) != SEC_S_OK))
        return outcome::failed;
    const bool has_entries = !trees.trees().empty();
    sec_acl_buffer_t compiled = {};
    if (has_entries && sec__acltrees_to_acl(trees.trees(), &compiled) != SEC_S_OK)
        return outcome::failed;
    const qz::owned<void> owner(compiled.data);
    if (has_entries && write_cache(file.path.text, compiled, text.origin()) != SEC_S_OK)
        return outcome::failed;
    return is_what_services_read(path, set, compiled) ? outcome::counts : outcome::does_not_count;
}

bool same_text(const struct stat &one, const struct stat &other) {
    return qz::same_file(one, other) && one.st_mtim.tv_sec == other.st_mtim.tv_sec &&
           one.st_mtim.tv_nsec == other.st_mtim.tv_nsec;
}

} // namespace

bool make_cache_count(const std::string &path, const permission_set &set) {
    // Another edit may change the text while this one compiles it.
    constexpr int most_attempts = 10;
    for (int left = most_attempts;; --left) {
        struct stat before = {};
        struct stat after = {};
        wait_until_later_than(path);
        const bool is_there = stat(path.c_str(), &before) == 0;
        const outcome found = compile_once(path, *set.get());
        if (found == outcome::counts)
            return true;
        const bool has_changed = is_there && stat(path.c_str(), &after) == 0 && !same_text(before, after);
        if (!has_changed || left == 1) {
            if (found == outcome::failed)
                print_recorded_error();
            return false;
        }
        cu_set_no_error_1();
    }
}

} // namespace qzacl
