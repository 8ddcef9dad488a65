// Trees, and their compiled form in both directions: against a plain binary search tree with nodes and links,
// with a million entries on a small stack, with hostile bytes, and with failing allocations.
#include "qzacl_acl/compile.h"
#include "support.h"

#include <algorithm>
#include <memory>
#include <pthread.h>
#include <random>

using namespace support;

#if defined(__has_feature)
#if __has_feature(address_sanitizer) || __has_feature(thread_sanitizer)
#define TREE_TEST_SANITIZED
#endif
#elif defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
#define TREE_TEST_SANITIZED
#endif

// The allocations of this thread until one fails; negative: none does. The sanitizers bring their own
// allocator.
static thread_local int allocations_left = -1;
#ifdef TREE_TEST_SANITIZED
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

std::string folded(std::string text) {
    for (char &letter : text)
        letter = static_cast<char>(letter >= 'A' && letter <= 'Z' ? letter + 32 : letter);
    return text;
}

struct plain_entry {
    int type = 0;
    std::string mechanism = {}; // empty where the type has none
    std::string identity = {};
    std::uint32_t mask = 0;

    sec_acle_t acle() const { return entry(type, mechanism, type < 4 ? nullptr : identity.c_str(), mask); }
    failure as_duplicate() const {
        const std::string letter(1, "?no?u???e???????g"[type]);
        return type < 4     ? error_of(43, 160, {letter})
               : type == 16 ? error_of(43, 161, {letter, identity})
                            : error_of(43, 144, {letter, mechanism, identity});
    }
    failure as_missing() const { return error_of(18, 105, {std::to_string(type), mechanism, identity}); }
};

// ---- The plain tree ----

struct plain_node;
using plain_tree = std::unique_ptr<plain_node>;
struct plain_node {
    plain_entry held = {};
    std::string key = {};
    bool is_held = true;
    plain_tree left = {};
    plain_tree right = {};
};

// The slot where an entry is, or where it would be put.
plain_tree &slot_of(plain_tree &root, const plain_entry &wanted) {
    const std::string key = folded(wanted.identity);
    plain_tree *slot = &root;
    while (*slot && key != (*slot)->key)
        slot = wanted.type == 8 || key > (*slot)->key ? &(*slot)->right : &(*slot)->left;
    return *slot;
}

// True unless the entry is a duplicate, which with `merge` leaves its mask.
bool insert(plain_tree &root, const plain_entry &added, bool merge) {
    plain_tree &slot = slot_of(root, added);
    if (slot && merge)
        slot->held.mask = added.mask;
    if (slot)
        return false;
    slot = std::make_unique<plain_node>();
    slot->held = added;
    slot->key = folded(added.identity);
    return true;
}

// The entries that are held, in order; before them the one that the walk meets first.
void walk(const plain_tree &node, std::vector<plain_entry> &out) {
    if (!node)
        return;
    if (node->is_held && out.empty())
        out.push_back(node->held);
    walk(node->left, out);
    if (node->is_held)
        out.push_back(node->held);
    walk(node->right, out);
}

std::string compiled(const plain_tree &root) {
    std::vector<plain_entry> entries;
    walk(root, entries);
    std::string packed;
    const auto field = [](const std::string &text) { return text.empty() ? "" : text + '\0'; };
    for (std::size_t index = 1; index < entries.size(); ++index)
        packed += packed_entry(entries[index].mask, field(entries[index].identity));
    if (entries.empty())
        return "";
    return packed_subacl(entries[0].type, field(entries[0].mechanism), entries.size() - 1, packed);
}

// ---- The library's ----

using trees = std::vector<sec_acltree_t *>;

// Lets each allocation of a step fail in turn until it gets what it wants: what failed for memory left
// everything as it was, or where the operation says so, half done, and is repeated.
template <class Step>
int patiently(Step step) {
    for (int allowed = 0;; ++allowed) {
        allocations_left = allowed;
        const int result = step();
        allocations_left = -1;
        if (result != 6)
            return result;
        EXPECT_EQ(recorded_error().id, 89);
    }
}

std::string compiled(const sec_acltree_t *root) {
    qz::loose_subacl out;
    EXPECT_EQ(patiently([&] { return sec__acltree_to_subacl(root, out); }), 0);
    return {reinterpret_cast<char *>(out.data.get()), out.length};
}

std::string compiled(std::span<sec_acltree_t *const> all) {
    sec_acl_buffer_t acl = {};
    EXPECT_EQ(patiently([&] { return sec__acltrees_to_acl(all, &acl); }), 0);
    std::string bytes(static_cast<char *>(acl.data), static_cast<std::size_t>(acl.length));
    EXPECT_EQ(sec_release_acl(&acl), 0);
    return bytes;
}

