// Adding entries to a compiled buffer and deleting them from it. An edit changes only the sub-ACL of the entry's key.
//
// The general method expands that sub-ACL into a tree, changes the tree and compiles it again. Most edits do not
// need it: see edit_packed.h.
#include "base/owned.h"
#include "qzacl_acl/acle_report.h"
#include "qzacl_acl/buffer.h"
#include "qzacl_acl/buffer_format.h"
#include "qzacl_acl/compile.h"
#include "qzacl_acl/edit_packed.h"
#include "qzacl_acl/entry.h"
#include "qzacl_acl/splice.h"
#include "qzacl_acl/tree.h"
#include "report.h"
#include "trace_points.h"

using namespace qz;

namespace {

constexpr const char *add_function = edit_function::adding;
constexpr const char *delete_function = edit_function::deleting;

int check_entry(const sec_acle_t &acle) {
    if (!is_acle_type(acle.type))
        return report(SEC_S_BAD_ACLE, msg::acle_type_unknown, acle.type);
    const bool lacks_identity = has_identity(acle.type) && acle.identity == nullptr;
    const std::size_t mechanism_length = strnlen(acle.mechanism, sizeof acle.mechanism);
    const bool lacks_mechanism =
        has_mechanism(acle.type) && (mechanism_length == 0 || mechanism_length > mechanism_max);
    if (lacks_identity || lacks_mechanism)
        return report(SEC_S_BAD_ACLE, msg::acle_lacks_key, acle.type);
    return SEC_S_OK;
}

int check_header(const sec_acl_buffer_t &acl) {
    // Header bytes beyond the length are reported as missing, not as wrong.
    byte_reader reader(format::bytes_of(acl));
    std::uint8_t type = format::buffer_type;
    std::uint8_t version = format::buffer_version;
    std::uint8_t order = format::host_order;
    std::uint16_t subacl_count = 0;
    const bool is_whole =
        reader.field(type) && reader.field(version) && reader.field(order) && reader.field(subacl_count);
    if (type != format::buffer_type)
        return report(SEC_S_BAD_ACL, msg::second_argument_not_acl);
    if (version != format::buffer_version)
        return report(SEC_S_BAD_ACL, msg::buffer_version_unsupported);
    if (order != format::host_order)
        return report(SEC_S_BAD_ACL, msg::wrong_byte_order);
    return is_whole ? SEC_S_OK : report_corrupt(__LINE__);
}

// Finds the sub-ACL to edit. All bytes that the edit replaces must exist.
int find_edited(const sec_acl_buffer_t &acl, const sec_acle_t &acle, stored_subacl &out) {
    out = sec__find_subacl(acl, acle.type, acle.mechanism);
    if (out.is_there && out.head.length > static_cast<std::size_t>(acl.length) - out.offset)
        return report_corrupt(__LINE__);
    return SEC_S_OK;
}

// Replaces the stored sub-ACL with the compiled one, or inserts that as a new one.
int replace_subacl(const loose_subacl &compiled, const stored_subacl &stored, const char *function,
                   sec_acl_buffer_t &acl) {
    const bool is_new = !stored.is_there;
    const std::size_t count = subacl_count(acl);
    if (is_new && count == format::subacls_max)
        return report_no_memory(function, static_cast<std::size_t>(acl.length) + compiled.length);
    const int result = resize_part(acl, stored.offset, stored.head.length, compiled.length, function);
    if (result != SEC_S_OK)
        return result;
    byte_writer writer(writable_bytes(acl).subspan(stored.offset, compiled.length));
    writer.bytes(compiled.data.get(), compiled.length);
    if (is_new)
        set_subacl_count(acl, count + 1);
    else if (compiled.length == 0)
        set_subacl_count(acl, count - 1);
    return SEC_S_OK;
}

int add_by_tree(const sec_acle_t &acle, on_duplicate handling, const stored_subacl &stored,
                sec_acl_buffer_t &acl) {
    sec_acltree_t *root = nullptr;
    if (stored.is_there) {
        const int result = sec__subacl_to_acltree(format::bytes_of(acl).subspan(stored.offset), &root);
        if (result != SEC_S_OK)
            return result;
    }
    int result = sec__add_acle_to_tree(handling, &acle, &root);
    const owned_acltree tree(root);
    loose_subacl compiled;
    if (result == SEC_S_OK)
        result = sec__acltree_to_subacl(root, compiled);
    if (result != SEC_S_OK)
        return result;
    if (compiled.length == 0)
        return report(SEC_S_INTERNAL, msg::internal_failure, acl_source, __LINE__, SEC_S_INTERNAL);
    // Duplicates in the stored sub-ACL may have become one entry. If shrinking the memory fails, the addition still
    // succeeded.
    const std::int32_t old_length = acl.length;
    const int replaced = replace_subacl(compiled, stored, add_function, acl);
    if (replaced == SEC_S_OK && acl.length < old_length)
        static_cast<void>(give_back(acl));
    return replaced;
}

int add_to_buffer(const sec_acle_t &acle, on_duplicate handling, sec_acl_buffer_t &acl) {
    stored_subacl stored;
    if (const int result = find_edited(acl, acle, stored); result != SEC_S_OK)
        return result;
    if (!stored.is_there && !format::find_end(format::bytes_of(acl), stored.offset))
        return report_corrupt(__LINE__);
    packed_place place;
    if (stored.is_there && find_packed(acl, stored, acle, place) &&
        std::strlen(acle.identity) <= format::identity_max)
        return add_packed(acle, handling, stored, place, acl);
    return add_by_tree(acle, handling, stored, acl);
}

int add_checked(const sec_acle_t *acle, on_duplicate handling, sec_acl_buffer_t *acl) {
    if (acle == nullptr)
        return report_bad_parameter(add_function, 1, 0);
    if (acl == nullptr)
        return report_bad_parameter(add_function, 2, 0);
    if (const int result = check_entry(*acle); result != SEC_S_OK)
        return result;
    if (acl->data != nullptr) {
        const int result = check_header(*acl);
        return result == SEC_S_OK ? add_to_buffer(*acle, handling, *acl) : result;
    }

    auto memory = allocate<unsigned char>(format::header_size);
    if (memory == nullptr)
        return report_no_memory(add_function, format::header_size);
    std::memcpy(memory.get(), format::empty_acl, format::header_size);
    sec_acl_buffer_t made = {format::header_size, memory.release()};
    const int result = add_to_buffer(*acle, handling, made);
    if (result != SEC_S_OK) {
        std::free(made.data);
        made = {};
    }
    *acl = made;
    return result;
}

int delete_by_tree(const sec_acle_t &acle, const stored_subacl &stored, sec_acl_buffer_t &acl) {
    sec_acltree_t *root = nullptr;
    int result = sec__subacl_to_acltree(format::bytes_of(acl).subspan(stored.offset), &root);
    if (result != SEC_S_OK)
        return result;
    const owned_acltree tree(root);
    if (root == nullptr)
        return sec__acle_not_found(SEC_S_BAD_ACLE, view_of(acle));
    result = sec__del_acle_from_tree(&acle, root);
    loose_subacl compiled;
    if (result == SEC_S_OK)
        result = sec__acltree_to_subacl(root, compiled);
    if (result == SEC_S_OK)
        result = replace_subacl(compiled, stored, delete_function, acl);
    return result == SEC_S_OK ? finish_deletion(acl) : result;
}

int delete_checked(const sec_acle_t *acle, sec_acl_buffer_t *acl) {
    if (acle == nullptr)
        return report_bad_parameter(delete_function, 1, 0);
    if (acl == nullptr)
        return report_bad_parameter(delete_function, 2, 0);
    if (const int result = check_entry(*acle); result != SEC_S_OK)
        return result;
    if (acl->length == 0 || acl->data == nullptr)
        return report(SEC_S_BAD_ACL, msg::acl_corrupted);
    if (const int result = check_header(*acl); result != SEC_S_OK)
        return result;

    stored_subacl stored;
    if (const int result = find_edited(*acl, *acle, stored); result != SEC_S_OK)
        return result;
    if (!stored.is_there)
        return sec__acle_not_found(SEC_S_ACLE_NOT_FOUND, view_of(*acle));
    packed_place place;
    if (find_packed(*acl, stored, *acle, place))
        return place.size == 0 ? sec__acle_not_found(SEC_S_ACLE_NOT_FOUND, view_of(*acle))
                               : delete_packed(stored, place, *acl);
    return delete_by_tree(*acle, stored, *acl);
}

int sec__add_acle_to_acl(on_duplicate handling, const sec_acle_t *acle, sec_acl_buffer_t *acl) {
    return run(operation::add_acle_to_acl, std::tie(acle, acl),
               [&] { return add_checked(acle, handling, acl); });
}

} // namespace

int sec_add_acle_to_acl(const sec_acle_t *acle, sec_acl_buffer_t *acl) {
    return sec__add_acle_to_acl(on_duplicate::replace_mask, acle, acl);
}

int sec_add_acle_to_acl2(const sec_acle_t *acle, sec_acl_buffer_t *acl) {
    return sec__add_acle_to_acl(on_duplicate::report, acle, acl);
}

int sec_del_acle_from_acl(const sec_acle_t *acle, sec_acl_buffer_t *acl) {
    return run(operation::del_acle_from_acl, std::tie(acle, acl), [&] { return delete_checked(acle, acl); });
}
