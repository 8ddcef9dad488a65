// Trees: the entries of one key, collected for compilation.
#include "qzacl_acl/tree.h"

#include "qzacl_acl/buffer_format.h"
#include "qzacl_acl/identity_order.h"
#include "qzacl_acl/tree_shape.h"
#include "report.h"
#include "trace_points.h"

#include <algorithm>
#include <new>

using namespace qz;

namespace {

// Up to this many entries are compared one by one.
constexpr std::uint32_t few = 16;

std::size_t packed_size_of(std::uint8_t type, std::size_t identity_length) {
    return format::entry_fixed_size + (has_identity(type) ? identity_length + 1 : 0);
}

// Grows a structure for the expected entries or, without memory for so many, for twice the present ones.
template <class Grow>
shortage grow_for(std::uint32_t expected, std::uint32_t count, const Grow &grow) {
    const std::uint32_t fair = std::max(count * 2, few);
    const shortage lacking = grow(expected);
    return lacking && expected > fair ? grow(fair) : lacking;
}

} // namespace

bool sec_acltree::is_equal(const small_entry &held, const candidate &wanted) const {
    if (held.key != wanted.key)
        return false;
    return ends_within(wanted.key) ||
           compare_identities(identity(held) + identity_word_size, wanted.identity + identity_word_size) == 0;
}

bool sec_acltree::sorts_last(const candidate &wanted) const {
    const small_entry &last = entries_.all().back();
    if (wanted.key != last.key)
        return wanted.key > last.key;
    return compare_identities(wanted.identity, identity(last)) > 0;
}

// Enters all entries into a new table with room for the expected ones.
shortage sec_acltree::fill_table(std::uint32_t place) {
    const auto entries = std::as_const(entries_).all();
    const auto reset = [&](std::uint32_t room) { return table_.reset(room); };
    const std::uint32_t expected = identities_.expected_count(entries_.count(), place);
    if (const shortage lacking = grow_for(expected, entries_.count(), reset))
        return lacking;
    for (std::uint32_t number = 0; number < entries.size(); ++number)
        table_.enter(table_.hash(identity(entries[number]), entries[number].key), number);
    return {};
}

small_entry *sec_acltree::find_equal(const candidate &wanted, std::uint64_t hash) {
    const auto entries = entries_.all();
    const auto is_wanted = [&](const small_entry &entry) { return is_equal(entry, wanted); };
    if (table_.room() == 0) {
        const auto at = std::find_if(entries.begin(), entries.end(), is_wanted);
        return at == entries.end() ? nullptr : &*at;
    }
    const std::uint32_t number =
        table_.find(hash, [&](std::uint32_t each) { return is_wanted(entries[each]); });
    return number == identity_table::none ? nullptr : &entries[number];
}

sec_acltree::insertion sec_acltree::insert(const acle_view &acle, on_duplicate handling) {
    const std::uint32_t count = entries_.count();
    if (is_single_type(type_) && count != 0)
        return {outcome::duplicate, &entries_.all().front(), {}};
    restore_keys();
    std::uint32_t place = 0;
    if (const shortage lacking = identities_.place(acle, place))
        return {outcome::no_memory, nullptr, lacking};
    if (entries_.is_full()) {
        const auto reserve = [&](std::uint32_t room) { return entries_.reserve(room); };
        if (const shortage lacking = grow_for(identities_.expected_count(count, place), count, reserve))
            return {outcome::no_memory, nullptr, lacking};
    }

    const char *const identity = identities_.identity(place);
    const candidate wanted = {identity, ordered_word(identity)};
    if (is_ascending_ && count != 0)
        is_ascending_ = sorts_last(wanted);
    if (!is_ascending_ && handling != on_duplicate::report_late) {
        if (count >= few && table_.room() <= count) {
            if (const shortage lacking = fill_table(place))
                return {outcome::no_memory, nullptr, lacking};
        }
        const std::uint64_t hash = table_.room() == 0 ? 0 : table_.hash(identity, wanted.key);
        if (small_entry *held = find_equal(wanted, hash); held != nullptr)
            return {outcome::duplicate, held, {}};
        if (table_.room() != 0)
            table_.enter(hash, count);
    }
    identities_.keep(place, acle.identity.size());
    count_entry(acle.identity.size(), 1);
    return {outcome::inserted,
            &entries_.append({.key = wanted.key,
                              .place = place & identity_store::last_place,
                              .is_deleted = 0,
                              .perm_mask = acle.perm_mask}),
            {}};
}

std::optional<small_entry> sec_acltree::first_duplicate() {
    if (is_ascending_)
        return std::nullopt;
    if (type_ != SEC_ACLE_EXPANDED) {
        put_in_order();
        return qz::first_duplicate(entries_.all(), identities_);
    }
    // Expanded entries keep the order of insertion.
    restore_keys();
    const std::span<small_entry> entries = entries_.all();
    const owned<small_entry[]> copy = allocate<small_entry>(entries.size());
    const std::span<small_entry> sorted = copy == nullptr ? entries : std::span(copy.get(), entries.size());
    if (copy != nullptr)
        std::copy(entries.begin(), entries.end(), sorted.begin());
    const bool has_whole_keys = sort_by_identity(sorted, identities_);
    const std::optional<small_entry> found = qz::first_duplicate(sorted, identities_);
    if (copy == nullptr) {
        has_whole_keys_ = has_whole_keys;
        std::sort(entries.begin(), entries.end(),
                  [](const small_entry &a, const small_entry &b) { return a.place < b.place; });
    }
    return found;
}

