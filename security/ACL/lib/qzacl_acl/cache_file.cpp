// Writing the cache of an ACL file: a compiled buffer next to it, with the same owner, mode and POSIX ACL.
#include "qzacl_acl/cache_file.h"

#include "base/limited_write.h"
#include "base/open_file.h"
#include "base/owned.h"
#include "qzacl_acl/posix_acl.h"
#include "qzacl_utils/file_bytes.h"
#include "report.h"
#include "trace_points.h"

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <sys/stat.h>

using namespace qz;

namespace {

// A file that this call created. It is removed at the end of the scope unless it is kept, and only if its name still
// leads to the file that is open.
class made_file {
public:
    made_file(const char *name, descriptor file) : name_(name), file_(std::move(file)) {}
    made_file(const made_file &) = delete;
    made_file &operator=(const made_file &) = delete;
    ~made_file() {
        struct stat held = {};
        struct stat named = {};
        if (!is_kept_ && file_ && fstat(file_.get(), &held) == 0 && lstat(name_, &named) == 0 &&
            same_file(held, named))
            unlink(name_);
    }

    explicit operator bool() const { return static_cast<bool>(file_); }
    int fd() const { return file_.get(); }
    void keep() { is_kept_ = true; }

private:
    const char *name_;
    descriptor file_;
    bool is_kept_ = false;
};

int cannot_open(const char *name) { return report(SEC_S_FILE_ERROR, msg::cannot_open_for_writing, name); }

int cannot_protect(const char *cache_name, const struct stat &text) {
    const auto bits = static_cast<int>(text.st_mode & permission_bits);
    return report(SEC_S_FILE_ERROR, msg::cannot_set_mode, cache_name, bits);
}

// Creates the temporary file. Its name is the ACL file's, a '.', and four digits, plus four more for each name that is
// taken. On failure `name` is the last one tried.
descriptor create_temporary(const char *aclfname, path_buffer &name) {
    constexpr std::size_t digits = 4;
    std::size_t length = std::strlen(aclfname);
    std::memcpy(name.text, aclfname, length);
    name.text[length++] = '.';
    name.text[length] = '\0';
    while (length + digits <= path_max) {
        auto state = static_cast<unsigned>(read_counter() >> 32);
        const unsigned drawn = static_cast<unsigned>(rand_r(&state)) & 0xffff;
        std::snprintf(name.text + length, digits + 1, "%04x", drawn);
        length += digits;

        struct stat status = {};
        if (stat(name.text, &status) == 0)
            continue;
        if (errno != ENOENT)
            return {};
        descriptor file = open_file(name.text, O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW);
        // The name may have been taken since, or be that of a dangling symbolic link.
        if (file || errno != EEXIST)
            return file;
    }
    return {};
}

int cannot_write(ssize_t count, const sec_acl_buffer_t &acl) {
    return report(SEC_S_FILE_ERROR, msg::short_write, static_cast<int>(count), acl.length, errno);
}

// Writes one cache, step by step. Each step returns SEC_S_OK, or the result of the whole operation.
class cache_writer {
public:
    cache_writer(const char *aclfname, const text_origin &origin) : aclfname_(aclfname), origin_(origin) {}

    int name_cache();
    int examine_text() { return text_.examine(aclfname_, origin_); }
    int examine_cache(cache_rewriting rewriting);
    int replace(const sec_acl_buffer_t &acl);

private:
    descriptor open_cache() const;
    int vet_opened_cache(int fd) const;
    int write_and_rename(const sec_acl_buffer_t &acl);
    int fill(int fd, const sec_acl_buffer_t &acl) const;
    int protect(int fd) const;

