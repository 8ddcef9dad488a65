// Restores errno at the end of a scope, for functions that must not change it.
#ifndef QZ_KEPT_ERRNO_H
#define QZ_KEPT_ERRNO_H

#include <cerrno>

namespace qz {

class kept_errno {
public:
    kept_errno() = default;
    ~kept_errno() { errno = saved_; }
    kept_errno(const kept_errno &) = delete;
    kept_errno &operator=(const kept_errno &) = delete;

private:
    const int saved_ = errno;
};

} // namespace qz

#endif
