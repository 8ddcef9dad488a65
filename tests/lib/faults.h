// Intercepts allocations and system calls: counts them, and lets tests fail them, cut them short, or act before them.
// The linker redirects the calls of the layers and the tests to this file (see CMakeLists.txt).
#ifndef QZ_TESTS_FAULTS_H
#define QZ_TESTS_FAULTS_H

#include "qz/cu.h"

#include <cerrno>
#include <cstring>
#include <fcntl.h>
#include <functional>
#include <optional>
#include <pwd.h>
#include <string>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>
#include <vector>

namespace faults {

struct allocations_seen {
    std::size_t count = 0;
    std::size_t fails_at = 0; // from 1; 0 fails none
    bool fails_on = false;    // and all later ones, too
    std::ptrdiff_t live = 0;
    std::size_t refused = 0; // bytes that the last one to fail asked for
};
inline thread_local allocations_seen allocations; // of this thread

// What a call does: nothing special, transfer less than requested, or fail with an errno value.
constexpr int no_fault = 0;
constexpr int short_transfer = -1;

inline bool is_watching = false;
inline std::vector<std::string> calls;
inline std::string opened;                       // the name in the latest call of open
inline std::function<int(std::size_t)> fault_of; // by the place in `calls` of the next call

// The answer of the user database instead: a result, and the user's name; null if there is no such user.
inline std::optional<std::pair<int, const char *>> answer;
inline std::string home; // of every user

inline int next(const char *name) {
    if (!is_watching)
        return no_fault;
    is_watching = false; // calls of the test itself do not count
    calls.emplace_back(name);
    const int fault = fault_of ? fault_of(calls.size() - 1) : no_fault;
    is_watching = true;
    if (fault > 0)
        errno = fault;
    return fault;
}

// Runs something with its system calls watched.
template <class Call>
auto watched(const std::function<int(std::size_t)> &fault, const Call &call) {
    calls.clear();
    fault_of = fault;
    is_watching = true;
    auto result = call();
    is_watching = false;
    return result;
}

// Fails each allocation of a step in turn until the step succeeds: a failed attempt must change nothing.
template <class Step>
int patiently(Step step) {
    for (std::size_t failing = 1;; ++failing) {
        allocations = {.fails_at = failing};
        const int result = step();
        const bool is_refused = allocations.count >= failing;
        allocations = {};
        if (result != CU_NO_MEMORY || !is_refused)
            return result;
        cu_set_no_error_1();
    }
}

inline bool fails_now(std::size_t size) {
    allocations_seen &all = allocations;
    ++all.count;
    const bool is_behind = all.fails_on && all.count > all.fails_at;
    const bool fails = all.fails_at != 0 && (all.count == all.fails_at || is_behind);
    if (fails)
        all.refused = size;
    return fails;
}

inline void *counted(void *made) {
    allocations.live += made != nullptr;
    return made;
}

} // namespace faults

// The linker knows a call under several names, for large files and late times. A C library may lack some; the code
// under test uses one of them.
#define QZ_WRAPPED(result, name, parameters)                                                                 \
    [[gnu::weak]] result __real_##name parameters;                                                           \
    [[gnu::used]] inline result __wrap_##name parameters
