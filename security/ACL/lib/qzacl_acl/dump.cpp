// Printing entries, trees and buffers for people. Every line is a catalog message that is recorded, printed and
// cleared.
#include "base/owned.h"
#include "base/uncancelled.h"
#include "print_recorded.h"
#include "qzacl_acl/buffer_format.h"
#include "qzacl_acl/compile.h"
#include "qzacl_acl/entry.h"
#include "qzacl_acl/permission.h"
#include "qzacl_acl/tree.h"
#include "report.h"

#include <algorithm>

using namespace qz;

namespace {

constexpr char as_it_stands[] = "";
constexpr char with_empty_line[] = "\n";

void print_and_clear(std::FILE *stream, const char *ending) {
    const uncancelled until_all_is_released;
    static_cast<void>(print_recorded(stream, ending));
    cu_set_no_error_1();
}

void dump_subacl(byte_span bytes, const char *indentation) {
    byte_reader reader(bytes);
    format::subacl head;
    const char *mechanism = nullptr;
    if (format::read(reader, head))
        mechanism = has_mechanism(head.type) ? format::string_in(head.mechanism) : "";
    if (mechanism == nullptr) {
        report_corrupt(__LINE__);
        print_and_clear(stdout, as_it_stands);
        return;
    }
    report(SEC_S_ADVISORY, msg::dump_subacl, indentation, indentation, shown_size(head.length), head.type,
           mechanism, shown_size(head.entry_count));
    print_and_clear(stderr, with_empty_line);

    sec_acltree_t *tree = nullptr;
    if (sec__subacl_to_acltree(bytes, &tree) != SEC_S_OK) {
        print_and_clear(stdout, as_it_stands);
        return;
    }
    char entry_indentation[8];
    std::snprintf(entry_indentation, sizeof entry_indentation, "%.6s\t", indentation);
    sec__dump_acltree(tree, entry_indentation);
    sec__free_acltree(tree);
}

} // namespace

void sec__dump_acle(const sec_acle_t *acle, const sec_perm_set_t *set, const char *indentation) {
    if (acle == nullptr)
        return;
    if (indentation == nullptr)
        indentation = "";
    char *mechanism = nullptr;
    char *identity = nullptr;
    char permissions[permission_text_size];
    int result = sec_display_acle_id(acle, &mechanism, &identity);
    const owned<char> mechanism_owner(mechanism);
    const owned<char> identity_owner(identity);
    if (result == SEC_S_OK)
        result = sec_translate_bitmask(acle->perm_mask, set, permissions);
    if (result == SEC_S_OK) {
        const int letter = type_letter(acle->type);
        if (has_mechanism(acle->type))
            report(SEC_S_ADVISORY, msg::dump_mechanism_acle, indentation, letter, mechanism, identity,
                   permissions);
        else if (acle->type == SEC_ACLE_GROUP)
            report(SEC_S_ADVISORY, msg::dump_group_acle, indentation, letter, identity, permissions);
        else
            report(SEC_S_ADVISORY, msg::dump_single_acle, indentation, letter, permissions);
    }
    // Either the entry's line, or the reason why there is none.
    print_and_clear(stderr, as_it_stands);
}

void sec__dump_acltree(const sec_acltree_t *node, const char *indentation) {
    if (node == nullptr)
        return;
    for (const small_entry &entry : node->in_order()) {
        const sec_acle_t shown = node->record(entry);
        if (entry.is_deleted == 0)
            sec__dump_acle(&shown, nullptr, indentation);
    }
}

void sec__dump_subacl(const void *subacl, const char *indentation) {
    if (subacl == nullptr)
        return;
    // The caller guarantees that the header is readable. The rest must be within the length that it gives.
    const auto *start = static_cast<const unsigned char *>(subacl);
    std::uint32_t length = 0;
    byte_reader(byte_span(start, format::subacl_header_size)).field(length);
    dump_subacl({start, std::max<std::size_t>(length, format::subacl_header_size)},
                indentation == nullptr ? "" : indentation);
}

void sec__dump_acl(const sec_acl_buffer_t *acl) {
    if (acl == nullptr || acl->length == 0 || acl->data == nullptr)
        return;
    const byte_span bytes = format::bytes_of(*acl);
    byte_reader reader(bytes);
    format::header head;
    if (!format::read(reader, head) || head.type != format::buffer_type) {
        report(SEC_S_ADVISORY, msg::dump_not_valid);
        print_and_clear(stderr, with_empty_line);
        return;
    }
    char length[16];
    std::snprintf(length, sizeof length, "%d", acl->length);
    report(SEC_S_ADVISORY, msg::dump_descriptor, length, head.version, head.order, head.subacl_count);
    print_and_clear(stderr, as_it_stands);

    format::subacl_walk walk(bytes);
    auto step = walk.next();
    for (; step == format::subacl_walk::step::found; step = walk.next())
        dump_subacl(walk.bytes(), "\t");
    if (step == format::subacl_walk::step::corrupt) {
        report_corrupt(__LINE__);
        print_and_clear(stdout, as_it_stands);
    }
}
