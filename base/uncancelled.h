// Defers the cancellation of a thread until an operation has released its resources.
#ifndef QZ_UNCANCELLED_H
#define QZ_UNCANCELLED_H

#include <pthread.h>

namespace qz {

// Disables cancellation of the thread for its scope. Scopes nest.
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
