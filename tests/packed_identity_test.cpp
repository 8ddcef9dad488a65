// The quick proofs about packed identities: where a string ends in its field, and which of two sorts first.
#include "qzacl_acl/packed_identity.h"

#include <gtest/gtest.h>

#include <string>

namespace {

constexpr std::size_t readable = qz::identity_block::size;

bool ends_exactly(const std::string &bytes, std::size_t size) {
    return qz::ends_exactly({reinterpret_cast<const unsigned char *>(bytes.data()), size});
}

// Sizes on both sides of one block and of two, and a first NUL at every place in the field and after it.
TEST(PackedIdentity, EndsExactlyWhereItsFirstNulIsTheLastByte) {
    for (std::size_t size = 1; size <= 3 * readable; ++size) {
        for (std::size_t nul = 0; nul <= size; ++nul) {
            std::string bytes(size + readable, 'a');
            bytes[nul] = '\0';
            EXPECT_EQ(ends_exactly(bytes, size), nul + 1 == size) << size << " bytes, NUL at " << nul;
            bytes[size - 1] = '\0';
            EXPECT_EQ(ends_exactly(bytes, size), nul + 1 >= size) << size << " bytes, a first NUL at " << nul;
        }
    }
}

// What differs only after the strings, in the bytes of the next entry, says nothing of their order.
TEST(PackedIdentity, SortsBeforeWithinItsOwnBytesAlone) {
    for (std::size_t differing = 0; differing < readable; ++differing) {
        std::string lesser(readable, 'b');
        std::string greater(readable, 'B');
        lesser[differing] = 'a';
        const qz::identity_block first(reinterpret_cast<const unsigned char *>(lesser.data()));
        const qz::identity_block second(reinterpret_cast<const unsigned char *>(greater.data()));
        EXPECT_TRUE(first.sorts_before_within(differing + 1, second)) << differing;
        EXPECT_FALSE(first.sorts_before_within(differing, second)) << differing;
        EXPECT_FALSE(second.sorts_before_within(readable, first)) << differing;
    }
}

} // namespace
