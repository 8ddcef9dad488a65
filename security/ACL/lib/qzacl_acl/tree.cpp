// Trees: the entries of one key, collected in the order in which they are compiled.
#include "qzacl_acl/tree.h"

#include "qzacl_acl/buffer_format.h"
#include "report.h"
#include "trace_points.h"

#include <algorithm>
#include <new>
#include <utility>

namespace qz {

acle_arena::~acle_arena() {
    for (chunk *at = last_; at != nullptr;) {
        chunk *previous = at->previous;
        std::free(at);
        at = previous;
    }
}

unsigned char *acle_arena::room(std::size_t size) {
    constexpr std::size_t largest_chunk = std::size_t{1} << 20;
    if (size <= static_cast<std::size_t>(end_ - at_))
        return at_;
    const std::size_t chunk_size = std::max(next_size_, size + sizeof(chunk));
    auto *memory = static_cast<unsigned char *>(std::malloc(chunk_size));
    if (memory == nullptr) {
        refused_ = chunk_size;
        return nullptr;
    }
    last_ = new (memory) chunk{last_};
    at_ = memory + sizeof(chunk);
    end_ = memory + chunk_size;
    next_size_ = std::min(next_size_ * 2, largest_chunk);
    return at_;
}

} // namespace qz

namespace {

// An entry with its identity behind it, padded with NULs to whole words.
std::size_t node_size(std::size_t identity_length) {
    return sizeof(sec_acle_t) + qz::identity_words(identity_length) * sizeof(std::uint64_t);
}

// Single entries have no identity of their own; an empty one keeps their handling alike.
const char *identity_of(const sec_acle_t &acle) { return acle.identity == nullptr ? "" : acle.identity; }

std::uint32_t is_overlong(std::size_t identity_length) {
    return identity_length > qz::format::identity_max ? 1 : 0;
}

std::size_t packed_size_of(std::uint8_t type, std::size_t identity_length) {
    return qz::format::entry_fixed_size + (qz::has_identity(type) ? identity_length + 1 : 0);
}

} // namespace

sec_acle_t *sec_acltree::copy_to_room(const sec_acle_t &acle, std::size_t identity_length,
                                      std::size_t &size) {
    size = node_size(identity_length);
    unsigned char *memory = arena_.room(size);
    if (memory == nullptr) {
        refused_ = arena_.refused();
        return nullptr;
    }
    char *identity = reinterpret_cast<char *>(memory + sizeof(sec_acle_t));
    std::memset(memory + size - sizeof(std::uint64_t), 0, sizeof(std::uint64_t));
    std::memcpy(identity, identity_of(acle), identity_length);
    auto *copy = new (memory) sec_acle_t(acle);
    copy->identity = identity;
    return copy;
}

void sec_acltree::place(slot entry) {
    // The high bits choose the slot, so that growing moves the entries in the order in which they stand.
    const std::size_t mask = (std::size_t{1} << slot_bits_) - 1;
    std::size_t at = entry.hash >> (32 - slot_bits_);
    while (slots_[at].number != 0)
        at = (at + 1) & mask;
    slots_[at] = entry;
}

// Makes sure of a free slot for one more entry, at most five of eight being taken.
bool sec_acltree::prepare_slots() {
    constexpr unsigned first_bits = 4;
    unsigned bits = std::max(slot_bits_, first_bits);
    while ((std::uint64_t{count_} + 1) * 8 > std::uint64_t{5} << bits)
        ++bits;
    if (slots_ != nullptr && bits == slot_bits_)
        return true;
    const std::size_t size = std::size_t{1} << bits;
    qz::owned<slot[]> grown(static_cast<slot *>(std::calloc(size, sizeof(slot))));
    if (grown == nullptr) {
        refused_ = size * sizeof(slot);
        return false;
    }
    const std::size_t old_size = std::size_t{1} << slot_bits_;
    const qz::owned<slot[]> old = std::exchange(slots_, std::move(grown));
    slot_bits_ = bits;
    if (old != nullptr) {
        for (std::size_t at = 0; at < old_size; ++at) {
            if (old[at].number != 0)
                place(old[at]);
        }
        return true;
    }
    // The entries so far came in ascending order and had no slots.
    hash_key_ = qz::make_identity_hash_key();
    for (std::uint32_t number = 0; number < count_; ++number) {
        const char *identity = entries_[number]->identity;
        place({qz::hash_identity(identity, std::strlen(identity), hash_key_), number + 1});
    }
    return true;
}

