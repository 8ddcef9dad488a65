// Adding entries to a compiled buffer and deleting them from it. An edit touches the sub-ACL of the entry's
// key and no other.
//
// The plain way expands that sub-ACL into a tree, changes the tree and compiles it again. Where the stored
// entries already are what compiling such a tree gives, well-formed and in ascending order, the bytes of the
// one entry are changed in place instead: the result is the same, without a second copy of the sub-ACL.
#include "base/owned.h"
#include "qzacl_acl/acle_report.h"
#include "qzacl_acl/buffer.h"
#include "qzacl_acl/buffer_format.h"
#include "qzacl_acl/compile.h"
#include "qzacl_acl/entry.h"
#include "qzacl_acl/packed_identity.h"
#include "qzacl_acl/tree.h"
#include "qzacl_trace.h"
#include "report.h"

namespace {

namespace format = qz::format;

constexpr char add_function[] = "sec_add_acle_to_acl";
constexpr char delete_function[] = "sec_del_acle_from_acl";

int check_entry(const sec_acle_t &acle) {
    if (!qz::is_acle_type(acle.type))
        return qz::report(SEC_S_BAD_ACLE, qz::msg::acle_type_unknown, acle.type);
    const bool lacks_identity = qz::has_identity(acle.type) && acle.identity == nullptr;
    const std::size_t mechanism_length = strnlen(acle.mechanism, sizeof acle.mechanism);
    const bool lacks_mechanism =
        qz::has_mechanism(acle.type) && (mechanism_length == 0 || mechanism_length > qz::mechanism_max);
    if (lacks_identity || lacks_mechanism)
        return qz::report(SEC_S_BAD_ACLE, qz::msg::acle_lacks_key, acle.type);
    return SEC_S_OK;
}

int check_header(const sec_acl_buffer_t &acl) {
    // What of the header the length does not cover counts as wrong in no way of its own, but as bytes that
    // are missing.
    qz::byte_reader reader(format::bytes_of(acl));
    std::uint8_t type = format::buffer_type;
    std::uint8_t version = format::buffer_version;
    std::uint8_t order = format::host_order;
    std::uint16_t subacl_count = 0;
    const bool is_whole =
        reader.field(type) && reader.field(version) && reader.field(order) && reader.field(subacl_count);
    if (type != format::buffer_type)
        return qz::report(SEC_S_BAD_ACL, qz::msg::second_argument_not_acl);
    if (version != format::buffer_version)
        return qz::report(SEC_S_BAD_ACL, qz::msg::buffer_version_unsupported);
    if (order != format::host_order)
        return qz::report(SEC_S_BAD_ACL, qz::msg::wrong_byte_order);
    return is_whole ? SEC_S_OK : qz::report_corrupt(__LINE__);
}

std::span<unsigned char> writable(const sec_acl_buffer_t &acl) {
    return {static_cast<unsigned char *>(acl.data), static_cast<std::size_t>(acl.length)};
}

std::uint16_t subacl_count(const sec_acl_buffer_t &acl) {
    qz::byte_reader reader(format::bytes_of(acl));
    format::header head;
    format::read(reader, head);
    return head.subacl_count;
}

void set_subacl_count(const sec_acl_buffer_t &acl, std::size_t count) {
    qz::store_field(writable(acl), format::count_offset, static_cast<std::uint16_t>(count));
}

// Replaces `old_size` bytes at `offset` by a gap of `new_size` bytes, which the caller fills. Only growing
// can fail, and then nothing has changed; what shrank keeps its memory until it is given back.
int make_gap(sec_acl_buffer_t &acl, std::size_t offset, std::size_t old_size, std::size_t new_size,
             const char *function) {
    const auto length = static_cast<std::size_t>(acl.length);
    const std::size_t new_length = length - old_size + new_size;
    const std::size_t tail = length - offset - old_size;
    if (new_length > length) {
        void *grown = new_length > format::buffer_max ? nullptr : std::realloc(acl.data, new_length);
        if (grown == nullptr)
            return qz::report_no_memory(function, new_length);
        acl.data = grown;
    }
    auto *bytes = static_cast<unsigned char *>(acl.data);
    std::memmove(bytes + offset + new_size, bytes + offset + old_size, tail);
    acl.length = static_cast<std::int32_t>(new_length);
    return SEC_S_OK;
}

// Gives back the memory that a buffer shrank by. False leaves the buffer sound, with more memory than it
// needs.
bool give_back(sec_acl_buffer_t &acl) {
    void *shrunk = std::realloc(acl.data, static_cast<std::size_t>(acl.length));
    if (shrunk == nullptr)
        return false;
    acl.data = shrunk;
    return true;
}

// The end of every deletion: the entry is gone, and a failure tells no more than that the memory was kept.
int finish_deletion(sec_acl_buffer_t &acl) {
    return give_back(acl) ? SEC_S_OK
                          : qz::report_no_memory(delete_function, static_cast<std::size_t>(acl.length));
}

// Finds the sub-ACL that an edit is about. The bytes that the edit replaces must all be there.
int find_edited(const sec_acl_buffer_t &acl, const sec_acle_t &acle, qz::stored_subacl &out) {
    out = sec__find_subacl(&acl, acle.type, acle.mechanism);
    if (out.is_there && out.head.length > static_cast<std::size_t>(acl.length) - out.offset)
        return qz::report_corrupt(__LINE__);
    return SEC_S_OK;
}

qz::byte_span bytes_from(const sec_acl_buffer_t &acl, std::size_t offset) {
    return format::bytes_of(acl).subspan(offset);
}

// Where an identity stands, or would stand, among packed entries.
struct packed_place {
    std::size_t offset = 0; // in the sub-ACL
    std::size_t size = 0;   // of the entry found there, 0 when the identity is not among them
};

bool has_sorted_form(const format::subacl &head) {
    if (head.entry_count == 0)
        return false;
    if (head.type == SEC_ACLE_USER)
        return format::holds_exact_string(head.mechanism) && head.mechanism.size() <= qz::mechanism_max + 1;
    return head.type == SEC_ACLE_GROUP && head.mechanism_length == 0;
}

// Skips entries that are clearly what compiling gives, each behind the one before it: up to where the wanted
// identity may stand, or all of them once its place is known. `previous` is the identity before the next entry.
void skip_ascending(const qz::wanted_identity &wanted, bool is_placed, qz::byte_span &previous,
                    format::entry_walk &walk) {
    constexpr std::size_t block_size = qz::identity_block::size;
    if (walk.left == 0 || previous.size() + walk.entries.left() < block_size)
        return;
    const qz::wanted_identity held_in_registers = wanted; // a copy, which nothing else can change meanwhile
    qz::identity_block before(previous.data());
    std::size_t before_size = previous.size();
    const unsigned char *last = previous.data();
    format::skip_entries_while(walk, block_size, [&](std::uint8_t version, qz::byte_span identity) {
        const qz::identity_block block(identity.data());
        // Behind the NUL of the one before stand other fields, which say nothing of the order.
        if (version != format::entry_version || !qz::ends_exactly(identity) || !before.sorts_before(block) ||
            before.differs_at(block) >= before_size)
            return false;
        if (!is_placed && !held_in_registers.is_clearly_behind(block))
            return false;
        before = block;
        before_size = identity.size();
        last = identity.data();
        return true;
    });
    previous = {last, before_size};
}

// Looks for an identity in a user or group sub-ACL. False unless the bytes are exactly what compiling a tree
// of these entries gives: only then does changing one entry's bytes give what the plain way would.
bool find_packed(qz::byte_span subacl, const format::subacl &head, const char *identity,
                 packed_place &place) {
    if (!has_sorted_form(head))
        return false;
    const qz::wanted_identity wanted(identity);
    format::entry_walk walk{qz::byte_reader(subacl), head.entry_count};
    if (!walk.entries.skip(format::subacl_header_size + head.mechanism_length))
        return false;
    qz::byte_span previous;
    bool is_placed = false;
    while (walk.left != 0) {
        const std::size_t offset = subacl.size() - walk.entries.left();
        format::entry entry;
        if (!format::read(walk.entries, entry) || entry.version != format::entry_version ||
            !format::holds_exact_string(entry.identity))
            return false;
        if (!previous.empty() &&
            qz::fold_compare(format::string_in(previous), format::string_in(entry.identity)) >= 0)
            return false;
        const qz::identity_order order =
            is_placed ? qz::identity_order::behind : wanted.compare(entry.identity);
        if (order != qz::identity_order::behind) {
            is_placed = true;
            place = {offset, order == qz::identity_order::same
                                 ? format::entry_fixed_size + entry.identity.size()
                                 : 0};
        }
        previous = entry.identity;
        --walk.left;
        skip_ascending(wanted, is_placed, previous, walk);
    }
    if (!is_placed)
        place = {subacl.size() - walk.entries.left(), 0};
    return walk.entries.left() == 0;
}

// Traces show each entry of the tree that the plain way makes. And an identity that lies in the buffer
// itself, as the ones that handlers are shown do, would move while it is being added.
bool may_edit_packed(const sec_acle_t &acle, const sec_acl_buffer_t &acl) {
    const qz::byte_span bytes = format::bytes_of(acl);
    const auto place =
        reinterpret_cast<std::uintptr_t>(acle.identity) - reinterpret_cast<std::uintptr_t>(bytes.data());
    return qz::has_identity(acle.type) && place >= bytes.size() && !qz::traces(qz::trace_category::api);
}

void store_subacl_size(const sec_acl_buffer_t &acl, const qz::stored_subacl &stored, std::size_t length,
                       std::uint32_t count) {
    qz::store_field(writable(acl), stored.offset, static_cast<std::uint32_t>(length));
    qz::store_field(writable(acl), stored.offset + format::subacl_count_offset, count);
}

// Adds to packed entries. The identity is known to fit the format.
int add_packed(const sec_acle_t &acle, int report_duplicates, const qz::stored_subacl &stored,
               const packed_place &place, sec_acl_buffer_t &acl) {
    if (place.size != 0) {
        if (report_duplicates != 0)
            return sec__report_duplicate(qz::view_of(acle));
        qz::store_field(writable(acl), stored.offset + place.offset + format::entry_mask_offset,
                        acle.perm_mask);
        sec__trace_replacement(qz::view_of(acle));
        return SEC_S_OK;
    }
    const std::size_t identity_size = std::strlen(acle.identity) + 1;
    const std::size_t size = format::entry_fixed_size + identity_size;
    const std::size_t offset = stored.offset + place.offset;
    if (const int result = make_gap(acl, offset, 0, size, add_function); result != SEC_S_OK)
        return result;
    qz::byte_writer writer(writable(acl).subspan(offset, size));
    format::write_entry(writer, acle.perm_mask, acle.identity, identity_size);
    store_subacl_size(acl, stored, stored.head.length + size, stored.head.entry_count + 1);
    return SEC_S_OK;
}

// Puts what a changed tree compiled to in the place of the stored sub-ACL, or where a new one goes.
int splice(const qz::loose_subacl &compiled, const qz::stored_subacl &stored, const char *function,
           sec_acl_buffer_t &acl) {
    const bool is_new = !stored.is_there;
    const std::size_t count = subacl_count(acl);
    if (is_new && count == format::subacls_max)
        return qz::report_no_memory(function, static_cast<std::size_t>(acl.length) + compiled.length);
    const int result = make_gap(acl, stored.offset, stored.head.length, compiled.length, function);
    if (result != SEC_S_OK)
        return result;
    qz::byte_writer writer(writable(acl).subspan(stored.offset, compiled.length));
    writer.bytes(compiled.data.get(), compiled.length);
    if (is_new)
        set_subacl_count(acl, count + 1);
    else if (compiled.length == 0)
        set_subacl_count(acl, count - 1);
    return SEC_S_OK;
}

int add_by_tree(const sec_acle_t &acle, int report_duplicates, const qz::stored_subacl &stored,
                sec_acl_buffer_t &acl) {
    sec_acltree_t *root = nullptr;
    if (stored.is_there) {
        const int result = sec__subacl_to_acltree(bytes_from(acl, stored.offset), &root);
        if (result != SEC_S_OK)
            return result;
    }
    int result = sec__add_acle_to_tree(report_duplicates, &acle, &root);
    const qz::owned_acltree tree(root);
    qz::loose_subacl compiled;
    if (result == SEC_S_OK)
        result = sec__acltree_to_subacl(root, compiled);
    if (result != SEC_S_OK)
        return result;
    if (compiled.length == 0)
        return qz::report(SEC_S_INTERNAL, qz::msg::internal_failure, qz::acl_source, __LINE__,
                          SEC_S_INTERNAL);
    // Entries with equal identities may have become one; an entry that was added is no failure for want of
    // less memory.
    const std::int32_t old_length = acl.length;
    const int spliced = splice(compiled, stored, add_function, acl);
    if (spliced == SEC_S_OK && acl.length < old_length)
        static_cast<void>(give_back(acl));
    return spliced;
}

int add_to_buffer(const sec_acle_t &acle, int report_duplicates, sec_acl_buffer_t &acl) {
    qz::stored_subacl stored;
    if (const int result = find_edited(acl, acle, stored); result != SEC_S_OK)
        return result;
    if (!stored.is_there && !format::find_end(format::bytes_of(acl), stored.offset))
        return qz::report_corrupt(__LINE__);
    packed_place place;
    if (stored.is_there && may_edit_packed(acle, acl) && std::strlen(acle.identity) <= format::identity_max &&
        find_packed(bytes_from(acl, stored.offset).first(stored.head.length), stored.head, acle.identity,
                    place))
        return add_packed(acle, report_duplicates, stored, place, acl);
    return add_by_tree(acle, report_duplicates, stored, acl);
}

int add_checked(const sec_acle_t *acle, int report_duplicates, sec_acl_buffer_t *acl) {
    if (acle == nullptr)
        return qz::report_bad_parameter(add_function, 1, 0);
    if (acl == nullptr)
        return qz::report_bad_parameter(add_function, 2, 0);
    if (const int result = check_entry(*acle); result != SEC_S_OK)
        return result;
    if (acl->data != nullptr) {
        const int result = check_header(*acl);
        return result == SEC_S_OK ? add_to_buffer(*acle, report_duplicates, *acl) : result;
    }

    auto memory = qz::allocate<unsigned char>(format::header_size);
    if (memory == nullptr)
        return qz::report_no_memory(add_function, format::header_size);
    std::memcpy(memory.get(), format::empty_acl, format::header_size);
    sec_acl_buffer_t made = {format::header_size, memory.release()};
    const int result = add_to_buffer(*acle, report_duplicates, made);
    if (result != SEC_S_OK) {
        std::free(made.data);
        made = {};
    }
    *acl = made;
    return result;
}

int delete_packed(const qz::stored_subacl &stored, const packed_place &place, sec_acl_buffer_t &acl) {
    const bool is_last = stored.head.entry_count == 1;
    const std::size_t offset = is_last ? stored.offset : stored.offset + place.offset;
    const std::size_t size = is_last ? stored.head.length : place.size;
    const std::size_t count = subacl_count(acl);
    static_cast<void>(make_gap(acl, offset, size, 0, delete_function)); // it does not grow
    if (is_last)
        set_subacl_count(acl, count - 1);
    else
        store_subacl_size(acl, stored, stored.head.length - size, stored.head.entry_count - 1);
    return finish_deletion(acl);
}

int delete_by_tree(const sec_acle_t &acle, const qz::stored_subacl &stored, sec_acl_buffer_t &acl) {
    sec_acltree_t *root = nullptr;
    int result = sec__subacl_to_acltree(bytes_from(acl, stored.offset), &root);
    if (result != SEC_S_OK)
        return result;
    const qz::owned_acltree tree(root);
    if (root == nullptr)
        return sec__acle_not_found(SEC_S_BAD_ACLE, qz::view_of(acle));
    result = sec__del_acle_from_tree(&acle, root);
    qz::loose_subacl compiled;
    if (result == SEC_S_OK)
        result = sec__acltree_to_subacl(root, compiled);
    if (result == SEC_S_OK)
        result = splice(compiled, stored, delete_function, acl);
    return result == SEC_S_OK ? finish_deletion(acl) : result;
}

int delete_checked(const sec_acle_t *acle, sec_acl_buffer_t *acl) {
    if (acle == nullptr)
        return qz::report_bad_parameter(delete_function, 1, 0);
    if (acl == nullptr)
        return qz::report_bad_parameter(delete_function, 2, 0);
    if (const int result = check_entry(*acle); result != SEC_S_OK)
        return result;
    if (acl->length == 0 || acl->data == nullptr)
        return qz::report(SEC_S_BAD_ACL, qz::msg::acl_corrupted);
    if (const int result = check_header(*acl); result != SEC_S_OK)
        return result;

    qz::stored_subacl stored;
    if (const int result = find_edited(*acl, *acle, stored); result != SEC_S_OK)
        return result;
    if (!stored.is_there)
        return sec__acle_not_found(SEC_S_ACLE_NOT_FOUND, qz::view_of(*acle));
    packed_place place;
    if (may_edit_packed(*acle, *acl) && find_packed(bytes_from(*acl, stored.offset).first(stored.head.length),
                                                    stored.head, acle->identity, place))
        return place.size == 0 ? sec__acle_not_found(SEC_S_ACLE_NOT_FOUND, qz::view_of(*acle))
                               : delete_packed(stored, place, *acl);
    return delete_by_tree(*acle, stored, *acl);
}

// The entry and the descriptor, as the entry records of all edits show them.
void trace_arguments(int id, const sec_acle_t *acle, const sec_acl_buffer_t *acl) {
    const std::uint32_t type = acle == nullptr ? 0 : acle->type;
    const std::uint32_t mask = acle == nullptr ? 0 : acle->perm_mask;
    const sec_acl_buffer_t shown = acl == nullptr ? sec_acl_buffer_t{} : *acl;
    qz::trace_data(id, qz::number(acle), qz::number(type), qz::number(mask),
                   acle == nullptr ? qz::item(nullptr) : qz::bounded_item(acle->mechanism),
                   qz::item(acle == nullptr ? nullptr : acle->identity), qz::number(acl),
                   qz::number(shown.length), qz::number(shown.data));
}

int sec__add_acle_to_acl(int report_duplicates, const sec_acle_t *acle, sec_acl_buffer_t *acl) {
    qz::trace_entry(60, [&] { trace_arguments(62, acle, acl); });
    cu_set_no_error_1();
    const int result = add_checked(acle, report_duplicates, acl);
    qz::trace_exit(63, result);
    return result;
}

} // namespace

int sec_add_acle_to_acl(const sec_acle_t *acle, sec_acl_buffer_t *acl) {
    return sec__add_acle_to_acl(0, acle, acl);
}

int sec_add_acle_to_acl2(const sec_acle_t *acle, sec_acl_buffer_t *acl) {
    return sec__add_acle_to_acl(1, acle, acl);
}

int sec_del_acle_from_acl(const sec_acle_t *acle, sec_acl_buffer_t *acl) {
    qz::trace_entry(65, [&] { trace_arguments(67, acle, acl); });
    cu_set_no_error_1();
    const int result = delete_checked(acle, acl);
    qz::trace_exit(68, result);
    return result;
}
