// The byte format of a compiled ACL, and walks over its sub-ACLs and entries. No other file knows an offset.
//
//   Header             0  1  buffer type, 0x85
//                      1  1  version, 1
//                      2  1  byte order of all fields: 2 low byte first, 1 high byte first; a host takes
//                            any value but its own for the other order
//                      3  2  number of sub-ACLs
//
//   Sub-ACL            0  4  its length: this header, the mechanism and the entries
//                      4  1  type of its entries: 1, 2, 4, 8 or 16
//                      5  4  number of entries
//                      9  1  bytes of the mechanism with its NUL; 0 for types 1, 2 and 16
//                     10     mechanism, entries
//
//   Entry              0  1  version, 1
//                      1  4  permission mask
//                      5  2  bytes of the identity with its NUL; 0 for types 1 and 2
//                      7     identity
//
// There is no padding. An ACL with one user entry, mechanism abcd, identity xyz, mask 3, takes 31 bytes. On a host with
// the low byte first:
//
//   85 01 02 01 00 | 1a 00 00 00  04  01 00 00 00  05  61 62 63 64 00 | 01  03 00 00 00  04 00  78 79 7a 00
#ifndef QZACL_BUFFER_FORMAT_H
#define QZACL_BUFFER_FORMAT_H

#include "bytes.h"
#include "qz/acl.h"

#include <algorithm>
#include <bit>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <limits>
#include <string_view>

