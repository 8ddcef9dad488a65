// Whole compiled buffers: finding one sub-ACL in them.
#ifndef QZACL_BUFFER_H
#define QZACL_BUFFER_H

#include "qz/acl.h"

#include <cstdint>

// Finds the first sub-ACL of a type and, for types 4 and 8, of a mechanism in any letter case; for the other
// types `mechanism` is not looked at. `*subacl` becomes the sub-ACL's start or null, also where the bytes end
// before it is found. Always returns SEC_S_OK.
int sec__find_subacl(const sec_acl_buffer_t *acl, std::uint8_t type, const char *mechanism,
                     const unsigned char **subacl);

#endif
