// Tests of adding and deleting entries, against a plain model of what an edit does: expand the sub-ACL of the
// entry's key, change it, compile it again.
#include "service_support.h"

#include "qzacl_acl/validate.h"

#include <array>

namespace {

using namespace support;

struct item {
    std::string identity;
    std::uint32_t mask;
};

struct model_subacl {
    int type;
    std::string mechanism;
    std::vector<item> items; // as they are stored: in any order, with repetitions
};

bool has_mechanism(int type) { return type == 4 || type == 8; }
bool has_identity(int type) { return type >= 4; }

class model {
public:
    std::vector<model_subacl> subacls;

    std::string bytes() const {
        std::string all;
        for (const model_subacl &subacl : subacls) {
            std::string entries;
            for (const auto &[identity, mask] : subacl.items)
                entries += packed_entry(mask, has_identity(subacl.type) ? text_field(identity) : "");
            all += packed_subacl(subacl.type, has_mechanism(subacl.type) ? text_field(subacl.mechanism) : "",
                                 subacl.items.size(), entries);
        }
        return packed_acl(subacls.size(), all);
    }

    std::vector<listed> entries(int type = 0, const char *mechanism = nullptr) const {
        std::vector<listed> all;
        for (const model_subacl &subacl : subacls) {
            const bool is_wanted =
                type == 0 || (subacl.type == type && (mechanism == nullptr || !has_mechanism(type) ||
                                                      same(subacl.mechanism, mechanism)));
            if (!is_wanted)
                continue;
            for (const auto &[identity, mask] : expanded(subacl))
                all.push_back({subacl.type, has_mechanism(subacl.type) ? subacl.mechanism : "",
                               has_identity(subacl.type) ? identity : "<none>", mask});
            if (type != 0 && (mechanism != nullptr || !has_mechanism(type)))
                break; // the first of the key
        }
        return all;
    }

    failure add(const sec_acle_t &acle, bool refuses_duplicates) {
        const std::string identity = has_identity(acle.type) ? acle.identity : "";
        auto subacl = find(acle);
        const bool is_new = subacl == subacls.end();
        model_subacl made{acle.type, acle.mechanism, {}};
        if (!is_new) {
            if (!subacl->items.empty())
                made.mechanism = subacl->mechanism;
            made.items = expanded(*subacl);
        }
        const auto held = find(made, identity);
        if (held == made.items.end()) {
            made.items.push_back({identity, acle.perm_mask});
        } else if (refuses_duplicates) {
            switch (acle.type) {
            case 1:
            case 2:
                return error_of(43, 160, {acle.type == 1 ? "n" : "o"});
            case 16:
                return error_of(43, 161, {"g", identity});
            default:
                return error_of(43, 144, {acle.type == 4 ? "u" : "e", acle.mechanism, identity});
            }
        } else {
            held->mask = acle.perm_mask;
        }
        made.items = expanded(made);
        if (is_new)
            subacls.push_back(made);
        else
            *subacl = made;
        return no_error;
    }

    failure remove(const sec_acle_t &acle) {
        const auto missing = [&](int code) {
            return error_of(code, 105,
                            {std::to_string(acle.type), has_mechanism(acle.type) ? acle.mechanism : "",
                             has_identity(acle.type) ? acle.identity : ""});
        };
        const auto subacl = find(acle);
        if (subacl == subacls.end())
            return missing(18);
        if (subacl->items.empty())
            return missing(43);
        model_subacl made{subacl->type, subacl->mechanism, expanded(*subacl)};
        const auto held = find(made, has_identity(acle.type) ? acle.identity : "");
        if (held == made.items.end())
            return missing(18);
        made.items.erase(held);
        if (made.items.empty())
            subacls.erase(subacl);
        else
            *subacl = made;
        return no_error;
    }

private:
    std::vector<model_subacl>::iterator find(const sec_acle_t &acle) {
        return std::find_if(subacls.begin(), subacls.end(), [&](const model_subacl &subacl) {
            return subacl.type == acle.type &&
                   (!has_mechanism(acle.type) || same(subacl.mechanism, acle.mechanism));
        });
    }
    static std::vector<item>::iterator find(model_subacl &subacl, const std::string &identity) {
        return std::find_if(subacl.items.begin(), subacl.items.end(),
                            [&](const item &held) { return same(held.identity, identity); });
    }
    // Equal identities become one, with the first spelling and the last mask; all but user-expanded ones are
    // put in order.
    static std::vector<item> expanded(const model_subacl &subacl) {
        model_subacl made{subacl.type, {}, {}};
        for (const item &stored : subacl.items) {
            const auto held = find(made, stored.identity);
            if (held == made.items.end())
                made.items.push_back(stored);
            else
                held->mask = stored.mask;
        }
        if (subacl.type != 8)
            std::sort(made.items.begin(), made.items.end(),
                      [](const item &a, const item &b) { return precedes(a.identity, b.identity); });
        return made.items;
    }
};

using edit_function = int (*)(const sec_acle_t *, sec_acl_buffer_t *);

// Few keys and identities, each in several spellings. The bytes between the cases and beyond ASCII do not
// fold.
struct random_edits {
    std::mt19937 generator;
    arguments mechanisms = words("unix UNIX uNix hba2 HBA2 a_[`{ A_[`{ sixteen-bytes-xx");
    arguments identities = words("a A b B ab aB Ab@x ab@X a_b a[b \xc3 \xe3 longer-name-1 LONGER-name-1 "
                                 "sixteen-bytes-16 sixteen-BYTES-16 "
                                 "seventeen-byte-17 seventeen-byte-1_ seventeen-byte-1Z");

