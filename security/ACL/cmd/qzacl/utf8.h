// Whether bytes are UTF-8.
#ifndef QZACL_UTF8_H
#define QZACL_UTF8_H

#include <string>
#include <string_view>

namespace qzacl {

// The length of the character at the start of the text; 0 if there is none. Overlong forms, surrogates and values
// above U+10FFFF are not characters.
std::size_t character_size(std::string_view text);

bool is_utf8(std::string_view text);

// The text with U+FFFD in place of each byte that belongs to no character.
std::string valid_utf8(std::string_view text);

} // namespace qzacl

#endif
