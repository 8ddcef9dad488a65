// Which bytes the trace file may show as text.
#ifndef QZ_TR_TEXT_H
#define QZ_TR_TEXT_H

#include <string_view>

namespace qz::tr {

// True for well-formed UTF-8 without control characters, including the empty string.
bool is_printable(std::string_view bytes);

} // namespace qz::tr

#endif
