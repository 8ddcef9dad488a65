// Identities laid out for quick comparison, and sorting them.
#include "qzacl_acl/identity_order.h"

#include "libqz_cu/wide_product.h"

#include <algorithm>
#include <array>
#include <bit>
#include <sys/auxv.h>

namespace qz {
namespace {

constexpr std::size_t word_size = sizeof(std::uint64_t);

constexpr bool has_nul(std::uint64_t word) {
    return ((word - 0x0101010101010101) & ~word & 0x8080808080808080) != 0;
}

// Words are compared and sorted as the byte strings they hold.
constexpr std::uint64_t in_byte_order(std::uint64_t word) {
    if constexpr (std::endian::native == std::endian::little)
        return __builtin_bswap64(word);
    else
        return word;
}

std::uint64_t mix(std::uint64_t a, std::uint64_t b) {
    const wide_number product = wide_product(a, b);
    return product.high ^ product.low;
}

// The length of the folded prefix that all identities share.
std::size_t common_prefix(std::span<sec_acle_t *const> acles) {
    const char *first = acles.front()->identity;
    std::size_t prefix = std::strlen(first);
    for (const sec_acle_t *acle : acles) {
        std::size_t same = 0;
        while (same < prefix) {
            const std::uint64_t difference = in_byte_order(folded_word(first, same / word_size) ^
                                                           folded_word(acle->identity, same / word_size));
            if (difference != 0) {
                same += static_cast<std::size_t>(std::countl_zero(difference)) / 8;
                break;
            }
            same += word_size;
        }
        prefix = std::min(prefix, same);
        if (prefix == 0)
            break;
    }
    return prefix;
}

// Eight folded bytes from `prefix` on, padded with NULs.
std::uint64_t key_behind(const char *identity, std::size_t prefix) {
    const std::size_t word = prefix / word_size;
    const std::size_t shift = prefix % word_size * 8;
    const std::uint64_t head = folded_word(identity, word);
    std::uint64_t key = in_byte_order(head) << shift;
    // The next word belongs to the identity only when this one does not end it.
    if (shift != 0 && !has_nul(head))
        key |= in_byte_order(folded_word(identity, word + 1)) >> (64 - shift);
    return key;
}

struct sorts_before {
    bool operator()(const keyed_acle &a, const keyed_acle &b) const {
        if (a.key != b.key)
            return a.key < b.key;
        return compare_identities(a.acle->identity, b.acle->identity) < 0;
    }
};

// Below this many elements comparing costs less than counting digits.
constexpr std::size_t comparison_sort_max = 48;

// Distributes by one byte of the key after the other, the highest first, between the two arrays; the
// recursion is as deep as a key has bytes. The result always ends in `elements`.
void sort_keyed(std::span<keyed_acle> elements, std::span<keyed_acle> scratch, unsigned shift) {
    if (elements.size() <= comparison_sort_max || shift >= 64) {
        std::sort(elements.begin(), elements.end(), sorts_before{});
        return;
    }
    const auto digit = [shift](const keyed_acle &element) {
        return static_cast<std::size_t>((element.key >> (56 - shift)) & 0xff);
    };
    std::array<std::uint32_t, 257> starts{};
    for (const keyed_acle &element : elements)
        ++starts[digit(element) + 1];
    if (starts[digit(elements.front()) + 1] == elements.size()) {
        sort_keyed(elements, scratch, shift + 8);
        return;
    }
    for (std::size_t value = 1; value < starts.size(); ++value)
        starts[value] += starts[value - 1];
    std::array<std::uint32_t, 256> ends{};
    std::copy_n(starts.begin(), ends.size(), ends.begin());
    for (const keyed_acle &element : elements)
        scratch[ends[digit(element)]++] = element;
    std::copy(scratch.begin(), scratch.end(), elements.begin());
    for (std::size_t value = 0; value < ends.size(); ++value) {
        const std::size_t size = ends[value] - starts[value];
        if (size > 1)
            sort_keyed(elements.subspan(starts[value], size), scratch.subspan(starts[value], size),
                       shift + 8);
    }
}

} // namespace

identity_hash_key make_identity_hash_key() {
    // Sixteen random bytes that the kernel gives every process: no system call, and nothing that can fail.
    identity_hash_key key;
    const auto *random = reinterpret_cast<const unsigned char *>(getauxval(AT_RANDOM));
    if (random != nullptr) {
        std::memcpy(&key.first, random, sizeof key.first);
        std::memcpy(&key.second, random + sizeof key.first, sizeof key.second);
    }
    key.first = mix(key.first ^ 0x9e3779b97f4a7c15, 0xd6e8feb86659fd93) | 1;
    key.second = mix(key.second ^ 0xa0761d6478bd642f, 0xe7037ed1a0b428db) | 1;
    return key;
}

std::uint32_t hash_identity(const char *padded, std::size_t length, const identity_hash_key &key) {
    std::uint64_t state = key.second;
    for (std::size_t word = 0; word < identity_words(length); ++word)
        state = mix(state ^ folded_word(padded, word), key.first);
    return static_cast<std::uint32_t>(mix(state, key.second) >> 32);
}

int compare_identities(const char *padded, const char *other) {
    for (std::size_t word = 0;; ++word) {
        const std::uint64_t a = folded_word(padded, word);
        const std::uint64_t b = folded_word(other, word);
        if (a != b)
            return in_byte_order(a) < in_byte_order(b) ? -1 : 1;
        if (has_nul(a))
            return 0;
    }
}

void sort_by_identity(std::span<sec_acle_t *> acles, keyed_acle *scratch, keyed_acle *more_scratch) {
    if (acles.size() < 2)
        return;
    const std::size_t prefix = common_prefix(acles);
    for (std::size_t index = 0; index < acles.size(); ++index)
        scratch[index] = {key_behind(acles[index]->identity, prefix), acles[index]};
    sort_keyed({scratch, acles.size()}, {more_scratch, acles.size()}, 0);
    for (std::size_t index = 0; index < acles.size(); ++index)
        acles[index] = scratch[index].acle;
}

} // namespace qz
