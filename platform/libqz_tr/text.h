// Which bytes a reader of the trace file may see as text.
#ifndef QZ_TR_TEXT_H
#define QZ_TR_TEXT_H

#include <string_view>

namespace qz::tr {

// Whether the bytes are well-formed UTF-8 without control characters. No bytes at all are.
bool is_printable(std::string_view bytes);

} // namespace qz::tr

#endif
