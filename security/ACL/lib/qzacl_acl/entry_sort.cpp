// Sorting entries by identity: by their keys and, if those are equal, by their texts.
#include "qzacl_acl/entry_sort.h"

#include "qzacl_acl/identity_order.h"

#include <algorithm>
#include <array>
#include <bit>
#include <numeric>

namespace qz {
namespace {

struct sorts_before {
    const identity_store &identities;

    bool operator()(const small_entry &a, const small_entry &b) const {
        if (a.key != b.key)
            return a.key < b.key;
        const int order = compare_identities(identities.identity(a.place), identities.identity(b.place));
        return order != 0 ? order < 0 : a.place < b.place;
    }
};

// The length of the folded prefix common to all identities.
std::size_t common_prefix(std::span<const small_entry> entries, const identity_store &identities) {
    const small_entry &first = entries.front();
    std::uint64_t difference = 0;
    for (const small_entry &entry : entries)
        difference |= entry.key ^ first.key;
    if (difference != 0)
        return static_cast<std::size_t>(std::countl_zero(difference)) / 8;
    if (ends_within(first.key))
        return 0; // all are equal
    const char *const text = identities.identity(first.place);
    std::size_t prefix = identity_length(text);
    for (const small_entry &entry : entries.subspan(1)) {
        const char *const other = identities.identity(entry.place);
        std::size_t same = identity_word_size;
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

// Sorts by one digit after the other. The recursion is at most as deep as a key has bytes.
void radix_sort(std::span<small_entry> entries, digit_of_key digit, const sorts_before &before) {
    // Up to this many entries, a comparison sort is faster.
    constexpr std::size_t few = 48;
    if (entries.size() <= few || digit.number == sizeof(small_entry::key)) {
        std::sort(entries.begin(), entries.end(), before);
        return;
    }
    digit_counts sizes{};
    for (const small_entry &entry : entries)
        ++sizes[digit(entry)];
    if (sizes[digit(entries.front())] != entries.size())
        order_by_digit(entries, digit, sizes);
    std::size_t start = 0;
    for (const std::uint32_t size : sizes) {
        if (size > 1)
            radix_sort(entries.subspan(start, size), {digit.number + 1}, before);
        start += size;
    }
}

} // namespace

std::size_t sort_by_identity(std::span<small_entry> entries, const identity_store &identities) {
    if (entries.size() < 2)
        return 0;
    const std::size_t prefix = common_prefix(entries, identities);
    if (prefix != 0) {
        for (small_entry &entry : entries)
            entry.key = ordered_word(identities.identity(entry.place) + prefix);
    }
    radix_sort(entries, {.number = 0}, {identities});
    return prefix;
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
