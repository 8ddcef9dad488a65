// Whole compiled buffers: finding a sub-ACL.
#ifndef QZACL_BUFFER_H
#define QZACL_BUFFER_H

#include "qz/acl.h"
#include "qzacl_acl/buffer_format.h"

#include <cstddef>
#include <cstdint>

// Finds the first sub-ACL of a type and, for types 4 and 8, of a mechanism in any letter case; other types ignore
// `mechanism`. Sets `*subacl` to its start, or to null if it is not found before the bytes end. Always returns
// SEC_S_OK.
int sec__find_subacl(const sec_acl_buffer_t *acl, std::uint8_t type, const char *mechanism,
                     const unsigned char **subacl);

namespace qz {

// A sub-ACL in a buffer.
struct stored_subacl {
    bool is_there = false;
    std::size_t offset = 0; // of its start
    format::subacl head;
};

// The same, and reads its header. `entries` then starts at the first entry and reaches to the end of the buffer.
// Inline, and the header is read again: a decision among few entries would otherwise spend a third of its time on
// loading what the search has just stored.
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

// The same for functions that change or copy the sub-ACL.
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