int expand(std::string_view subacl, qz::owned_acltree &out) {
    const guarded copy(subacl);
    const qz::byte_span bytes(reinterpret_cast<const unsigned char *>(copy.data()), copy.size());
    auto *root = reinterpret_cast<sec_acltree_t *>(0x10);
    const int result = patiently([&] { return sec__subacl_to_acltree(bytes, &root); });
    out.reset(root);
    return result;
}

std::string recompiled(std::string_view subacl) {
    qz::owned_acltree tree;
    EXPECT_EQ(expand(subacl, tree), 0);
    return compiled(tree.get());
}

int add(bool report_duplicates, const plain_entry &added, sec_acltree_t **root) {
    const sec_acle_t acle = added.acle();
    return patiently([&] { return sec__add_acle_to_tree(report_duplicates, &acle, root); });
}

qz::owned_acltree tree_of(const std::vector<plain_entry> &entries) {
    sec_acltree_t *root = nullptr;
    for (const plain_entry &each : entries)
        EXPECT_EQ(add(true, each, &root), 0);
    return qz::owned_acltree(root);
}

// Invents entries: in turns from few letters, from all bytes, and behind a long prefix that they share; of
// few mechanisms or of many.
struct inventor {
    plain_entry operator()(int type) {
        const auto mechanisms = style % 50 == 7 ? 1500u : 2u;
        plain_entry made = {type, "", "", static_cast<std::uint32_t>(random())};
        if (type == 4 || type == 8)
            made.mechanism = spelled("unix" + std::to_string(random() % mechanisms));
        if (type >= 4)
            made.identity = style % 3 == 0   ? text("aAbB", 1 + random() % 5)
                            : style % 3 == 1 ? text(all_bytes, 1 + random() % 70)
                                             : spelled(prefix) + text("aAzZ@[`{\x7f\x80\xff", random() % 12);
        return made;
    }
    std::string text(const std::string &letters, std::size_t length) {
        std::string made;
        while (made.size() < length)
            made += letters[random() % letters.size()];
        return made;
    }
    std::string spelled(std::string word) {
        for (char &letter : word)
            letter = static_cast<char>(letter >= 'a' && letter <= 'z' && random() % 2 ? letter - 32 : letter);
        return word;
    }

    std::mt19937 &random;
    unsigned style;
    std::string all_bytes = [] {
        std::string bytes;
        for (int value = 1; value < 256; ++value)
            bytes += static_cast<char>(value);
        return bytes;
    }();
    std::string prefix = text("az\x80", 1 + random() % 60);
};

TEST(tree, of_each_key_is_that_of_plain_insertion) {
    std::mt19937 random(1);
    for (unsigned round = 0; round < 600; ++round) {
        inventor invent{random, round};
        std::vector<std::pair<std::string, plain_tree>> plain; // by key, in the order of first appearance
        sec_acltree_array array;
        const int types[] = {1, 2, 4, 8, 16, 4, 8, 16};
        for (auto count = random() % (round % 25 == 7 ? 3000 : 120); count != 0; --count) {
            const plain_entry added = invent(types[random() % std::size(types)]);
            const sec_acle_t acle = added.acle();
            const std::string key = std::to_string(added.type) + folded(added.mechanism);
            auto at = std::find_if(plain.begin(), plain.end(), [&](auto &each) { return each.first == key; });
            if (at == plain.end())
                at = plain.insert(at, std::pair(key, plain_tree()));
            const bool is_new = insert(at->second, added, false);
            ASSERT_EQ(patiently([&] { return sec__add_acle_to_trees(&acle, array); }), is_new ? 0 : 43);
            ASSERT_EQ(recorded_error(), is_new ? failure{} : added.as_duplicate());
        }
        std::string subacls;
        for (const auto &[key, tree] : plain) {
            const std::string subacl = compiled(tree);
            ASSERT_EQ(recompiled(subacl), subacl);
            subacls.insert(0, subacl);
        }
        ASSERT_EQ(compiled(array.trees()), packed_acl(plain.size(), subacls)) << round;
    }
}

