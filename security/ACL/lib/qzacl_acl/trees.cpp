// The trees of one ACL, found by the keys of entries.
#include "qzacl_acl/trees.h"

#include "base/posix_fold.h"
#include "report.h"
#include "trace_points.h"

#include <algorithm>
#include <cstring>
#include <new>
#include <utility>

using namespace qz;

namespace {

// A mechanism in two words, folded, the rest zero.
using mechanism_words = std::array<std::uint64_t, 2>;

// Of an entry in the text. The parser has folded it, and two words are readable there, so that this takes no call.
mechanism_words words_in_text(std::string_view mechanism) {
    const std::uint64_t first = first_byte_highest(load8(mechanism.data())) & ~bits_after(mechanism.size());
    if (mechanism.size() <= word_size)
        return {first, 0};
    return {first, first_byte_highest(load8(mechanism.data() + word_size)) &
                       ~bits_after(mechanism.size() - word_size)};
}

// Of any other entry.
mechanism_words folded_words(std::string_view mechanism) {
    char padded[mechanism_max] = {};
    std::memcpy(padded, mechanism.data(), mechanism.size());
    return {fold8(load8(padded)), fold8(load8(padded + word_size))};
}

// Reporting duplicates late needs places that ascend in order of insertion over all trees. A trace of lines or releases
// must show none after the first bad entry.
on_duplicate possible_handling(std::span<char> text, on_duplicate wanted) {
    const bool is_traced = traces(trace_category::api) || traces(point::line_too_long) ||
                           traces(point::line_read) || traces(point::parsing);
    return text.empty() || text.size() > identity_store::last_place || is_traced ? on_duplicate::report
                                                                                 : wanted;
}

} // namespace

sec_acltree_array::sec_acltree_array(std::span<char> text, on_duplicate handling)
    : text_(text), handling_(possible_handling(text, handling)) {}

sec_acltree_array::~sec_acltree_array() {
    const bool is_traced = traces(trace_category::api);
    for (std::uint32_t index = count_; index != 0; --index) {
        sec_acltree_t &tree = *trees_[index - 1];
        if (is_traced)
            tree.trace_release();
        tree.~sec_acltree();
    }
}

sec_acltree_array::tree_key sec_acltree_array::key_of(std::uint8_t type, std::string_view mechanism) const {
    if (!has_mechanism(type))
        return {{}, type};
    return {text_.empty() ? folded_words(mechanism) : words_in_text(mechanism), type};
}

std::uint32_t sec_acltree_array::hash_of(const tree_key &key) const {
    std::uint64_t state = hash_word(hash_key_.second, key.type, hash_key_);
    state = hash_word(state, key.mechanism[0], hash_key_);
    state = hash_word(state, key.mechanism[1], hash_key_);
    return static_cast<std::uint32_t>(hash_word(state, hash_key_.second, hash_key_) >> 32);
}

sec_acltree_t *sec_acltree_array::find_tree(const tree_key &key, std::uint32_t hash) const {
    if (index_ == nullptr)
        return nullptr;
    for (std::uint32_t at = hash;; ++at) {
        const slot held = index_[at & (index_size_ - 1)];
        if (held.number == 0)
            return nullptr;
        if (held.hash != hash)
            continue;
        sec_acltree_t *const tree = trees_[held.number - 1];
        if (key_of(tree->type(), tree->mechanism()) == key)
            return tree;
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

int sec_acltree_array::append_tree(const acle_view &acle, const tree_key &key, std::uint32_t hash) {
    if (const shortage lacking = make_room_for_tree())
        return report_no_memory("sec__add_acle_to_trees", lacking);
    if (const shortage lacking = memory_.make_room(sizeof(sec_acltree_t)))
        return report_no_memory("sec__add_acle_to_tree", lacking);
    auto *tree = new (memory_.room()) sec_acltree_t(acle.type, text_);
    if (const int result = add_to_tree(handling_, acle, *tree); result != SEC_S_OK) {
        tree->~sec_acltree();
        return result;
    }
    memory_.keep(sizeof(sec_acltree_t));
    trees_[count_++] = tree;
    enter_in_index({hash, count_});
    last_found_ = tree;
    last_key_ = key;
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
    const int result = insert(acle);
    return result == SEC_S_OK ? SEC_S_OK : settle(result);
}

int sec_acltree_array::insert(const acle_view &acle) {
    if (!may_borrow(acle))
        return report(SEC_S_INTERNAL, msg::internal_failure, acl_source, __LINE__, SEC_S_INTERNAL);
    const tree_key key = key_of(acle.type, acle.mechanism);
    if (last_found_ == nullptr || key != last_key_) {
        const std::uint32_t hash = hash_of(key);
        sec_acltree_t *found = find_tree(key, hash);
        if (found == nullptr)
            return append_tree(acle, key, hash);
        last_found_ = found;
        last_key_ = key;
    }
    return add_to_tree(handling_, acle, *last_found_);
}

void sec_acltree_array::expect(const acle_view &acle) const {
    constexpr int for_writing = 1;
    // Most entries have the key of the previous one.
    if (last_found_ != nullptr && key_of(acle.type, acle.mechanism) == last_key_)
        __builtin_prefetch(last_found_->first_look(acle), for_writing);
}

int sec_acltree_array::settle(int result) const {
    if (handling_ != on_duplicate::report_late)
        return result;
    std::optional<small_entry> first;
    const sec_acltree_t *its_tree = nullptr;
    for (sec_acltree_t *tree : trees()) {
        const std::optional<small_entry> found = tree->first_duplicate();
        if (found && (!first || found->place < first->place)) {
            first = found;
            its_tree = tree;
        }
    }
    return first ? sec__report_duplicate(its_tree->view(*first)) : result;
}

int sec__add_acle_to_trees(const acle_view &acle, sec_acltree_array &array) { return array.add(acle); }

int sec__add_acle_to_trees(const sec_acle_t *acle, sec_acltree_array &array) {
    return array.add(view_of(*acle));
}
