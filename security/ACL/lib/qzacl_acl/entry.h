// Entries of an ACL: their types, and the record that holds one in memory.
#ifndef QZACL_ENTRY_H
#define QZACL_ENTRY_H

#include "qz/acl.h"

#include <cstddef>
#include <cstdint>
#include <memory>

namespace qz {

// The longest mechanism mnemonic, without its NUL.
inline constexpr std::size_t mechanism_max = 16;
static_assert(sizeof(sec_acle_t::mechanism) == mechanism_max + 1);

constexpr bool is_acle_type(unsigned type) {
    return type == SEC_ACLE_UNAUTHENTICATED || type == SEC_ACLE_ANYOTHER || type == SEC_ACLE_USER ||
           type == SEC_ACLE_EXPANDED || type == SEC_ACLE_GROUP;
}

// Types of which an ACL holds at most one entry.
constexpr bool is_single_type(unsigned type) {
    return type == SEC_ACLE_UNAUTHENTICATED || type == SEC_ACLE_ANYOTHER;
}

constexpr bool has_mechanism(unsigned type) { return type == SEC_ACLE_USER || type == SEC_ACLE_EXPANDED; }

constexpr bool has_identity(unsigned type) { return has_mechanism(type) || type == SEC_ACLE_GROUP; }

// The letter of a type in an ACL file, always in lower case; '?' for a value that is no type.
constexpr int type_letter(unsigned type) {
    switch (type) {
    case SEC_ACLE_UNAUTHENTICATED:
        return 'n';
    case SEC_ACLE_ANYOTHER:
        return 'o';
    case SEC_ACLE_USER:
        return 'u';
    case SEC_ACLE_EXPANDED:
        return 'e';
    case SEC_ACLE_GROUP:
        return 'g';
    default:
        return '?';
    }
}

} // namespace qz

// Records the trace points of releasing an entry, which may be null: also for entries that others hold memory
// for.
void sec__trace_release(const sec_acle_t *acle);

// Makes an entry whose arguments were checked by the caller: a mechanism of at most 16 bytes for types 4 and
// 8, an identity for types 4, 8 and 16. With `convert` non-zero both are converted to UTF-8. Returns SEC_S_OK
// with a new entry in `*acle`, or the code of the failed allocation or conversion with null there.
int sec__create_acle(std::uint8_t type, std::uint32_t perm_mask, const char *mechanism, const char *identity,
                     int convert, sec_acle_t **acle);

#endif