sec_acle_t *sec_acltree::find_equal(const sec_acle_t &acle, std::size_t identity_length,
                                    std::uint32_t hash) const {
    const std::size_t mask = (std::size_t{1} << slot_bits_) - 1;
    for (std::size_t at = hash >> (32 - slot_bits_); slots_[at].number != 0; at = (at + 1) & mask) {
        if (slots_[at].hash != hash)
            continue;
        sec_acle_t *held = entries_[slots_[at].number - 1];
        if (qz::identities_are_equal(acle.identity, identity_length, held->identity))
            return held;
    }
    return nullptr;
}

bool sec_acltree::grow_entries() {
    if (count_ < capacity_)
        return true;
    const std::uint32_t capacity = capacity_ * 2;
    if (!qz::reallocate(more_entries_, capacity)) {
        refused_ = capacity * sizeof(sec_acle_t *);
        return false;
    }
    if (entries_ == own_entries_)
        std::copy_n(own_entries_, count_, more_entries_.get());
    entries_ = more_entries_.get();
    capacity_ = capacity;
    return true;
}

sec_acltree::outcome sec_acltree::insert(const sec_acle_t &acle, sec_acle_t *&held) {
    if (qz::is_single_type(type_) && count_ != 0) {
        held = entries_[0];
        return outcome::duplicate;
    }
    const std::size_t length = std::strlen(identity_of(acle));
    std::size_t size = 0;
    sec_acle_t *copy = copy_to_room(acle, length, size);
    if (copy == nullptr || !grow_entries())
        return outcome::no_memory;

    if (is_ascending_ && count_ != 0) {
        const int order = qz::compare_identities(copy->identity, entries_[count_ - 1]->identity);
        if (order == 0) {
            held = entries_[count_ - 1];
            return outcome::duplicate;
        }
        if (order < 0) {
            if (!prepare_slots())
                return outcome::no_memory;
            is_ascending_ = false;
        }
    }
    if (!is_ascending_) {
        if (!prepare_slots())
            return outcome::no_memory;
        const std::uint32_t hash = qz::hash_identity(copy->identity, length, hash_key_);
        held = find_equal(*copy, length, hash);
        if (held != nullptr)
            return outcome::duplicate;
        place({hash, count_ + 1});
    }
    arena_.keep(size);
    entries_[count_++] = copy;
    order_.reset();
    ++held_count_;
    packed_size_ += packed_size_of(type_, length);
    overlong_count_ += is_overlong(length);
    held = copy;
    return outcome::inserted;
}

sec_acle_t *sec_acltree::find(const char *identity) const {
    const std::span<sec_acle_t *const> entries(entries_, count_);
    const auto is_match = [identity](const sec_acle_t *acle) {
        return acle->type != 0 && cu_strcasecmp_posix_1(identity, acle->identity) == 0;
    };
    if (is_ascending_) {
        const auto at = std::lower_bound(entries.begin(), entries.end(), identity,
                                         [](const sec_acle_t *acle, const char *wanted) {
                                             return cu_strcasecmp_posix_1(acle->identity, wanted) < 0;
                                         });
        return at != entries.end() && is_match(*at) ? *at : nullptr;
    }
    // Deleting is one step of an edit that has read all entries before; it must not need memory to hash a
    // name.
    const auto at = std::find_if(entries.begin(), entries.end(), is_match);
    return at == entries.end() ? nullptr : *at;
}

