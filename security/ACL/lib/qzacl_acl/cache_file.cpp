// The cached form of an ACL file: the compiled buffer beside it, owned and protected like it.
#include "qzacl_acl/cache_file.h"

#include "base/open_file.h"
#include "base/owned.h"
#include "qzacl_trace.h"
#include "qzacl_utils.h"
#include "report.h"

#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <pthread.h>
#include <sys/stat.h>

namespace {

constexpr mode_t permission_bits = 07777;

// A file under a name that this call made. It is removed at the end of the scope unless it was kept, and only
// while the name still leads to the file that is held open.
class made_file {
public:
    made_file(const char *name, qz::descriptor file) : name_(name), file_(std::move(file)) {}
    made_file(const made_file &) = delete;
    made_file &operator=(const made_file &) = delete;
    ~made_file() {
        struct stat held = {};
        struct stat named = {};
        if (!is_kept_ && file_ && fstat(file_.get(), &held) == 0 && lstat(name_, &named) == 0 &&
            held.st_dev == named.st_dev && held.st_ino == named.st_ino)
            unlink(name_);
    }

    explicit operator bool() const { return static_cast<bool>(file_); }
    int fd() const { return file_.get(); }
    void keep() { is_kept_ = true; }

private:
    const char *name_;
    qz::descriptor file_;
    bool is_kept_ = false;
};

int query_failed(const char *queried, const char *aclfname, int error) {
    if (qz::traces(qz::trace_category::errors))
        qz::trace_data(109, qz::item(queried), qz::item("stat()"), qz::number(error));
    return qz::report(SEC_S_FILE_ERROR, qz::msg::bad_file_name, aclfname, error);
}

int cannot_open(const char *name) {
    return qz::report(SEC_S_FILE_ERROR, qz::msg::cannot_open_for_writing, name);
}

// A cache that exists must be owned and protected like its ACL file; one that is not is the owner's to mend.
int check_existing(const char *aclfname, const char *cache_name, const struct stat &acl_status,
                   const struct stat &cache_status) {
    if (cache_status.st_uid != acl_status.st_uid || cache_status.st_gid != acl_status.st_gid) {
        if (qz::traces(qz::trace_category::errors))
            qz::trace_data(111, qz::item(cache_name), qz::number(cache_status.st_uid),
                           qz::number(cache_status.st_gid), qz::number(acl_status.st_uid),
                           qz::number(acl_status.st_gid));
        return qz::report(SEC_S_FILE_ERROR, qz::msg::cache_owner_differs, aclfname);
    }
    if (cache_status.st_mode != acl_status.st_mode) {
        const std::uint32_t cache_bits = cache_status.st_mode & permission_bits;
        const std::uint32_t acl_bits = acl_status.st_mode & permission_bits;
        if (qz::traces(qz::trace_category::errors))
            qz::trace_data(111, qz::item(cache_name), qz::number(cache_bits), qz::number(acl_bits));
        return qz::report(SEC_S_FILE_ERROR, qz::msg::cache_mode_differs, aclfname);
    }
    return SEC_S_OK;
}

// Creates the temporary file under the ACL file's name, a '.', and groups of four digits, one more for each
// name that is taken. On failure `name` is the one that could not be had.
qz::descriptor create_temporary(const char *aclfname, qz::path_buffer &name) {
    constexpr std::size_t digits = 4;
    std::size_t length = std::strlen(aclfname);
    std::memcpy(name.text, aclfname, length);
    name.text[length++] = '.';
    name.text[length] = '\0';
    while (length + digits <= qz::path_max) {
        auto state = static_cast<unsigned>(qz::read_counter() >> 32);
        const unsigned drawn = static_cast<unsigned>(rand_r(&state)) & 0xffff;
        std::snprintf(name.text + length, digits + 1, "%04x", drawn);
        length += digits;

        struct stat status = {};
        if (stat(name.text, &status) == 0)
            continue;
        if (errno != ENOENT)
            return {};
        qz::descriptor file = qz::open_file(name.text, O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW);
        // Somebody may have taken the name since, or a link that leads nowhere stands under it.
        if (file || errno != EEXIST)
            return file;
    }
    return {};
}

// One write. Past a file size limit it fails like on a full disk: the signal that would end the process, and
// leave half a cache behind, is held back and taken away again.
ssize_t write_once(int fd, const sec_acl_buffer_t &acl) {
    sigset_t limit_signal;
    sigset_t before;
    sigset_t pending;
    sigemptyset(&limit_signal);
    sigaddset(&limit_signal, SIGXFSZ);
    pthread_sigmask(SIG_BLOCK, &limit_signal, &before);
    sigpending(&pending);
    errno = 0;
    const ssize_t count = write(fd, acl.data, static_cast<std::size_t>(acl.length));
    const int error = errno;
    if (error == EFBIG && sigismember(&pending, SIGXFSZ) == 0) {
        const timespec at_once = {};
        while (sigtimedwait(&limit_signal, nullptr, &at_once) < 0 && errno == EINTR) {
        }
    }
    pthread_sigmask(SIG_SETMASK, &before, nullptr);
    errno = error;
    return count;
}

// Writes the buffer, stamps the file, and has its bytes on disk before the file gets its final name.
int write_buffer(int fd, const sec_acl_buffer_t &acl, const timespec &text_time) {
    const timespec times[2] = {text_time, text_time};
    const ssize_t count = write_once(fd, acl);
    if (count == acl.length && futimens(fd, times) == 0 && fdatasync(fd) == 0)
        return SEC_S_OK;
    return qz::report(SEC_S_FILE_ERROR, qz::msg::short_write, static_cast<int>(count), acl.length, errno);
}

int fill_and_rename(int fd, const char *temporary_name, const char *cache_name, const sec_acl_buffer_t &acl,
                    const struct stat &acl_status, const timespec &text_time) {
    if (const int result = write_buffer(fd, acl, text_time); result != SEC_S_OK)
        return result;
    if (fchown(fd, acl_status.st_uid, acl_status.st_gid) != 0) {
        char user_id[16];
        std::snprintf(user_id, sizeof user_id, "%u", static_cast<unsigned>(acl_status.st_uid));
        return qz::report(SEC_S_FILE_ERROR, qz::msg::cannot_set_owner, cache_name, user_id,
                          static_cast<int>(acl_status.st_gid));
    }
    const mode_t bits = acl_status.st_mode & permission_bits;
    if (fchmod(fd, bits) != 0)
        return qz::report(SEC_S_FILE_ERROR, qz::msg::cannot_set_mode, cache_name, static_cast<int>(bits));
    if (rename(temporary_name, cache_name) != 0)
        return qz::report(SEC_S_FILE_ERROR, qz::msg::cannot_rename_cache, temporary_name, cache_name);
    return SEC_S_OK;
}

} // namespace

