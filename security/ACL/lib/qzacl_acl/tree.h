// A tree: the entries of one key, collected for compilation. The key of user and expanded entries is their type and
// mechanism, that of all others the type alone.
//
// Entries are stored in order of insertion. User and group entries are sorted by identity when their order is first
// needed. Each duplicate is found by one hash look-up, or all are found at once by sorting. Nothing recurses on the size
// of a tree. tree_shape.h has the few things that depend on the shape of a linked tree.
#ifndef QZACL_TREE_H
#define QZACL_TREE_H

#include "qz/acl.h"
#include "qzacl_acl/acle_report.h"
#include "qzacl_acl/entry.h"
#include "qzacl_acl/entry_array.h"
#include "qzacl_acl/identity_store.h"
#include "qzacl_acl/identity_table.h"

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <span>

// A tree. A null pointer is an empty one. Not thread-safe.
struct sec_acltree {
public:
    enum class outcome : std::uint8_t { inserted, duplicate, no_memory };
    struct insertion {
        outcome result;
        qz::small_entry *entry; // the new or the duplicate one
        qz::shortage lacking;
    };

    // The identities are in the text, or are copied if that is empty.
    sec_acltree(std::uint8_t type, std::span<char> text)
        : identities_(qz::has_identity(type) ? text : std::span<char>()), type_(type) {}
    sec_acltree(const sec_acltree &) = delete;
    sec_acltree &operator=(const sec_acltree &) = delete;

    std::uint8_t type() const { return type_; }
    // The mechanism of the key, as the first entry inserted spells it.
    std::string_view mechanism() const { return identities_.first_mechanism(); }

    // A duplicate changes nothing, unless it is to be reported late. Then all are, and the identities are in the text.
    insertion insert(const qz::acle_view &acle, qz::on_duplicate handling);
    // The first entry inserted that repeats the identity of an earlier one.
    std::optional<qz::small_entry> first_duplicate();
    // The memory that inserting an entry of the text reads first, or null if unknown.
    const void *first_look(const qz::acle_view &acle) const {
        const char *const text = acle.identity.data();
        return table_.room() == 0 ? nullptr : table_.first_look(table_.hash(text, qz::ordered_word(text)));
    }
    // The entry whose identity equals the wanted one in any letter case, or null.
    qz::small_entry *find_entry(const char *wanted);
    // Marks the entry as deleted. It keeps its place, so the order of the others does not change.
    void erase(qz::small_entry &entry);

    // All entries, including deleted ones, in the order of the tree.
    std::span<const qz::small_entry> in_order() const;
    std::span<qz::small_entry> in_order();
    // The entry with its texts, as a view and as a record that borrows the identity.
    qz::acle_view view(const qz::small_entry &entry) const;
    sec_acle_t record(const qz::small_entry &entry) const;
    const char *identity(const qz::small_entry &entry) const { return identities_.identity(entry.place); }
    // The mechanism of the compiled sub-ACL. Requires an entry.
    std::string_view compiled_mechanism() const;

    // Records the trace points of releasing every entry, which destroys their order.
    void trace_release();

    std::uint32_t held_count() const { return held_count_; }
    // The size of the entries in a sub-ACL.
    std::uint64_t packed_size() const { return packed_size_; }
    // True when an identity exceeds the maximum of its length field.
    bool has_overlong_identity() const { return overlong_count_ != 0; }

private:
    // The identity being inserted, and its first ordered word.
    struct candidate {
        const char *identity;
        std::uint64_t key;
    };

    bool is_equal(const qz::small_entry &held, const candidate &wanted) const;
    bool sorts_last(const candidate &wanted) const;
    qz::small_entry *find_equal(const candidate &wanted, std::uint64_t hash);
    qz::shortage fill_table(std::uint32_t place);
    void count_entry(std::size_t identity_length, int held);
    void put_in_order() const;
    void restore_keys();

    // Mutable, because sorting does not change a tree's contents.
    mutable qz::entry_array entries_;
    mutable qz::identity_table table_;
    qz::identity_store identities_;
    std::uint64_t packed_size_ = 0;
    std::uint32_t held_count_ = 0;
    std::uint32_t overlong_count_ = 0;
    mutable bool has_whole_keys_ = true; // false once sorting has replaced keys by later bytes
    // True while every entry sorts after its predecessor. As long as it is, no two are equal, and the table is unused.
    mutable bool is_ascending_ = true;
    std::uint8_t type_;
};

// Inserts the entry into the tree in `*slot`, made when that is null; the tree copies what it keeps. Returns SEC_S_OK,
// SEC_S_BAD_ACLE for a reported duplicate or SEC_S_NO_MEMORY.
int sec__add_acle_to_tree(qz::on_duplicate handling, const qz::acle_view &acle, sec_acltree_t **slot);
int sec__add_acle_to_tree(qz::on_duplicate handling, const sec_acle_t *acle, sec_acltree_t **slot);

// Deletes the entry with the same identity from a tree of its key. Returns SEC_S_OK or SEC_S_ACLE_NOT_FOUND.
int sec__del_acle_from_tree(const sec_acle_t *acle, sec_acltree_t *root);

// Frees a tree made by sec__add_acle_to_tree; null is allowed.
void sec__free_acltree(sec_acltree_t *root);

namespace qz {

// The same for an existing tree.
int add_to_tree(on_duplicate handling, const acle_view &acle, sec_acltree &tree);

struct free_acltree {
    void operator()(sec_acltree_t *root) const { sec__free_acltree(root); }
};
using owned_acltree = std::unique_ptr<sec_acltree_t, free_acltree>;

} // namespace qz

#endif