void sec_acltree::erase(sec_acle_t &acle) {
    const std::size_t length = std::strlen(acle.identity);
    packed_size_ -= packed_size_of(type_, length);
    overlong_count_ -= is_overlong(length);
    --held_count_;
    acle.type = 0;
}

// In post-order. In the order of identities a node is done with when one comes that was inserted before it: all that
// is below it stands between the two.
void sec_acltree::trace_release() const {
    const auto trace = [this](std::uint32_t number) {
        sec__trace_release(entries_[number]->type == 0 ? nullptr : entries_[number]);
    };
    std::span<sec_acle_t *const> nodes;
    std::size_t refused = 0;
    const auto memory = qz::allocate<std::uint32_t>(std::size_t{count_} * 2);
    if (!is_sorted_by_identity() || memory == nullptr || !in_order(nodes, refused)) {
        // A chain to the right; without memory this keeps each node behind those below it, too.
        for (std::uint32_t number = count_; number != 0; --number)
            trace(number - 1);
        return;
    }
    const std::span numbers(memory.get(), count_);
    std::uint32_t *const waiting = memory.get() + count_;
    for (std::uint32_t number = 0; number < count_; ++number) {
        const auto at = std::lower_bound(nodes.begin(), nodes.end(), entries_[number],
                                         [](const sec_acle_t *a, const sec_acle_t *b) {
                                             return qz::compare_identities(a->identity, b->identity) < 0;
                                         });
        numbers[static_cast<std::size_t>(at - nodes.begin())] = number;
    }
    std::uint32_t depth = 0;
    for (const std::uint32_t number : numbers) {
        while (depth != 0 && waiting[depth - 1] > number)
            trace(waiting[--depth]);
        waiting[depth++] = number;
    }
    while (depth != 0)
        trace(waiting[--depth]);
}

bool sec_acltree::in_order(std::span<sec_acle_t *const> &nodes, std::size_t &refused) const {
    if (!is_sorted_by_identity()) {
        nodes = {entries_, count_};
        return true;
    }
    if (order_ == nullptr) {
        auto order = qz::allocate<sec_acle_t *>(count_);
        const auto scratch = qz::allocate<qz::keyed_acle>(std::size_t{count_} * 2);
        if (order == nullptr || scratch == nullptr) {
            refused = order == nullptr ? count_ * sizeof(sec_acle_t *) : count_ * sizeof(qz::keyed_acle) * 2;
            return false;
        }
        std::copy_n(entries_, count_, order.get());
        qz::sort_by_identity({order.get(), count_}, scratch.get(), scratch.get() + count_);
        order_ = std::move(order);
    }
    nodes = {order_.get(), count_};
    return true;
}

const sec_acle_t *sec_acltree::first_held() const {
    const auto is_held = [](const sec_acle_t *acle) { return acle->type != 0; };
    if (held_count_ == 0)
        return nullptr;
    if (is_held(entries_[0]))
        return entries_[0];
    if (!is_sorted_by_identity()) // a chain to the right
        return *std::find_if(entries_, entries_ + count_, is_held);
    // Below the root hang the nodes that sort before it, then those behind it, each side headed by the one
    // that was inserted first; and so on below every node without an entry.
    const auto precedes = [](const sec_acle_t *a, const sec_acle_t *b) {
        return qz::compare_identities(a->identity, b->identity) < 0;
    };
    std::span<sec_acle_t *const> side(order_.get(), count_);
    for (std::uint32_t number = 0; number < count_; ++number) {
        sec_acle_t *node = entries_[number];
        if (precedes(node, side.front()) || precedes(side.back(), node))
            continue; // on another side
        if (is_held(node))
            return node;
        const auto at = std::lower_bound(side.begin(), side.end(), node, precedes);
        const auto before = static_cast<std::size_t>(at - side.begin());
        side = std::any_of(side.begin(), at, is_held) ? side.first(before) : side.subspan(before + 1);
    }
    return nullptr;
}

