// Trees, and their compiled form in both directions, against the model while allocations fail. Whole texts are
// text_fuzz's, a hundred thousand entries on a small stack command_test's.
#include "faults.h"
#include "model.h"
#include "qzacl_acl/compile.h"

using namespace support;

namespace {

// Lets each allocation of a step fail in turn until it gets what it wants: what failed for memory left
// everything as it was, or where the operation says so, half done, and is repeated.
template <class Step>
int patiently(Step step) {
    for (std::size_t failing = 1;; ++failing) {
        faults::allocations = {0, failing};
        const int result = step();
        faults::allocations = {};
        if (result != 6) return result;
        EXPECT_EQ(recorded_error().id, 89);
    }
}

std::string compiled(const sec_acltree_t *root) {
    qz::loose_subacl out;
    EXPECT_EQ(patiently([&] { return sec__acltree_to_subacl(root, out); }), 0);
    return {reinterpret_cast<char *>(out.data.get()), out.length};
}

// What a sub-ACL becomes when it is expanded and compiled again.
std::string recompiled(const std::string &subacl) {
    sec_acltree_t *root = nullptr;
    const qz::byte_span bytes(reinterpret_cast<const unsigned char *>(subacl.data()), subacl.size());
    EXPECT_EQ(patiently([&] { return sec__subacl_to_acltree(bytes, &root); }), 0);
    const qz::owned_acltree tree(root);
    return compiled(root);
}

TEST(tree, holds_what_the_model_holds) {
    for (unsigned round = 0; round < (QZ_SANITIZED ? 150 : 1500); ++round) {
        std::mt19937 random(round);
        const auto below = [&](std::size_t limit) { return random() % limit; };
        model plain{{{std::array{4, 8, 16}[below(3)], "unix"}}};
        model_subacl &held = plain.subacls[0];
        if (held.type == 16) held.mechanism = "";
        // Of few letters, of all bytes, and behind a long prefix that they share; now and then one that is known.
        const auto invent = [&] {
            std::string name(round % 5 == 2 ? round % 60 : 0, 'z');
            for (auto left = 1 + below(round % 5 == 1 ? 70 : 6); left != 0; --left)
                name += round % 5 == 1 ? static_cast<char>(1 + below(255)) : "aAbBzZ@[`{\x7f\x80\xff"[below(13)];
            if (!held.stored.empty() && below(3) == 0) name = held.stored[below(held.stored.size())].first;
            for (char &letter : name) letter = below(2) == 0 ? letter : static_cast<char>(std::toupper(letter & 255));
            return name;
        };
        const auto expected = [&] {
            return held.stored.empty() ? "" : model_subacl{held.type, held.mechanism, held.expanded()}.bytes();
        };
        sec_acltree_t *root = nullptr;
        for (auto count = 1 + below(round % 25 == 7 ? 1500 : 60); count != 0; --count) {
            const std::string name = invent();
            const auto at = find(held.stored, name);
            const bool is_new = at == held.stored.end(), refuses = below(2) == 0;
            const sec_acle_t acle =
                entry(held.type, held.mechanism, name.c_str(), static_cast<std::uint32_t>(random()));
            ASSERT_EQ(patiently([&] { return sec__add_acle_to_tree(refuses, &acle, &root); }),
                      is_new || !refuses ? 0 : 43);
            if (is_new || !refuses) (is_new ? held.stored.emplace_back(name, 0) : *at).second = acle.perm_mask;
        }
        const qz::owned_acltree owner(root);
        ASSERT_EQ(compiled(root), expected()) << round;
        ASSERT_EQ(recompiled(expected()), expected()) << round;
        for (auto count = below(held.stored.size() + 2) % 40; count != 0; --count) {
            const std::string name = invent();
            const auto at = find(held.stored, name);
            const bool is_there = at != held.stored.end();
            const sec_acle_t acle = entry(held.type, "UNIX", name.c_str(), 0);
            ASSERT_EQ(sec__del_acle_from_tree(&acle, root), is_there ? 0 : 18);
            if (is_there) held.stored.erase(at);
            ASSERT_EQ(compiled(root), expected()) << round;
        }
        // Lacking memory, part of the entries are in the list and the rest still in the tree.
        sec_aclelist_t list = {};
        ASSERT_EQ(patiently([&] { return sec__acltree_to_aclelist(root, &list); }), 0);
        ASSERT_EQ(taken(list), plain.entries(0, nullptr));
        ASSERT_EQ(compiled(root), "");
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
    for (const auto &[spelled, next] : {std::pair("Unix", "m"), {"unIx", "c"}, {"uniX", "a"}, {"uNix", "z"}}) {
        EXPECT_EQ(compiled(root).substr(10, 4), spelled);
        const sec_acle_t gone = entry(4, "unix", next, 1);
        EXPECT_EQ(sec__del_acle_from_tree(&gone, root), 0);
    }
}

TEST(trees, are_found_by_their_keys_however_many) {
    sec_acltree_array array;
    std::string subacls;
    for (const int expected : {0, 43})
        for (int index = 0; index < 1500; ++index) {
            const std::string mechanism = (index % 2 == 0 ? "m" : "M") + std::to_string(index / 2);
            const sec_acle_t acle = entry(index % 2 == 0 ? 4 : 8, mechanism, "x", 1);
            ASSERT_EQ(patiently([&] { return sec__add_acle_to_trees(&acle, array); }), expected);
            if (expected == 0) subacls.insert(0, of_mechanism(acle.type, mechanism, 1, named(1, "x")));
        }
    buffer out;
    EXPECT_EQ(patiently([&] { return sec__acltrees_to_acl(array.trees(), &out.acl); }), 0);
    EXPECT_EQ(out.bytes(), packed_acl(1500, subacls));
    const std::vector<sec_acltree_t *> too_many(65536, array.trees().back());
    buffer none;
    EXPECT_EQ(sec__acltrees_to_acl(too_many, &none.acl), 6);
    EXPECT_EQ(none.bytes(), "");
}

} // namespace
