// The byte operations that all edits of a compiled buffer share.
#ifndef QZACL_SPLICE_H
#define QZACL_SPLICE_H

#include "qz/acl.h"

#include <cstddef>
#include <cstdint>
#include <span>

namespace qz {

// The function names in messages about edits.
namespace edit_function {
inline constexpr char adding[] = "sec_add_acle_to_acl";
inline constexpr char deleting[] = "sec_del_acle_from_acl";
} // namespace edit_function

// The bytes of a non-empty buffer.
std::span<unsigned char> writable_bytes(const sec_acl_buffer_t &acl);

// The number of sub-ACLs in the header of a complete buffer.
std::uint16_t subacl_count(const sec_acl_buffer_t &acl);
void set_subacl_count(const sec_acl_buffer_t &acl, std::size_t count);

// Resizes the part at `offset` from `old_size` to `new_size` bytes, which the caller fills, and moves what follows.
// Only growing can fail: then nothing has changed, and the message names `function`. A buffer that shrank keeps its
// memory until give_back().
int resize_part(sec_acl_buffer_t &acl, std::size_t offset, std::size_t old_size, std::size_t new_size,
                const char *function);

// Frees the memory that a buffer no longer needs. On failure returns false; the buffer stays valid.
bool give_back(sec_acl_buffer_t &acl);

// Ends every deletion. A failure only means that the memory was kept: the entry is gone.
int finish_deletion(sec_acl_buffer_t &acl);

} // namespace qz

#endif
