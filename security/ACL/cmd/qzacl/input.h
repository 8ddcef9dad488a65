// Files that are read whole.
#ifndef QZACL_INPUT_H
#define QZACL_INPUT_H

#include <string>

namespace qzacl {

// How standard input is named; a file of that name is "./-".
inline constexpr char standard_input[] = "-";

// Reads a file, or standard input, to its end. Throws trouble.
std::string read_whole(const std::string &name);

// The same of what is open already; `name` is for people.
std::string read_whole(int fd, const std::string &name);

} // namespace qzacl

#endif
