// Checking the structure of a compiled buffer.
#ifndef QZACL_VALIDATE_H
#define QZACL_VALIDATE_H

#include "qz/acl.h"

// Walks over a buffer in host order. Returns SEC_S_OK; SEC_S_BAD_ACL at the first structural fault;
// SEC_S_BAD_ACLE when only entries are at fault. Never looks outside the descriptor's bytes.
int sec__check_acl_buffer(const sec_acl_buffer_t *acl);

#endif