TEST(tree, merges_deletes_and_lists_like_the_plain_one) {
    std::mt19937 random(2);
    for (unsigned round = 0; round < 600; ++round) {
        inventor invent{random, round / 5};
        const int type = 1 << round % 5;
        plain_tree plain;
        sec_acltree_t *root = nullptr;
        std::vector<plain_entry> known;
        for (auto count = 1 + random() % (round % 50 == 4 ? 1500 : 90); count != 0; --count) {
            const plain_entry added = known.emplace_back(invent(type));
            const bool report = random() % 2 != 0;
            const bool passes = insert(plain, added, !report) || !report;
            ASSERT_EQ(add(report, added, &root), passes ? 0 : 43);
            ASSERT_EQ(recorded_error(), passes ? failure{} : added.as_duplicate());
        }
        const qz::owned_acltree owner(root);
        // Every other time from the top, where the compiled mechanism's spelling comes from; also what is not
        // there.
        for (std::size_t count = 0, end = random() % (known.size() + 2); count != end; ++count) {
            const plain_entry gone =
                random() % 4 == 0 ? invent(type) : known[(round % 2 == 0 ? count : random()) % known.size()];
            const plain_tree &slot = slot_of(plain, gone);
            const bool is_there = slot && std::exchange(slot->is_held, false);
            const sec_acle_t acle = gone.acle();
            ASSERT_EQ(sec__del_acle_from_tree(&acle, root), is_there ? 0 : 18);
            ASSERT_EQ(recorded_error(), is_there ? failure{} : gone.as_missing());
            ASSERT_EQ(compiled(root), compiled(plain));
        }
        std::vector<plain_entry> rest;
        walk(plain, rest);
        sec_aclelist_t list =
            {}; // lacking memory, part of the entries are in it and the rest still in the tree
        ASSERT_EQ(patiently([&] { return sec__acltree_to_aclelist(root, &list); }), 0);
        ASSERT_EQ(list.count, std::max<std::ptrdiff_t>(std::ssize(rest) - 1, 0));
        for (std::size_t index = 1; index < rest.size(); ++index) {
            const sec_acle_t &acle = *list.acles[index - 1];
            ASSERT_EQ(std::tuple(int{acle.type}, acle.perm_mask), std::tuple(type, rest[index].mask));
            ASSERT_EQ(acle.identity == nullptr ? "" : acle.identity, rest[index].identity);
            ASSERT_EQ(acle.mechanism, rest[index].mechanism);
        }
        EXPECT_EQ(compiled(trees{root}), packed_acl(0, "")); // all were moved
        sec_release_aclelist(&list);
    }
}

// ---- Size ----

template <class Call>
void on_small_stack(Call call) {
    pthread_attr_t attributes;
    pthread_t thread = {};
    pthread_attr_init(&attributes);
    ASSERT_EQ(pthread_attr_setstacksize(&attributes, std::size_t{256} * 1024), 0);
    const auto run = [](void *context) -> void * {
        (*static_cast<Call *>(context))();
        return nullptr;
    };
    ASSERT_EQ(pthread_create(&thread, &attributes, run, &call), 0);
    pthread_join(thread, nullptr);
    pthread_attr_destroy(&attributes);
}

TEST(tree, takes_a_million_entries_in_any_order) {
    std::vector<std::string> names;
    for (int index = 0; index < a_million; ++index) {
        char name[32];
        std::snprintf(name, sizeof name, index % 2 == 0 ? "user-%08x" : "User-%08X", index);
        names.emplace_back(name);
    }
    const auto bytes_of_names = [&](int type) {
        std::string entries;
        for (const std::string &name : names)
            entries += packed_entry(1, name + '\0');
        return packed_subacl(type, "kdz\0"sv, names.size(), entries);
    };
    const std::string sorted = bytes_of_names(4);
    const auto try_type = [&](int type, bool and_back) {
        sec_acltree_t *root = nullptr;
        for (const std::string &name : names) {
            const sec_acle_t acle = entry(type, "kdz", name.c_str(), 1);
            ASSERT_EQ(sec__add_acle_to_tree(1, &acle, &root), 0);
        }
        const qz::owned_acltree owner(root);
        EXPECT_EQ(add(true, {type, "kdz", names[4711]}, &root), 43);
        const std::string bytes = compiled(root);
        EXPECT_TRUE(bytes == (type == 4 ? sorted : bytes_of_names(8)));
        if (!and_back)
            return;
        EXPECT_TRUE(recompiled(bytes) == bytes);
        sec_aclelist_t list = {};
        EXPECT_EQ(sec__acltree_to_aclelist(root, &list), 0);
        EXPECT_EQ(list.count, a_million);
        sec_release_aclelist(&list);
    };
    on_small_stack([&] {
        try_type(4, false);
        try_type(8, false);
        std::reverse(names.begin(), names.end());
        try_type(4, false);
        std::shuffle(names.begin(), names.end(), std::mt19937(3));
        try_type(4, true);
        try_type(8, true);
    });
}

