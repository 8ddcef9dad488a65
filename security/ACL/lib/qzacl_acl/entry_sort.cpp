// Sorting entries by identity: by their keys and, if those are equal, by their texts.
#include "qzacl_acl/entry_sort.h"

#include "qzacl_acl/identity_order.h"

#include <algorithm>
#include <array>
#include <bit>

namespace qz {
namespace {

struct sorts_before {
    const identity_store &identities;

    bool operator()(const small_entry &a, const small_entry &b) const {
        if (a.key != b.key)
            return a.key < b.key;
        return compare_identities(identities.identity(a.place), identities.identity(b.place)) < 0;
    }
};

// The length of the folded prefix common to all identities.
std::size_t common_prefix(std::span<const small_entry> entries, const identity_store &identities) {
    const small_entry &first = entries.front();
    std::uint64_t difference = 0;
    for (const small_entry &entry : entries)
        difference |= entry.key ^ first.key;
    // If one identity fits in its key, the prefix ends there.
    std::size_t prefix = static_cast<std::size_t>(std::countl_zero(difference)) / 8;
    if (difference != 0 || ends_within(first.key))
        return prefix;
    const char *const text = identities.identity(first.place);
    prefix = identity_length(text);
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

// Up to this many entries, a comparison sort is faster than a radix sort.
constexpr std::size_t comparison_sort_max = 48;

// Sorts by one byte of the key after the other, the highest first, moving the entries between two arrays. The recursion
// is at most as deep as a key has bytes.
class radix_sort {
public:
    explicit radix_sort(const identity_store &identities) : before_{identities} {}

    // The result is in `to` if `ends_in_to`, else in `from`.
    void sort(std::span<small_entry> from, std::span<small_entry> to, unsigned shift, bool ends_in_to) {
        if (from.size() <= comparison_sort_max || shift >= 64) {
            std::sort(from.begin(), from.end(), before_);
            if (ends_in_to)
                std::copy(from.begin(), from.end(), to.begin());
            return;
        }
        const auto digit = [shift](const small_entry &entry) {
            return static_cast<std::size_t>((entry.key >> (56 - shift)) & 0xff);
        };
        std::array<std::uint32_t, 257> starts{};
        for (const small_entry &entry : from)
            ++starts[digit(entry) + 1];
        if (starts[digit(from.front()) + 1] == from.size()) {
            sort(from, to, shift + 8, ends_in_to);
            return;
        }
        for (std::size_t value = 1; value < starts.size(); ++value)
            starts[value] += starts[value - 1];
        std::array<std::uint32_t, 256> ends{};
        std::copy_n(starts.begin(), ends.size(), ends.begin());
        for (const small_entry &entry : from)
            to[ends[digit(entry)]++] = entry;
        for (std::size_t value = 0; value < ends.size(); ++value) {
            const std::size_t size = ends[value] - starts[value];
            if (size != 0)
                sort(to.subspan(starts[value], size), from.subspan(starts[value], size), shift + 8,
                     !ends_in_to);
        }
    }

private:
    sorts_before before_;
};

} // namespace

std::size_t sort_by_identity(std::span<small_entry> entries, const identity_store &identities) {
    if (entries.size() < 2)
        return 0;
    const std::size_t prefix = common_prefix(entries, identities);
    if (prefix != 0) {
        for (small_entry &entry : entries)
            entry.key = ordered_word(identities.identity(entry.place) + prefix);
    }
    constexpr unsigned first_byte = 0;
    constexpr bool ends_in_scratch = false;
    owned<small_entry[]> scratch;
    if (entries.size() > comparison_sort_max)
        scratch = allocate<small_entry>(entries.size());
    if (scratch == nullptr)
        std::sort(entries.begin(), entries.end(), sorts_before{identities});
    else
        radix_sort(identities).sort(entries, {scratch.get(), entries.size()}, first_byte, ends_in_scratch);
    return prefix;
}

} // namespace qz
