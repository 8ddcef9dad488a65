// Compiling trees into the bytes of a buffer, and expanding the bytes into trees and lists.
#include "qzacl_acl/compile.h"

#include "qzacl_acl/buffer_format.h"
#include "qzacl_acl/identity_order.h"
#include "qzacl_trace.h"
#include "report.h"

using namespace qz;

namespace {

// A tree and the header of its sub-ACL, measured before anything is allocated.
struct measured_subacl {
    format::subacl head;
    const sec_acltree_t *tree = nullptr;
};

int measure_subacl(const sec_acltree_t &tree, measured_subacl &out) {
    if (has_identity(tree.type()) && tree.has_overlong_identity())
        return report(SEC_S_BAD_ACLE, msg::acle_lacks_key, tree.type());

    out.tree = &tree;
    out.head.type = tree.type();
    out.head.entry_count = tree.held_count();
    if (has_mechanism(tree.type())) {
        const std::string_view mechanism = tree.compiled_mechanism();
        out.head.mechanism = {reinterpret_cast<const unsigned char *>(mechanism.data()),
                              mechanism.size() + 1};
    }
    const std::uint64_t length = format::subacl_header_size + out.head.mechanism.size() + tree.packed_size();
    if (length > format::buffer_max)
        return report_no_memory("sec__add_acle_to_subacl", length);
    out.head.length = static_cast<std::uint32_t>(length);
    return SEC_S_OK;
}

void write_subacl(byte_writer &writer, const measured_subacl &subacl) {
    // Identities are stored in order of insertion. Prefetching hides most of the jumps between them.
    constexpr std::size_t ahead = 12;
    format::write_subacl_header(writer, subacl.head);
    const bool carries_identity = has_identity(subacl.head.type);
    const sec_acltree_t &tree = *subacl.tree;
    const std::span<const small_entry> entries = tree.in_order();
    for (std::size_t index = 0; index < entries.size(); ++index) {
        if (index + ahead < entries.size())
            __builtin_prefetch(tree.identity(entries[index + ahead]));
        const small_entry &entry = entries[index];
        const char *const identity = tree.identity(entry);
        if (entry.is_deleted == 0)
            format::write_entry(writer, entry.perm_mask, identity,
                                carries_identity ? identity_length(identity) + 1 : 0);
    }
}

bool has_entries(const sec_acltree_t *root) { return root != nullptr && root->held_count() != 0; }

// Measures the trees that have entries, the last one first, and hands each result to `use`, up to the first failure.
template <class Use>
int measure_each(std::span<sec_acltree_t *const> trees, const Use &use) {
    for (std::size_t index = trees.size(); index > 0; --index) {
        const sec_acltree_t *tree = trees[index - 1];
        if (!has_entries(tree))
            continue;
        measured_subacl subacl;
        if (const int result = measure_subacl(*tree, subacl); result != SEC_S_OK)
            return result;
        if (const int result = use(subacl); result != SEC_S_OK)
            return result;
    }
    return SEC_S_OK;
}

// What all entries of a sub-ACL share: type and mechanism.
int common_part(const format::subacl &head, acle_view &acle) {
    acle = {.type = head.type};
    if (!is_acle_type(head.type))
        return report_corrupt(__LINE__);
    if (!has_mechanism(head.type))
        return SEC_S_OK;
    const std::string_view mechanism = format::text_in(head.mechanism);
    const std::size_t length = mechanism.data() == nullptr ? head.mechanism.size() : mechanism.size();
    if (length > mechanism_max)
        return report(SEC_S_BAD_ACL, msg::bad_mechanism_length, shown_size(head.mechanism.size()), acl_source,
                      __LINE__);
    if (mechanism.data() == nullptr)
        return report_corrupt(__LINE__);
    acle.mechanism = mechanism;
    return SEC_S_OK;
}

int expand_entries(byte_reader reader, const format::subacl &head, sec_acltree_t **root) {
    const bool is_traced = traces(trace_category::api);
    acle_view acle;
    if (const int result = common_part(head, acle); result != SEC_S_OK)
        return result;
    for (std::uint32_t left = head.entry_count; left != 0; --left) {
        format::entry entry;
        if (!format::read(reader, entry))
            return report_corrupt(__LINE__);
        acle.perm_mask = entry.perm_mask;
        if (has_identity(head.type)) {
            acle.identity = format::text_in(entry.identity);
            if (acle.identity.data() == nullptr)
                return report_corrupt(__LINE__);
        }
        if (const int result = sec__add_acle_to_tree(on_duplicate::replace_mask, acle, root);
            result != SEC_S_OK)
            return result;
        if (is_traced)
            sec__trace_release(&acle, acle);
    }
    return SEC_S_OK;
}

} // namespace

