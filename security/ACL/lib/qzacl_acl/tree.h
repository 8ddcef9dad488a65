// Trees: the entries of one key, collected in the order in which they are compiled. A key is the type alone
// for unauthenticated, any-other and group entries, and the type with the mechanism for user and expanded
// ones.
//
// A tree of user or group entries is the binary search tree that plain insertion makes, a tree of expanded
// entries the chain of its insertions. Both shapes follow wholly from two sequences, the entries in order of
// insertion and the entries in order of identity: a node heads its subtree because it was inserted first
// among the identities that the subtree spans. So the two sequences are what is kept, and the links are not.
// Finding a duplicate takes one look-up by hash whatever the order of the input; the sorted sequence is made
// when it is first asked for, and nothing here recurses on the size of a tree.
#ifndef QZACL_TREE_H
#define QZACL_TREE_H

#include "owned.h"
#include "qz/acl.h"
#include "qzacl_acl/entry.h"
#include "qzacl_acl/identity_order.h"

#include <cstddef>
#include <cstdint>
#include <span>

namespace qz {

// Memory for the entries of one tree, given back as a whole.
class acle_arena {
public:
    acle_arena() = default;
    acle_arena(const acle_arena &) = delete;
    acle_arena &operator=(const acle_arena &) = delete;
    ~acle_arena();

    // Room for `size` bytes at a multiple of eight, or null; it is taken only by keep().
    unsigned char *room(std::size_t size);
    void keep(std::size_t size) { at_ += size; }

    // What a failed room() asked for.
    std::size_t refused() const { return refused_; }

private:
    struct chunk {
        chunk *previous;
    };
    // Enough for a tree of one or two entries, of which an ACL of many mechanisms has thousands.
    static constexpr std::size_t own_size = 128;

    alignas(std::uint64_t) unsigned char own_[own_size];
    unsigned char *at_ = own_;
    unsigned char *end_ = own_ + own_size;
    chunk *last_ = nullptr;
    std::size_t next_size_ = 4096;
    std::size_t refused_ = 0;
};

} // namespace qz

// One tree; a null pointer is an empty one. It is used by one thread at a time.
struct sec_acltree {
public:
    enum class outcome : std::uint8_t { inserted, duplicate, no_memory };

    explicit sec_acltree(std::uint8_t type) : type_(type) {}
    sec_acltree(const sec_acltree &) = delete;
    sec_acltree &operator=(const sec_acltree &) = delete;

    std::uint8_t type() const { return type_; }
    // The entry inserted first, which names the tree's mechanism.
    const sec_acle_t &root() const { return *entries_[0]; }
    // The entry that compiling meets first: the root, or where it was deleted the nearest node below that
    // holds one. Null when no node does. Asked after in_order() succeeded.
    const sec_acle_t *first_held() const;

    // Inserts a copy. For a duplicate nothing changes and `held` is the entry that is there.
    outcome insert(const qz::acle_view &acle, sec_acle_t *&held);
    // The held entry whose identity equals the given one in any letter case, or null.
    sec_acle_t *find(const char *identity) const;
    // Takes the entry out; its node stays, so that the order of the others does not change.
    void erase(sec_acle_t &acle);

    // All nodes in the order of the tree; those without an entry have the type 0. Returns false, the bytes
    // asked for in `refused`, when memory for sorting is lacking.
    bool in_order(std::span<sec_acle_t *const> &nodes, std::size_t &refused) const;

    // Records the trace points of releasing every node's entry.
    void trace_release() const;

    std::uint32_t held_count() const { return held_count_; }
    // The bytes that the entries take in a sub-ACL.
    std::uint64_t packed_size() const { return packed_size_; }
    // True when an entry's identity is longer than a length field can say.
    bool has_overlong_identity() const { return overlong_count_ != 0; }
    // The bytes that the last failed insertion asked for.
    std::size_t refused() const { return refused_; }

private:
    struct slot {
        std::uint32_t hash;
        std::uint32_t number; // of the entry plus one; 0 in a free slot
    };

