// The file to edit.
#include "edited_file.h"

#include "qzacl_utils/file_bytes.h"
#include "whole_file.h"

#include <cerrno>
#include <climits>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <memory>
#include <unistd.h>

using namespace qz;

namespace qzacl {

namespace {

constexpr int reading = O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC;

bool same_time(const timespec &one, const timespec &other) {
    return one.tv_sec == other.tv_sec && one.tv_nsec == other.tv_nsec;
}

} // namespace

system_failure::system_failure(const std::string &what) : trouble(what + ": " + strerror(errno)) {}

edited_file::edited_file(const std::string &path) : path_(path) {
    const owned<char> real(realpath(path.c_str(), nullptr));
    if (real == nullptr)
        throw system_failure("cannot find " + path);
    const std::string found = real.get();
    const std::size_t slash = found.rfind('/');
    leaf_ = found.substr(slash + 1);
    folder_ = descriptor(open(found.substr(0, slash + 1).c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (!folder_)
        throw system_failure("cannot open the folder of " + path);
}

void edited_file::read() {
    // Tries again if the file is replaced by rename between these two calls.
    constexpr int most_attempts = 50;
    for (int left = most_attempts; left != 0; --left) {
        file_ = descriptor(openat(folder_.get(), leaf_.c_str(), reading));
        if (!file_)
            throw system_failure("cannot open " + path_);
        if (fstat(file_.get(), &status_) != 0)
            throw system_failure("cannot examine " + path_);
        if (status_.st_nlink != 0)
            break;
    }
    if (!S_ISREG(status_.st_mode))
        throw trouble(path_ + " is no regular file");
    if (status_.st_nlink != 1)
        throw trouble(path_ + " has several names, of which a change would reach one only");
    text_ = read_whole(file_.get(), path_);
}

bool edited_file::is_as_read() const {
    struct stat now = {};
    return fstatat(folder_.get(), leaf_.c_str(), &now, AT_SYMLINK_NOFOLLOW) == 0 && same_file(now, status_) &&
           now.st_size == status_.st_size && same_time(now.st_mtim, status_.st_mtim) &&
           same_time(now.st_ctim, status_.st_ctim);
}

} // namespace qzacl
