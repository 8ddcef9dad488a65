// Identity handlers: the comparison functions that services register for their mechanisms.
#ifndef QZACL_ID_HANDLERS_H
#define QZACL_ID_HANDLERS_H

#include "qz/acl.h"

#include <cstdint>

// Finds the first handler registered for a kind and a mechanism in any letter case, or null. The state must be
// initialized. Returns SEC_S_OK, or SEC_S_INTERNAL if the state cannot be locked or unlocked; in the latter case the
// handler is set.
int sec__get_id_handler(std::uint32_t kind, const char *mechanism, sec_id_compare_fn *handler);

#endif