TEST(tree, and_acl_keep_to_the_limits_of_their_fields) {
    for (int type : {4, 8, 16}) {
        const std::string mechanism = type == 16 ? "" : "kdz";
        const std::string bytes = compiled(tree_of({{type, mechanism, std::string(65534, 'y')}}).get());
        EXPECT_TRUE(bytes.ends_with("\xff\xff" + std::string(65534, 'y') + '\0'));
        EXPECT_TRUE(recompiled(bytes) == bytes);

        const auto tree = tree_of({{type, mechanism, "a"}, {type, mechanism, std::string(65535, 'x')}});
        sec_acl_buffer_t acl = {1, nullptr};
        EXPECT_EQ(sec__acltrees_to_acl(trees{tree.get()}, &acl), 43);
        EXPECT_EQ(recorded_error(), error_of(43, 104, {std::to_string(type)}));
        EXPECT_EQ(acl.length, 0);
    }
    const auto any = tree_of({{2, "", ""}});
    const trees too_many(65536, any.get());
    EXPECT_EQ(compiled(std::span(too_many).first(65535)).substr(0, 5), packed_acl(65535, ""));
    sec_acl_buffer_t acl = {1, nullptr};
    EXPECT_EQ(sec__acltrees_to_acl(too_many, &acl), 6);
    EXPECT_EQ(acl.length, 0);
}

// ---- Bytes ----

TEST(compiling, writes_these_bytes) {
    const auto user = tree_of({{4, "abcd", "xyz", 3}});
    const auto any = tree_of({{2, "ignored", "", 0xa0b0c0d0}});
    const std::string abcd = "\x1a\0\0\0\4\1\0\0\0\5abcd\0\1\3\0\0\0\4\0xyz\0"s;
    EXPECT_EQ(compiled(trees{}), "\x85\1\2\0\0"s);
    EXPECT_EQ(compiled(trees{user.get()}), "\x85\1\2\1\0"s + abcd);
    EXPECT_EQ(compiled(trees{user.get(), nullptr, any.get()}),
              "\x85\1\2\2\0\x11\0\0\0\2\1\0\0\0\0\1\xd0\xc0\xb0\xa0\0\0"s + abcd);
}

const std::string x1 = packed_entry(1, "x\0"sv);

TEST(expanding, merges_equal_identities) {
    const std::string X2 = packed_entry(2, "X\0"sv), x2 = packed_entry(2, "x\0"sv),
                      a = packed_entry(4, "a\0"sv);
    const auto subacl = [](int type, int count, const std::string &entries) {
        return packed_subacl(type, type == 16 ? "" : "kdz\0"sv, static_cast<unsigned>(count), entries);
    };
    EXPECT_EQ(recompiled(subacl(4, 3, x1 + a + X2)), subacl(4, 2, a + x2));
    EXPECT_EQ(recompiled(subacl(8, 3, x1 + a + X2)), subacl(8, 2, x2 + a));
    EXPECT_EQ(recompiled(subacl(16, 2, x1 + X2)), subacl(16, 1, x2));
    EXPECT_EQ(recompiled(subacl(4, 0, "")), "");
    EXPECT_EQ(recompiled(packed_subacl(16, "skipped\0"sv, 1, a)), subacl(16, 1, a));
    const std::string longest = packed_subacl(4, std::string(16, 'm') + '\0', 1, a);
    EXPECT_EQ(recompiled(longest), longest);
}

TEST(expanding, refuses_hostile_bytes) {
    const std::string sound = packed_subacl(4, "unix\0"sv, 2, packed_entry(1, "alice\0"sv) + x1);
    std::vector<std::pair<std::string, int>> rows = {
        {packed_subacl(0, "", 1, x1), 97},
        {packed_subacl(3, "unix\0"sv, 1, x1), 97},
        {packed_subacl(0x84, "unix\0"sv, 1, x1), 97},
        {packed_subacl(1, "", 2, packed_entry(1, "") + packed_entry(1, "")), 98},
        {packed_subacl(2, "", 0xffffffff, ""), 98},
        {packed_subacl(2, "", 1, ""), 97},
        {packed_subacl(4, "unix\0"sv, 2, x1), 97},
        {packed_subacl(16, "", 0xffffffff, x1), 97},
        {packed_subacl(4, "", 1, x1), 97},
        {packed_subacl(8, "unix", 1, x1), 97},
        {packed_subacl(4, std::string(16, 'm'), 1, x1), 97},
        {packed_subacl(4, std::string(17, 'm'), 1, x1), 110},
        {packed_subacl(4, std::string(17, 'm') + '\0', 1, x1), 110},
        {packed_subacl(8, std::string(255, 'm'), 1, x1), 110},
        {packed_subacl(4, "unix\0"sv, 2, x1 + packed_entry(1, "")), 97},
        {packed_subacl(16, "", 2, x1 + packed_entry(1, "y")), 97},
    };
    for (std::size_t length = 0; length < sound.size(); ++length)
        rows.emplace_back(sound.substr(0, length), 97);
    for (const auto &[bytes, id] : rows) {
        qz::owned_acltree tree;
        EXPECT_EQ(expand(bytes, tree), 42);
        EXPECT_EQ(recorded_error().id, id) << testing::PrintToString(bytes);
        EXPECT_EQ(tree, nullptr);
    }
}

} // namespace