// A call that fails with -1, and one that may also transfer less than requested.
#define QZ_WRAPPED_AS(called, name, parameters, arguments)                                                   \
    QZ_WRAPPED(int, name, parameters) { return faults::next(called) > 0 ? -1 : __real_##name arguments; }
#define QZ_WRAPPED_CALL(name, parameters, arguments) QZ_WRAPPED_AS(#name, name, parameters, arguments)
#define QZ_WRAPPED_STATUS(name, parameters, arguments)                                                       \
    QZ_WRAPPED_AS(#name, name, parameters, arguments)                                                        \
    QZ_WRAPPED_AS(#name, name##64, parameters, arguments)                                                    \
    QZ_WRAPPED_AS(#name, __##name##64_time64, parameters, arguments)
// Opening, and its fortified form without a mode.
#define QZ_WRAPPED_OPEN(name, fortified)                                                                     \
    QZ_WRAPPED(int, name, (const char *path, int flags, mode_t mode)) {                                      \
        if (faults::is_watching)                                                                             \
            faults::opened = path;                                                                           \
        return faults::next("open") > 0 ? -1 : __real_##name(path, flags, mode);                             \
    }                                                                                                        \
    [[gnu::used]] inline int __wrap_##fortified(const char *path, int flags) {                               \
        return __wrap_##name(path, flags, 0);                                                                \
    }
#define QZ_WRAPPED_TRANSFER(name, memory)                                                                    \
    QZ_WRAPPED(ssize_t, name, (int fd, memory bytes, size_t size)) {                                         \
        const int fault = faults::next(#name);                                                               \
        return fault > 0 ? -1 : __real_##name(fd, bytes, fault < 0 ? size - 1 : size);                       \
    }

extern "C" {

QZ_WRAPPED(void *, malloc, (size_t size)) {
    return faults::counted(faults::fails_now(size) ? nullptr : __real_malloc(size));
}
QZ_WRAPPED(void *, calloc, (size_t count, size_t size)) {
    return faults::counted(faults::fails_now(count * size) ? nullptr : __real_calloc(count, size));
}
QZ_WRAPPED(void *, realloc, (void *old, size_t size)) {
    void *made = faults::fails_now(size) ? nullptr : __real_realloc(old, size);
    return old == nullptr ? faults::counted(made) : made;
}
QZ_WRAPPED(char *, strdup, (const char *text)) {
    void *made = faults::fails_now(strlen(text) + 1) ? nullptr : __real_strdup(text);
    return static_cast<char *>(faults::counted(made));
}
QZ_WRAPPED(void, free, (void *memory)) {
    faults::allocations.live -= memory != nullptr;
    __real_free(memory);
}

QZ_WRAPPED_STATUS(stat, (const char *path, struct stat *out), (path, out))
QZ_WRAPPED_STATUS(lstat, (const char *path, struct stat *out), (path, out))
QZ_WRAPPED_STATUS(fstat, (int fd, struct stat *out), (fd, out))
QZ_WRAPPED_OPEN(open, __open_2)
QZ_WRAPPED_OPEN(open64, __open64_2)
QZ_WRAPPED_CALL(fchown, (int fd, uid_t user, gid_t group), (fd, user, group))
QZ_WRAPPED_CALL(fchmod, (int fd, mode_t mode), (fd, mode))
QZ_WRAPPED_CALL(futimens, (int fd, const timespec *times), (fd, times))
QZ_WRAPPED_AS("futimens", __futimens64, (int fd, const timespec *times), (fd, times))
QZ_WRAPPED_CALL(fdatasync, (int fd), (fd))
QZ_WRAPPED_CALL(rename, (const char *from, const char *to), (from, to))
QZ_WRAPPED_CALL(unlink, (const char *path), (path))
QZ_WRAPPED_CALL(fsetxattr, (int fd, const char *name, const void *value, size_t size, int flags),
                (fd, name, value, size, flags))
QZ_WRAPPED_CALL(fremovexattr, (int fd, const char *name), (fd, name))
QZ_WRAPPED(ssize_t, getxattr, (const char *path, const char *name, void *value, size_t size)) {
    return faults::next("getxattr") > 0 ? -1 : __real_getxattr(path, name, value, size);
}
QZ_WRAPPED(ssize_t, fgetxattr, (int fd, const char *name, void *value, size_t size)) {
    return faults::next("fgetxattr") > 0 ? -1 : __real_fgetxattr(fd, name, value, size);
}
QZ_WRAPPED_TRANSFER(read, void *)
// The fortified form of read().
[[gnu::used]] inline ssize_t __wrap___read_chk(int fd, void *bytes, size_t size, size_t /*room*/) {
    return __wrap_read(fd, bytes, size);
}
QZ_WRAPPED_TRANSFER(write, const void *)
QZ_WRAPPED(int, close, (int fd)) { // closes even if it fails
    const bool fails = faults::next("close") > 0;
    const int result = __real_close(fd);
    return fails ? -1 : result;
}
QZ_WRAPPED(char *, getcwd, (char *path, size_t size)) {
    return faults::next("getcwd") > 0 ? nullptr : __real_getcwd(path, size);
}
QZ_WRAPPED(int, getpwnam_r, (const char *name, passwd *entry, char *memory, size_t size, passwd **found)) {
    const int fault = faults::next("getpwnam_r");
    const int result = __real_getpwnam_r(name, entry, memory, size, found);
    entry->pw_dir = faults::home.data();
    if (faults::answer) {
        entry->pw_name = const_cast<char *>(faults::answer->second);
        entry->pw_uid = 4242;
        *found = entry->pw_name == nullptr ? nullptr : entry;
        return faults::answer->first;
    }
    if (fault > 0)
        *found = nullptr;
    return fault > 0 ? fault : result;
}

} // extern "C"

#endif
