// Storage of a tree's mechanisms and identities: in the text that the entries were read from, which outlives the tree,
// or as copies that the tree owns.
#ifndef QZACL_IDENTITY_STORE_H
#define QZACL_IDENTITY_STORE_H

#include "base/owned.h"
#include "qzacl_acl/entry.h"

#include <cstddef>
#include <cstdint>
#include <span>
#include <string_view>

namespace qz {

class identity_store {
public:
    // Places are 31-bit numbers that ascend in order of insertion.
    static constexpr std::uint32_t last_place = INT32_MAX;

    // Copies everything if the text is empty or too large for places. The bytes that must be readable after an identity
    // (identity_order.h) are part of the text or follow it.
    explicit identity_store(std::span<char> text);
    identity_store(const identity_store &) = delete;
    identity_store &operator=(const identity_store &) = delete;
    ~identity_store();

    // Finds the entry's place, or makes room and copies it there. The next entry takes the place unless it is kept.
    shortage place(const acle_view &acle, std::uint32_t &place);
    void keep(std::uint32_t place, std::size_t identity_length);

    // The identity at a place. Its NUL and seven more bytes are readable.
    char *identity(std::uint32_t place) const { return base_ + std::size_t{place} * unit_; }
    // Its mechanism. In a text this is the first entry's, since the parser folds them.
    std::string_view mechanism(std::uint32_t place) const;
    // The first entry's mechanism.
    std::string_view first_mechanism() const;

    bool is_in_text() const { return unit_ == 1; }
    // How many entries to make room for once `count` are placed, the next one at `place`: always more than that,
    // and for a text an extrapolation from the part that was read.
    std::uint32_t expected_count(std::uint32_t count, std::uint32_t place) const;

private:
    shortage copy(const acle_view &acle, std::uint32_t &place);
    shortage grow(std::uint64_t units);

    char *base_ = nullptr;
    std::uint32_t used_ = 0;      // units of own memory
    std::uint32_t size_ = 0;      // of the memory or the text
    std::uint32_t mechanism_ = 0; // place of the first one in the text
    std::uint8_t mechanism_length_ = 0;
    std::uint8_t unit_; // bytes per place
};

} // namespace qz

#endif