void sec_acltree::count_entry(std::size_t identity_length, int held) {
    const auto times = static_cast<std::uint32_t>(held); // -1 counts down
    held_count_ += times;
    overlong_count_ += identity_length > format::identity_max ? times : 0;
    packed_size_ += packed_size_of(type_, identity_length) * static_cast<std::uint64_t>(held);
}

small_entry *sec_acltree::find_entry(const char *wanted) {
    const auto entries = entries_.all();
    const auto is_wanted = [&](const small_entry &entry) {
        return entry.is_deleted == 0 && fold_compare(identity(entry), wanted) == 0;
    };
    // Without the table: this serves deletions, which have read all entries anyway and must not need memory to hash.
    const auto sorts_before = [&](const small_entry &entry, const char *other) {
        return fold_compare(identity(entry), other) < 0;
    };
    const auto at = is_ascending_ ? std::lower_bound(entries.begin(), entries.end(), wanted, sorts_before)
                                  : std::find_if(entries.begin(), entries.end(), is_wanted);
    return at != entries.end() && is_wanted(*at) ? &*at : nullptr;
}

void sec_acltree::erase(small_entry &entry) {
    count_entry(identity_length(identity(entry)), -1);
    entry.is_deleted = 1;
}

void sec_acltree::put_in_order() const {
    if (is_ascending_)
        return;
    table_.release(); // its numbers become invalid, and sorting can use the memory
    if (type_ == SEC_ACLE_EXPANDED)
        return;
    has_whole_keys_ = sort_by_identity(entries_.all(), identities_);
    is_ascending_ = true;
}

void sec_acltree::restore_keys() {
    if (has_whole_keys_)
        return;
    for (small_entry &entry : entries_.all())
        entry.key = ordered_word(identity(entry));
    has_whole_keys_ = true;
}

std::span<const small_entry> sec_acltree::in_order() const {
    put_in_order();
    return entries_.all();
}

std::span<small_entry> sec_acltree::in_order() {
    put_in_order();
    return entries_.all();
}

acle_view sec_acltree::view(const small_entry &entry) const {
    const char *const text = identity(entry);
    return {entry.perm_mask, type_, identities_.mechanism(entry.place), {text, identity_length(text)}};
}

sec_acle_t sec_acltree::record(const small_entry &entry) const {
    sec_acle_t made = {entry.perm_mask, {}, type_, identities_.identity(entry.place)};
    const std::string_view mechanism = identities_.mechanism(entry.place);
    std::copy(mechanism.begin(), mechanism.end(), made.mechanism);
    return made;
}

std::string_view sec_acltree::compiled_mechanism() const {
    // In a text all entries of a key spell the mechanism the same way.
    return identities_.is_in_text() ? mechanism() : identities_.mechanism(topmost(in_order())->place);
}

void sec_acltree::trace_release() {
    in_post_order(in_order(), [this](const small_entry &entry) {
        if (entry.is_deleted != 0)
            sec__trace_release(nullptr);
        else
            sec__trace_release(&entry, view(entry));
    });
}

namespace qz {

int add_to_tree(on_duplicate handling, const acle_view &acle, sec_acltree &tree) {
    const sec_acltree::insertion done = tree.insert(acle, handling);
    switch (done.result) {
    case sec_acltree::outcome::inserted:
        break;
    case sec_acltree::outcome::duplicate:
        if (handling != on_duplicate::replace_mask)
            return sec__report_duplicate(acle);
        done.entry->perm_mask = acle.perm_mask;
        sec__trace_replacement(acle);
        break;
    case sec_acltree::outcome::no_memory:
        return report_no_memory("sec__add_acle_to_tree", done.lacking);
    }
    return SEC_S_OK;
}

} // namespace qz

int sec__add_acle_to_tree(on_duplicate handling, const acle_view &acle, sec_acltree_t **slot) {
    if (*slot != nullptr)
        return add_to_tree(handling, acle, **slot);
    void *memory = std::malloc(sizeof(sec_acltree_t));
    if (memory == nullptr)
        return report_no_memory("sec__add_acle_to_tree", sizeof(sec_acltree_t));
    owned_acltree made(new (memory) sec_acltree_t(acle.type, {}));
    const int result = add_to_tree(handling, acle, *made);
    if (result == SEC_S_OK)
        *slot = made.release();
    return result;
}

int sec__add_acle_to_tree(on_duplicate handling, const sec_acle_t *acle, sec_acltree_t **slot) {
    return sec__add_acle_to_tree(handling, view_of(*acle), slot);
}

int sec__del_acle_from_tree(const sec_acle_t *acle, sec_acltree_t *root) {
    small_entry *held = nullptr;
    if (!is_single_type(acle->type))
        held = root->find_entry(acle->identity);
    else if (root->held_count() != 0)
        held = &root->in_order().front();
    if (held == nullptr)
        return sec__acle_not_found(SEC_S_ACLE_NOT_FOUND, view_of(*acle));
    sec__trace_release(held, root->view(*held));
    root->erase(*held);
    return SEC_S_OK;
}

void sec__free_acltree(sec_acltree_t *root) {
    if (root == nullptr)
        return;
    if (traces(trace_category::api))
        root->trace_release();
    root->~sec_acltree();
    std::free(root);
}
