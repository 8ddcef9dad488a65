// Conversion of strings between the locale's code set and UTF-8.
#ifndef QZACL_CODE_SET_H
#define QZACL_CODE_SET_H

#include <cstddef>

// Convert the `*in_length` bytes at `in`, including the terminating NUL, into a new string that the caller frees. Both
// return SEC_S_OK, or record an error, leave `*out` unchanged and return SEC_S_CODESET, SEC_S_NO_MEMORY or
// SEC_S_INTERNAL. Thread-safe.
int acl__convert_to_utf8(const char *in, const std::size_t *in_length, char **out, std::size_t *out_length);
int acl__convert_from_utf8(const char *in, const std::size_t *in_length, char **out, std::size_t *out_length);

#endif
