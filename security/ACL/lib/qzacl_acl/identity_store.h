// Where the mechanisms and identities of a tree are: in the text that the entries were read from, which outlives
// the tree, or copied into memory of the tree's own.
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
    // Places are numbers of 31 bits, and ascend in the order in which the identities came.
    static constexpr std::uint32_t last_place = INT32_MAX;

    // With an empty text, or one that places do not reach the end of, everything is copied. The bytes that
    // identities are read with (identity_order.h) belong to the text or stand behind it.
    explicit identity_store(std::span<char> text);
    identity_store(const identity_store &) = delete;
    identity_store &operator=(const identity_store &) = delete;
    ~identity_store();

    // Finds the entry's place, or makes room and copies it there. The next entry takes the place unless it is kept.
    shortage place(const acle_view &acle, std::uint32_t &place);
    void keep(std::uint32_t place, std::size_t identity_length);

    // The identity at a place, with its NUL and seven readable bytes behind that.
    char *identity(std::uint32_t place) const { return base_ + std::size_t{place} * unit_; }
    // The mechanism that came with it; of a text that of the first entry, as the parser spells all alike.
    std::string_view mechanism(std::uint32_t place) const;
    // The mechanism that came with the first identity.
    std::string_view first_mechanism() const;

    bool is_in_text() const { return unit_ == 1; }
    // How many entries to make room for when `count` were placed so far, the next one at `place`: more than that,
    // and of a text as many as there will be if the rest of it is like the part that was read.
    std::uint32_t expected_count(std::uint32_t count, std::uint32_t place) const;

private:
    shortage copy(const acle_view &acle, std::uint32_t &place);
    shortage grow(std::uint64_t units);

    char *base_ = nullptr;
    std::uint32_t used_ = 0;      // units of own memory
    std::uint32_t size_ = 0;      // of the memory or the text
    std::uint32_t mechanism_ = 0; // the place of the first one in the text
    std::uint8_t mechanism_length_ = 0;
    std::uint8_t unit_; // the bytes from one place to the next
};

} // namespace qz

#endif