    const char *aclfname_;
    const text_origin &origin_;
    path_buffer cache_name_;
    path_buffer temporary_name_;
    text_protection text_;
    struct stat cache_ = {};
    bool is_new_ = false;
};

int cache_writer::name_cache() {
    const std::size_t length = std::strlen(aclfname_);
    if (length < uncached_path_length && make_cache_name(aclfname_, cache_name_))
        return SEC_S_OK;
    trace(point::name_too_long_for_cache, aclfname_, shown_size(length));
    return report(SEC_S_FILE_ERROR, msg::name_too_long_for_cache, aclfname_);
}

int cache_writer::examine_cache(cache_rewriting rewriting) {
    is_new_ = stat(cache_name_.text, &cache_) != 0;
    if (is_new_) {
        if (errno != ENOENT)
            return query_failed(cache_name_.text, "stat()", aclfname_, errno);
        trace(point::cache_is_new, cache_name_.text);
        return SEC_S_OK;
    }
    if (const int result = text_.vet_cache(aclfname_, cache_name_.text, cache_); result != SEC_S_OK)
        return result;
    if (rewriting == cache_rewriting::unless_current && text_.status.st_mtime < cache_.st_mtime)
        return SEC_S_ADVISORY;
    return SEC_S_OK;
}

descriptor cache_writer::open_cache() const {
    if (!is_new_)
        return open_vetted(cache_name_.text, O_WRONLY, cache_);
    return open_file(cache_name_.text, O_WRONLY | O_CREAT | O_EXCL);
}

// For a new cache this is the empty file that holds its name until it is complete.
int cache_writer::vet_opened_cache(int fd) const {
    if (is_new_)
        return remove_posix_acl(fd) ? SEC_S_OK : cannot_protect(cache_name_.text, text_.status);
    return text_.vet_opened_cache(aclfname_, cache_name_.text, fd);
}

int cache_writer::replace(const sec_acl_buffer_t &acl) {
    made_file placeholder(cache_name_.text, open_cache());
    if (!placeholder)
        return cannot_open(cache_name_.text);
    if (!is_new_)
        placeholder.keep();
    int result = vet_opened_cache(placeholder.fd());
    if (result == SEC_S_OK)
        result = acl__lock_acl_file(cache_name_.text, placeholder.fd(), lock_purpose::replacing);
    if (result == SEC_S_OK)
        result = write_and_rename(acl);
    if (result == SEC_S_OK)
        placeholder.keep();
    return result;
}

int cache_writer::write_and_rename(const sec_acl_buffer_t &acl) {
    made_file temporary(temporary_name_.text, create_temporary(aclfname_, temporary_name_));
    if (!temporary)
        return cannot_open(temporary_name_.text);
    if (const int result = fill(temporary.fd(), acl); result != SEC_S_OK)
        return result;
    if (rename(temporary_name_.text, cache_name_.text) != 0)
        return report(SEC_S_FILE_ERROR, msg::cannot_rename_cache, temporary_name_.text, cache_name_.text);
    temporary.keep();
    return SEC_S_OK;
}

// The bytes must be on disk before the file gets its final name. Syncing takes long, so it comes after all that may
// fail.
int cache_writer::fill(int fd, const sec_acl_buffer_t &acl) const {
    const timespec times[2] = {origin_.time, origin_.time};
    errno = 0; // a write that is cut short sets none
    const ssize_t count = limited_write(fd, acl.data, static_cast<std::size_t>(acl.length));
    if (count != acl.length || futimens(fd, times) != 0)
        return cannot_write(count, acl);
    if (const int result = protect(fd); result != SEC_S_OK)
        return result;
    return fdatasync(fd) == 0 ? SEC_S_OK : cannot_write(count, acl);
}

// At no time may anyone but the owner write the file who cannot write the text. So its mode is 0 while the POSIX ACL
// inherited from the directory is removed and the owner changes. The mode comes last, because fchown clears some of its
// bits. Its group bits already match the mask of the POSIX ACL.
int cache_writer::protect(int fd) const {
    if (!remove_posix_acl(fd))
        return cannot_protect(cache_name_.text, text_.status);
    if (fchown(fd, text_.status.st_uid, text_.status.st_gid) != 0) {
        char user_id[16];
        std::snprintf(user_id, sizeof user_id, "%u", static_cast<unsigned>(text_.status.st_uid));
        return report(SEC_S_FILE_ERROR, msg::cannot_set_owner, cache_name_.text, user_id,
                      static_cast<int>(text_.status.st_gid));
    }
    if (!text_.entries.give_to(fd) || fchmod(fd, text_.status.st_mode & permission_bits) != 0)
        return cannot_protect(cache_name_.text, text_.status);
    return SEC_S_OK;
}

} // namespace

int sec__cache_aclbuffer(const char *aclfname, const sec_acl_buffer_t *acl, cache_rewriting rewriting,
                         const text_origin &origin) {
    if (acl->length == 0) {
        trace(point::nothing_to_cache, aclfname);
        return SEC_S_ADVISORY;
    }
    cache_writer writer(aclfname, origin);
    int result = writer.name_cache();
    if (result == SEC_S_OK)
        result = writer.examine_text();
    if (result == SEC_S_OK)
        result = writer.examine_cache(rewriting);
    if (result == SEC_S_OK)
        result = writer.replace(*acl);
    return result;
}
