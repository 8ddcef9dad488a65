// Compiles a text so that its cache counts.
#include "counting_cache.h"

#include "base/owned.h"
#include "lock_file.h"
#include "qzacl_acl/cache_file.h"
#include "qzacl_acl/compile.h"
#include "qzacl_acl/trees.h"
#include "trouble.h"
#include "whole_file.h"

#include <cstring>
#include <ctime>
#include <sys/stat.h>
#include <thread>

using namespace qz;

namespace qzacl {

namespace {

enum class outcome { counts, does_not_count, failed };

// A cache counts if it is later than its text in whole seconds. Returns how long the second in which the text was
// written will last, or 0 when it is over. The kernel may have stamped the text from a finer clock, which is ahead of
// the coarse one that stamps the cache, so that second may not even have begun. A text from a later future is not
// waited for.
std::chrono::nanoseconds rest_of_second(const std::string &path) {
    using std::chrono::seconds;
    struct stat text = {};
    timespec now = {};
    if (stat(path.c_str(), &text) != 0 || clock_gettime(CLOCK_REALTIME_COARSE, &now) != 0)
        return {};
    const seconds ahead(text.st_mtim.tv_sec - now.tv_sec);
    if (ahead < seconds(0) || ahead > seconds(1))
        return {};
    return ahead + seconds(1) - std::chrono::nanoseconds(now.tv_nsec);
}

int read_trees(acl_text &text, sec_acltree_array &trees) {
    parsed_acle entry;
    for (;;) {
        const acl_line line = text.next(entry);
        if (line == acl_line::end)
            return SEC_S_OK;
        if (line == acl_line::bad)
            return text.failure();
        if (line == acl_line::none)
            continue;
        if (const int result = trees.add(view_of(entry)); result != SEC_S_OK)
            return result;
    }
}

// For a text without entries there is no cache, and services must not read anything else.
bool is_what_services_read(const std::string &path, const sec_perm_set_t &set,
                           const sec_acl_buffer_t &compiled) {
    sec_acl_buffer_t served = {};
    std::uint32_t flags = 0;
    const int result = sec_read_acl_file(path.c_str(), nullptr, &set, 0, &served, &flags);
    const owned<void> owner(served.data);
    const bool is_text = (flags & SEC_READ_ACL_TEXT) != 0;
    if (result != SEC_S_OK || compiled.length == 0)
        return result == SEC_S_OK && served.length == 0;
    return !is_text && served.length == compiled.length &&
           std::memcmp(served.data, compiled.data, static_cast<std::size_t>(compiled.length)) == 0;
}

outcome compile_once(const std::string &path, const sec_perm_set_t &set) {
    vetted_file file;
    acl_text text(&set);
    const int opened = read_acl_text(path, file, text);
    sec_acltree_array trees(text.all());
    if (opened != SEC_S_OK || (!text.is_empty() && read_trees(text, trees) != SEC_S_OK))
        return outcome::failed;
    const bool has_entries = !trees.trees().empty();
    sec_acl_buffer_t compiled = {};
    if (has_entries && sec__acltrees_to_acl(trees.trees(), &compiled) != SEC_S_OK)
        return outcome::failed;
    const owned<void> owner(compiled.data);
    if (has_entries &&
        sec__cache_aclbuffer(file.path.text, &compiled, cache_rewriting::always, text.origin()) != SEC_S_OK)
        return outcome::failed;
    return is_what_services_read(path, set, compiled) ? outcome::counts : outcome::does_not_count;
}

} // namespace

bool make_cache_count(const edited_file &file, std::chrono::seconds wait, const permission_set &set) {
    constexpr std::chrono::nanoseconds over(0);
    for (;;) {
        // Other edits may happen meanwhile; each waits for its own cache.
        for (auto rest = rest_of_second(file.path()); rest != over; rest = rest_of_second(file.path()))
            std::this_thread::sleep_for(rest);
        const lock_file lock(file, wait);
        if (rest_of_second(file.path()) != over)
            continue;
        const outcome found = compile_once(file.path(), *set.get());
        if (found == outcome::failed)
            print_recorded_error();
        return found == outcome::counts;
    }
}

} // namespace qzacl
