// The lock that edits of a file take in turn: FILE.lock beside it. It is held with flock, so the lock of a killed
// edit is free, and removed while it is held.
#ifndef QZACL_LOCK_FILE_H
#define QZACL_LOCK_FILE_H

#include "base/owned.h"
#include "edited_file.h"

#include <chrono>
#include <csignal>
#include <string>

namespace qzacl {

class lock_file {
public:
    // Takes the lock of a file that was read. Throws trouble if that fails or takes too long.
    lock_file(const edited_file &file, std::chrono::seconds wait);
    lock_file(const lock_file &) = delete;
    lock_file &operator=(const lock_file &) = delete;
    ~lock_file();

private:
    bool open_or_make(const edited_file &file);
    bool is_named() const;

    int folder_;
    std::string name_;
    qz::descriptor file_;
    // While the lock is held, signals that would end the command are blocked, so that nothing is left half done.
    sigset_t signals_before_ = {};
};

} // namespace qzacl

#endif
