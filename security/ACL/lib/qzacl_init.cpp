// The state that the library keeps for its process.
#include "qzacl_init.h"

acl_state_t acl__state;
pthread_once_t acl__init_once_block = PTHREAD_ONCE_INIT;

void acl__state_init() {
    acl__state = {};
    pthread_mutex_init(&acl__state.lock, nullptr);
}
