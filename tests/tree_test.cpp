// Trees of more entries than the fuzzers' texts have, through the fuzzer of texts; what names a tree; and its limit.
#include "faults.h"
#include "fuzz.h"
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
            for (auto left = 1 + below(round % 5 == 1 ? 150 : 6); left != 0; --left)
                name +=
                    round % 5 == 1 ? static_cast<char>(33 + below(223)) : "aAbBzZ@[`{\x7f\x80\xff"[below(13)];
            const std::string mechanism = round % 3 == 1 ? std::to_string(below(500)) : "unix";
            text += std::array{"u " + mechanism, "e " + mechanism, "g"s}[below(3)] + " " + name + " rw\n";
        }
        LLVMFuzzerTestOneInput(reinterpret_cast<const std::uint8_t *>(text.data()), text.size());
    }
}

// The mechanism is spelled as in the entry that stands topmost in the binary search tree of the insertions, or in the
// chain of expanded ones.
TEST(tree, is_named_by_its_topmost_entry) {
    const auto acle_of = [](int type, const char *name) {
        std::string mechanism = "unix";
        for (unsigned bit = 0; bit < 4; ++bit)
            mechanism[bit] ^= (*name >> bit & 1) == 0 ? 0 : 0x20;
        return entry(type, mechanism, name, 1);
    };
    std::vector<std::tuple<int, std::string, std::string>> rows = {{4, "m f t c i p w", "m f c i t p w"}};
    for (std::string chain = "d e f c b a g h"; !chain.empty();
         chain.resize(std::max<std::size_t>(chain.size(), 2) - 2))
        rows.emplace_back(8, chain, chain);
    for (const auto &[type, inserted, topmost] : rows) {
        sec_acltree_t *root = nullptr;
        for (const std::string &name : words(inserted)) {
            const sec_acle_t acle = acle_of(type, name.c_str());
            EXPECT_EQ(faults::patiently([&] { return sec__add_acle_to_tree(1, &acle, &root); }), SEC_S_OK);
        }
        const qz::owned_acltree owner(root);
        buffer most, refused;
        EXPECT_EQ(sec__acltrees_to_acl(std::vector(65535, root), &most.acl), SEC_S_OK);
        EXPECT_EQ(sec__acltrees_to_acl(std::vector(65536, root), &refused.acl), SEC_S_NO_MEMORY);
        EXPECT_EQ(refused.bytes(), "");
        for (const std::string &name : words(topmost)) {
            const sec_acle_t acle = acle_of(type, name.c_str());
            qz::loose_subacl out;
            EXPECT_EQ(sec__acltree_to_subacl(root, out), SEC_S_OK);
            EXPECT_EQ(std::memcmp(out.data.get() + 10, acle.mechanism, 5), 0) << name;
            EXPECT_EQ(sec__del_acle_from_tree(&acle, root), SEC_S_OK);
            EXPECT_EQ(sec__del_acle_from_tree(&acle, root), SEC_S_ACLE_NOT_FOUND);
        }
    }
}

// Whose order trace_test reads.
TEST(tree, is_released_from_its_leaves_up) {
    for (const auto &[type, inserted] : {std::pair(16, "m f t c i p w"), {16, "a b c"}, {8, "m f t"}}) {
        sec_acltree_t *root = nullptr;
        for (const std::string &name : words(inserted)) {
            const sec_acle_t acle = entry(type, "sixteen-bytes-xx", name.c_str(), 1);
            EXPECT_EQ(sec__add_acle_to_tree(1, &acle, &root), SEC_S_OK);
        }
        const std::string first(inserted, 1);
        sec_acle_t again = entry(type, "sixteen-bytes-xx", first.c_str(), 2);
        again.mechanism[16] = 'x'; // in place of the NUL, as a caller may fill the array
        EXPECT_EQ(sec__add_acle_to_tree(0, &again, &root), SEC_S_OK);
        sec__free_acltree(root);
    }
}
