// Trees, and their compiled form in both directions: against a plain binary search tree, with a million entries
// on a small stack, with hostile bytes, and with failing allocations.
#include "qzacl_acl/compile.h"
#include "service_support.h"

#include <pthread.h>
#include <strings.h>
#include <thread>

using namespace support;

// The allocations of this thread until one fails; negative: none does. The sanitizers bring their own
// allocator.
static thread_local int allocations_left = -1;
#ifndef __has_feature
#define __has_feature(feature) 0
#endif
#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__) || __has_feature(address_sanitizer) ||               \
    __has_feature(thread_sanitizer)
constexpr int a_million = 100000; // stands for it where everything takes its time
#else
constexpr int a_million = 1000000;
extern "C" void *__libc_malloc(size_t);
extern "C" void *__libc_calloc(size_t, size_t);
extern "C" void *__libc_realloc(void *, size_t);
static bool fails() { return allocations_left >= 0 && allocations_left-- == 0; }
extern "C" void *malloc(size_t n) noexcept { return fails() ? nullptr : __libc_malloc(n); }
extern "C" void *calloc(size_t n, size_t size) noexcept { return fails() ? nullptr : __libc_calloc(n, size); }
extern "C" void *realloc(void *old, size_t n) noexcept { return fails() ? nullptr : __libc_realloc(old, n); }
#endif

namespace {

// A binary search tree as its nodes in the order in which they were inserted; deleted ones have no type.
struct plain_tree {
    int type;
    std::string mechanism;
    std::vector<listed> nodes = {};

