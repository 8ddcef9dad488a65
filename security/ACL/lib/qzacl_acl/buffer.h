// Whole compiled buffers: finding one sub-ACL in them.
#ifndef QZACL_BUFFER_H
#define QZACL_BUFFER_H

#include "qz/acl.h"
#include "qzacl_acl/buffer_format.h"

#include <cstddef>
#include <cstdint>

// Finds the first sub-ACL of a type and, for types 4 and 8, of a mechanism in any letter case; for the other
// types `mechanism` is not looked at. `*subacl` becomes the sub-ACL's start or null, also where the bytes end
// before it is found. Always returns SEC_S_OK.
int sec__find_subacl(const sec_acl_buffer_t *acl, std::uint8_t type, const char *mechanism,
                     const unsigned char **subacl);

namespace qz {

// A sub-ACL where it stands in a buffer.
struct stored_subacl {
    bool is_there = false;
    std::size_t offset = 0; // of its start
    format::subacl head;
};

// The same with what its header says; `entries` then stands before the first entry, and reaches to the end of the
// buffer. Inline, and the header is read once more: a decision among few entries would spend a third of its time on
// fetching from memory what the search has just put there.
[[gnu::always_inline]] inline bool find_subacl(const sec_acl_buffer_t &acl, std::uint8_t type,
                                               const char *mechanism, format::subacl &head,
                                               byte_reader &entries) {
    const unsigned char *start = nullptr;
    sec__find_subacl(&acl, type, mechanism, &start);
    if (start == nullptr)
        return false;
    const byte_span bytes = format::bytes_of(acl);
    entries = byte_reader(bytes.subspan(static_cast<std::size_t>(start - bytes.data())));
    return format::read(entries, head);
}

// The same for those who change or copy the sub-ACL.
inline stored_subacl find_subacl(const sec_acl_buffer_t &acl, std::uint8_t type, const char *mechanism) {
    stored_subacl found;
    byte_reader entries;
    found.is_there = find_subacl(acl, type, mechanism, found.head, entries);
    if (found.is_there)
        found.offset = format::bytes_of(acl).size() - entries.left() - format::subacl_header_size -
                       found.head.mechanism_length;
    return found;
}

} // namespace qz

#endif
