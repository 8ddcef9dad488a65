// The library's one process-wide state.
#include "qzacl_init.h"

acl_state_t acl__state;
pthread_once_t acl__init_once_block = PTHREAD_ONCE_INIT;

void acl__state_init() {
    acl__state = {};
    pthread_mutex_init(&acl__state.lock, nullptr);
}

namespace {

// Initializes the state first, so that no thread is doing so while the process forks.
void lock() {
    pthread_once(&acl__init_once_block, acl__state_init);
    pthread_mutex_lock(&acl__state.lock);
}
void unlock() { pthread_mutex_unlock(&acl__state.lock); }

// Otherwise a child forked while another thread looks up a handler would wait forever for a thread that it does not
// have.
[[gnu::constructor]] void keep_free_over_fork() { pthread_atfork(lock, unlock, unlock); }

} // namespace
