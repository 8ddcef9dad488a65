// Identity handlers: the comparison functions that services register for their mechanisms.
#ifndef QZACL_ID_HANDLERS_H
#define QZACL_ID_HANDLERS_H

#include "qz/acl.h"

#include <cstdint>

// Finds the handler that was registered first for a kind and a mechanism in any letter case; null when there
// is none. Returns SEC_S_OK, or SEC_S_INTERNAL when the state cannot
// be locked or unlocked, in the latter case with the handler in place.
int sec__get_id_handler(std::uint32_t kind, const char *mechanism, sec_id_compare_fn *handler);

#endif
