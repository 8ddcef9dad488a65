// Whole compiled buffers: finding a sub-ACL.
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
        // Most have the same letter case.
        if (field[index] != wanted && fold(field[index]) != fold(wanted))
            return false;
        if (wanted == '\0')
            return true;
    }
    return false;
}

// A sub-ACL in a buffer.
struct stored_subacl {
    bool is_there = false;
    std::size_t offset = 0; // of its start
    format::subacl head;
};

} // namespace qz

// Steps to the first sub-ACL of a type and, for types 4 and 8, of a mechanism in any letter case; other types ignore
// `mechanism`. False if it is not found before the bytes end.
inline bool sec__find_subacl(qz::format::subacl_walk &walk, std::uint8_t type, const char *mechanism) {
    while (walk.next() == qz::format::subacl_walk::step::found) {
        const qz::format::subacl &head = walk.current();
        if (head.type == type && (!qz::has_mechanism(type) || qz::holds_mechanism(head.mechanism, mechanism)))
            return true;
    }
    return false;
}

// The same for functions that change or copy the sub-ACL.
inline qz::stored_subacl sec__find_subacl(const sec_acl_buffer_t &acl, std::uint8_t type,
                                          const char *mechanism) {
    const qz::byte_span bytes = qz::format::bytes_of(acl);
    qz::format::subacl_walk walk(bytes);
    qz::stored_subacl found;
    found.is_there = sec__find_subacl(walk, type, mechanism);
    if (found.is_there) {
        found.offset = static_cast<std::size_t>(walk.bytes().data() - bytes.data());
        found.head = walk.current();
    }
    return found;
}

#endif
