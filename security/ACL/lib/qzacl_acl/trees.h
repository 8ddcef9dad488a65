// The trees of one ACL, found by the keys of entries.
#ifndef QZACL_TREES_H
#define QZACL_TREES_H

#include "base/owned.h"
#include "qz/acl.h"
#include "qzacl_acl/arena.h"
#include "qzacl_acl/entry.h"
#include "qzacl_acl/identity_order.h"
#include "qzacl_acl/tree.h"

#include <cstddef>
#include <cstdint>
#include <span>

// Trees in order of the first appearance of their keys.
class sec_acltree_array {
public:
    // For entries parsed from the text, which includes a NUL, outlives the trees, and has the readable bytes after
    // it that identity_order.h requires. Other entries fail with an internal error. With an empty text the trees
    // copy what they keep.
    explicit sec_acltree_array(std::span<char> text = {}) : text_(text) {}
    sec_acltree_array(const sec_acltree_array &) = delete;
    sec_acltree_array &operator=(const sec_acltree_array &) = delete;
    ~sec_acltree_array();

    std::span<sec_acltree_t *const> trees() const { return {trees_.get(), count_}; }

    // Prefetches the memory that inserting an entry of a text reads, for callers with other work to do first.
    void expect(const qz::acle_view &acle) const;

    // Implements sec__add_acle_to_trees.
    int add(const qz::acle_view &acle);

    // The same for a text whose first failure ends the reading. Entries wait in a queue while the memory for their
    // insertion is prefetched, so the result may be that of an earlier entry.
    int add_soon(const qz::acle_view &acle);
    // Inserts the waiting entries. Returns the first failure, or else `result`, which came after them.
    int settle(int result);

private:
    struct slot {
        std::uint32_t hash;
        std::uint32_t number; // number of the tree plus one; 0 in a free slot
    };

    bool is_of_key(const sec_acltree_t &tree, const qz::acle_view &acle) const;
    bool may_borrow(const qz::acle_view &acle) const;

    static constexpr std::uint32_t waiting_max = 16;

    sec_acltree_t *find_tree(const qz::acle_view &acle, std::uint32_t hash);
    int append_tree(const qz::acle_view &acle, std::uint32_t hash);
    qz::shortage make_room_for_tree();
    void enter_in_index(slot entry);

    std::span<char> text_;
    qz::owned<sec_acltree_t *[]> trees_;
    std::uint32_t count_ = 0;
    std::uint32_t capacity_ = 0;
    sec_acltree_t *last_found_ = nullptr;
    // A hash table of trees by key: there may be as many mechanisms as entries.
    qz::owned<slot[]> index_;
    std::uint32_t index_size_ = 0;
    qz::identity_hash_key hash_key_ = qz::make_identity_hash_key();
    qz::arena memory_; // of the trees themselves
    qz::acle_view waiting_[waiting_max];
    std::uint32_t first_waiting_ = 0;
    std::uint32_t waiting_count_ = 0;
};

// Inserts the entry into the tree of its key, which is appended if missing. Returns SEC_S_OK, SEC_S_BAD_ACLE for a
// duplicate or SEC_S_NO_MEMORY.
int sec__add_acle_to_trees(const qz::acle_view &acle, sec_acltree_array &array);
int sec__add_acle_to_trees(const sec_acle_t *acle, sec_acltree_array &array);

#endif
