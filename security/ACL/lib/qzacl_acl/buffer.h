// Whole compiled buffers: finding one sub-ACL in them.
#ifndef QZACL_BUFFER_H
#define QZACL_BUFFER_H

#include "qz/acl.h"
#include "qzacl_acl/buffer_format.h"

#include <cstddef>
#include <cstdint>

namespace qz {

// A sub-ACL where it stands in a buffer.
struct stored_subacl {
    bool is_there = false;
    std::size_t offset = 0; // of its start
    format::subacl head;
    byte_reader entries; // stands before the first one, and reaches to the end of the buffer
};

} // namespace qz

// Finds the first sub-ACL of a type and, for types 4 and 8, of a mechanism in any letter case; for the other
// types `mechanism` is not looked at. There is none where the bytes end before it is found.
qz::stored_subacl sec__find_subacl(const sec_acl_buffer_t *acl, std::uint8_t type, const char *mechanism);

#endif
