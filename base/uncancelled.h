// Keeps a thread that is to be cancelled going until an operation has given back what it holds.
#ifndef QZ_UNCANCELLED_H
#define QZ_UNCANCELLED_H

#include <pthread.h>

namespace qz {

// Disables the cancellation of the thread for its scope. Such scopes may lie within each other.
class uncancelled {
public:
    uncancelled() { pthread_setcancelstate(PTHREAD_CANCEL_DISABLE, &before_); }
    ~uncancelled() { pthread_setcancelstate(before_, nullptr); }
    uncancelled(const uncancelled &) = delete;
    uncancelled &operator=(const uncancelled &) = delete;

private:
    int before_ = PTHREAD_CANCEL_ENABLE;
};

} // namespace qz

#endif
