// Trees with more entries than the fuzzers' texts have, through the fuzzer of texts; the entry that names a tree;
// limits.
#include "faults.h"
#include "fuzz.h"
#include "qzacl_acl/compile.h"
#include "qzacl_acl/entry_array.h"
#include "qzacl_acl/entry_parser.h"
#include "qzacl_acl/identity_table.h"
#include "qzacl_acl/tree_shape.h"
#include "qzacl_acl/trees.h"
#include "support.h"

using namespace support;

TEST(tree, holds_what_a_text_says) {
    for (unsigned round = 0; round < (QZ_SANITIZED ? 40 : 400); ++round) {
        std::mt19937 random(round);
        const auto below = [&](std::size_t limit) { return random() % limit; };
        std::string text;
        for (auto count = 1 + below(round % 20 == 7 ? 500 : 60); count != 0; --count) {
            // Of few letters, of all bytes, and after one of two long prefixes.
            std::string name(round % 5 == 2 ? round % 60 : 0, "yz"[below(2)]);
            for (auto left = 1 + below(round % 5 == 1 ? 150 : 6); left != 0; --left)
                name +=
                    round % 5 == 1 ? static_cast<char>(33 + below(223)) : "aAbBzZ@[`{\x7f\x80\xff"[below(13)];
            const std::string mechanism = round % 3 == 1 ? std::to_string(below(500)) : "unix";
            text += std::array{"u " + mechanism, "e " + mechanism, "g"s}[below(3)] + " " + name + " rw\n";
        }
        LLVMFuzzerTestOneInput(reinterpret_cast<const std::uint8_t *>(text.data()), text.size());
    }
}

