// Whole compiled buffers: finding one sub-ACL in them.
#ifndef QZACL_BUFFER_H
#define QZACL_BUFFER_H

#include "base/posix_fold.h"
#include "qz/acl.h"
#include "qzacl_acl/buffer_format.h"
#include "qzacl_acl/entry.h"

#include <cstddef>
#include <cstdint>

namespace qz {

// True when a sub-ACL's field holds the mechanism, in any letter case.
inline bool holds_mechanism(byte_span field, const char *mechanism) {
    for (std::size_t index = 0; index < field.size(); ++index) {
        const auto wanted = static_cast<unsigned char>(mechanism[index]);
        // Most are spelled alike.
        if (field[index] != wanted && fold(field[index]) != fold(wanted))
            return false;
        if (wanted == '\0')
            return true;
    }
    return false;
}

// Steps to the first sub-ACL of a type and, for types 4 and 8, of a mechanism in any letter case; for the other types
// `mechanism` is not looked at. False, also where the bytes end before it is found.
inline bool find_subacl(format::subacl_walk &walk, std::uint8_t type, const char *mechanism) {
    while (walk.next() == format::subacl_walk::step::found) {
        const format::subacl &head = walk.current();
        if (head.type == type && (!has_mechanism(type) || holds_mechanism(head.mechanism, mechanism)))
            return true;
    }
    return false;
}

// A sub-ACL where it stands in a buffer.
struct stored_subacl {
    bool is_there = false;
    std::size_t offset = 0; // of its start
    format::subacl head;
};

// The same for those who change or copy the sub-ACL.
inline stored_subacl find_subacl(const sec_acl_buffer_t &acl, std::uint8_t type, const char *mechanism) {
    const byte_span bytes = format::bytes_of(acl);
    format::subacl_walk walk(bytes);
    stored_subacl found;
    found.is_there = find_subacl(walk, type, mechanism);
    if (found.is_there) {
        found.offset = static_cast<std::size_t>(walk.bytes().data() - bytes.data());
        found.head = walk.current();
    }
    return found;
}

} // namespace qz

#endif