    explicit random_edits(unsigned start) : generator(start) { identities.emplace_back(); }

    unsigned below(std::size_t limit) { return static_cast<unsigned>(generator() % limit); }
    int type() { return std::array{1, 2, 4, 4, 4, 8, 8, 16, 16}[below(9)]; }
    const char *mechanism() { return mechanisms[below(mechanisms.size())].c_str(); }
    const char *identity() { return identities[below(identities.size())].c_str(); }
    std::uint32_t mask() { return static_cast<std::uint32_t>(generator()); }

    // Sub-ACLs as no edit leaves them: unsorted, repeated, empty, the same key twice.
    model untidy() {
        model made;
        for (unsigned left = below(6); left != 0; --left) {
            model_subacl subacl{type(), mechanism(), {}};
            for (unsigned entries = below(subacl.type < 4 ? 2 : 8); entries != 0; --entries)
                subacl.items.push_back({subacl.type < 4 ? "" : identity(), mask()});
            made.subacls.push_back(subacl);
        }
        return made;
    }
};

void expect_same(const buffer &held, const model &wanted) {
    ASSERT_EQ(held.bytes(), wanted.bytes());
    EXPECT_EQ(sec__check_acl_buffer(&held.acl), SEC_S_OK) << recorded_error();
    EXPECT_EQ(all_entries(held.acl), wanted.entries());
    for (const int type : {1, 2, 4, 8, 16}) {
        for (const char *mechanism : {static_cast<const char *>(nullptr), "Unix", "HBA2", "none"}) {
            sec_aclelist_t list = {};
            EXPECT_EQ(sec_list_acl_by_type(&held.acl, static_cast<std::uint8_t>(type), mechanism, &list),
                      SEC_S_OK);
            EXPECT_EQ(taken(list), wanted.entries(type, mechanism));
        }
    }
    EXPECT_EQ(recorded_error(), no_error);
}

TEST(edit, does_what_expanding_changing_and_compiling_does) {
    for (unsigned run = 0; run < 240; ++run) {
        random_edits random(run);
        model wanted;
        buffer held;
        if (run % 3 != 0) { // else the buffer is made by the first addition
            wanted = run % 3 == 1 ? random.untidy() : model();
            held.assign(wanted.bytes());
        }
        for (int step = 0; step < 60; ++step) {
            const int type = random.type();
            // What a type has no use for must not matter.
            const sec_acle_t acle =
                entry(type, type < 4 && step % 2 == 0 ? "" : random.mechanism(),
                      type < 4 && step % 3 == 0 ? nullptr : random.identity(), random.mask());
            const unsigned kind = random.below(5);
            SCOPED_TRACE("run " + std::to_string(run) + " step " + std::to_string(step) + " kind " +
                         std::to_string(kind));
            failure expected = error_of(42, 93);
            if (kind < 3 || held.acl.data != nullptr)
                expected = kind < 3 ? wanted.add(acle, kind == 0) : wanted.remove(acle);
            const edit_function edit = kind >= 3   ? sec_del_acle_from_acl
                                       : kind == 0 ? sec_add_acle_to_acl2
                                                   : sec_add_acle_to_acl;
            ASSERT_EQ(after(edit(&acle, &held.acl)), expected);
            if (held.acl.data != nullptr) {
                ASSERT_NO_FATAL_FAILURE(expect_same(held, wanted));
            }
        }
    }
}

TEST(edit, reports_what_it_refuses_and_leaves_the_buffer_alone) {
    const std::string two_anyothers = one(packed_subacl(2, "", 2, packed_entry(1, "") + packed_entry(2, "")));
    const sec_acle_t user = entry(4, "unix", "al", 1), other = entry(2, "", nullptr, 1);
    const struct {
        std::string bytes;
        sec_acle_t acle;
        failure error;
    } rows[] = {
        {rich, entry(0, "unix", "a", 1), error_of(43, 103, {"0"})},
        {rich, entry(3, "unix", "a", 1), error_of(43, 103, {"3"})},
        {rich, entry(0x84, "unix", "a", 1), error_of(43, 103, {"132"})},
        {rich, entry(4, "", "a", 1), error_of(43, 104, {"4"})},
        {rich, entry(8, "", "a", 1), error_of(43, 104, {"8"})},
        {rich, entry(4, "unix", nullptr, 1), error_of(43, 104, {"4"})},
        {rich, entry(8, "unix", nullptr, 1), error_of(43, 104, {"8"})},
        {rich, entry(16, "unix", nullptr, 1), error_of(43, 104, {"16"})},
        {"no ACL", entry(16, "", nullptr, 1), error_of(43, 104, {"16"})}, // the entry before the buffer
        {with(rich, 0, 0x84), user, error_of(42, 100)},
        {with(rich, 1, 2), user, error_of(42, 101)},
        {with(rich, 2, 1), user, error_of(42, 102)},
        {"\x84\2\1"s, user, error_of(42, 100)},
        {"\x85\2\1"s, user, error_of(42, 101)},
        {"\x85\1\2\0"s, user, located(42, 97)},
        {two_anyothers, other, error_of(42, 98)},
    };
    for (const auto &[bytes, acle, error] : rows) {
        for (const auto edit : {sec_add_acle_to_acl, sec_add_acle_to_acl2, sec_del_acle_from_acl}) {
            buffer held(bytes);
            const void *data = held.acl.data;
            EXPECT_EQ(after(edit(&acle, &held.acl)), error);
            EXPECT_EQ(held.bytes(), bytes) << error;
            EXPECT_EQ(held.acl.data, data) << error;
        }
    }
    const char *const add_name = "sec_add_acle_to_acl", *const delete_name = "sec_del_acle_from_acl";
    EXPECT_EQ(after(sec_add_acle_to_acl(nullptr, nullptr)), bad_parameter(add_name, 1, "0"));
    EXPECT_EQ(after(sec_add_acle_to_acl2(&user, nullptr)), bad_parameter(add_name, 2, "0"));
    EXPECT_EQ(after(sec_del_acle_from_acl(nullptr, nullptr)), bad_parameter(delete_name, 1, "0"));
    EXPECT_EQ(after(sec_del_acle_from_acl(&user, nullptr)), bad_parameter(delete_name, 2, "0"));

    // A buffer that the call itself made goes with its failure.
    const std::string too_long(65535, 'i');
    const sec_acle_t refused = entry(4, "unix", too_long.c_str(), 1);
    sec_acl_buffer_t acl = {7, nullptr};
    EXPECT_EQ(after(sec_add_acle_to_acl(&refused, &acl)), error_of(43, 104, {"4"}));
    EXPECT_EQ(acl.data, nullptr);
    EXPECT_EQ(acl.length, 0);
}

// What compiling would never write is not changed in place: the whole sub-ACL is put right.
TEST(edit, tidies_what_it_rebuilds) {
    const std::string a = named(1, "a"), c = named(9, "c-and-more-bytes");
    for (const std::string &stored : {
             of_mechanism(4, "unix", 2, with(a, 0, 7) + c),                 // a version nobody looks at
             of_mechanism(4, "unix", 2, packed_entry(1, "a\0junk\0"s) + c), // bytes behind the string
             of_mechanism(4, "unix", 3, named(8, "a") + named(1, "A") + c), // equal in sorted order
             of_mechanism(4, "unix", 2, c + a),                             // out of order
             packed_subacl(4, "unix\0\0\0"s, 2, a + c),                     // bytes behind the mechanism
         }) {
        buffer held(packed_acl(2, stored + packed_subacl(1, "", 0, "")));
        const sec_acle_t b = entry(4, "unix", "b", 5);
        EXPECT_EQ(after(sec_add_acle_to_acl2(&b, &held.acl)), no_error);
        EXPECT_EQ(held.bytes(), packed_acl(2, of_mechanism(4, "unix", 3, a + named(5, "b") + c) +
                                                  packed_subacl(1, "", 0, "")));
    }
}

TEST(edit, holds_identities_of_at_most_65534_bytes) {
    const std::string longest(65534, 'i'), too_long = longest + "i", a = named(1, "a"), b = named(2, "b");
    for (const int type : {4, 8, 16}) {
        for (const std::string &entries : {a + b, b + a}) { // the one changed in place, the other rebuilt
            const std::string mechanism = has_mechanism(type) ? text_field("unix") : "";
            buffer held(one(packed_subacl(type, mechanism, 2, entries)));
            const sec_acle_t refused = entry(type, "unix", too_long.c_str(), 7);
            const sec_acle_t fitting = entry(type, "unix", longest.c_str(), 7);
            EXPECT_EQ(after(sec_add_acle_to_acl(&refused, &held.acl)),
                      error_of(43, 104, {std::to_string(type)}));
            EXPECT_EQ(held.bytes(), one(packed_subacl(type, mechanism, 2, entries)));
            EXPECT_EQ(after(sec_add_acle_to_acl(&fitting, &held.acl)), no_error);
            EXPECT_EQ(held.bytes(), one(packed_subacl(type, mechanism, 3,
                                                      (type == 8 ? entries : a + b) + named(7, longest))));
            EXPECT_EQ(sec_del_acle_from_acl(&refused, &held.acl), 18);
            EXPECT_EQ(sec_del_acle_from_acl(&fitting, &held.acl), 0);
        }
    }
}

TEST(edit, holds_at_most_65535_subacls) {
    std::string subacls;
    for (int number = 0; number < 65535; ++number)
        subacls += of_mechanism(8, "m"s.append(std::to_string(number)), 1, named(1, "x"));
    const std::string full = packed_acl(65535, subacls), added = of_mechanism(4, "more", 1, named(1, "x"));
    buffer held(full);
    const sec_acle_t more = entry(4, "more", "x", 1), last = entry(8, "M65534", "X", 1);
    EXPECT_EQ(after(sec_add_acle_to_acl(&more, &held.acl)),
              error_of(6, 89, {"sec_add_acle_to_acl", std::to_string(full.size() + added.size())}));
    EXPECT_TRUE(held.bytes() == full);
    EXPECT_EQ(sec_del_acle_from_acl(&last, &held.acl), 0);
    EXPECT_EQ(sec_add_acle_to_acl(&more, &held.acl), 0);
    EXPECT_TRUE(held.bytes() == full.substr(0, full.size() - 26) + added);
}

// Nothing compares the last sub-ACL's length with where its entries end. An edit replaces the bytes that the
// length names by all of the entries that it counts.
TEST(edit, replaces_as_many_bytes_as_the_stored_length_says) {
    const std::string a = named(1, "a"), c = named(3, "c"), behind = "behind";
    const std::string first = packed_subacl(2, "", 1, packed_entry(5, ""));
    const std::string stored = of_mechanism(4, "unix", 2, a + c);
    const struct {
        edit_function edit;
        sec_acle_t acle;
        std::string changed;
    } rows[] = {
        {sec_add_acle_to_acl, entry(4, "unix", "b", 2), of_mechanism(4, "unix", 3, a + named(2, "b") + c)},
        {sec_add_acle_to_acl, entry(4, "unix", "A", 9), of_mechanism(4, "unix", 2, named(9, "a") + c)},
        {sec_del_acle_from_acl, entry(4, "unix", "C", 0), of_mechanism(4, "unix", 1, a)},
    };
    for (std::size_t length = 0; length <= stored.size() + behind.size() + 2; ++length) {
        const std::string last = number(length, 4) + stored.substr(4) + behind;
        const bool is_inside = length <= last.size();
        for (const auto &[edit, acle, changed] : rows) {
            buffer held(packed_acl(2, first + last));
            EXPECT_EQ(after(edit(&acle, &held.acl)), is_inside ? no_error : located(42, 97)) << length;
            EXPECT_EQ(held.bytes(), packed_acl(2, first + (is_inside ? changed + last.substr(length) : last)))
                << length;
        }
    }
}

} // namespace