// The mechanism is spelled as in the topmost entry of the binary search tree that insertion builds, or of the chain
// of expanded entries.
TEST(tree, is_named_by_its_topmost_entry) {
    const auto acle_of = [](int type, const char *name) {
        std::string mechanism = "unix";
        for (unsigned bit = 0; bit < 4; ++bit)
            mechanism[bit] ^= (*name >> bit & 1) == 0 ? 0 : 0x20;
        return entry(type, mechanism, name, 1);
    };
    std::vector<std::tuple<int, std::string, std::string>> rows = {
        {SEC_ACLE_USER, "m f t c i p w", "m f c i t p w"}};
    for (std::string chain = "d e f c b a g h"; !chain.empty();
         chain.resize(std::max<std::size_t>(chain.size(), 2) - 2))
        rows.emplace_back(SEC_ACLE_EXPANDED, chain, chain);
    for (const auto &[type, inserted, topmost] : rows) {
        sec_acltree_t *root = nullptr;
        for (const std::string &name : words(inserted)) {
            const sec_acle_t acle = acle_of(type, name.c_str());
            EXPECT_EQ(faults::patiently(
                          [&] { return sec__add_acle_to_tree(qz::on_duplicate::report, &acle, &root); }),
                      SEC_S_OK);
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

// A tree points into its text, as far as its places reach, and copies everything else.
TEST(tree, copies_what_it_cannot_point_to) {
    const std::string line = "u unix alice r\n";
    const std::string alice = acl_bytes("u unix: alice 1");
    const std::string other = acl_bytes("u xxxx: xxxxx 1");
    const std::size_t whole = line.size() + 1;
    const std::size_t out_of_reach = std::size_t{3} << 30;
    const std::tuple<std::size_t, std::string> rows[] = {{0, alice}, {whole, other}, {out_of_reach, alice}};
    for (const auto &[told, compiled] : rows) {
        char text[64] = {};
        line.copy(text, line.size());
        char *cursor = text;
        std::size_t left = whole;
        std::uint32_t number = 1;
        qz::parsed_acle parsed;
        ASSERT_EQ(sec__read_acle_from_text(nullptr, &cursor, &left, &number, &parsed), qz::line_consumed);
        sec_acltree_array trees({text, told});
        EXPECT_EQ(trees.add(qz::view_of(parsed)), SEC_S_OK);
        std::ranges::fill(parsed.mechanism, 'x');
        std::ranges::fill(parsed.identity, 'x');
        buffer out;
        EXPECT_EQ(sec__acltrees_to_acl(trees.trees(), &out.acl), SEC_S_OK);
        EXPECT_EQ(out.bytes(), compiled) << told;
        const sec_acle_t elsewhere = entry(SEC_ACLE_USER, "unix", "bob", 1);
        EXPECT_EQ(sec__add_acle_to_trees(&elsewhere, trees), told == 0 ? SEC_S_OK : SEC_S_INTERNAL);
    }
}

// Compiling sorts the entries and drops the common prefix from their keys; a tree that then grows still finds them
// all.
TEST(tree, takes_more_entries_after_it_was_compiled) {
    for (const int count : {3, 40}) {
        sec_acltree_t *root = nullptr;
        const auto add = [&](const std::string &name) {
            const sec_acle_t acle = entry(SEC_ACLE_GROUP, "", name.c_str(), 1);
            return sec__add_acle_to_tree(qz::on_duplicate::report, &acle, &root);
        };
        const auto name_of = [](int number) { return "common-" + std::to_string(1000 + number); };
        for (int number = count; number != 0; --number)
            EXPECT_EQ(add(name_of(number)), SEC_S_OK);
        const qz::owned_acltree owner(root);
        qz::loose_subacl first;
        EXPECT_EQ(sec__acltree_to_subacl(root, first), SEC_S_OK);

        EXPECT_EQ(add("common-0"), SEC_S_OK);
        std::string entries = entry_bytes("common-0 1");
        for (int number = 1; number <= count; ++number) {
            EXPECT_EQ(add(name_of(number)), SEC_S_BAD_ACLE) << number;
            entries += entry_bytes(name_of(number) + " 1");
        }
        qz::loose_subacl second;
        EXPECT_EQ(sec__acltree_to_subacl(root, second), SEC_S_OK);
        const std::string found(reinterpret_cast<const char *>(second.data.get()), second.length);
        EXPECT_EQ(found, packed_subacl(SEC_ACLE_GROUP, "", static_cast<unsigned>(count) + 1, entries));
    }
}

// trace_test reads the order of the releases, and the mechanism recorded for the replaced entry.
TEST(tree, is_released_from_its_leaves_up) {
    const char mechanism[] = "sixteen-bytes-xx";
    const std::pair<int, std::string> rows[] = {
        {SEC_ACLE_GROUP, "m f t c i p w"}, {SEC_ACLE_GROUP, "a b c d"},  {SEC_ACLE_GROUP, "d c b a"},
        {SEC_ACLE_GROUP, "a d b c"},       {SEC_ACLE_EXPANDED, "m f t"},
    };
    for (const auto &[type, inserted] : rows) {
        sec_acltree_t *root = nullptr;
        for (const std::string &name : words(inserted)) {
            const sec_acle_t acle = entry(type, mechanism, name.c_str(), 1);
            EXPECT_EQ(sec__add_acle_to_tree(qz::on_duplicate::report, &acle, &root), SEC_S_OK);
        }
        const std::string first = inserted.substr(0, 1);
        sec_acle_t again = entry(type, mechanism, first.c_str(), 2);
        again.mechanism[sizeof mechanism - 1] = 'x'; // in place of the NUL, as a caller may fill the array
        EXPECT_EQ(sec__add_acle_to_tree(qz::on_duplicate::replace_mask, &again, &root), SEC_S_OK);
        sec__free_acltree(root);
    }
}

// A text of a gigabyte may promise more entries than 32 bits can say the size of.
TEST(tree, asks_for_no_less_memory_than_it_means) {
    constexpr std::uint64_t entry_size = sizeof(qz::small_entry);
    constexpr std::uint64_t least_slot_size = 5; // a tag and a number
    for (const std::uint32_t count : {0x10000001u, 0x30000000u, 0x7fffffffu}) {
        SCOPED_TRACE(count);
        qz::entry_array entries;
        faults::allocations = {0, 1};
        EXPECT_GE(entries.reserve(count).bytes(), std::min<std::uint64_t>(count * entry_size, PTRDIFF_MAX));

        qz::identity_table table;
        faults::allocations = {0, 1};
        EXPECT_GE(table.reset(count).bytes(), std::min<std::uint64_t>(count * least_slot_size, PTRDIFF_MAX));
        faults::allocations = {};
    }
}

// The tree of a few entries before a long comment takes little memory.
TEST(tree, takes_no_memory_for_a_comment) {
    constexpr std::size_t line_size = 4;
    std::string text;
    for (char name = 'z'; name >= 'a'; --name)
        text += "g "s + name + '\0';
    const std::size_t count = text.size() / line_size;
    text.append(std::size_t{1} << 22, '#');
    std::size_t most = 0;
    for (std::size_t at = 1; at == 1 || faults::allocations.fails_at <= faults::allocations.count; ++at) {
        sec_acltree_array trees(text);
        faults::allocations = {0, at};
        for (std::size_t line = 0; line < count; ++line)
            trees.add({1, SEC_ACLE_GROUP, "", std::string_view(text.data() + line * line_size + 2, 1)});
        most = std::max(most, faults::allocations.refused);
    }
    faults::allocations = {};
    EXPECT_GT(most, 0u);
    EXPECT_LT(most, 10'000u);
}
