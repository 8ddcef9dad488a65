// What edits do to the bytes of a compiled buffer, whichever way they take.
#ifndef QZACL_SPLICE_H
#define QZACL_SPLICE_H

#include "qz/acl.h"

#include <cstddef>
#include <cstdint>
#include <span>

namespace qz {

// The functions that messages about edits name.
namespace edit_function {
inline constexpr char adding[] = "sec_add_acle_to_acl";
inline constexpr char deleting[] = "sec_del_acle_from_acl";
} // namespace edit_function

// The bytes of a buffer that holds some.
std::span<unsigned char> writable_bytes(const sec_acl_buffer_t &acl);

// The number of sub-ACLs, as the header of a whole buffer has it.
std::uint16_t subacl_count(const sec_acl_buffer_t &acl);
void set_subacl_count(const sec_acl_buffer_t &acl, std::size_t count);

// Makes `new_size` bytes of the `old_size` bytes at `offset`, which the caller fills; what follows moves. Only growing
// can fail, and then nothing has changed: the message names `function`. What shrank keeps its memory until it is
// given back.
int resize_part(sec_acl_buffer_t &acl, std::size_t offset, std::size_t old_size, std::size_t new_size,
                const char *function);

// Gives back the memory that a buffer shrank by. False leaves the buffer sound, with more memory than it needs.
bool give_back(sec_acl_buffer_t &acl);

// The end of every deletion: the entry is gone, and a failure tells no more than that the memory was kept.
int finish_deletion(sec_acl_buffer_t &acl);

} // namespace qz

#endif
