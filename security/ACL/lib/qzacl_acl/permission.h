// Translation between permission characters and bit masks over a set of permission templates.
#ifndef QZACL_PERMISSION_H
#define QZACL_PERMISSION_H

#include "qz/acl.h"

#include <cstdint>
#include <span>

namespace qz {

// A permission text holds at most one letter for each bit of the mask, and its NUL.
inline constexpr std::size_t permission_text_size = 33;

// The templates of a set; a set that claims a negative count has none.
inline std::span<const sec_perm_template_t> templates_of(const sec_perm_set_t &set) {
    return {set.templates, set.count > 0 ? static_cast<std::size_t>(set.count) : 0};
}

} // namespace qz

// ORs the bit of each character of `text` into `*mask`. Returns SEC_S_OK, or SEC_S_BAD_PERMISSION for the
// first character without a template, the bits before it having been added.
int sec__translate_perms(const char *text, const sec_perm_set_t *set, std::uint32_t *mask);

// Writes the letters of the mask's bits in ascending order, and a NUL, into the 33 bytes at `out`. Returns
// SEC_S_OK, or SEC_S_BAD_PERMISSION for the first bit without a template, after the letters below it.
int sec__translate_bitmask(std::uint32_t mask, const sec_perm_set_t *set, char *out);

#endif
