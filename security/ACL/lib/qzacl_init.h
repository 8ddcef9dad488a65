// The library's one process-wide state: the table of identity handlers and its lock.
#ifndef QZACL_INIT_H
#define QZACL_INIT_H

#include "qz/acl.h"

#include <cstdint>
#include <pthread.h>

struct sec_id_handler_t {
    std::uint32_t kind;
    char mechanism[17];
    sec_id_compare_fn handler;
};

struct acl_state_t {
    pthread_mutex_t lock;
    std::int32_t handler_count;
    sec_id_handler_t *handlers; // in order of registration; grows and is never freed
};

extern acl_state_t acl__state;
extern pthread_once_t acl__init_once_block;

// Initializes the state. Every operation that uses it calls this through acl__init_once_block.
void acl__state_init();

#endif
