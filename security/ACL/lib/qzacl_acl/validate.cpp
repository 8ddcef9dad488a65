// Checking the structure of a compiled buffer, and converting one to host byte order.
#include "qzacl_acl/validate.h"

#include "qzacl_acl/buffer_format.h"
#include "qzacl_acl/entry.h"
#include "qzacl_acl/packed_identity.h"
#include "report.h"
#include "trace_points.h"

using namespace qz;

namespace {

int report_shorter_than_header(std::int32_t length, int line) {
    return report(SEC_S_BAD_ACL, msg::shorter_than_header, length, acl_source, line);
}

enum class field_fault : std::uint8_t { none, inexact, cut_short };

// Checks that the string here ends exactly with its field, and skips it. A field cut short counts as such only if its
// string does not end early, either.
field_fault skip_exact_string(byte_reader &reader, std::size_t length) {
    const void *nul = reader.left() == 0 ? nullptr : std::memchr(reader.position(), '\0', reader.left());
    if (nul == nullptr)
        return length > reader.left() ? field_fault::cut_short : field_fault::inexact;
    const auto size =
        static_cast<std::size_t>(static_cast<const unsigned char *>(nul) - reader.position()) + 1;
    if (size != length)
        return field_fault::inexact;
    reader.skip(size);
    return field_fault::none;
}

// Reports a mechanism that does not end with its field. It is shown up to the next NUL or, without one, truncated
// to the largest size of the field.
int report_bad_mechanism(byte_reader at_mechanism, int line) {
    const byte_span left(at_mechanism.position(), at_mechanism.left());
    char cut[256] = {};
    const char *shown = format::string_in(left);
    if (shown == nullptr) {
        if (!left.empty())
            std::memcpy(cut, left.data(), std::min(left.size(), sizeof cut - 1));
        shown = cut;
    }
    return report(SEC_S_BAD_ACL, msg::bad_mechanism, shown, acl_source, line);
}

int check_mechanism(byte_reader &reader, format::subacl &head) {
    if (!is_acle_type(head.type))
        return report(SEC_S_BAD_ACL, msg::subacl_type_unknown, head.type, acl_source, __LINE__);
    if (!has_mechanism(head.type)) {
        if (head.mechanism_length != 0)
            return report(SEC_S_BAD_ACL, msg::subacl_takes_no_mechanism, head.type, acl_source, __LINE__);
        if (is_single_type(head.type) && head.entry_count > 1)
            return report(SEC_S_BAD_ACL, msg::more_than_one_acle, acl_source, __LINE__);
        return SEC_S_OK;
    }
    if (head.mechanism_length < 2)
        return report(SEC_S_BAD_ACL, msg::bad_mechanism_length, head.mechanism_length, acl_source, __LINE__);
    switch (skip_exact_string(reader, head.mechanism_length)) {
    case field_fault::cut_short:
        return report_corrupt(__LINE__);
    case field_fault::inexact:
        return report_bad_mechanism(reader, __LINE__);
    case field_fault::none:
        break;
    }
    return SEC_S_OK;
}

// Checks one entry and skips it.
int check_entry(byte_reader &reader, std::uint8_t type) {
    format::entry entry;
    std::uint16_t identity_length = 0;
    if (!format::read_fixed_part(reader, entry, identity_length))
        return report_corrupt(__LINE__);
    if (entry.version != format::entry_version)
        return report(SEC_S_BAD_ACLE, msg::acle_version_unsupported, entry.version, acl_source, __LINE__);
    if (is_single_type(type))
        return identity_length == 0 ? SEC_S_OK
                                    : report(SEC_S_BAD_ACLE, msg::unexpected_identity, acl_source, __LINE__);
    switch (skip_exact_string(reader, identity_length)) {
    case field_fault::cut_short:
        return report_corrupt(__LINE__);
    case field_fault::inexact:
        return report(SEC_S_BAD_ACLE, msg::bad_identity_length, acl_source, __LINE__);
    case field_fault::none:
        break;
    }
    return SEC_S_OK;
}

// Skips sound entries with identities, except close to the end.
void skip_sound_entries(format::entry_walk &walk) {
    format::skip_entries_while(walk, identity_block::size, [](std::uint8_t version, byte_span identity) {
        return version == format::entry_version && ends_exactly(identity);
    });
}

// Checks the entries of one sub-ACL, up to the first faulty one, and leaves the reader before that.
int check_entries(byte_reader &reader, const format::subacl &head) {
    format::entry_walk walk{reader, head.entry_count};
    for (;;) {
        if (has_identity(head.type))
            skip_sound_entries(walk);
        reader = walk.entries;
        if (walk.left == 0)
            return SEC_S_OK;
        if (const int result = check_entry(walk.entries, head.type); result != SEC_S_OK)
            return result;
        --walk.left;
    }
}

// Compares the end of a sub-ACL by its length with the position that the walk has reached.
class expected_end {
public:
    void set(const unsigned char *start, std::uint32_t length) {
        start_ = start;
        length_ = length;
    }
    bool is_at(const unsigned char *position) const {
        return start_ == nullptr || static_cast<std::size_t>(position - start_) == length_;
    }

private:
    const unsigned char *start_ = nullptr;
    std::uint32_t length_ = 0;
};

int convert_to_host(std::span<unsigned char> bytes) {
    byte_swapper swapper(bytes);
    std::uint16_t subacl_count = 0;
    if (!swapper.skip(format::count_offset) || !swapper.swap(subacl_count))
        return report_corrupt(__LINE__);
    expected_end end;
    for (; subacl_count != 0; --subacl_count) {
        if (!end.is_at(swapper.position()))
            return report_corrupt(__LINE__);
        const unsigned char *start = swapper.position();
        format::subacl head;
        if (!swapper.swap(head.length) || !swapper.byte(head.type) || !swapper.swap(head.entry_count) ||
            !swapper.byte(head.mechanism_length) || !swapper.skip(head.mechanism_length))
            return report_corrupt(__LINE__);
        end.set(start, head.length);
        for (std::uint32_t left = head.entry_count; left != 0; --left) {
            format::entry entry;
            std::uint16_t identity_length = 0;
            if (!swapper.byte(entry.version) || !swapper.swap(entry.perm_mask) ||
                !swapper.swap(identity_length) || !swapper.skip(identity_length))
                return report_corrupt(__LINE__);
        }
    }
    store_field(bytes, format::order_offset, format::host_order);
    return SEC_S_OK;
}

int convert_checked(int check, sec_acl_buffer_t *acl) {
    if (acl == nullptr)
        return report_bad_parameter("sec_convert_acl_to_host", 2, 0);
    // Bytes beyond the length are not read. The part of the header within it must be right.
    const byte_span bytes = format::bytes_of(*acl);
    byte_reader reader(bytes);
    std::uint8_t type = format::buffer_type;
    std::uint8_t version = format::buffer_version;
    std::uint8_t order = 0;
    reader.field(type);
    reader.field(version);
    if (acl->length == 0 || acl->data == nullptr || type != format::buffer_type ||
        version != format::buffer_version)
        return report(SEC_S_BAD_ACL, msg::not_an_acl_buffer);
    if (!reader.field(order))
        return check != 0 ? report_shorter_than_header(acl->length, __LINE__) : report_corrupt(__LINE__);

    if (order == format::host_order) {
        trace(point::in_host_order);
        return check != 0 ? sec__check_acl_buffer(acl) : SEC_S_OK;
    }
    trace(point::converting_to_host_order);
    return convert_to_host({static_cast<unsigned char *>(acl->data), bytes.size()});
}

} // namespace

int sec__check_acl_buffer(const sec_acl_buffer_t *acl) {
    if (acl->length < static_cast<std::int32_t>(format::header_size))
        return report_shorter_than_header(acl->length, __LINE__);
    byte_reader reader(format::bytes_of(*acl));
    format::header header;
    if (!format::read(reader, header))
        return report_shorter_than_header(acl->length, __LINE__);

    int result = SEC_S_OK;
    expected_end end;
    for (unsigned left = header.subacl_count; left != 0; --left) {
        if (!end.is_at(reader.position()))
            return report_corrupt(__LINE__);
        const unsigned char *start = reader.position();
        format::subacl head;
        if (!format::read_fixed_part(reader, head))
            return report_corrupt(__LINE__);
        end.set(start, head.length);
        if (const int fault = check_mechanism(reader, head); fault != SEC_S_OK)
            return fault;
        const int fault = check_entries(reader, head);
        if (fault == SEC_S_BAD_ACL)
            return fault;
        if (fault != SEC_S_OK)
            result = fault;
    }
    return result;
}

int sec_convert_acl_to_host(int check, sec_acl_buffer_t *acl) {
    return run(operation::convert_acl_to_host, std::tie(check, acl),
               [&] { return convert_checked(check, acl); });
}
