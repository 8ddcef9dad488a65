// The key of an entry, from the words of a command line. Words are bytes and are never converted.
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
    std::string identity;  // as given
    // As sec_create_acle stores it, or as given if it is refused.
    std::string stored;
    bool is_refused = false;
};

// Reads the words of a key or, if `letters` is not null, of an entry, whose key may be followed by letters. Throws
// wrong_use.
void read_entry_key(std::span<const std::string> words, entry_key &key, std::string *letters);

// The line of an entry in its stored form. Throws recorded_trouble for a permission without a letter.
std::string line_of(const entry_key &key, std::uint32_t permissions, const permission_set &set);

// True if two identities are equal: A to Z in either case, other bytes exactly.
bool same_identity(std::string_view one, std::string_view other);

} // namespace qzacl

#endif