sec_acltree_array::~sec_acltree_array() {
    for (std::int32_t index = count_; index > 0; --index)
        sec__free_acltree(trees_[static_cast<std::size_t>(index - 1)]);
}

namespace {

bool is_of_key(const sec_acltree_t *tree, const sec_acle_t &acle) {
    return tree != nullptr && tree->type() == acle.type &&
           (!qz::has_mechanism(acle.type) ||
            cu_strcasecmp_posix_1(tree->root().mechanism, acle.mechanism) == 0);
}

std::uint32_t hash_of_key(const sec_acle_t &acle, const qz::identity_hash_key &key) {
    // The mechanism in whole words, padded with NULs and the type behind its own.
    char padded[24] = {};
    if (qz::has_mechanism(acle.type))
        std::memcpy(padded, acle.mechanism, strnlen(acle.mechanism, qz::mechanism_max));
    padded[sizeof padded - 1] = static_cast<char>(acle.type);
    return qz::hash_identity(padded, sizeof padded - 1, key);
}

} // namespace

sec_acltree_t **sec_acltree_array::find(const sec_acle_t &acle) {
    if (count_ == 0)
        return nullptr;
    const auto tree = [this](std::int32_t number) { return &trees_[static_cast<std::size_t>(number)]; };
    if (is_of_key(*tree(last_found_), acle))
        return tree(last_found_);
    if (index_ == nullptr)
        return nullptr;
    for (std::uint32_t at = hash_of_key(acle, hash_key_);; ++at) {
        const std::uint32_t number = index_[at & (index_size_ - 1)];
        if (number == 0)
            return nullptr;
        const auto found = static_cast<std::int32_t>(number - 1);
        if (is_of_key(*tree(found), acle)) {
            last_found_ = found;
            return tree(found);
        }
    }
}

// Enters the last slot into the index; half of it stays free.
bool sec_acltree_array::index_last(std::size_t &refused) {
    constexpr std::uint32_t first_size = 16;
    const auto enter = [this](std::uint32_t *index, std::uint32_t size, std::uint32_t number) {
        std::uint32_t at = hash_of_key(trees_[number]->root(), hash_key_);
        while (index[at & (size - 1)] != 0)
            ++at;
        index[at & (size - 1)] = number + 1;
    };
    if ((indexed_ + 1) * 2 > index_size_) {
        const std::uint32_t size = index_size_ == 0 ? first_size : index_size_ * 2;
        qz::owned<std::uint32_t[]> grown(
            static_cast<std::uint32_t *>(std::calloc(size, sizeof(std::uint32_t))));
        if (grown == nullptr) {
            refused = size * sizeof(std::uint32_t);
            return false;
        }
        if (index_ == nullptr)
            hash_key_ = qz::make_identity_hash_key();
        for (std::uint32_t at = 0; at < index_size_; ++at) {
            if (index_[at] != 0)
                enter(grown.get(), size, index_[at] - 1);
        }
        index_ = std::move(grown);
        index_size_ = size;
    }
    enter(index_.get(), index_size_, static_cast<std::uint32_t>(count_ - 1));
    ++indexed_;
    last_found_ = count_ - 1;
    return true;
}

int sec__add_acle_to_trees(const sec_acle_t *acle, sec_acltree_array &array) {
    constexpr const char *function = "sec__add_acle_to_trees";
    if (sec_acltree_t **slot = array.find(*acle); slot != nullptr)
        return sec__add_acle_to_tree(1, acle, slot);

    const std::size_t count = static_cast<std::size_t>(array.count_) + 1;
    if (!qz::reallocate(array.trees_, count))
        return qz::report_no_memory(function, count * sizeof(sec_acltree_t *));
    sec_acltree_t **slot = &array.trees_[count - 1];
    *slot = nullptr;
    ++array.count_;
    if (const int result = sec__add_acle_to_tree(1, acle, slot); result != SEC_S_OK)
        return result;
    if (std::size_t refused = 0; !array.index_last(refused)) {
        // A tree that could not be found again would let a duplicate pass.
        sec__free_acltree(*slot);
        *slot = nullptr;
        return qz::report_no_memory(function, refused);
    }
    return SEC_S_OK;
}

