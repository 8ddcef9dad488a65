// The trees of one ACL, and finding the one of an entry's key among them.
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

// Trees in the order in which their keys first appeared.
class sec_acltree_array {
public:
    // For entries that are all parsed from the text, its NUL included, with as many readable bytes behind it as
    // identity_order.h asks for; it outlives the trees. An entry from elsewhere is refused as an internal failure.
    // With an empty text the trees copy what they keep.
    explicit sec_acltree_array(std::span<char> text = {}) : text_(text) {}
    sec_acltree_array(const sec_acltree_array &) = delete;
    sec_acltree_array &operator=(const sec_acltree_array &) = delete;
    ~sec_acltree_array();

    std::span<sec_acltree_t *const> trees() const { return {trees_.get(), count_}; }

    // Fetches the memory that inserting an entry of a text looks at, for those who have something else to do first.
    void expect(const qz::acle_view &acle) const;

    // What sec__add_acle_to_trees does.
    int add(const qz::acle_view &acle);

    // The same for entries of a text of which the first failure ends all: some wait, while the memory that their
    // insertion looks at is fetched. The result may be that of an entry that waited.
    int add_soon(const qz::acle_view &acle);
    // Inserts what waits. Returns the failure of one of these, else `result`, which came after them.
    int settle(int result);

private:
    struct slot {
        std::uint32_t hash;
        std::uint32_t number; // of the tree plus one; 0 in a free slot
    };

    bool may_borrow(const qz::acle_view &acle) const;

    static constexpr std::uint32_t waiting_max = 16;

    sec_acltree_t *find(const qz::acle_view &acle, std::uint32_t hash);
    int append(const qz::acle_view &acle, std::uint32_t hash);
    bool prepare(std::size_t &refused);
    void enter(slot entry);

    std::span<char> text_;
    qz::owned<sec_acltree_t *[]> trees_;
    std::uint32_t count_ = 0;
    std::uint32_t capacity_ = 0;
    sec_acltree_t *last_found_ = nullptr;
    // The trees by the hashes of their keys: there may be as many mechanisms as entries.
    qz::owned<slot[]> index_;
    std::uint32_t index_size_ = 0;
    qz::identity_hash_key hash_key_ = qz::make_identity_hash_key();
    qz::arena memory_; // of the trees themselves
    qz::acle_view waiting_[waiting_max];
    std::uint32_t first_waiting_ = 0;
    std::uint32_t waiting_count_ = 0;
};

// Inserts the entry into the tree of its key, which is appended when there is none. Returns SEC_S_OK, SEC_S_BAD_ACLE
// for a duplicate or SEC_S_NO_MEMORY.
int sec__add_acle_to_trees(const qz::acle_view &acle, sec_acltree_array &array);
int sec__add_acle_to_trees(const sec_acle_t *acle, sec_acltree_array &array);

#endif
