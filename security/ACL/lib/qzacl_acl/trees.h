// The trees of one ACL, found by the keys of entries.
#ifndef QZACL_TREES_H
#define QZACL_TREES_H

#include "base/owned.h"
#include "qz/acl.h"
#include "qzacl_acl/arena.h"
#include "qzacl_acl/entry.h"
#include "qzacl_acl/identity_order.h"
#include "qzacl_acl/tree.h"

#include <array>
#include <cstddef>
#include <cstdint>
#include <span>
#include <string_view>

// Trees in order of the first appearance of their keys.
class sec_acltree_array {
public:
    // For entries parsed from the text, which includes a NUL, outlives the trees, and has the readable bytes after
    // it that identity_order.h requires. Other entries fail with an internal error. With an empty text the trees
    // copy what they keep.
    //
    // A reader that ends at the first failure may have duplicates reported late: sorting takes less time than looking
    // for each. Where the text or tracing does not allow it, they are reported at once.
    explicit sec_acltree_array(std::span<char> text = {},
                               qz::on_duplicate handling = qz::on_duplicate::report);
    sec_acltree_array(const sec_acltree_array &) = delete;
    sec_acltree_array &operator=(const sec_acltree_array &) = delete;
    ~sec_acltree_array();

    std::span<sec_acltree_t *const> trees() const { return {trees_.get(), count_}; }

    // Prefetches the memory that add() reads to report a duplicate at once, for callers with other work to do first.
    void expect(const qz::acle_view &acle) const;

    // Implements sec__add_acle_to_trees. When duplicates are reported late, a failure is that of the first bad entry so far.
    int add(const qz::acle_view &acle);

    // Reports the first duplicate, if that is done late and there is one. Otherwise returns `result`, which came after all
    // entries.
    int settle(int result) const;

private:
    struct tree_key {
        std::array<std::uint64_t, 2> mechanism; // folded, the rest zero; all zero for types without one
        std::uint8_t type;

        bool operator==(const tree_key &) const = default;
    };
    struct slot {
        std::uint32_t hash;
        std::uint32_t number; // number of the tree plus one; 0 in a free slot
    };

    tree_key key_of(std::uint8_t type, std::string_view mechanism) const;
    std::uint32_t hash_of(const tree_key &key) const;
    bool may_borrow(const qz::acle_view &acle) const;

    sec_acltree_t *find_tree(const tree_key &key, std::uint32_t hash) const;
    int append_tree(const qz::acle_view &acle, const tree_key &key, std::uint32_t hash);
    int insert(const qz::acle_view &acle);
    qz::shortage make_room_for_tree();
    void enter_in_index(slot entry);

    std::span<char> text_;
    const qz::on_duplicate handling_;
    qz::owned<sec_acltree_t *[]> trees_;
    std::uint32_t count_ = 0;
    std::uint32_t capacity_ = 0;
    sec_acltree_t *last_found_ = nullptr;
    tree_key last_key_ = {};
    // A hash table of trees by key: there may be as many mechanisms as entries.
    qz::owned<slot[]> index_;
    std::uint32_t index_size_ = 0;
    qz::identity_hash_key hash_key_ = qz::make_identity_hash_key();
    qz::arena memory_; // of the trees themselves
};

// Inserts the entry into the tree of its key, which is appended if missing. Returns SEC_S_OK, SEC_S_BAD_ACLE for a
// duplicate or SEC_S_NO_MEMORY.
int sec__add_acle_to_trees(const qz::acle_view &acle, sec_acltree_array &array);
int sec__add_acle_to_trees(const sec_acle_t *acle, sec_acltree_array &array);

#endif
