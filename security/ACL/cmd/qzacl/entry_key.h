// Whom an entry is about, from the words of a command line. Words are bytes, which nothing converts.
#ifndef QZACL_ENTRY_KEY_H
#define QZACL_ENTRY_KEY_H

#include "permission_set.h"

#include <cstdint>
#include <span>
#include <string>
#include <string_view>

namespace qzacl {

struct entry_key {
    std::uint8_t type = 0;
    std::string mechanism; // in lower case
    std::string identity;  // as it was given
    // As sec_create_acle stores it, or as it was given where that refuses it.
    std::string stored;
    bool is_refused = false;
};

// Reads the words of a key, or of an entry, which may have letters behind it: `letters` then tells them, and is null
// for a key. Throws wrong_use.
void read_entry_key(std::span<const std::string> words, entry_key &key, std::string *letters);

// The line of an entry in its stored form. Throws recorded_trouble for a permission without letter.
std::string line_of(const entry_key &key, std::uint32_t permissions, const permission_set &set);

// Whether two identities are one: A to Z without regard to case, other bytes as they are.
bool same_identity(std::string_view one, std::string_view other);

} // namespace qzacl

#endif