namespace qz {

text_origin::text_origin(const struct stat &vetted) : device(vetted.st_dev), inode(vetted.st_ino), time() {
    // The coarse clock: the kernel stamps files from it or from a finer one, never earlier than it.
    clock_gettime(CLOCK_REALTIME_COARSE, &time);
}

bool make_cache_name(const char *aclfname, path_buffer &name) {
    const std::size_t length = strnlen(aclfname, path_max);
    if (length + sizeof cache_extension > sizeof name.text)
        return false;
    std::memcpy(name.text, aclfname, length);
    std::memcpy(name.text + length, cache_extension, sizeof cache_extension);
    return true;
}

} // namespace qz

int sec__cache_aclbuffer(const char *aclfname, const sec_acl_buffer_t *acl, int force,
                         const qz::text_origin &origin) {
    constexpr int lock_for_replacing = 2;
    if (acl->length == 0) {
        if (qz::trace_level(qz::trace_category::info) == 1)
            qz::trace_data(107, qz::item(aclfname));
        return SEC_S_ADVISORY;
    }
    qz::path_buffer cache_name;
    if (std::strlen(aclfname) >= qz::uncached_path_length || !qz::make_cache_name(aclfname, cache_name)) {
        const int shown_length = qz::shown_size(std::strlen(aclfname));
        if (qz::traces(qz::trace_category::errors))
            qz::trace_data(108, qz::item(aclfname), qz::number(shown_length));
        return qz::report(SEC_S_FILE_ERROR, qz::msg::name_too_long_for_cache, aclfname);
    }

    struct stat acl_status = {};
    if (stat(aclfname, &acl_status) != 0)
        return query_failed(aclfname, aclfname, errno);
    if (acl_status.st_dev != origin.device || acl_status.st_ino != origin.inode ||
        !S_ISREG(acl_status.st_mode))
        return query_failed(aclfname, aclfname, ESTALE);
    struct stat cache_status = {};
    const bool is_new = stat(cache_name.text, &cache_status) != 0;
    if (is_new) {
        if (errno != ENOENT)
            return query_failed(cache_name.text, aclfname, errno);
        if (qz::traces(qz::trace_category::info))
            qz::trace_data(110, qz::item(cache_name.text));
    } else {
        const int result = check_existing(aclfname, cache_name.text, acl_status, cache_status);
        if (result != SEC_S_OK)
            return result;
        if (force == 0 && acl_status.st_mtime < cache_status.st_mtime)
            return SEC_S_ADVISORY;
    }

    made_file placeholder(cache_name.text, is_new
                                               ? qz::open_file(cache_name.text, O_WRONLY | O_CREAT | O_EXCL)
                                               : qz::open_vetted(cache_name.text, O_WRONLY, cache_status));
    if (!placeholder)
        return cannot_open(cache_name.text);
    if (!is_new)
        placeholder.keep();
    if (const int result = acl__lock_acl_file(cache_name.text, placeholder.fd(), lock_for_replacing);
        result != 0)
        return result;

    qz::path_buffer temporary_name;
    made_file temporary(temporary_name.text, create_temporary(aclfname, temporary_name));
    if (!temporary)
        return cannot_open(temporary_name.text);
    const int result =
        fill_and_rename(temporary.fd(), temporary_name.text, cache_name.text, *acl, acl_status, origin.time);
    if (result == SEC_S_OK) {
        temporary.keep();
        placeholder.keep();
    }
    return result;
}
