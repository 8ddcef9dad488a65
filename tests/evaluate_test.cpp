// Tests of access decisions and identity handlers. What an evaluation answers is compared with plain models
// that walk the entries one by one, on sorted buffers and on such as only pass the check.
#include "service_support.h"

#include "qzacl_acl/id_handlers.h"
#include "qzacl_init.h"

#include <atomic>
#include <thread>

namespace {

using namespace support;

constexpr std::uint32_t untouched = 0xabad1dea;

struct decision {
    int result;
    std::uint32_t mask;
    failure error;
    bool operator==(const decision &) const = default;
};

std::ostream &operator<<(std::ostream &out, const decision &shown) {
    return out << shown.result << " mask " << shown.mask << ' ' << shown.error;
}

decision granted(std::uint32_t mask) { return {0, mask, {}}; }
decision denied(int type, const std::string &mechanism, const std::string &identity) {
    return {43, 0, error_of(43, 134, {std::to_string(type), mechanism, identity})};
}
decision refused(const failure &error, std::uint32_t mask = untouched) { return {error.code, mask, error}; }

// The bytes lie right before memory that nothing may touch.
decision single(const std::string &bytes, int type, const char *mechanism, const char *identity,
                const char *subacl_mechanism = nullptr) {
    const guarded memory(bytes);
    const sec_acl_buffer_t acl = {static_cast<std::int32_t>(bytes.size()), memory.data()};
    decision made{0, untouched, {}};
    made.result = sec__single_acle_perm(&acl, static_cast<std::uint8_t>(type), mechanism, subacl_mechanism,
                                        identity, &made.mask);
    made.error = after(made.result);
    return made;
}

decision groups(const std::string &bytes, const std::vector<const char *> &names) {
    const guarded memory(bytes);
    const sec_acl_buffer_t acl = {static_cast<std::int32_t>(bytes.size()), memory.data()};
    std::vector<sec_group_ref_t> refs;
    for (const char *name : names)
        refs.push_back({0, name});
    decision made{0, untouched, {}};
    made.result =
        sec__group_acles_perm(&acl, static_cast<std::int32_t>(refs.size()), refs.data(), &made.mask);
    made.error = after(made.result);
    return made;
}

// Handlers note the entries that they are asked about, and what they record is nobody else's business.
thread_local arguments asked;
int noted(int order, const char *held) {
    asked.emplace_back(held);
    if (order != 0)
        cu_set_error_1(99, 0, "none.cat", 1, 1, "no match");
    return order;
}
int same_bytes(const char *requested, const char *held) { return noted(std::strcmp(requested, held), held); }
int same_end(const char *requested, const char *held) {
    return noted(std::string_view(requested).ends_with(held) ? 0 : -1, held);
}
int never(const char *, const char *) { return 1; }

class evaluate : public testing::Test {
protected:
    static void SetUpTestSuite() {
        EXPECT_EQ(sec__register_id_handler(SEC_ID_HANDLER_EXPANDED, "kRb5", same_end), 0);
        EXPECT_EQ(sec__register_id_handler(SEC_ID_HANDLER_USER, "exact", same_bytes), 0);
    }
};

TEST_F(evaluate, decides_by_exactly_one_entry) {
    const std::string user =
        of_mechanism(4, "unix", 3, named(1, "Alice") + named(2, "bob") + named(4, "dave"));
    const std::string exact = of_mechanism(4, "Exact", 2, named(8, "A") + named(16, "a"));
    const std::string expanded =
        of_mechanism(8, "krb5", 3, named(32, ".x") + named(64, "x") + named(128, ""));
    const std::string no_handler = of_mechanism(8, "unix", 1, named(1, "alice"));
    const std::string acl =
        packed_acl(6, user + exact + expanded + no_handler + packed_subacl(2, "", 1, packed_entry(256, "")) +
                          packed_subacl(1, "", 1, packed_entry(512, "")));
    const std::string few = one(user);
    const failure two_singles = located(42, 109);
    const struct {
        std::string bytes;
        int type;
        const char *mechanism, *subacl_mechanism, *identity;
        decision answer;
    } rows[] = {
        {acl, 1, nullptr, nullptr, nullptr, granted(512)},
        {acl, 2, "unused", "unused", "unused", granted(256)},
        {acl, 0x82, nullptr, nullptr, nullptr, granted(256)},
        {few, 1, nullptr, nullptr, "unused", denied(1, "", "")},
        {few, 0xe2, "shown", "unused", "unused", denied(226, "shown", "")},
        {one(packed_subacl(1, "", 0, "")), 1, "m", nullptr, "i", denied(1, "m", "")},
        {one(packed_subacl(2, "", 2, named(1, "") + named(2, ""))), 2, "m", nullptr, "i",
         refused(two_singles, 0)},
        {one(packed_subacl(1, "", 2, "")), 1, "m", nullptr, "i", refused(two_singles, 0)},
        {one(packed_subacl(1, "", 1, "")), 1, "m", nullptr, "i", refused(located(42, 97), 0)},

        {acl, 4, "UNIX", nullptr, "aLICE", granted(1)},
        {acl, 4, "unix", nullptr, "dave", granted(4)},
        {acl, 4, "unix", nullptr, "carol", denied(4, "unix", "carol")},
        {acl, 4, "unix", nullptr, "alic", denied(4, "unix", "alic")},
        {acl, 4, "unix", nullptr, "alice2", denied(4, "unix", "alice2")},
        {acl, 4, "none", nullptr, "alice", denied(4, "none", "")},
        {acl, 4, "none", "unix", "BOB", granted(2)},
        {acl, 4, "unix", "none", "bob", denied(4, "unix", "")},
        {acl, 0x84, "unix", nullptr, "ALICE", granted(1)}, // no handler: as without the flag
        {acl, 0x84, "unix", nullptr, "x", denied(132, "unix", "x")},
        {acl, 4, "exact", nullptr, "a", granted(8)},     // without the flag letters fold
        {acl, 0x84, "EXACT", nullptr, "a", granted(16)}, // the handler's mechanism in any case
        {acl, 0x84, "exact", "unix", "alice", denied(132, "exact", "alice")}, // the requester's handler
        {acl, 0x84, "krb5", "exact", "a", granted(8)}, // a handler of the other kind does not count

        {acl, 8, "krb5", nullptr, "h.x", granted(32)}, // the first that accepts
        {acl, 8, "KRB5", nullptr, "hx", granted(64)},
        {acl, 8, "unix", nullptr, "alice", denied(8, "unix", "alice")}, // entries, but no handler
        {acl, 8, "krb5", "unix", "at-alice", granted(1)},
        {acl, 8, "krb5", "unix", "bob", denied(8, "krb5", "bob")},
        {acl, 8, "exact", "krb5", "h.x", denied(8, "exact", "h.x")}, // a handler of the other kind only
        {few, 8, "krb5", nullptr, "x", denied(8, "krb5", "")},

        {acl, 3, "unix", nullptr, "a", refused(error_of(4, 115, {"3"}))},
        {acl, 16, "unix", nullptr, "a", refused(error_of(4, 115, {"16"}))},
        {acl, 0x8c, "unix", nullptr, "a", refused(error_of(4, 115, {"140"}))},
        {acl, 4, nullptr, "unix", "a", refused(error_of(4, 116))},
        {acl, 8, "", "unix", nullptr, refused(error_of(4, 116))},
        {acl, 4, "unix", nullptr, nullptr, refused(error_of(4, 117))},
        {acl, 0x88, "unix", nullptr, "", refused(error_of(4, 117))},
    };
    for (const auto &[bytes, type, mechanism, subacl_mechanism, identity, answer] : rows)
        EXPECT_EQ(single(bytes, type, mechanism, identity, subacl_mechanism), answer)
            << "type " << type << " of " << (identity == nullptr ? "null" : identity);
}

TEST_F(evaluate, refuses_bytes_that_are_no_acl_of_this_host) {
    const struct {
        std::string bytes;
        failure error;
    } rows[] = {
        {"", error_of(42, 96)},
        {"\x85", error_of(42, 96)},
        {with(rich, 0, 5), error_of(42, 96)},
        {with(rich, 1, 2), error_of(42, 96)},
        {"\x85\1\2\0"s, located(42, 97)},
        {with(rich, 2, 1), error_of(42, 102)},
        {foreign(rich), error_of(42, 102)},
    };
    for (const auto &[bytes, error] : rows) {
        EXPECT_EQ(single(bytes, 99, nullptr, nullptr), refused(error)); // before the type
        EXPECT_EQ(groups(bytes, {}), refused(error));
    }

    std::uint32_t mask = untouched;
    const buffer acl(rich);
    const sec_group_ref_t group = {1, "staff"};
    const sec_acl_buffer_t none = {5, nullptr}, negative = {-1, acl.acl.data};
    for (const sec_acl_buffer_t *bytes : {&none, &negative})
        EXPECT_EQ(after(sec__single_acle_perm(bytes, 2, nullptr, nullptr, nullptr, &mask)), error_of(42, 96));
    const char *const single_name = "sec__single_acle_perm", *const group_name = "sec__group_acles_perm";
    EXPECT_EQ(after(sec__single_acle_perm(nullptr, 99, nullptr, nullptr, nullptr, nullptr)),
              bad_parameter(single_name, 1, "0"));
    EXPECT_EQ(after(sec__single_acle_perm(&none, 99, nullptr, nullptr, nullptr, nullptr)),
              bad_parameter(single_name, 5, "0"));
    EXPECT_EQ(after(sec__group_acles_perm(nullptr, 1, nullptr, nullptr)), bad_parameter(group_name, 1, "0"));
    EXPECT_EQ(after(sec__group_acles_perm(&none, -1, nullptr, nullptr)), bad_parameter(group_name, 3, "0"));
    EXPECT_EQ(after(sec__group_acles_perm(&none, 1, &group, nullptr)), bad_parameter(group_name, 4, "0"));
    EXPECT_EQ(mask, untouched);
    EXPECT_EQ(after(sec__group_acles_perm(&acl.acl, -1, &group, &mask)), error_of(43, 134, {"16", "", ""}));
    EXPECT_EQ(mask, 0u);
    EXPECT_EQ(groups(rich, {}), granted(0));
}

TEST_F(evaluate, asks_a_handler_as_long_as_an_entry_may_match) {
    const std::string entries = named(1, "b") + named(2, "d") + named(4, "a") + named(8, "e");
    const struct {
        int type;
        const char *mechanism, *identity;
        arguments asked;
        decision answer;
    } rows[] = {
        {0x84, "exact", "d", words("b d"), granted(2)},
        {0x84, "exact", "c", words("b d"), denied(132, "exact", "c")},
        {0x84, "exact", "a", words("b"), denied(132, "exact", "a")},
        {0x84, "exact", "z", words("b d a e"), denied(132, "exact", "z")},
        {8, "krb5", "z", words("b d a e"), denied(8, "krb5", "z")}, // the sign does not matter
    };
    for (const auto &[type, mechanism, identity, expected, answer] : rows) {
        asked.clear();
        EXPECT_EQ(single(one(of_mechanism(type & 0x1f, mechanism, 4, entries)), type, mechanism, identity),
                  answer);
        EXPECT_EQ(asked, expected);
    }
}

// Entries and names that differ late, early, by case, by bytes next to the letters, and by a prefix; many
// around eight and sixteen bytes, since that many are compared at once.
const arguments names =
    words("a B ab aB a_b a[b a` sixsix seven77 SEVEN77 eight888 EIGHT888 eight889 nine99999 nine9999X "
          "nine9999x \xc3\x84 \xe3\x84 \x7f @ [ fifteen-bytes15 sixteen-bytes-16 SIXTEEN-bytes-16 "
          "sixteen-bytes-1_ seventeen-byte-17 seventeen-byte-1 host.example.of.more host.example.of.mord");

struct held {
    std::string name;
    std::uint32_t mask;
};

std::vector<held> random_entries(std::mt19937 &random, bool is_sorted) {
    std::vector<held> entries(random() % 12);
    for (held &entry : entries)
        entry = {names[random() % names.size()], static_cast<std::uint32_t>(random())};
    if (is_sorted)
        std::stable_sort(entries.begin(), entries.end(),
                         [](const held &a, const held &b) { return precedes(a.name, b.name); });
    return entries;
}

// The mask of the entry that a walk in stored order ends at with a match.
const held *found_by_walk(const std::vector<held> &entries, const std::string &name) {
    for (const held &entry : entries) {
        if (same(name, entry.name))
            return &entry;
        if (precedes(name, entry.name))
            break;
    }
    return nullptr;
}

TEST_F(evaluate, finds_what_a_walk_in_stored_order_finds) {
    std::mt19937 random(4);
    for (int run = 0; run < 1000; ++run) {
        const std::vector<held> entries = random_entries(random, run % 2 == 0);
        std::string packed;
        for (const auto &[name, mask] : entries)
            packed += named(mask, name);
        const std::string users = one(of_mechanism(4, "unix", entries.size(), packed));
        for (const std::string &name : names) {
            const held *match = found_by_walk(entries, name);
            const decision answer = match == nullptr ? denied(4, "unix", name) : granted(match->mask);
            ASSERT_EQ(single(users, 4, "unix", name.c_str()), answer) << "run " << run << ' ' << name;
        }
        // Each group walks on its own, and all that are found count.
        std::vector<const char *> asked_for(random() % (run % 10 == 0 ? 200 : 8) + 1);
        decision answer = denied(16, "", "");
        for (const char *&name : asked_for) {
            name = names[random() % names.size()].c_str();
            if (const held *match = found_by_walk(entries, name); match != nullptr)
                answer = granted((answer.result == 0 ? answer.mask : 0) | match->mask);
        }
        ASSERT_EQ(groups(one(packed_subacl(16, "", entries.size(), packed)), asked_for), answer)
            << "run " << run;
    }
    EXPECT_EQ(groups(rich, {"nobody", nullptr, "STAFF", nullptr, "admins"}), granted(0x13));
    EXPECT_EQ(groups(rich, std::vector<const char *>(65, nullptr)), denied(16, "", ""));
    EXPECT_EQ(groups(example, {"staff"}), denied(16, "", ""));
}

// A walk stops at what it cannot read, but only when it gets there.
TEST_F(evaluate, fails_where_an_entry_does_not_end) {
    const std::string a = named(1, "a");
    const std::string broken[] = {
        "", "\1\0\0\0"s, packed_entry(2, "m"), packed_entry(2, ""), "\1\0\0\0\0\x10\0m\0"s,
    };
    for (const std::string &end : broken) {
        const std::string user = one(of_mechanism(4, "unix", 2, a + end));
        EXPECT_EQ(single(user, 4, "unix", "a"), granted(1));
        EXPECT_EQ(single(user, 4, "unix", "0"), denied(4, "unix", "0"));
        EXPECT_EQ(single(user, 4, "unix", "m"), refused(located(42, 97), 0));
        EXPECT_EQ(single(user, 0x84, "exact", "m", "unix"), refused(located(42, 97), 0));
        const std::string group = one(packed_subacl(16, "", 2, a + end));
        EXPECT_EQ(groups(group, {"a", "0"}), granted(1));
        EXPECT_EQ(groups(group, {"m", "a"}), refused(located(42, 97), 0));
    }
}

TEST_F(evaluate, registrations_stay_in_the_order_in_which_they_came) {
    const std::string sixteen = "sixteen-bytes-xx";
    const struct {
        std::uint32_t kind;
        const char *mechanism;
        sec_id_compare_fn handler;
        failure error;
    } rows[] = {
        {3, nullptr, nullptr, bad_parameter("acl__register_id_handler", 1, "3")},
        {0x80000001, "m", never, bad_parameter("acl__register_id_handler", 1, "80000001")},
        {1, nullptr, nullptr, bad_parameter("acl__register_id_handler", 2, "0")},
        {2, "", nullptr, bad_parameter("acl__register_id_handler", 3, "0")},
        {2, "", never, error_of(4, 119)},
        {1, "seventeen-bytes-x", never, error_of(4, 119)},
    };
    const std::int32_t before = acl__state.handler_count;
    for (const auto &[kind, mechanism, handler, error] : rows) {
        EXPECT_EQ(after(sec__register_id_handler(kind, mechanism, handler)), error);
    }
    EXPECT_EQ(acl__state.handler_count, before);

    const auto registered = [](std::uint32_t kind, const char *mechanism) {
        sec_id_compare_fn handler = never;
        EXPECT_EQ(sec__get_id_handler(kind, mechanism, &handler), 0);
        return handler;
    };
    EXPECT_EQ(registered(2, sixteen.c_str()), nullptr);
    EXPECT_EQ(sec__register_id_handler(2, sixteen.c_str(), same_bytes), 0);
    EXPECT_EQ(sec__register_id_handler(2, "SIXTEEN-bytes-XX", never), 0);
    EXPECT_EQ(acl__state.handler_count, before + 2);
    EXPECT_EQ(acl__state.handlers[before].mechanism, sixteen);
    EXPECT_EQ(registered(2, "sixteen-BYTES-xx"), same_bytes);
    EXPECT_EQ(registered(2, "sixteen-bytes-x"), nullptr);
    EXPECT_EQ(registered(1, sixteen.c_str()), nullptr);
    EXPECT_EQ(recorded_error(), no_error);
}

TEST_F(evaluate, threads_register_and_decide_at_once) {
    const std::string bytes = one(of_mechanism(4, "exact", 1, named(7, "a")));
    std::atomic<int> wrong = 0;
    const std::int32_t before = acl__state.handler_count;
    std::vector<std::thread> threads;
    for (int thread = 0; thread < 4; ++thread)
        threads.emplace_back([&, thread] {
            const sec_acl_buffer_t acl = {static_cast<std::int32_t>(bytes.size()),
                                          const_cast<char *>(bytes.data())};
            for (int turn = 0; turn < 200; ++turn) {
                const std::string mechanism = "t"s.append(std::to_string(thread * 1000 + turn));
                std::uint32_t mask = 0;
                wrong += sec__single_acle_perm(&acl, 0x84, mechanism.c_str(), "exact", "b", &mask) != 43;
                wrong += sec__register_id_handler(2, mechanism.c_str(),
                                                  [](const char *, const char *) { return 0; }) != 0;
                wrong += sec__single_acle_perm(&acl, 0x84, mechanism.c_str(), "exact", "b", &mask) != 0 ||
                         mask != 7;
                wrong += sec__single_acle_perm(&acl, 0x84, "exact", nullptr, "A", &mask) != 43 || mask != 0;
            }
        });
    for (std::thread &thread : threads)
        thread.join();
    EXPECT_EQ(wrong, 0);
    EXPECT_EQ(acl__state.handler_count, before + 800);
}

} // namespace
