// Whether bytes are UTF-8.
#ifndef QZACL_UTF8_H
#define QZACL_UTF8_H

#include <string>
#include <string_view>

namespace qzacl {

// The bytes of the character that the text begins with; 0 when it begins with none, or is empty. Overlong forms,
// surrogates and what lies beyond U+10FFFF are no characters.
std::size_t character_size(std::string_view text);

bool is_utf8(std::string_view text);

// The text with U+FFFD in place of each byte that belongs to no character.
std::string valid_utf8(std::string_view text);

} // namespace qzacl

#endif