int sec__acltree_to_subacl(const sec_acltree_t *root, loose_subacl &out) {
    out = {};
    if (!has_entries(root))
        return SEC_S_OK;
    measured_subacl subacl;
    if (const int result = measure_subacl(*root, subacl); result != SEC_S_OK)
        return result;
    auto memory = allocate<unsigned char>(subacl.head.length);
    if (memory == nullptr)
        return report_no_memory("sec__add_acle_to_subacl", subacl.head.length);
    byte_writer writer({memory.get(), subacl.head.length});
    write_subacl(writer, subacl);
    if (!writer.is_full())
        return report_corrupt(__LINE__);
    out = {std::move(memory), subacl.head.length};
    return SEC_S_OK;
}

int sec__acltrees_to_acl(std::span<sec_acltree_t *const> trees, sec_acl_buffer_t *acl) {
    constexpr const char *function = "sec__acltrees_to_acl";
    *acl = {};
    std::uint64_t size = format::header_size;
    std::size_t count = 0;
    int result = measure_each(trees, [&](const measured_subacl &subacl) {
        size += subacl.head.length;
        if (++count > format::subacls_max || size > format::buffer_max)
            return report_no_memory(function, size);
        return SEC_S_OK;
    });
    if (result != SEC_S_OK)
        return result;
    const auto whole = static_cast<std::size_t>(size);
    auto memory = allocate<unsigned char>(whole);
    if (memory == nullptr)
        return report_no_memory(function, size);
    byte_writer writer({memory.get(), whole});
    format::write_header(writer, static_cast<std::uint16_t>(count));
    result = measure_each(trees, [&](const measured_subacl &subacl) {
        write_subacl(writer, subacl);
        return SEC_S_OK;
    });
    if (result != SEC_S_OK)
        return result;
    if (!writer.is_full())
        return report_corrupt(__LINE__);
    *acl = {static_cast<std::int32_t>(size), memory.release()};
    return SEC_S_OK;
}

int sec__subacl_to_acltree(byte_span bytes, sec_acltree_t **root) {
    *root = nullptr;
    byte_reader reader(bytes);
    format::subacl head;
    if (!format::read(reader, head))
        return report_corrupt(__LINE__);
    if (is_single_type(head.type) && head.entry_count > 1)
        return report(SEC_S_BAD_ACL, msg::single_acle_repeated);
    const int result = expand_entries(reader, head, root);
    if (result != SEC_S_OK) {
        sec__free_acltree(*root);
        *root = nullptr;
    }
    return result;
}

int sec__acltree_to_aclelist(sec_acltree_t *root, sec_aclelist_t *list) {
    constexpr const char *function = "sec__acltree_to_aclelist";
    if (!has_entries(root))
        return SEC_S_OK;
    const std::size_t count = static_cast<std::size_t>(list->count) + root->held_count();
    const std::size_t size = count * sizeof(sec_acle_t *);
    auto *acles = count > format::buffer_max
                      ? nullptr
                      : static_cast<sec_acle_t **>(std::realloc(static_cast<void *>(list->acles), size));
    if (acles == nullptr)
        return report_no_memory(function, size);
    list->acles = acles;
    for (small_entry &entry : root->in_order()) {
        if (entry.is_deleted != 0)
            continue;
        const acle_view held = root->view(entry);
        sec_acle_t *made = nullptr;
        const int result = sec__create_acle(held.type, held.perm_mask, held.mechanism.data(),
                                            held.identity.data(), strings_in::utf8, &made);
        if (result != SEC_S_OK) {
            // An empty list owns no array.
            if (list->count == 0)
                std::free(std::exchange(list->acles, nullptr));
            return result;
        }
        list->acles[list->count++] = made;
        root->erase(entry);
    }
    return SEC_S_OK;
}
