// Trees, and their compiled form in both directions: against a plain binary search tree while allocations fail, with
// many keys, with a quarter of a million entries on a small stack, and with hostile bytes. Whole texts are text_fuzz's.
#include "faults.h"
#include "qzacl_acl/compile.h"
#include "support.h"

#include <pthread.h>
#include <thread>

using namespace support;

constexpr int many = 250000; // so that the sanitizers get through, too

namespace {

// A binary search tree as its nodes in the order in which they were inserted; deleted ones have no type.
struct plain_tree {
    int type;
    std::vector<listed> nodes = {};

    auto find(const std::string &identity) {
        return std::ranges::find_if(nodes, [&](const listed &node) { return same(node.identity, identity); });
    }
    // The entries of a node, the first of these, and of those below it; before them the one that is met first.
    void walk(const std::vector<listed> &these, std::vector<listed> &out) const {
        if (these.empty()) return;
        const listed &node = these[0];
        std::vector<listed> left, right;
        for (const listed &each : std::span(these).subspan(1))
            (precedes(each.identity, node.identity) && type != 8 ? left : right).push_back(each);
        if (node.type != 0 && out.empty()) out.push_back(node);
        walk(left, out);
        if (node.type != 0) out.push_back(node);
        walk(right, out);
    }
    std::string compiled(std::vector<listed> &held) const {
        held.clear();
        walk(nodes, held);
        if (held.empty()) return "";
        const std::string field = type == 16 ? "" : text_field(held[0].mechanism);
        held.erase(held.begin());
        std::string packed;
        for (const listed &each : held) packed += named(each.mask, each.identity);
        return packed_subacl(type, field, held.size(), packed);
    }
};

sec_acle_t acle_of(const listed &from) { return entry(from.type, from.mechanism, from.identity.c_str(), from.mask); }

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

std::string compiled(std::span<sec_acltree_t *const> all) {
    buffer out;
    EXPECT_EQ(patiently([&] { return sec__acltrees_to_acl(all, &out.acl); }), 0);
    return out.bytes();
}

// What a sub-ACL becomes when it is expanded and compiled again.
std::string recompiled(std::string_view subacl, int expected = 0) {
    const guarded copy(subacl);
    const qz::byte_span bytes(reinterpret_cast<const unsigned char *>(copy.data()), copy.size());
    auto *root = reinterpret_cast<sec_acltree_t *>(0x10);
    EXPECT_EQ(patiently([&] { return sec__subacl_to_acltree(bytes, &root); }), expected);
    const qz::owned_acltree tree(root);
    return compiled(root);
}

TEST(tree, is_what_plain_insertion_and_deletion_make) {
    for (unsigned round = 0; round < (QZ_SANITIZED ? 150 : 1500); ++round) {
        std::mt19937 random(round);
        const auto below = [&](std::size_t limit) { return random() % limit; };
        const auto spelled = [&](std::string word) {
            for (char &letter : word) letter = below(2) == 0 ? letter : static_cast<char>(std::toupper(letter & 255));
            return word;
        };
        plain_tree plain{std::array{4, 8, 16}[below(3)]};
        // Of few letters, of all bytes, and behind a long prefix that they share; now and then one that is known.
        const auto invent = [&] {
            std::string name(round % 5 == 2 ? round % 60 : 0, 'z');
            for (auto left = 1 + below(round % 5 == 1 ? 70 : 6); left != 0; --left)
                name += round % 5 == 1 ? static_cast<char>(1 + below(255)) : "aAbBzZ@[`{\x7f\x80\xff"[below(13)];
            if (!plain.nodes.empty() && below(3) == 0) name = plain.nodes[below(plain.nodes.size())].identity;
            return listed{plain.type, plain.type == 16 ? "" : spelled("unix"), spelled(name),
                          static_cast<std::uint32_t>(random())};
        };
        sec_acltree_t *root = nullptr;
        for (auto count = 1 + below(round % 25 == 7 ? 1500 : 60); count != 0; --count) {
            const listed added = invent();
            const auto at = plain.find(added.identity);
            const bool is_new = at == plain.nodes.end(), refuses = below(2) == 0;
            const sec_acle_t acle = acle_of(added);
            ASSERT_EQ(patiently([&] { return sec__add_acle_to_tree(refuses, &acle, &root); }),
                      is_new || !refuses ? 0 : 43);
            ASSERT_EQ(recorded_error().id, is_new || !refuses ? 0 : added.type == 16 ? 161 : 144);
            if (is_new)
                plain.nodes.push_back(added);
            else if (!refuses)
                at->mask = added.mask;
        }
        const qz::owned_acltree owner(root);
        std::vector<listed> held;
        const std::string subacl = plain.compiled(held);
        ASSERT_EQ(compiled(root), subacl) << round;
        ASSERT_EQ(recompiled(subacl), subacl) << round;
        // Every other time from the top, where the spelling of the compiled mechanism comes from.
        for (std::size_t count = 0, end = below(plain.nodes.size() + 2) % 40; count != end; ++count) {
            listed gone = invent();
            if (round % 2 == 0) gone.identity = spelled(plain.nodes[count % plain.nodes.size()].identity);
            const auto at = plain.find(gone.identity);
            const bool is_there = at != plain.nodes.end() && std::exchange(at->type, 0) != 0;
            const sec_acle_t acle = acle_of(gone);
            ASSERT_EQ(sec__del_acle_from_tree(&acle, root), is_there ? 0 : 18);
            ASSERT_EQ(recorded_error().id, is_there ? 0 : 105);
            ASSERT_EQ(compiled(root), plain.compiled(held)) << round;
        }
        // Lacking memory, part of the entries are in the list and the rest still in the tree.
        sec_aclelist_t list = {};
        ASSERT_EQ(patiently([&] { return sec__acltree_to_aclelist(root, &list); }), 0);
        plain.compiled(held);
        if (plain.type == 16)
            for (listed &each : held) each.mechanism = "";
        ASSERT_EQ(taken(list), held);
        ASSERT_EQ(compiled(root), "");
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
    EXPECT_EQ(compiled(array.trees()), packed_acl(1500, subacls));
}

TEST(tree, takes_many_entries_in_any_order_on_a_small_stack) {
    std::vector<std::string> names;
    for (int index = 1; index <= many; ++index)
        names.push_back((index % 2 == 0 ? "user" : "User") + std::to_string(many + index));
    std::string sorted;
    const auto expect_tree = [&](int type) {
        sec_acltree_t *root = nullptr;
        for (const std::string &name : names) {
            const sec_acle_t acle = entry(type, "kdz", name.c_str(), 1);
            ASSERT_EQ(sec__add_acle_to_tree(1, &acle, &root), 0);
        }
        const qz::owned_acltree owner(root);
        const sec_acle_t again = entry(type, "kdz", names[4711].c_str(), 1);
        EXPECT_EQ(sec__add_acle_to_tree(1, &again, &root), 43);
        const std::string bytes = compiled(root);
        EXPECT_TRUE(type == 8 || sorted.empty() || bytes == sorted);
        if (type == 4) sorted = bytes;
        EXPECT_TRUE(recompiled(bytes) == bytes);
        sec_aclelist_t list = {};
        EXPECT_EQ(sec__acltree_to_aclelist(root, &list), 0);
        EXPECT_EQ(list.count, many);
        sec_release_aclelist(&list);
    };
    pthread_attr_t small;
    pthread_attr_init(&small);
    ASSERT_EQ(pthread_attr_setstacksize(&small, std::size_t{256} * 1024), 0);
    ASSERT_EQ(pthread_setattr_default_np(&small), 0);
    std::thread([&] {
        for (const char *order : {"up", "down", "shuffled"}) {
            if (*order == 'd') std::ranges::reverse(names);
            if (*order == 's') std::ranges::shuffle(names, std::mt19937(3));
            for (const int type : {4, 8}) expect_tree(type);
        }
    }).join();
}

TEST(compiling, writes_no_more_than_fits) {
    const sec_acle_t user = entry(4, "abcd", "xyz", 3);
    sec_acltree_array array;
    EXPECT_EQ(sec__add_acle_to_trees(&user, array), 0);
    const std::vector<sec_acltree_t *> too_many(65536, array.trees()[0]);
    EXPECT_EQ(compiled(std::span(too_many).first(65535)).substr(0, 31), packed_acl(65535, example.substr(5)));
    sec_acl_buffer_t acl = {1, nullptr};
    EXPECT_EQ(sec__acltrees_to_acl(too_many, &acl), 6);
    EXPECT_EQ(acl.length, 0);
}

TEST(expanding, refuses_hostile_bytes) {
    const std::string single = packed_entry(1, ""), x1 = named(1, "x"), sound = of_mechanism(4, "unix", 2, x1 + x1);
    std::vector<std::pair<std::string, int>> rows = {
        {packed_subacl(0, "", 1, x1), 97},
        {packed_subacl(1, "", 2, single + single), 98},
        {packed_subacl(16, "", 0xffffffff, x1), 97},
        {packed_subacl(4, "", 1, x1), 97},
        {packed_subacl(4, std::string(16, 'm'), 1, x1), 97},
        {packed_subacl(4, std::string(17, 'm'), 1, x1), 110},
        {of_mechanism(4, "unix", 2, x1 + single), 97},
        {packed_subacl(16, "", 2, x1 + packed_entry(1, "y")), 97},
    };
    for (std::size_t length = 0; length < sound.size(); ++length) rows.emplace_back(sound.substr(0, length), 97);
    for (const auto &[bytes, id] : rows) {
        EXPECT_EQ(recompiled(bytes, 42), ""); // no tree is left
        EXPECT_EQ(recorded_error().id, id) << testing::PrintToString(bytes);
    }
}

} // namespace
