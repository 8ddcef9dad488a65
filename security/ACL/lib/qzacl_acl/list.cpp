// Listing the entries of a compiled buffer.
#include "qzacl_acl/buffer.h"
#include "qzacl_acl/buffer_format.h"
#include "qzacl_acl/compile.h"
#include "qzacl_acl/entry.h"
#include "qzacl_acl/tree.h"
#include "report.h"
#include "trace_points.h"

using namespace qz;

namespace {

// Appends the entries of the sub-ACL at the start of the bytes.
int append_subacl(byte_span bytes, sec_aclelist_t &list) {
    sec_acltree_t *root = nullptr;
    const int result = sec__subacl_to_acltree(bytes, &root);
    const owned_acltree tree(root);
    return result == SEC_S_OK ? sec__acltree_to_aclelist(root, &list) : result;
}

// True for an empty ACL and for a buffer with the right type and version.
bool is_acl(const sec_acl_buffer_t &acl) {
    if (acl.length == 0)
        return acl.data == nullptr;
    const byte_span bytes = format::bytes_of(acl);
    return bytes.size() > 1 && bytes[0] == format::buffer_type && bytes[1] == format::buffer_version;
}

// An empty ACL may have no bytes, but any others must have a header.
bool is_cut_short(byte_span bytes) { return !bytes.empty() && bytes.size() < format::header_size; }

// Appends the entries of the wanted sub-ACLs, in stored order.
template <class Wanted>
int append_wanted(const sec_acl_buffer_t &acl, sec_aclelist_t &list, const Wanted &is_wanted) {
    const byte_span bytes = format::bytes_of(acl);
    if (is_cut_short(bytes))
        return report_corrupt(__LINE__);
    format::subacl_walk walk(bytes);
    for (;;) {
        switch (walk.next()) {
        case format::subacl_walk::step::end:
            return SEC_S_OK;
        case format::subacl_walk::step::corrupt:
            return report_corrupt(__LINE__);
        case format::subacl_walk::step::found:
            break;
        }
        if (!is_wanted(walk.current()))
            continue;
        if (const int result = append_subacl(walk.bytes(), list); result != SEC_S_OK)
            return result;
    }
}

int append_first_of(const sec_acl_buffer_t &acl, std::uint8_t type, const char *mechanism,
                    sec_aclelist_t &list) {
    const byte_span bytes = format::bytes_of(acl);
    if (is_cut_short(bytes))
        return report_corrupt(__LINE__);
    const stored_subacl found = sec__find_subacl(acl, type, mechanism);
    return found.is_there ? append_subacl(bytes.subspan(found.offset), list) : SEC_S_OK;
}

// A list that could not be completed is released, and holds nothing.
int kept_if_whole(int result, sec_aclelist_t *list) {
    if (result != SEC_S_OK)
        sec_release_aclelist(list);
    return result;
}

int list_checked(const sec_acl_buffer_t *acl, sec_aclelist_t *list) {
    if (acl == nullptr)
        return report_bad_parameter("sec_list_acl", 1, 0);
    if (list == nullptr)
        return report_bad_parameter("sec_list_acl", 2, 0);
    if (!is_acl(*acl))
        return report(SEC_S_BAD_ACL, msg::not_an_acl_buffer);
    *list = {};
    return kept_if_whole(append_wanted(*acl, *list, [](const format::subacl &) { return true; }), list);
}

int list_by_type_checked(const sec_acl_buffer_t *acl, std::uint8_t type, const char *mechanism,
                         sec_aclelist_t *list) {
    constexpr const char *function = "sec_list_acl_by_type";
    if (acl == nullptr)
        return report_bad_parameter(function, 1, 0);
    if (!is_acle_type(type))
        return report_bad_parameter(function, 2, type);
    if (has_mechanism(type) && mechanism != nullptr) {
        const std::size_t length = strnlen(mechanism, mechanism_max + 1);
        if (length == 0 || length > mechanism_max)
            return report_bad_parameter(function, 3, shown_pointer(mechanism));
    }
    if (list == nullptr)
        return report_bad_parameter(function, 4, 0);
    if (!is_acl(*acl))
        return report(SEC_S_BAD_ACL, msg::not_an_acl_buffer);
    *list = {};
    return kept_if_whole(
        has_mechanism(type) && mechanism == nullptr
            ? append_wanted(*acl, *list, [type](const format::subacl &head) { return head.type == type; })
            : append_first_of(*acl, type, mechanism, *list),
        list);
}

} // namespace

int sec_list_acl(const sec_acl_buffer_t *acl, sec_aclelist_t *list) {
    return run(
        operation::list_acl, std::tie(acl, list), [&] { return list_checked(acl, list); },
        [&] { return std::tie(list->count); });
}

int sec_list_acl_by_type(const sec_acl_buffer_t *acl, std::uint8_t type, const char *mechanism,
                         sec_aclelist_t *list) {
    return run(
        operation::list_acl_by_type, std::tie(acl, type, mechanism, list),
        [&] { return list_by_type_checked(acl, type, mechanism, list); },
        [&] { return std::tie(list->count); });
}
