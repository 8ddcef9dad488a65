// Storage of a tree's mechanisms and identities.
#include "qzacl_acl/identity_store.h"

#include <algorithm>
#include <cstdlib>
#include <cstring>
#include <limits>

namespace qz {
namespace {

// A copied mechanism precedes its identity. NULs pad both to whole words.
constexpr std::size_t own_unit = sizeof(std::uint64_t);
constexpr std::uint32_t mechanism_units = 3;
constexpr std::size_t mechanism_size = mechanism_units * own_unit;
static_assert(mechanism_size > mechanism_max);

constexpr std::size_t units_of(std::size_t identity_length) { return identity_length / own_unit + 1; }

} // namespace

identity_store::identity_store(std::span<char> text) : unit_(own_unit) {
    if (text.empty() || text.size() > last_place)
        return;
    base_ = text.data();
    size_ = static_cast<std::uint32_t>(text.size());
    unit_ = 1;
}

identity_store::~identity_store() {
    if (!is_in_text())
        std::free(base_);
}

shortage identity_store::place(const acle_view &acle, std::uint32_t &place) {
    if (is_in_text()) {
        if (mechanism_length_ == 0 && has_mechanism(acle.type)) {
            mechanism_ = static_cast<std::uint32_t>(acle.mechanism.data() - base_);
            mechanism_length_ = static_cast<std::uint8_t>(acle.mechanism.size());
        }
        place = static_cast<std::uint32_t>(acle.identity.data() - base_);
        return {};
    }
    return copy(acle, place);
}

shortage identity_store::copy(const acle_view &acle, std::uint32_t &place) {
    // One more word must be readable after the last one. The next copy overwrites it.
    const std::uint64_t units = mechanism_units + units_of(acle.identity.size());
    if (used_ + units >= size_) {
        if (const shortage lacking = grow(used_ + units + 1))
            return lacking;
    }
    place = used_ + mechanism_units;
    char *const at = identity(place);
    std::memset(at - mechanism_size, 0, mechanism_size);
    std::memcpy(at - mechanism_size, acle.mechanism.data(), acle.mechanism.size());
    std::memset(at + (units_of(acle.identity.size()) - 1) * own_unit, 0, 2 * own_unit);
    std::memcpy(at, acle.identity.data(), acle.identity.size());
    return {};
}

shortage identity_store::grow(std::uint64_t units) {
    constexpr std::uint64_t first_units = 16;
    const std::uint64_t size = std::max({units, std::uint64_t{size_} * 2, first_units});
    // On a 32-bit machine the size may exceed the address space.
    constexpr std::size_t most_bytes = std::numeric_limits<std::ptrdiff_t>::max();
    constexpr std::uint64_t most_units = std::min<std::uint64_t>(last_place, most_bytes / own_unit);
    const bool fits = size <= most_units;
    const std::size_t bytes = fits ? static_cast<std::size_t>(size) * own_unit : most_bytes;
    void *grown = fits ? std::realloc(base_, bytes) : nullptr;
    if (grown == nullptr)
        return shortage(bytes);
    base_ = static_cast<char *>(grown);
    size_ = static_cast<std::uint32_t>(size);
    return {};
}

void identity_store::keep(std::uint32_t place, std::size_t identity_length) {
    if (!is_in_text())
        used_ = place + static_cast<std::uint32_t>(units_of(identity_length));
}

std::string_view identity_store::mechanism(std::uint32_t place) const {
    return is_in_text() ? first_mechanism() : identity(place) - mechanism_size;
}

std::string_view identity_store::first_mechanism() const {
    if (!is_in_text())
        return base_; // starts with it
    return mechanism_length_ == 0 ? "" : std::string_view{identity(mechanism_), mechanism_length_};
}

std::uint32_t identity_store::expected_count(std::uint32_t count, std::uint32_t place) const {
    constexpr std::uint64_t least = 16;
    std::uint64_t expected = std::max(std::uint64_t{count} * 2, least);
    if (is_in_text() && count >= least) {
        // Extrapolate from the part of the text that was read, plus a little, but within limits: a few entries before a
        // long comment must not claim memory that other trees need.
        const std::uint64_t promised = std::uint64_t{count} * size_ / place;
        expected =
            std::clamp(promised + promised / 8, std::uint64_t{count} + count / 4, std::uint64_t{count} * 16);
    }
    return static_cast<std::uint32_t>(std::min(expected, std::uint64_t{last_place}));
}

} // namespace qz