    bool is_sorted_by_identity() const { return type_ != SEC_ACLE_EXPANDED && !is_ascending_; }
    sec_acle_t *copy_to_room(const qz::acle_view &acle, std::size_t &size);
    sec_acle_t *find_equal(const sec_acle_t &acle, std::size_t identity_length, std::uint32_t hash) const;
    bool grow_entries();
    void place(slot entry);
    bool prepare_slots();

    static constexpr std::uint32_t own_capacity = 2;

    std::uint8_t type_;
    // While every entry sorted behind the one before it, the entries are their own sorted sequence and no
    // entry has a slot.
    bool is_ascending_ = true;
    std::uint32_t count_ = 0;
    std::uint32_t capacity_ = own_capacity;
    std::uint32_t held_count_ = 0;
    std::uint64_t packed_size_ = 0;
    std::uint32_t overlong_count_ = 0;
    std::size_t refused_ = 0;

    sec_acle_t *own_entries_[own_capacity] = {};
    sec_acle_t **entries_ = own_entries_;
    qz::owned<sec_acle_t *[]> more_entries_;
    mutable qz::owned<sec_acle_t *[]> order_;

    qz::identity_hash_key hash_key_;
    qz::owned<slot[]> slots_;
    unsigned slot_bits_ = 0;
    qz::acle_arena arena_;
};

// The trees of one ACL in the order in which their keys first appeared. A slot whose first insertion failed
// is null.
class sec_acltree_array {
public:
    sec_acltree_array() = default;
    sec_acltree_array(const sec_acltree_array &) = delete;
    sec_acltree_array &operator=(const sec_acltree_array &) = delete;
    ~sec_acltree_array();

    std::span<sec_acltree_t *const> trees() const { return {trees_.get(), static_cast<std::size_t>(count_)}; }

private:
    friend int sec__add_acle_to_trees(const qz::acle_view &acle, sec_acltree_array &array);

    sec_acltree_t **find(const qz::acle_view &acle);
    bool index_last(std::size_t &refused);

    qz::owned<sec_acltree_t *[]> trees_;
    std::int32_t count_ = 0;
    std::int32_t last_found_ = 0;
    // The numbers of the slots plus one, by the hash of their keys: there may be as many mechanisms as
    // entries.
    qz::owned<std::uint32_t[]> index_;
    std::uint32_t index_size_ = 0;
    std::uint32_t indexed_ = 0;
    qz::identity_hash_key hash_key_;
};

// Inserts a copy of the entry into the tree of its key, which is appended when there is none. Returns
// SEC_S_OK, SEC_S_BAD_ACLE for a duplicate or SEC_S_NO_MEMORY.
int sec__add_acle_to_trees(const qz::acle_view &acle, sec_acltree_array &array);
int sec__add_acle_to_trees(const sec_acle_t *acle, sec_acltree_array &array);

// Inserts a copy of the entry into the tree in `*slot`, made when that is null. An entry with the same
// identity is reported when `report_duplicates` is not 0, else it takes the new permission mask. Results as
// above.
int sec__add_acle_to_tree(int report_duplicates, const qz::acle_view &acle, sec_acltree_t **slot);
int sec__add_acle_to_tree(int report_duplicates, const sec_acle_t *acle, sec_acltree_t **slot);

// Deletes the entry with the same identity from a tree of the same key. Returns SEC_S_OK or
// SEC_S_ACLE_NOT_FOUND.
int sec__del_acle_from_tree(const sec_acle_t *acle, sec_acltree_t *root);

// Releases a tree; null is allowed.
void sec__free_acltree(sec_acltree_t *root);

namespace qz {

struct free_acltree {
    void operator()(sec_acltree_t *root) const { sec__free_acltree(root); }
};
using owned_acltree = std::unique_ptr<sec_acltree_t, free_acltree>;

} // namespace qz

#endif
