// Parses QZ_TRACE_LEVELS.
#ifndef QZ_TR_LEVELS_H
#define QZ_TR_LEVELS_H

#include <cstdint>
#include <string_view>

namespace qz::tr {

// The level that `text` sets for a category of a component; 0 when it sets none. Syntax:
// "COMPONENT:Category=8,Other=2;COMPONENT2:Category=1".
std::uint8_t configured_level(std::string_view text, std::string_view component, std::string_view category);

} // namespace qz::tr

#endif
