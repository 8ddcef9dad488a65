// Whether a cache belongs to its text.
#include "qzacl_acl/cache_vetting.h"

#include "qz/acl.h"
#include "qzacl_utils/file_bytes.h"
#include "report.h"
#include "trace_points.h"

#include <cerrno>

using namespace qz;

namespace {

bool has_same_owner(const struct stat &text, const struct stat &cache) {
    return text.st_uid == cache.st_uid && text.st_gid == cache.st_gid;
}

bool has_same_permissions(const struct stat &text, const struct stat &cache) {
    return ((text.st_mode ^ cache.st_mode) & permission_bits) == 0;
}

// True when the name still leads to the examined file, with the same owner, group and mode. Otherwise sets errno, to
// ESTALE for another file.
bool is_unchanged(const char *path, const struct stat &examined) {
    struct stat now = {};
    if (stat(path, &now) != 0)
        return false;
    errno = ESTALE;
    return same_file(now, examined) && has_same_owner(now, examined) && now.st_mode == examined.st_mode;
}

// True when the text is the one that was read, or is so new that a cache of what was read will not be used. Copying
// another file over it keeps the inode.
bool is_text_of(const struct stat &status, const text_origin &origin) {
    return same_file(status, origin.file) && S_ISREG(status.st_mode) &&
           (has_same_times(status, origin.file) || status.st_mtime >= origin.time.tv_sec);
}

int owner_differs(const char *aclfname, const char *cache_name, const struct stat &text,
                  const struct stat &cache) {
    trace(point::cache_owner_differs, cache_name, cache.st_uid, cache.st_gid, text.st_uid, text.st_gid);
    return report(SEC_S_FILE_ERROR, msg::cache_owner_differs, aclfname);
}

int mode_differs(const char *aclfname, const char *cache_name, const struct stat &text,
                 const struct stat &cache) {
    trace(point::cache_mode_differs, cache_name, cache.st_mode & permission_bits,
          text.st_mode & permission_bits);
    return report(SEC_S_FILE_ERROR, msg::cache_mode_differs, aclfname);
}

void trace_unlike(const vetted_file &text, const vetted_file &cache) {
    trace(point::cache_unlike_text, text.path.text, text.status.st_uid, text.status.st_gid,
          cache.status.st_uid, cache.status.st_gid, text.status.st_mode, cache.status.st_mode);
}

} // namespace

namespace qz {

text_origin::text_origin(const struct stat &vetted) : file(vetted), time() {
    // The kernel takes file times from this clock or a finer one, so none is earlier than it.
    clock_gettime(CLOCK_REALTIME_COARSE, &time);
}

bool cache_is_current(const vetted_file &text, vetted_file &cache) {
    if (!make_cache_name(text.path.text, cache.path))
        return false;
    trace(point::examining_cache, cache.path.text);
    if (stat(cache.path.text, &cache.status) != 0) {
        trace(point::cache_not_examined, cache.path.text, errno);
        return false;
    }
    if (cache.status.st_size == 0 || cache.status.st_mtime <= text.status.st_mtime) {
        trace(point::cache_not_current, cache.path.text);
        return false;
    }
    if (has_same_owner(text.status, cache.status) && has_same_permissions(text.status, cache.status))
        return true;
    trace_unlike(text, cache);
    return false;
}

bool cache_has_entries_of_text(const vetted_file &text, const vetted_file &cache, int cache_fd) {
    posix_acl of_cache;
    posix_acl of_text;
    // The group bits are the mask of the POSIX ACL. If they deny writing, only the owner can have written the cache.
    // Otherwise the POSIX ACL must be that of the very file that was vetted.
    const bool is_writable = (text.status.st_mode & S_IWGRP) != 0;
    if (of_cache.read(cache_fd) && of_text.read(text.path.text) && of_cache == of_text &&
        (!is_writable || is_unchanged(text.path.text, text.status)))
        return true;
    trace_unlike(text, cache);
    return false;
}

int text_protection::examine(const char *aclfname, const text_origin &origin) {
    if (stat(aclfname, &status) != 0)
        return query_failed(aclfname, "stat()", aclfname, errno);
    if (!is_text_of(status, origin))
        return query_failed(aclfname, "stat()", aclfname, ESTALE);
    if (!entries.read(aclfname))
        return query_failed(aclfname, "getxattr()", aclfname, errno);
    // The POSIX ACL must be of the same file as the owner and mode that the cache gets.
    if (!is_unchanged(aclfname, status))
        return query_failed(aclfname, "stat()", aclfname, errno);
    return SEC_S_OK;
}

int text_protection::vet_cache(const char *aclfname, const char *cache_name, const struct stat &cache) const {
    if (!has_same_owner(status, cache))
        return owner_differs(aclfname, cache_name, status, cache);
    if (cache.st_mode != status.st_mode)
        return mode_differs(aclfname, cache_name, status, cache);
    return SEC_S_OK;
}

int text_protection::vet_opened_cache(const char *aclfname, const char *cache_name, int cache_fd) const {
    posix_acl of_cache;
    if (of_cache.read(cache_fd) && of_cache == entries)
        return SEC_S_OK;
    // The mode bits are the same, but the POSIX ACL is part of the mode.
    return mode_differs(aclfname, cache_name, status, status);
}

int query_failed(const char *queried, const char *call, const char *aclfname, int error) {
    trace(point::query_failed, queried, call, error);
    return report(SEC_S_FILE_ERROR, msg::bad_file_name, aclfname, error);
}

} // namespace qz
