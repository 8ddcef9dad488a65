// What the tests of files share: an ACL file and its cache in a folder of their own, and reads and checks of them
// with watched system calls.
#ifndef QZ_TESTS_ACL_FILES_H
#define QZ_TESTS_ACL_FILES_H

#include "bulk_aclfile.h"
#include "faults.h"
#include "support.h"

#include <set>

namespace support {

namespace fs = std::filesystem;

constexpr unsigned text_only = SEC_READ_ACL_TEXT;
constexpr unsigned cached = SEC_READ_ACL_CACHE;
constexpr unsigned checked = SEC_READ_ACL_CONVERT;
inline const std::string acl_text =
    "n r\nu unix alice@host rw\nu krb carl r\nu krb bob r\ne krb zoe q\ng staff q\n";
inline const std::string other_text = "u unix eve@host rwcx\ng other r\n";
inline const std::string no_cache;
inline const std::string stale_cache = "old";
inline const std::string both_caches[] = {no_cache, stale_cache};

inline std::set<std::string> names_in(const std::string &path) {
    std::set<std::string> names;
    for (const auto &item : fs::directory_iterator(path))
        names.insert(item.path().filename());
    return names;
}

struct outcome : failure { // of a read or a check, with the code that it gave and the buffer's bytes
    std::string bytes = {};
    bool operator==(const outcome &) const = default;
};

inline outcome recorded(int code, const std::string &bytes = "") {
    outcome found{recorded_error(), bytes};
    found.code = code;
    return found;
}
inline outcome read_acl(const std::string &path, unsigned flags, const char *user = nullptr) {
    buffer held;
    const int code = sec_read_acl_file(path.c_str(), user, nullptr, flags, &held.acl, nullptr);
    return recorded(code, held.bytes());
}
// The command's check, by default with a cache written.
constexpr unsigned no_options = 0;
inline outcome check(const std::string &path, unsigned options = ACLFCK_OPT_COMPILE) {
    return recorded(aclfck__bulk_aclfile(path.c_str(), nullptr, options));
}

// Runs something watched, and keeps its output.
using faults_by_place = std::function<int(std::size_t)>;
inline std::string printed;
inline outcome watched(const faults_by_place &fault_of, const std::function<outcome()> &call) {
    testing::internal::CaptureStderr();
    const outcome result = faults::watched(fault_of, call);
    printed = testing::internal::GetCapturedStderr();
    return result;
}
// Does something before the call at a place.
inline faults_by_place before_step(std::size_t at, const std::function<void()> &act) {
    return [at, act](std::size_t index) {
        if (index == at)
            act();
        return faults::no_fault;
    };
}
inline bool is_about_to(const char *call) { return faults::calls.back() == call; }

inline const char *user_name() { return getpwuid(geteuid())->pw_name; }

struct files : testing::Test {
    const temporary_folder folder;
    const std::string path = folder / "acl";
    const std::string cache = path + ".cacl";
    outcome from_text;

    files() {
        lay_out();
        faults::home = folder.path;
        from_text = read_acl(path, text_only);
    }
    // The folder with the text of long ago, and beside it nothing, or a cache of the given bytes and age.
    void lay_out(const std::string &cache_bytes = no_cache, int cache_age = 200) const {
        fs::remove_all(folder.path);
        fs::create_directory(folder.path);
        fs::current_path(folder.path);
        write_file(path, acl_text, 100);
        if (!cache_bytes.empty())
            write_file(cache, cache_bytes, cache_age);
    }
    // Others than the owner may write the text and the cache. False where the file system has no such entries.
    bool give_both_entries() const {
        const bool has_cache = fs::exists(cache);
        return give_entries(path, 6, 6) && (!has_cache || give_entries(cache, 6, 6));
    }
    bool has_entries() const {
        lay_out();
        return give_both_entries();
    }
};

} // namespace support

#endif
