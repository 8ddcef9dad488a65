// The permissions that entries are read and shown with: the default ones, or those of a service.
#ifndef QZACL_PERMISSION_SET_H
#define QZACL_PERMISSION_SET_H

#include "qz/acl.h"

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

namespace qzacl {

class permission_set {
public:
    // The default permissions.
    permission_set() = default;

    // Reads a file of lines "LETTER BIT NAME DESCRIPTION": the bit as C writes numbers, the name of one word and at
    // most 13 bytes, the description of at most 64; the last two may be left out. '#' at the start of a line
    // begins a comment. Throws trouble.
    explicit permission_set(const std::string &file);

    permission_set(const permission_set &) = delete;
    permission_set &operator=(const permission_set &) = delete;

    bool is_default() const { return templates_.empty(); }
    const sec_perm_set_t *get() const { return is_default() ? &acl__default_perm_set : &set_; }

    // The mask of at least one letter. Throws wrong_use for none, recorded_trouble for an unknown one.
    std::uint32_t mask_of(const std::string &letters) const;

    // The letters of a mask in the order of their bits, valid until the next call. Throws recorded_trouble for a bit
    // without a letter.
    std::string_view letters_of(std::uint32_t mask) const;

private:
    std::vector<sec_perm_template_t> templates_;
    sec_perm_set_t set_ = {};
    // Most entries have the letters of the one before.
    mutable std::uint32_t last_mask_ = 0;
    mutable char last_letters_[33] = "";
    mutable std::size_t last_size_ = 0;
};

} // namespace qzacl

#endif
