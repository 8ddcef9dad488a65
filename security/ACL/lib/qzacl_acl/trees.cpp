// The trees of one ACL, found by the keys of entries.
#include "qzacl_acl/trees.h"

#include "base/posix_fold.h"
#include "qzacl_trace.h"
#include "report.h"

#include <algorithm>
#include <cstring>
#include <new>
#include <utility>

using namespace qz;

namespace {

bool equals_folded(std::string_view one, std::string_view other) {
    return std::equal(one.begin(), one.end(), other.begin(), other.end(), [](char a, char b) {
        return fold(static_cast<unsigned char>(a)) == fold(static_cast<unsigned char>(b));
    });
}

std::uint32_t hash_of_key(const acle_view &acle, const identity_hash_key &key) {
    char mechanism[mechanism_max] = {};
    if (has_mechanism(acle.type))
        std::memcpy(mechanism, acle.mechanism.data(), acle.mechanism.size());
    std::uint64_t state = hash_word(key.second, acle.type, key);
    state = hash_word(state, fold8(load8(mechanism)), key);
    state = hash_word(state, fold8(load8(mechanism + sizeof(std::uint64_t))), key);
    return static_cast<std::uint32_t>(hash_word(state, key.second, key) >> 32);
}

} // namespace

sec_acltree_array::~sec_acltree_array() {
    const bool is_traced = traces(trace_category::api);
    for (std::uint32_t index = count_; index != 0; --index) {
        sec_acltree_t &tree = *trees_[index - 1];
        if (is_traced)
            tree.trace_release();
        tree.~sec_acltree();
    }
}

bool sec_acltree_array::is_of_key(const sec_acltree_t &tree, const acle_view &acle) const {
    if (tree.type() != acle.type)
        return false;
    if (!has_mechanism(acle.type))
        return true;
    // The parser has folded the mechanisms of a text.
    return text_.empty() ? equals_folded(tree.mechanism(), acle.mechanism)
                         : tree.mechanism() == acle.mechanism;
}

sec_acltree_t *sec_acltree_array::find_tree(const acle_view &acle, std::uint32_t hash) {
    if (index_ == nullptr)
        return nullptr;
    for (std::uint32_t at = hash;; ++at) {
        const slot held = index_[at & (index_size_ - 1)];
        if (held.number == 0)
            return nullptr;
        if (held.hash == hash && is_of_key(*trees_[held.number - 1], acle))
            return trees_[held.number - 1];
    }
}

void sec_acltree_array::enter_in_index(slot entry) {
    std::uint32_t at = entry.hash;
    while (index_[at & (index_size_ - 1)].number != 0)
        ++at;
    index_[at & (index_size_ - 1)] = entry;
}

// Makes room for one more tree. A quarter of the index stays free.
shortage sec_acltree_array::make_room_for_tree() {
    if (count_ == capacity_) {
        const std::uint32_t capacity = std::max(capacity_ * 2, std::uint32_t{8});
        if (!reallocate(trees_, capacity))
            return shortage(capacity * sizeof(sec_acltree_t *));
        capacity_ = capacity;
    }
    if (count_ < index_size_ / 4 * 3)
        return {};
    const std::uint32_t size = std::max(index_size_ * 4, std::uint32_t{16});
    owned<slot[]> grown(static_cast<slot *>(std::calloc(size, sizeof(slot))));
    if (grown == nullptr)
        return shortage(size * sizeof(slot));
    const owned<slot[]> old = std::exchange(index_, std::move(grown));
    const std::uint32_t old_size = std::exchange(index_size_, size);
    for (std::uint32_t at = 0; at < old_size; ++at) {
        if (old[at].number != 0)
            enter_in_index(old[at]);
    }
    return {};
}

int sec_acltree_array::append_tree(const acle_view &acle, std::uint32_t hash) {
    if (const shortage lacking = make_room_for_tree())
        return report_no_memory("sec__add_acle_to_trees", lacking);
    if (const shortage lacking = memory_.make_room(sizeof(sec_acltree_t)))
        return report_no_memory("sec__add_acle_to_tree", lacking);
    auto *tree = new (memory_.room()) sec_acltree_t(acle.type, text_);
    if (const int result = add_to_tree(on_duplicate::report, acle, *tree); result != SEC_S_OK) {
        tree->~sec_acltree();
        return result;
    }
    memory_.keep(sizeof(sec_acltree_t));
    trees_[count_++] = tree;
    enter_in_index({hash, count_});
    last_found_ = tree;
    return SEC_S_OK;
}

// Places in the text are computed by subtraction, which is valid only for strings inside it.
bool sec_acltree_array::may_borrow(const acle_view &acle) const {
    const auto is_in_text = [this](std::string_view piece) {
        const auto start = reinterpret_cast<std::uintptr_t>(piece.data());
        return start - reinterpret_cast<std::uintptr_t>(text_.data()) < text_.size();
    };
    return text_.empty() || !has_identity(acle.type) ||
           (is_in_text(acle.identity) && (!has_mechanism(acle.type) || is_in_text(acle.mechanism)));
}

int sec_acltree_array::add(const acle_view &acle) {
    if (!may_borrow(acle))
        return report(SEC_S_INTERNAL, msg::internal_failure, acl_source, __LINE__, SEC_S_INTERNAL);
    if (last_found_ == nullptr || !is_of_key(*last_found_, acle)) {
        const std::uint32_t hash = hash_of_key(acle, hash_key_);
        sec_acltree_t *found = find_tree(acle, hash);
        if (found == nullptr)
            return append_tree(acle, hash);
        last_found_ = found;
    }
    return add_to_tree(on_duplicate::report, acle, *last_found_);
}

void sec_acltree_array::expect(const acle_view &acle) const {
    constexpr int for_writing = 1;
    // Most entries have the key of the previous one.
    if (last_found_ != nullptr && is_of_key(*last_found_, acle))
        __builtin_prefetch(last_found_->first_look(acle), for_writing);
}

int sec_acltree_array::add_soon(const acle_view &acle) {
    int result = SEC_S_OK;
    acle_view &oldest = waiting_[first_waiting_];
    if (waiting_count_ == waiting_max)
        result = add(oldest);
    else
        ++waiting_count_;
    expect(acle);
    oldest = acle;
    first_waiting_ = (first_waiting_ + 1) % waiting_max;
    return result;
}

int sec_acltree_array::settle(int result) {
    const std::uint32_t count = std::exchange(waiting_count_, 0);
    for (std::uint32_t left = count; left != 0; --left) {
        const int added = add(waiting_[(first_waiting_ + waiting_max - left) % waiting_max]);
        if (added != SEC_S_OK)
            return added;
    }
    return result;
}

int sec__add_acle_to_trees(const acle_view &acle, sec_acltree_array &array) { return array.add(acle); }

int sec__add_acle_to_trees(const sec_acle_t *acle, sec_acltree_array &array) {
    return array.add(view_of(*acle));
}
