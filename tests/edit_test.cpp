// Tests of adding and deleting entries, against a plain model of what an edit does: expand the sub-ACL of the
// entry's key, change it, compile it again.
#include "service_support.h"

namespace {

using namespace support;
using edit_function = int (*)(const sec_acle_t *, sec_acl_buffer_t *);
// Identities and masks as they are stored: in any order, with repetitions.
using items = std::vector<std::pair<std::string, std::uint32_t>>;

const auto key = [](const auto &each) { return folded(each.first); };
auto find(items &all, const std::string &identity) { return std::ranges::find(all, folded(identity), key); }
bool has_mechanism(int type) { return type == 4 || type == 8; }
struct model_subacl {
    int type;
    std::string mechanism;
    items stored = {};
    unsigned flaw = 0; // 1: a version nobody looks at; bytes behind 2: the mechanism, 3: the identities

    // Of equal ones the first spelling and the last mask; all but user-expanded ones are put in order.
    items expanded() const {
        items made;
        for (const auto &[identity, mask] : stored) {
            const auto at = find(made, identity);
            (at == made.end() ? made.emplace_back(identity, 0) : *at).second = mask;
        }
        if (type != 8) std::ranges::sort(made, {}, key);
        return made;
    }
    std::string bytes() const {
        std::string entries;
        for (const auto &[identity, mask] : stored)
            entries += packed_entry(mask, type < 4 ? "" : text_field(identity) + (flaw == 3 ? "more" : ""));
        if (flaw == 1 && !entries.empty()) entries[0] = 7;
        const std::string field = text_field(mechanism) + (flaw == 2 ? "m" : "");
        return packed_subacl(type, has_mechanism(type) ? field.substr(0, 17) : "", stored.size(), entries);
    }
};

struct model {
    std::vector<model_subacl> subacls;
    std::string bytes() const {
        std::string all;
        for (const model_subacl &each : subacls) all += each.bytes();
        return packed_acl(subacls.size(), all);
    }
    std::vector<listed> entries(int type, const char *mechanism) const {
        std::vector<listed> all;
        for (const model_subacl &each : subacls) {
            const bool by_mechanism = has_mechanism(type) && mechanism != nullptr;
            if (type != 0 && (each.type != type || (by_mechanism && !same(each.mechanism, mechanism)))) continue;
            for (const auto &[identity, mask] : each.expanded())
                all.push_back({each.type, each.mechanism, each.type < 4 ? "<none>" : identity, mask});
            if (type != 0 && (by_mechanism || !has_mechanism(type))) break; // the first of the key
        }
        return all;
    }
    failure edit(edit_function how, const sec_acle_t &acle) {
        const std::string mechanism = has_mechanism(acle.type) ? acle.mechanism : "";
        const std::string identity = acle.type < 4 ? "" : acle.identity;
        const bool deletes = how == sec_del_acle_from_acl;
        const auto is_it = [&](const auto &of) { return of.type == acle.type && same(of.mechanism, mechanism); };
        auto at = std::ranges::find_if(subacls, is_it);
        items held = at == subacls.end() ? items() : at->expanded();
        const auto old = find(held, identity);
        if (deletes && old == held.end())
            return error_of(at != subacls.end() && held.empty() ? 43 : 18, 105,
                            {std::to_string(acle.type), mechanism, identity});
        const std::string letter(1, " no u   e       g"[acle.type]);
        if (old != held.end() && how == sec_add_acle_to_acl2)
            return has_mechanism(acle.type) ? error_of(43, 144, {letter, mechanism, identity})
                                            : error_of(43, acle.type < 4 ? 160 : 161, {letter, identity});
        if (at == subacls.end()) at = subacls.insert(at, {acle.type, ""});
        const std::string spelled = held.empty() ? mechanism : at->mechanism;
        if (deletes)
            held.erase(old);
        else
            held.emplace_back(identity, acle.perm_mask);
        *at = {acle.type, spelled, model_subacl{acle.type, "", held}.expanded()};
        if (held.empty()) subacls.erase(at);
        return no_error;
    }
};

// In several spellings each. The bytes between the cases and beyond ASCII do not fold.
const arguments mechanisms = words("unix UNIX uNix hba2 HBA2 a_[`{ A_[`{ sixteen-bytes-xx");
const arguments identities =
    words("a A b B ab aB Ab@x ab@X a_b a[b \xc3 \xe3 longer-name-1 LONGER-name-1 sixteen-bytes-16 "
          "sixteen-BYTES-16 seventeen-byte-17 seventeen-byte-1_ seventeen-byte-1Z");

struct random_edits {
    std::mt19937 generator;
    unsigned below(std::size_t limit) { return static_cast<unsigned>(generator() % limit); }
    int type() { return std::vector{1, 2, 4, 4, 4, 8, 8, 16, 16}[below(9)]; }
    const char *mechanism() { return mechanisms[below(8)].c_str(); }
    const char *identity(std::size_t limit) { return below(15) == 0 ? "" : identities[below(limit)].c_str(); }
    // Sub-ACLs as no edit leaves them: unsorted, repeated, empty, flawed, the same key twice.
    model untidy() {
        model made;
        for (unsigned left = below(6); left != 0; --left) {
            model_subacl subacl{type(), mechanism(), {}, below(8)};
            if (!has_mechanism(subacl.type)) subacl.mechanism.clear();
            for (unsigned entries = below(subacl.type < 4 ? 2 : 8); entries != 0; --entries)
                subacl.stored.emplace_back(subacl.type < 4 ? "" : identity(left % 2 * 15 + 4), below(~0u));
            made.subacls.push_back(subacl);
        }
        return made;
    }
};

TEST(edit, does_what_expanding_changing_and_compiling_does) {
    const edit_function edits[] = {sec_add_acle_to_acl, sec_add_acle_to_acl2, sec_del_acle_from_acl};
    for (unsigned run = 0; run < 300; ++run) {
        random_edits random{std::mt19937(run)};
        model wanted = run % 3 == 1 ? random.untidy() : model();
        buffer held(run % 3 == 0 ? "" : wanted.bytes()); // the first addition makes one
        for (int step = 0; step < 60; ++step) {
            SCOPED_TRACE("run " + std::to_string(run) + " step " + std::to_string(step));
            const int type = random.type(); // what it has no use for must not matter
            const char *const mechanism = type < 4 && step % 2 == 0 ? "" : random.mechanism();
            const char *const identity = type < 4 && step % 3 == 0 ? nullptr : random.identity(19);
            const sec_acle_t acle = entry(type, mechanism, identity, random.below(~0u));
            const edit_function edit = edits[random.below(held.acl.data == nullptr ? 2 : 3)];
            ASSERT_EQ(after(edit(&acle, &held.acl)), wanted.edit(edit, acle));
            ASSERT_EQ(held.bytes(), wanted.bytes());
            for (const int of : {0, 1, 2, 4, 8, 16})
                for (const char *by : {static_cast<const char *>(nullptr), "Unix", "HBA2", "none"}) {
                    sec_aclelist_t list = {};
                    ASSERT_EQ(of == 0 ? sec_list_acl(&held.acl, &list)
                                      : sec_list_acl_by_type(&held.acl, of & 31, by, &list),
                              0);
                    ASSERT_EQ(taken(list), wanted.entries(of, by));
                }
        }
    }
}

TEST(edit, reports_what_it_refuses_and_leaves_the_buffer_alone) {
    const sec_acle_t user = entry(4, "unix", "al", 1);
    const std::tuple<std::string, sec_acle_t, failure> rows[] = {
        {rich, entry(0x84, "unix", "a", 1), error_of(43, 103, {"132"})},
        {rich, entry(4, "", "a", 1), error_of(43, 104, {"4"})},
        {"no ACL", entry(16, "", nullptr, 1), error_of(43, 104, {"16"})}, // the entry before the buffer
        {"\x85\1\1\0\0"s, user, error_of(42, 102)},
        {"\x84\2\1"s, user, error_of(42, 100)},
        {"\x85\2\1"s, user, error_of(42, 101)},
        {"\x85\1\2\0"s, user, located(42, 97)},
        {one(packed_subacl(1, "", 2, packed_entry(1, "") + packed_entry(2, ""))), entry(1, "", nullptr, 1),
         error_of(42, 98)},
    };
    for (const auto edit : {sec_add_acle_to_acl, sec_add_acle_to_acl2, sec_del_acle_from_acl}) {
        for (const auto &[bytes, acle, error] : rows) {
            buffer held(bytes);
            EXPECT_EQ(after(edit(&acle, &held.acl)), error);
            EXPECT_EQ(held.bytes(), bytes) << error;
        }
        const char *name = edit == sec_del_acle_from_acl ? "sec_del_acle_from_acl" : "sec_add_acle_to_acl";
        EXPECT_EQ(after(edit(nullptr, nullptr)), bad_parameter(name, 1, "0"));
        EXPECT_EQ(after(edit(&user, nullptr)), bad_parameter(name, 2, "0"));
    }
}

TEST(edit, holds_at_most_65534_bytes_of_identity_and_65535_subacls) {
    const std::string longest(65534, 'i'), too_long = longest + "i", a = named(1, "a"), b = named(2, "b");
    const sec_acle_t refused = entry(16, "", too_long.c_str(), 7), fitting = entry(16, "", longest.c_str(), 7);
    // A buffer that the call makes, which goes with its failure; one changed in place, one rebuilt.
    for (const std::string &entries : {""s, a + b, b + a}) {
        const std::string bytes = entries.empty() ? "" : one(packed_subacl(16, "", 2, entries));
        buffer held(bytes);
        EXPECT_EQ(after(sec_add_acle_to_acl(&refused, &held.acl)), error_of(43, 104, {"16"}));
        EXPECT_EQ(held.bytes(), bytes);
        EXPECT_EQ(sec_del_acle_from_acl(&refused, &held.acl), bytes.empty() ? 42 : 18);
        EXPECT_EQ(after(sec_add_acle_to_acl(&fitting, &held.acl)), no_error);
        EXPECT_TRUE(held.bytes().ends_with((bytes.empty() ? "" : a + b) + named(7, longest)));
    }
    std::string subacls;
    for (int number = 10000; number < 75535; ++number) subacls += of_mechanism(8, std::to_string(number), 1, a);
    const std::string full = packed_acl(65535, subacls), added = of_mechanism(4, "more", 1, a);
    buffer held(full);
    const sec_acle_t more = entry(4, "more", "a", 1), last = entry(8, "75534", "A", 1);
    EXPECT_EQ(after(sec_add_acle_to_acl(&more, &held.acl)),
              error_of(6, 89, {"sec_add_acle_to_acl", std::to_string(full.size() + added.size())}));
    EXPECT_TRUE(held.bytes() == full);
    EXPECT_EQ(sec_del_acle_from_acl(&last, &held.acl) + sec_add_acle_to_acl(&more, &held.acl), 0);
    EXPECT_TRUE(held.bytes() == full.substr(0, full.size() - 25) + added);
}

// Nothing compares the last sub-ACL's length with where its entries end. An edit replaces the bytes that the
// length names by all of the entries that it counts.
TEST(edit, replaces_as_many_bytes_as_the_stored_length_says) {
    const std::string a = named(1, "a"), c = named(3, "c"), first = packed_subacl(1, "", 0, "");
    const std::string stored = of_mechanism(4, "unix", 2, a + c) + "behind";
    for (std::size_t length = 0; length <= stored.size() + 2; ++length)
        for (const auto edit : {sec_add_acle_to_acl, sec_del_acle_from_acl}) {
            const bool adds = edit == sec_add_acle_to_acl, is_inside = length <= stored.size();
            const std::string last = number(length, 4) + stored.substr(4);
            const std::string changed =
                adds ? of_mechanism(4, "unix", 3, a + named(2, "b") + c) : of_mechanism(4, "unix", 1, a);
            buffer held(packed_acl(2, first + last));
            const sec_acle_t acle = entry(4, "unix", adds ? "b" : "C", 2);
            EXPECT_EQ(after(edit(&acle, &held.acl)), is_inside ? no_error : located(42, 97)) << length;
            EXPECT_EQ(held.bytes(), packed_acl(2, first + (is_inside ? changed + last.substr(length) : last)));
        }
}

// A handler is shown identities where they stand, and may keep one to add it: the buffer moves while that is done.
TEST(edit, adds_an_identity_that_lies_in_the_buffer) {
    const std::string stored = named(1, "of a long name that makes the buffer move");
    buffer held(packed_acl(1, of_mechanism(4, "unix", 1, stored)));
    sec_acle_t acle = entry(4, "unix", "", 2);
    acle.identity = static_cast<char *>(held.acl.data) + held.acl.length - 5;
    EXPECT_EQ(after(sec_add_acle_to_acl(&acle, &held.acl)), no_error);
    EXPECT_EQ(held.bytes(), packed_acl(1, of_mechanism(4, "unix", 2, named(2, "move") + stored)));
}

} // namespace
