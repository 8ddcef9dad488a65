// The byte operations that all edits of a compiled buffer share.
#include "qzacl_acl/splice.h"

#include "qzacl_acl/buffer_format.h"
#include "report.h"

#include <cstdlib>
#include <cstring>

namespace qz {

std::span<unsigned char> writable_bytes(const sec_acl_buffer_t &acl) {
    return {static_cast<unsigned char *>(acl.data), static_cast<std::size_t>(acl.length)};
}

std::uint16_t subacl_count(const sec_acl_buffer_t &acl) {
    return load_field<std::uint16_t>(format::bytes_of(acl), format::count_offset);
}

void set_subacl_count(const sec_acl_buffer_t &acl, std::size_t count) {
    store_field(writable_bytes(acl), format::count_offset, static_cast<std::uint16_t>(count));
}

int resize_part(sec_acl_buffer_t &acl, std::size_t offset, std::size_t old_size, std::size_t new_size,
                const char *function) {
    const auto length = static_cast<std::size_t>(acl.length);
    const std::size_t new_length = length - old_size + new_size;
    const std::size_t tail = length - offset - old_size;
    if (new_length > length) {
        void *grown = new_length > format::buffer_max ? nullptr : std::realloc(acl.data, new_length);
        if (grown == nullptr)
            return report_no_memory(function, new_length);
        acl.data = grown;
    }
    auto *bytes = static_cast<unsigned char *>(acl.data);
    std::memmove(bytes + offset + new_size, bytes + offset + old_size, tail);
    acl.length = static_cast<std::int32_t>(new_length);
    return SEC_S_OK;
}

bool give_back(sec_acl_buffer_t &acl) {
    void *shrunk = std::realloc(acl.data, static_cast<std::size_t>(acl.length));
    if (shrunk == nullptr)
        return false;
    acl.data = shrunk;
    return true;
}

int finish_deletion(sec_acl_buffer_t &acl) {
    return give_back(acl) ? SEC_S_OK
                          : report_no_memory(edit_function::deleting, static_cast<std::size_t>(acl.length));
}

} // namespace qz