    auto find(const std::string &identity) {
        return std::find_if(nodes.begin(), nodes.end(), [&](const listed &node) {
            return strcasecmp(node.identity.c_str(), identity.c_str()) == 0;
        });
    }
    // The entries of a node, the first of these, and of those below it; before them the one that is met first.
    void walk(const std::vector<const listed *> &these, std::vector<listed> &out) const {
        if (these.empty()) return;
        const listed &node = *these[0];
        std::vector<const listed *> left, right;
        for (std::size_t at = 1; at < these.size(); ++at) {
            const bool precedes = strcasecmp(these[at]->identity.c_str(), node.identity.c_str()) < 0;
            (precedes && type != 8 ? left : right).push_back(these[at]);
        }
        if (node.type != 0 && out.empty()) out.push_back(node);
        walk(left, out);
        if (node.type != 0) out.push_back(node);
        walk(right, out);
    }
    std::vector<listed> entries() const {
        std::vector<const listed *> all;
        for (const listed &node : nodes) all.push_back(&node);
        std::vector<listed> out;
        walk(all, out);
        return out;
    }
    std::string compiled() const {
        const std::vector<listed> held = entries();
        if (held.empty()) return "";
        std::string packed;
        for (const listed &each : std::span(held).subspan(1))
            packed += packed_entry(each.mask, type < 4 ? "" : text_field(each.identity));
        const std::string field = type == 4 || type == 8 ? text_field(held[0].mechanism) : "";
        return packed_subacl(type, field, held.size() - 1, packed);
    }
};

sec_acle_t acle_of(const listed &from) {
    return entry(from.type, from.mechanism, from.type < 4 ? nullptr : from.identity.c_str(), from.mask);
}

// Lets each allocation of a step fail in turn until it gets what it wants: what failed for memory left
// everything as it was, or where the operation says so, half done, and is repeated.
template <class Step>
int patiently(Step step) {
    for (int allowed = 0;; ++allowed) {
        allocations_left = allowed;
        const int result = step();
        allocations_left = -1;
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

// Invents entries: in turns of few letters, of all bytes, and behind a long prefix that they share; of few
// mechanisms or of many.
struct inventor {
    listed operator()(int type) {
        const std::string of = "unix" + std::to_string(random() % (round % 50 == 7 ? 1500 : 2));
        std::string name(round % 3 == 2 ? round % 60 : 0, 'z');
        for (auto left = 1 + random() % (round % 3 == 1 ? 70 : 6); left != 0; --left)
            name += static_cast<char>(round % 3 == 0   ? "aAbB"[random() % 4]
                                      : round % 3 == 1 ? static_cast<char>(1 + random() % 255)
                                                       : "aAzZ@[`{\x7f\x80\xff"[random() % 11]);
        return {type, type == 4 || type == 8 ? spelled(of) : "", type < 4 ? "<none>" : spelled(name), random()};
    }
    std::string spelled(std::string word) {
        for (char &letter : word) letter = random() % 2 == 0 ? letter : static_cast<char>(std::toupper(letter & 255));
        return word;
    }
    std::uint32_t random() { return static_cast<std::uint32_t>(generator()); }

    unsigned round;
    std::mt19937 generator{round};
};

TEST(tree, is_what_plain_insertion_and_deletion_make) {
    for (unsigned round = 0; round < 600; ++round) {
        inventor invent{round};
        const auto below = [&](std::size_t limit) { return invent.random() % limit; };
        std::vector<plain_tree> plain; // in the order of first appearance
        sec_acltree_array array;
        for (auto count = below(round % 25 == 7 ? 3000 : 300); count != 0; --count) {
            const listed added = invent(std::array{1, 2, 4, 8, 16, 4, 8, 16}[below(8)]);
            auto at = std::find_if(plain.begin(), plain.end(), [&](const plain_tree &each) {
                return each.type == added.type && same(each.mechanism, added.mechanism);
            });
            if (at == plain.end()) at = plain.insert(at, {added.type, added.mechanism});
            const bool is_new = at->find(added.identity) == at->nodes.end();
            if (is_new) at->nodes.push_back(added);
            const sec_acle_t acle = acle_of(added);
            ASSERT_EQ(patiently([&] { return sec__add_acle_to_trees(&acle, array); }), is_new ? 0 : 43);
            ASSERT_EQ(recorded_error().id, is_new ? 0 : added.type < 4 ? 160 : added.type == 16 ? 161 : 144);
        }
        std::string subacls;
        for (const plain_tree &each : plain) {
            const std::string subacl = each.compiled();
            ASSERT_EQ(recompiled(subacl), subacl);
            subacls.insert(0, subacl);
        }
        ASSERT_EQ(compiled(array.trees()), packed_acl(plain.size(), subacls)) << round;

        auto tree = plain.begin();
        for (sec_acltree_t *root : array.trees()) {
            if (root == nullptr) continue; // a slot that was left when memory failed
            // One that may be there; else one that was, every other time from the top, where the spelling of the
            // compiled mechanism comes from.
            const auto pick = [&](std::size_t count) {
                const auto &known = tree->nodes[(round % 2 == 0 ? count : invent.random()) % tree->nodes.size()];
                listed made = invent(tree->type);
                made.identity = below(4) == 0 ? made.identity : invent.spelled(known.identity);
                return made;
            };
            for (auto count = below(10); count != 0; --count) {
                const listed merged = pick(count);
                if (const auto at = tree->find(merged.identity); at != tree->nodes.end())
                    at->mask = merged.mask;
                else
                    tree->nodes.push_back(merged);
                const sec_acle_t acle = acle_of(merged);
                ASSERT_EQ(patiently([&] { return sec__add_acle_to_tree(0, &acle, &root); }), 0);
            }
            for (std::size_t count = 0, end = below(tree->nodes.size() + 2); count != end; ++count) {
                const listed gone = pick(count);
                const auto at = tree->find(gone.identity);
                const bool is_there = at != tree->nodes.end() && std::exchange(at->type, 0) != 0;
                const sec_acle_t acle = acle_of(gone);
                ASSERT_EQ(sec__del_acle_from_tree(&acle, root), is_there ? 0 : 18);
                ASSERT_EQ(recorded_error().id, is_there ? 0 : 105);
                ASSERT_EQ(compiled(root), tree->compiled());
            }
            std::vector<listed> rest = tree->entries();
            rest.erase(rest.begin(), rest.begin() + !rest.empty());
            // Lacking memory, part of the entries are in the list and the rest still in the tree.
            sec_aclelist_t list = {};
            ASSERT_EQ(patiently([&] { return sec__acltree_to_aclelist(root, &list); }), 0);
            ASSERT_EQ(taken(list), rest);
            ++tree;
        }
        ASSERT_EQ(compiled(array.trees()), packed_acl(0, "")); // all were moved
    }
}

TEST(tree, takes_a_million_entries_in_any_order_on_a_small_stack) {
    std::vector<std::string> names;
    for (int index = 1; index <= a_million; ++index)
        names.push_back((index % 2 == 0 ? "user" : "User") + std::to_string(a_million + index));
    const auto bytes_of_names = [&](int type) {
        std::string entries;
        for (const std::string &name : names) entries += named(1, name);
        return of_mechanism(type, "kdz", names.size(), entries);
    };
    const std::string sorted = bytes_of_names(4);
    const auto try_types = [&](std::initializer_list<int> types) {
        for (const int type : types) {
            sec_acltree_t *root = nullptr;
            for (const std::string &name : names) {
                const sec_acle_t acle = entry(type, "kdz", name.c_str(), 1);
                ASSERT_EQ(sec__add_acle_to_tree(1, &acle, &root), 0);
            }
            const qz::owned_acltree owner(root);
            const sec_acle_t again = entry(type, "kdz", names[4711].c_str(), 1);
            EXPECT_EQ(sec__add_acle_to_tree(1, &again, &root), 43);
            const std::string bytes = compiled(root);
            EXPECT_TRUE(bytes == (type == 4 ? sorted : bytes_of_names(8)));
            EXPECT_TRUE(recompiled(bytes) == bytes);
            sec_aclelist_t list = {};
            EXPECT_EQ(sec__acltree_to_aclelist(root, &list), 0);
            EXPECT_EQ(list.count, a_million);
            sec_release_aclelist(&list);
        }
    };
    pthread_attr_t small;
    pthread_attr_init(&small);
    ASSERT_EQ(pthread_attr_setstacksize(&small, std::size_t{256} * 1024), 0);
    ASSERT_EQ(pthread_setattr_default_np(&small), 0);
    std::thread([&] {
        try_types({4, 8});
        std::reverse(names.begin(), names.end());
        try_types({4});
        std::shuffle(names.begin(), names.end(), std::mt19937(3));
        try_types({4, 8});
    }).join();
}

TEST(compiling, writes_these_bytes_and_no_more_than_fit) {
    const sec_acle_t user = entry(4, "abcd", "xyz", 3), other = entry(2, "ignored", nullptr, 0xa0b0c0d0);
    sec_acltree_array array;
    EXPECT_EQ(sec__add_acle_to_trees(&user, array) + sec__add_acle_to_trees(&other, array), 0);
    const std::string abcd = "\x1a\0\0\0\4\1\0\0\0\5abcd\0\1\3\0\0\0\4\0xyz\0"s;
    EXPECT_EQ(compiled(array.trees()), "\x85\1\2\2\0\x11\0\0\0\2\1\0\0\0\0\1\xd0\xc0\xb0\xa0\0\0"s + abcd);
    const std::vector<sec_acltree_t *> too_many(65536, array.trees()[1]);
    EXPECT_EQ(compiled(std::span(too_many).first(65535)).substr(0, 5), packed_acl(65535, ""));
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
