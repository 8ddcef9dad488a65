// Translation between permission letters and masks by a set of permission templates.
#ifndef QZACL_PERMISSION_H
#define QZACL_PERMISSION_H

#include "qz/acl.h"

#include <cstdint>
#include <span>

namespace qz {

// A permission text has at most one letter per bit of the mask, and a NUL.
inline constexpr std::size_t permission_text_size = 33;

// The templates of a set. A negative count means none.
inline std::span<const sec_perm_template_t> templates_of(const sec_perm_set_t &set) {
    return {set.templates, set.count > 0 ? static_cast<std::size_t>(set.count) : 0};
}

} // namespace qz

// ORs the bit of each letter in `text` into `*mask`. At the first letter without a template it returns
// SEC_S_BAD_PERMISSION, with the earlier bits set; otherwise SEC_S_OK.
int sec__translate_perms(const char *text, const sec_perm_set_t *set, std::uint32_t *mask);

// Writes the letters of the mask's bits, in ascending order, and a NUL into the 33 bytes at `out`. At the first bit
// without a template it returns SEC_S_BAD_PERMISSION, with the earlier letters written; otherwise SEC_S_OK.
int sec__translate_bitmask(std::uint32_t mask, const sec_perm_set_t *set, char *out);

#endif
