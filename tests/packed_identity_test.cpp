// The fast comparisons of packed identities: where a string ends in its field, and which of two sorts first.
#include "qzacl_acl/packed_identity.h"
#include "support.h"

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

// Around the limits of words and blocks, with bytes that folding changes or leaves alone, or that are higher than
// letters. The first is empty.
const support::arguments identities = support::split(
    ",A,a_,a`,AB,abcdef,abcdefg,abcdefg_,abcdefg`,abcdefgH,abcdefghi,user_000@,USER_001,user_0010,z,[,"
    "\xff\xff,same-start-of-16,same-start-of-16x",
    ',');

// The field of an identity, with bytes that may follow it in a buffer.
struct field {
    field(const std::string &identity, char following)
        : size(identity.size() + 1), bytes(identity + '\0' + std::string(readable, following)) {}

    qz::byte_span span() const { return {reinterpret_cast<const unsigned char *>(bytes.data()), size}; }

    std::size_t size;
    std::string bytes;
};

void expect_after_only_what_sorts_before(const std::string &wanted, const std::string &stored,
                                         char following) {
    const field held(stored, following);
    const qz::identity_start start(wanted.c_str(), wanted.size());
    const bool sorts_before = qz::fold_compare(stored.c_str(), wanted.c_str()) < 0;
    const bool differs_early =
        qz::fold_compare(stored.substr(0, readable).c_str(), wanted.substr(0, readable).c_str()) != 0;
    const qz::identity_block block(held.span());
    EXPECT_EQ(start.is_clearly_after(block), sorts_before && differs_early) << stored << " before " << wanted;
    EXPECT_EQ(block.sorts_before(qz::identity_block(field(wanted, 'a').span())),
              sorts_before && differs_early);
    EXPECT_TRUE(sorts_before || !start.is_far_after(held.span())) << stored << " before " << wanted;
}

TEST(PackedIdentity, SortsAfterOthersWhateverFollowsThem) {
    for (const char following : {'\0', '\1', 'a', '\xff'}) {
        for (const std::string &wanted : identities) {
            for (const std::string &stored : identities)
                expect_after_only_what_sorts_before(wanted, stored, following);
        }
    }
}

TEST(PackedIdentity, IsFarAfterWhereOnlyLettersAndDigitsDiffer) {
    const std::pair<std::string, std::string> rows[] = {{"bob", "Alice"},
                                                        {"BOB", "alice"},
                                                        {"user0002@corp.com", "USER0001@corp.com"},
                                                        {"abcdefghijklmnZ", "ABCDEFGHIJKLMNA"}};
    for (const auto &[wanted, stored] : rows)
        EXPECT_TRUE(qz::identity_start(wanted.c_str(), wanted.size()).is_far_after(field(stored, 'x').span()))
            << stored << " before " << wanted;
}

// A field without a NUL says nothing about the bytes that follow it.
TEST(PackedIdentity, IsNotFarAfterWhatItStartsWith) {
    const std::string wanted = "abcdefghijklmnopq";
    const qz::identity_start start(wanted.c_str(), wanted.size());
    for (std::size_t size = 0; size <= readable; ++size) {
        const field held(wanted.substr(0, size), '\0');
        EXPECT_FALSE(start.is_far_after(held.span().first(size))) << size;
    }
}

} // namespace
