// Keeps errno as the caller left it, in operations that call what may change it.
#ifndef QZ_CU_KEPT_ERRNO_H
#define QZ_CU_KEPT_ERRNO_H

#include <cerrno>

namespace qz::cu {

class kept_errno {
public:
    kept_errno() = default;
    ~kept_errno() { errno = saved_; }
    kept_errno(const kept_errno &) = delete;
    kept_errno &operator=(const kept_errno &) = delete;

private:
    const int saved_ = errno;
};

} // namespace qz::cu

#endif