namespace qz::format {

inline constexpr std::uint8_t buffer_type = 0x85;
inline constexpr std::uint8_t buffer_version = 1;
inline constexpr std::uint8_t host_order = std::endian::native == std::endian::little ? 2 : 1;
inline constexpr std::uint8_t entry_version = 1;

inline constexpr std::size_t header_size = 5;
inline constexpr std::size_t order_offset = 2;
inline constexpr std::size_t count_offset = 3;

inline constexpr std::size_t subacl_header_size = 10;
inline constexpr std::size_t subacl_type_offset = 4;
inline constexpr std::size_t subacl_count_offset = 5;
inline constexpr std::size_t subacl_mechanism_length_offset = 9;

inline constexpr std::size_t entry_fixed_size = 7;
inline constexpr std::size_t entry_mask_offset = 1;
inline constexpr std::size_t entry_length_offset = 5;

// Limits by the widths of fields.
inline constexpr std::size_t identity_max = std::numeric_limits<std::uint16_t>::max() - 1;
inline constexpr std::size_t subacls_max = std::numeric_limits<std::uint16_t>::max();
inline constexpr std::size_t buffer_max = std::numeric_limits<std::int32_t>::max();

inline constexpr unsigned char empty_acl[header_size] = {buffer_type, buffer_version, host_order, 0, 0};

struct header {
    std::uint8_t type = 0;
    std::uint8_t version = 0;
    std::uint8_t order = 0;
    std::uint16_t subacl_count = 0;
};

struct subacl {
    std::uint32_t length = 0;
    std::uint8_t type = 0;
    std::uint32_t entry_count = 0;
    std::uint8_t mechanism_length = 0;
    byte_span mechanism; // with its NUL
};

struct entry {
    std::uint8_t version = 0;
    std::uint32_t perm_mask = 0;
    byte_span identity; // with its NUL
};

// The bytes of a descriptor; none without a buffer or a positive length.
inline byte_span bytes_of(const sec_acl_buffer_t &acl) {
    if (acl.data == nullptr || acl.length <= 0)
        return {};
    return {static_cast<const unsigned char *>(acl.data), static_cast<std::size_t>(acl.length)};
}

inline bool read(byte_reader &reader, header &out) {
    byte_span fixed;
    if (!reader.bytes(header_size, fixed))
        return false;
    out.type = fixed[0];
    out.version = fixed[1];
    out.order = fixed[order_offset];
    out.subacl_count = load_field<std::uint16_t>(fixed, count_offset);
    return true;
}

// Reads the fixed fields of a sub-ACL, up to its mechanism.
inline bool read_fixed_part(byte_reader &reader, subacl &out) {
    byte_span fixed;
    if (!reader.bytes(subacl_header_size, fixed))
        return false;
    out.length = load_field<std::uint32_t>(fixed, 0);
    out.type = fixed[subacl_type_offset];
    out.entry_count = load_field<std::uint32_t>(fixed, subacl_count_offset);
    out.mechanism_length = fixed[subacl_mechanism_length_offset];
    return true;
}

// Reads the fixed fields and the mechanism of a sub-ACL, up to its first entry.
inline bool read(byte_reader &reader, subacl &out) {
    return read_fixed_part(reader, out) && reader.bytes(out.mechanism_length, out.mechanism);
}

// Reads the fixed fields of an entry, up to its identity.
inline bool read_fixed_part(byte_reader &reader, entry &out, std::uint16_t &identity_length) {
    byte_span fixed;
    if (!reader.bytes(entry_fixed_size, fixed))
        return false;
    out.version = fixed[0];
    out.perm_mask = load_field<std::uint32_t>(fixed, entry_mask_offset);
    identity_length = load_field<std::uint16_t>(fixed, entry_length_offset);
    return true;
}

inline bool read(byte_reader &reader, entry &out) {
    std::uint16_t identity_length = 0;
    return read_fixed_part(reader, out, identity_length) && reader.bytes(identity_length, out.identity);
}

// True when a string ends exactly where its field does.
inline bool holds_exact_string(byte_span field) {
    return !field.empty() && std::memchr(field.data(), '\0', field.size()) == &field.back();
}

// True when a field's last byte is a NUL, whether or not it is the first one. Such a field holds a string.
inline bool ends_in_nul(byte_span field) { return !field.empty() && field.back() == '\0'; }

// A string field as a C string, or null if it has no NUL.
inline const char *string_in(byte_span field) {
    // Most fields end with their string, which takes no call to see.
    if (!ends_in_nul(field) && (field.empty() || std::memchr(field.data(), '\0', field.size()) == nullptr))
        return nullptr;
    return reinterpret_cast<const char *>(field.data());
}

// The same with its length. A null view if it has no NUL.
inline std::string_view text_in(byte_span field) {
    const void *end = field.empty() ? nullptr : std::memchr(field.data(), '\0', field.size());
    if (end == nullptr)
        return {};
    const auto length = static_cast<std::size_t>(static_cast<const unsigned char *>(end) - field.data());
    return {reinterpret_cast<const char *>(field.data()), length};
}

// How far a walk got: the bytes skipped, and the entries that are left.
struct skipped_entries {
    std::size_t bytes = 0;
    std::uint32_t left = 0;
};

// Skips entries while `is_passed` returns true for their version and identity, of which `readable` bytes may be
// read even if it is shorter. Also stops before an entry that reaches beyond the end, or that has fewer bytes after
// it than another entry with `readable` bytes of identity takes. Such entries, and so the last ones of a buffer, are
// left to the checked reader. Decisions spend their time in this loop, so each step has only one test for the end
// of the bytes.
template <class Passed>
skipped_entries skip_entries_while(byte_reader entries, std::uint32_t left, std::size_t readable,
                                   const Passed &is_passed) {
    if (entries.left() < entry_fixed_size + readable)
        return {0, left};
    const unsigned char *const start = entries.position();
    // The last place at which an entry may start, as a number: sums do not wrap and form no invalid pointer.
    const auto number_of = [](const unsigned char *place) {
        return std::uint64_t{reinterpret_cast<std::uintptr_t>(place)};
    };
    const std::uint64_t last = number_of(start) + (entries.left() - (entry_fixed_size + readable));
    const unsigned char *at = start;
    for (; left != 0; --left) {
        std::uint16_t length = 0;
        std::memcpy(&length, at + entry_length_offset, sizeof length);
        const unsigned char *const identity = at + entry_fixed_size;
        const std::size_t size = length;
        if (number_of(identity) + size > last) [[unlikely]]
            break;
        if (!is_passed(*at, byte_span(identity, size))) [[unlikely]]
            break;
        at = identity + size;
    }
    return {static_cast<std::size_t>(at - start), left};
}

// The entries of a sub-ACL that are still to be read.
struct entry_walk {
    byte_reader entries;
    std::uint32_t left = 0;

