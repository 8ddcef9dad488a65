// Sorting entries by identity: by their keys and, if those are equal, by their texts.
#include "qzacl_acl/entry_sort.h"

#include "qzacl_acl/identity_order.h"

#include <algorithm>
#include <array>
#include <bit>
#include <numeric>

namespace qz {
namespace {

// The length of the folded prefix common to all identities, at least `known` bytes unless they are equal.
std::size_t common_prefix(std::span<const small_entry> entries, const identity_store &identities,
                          std::size_t known) {
    const char *const text = identities.identity(entries.front().place);
    std::size_t prefix = identity_length(text);
    for (const small_entry &entry : entries.subspan(1)) {
        const char *const other = identities.identity(entry.place);
        std::uint64_t difference = 0;
        std::size_t same = known;
        while (same < prefix && (difference = ordered_word(text + same) ^ ordered_word(other + same)) == 0)
            same += identity_word_size;
        if (same < prefix)
            same += static_cast<std::size_t>(std::countl_zero(difference)) / 8;
        prefix = std::min(prefix, same);
    }
    return prefix;
}

// A byte of the key, the highest being number 0.
struct digit_of_key {
    unsigned number;

    std::size_t operator()(const small_entry &entry) const { return (entry.key >> (56 - 8 * number)) & 0xff; }
};

using digit_counts = std::array<std::uint32_t, 256>;

// Orders entries by a digit of which `sizes` has the counts, by moving them in place.
void order_by_digit(std::span<small_entry> entries, const digit_of_key &digit, const digit_counts &sizes) {
    digit_counts next; // the place of the next entry with the digit
    std::exclusive_scan(sizes.begin(), sizes.end(), next.begin(), std::uint32_t{0});
    std::uint32_t end = 0;
    for (std::size_t value = 0; value < sizes.size(); ++value) {
        end += sizes[value];
        while (next[value] != end) {
            small_entry moved = entries[next[value]];
            for (std::size_t its = digit(moved); its != value; its = digit(moved))
                std::swap(moved, entries[next[its]++]);
            entries[next[value]++] = moved;
        }
    }
}

// Sorts by one digit of the keys after the other and, where all of them are equal, by the keys of the bytes after them.
class radix_sort {
public:
    explicit radix_sort(const identity_store &identities) : identities_(identities) {}

    // Makes the bytes after the first `shared` ones the keys.
    void load_keys(std::span<small_entry> entries, std::size_t shared) {
        for (small_entry &entry : entries)
            entry.key = ordered_word(identities_.identity(entry.place) + shared);
        has_whole_keys_ = false;
    }

    // The identities have the first `shared` bytes in common, and so have the keys the digits before `digit`.
    void sort(std::span<small_entry> entries, std::size_t shared, digit_of_key digit) {
        // Up to this many entries, a comparison sort is faster.
        constexpr std::size_t few = 48;
        while (entries.size() > few) {
            if (digit.number == identity_word_size) {
                if (ends_within(entries.front().key))
                    break; // all are equal
                shared = common_prefix(entries, identities_, shared + identity_word_size);
                load_keys(entries, shared);
                digit = {0};
            }
            entries = sort_all_but_largest(entries, shared, digit);
            ++digit.number;
        }
        std::sort(entries.begin(), entries.end(), [this, shared](const small_entry &a, const small_entry &b) {
            return sorts_before(a, b, shared);
        });
    }

    bool has_whole_keys() const { return has_whole_keys_; }

private:
    // Orders entries by a digit and sorts the ranges with equal ones, except for the largest, which it returns. So the
    // depth of the recursion is logarithmic.
    std::span<small_entry> sort_all_but_largest(std::span<small_entry> entries, std::size_t shared,
                                                digit_of_key digit) {
        digit_counts sizes{};
        for (const small_entry &entry : entries)
            ++sizes[digit(entry)];
        if (sizes[digit(entries.front())] == entries.size())
            return entries;
        order_by_digit(entries, digit, sizes);
        std::span<small_entry> largest;
        std::size_t start = 0;
        for (const std::uint32_t size : sizes) {
            std::span<small_entry> range = entries.subspan(start, size);
            start += size;
            if (size > largest.size())
                std::swap(range, largest);
            if (range.size() > 1)
                sort(range, shared, {digit.number + 1});
        }
        return largest;
    }

    bool sorts_before(const small_entry &a, const small_entry &b, std::size_t shared) const {
        if (a.key != b.key)
            return a.key < b.key;
        if (!ends_within(a.key)) {
            const std::size_t equal = shared + identity_word_size;
            const int order = compare_identities(identities_.identity(a.place) + equal,
                                                 identities_.identity(b.place) + equal);
            if (order != 0)
                return order < 0;
        }
        return a.place < b.place;
    }

    const identity_store &identities_;
    bool has_whole_keys_ = true;
};

} // namespace

bool sort_by_identity(std::span<small_entry> entries, const identity_store &identities) {
    if (entries.size() < 2)
        return true;
    const std::uint64_t first = entries.front().key;
    std::uint64_t difference = 0;
    for (const small_entry &entry : entries)
        difference |= entry.key ^ first;
    std::size_t shared = 0;
    if (difference != 0)
        shared = static_cast<std::size_t>(std::countl_zero(difference)) / 8;
    else if (!ends_within(first))
        shared = common_prefix(entries, identities, identity_word_size);
    radix_sort sorting(identities);
    if (shared != 0)
        sorting.load_keys(entries, shared);
    sorting.sort(entries, shared, {0});
    return sorting.has_whole_keys();
}

std::optional<small_entry> first_duplicate(std::span<const small_entry> sorted,
                                           const identity_store &identities) {
    const small_entry *first = nullptr;
    for (std::size_t index = 1; index < sorted.size(); ++index) {
        const small_entry &one = sorted[index - 1];
        const small_entry &next = sorted[index];
        if (one.key == next.key && (first == nullptr || next.place < first->place) &&
            compare_identities(identities.identity(one.place), identities.identity(next.place)) == 0)
            first = &next;
    }
    return first == nullptr ? std::nullopt : std::optional(*first);
}

} // namespace qz
