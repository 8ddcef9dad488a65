// A tree: the entries of one key, collected in the order in which they are compiled. A key is the type alone for
// unauthenticated, any-other and group entries, and the type with the mechanism for user and expanded ones.
//
// Entries stand in order of insertion, and those of users and groups are sorted by identity when their order is first
// asked for. A duplicate is found by one look-up by hash whatever the order of the input, and nothing here recurses on
// the size of a tree. tree_shape.h knows the one thing for which the shape of a linked tree matters.
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
#include <span>

// One tree; a null pointer is an empty one. It is used by one thread at a time.
struct sec_acltree {
public:
    enum class outcome : std::uint8_t { inserted, duplicate, no_memory };
    struct insertion {
        outcome result;
        qz::small_entry *entry; // the new one, or the one that was there
        qz::shortage lacking;
    };

    // The identities of the entries stand in the text, or are copied when that is empty.
    sec_acltree(std::uint8_t type, std::span<char> text)
        : identities_(qz::has_identity(type) ? text : std::span<char>()), type_(type) {}
    sec_acltree(const sec_acltree &) = delete;
    sec_acltree &operator=(const sec_acltree &) = delete;

    std::uint8_t type() const { return type_; }
    // The mechanism of the key, as the entry that was inserted first spells it.
    std::string_view mechanism() const { return identities_.first_mechanism(); }

    // For a duplicate nothing changes.
    insertion insert(const qz::acle_view &acle);
    // What the insertion of an entry of the text will look at first; null when there is no saying.
    const void *first_look(const qz::acle_view &acle) const {
        const char *const text = acle.identity.data();
        return table_.room() == 0 ? nullptr : table_.first_look(table_.hash(text, qz::ordered_word(text)));
    }
    // The held entry whose identity equals the wanted one in any letter case, or null.
    qz::small_entry *find_entry(const char *wanted);
    // Takes the entry out; its node stays, so that the order of the others does not change.
    void erase(qz::small_entry &entry);

    // All entries in the order of the tree, deleted ones among them.
    std::span<const qz::small_entry> in_order() const;
    std::span<qz::small_entry> in_order();
    // An entry with its texts, and as a record that borrows them.
    qz::acle_view view(const qz::small_entry &entry) const;
    sec_acle_t record(const qz::small_entry &entry) const;
    const char *identity(const qz::small_entry &entry) const { return identities_.identity(entry.place); }
    // The mechanism that the compiled sub-ACL bears. There is an entry.
    std::string_view compiled_mechanism() const;

    // Records the trace points of releasing every node's entry. The entries are lost.
    void trace_release();

    std::uint32_t held_count() const { return held_count_; }
    // The bytes that the entries take in a sub-ACL.
    std::uint64_t packed_size() const { return packed_size_; }
    // True when an entry's identity is longer than a length field can say.
    bool has_overlong_identity() const { return overlong_count_ != 0; }

private:
    // What an insertion knows of its entry.
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

    // The order of the entries is no part of what a tree is, so that sorting changes none.
    mutable qz::entry_array entries_;
    mutable qz::identity_table table_;
    qz::identity_store identities_;
    std::uint64_t packed_size_ = 0;
    std::uint32_t held_count_ = 0;
    std::uint32_t overlong_count_ = 0;
    mutable bool has_whole_keys_ = true; // until sorting leaves out of the keys what all identities share
    // While every entry sorts behind the one before it, no entry is in the table.
    mutable bool is_ascending_ = true;
    std::uint8_t type_;
};

// Inserts the entry into the tree in `*slot`, made when that is null; the tree copies what it keeps. Returns SEC_S_OK,
// SEC_S_BAD_ACLE for a reported duplicate or SEC_S_NO_MEMORY.
int sec__add_acle_to_tree(qz::on_duplicate handling, const qz::acle_view &acle, sec_acltree_t **slot);
int sec__add_acle_to_tree(qz::on_duplicate handling, const sec_acle_t *acle, sec_acltree_t **slot);

// Deletes the entry with the same identity from a tree of the same key. Returns SEC_S_OK or SEC_S_ACLE_NOT_FOUND.
int sec__del_acle_from_tree(const sec_acle_t *acle, sec_acltree_t *root);

// Releases a tree that sec__add_acle_to_tree made; null is allowed.
void sec__free_acltree(sec_acltree_t *root);

namespace qz {

// The same insertion into a tree that is there.
int add_to_tree(on_duplicate handling, const acle_view &acle, sec_acltree &tree);

struct free_acltree {
    void operator()(sec_acltree_t *root) const { sec__free_acltree(root); }
};
using owned_acltree = std::unique_ptr<sec_acltree_t, free_acltree>;

} // namespace qz

#endif