    void step(const skipped_entries &skipped) {
        entries.skip(skipped.bytes);
        left = skipped.left;
    }
};

template <class Passed>
void skip_entries_while(entry_walk &walk, std::size_t readable, const Passed &is_passed) {
    walk.step(skip_entries_while(walk.entries, walk.left, readable, is_passed));
}

// Skips entries without looking at their contents. False if one reaches beyond the end.
inline bool skip_entries(byte_reader &reader, std::uint32_t count) {
    entry_walk walk{reader, count};
    for (;;) {
        skip_entries_while(walk, 0, [](std::uint8_t, byte_span) { return true; });
        reader = walk.entries;
        if (walk.left == 0)
            return true;
        entry passed;
        if (!read(walk.entries, passed))
            return false;
        --walk.left;
    }
}

// Steps through the sub-ACLs of a buffer in host order by their length fields.
class subacl_walk {
public:
    enum class step : std::uint8_t { found, end, corrupt };

    explicit subacl_walk(byte_span buffer) : next_(buffer) {
        header head;
        if (read(next_, head))
            left_ = head.subacl_count;
    }

    step next() {
        if (left_ == 0)
            return step::end;
        // A shorter length would lead back into the sub-ACL's own header.
        if (is_started_ && (current_.length < subacl_header_size || !next_.skip(current_.length)))
            return step::corrupt;
        is_started_ = true;
        --left_;
        byte_reader head = next_;
        return read(head, current_) ? step::found : step::corrupt;
    }

    const subacl &current() const { return current_; }
    // From the first entry of the current sub-ACL to the end of the buffer.
    byte_reader entries() const {
        byte_reader first = next_;
        first.skip(subacl_header_size + current_.mechanism_length);
        return first;
    }
    // The bytes that the current sub-ACL may use: up to the next sub-ACL or, for the last one, to the end of the
    // buffer. So even if forged sub-ACLs overlap, walking over all entries takes time linear in the bytes.
    byte_span bytes() const {
        return {next_.position(),
                left_ == 0 ? next_.left() : std::min<std::size_t>(current_.length, next_.left())};
    }

private:
    byte_reader next_;
    subacl current_;
    std::size_t left_ = 0;
    bool is_started_ = false;
};

// Finds the end of the counted sub-ACLs, where a new one is inserted; any bytes after that remain uncounted. False
// if a sub-ACL reaches beyond the end of the buffer, or if the length of the last one does not lead to the end of
// its entries, because a walk would look for the new one elsewhere.
inline bool find_end(byte_span buffer, std::size_t &offset) {
    byte_reader rest(buffer);
    header head;
    if (!read(rest, head))
        return false;
    subacl_walk walk(buffer);
    for (unsigned left = head.subacl_count; left != 0; --left) {
        if (walk.next() != subacl_walk::step::found)
            return false;
    }
    if (head.subacl_count != 0) {
        rest = byte_reader(walk.bytes());
        subacl last;
        if (!read(rest, last) || !skip_entries(rest, last.entry_count) ||
            walk.bytes().size() - rest.left() != last.length)
            return false;
    }
    offset = buffer.size() - rest.left();
    return true;
}

inline void write_header(byte_writer &writer, std::uint16_t subacl_count) {
    writer.field(buffer_type);
    writer.field(buffer_version);
    writer.field(host_order);
    writer.field(subacl_count);
}

inline void write_subacl_header(byte_writer &writer, const subacl &head) {
    writer.field(head.length);
    writer.field(head.type);
    writer.field(head.entry_count);
    writer.field(static_cast<std::uint8_t>(head.mechanism.size()));
    writer.bytes(head.mechanism.data(), head.mechanism.size());
}

// Writes an entry. `identity_size` counts the NUL and is 0 for an entry without an identity.
inline void write_entry(byte_writer &writer, std::uint32_t perm_mask, const char *identity,
                        std::size_t identity_size) {
    writer.field(entry_version);
    writer.field(perm_mask);
    writer.field(static_cast<std::uint16_t>(identity_size));
    writer.bytes(identity, identity_size);
}

} // namespace qz::format

#endif
