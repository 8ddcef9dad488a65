// Checks that stored entries are in compiled form, and edits them in place.
#include "qzacl_acl/edit_packed.h"

#include "qzacl_acl/packed_identity.h"
#include "qzacl_acl/splice.h"
#include "qzacl_trace.h"
#include "report.h"

#include <cstring>

namespace qz {
namespace {

bool has_sorted_form(const format::subacl &head) {
    if (head.entry_count == 0)
        return false;
    if (head.type == SEC_ACLE_USER)
        return format::holds_exact_string(head.mechanism) && head.mechanism.size() <= mechanism_max + 1;
    return head.type == SEC_ACLE_GROUP && head.mechanism_length == 0;
}

// Skips entries that are clearly in compiled form and ascending order, up to the possible place of the wanted
// identity. `previous` is the identity before the next entry. Not inline, so that the loop's variables fit into
// registers.
[[gnu::noinline]] void skip_ascending(identity_start wanted, byte_span &previous, format::entry_walk &walk) {
    constexpr std::size_t block_size = identity_block::size;
    if (walk.left == 0 || previous.size() + walk.entries.left() < block_size)
        return;
    byte_span last = previous;
    identity_block before(last);
    format::skip_entries_while(walk, block_size, [&](std::uint8_t version, byte_span identity) {
        const identity_block block(identity);
        if (version != format::entry_version || !before.sorts_before(block) ||
            !wanted.is_clearly_after(block) || !ends_exactly(identity))
            return false;
        before = block;
        last = identity;
        return true;
    });
    previous = last;
}

// Finds the place of an identity in a user or group sub-ACL. False unless the bytes are exactly what compiling a
// tree of these entries gives: only then do an edit in place and the general method give the same bytes.
bool find_sorted(byte_span subacl, const format::subacl &head, const char *identity, packed_place &place) {
    if (!has_sorted_form(head))
        return false;
    const wanted_identity wanted(identity);
    format::entry_walk walk{byte_reader(subacl), head.entry_count};
    if (!walk.entries.skip(format::subacl_header_size + head.mechanism_length))
        return false;
    byte_span previous;
    bool is_placed = false;
    while (walk.left != 0) {
        const std::size_t offset = subacl.size() - walk.entries.left();
        format::entry entry;
        if (!format::read(walk.entries, entry) || entry.version != format::entry_version ||
            !format::holds_exact_string(entry.identity))
            return false;
        if (!previous.empty() &&
            fold_compare(format::string_in(previous), format::string_in(entry.identity)) >= 0)
            return false;
        const identity_order order = is_placed ? identity_order::after : wanted.compare(entry.identity);
        if (order != identity_order::after) {
            is_placed = true;
            place = {offset,
                     order == identity_order::same ? format::entry_fixed_size + entry.identity.size() : 0};
        }
        previous = entry.identity;
        --walk.left;
        skip_ascending(is_placed ? identity_start::after_all() : wanted.start(), previous, walk);
    }
    if (!is_placed)
        place = {subacl.size() - walk.entries.left(), 0};
    return walk.entries.left() == 0;
}

// Not while tracing: traces show each entry of the tree that the general method makes. Not if the identity is in
// the buffer itself, as those passed to handlers are: it would move while being added.
bool may_edit_packed(const sec_acle_t &acle, const sec_acl_buffer_t &acl) {
    const byte_span bytes = format::bytes_of(acl);
    const auto place =
        reinterpret_cast<std::uintptr_t>(acle.identity) - reinterpret_cast<std::uintptr_t>(bytes.data());
    return has_identity(acle.type) && place >= bytes.size() && !traces(trace_category::api);
}

void store_subacl_size(const sec_acl_buffer_t &acl, const stored_subacl &stored, std::size_t length,
                       std::uint32_t count) {
    store_field(writable_bytes(acl), stored.offset, static_cast<std::uint32_t>(length));
    store_field(writable_bytes(acl), stored.offset + format::subacl_count_offset, count);
}

} // namespace

bool find_packed(const sec_acl_buffer_t &acl, const stored_subacl &stored, const sec_acle_t &acle,
                 packed_place &place) {
    return may_edit_packed(acle, acl) &&
           find_sorted(format::bytes_of(acl).subspan(stored.offset, stored.head.length), stored.head,
                       acle.identity, place);
}

int add_packed(const sec_acle_t &acle, on_duplicate handling, const stored_subacl &stored,
               const packed_place &place, sec_acl_buffer_t &acl) {
    if (place.size != 0) {
        if (handling == on_duplicate::report)
            return sec__report_duplicate(view_of(acle));
        store_field(writable_bytes(acl), stored.offset + place.offset + format::entry_mask_offset,
                    acle.perm_mask);
        sec__trace_replacement(view_of(acle));
        return SEC_S_OK;
    }
    const std::size_t identity_size = std::strlen(acle.identity) + 1;
    const std::size_t size = format::entry_fixed_size + identity_size;
    const std::size_t offset = stored.offset + place.offset;
    if (const int result = resize_part(acl, offset, 0, size, edit_function::adding); result != SEC_S_OK)
        return result;
    byte_writer writer(writable_bytes(acl).subspan(offset, size));
    format::write_entry(writer, acle.perm_mask, acle.identity, identity_size);
    store_subacl_size(acl, stored, stored.head.length + size, stored.head.entry_count + 1);
    return SEC_S_OK;
}

int delete_packed(const stored_subacl &stored, const packed_place &place, sec_acl_buffer_t &acl) {
    const bool is_last = stored.head.entry_count == 1;
    const std::size_t offset = is_last ? stored.offset : stored.offset + place.offset;
    const std::size_t size = is_last ? stored.head.length : place.size;
    const std::size_t count = subacl_count(acl);
    static_cast<void>(resize_part(acl, offset, size, 0, edit_function::deleting)); // it does not grow
    if (is_last)
        set_subacl_count(acl, count - 1);
    else
        store_subacl_size(acl, stored, stored.head.length - size, stored.head.entry_count - 1);
    return finish_deletion(acl);
}

} // namespace qz
