// Entries of an ACL: their types, the record that owns one, and a view that borrows one.
#ifndef QZACL_ENTRY_H
#define QZACL_ENTRY_H

#include "qz/acl.h"

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <memory>
#include <string_view>

namespace qz {

// The longest mechanism mnemonic, without its NUL.
inline constexpr std::size_t mechanism_max = 16;
static_assert(sizeof(sec_acle_t::mechanism) == mechanism_max + 1);

constexpr bool is_acle_type(unsigned type) {
    return type == SEC_ACLE_UNAUTHENTICATED || type == SEC_ACLE_ANYOTHER || type == SEC_ACLE_USER ||
           type == SEC_ACLE_EXPANDED || type == SEC_ACLE_GROUP;
}

// Types with at most one entry per ACL.
constexpr bool is_single_type(unsigned type) {
    return type == SEC_ACLE_UNAUTHENTICATED || type == SEC_ACLE_ANYOTHER;
}

constexpr bool has_mechanism(unsigned type) { return type == SEC_ACLE_USER || type == SEC_ACLE_EXPANDED; }

constexpr bool has_identity(unsigned type) { return has_mechanism(type) || type == SEC_ACLE_GROUP; }

// The letter of a type in an ACL file, in lower case; '?' for an invalid type.
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

inline constexpr char no_text[] = "";

// A borrowed entry. A NUL, which the lengths do not count, follows the identity and, for types that have one, the
// mechanism.
struct acle_view {
    std::uint32_t perm_mask = 0;
    std::uint8_t type = 0;
    std::string_view mechanism = no_text;
    std::string_view identity = no_text;
};

// The view of a record, whose identity may be null.
inline acle_view view_of(const sec_acle_t &acle) {
    return {acle.perm_mask,
            acle.type,
            {acle.mechanism, strnlen(acle.mechanism, mechanism_max)},
            acle.identity == nullptr ? no_text : acle.identity};
}

// The code set of the strings that an entry is made from.
enum class strings_in : std::uint8_t { utf8, locale };

} // namespace qz

// Records the trace points of releasing an entry, which may be null.
void sec__trace_release(const sec_acle_t *acle);
// The same for an entry without a record, which is stored at `place`.
void sec__trace_release(const void *place, const qz::acle_view &acle);

// Makes an entry from arguments that the caller has checked: a mechanism of at most 16 bytes for types 4 and 8, an
// identity for types 4, 8 and 16. The entry holds both in UTF-8. Returns SEC_S_OK with a new entry in `*acle`, or the
// code of the failed allocation or conversion with null there.
int sec__create_acle(std::uint8_t type, std::uint32_t perm_mask, const char *mechanism, const char *identity,
                     qz::strings_in code_set, sec_acle_t **acle);

#endif
