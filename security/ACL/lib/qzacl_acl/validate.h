// Checking the structure of a compiled buffer.
#ifndef QZACL_VALIDATE_H
#define QZACL_VALIDATE_H

#include "qz/acl.h"

// Checks a buffer in host order. Returns SEC_S_OK, SEC_S_BAD_ACL for the first structural fault, or SEC_S_BAD_ACLE
// if only entries are faulty. Never reads outside the descriptor's bytes.
int sec__check_acl_buffer(const sec_acl_buffer_t *acl);

#endif