int sec__add_acle_to_tree(int report_duplicates, const sec_acle_t *acle, sec_acltree_t **slot) {
    constexpr const char *function = "sec__add_acle_to_tree";
    const bool is_new = *slot == nullptr;
    if (is_new) {
        void *memory = std::malloc(sizeof(sec_acltree_t));
        if (memory == nullptr)
            return qz::report_no_memory(function, sizeof(sec_acltree_t));
        *slot = new (memory) sec_acltree_t(acle->type);
    }
    sec_acle_t *held = nullptr;
    switch ((*slot)->insert(*acle, held)) {
    case sec_acltree::outcome::inserted:
        return SEC_S_OK;
    case sec_acltree::outcome::duplicate:
        if (report_duplicates != 0)
            return sec__report_duplicate(acle);
        held->perm_mask = acle->perm_mask;
        sec__trace_replacement(acle);
        return SEC_S_OK;
    case sec_acltree::outcome::no_memory:
        break;
    }
    const std::size_t refused = (*slot)->refused();
    if (is_new) {
        sec__free_acltree(*slot);
        *slot = nullptr;
    }
    return qz::report_no_memory(function, refused);
}

int sec__report_duplicate(const sec_acle_t *acle) {
    const int letter = qz::type_letter(acle->type);
    if (qz::is_single_type(acle->type))
        return qz::report(SEC_S_BAD_ACLE, qz::msg::duplicate_single_acle, letter);
    if (acle->type == SEC_ACLE_GROUP)
        return qz::report(SEC_S_BAD_ACLE, qz::msg::duplicate_group, letter, acle->identity);
    return qz::report(SEC_S_BAD_ACLE, qz::msg::duplicate_acle, letter, acle->mechanism, acle->identity);
}

void sec__trace_replacement(const sec_acle_t *acle) {
    if (!qz::traces(qz::point::entry_replaced))
        return;
    const char *type = "group";
    switch (acle->type) {
    case SEC_ACLE_UNAUTHENTICATED:
        type = "unauthenticated";
        break;
    case SEC_ACLE_ANYOTHER:
        type = "anyother";
        break;
    case SEC_ACLE_USER:
        type = "user";
        break;
    case SEC_ACLE_EXPANDED:
        type = "user-expanded";
        break;
    default:
        break;
    }
    const char *identity = acle->type == SEC_ACLE_USER ? acle->identity : "<none>";
    if (qz::is_single_type(acle->type))
        qz::point::entry_replaced.record(type, "<none>", identity);
    else
        qz::point::entry_replaced.record(type, acle->mechanism, identity);
}

int sec__acle_not_found(int code, const sec_acle_t *acle) {
    return qz::report(code, qz::msg::acle_not_found, acle->type,
                      qz::has_mechanism(acle->type) ? acle->mechanism : "",
                      qz::has_identity(acle->type) ? acle->identity : "");
}

int sec__del_acle_from_tree(const sec_acle_t *acle, sec_acltree_t *root) {
    sec_acle_t *held = nullptr;
    std::span<sec_acle_t *const> nodes;
    if (qz::is_single_type(acle->type)) {
        std::size_t refused = 0;
        if (root->in_order(nodes, refused) && nodes.front()->type != 0)
            held = nodes.front();
    } else {
        held = root->find(acle->identity);
    }
    if (held == nullptr)
        return sec__acle_not_found(SEC_S_ACLE_NOT_FOUND, acle);
    sec__trace_release(held);
    root->erase(*held);
    return SEC_S_OK;
}

void sec__free_acltree(sec_acltree_t *root) {
    if (root == nullptr)
        return;
    if (qz::traces(qz::trace_category::api))
        root->trace_release();
    root->~sec_acltree();
    std::free(root);
}
