// The lock that edits of a file take in turn.
#include "lock_file.h"

#include "qzacl_utils/file_bytes.h"

#include <cerrno>
#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <thread>
#include <unistd.h>

using namespace qz;

namespace qzacl {

namespace {

constexpr mode_t owner_alone = 0600;

} // namespace

lock_file::lock_file(const edited_file &file, std::chrono::seconds wait)
    : folder_(file.folder()), name_(file.leaf() + ".lock") {
    constexpr std::chrono::milliseconds pause(10);
    const auto last_moment = std::chrono::steady_clock::now() + wait;
    for (;;) {
        // The former holder may have removed the file since it was opened here: then a new one is the lock.
        if (open_or_make(file) && flock(file_.get(), LOCK_EX | LOCK_NB) == 0) {
            if (is_named())
                break;
            continue;
        }
        if (file_ && errno != EWOULDBLOCK && errno != EINTR)
            throw system_failure("cannot lock " + file.path() + ".lock");
        if (std::chrono::steady_clock::now() >= last_moment)
            throw trouble("another edit of " + file.path() + " goes on: its lock was not free in time");
        std::this_thread::sleep_for(pause);
    }
    sigset_t all;
    sigfillset(&all);
    sigprocmask(SIG_BLOCK, &all, &signals_before_);
}

// False when the lock was removed at this very moment.
bool lock_file::open_or_make(const edited_file &file) {
    constexpr auto any_group = static_cast<gid_t>(-1);
    constexpr int how = O_RDWR | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC;
    file_ = descriptor(openat(folder_, name_.c_str(), how | O_CREAT | O_EXCL, owner_alone));
    const bool is_new = static_cast<bool>(file_);
    if (!is_new && errno == EEXIST)
        file_ = descriptor(openat(folder_, name_.c_str(), how));
    if (!file_ && errno == ENOENT)
        return false;
    struct stat status = {};
    if (!file_ || fstat(file_.get(), &status) != 0)
        throw system_failure("cannot open " + file.path() + ".lock");
    if (!S_ISREG(status.st_mode) || status.st_nlink > 1)
        throw trouble(file.path() + ".lock is no lock: it is no regular file, or has several names");
    // So that the owner of the file can use the lock if another user's edit is killed.
    if (is_new && (fchown(file_.get(), file.status().st_uid, any_group) != 0 ||
                   fchmod(file_.get(), owner_alone) != 0)) {
        const int error = errno;
        unlinkat(folder_, name_.c_str(), 0);
        errno = error;
        throw system_failure("cannot protect " + file.path() + ".lock");
    }
    return true;
}

bool lock_file::is_named() const {
    struct stat held = {};
    struct stat named = {};
    return fstat(file_.get(), &held) == 0 &&
           fstatat(folder_, name_.c_str(), &named, AT_SYMLINK_NOFOLLOW) == 0 && same_file(held, named);
}

lock_file::~lock_file() {
    if (is_named())
        unlinkat(folder_, name_.c_str(), 0);
    file_.close();
    sigprocmask(SIG_SETMASK, &signals_before_, nullptr);
}

} // namespace qzacl
