// Trees of more entries than the fuzzers' texts have, through the fuzzer of texts; what names a tree; and its limit.
#include "../fuzz/fuzz.h"
#include "qzacl_acl/compile.h"
#include "support.h"

using namespace support;

TEST(tree, holds_what_a_text_says) {
    for (unsigned round = 0; round < (QZ_SANITIZED ? 40 : 400); ++round) {
        std::mt19937 random(round);
        const auto below = [&](std::size_t limit) { return random() % limit; };
        std::string text;
        for (auto count = 1 + below(round % 20 == 7 ? 500 : 60); count != 0; --count) {
            // Of few letters, of all bytes, and behind a long prefix that they share.
            std::string name(round % 5 == 2 ? round % 60 : 0, 'z');
            for (auto left = 1 + below(round % 5 == 1 ? 70 : 6); left != 0; --left)
                name += round % 5 == 1 ? static_cast<char>(33 + below(223)) : "aAbBzZ@[`{\x7f\x80\xff"[below(13)];
            const std::string mechanism = round % 3 == 1 ? std::to_string(below(500)) : "unix";
            text += std::array{"u " + mechanism, "e " + mechanism, "g"s}[below(3)] + " " + name + " rw\n";
        }
        LLVMFuzzerTestOneInput(reinterpret_cast<const std::uint8_t *>(text.data()), text.size());
    }
}

// The mechanism is spelled as in the entry that stands topmost in the binary search tree of the insertions.
TEST(tree, is_named_by_its_topmost_entry) {
    sec_acltree_t *root = nullptr;
    for (const auto &[mechanism, name] : {std::pair("Unix", "m"), {"uNix", "z"}, {"unIx", "c"}, {"uniX", "a"}}) {
        const sec_acle_t acle = entry(4, mechanism, name, 1);
        EXPECT_EQ(sec__add_acle_to_tree(1, &acle, &root), 0);
    }
    const qz::owned_acltree owner(root);
    buffer refused;
    EXPECT_EQ(sec__acltrees_to_acl(std::vector(65536, root), &refused.acl), 6);
    EXPECT_EQ(refused.bytes(), "");
    for (const auto &[spelled, next] : {std::pair("Unix", "m"), {"unIx", "c"}, {"uniX", "a"}, {"uNix", "z"}}) {
        qz::loose_subacl out;
        EXPECT_EQ(sec__acltree_to_subacl(root, out), 0);
        EXPECT_EQ(std::memcmp(out.data.get() + 10, spelled, 5), 0) << spelled;
        const sec_acle_t gone = entry(4, "unix", next, 1);
        EXPECT_EQ(sec__del_acle_from_tree(&gone, root), 0);
    }
}
