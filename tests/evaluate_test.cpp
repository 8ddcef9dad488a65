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

// The result, the mask, and the error.
using decision = std::tuple<int, std::uint32_t, failure>;
decision granted(std::uint32_t mask) { return {0, mask, {}}; }
decision denied(int type, const std::string &mechanism, const std::string &identity) {
    return {43, 0, error_of(43, 134, {std::to_string(type), mechanism, identity})};
}
decision refused(const failure &error, std::uint32_t mask = untouched) { return {error.code, mask, error}; }

// The bytes lie right before memory that nothing may touch.
template <class Call>
decision decided(const std::string &bytes, const Call &call) {
    const guarded memory(bytes);
    const sec_acl_buffer_t acl = {static_cast<std::int32_t>(bytes.size()), memory.data()};
    std::uint32_t mask = untouched;
    const int result = call(&acl, &mask);
    return {result, mask, after(result)};
}
decision single(const std::string &bytes, int type, const char *mechanism, const char *identity,
                const char *subacl_mechanism = nullptr) {
    return decided(bytes, [&](auto acl, auto mask) {
        return sec__single_acle_perm(acl, static_cast<std::uint8_t>(type), mechanism, subacl_mechanism, identity, mask);
    });
}
decision groups(const std::string &bytes, const std::vector<const char *> &names) {
    std::vector<sec_group_ref_t> refs;
    for (const char *name : names) refs.push_back({0, name});
    return decided(bytes, [&](auto acl, auto mask) {
        return sec__group_acles_perm(acl, static_cast<std::int32_t>(refs.size()), refs.data(), mask);
    });
}

// Handlers note the entries that they are asked about, and what they record is nobody else's business.
thread_local std::string asked;
int noted(int order, const char *held) {
    asked += held;
    if (order != 0) cu_set_error_1(99, 0, "none.cat", 1, 1, "no match");
    return order;
}
int same_bytes(const char *requested, const char *held) { return noted(std::strcmp(requested, held), held); }
int same_end(const char *requested, const char *held) {
    return noted(std::string_view(requested).ends_with(held) ? 0 : -1, held);
}
int never(const char *, const char *) { return 1; }

const int registered = sec__register_id_handler(SEC_ID_HANDLER_EXPANDED, "kRb5", same_end) +
                       sec__register_id_handler(SEC_ID_HANDLER_USER, "exact", same_bytes);

TEST(evaluate, decides_by_exactly_one_entry) {
    EXPECT_EQ(registered, 0);
    const std::string user = of_mechanism(4, "unix", 2, named(1, "Alice") + named(4, "dave"));
    const std::string acl = packed_acl(5, user + of_mechanism(4, "Exact", 2, named(8, "A") + named(16, "a")) +
                                              of_mechanism(8, "krb5", 2, named(32, ".x") + named(64, "")) +
                                              packed_subacl(2, "", 1, packed_entry(256, "")) +
                                              packed_subacl(1, "", 1, packed_entry(512, "")));
    // The bytes, the type, the mechanism, the sub-ACL's mechanism, the identity.
    using text = const char *;
    const std::tuple<std::string, int, text, text, text, decision> rows[] = {
        {acl, 1, nullptr, nullptr, nullptr, granted(512)},
        {acl, 0x82, "unused", "unused", "unused", granted(256)},
        {one(user), 0xe2, "shown", "unused", "unused", denied(226, "shown", "")},
        {one(packed_subacl(1, "", 0, "")), 1, nullptr, nullptr, "i", denied(1, "", "")},
        {one(packed_subacl(1, "", 2, "")), 1, "m", nullptr, "i", refused(located(42, 109), 0)},
        {one(packed_subacl(1, "", 1, "")), 1, "m", nullptr, "i", refused(located(42, 97), 0)},
        {acl, 4, "UNIX", nullptr, "aLICE", granted(1)},
        {acl, 4, "none", nullptr, "alice", denied(4, "none", "")},
        {acl, 4, "none", "unix", "DAVE", granted(4)},
        {acl, 4, "unix", "none", "dave", denied(4, "unix", "")},
        {acl, 0x84, "unix", nullptr, "ALICE", granted(1)},                    // no handler: as without the flag
        {acl, 4, "exact", nullptr, "a", granted(8)},                          // without the flag letters fold
        {acl, 0x84, "EXACT", nullptr, "a", granted(16)},                      // the handler's mechanism in any case
        {acl, 0x84, "exact", "unix", "alice", denied(132, "exact", "alice")}, // the requester's handler
        {acl, 0x84, "krb5", "exact", "a", granted(8)}, // a handler of the other kind does not count
        {acl, 8, "KRB5", nullptr, "h.x", granted(32)}, // the first that accepts
        {acl, 8, "krb5", "KRB5", "at-alice", granted(64)},
        {acl, 8, "exact", "krb5", "h.x", denied(8, "exact", "h.x")}, // a handler of the other kind only
        {one(user), 8, "krb5", nullptr, "x", denied(8, "krb5", "")},
        {acl, 16, "unix", nullptr, "a", refused(error_of(4, 115, {"16"}))},
        {acl, 0x8c, "unix", nullptr, "a", refused(error_of(4, 115, {"140"}))},
        {acl, 8, nullptr, "unix", nullptr, refused(error_of(4, 116))},
        {acl, 4, "", "unix", "a", refused(error_of(4, 116))},
        {acl, 4, "unix", nullptr, nullptr, refused(error_of(4, 117))},
        {acl, 0x88, "unix", nullptr, "", refused(error_of(4, 117))},
    };
    for (const auto &[bytes, type, mechanism, subacl_mechanism, identity, answer] : rows)
        EXPECT_EQ(single(bytes, type, mechanism, identity, subacl_mechanism), answer) << "type " << type;
}

TEST(evaluate, refuses_bytes_that_are_no_acl_of_this_host) {
    for (const auto &[bytes, error] : {
             std::pair("\x85"s, error_of(42, 96)),
             {"\5\1\2\0\0"s, error_of(42, 96)},
             {"\x85\2\2\0\0"s, error_of(42, 96)},
             {"\x85\1\2\0"s, located(42, 97)},
             {"\x85\1\1\0\0"s, error_of(42, 102)},
         }) {
        EXPECT_EQ(single(bytes, 99, nullptr, nullptr), refused(error)); // before the type
        EXPECT_EQ(groups(bytes, {}), refused(error));
    }
    const sec_group_ref_t group = {1, "staff"};
    const sec_acl_buffer_t acl = {5, nullptr};
    std::uint32_t mask = 0;
    const auto call = sec__single_acle_perm;
    const auto call_groups = sec__group_acles_perm;
    const std::string of = "sec__single_acle_perm", of_groups = "sec__group_acles_perm";
    EXPECT_EQ(after(call(nullptr, 99, nullptr, nullptr, nullptr, nullptr)), bad_parameter(of, 1, "0"));
    EXPECT_EQ(after(call(&acl, 99, nullptr, nullptr, nullptr, nullptr)), bad_parameter(of, 5, "0"));
    EXPECT_EQ(after(call(&acl, 2, nullptr, nullptr, nullptr, &mask)), error_of(42, 96));
    EXPECT_EQ(after(call_groups(nullptr, 1, nullptr, nullptr)), bad_parameter(of_groups, 1, "0"));
    EXPECT_EQ(after(call_groups(&acl, -1, nullptr, nullptr)), bad_parameter(of_groups, 3, "0"));
    EXPECT_EQ(after(call_groups(&acl, 1, &group, nullptr)), bad_parameter(of_groups, 4, "0"));
    const auto negative = [&](auto held, auto out) { return sec__group_acles_perm(held, -1, &group, out); };
    EXPECT_EQ(decided(rich, negative), denied(16, "", ""));
    EXPECT_EQ(groups(rich, {}), granted(0));
}

TEST(evaluate, asks_a_handler_as_long_as_an_entry_may_match) {
    const std::string entries = named(1, "b") + named(2, "d") + named(4, "a") + named(8, "e");
    const auto ask = [&](int type, const char *mechanism, const char *identity) {
        asked.clear();
        const std::string bytes = one(of_mechanism(type & 31, mechanism, 4, entries));
        return std::to_string(std::get<1>(single(bytes, type, mechanism, identity))) + asked;
    };
    EXPECT_EQ(ask(0x84, "exact", "d"), "2bd");
    EXPECT_EQ(ask(0x84, "exact", "c"), "0bd");
    EXPECT_EQ(ask(0x84, "exact", "z"), "0bdae");
    EXPECT_EQ(ask(8, "krb5", "z"), "0bdae"); // the sign does not matter
}

// Entries and names that differ late, early, by case, by bytes next to the letters, and by a prefix; many
// around eight and sixteen bytes, since that many are compared at once.
const arguments names =
    words("a B ab aB a_b a[b a` sixsix seven77 SEVEN77 eight888 EIGHT888 eight889 nine99999 nine9999X "
          "nine9999x \xc3\x84 \xe3\x84 \x7f @ [ fifteen-bytes15 sixteen-bytes-16 SIXTEEN-bytes-16 "
          "sixteen-bytes-1_ seventeen-byte-17 seventeen-byte-1 host.example.of.more host.example.of.mord");

// The mask of the entry that a walk in stored order ends at with a match, none at the end.
using items = std::vector<std::pair<std::string, std::uint32_t>>;
items::const_iterator found_by_walk(const items &all, const std::string &name) {
    const auto at = std::ranges::find_if(all, [&](const auto &held) { return !precedes(held.first, name); });
    return at != all.end() && same(at->first, name) ? at : all.end();
}

TEST(evaluate, finds_what_a_walk_in_stored_order_finds) {
    std::mt19937 random(4);
    const auto any_name = [&] { return names[random() % names.size()].c_str(); };
    for (int run = 0; run < 1000; ++run) {
        SCOPED_TRACE("run " + std::to_string(run));
        items all;
        for (auto left = random() % 12; left != 0; --left)
            all.emplace_back(any_name(), static_cast<std::uint32_t>(random()));
        if (run % 2 == 0) std::ranges::stable_sort(all, {}, [](const auto &each) { return folded(each.first); });
        std::string packed;
        for (const auto &[name, mask] : all) packed += named(mask, name);
        for (const std::string &name : names) {
            const auto match = found_by_walk(all, name);
            ASSERT_EQ(single(one(of_mechanism(4, "unix", all.size(), packed)), 4, "unix", name.c_str()),
                      match == all.end() ? denied(4, "unix", name) : granted(match->second))
                << name;
        }
        // Each group walks on its own, all that are found count, and those without a name do not.
        std::vector<const char *> asked_for(random() % (run % 10 == 0 ? 200 : 8) + 1);
        decision answer = denied(16, "", "");
        for (const char *&name : asked_for) {
            if (name = random() % 8 == 0 ? nullptr : any_name(); name == nullptr) continue;
            if (const auto match = found_by_walk(all, name); match != all.end())
                answer = granted(std::get<1>(answer) | match->second);
        }
        ASSERT_EQ(groups(one(packed_subacl(16, "", all.size(), packed)), asked_for), answer);
    }
    EXPECT_EQ(groups(example, {"staff"}), denied(16, "", ""));
}

TEST(evaluate, registrations_stay_in_the_order_in_which_they_came) {
    const char *const name = "acl__register_id_handler";
    const std::tuple<std::uint32_t, const char *, sec_id_compare_fn, failure> rows[] = {
        {0x80000001, "m", never, bad_parameter(name, 1, "80000001")},
        {3, nullptr, nullptr, bad_parameter(name, 1, "3")},
        {1, nullptr, nullptr, bad_parameter(name, 2, "0")},
        {2, "", nullptr, bad_parameter(name, 3, "0")},
        {2, "", never, error_of(4, 119)},
        {1, "seventeen-bytes-x", never, error_of(4, 119)},
        {2, "sixteen-bytes-xx", same_bytes, no_error},
        {2, "SIXTEEN-bytes-XX", never, no_error},
    };
    const std::int32_t before = acl__state.handler_count;
    for (const auto &[kind, mechanism, handler, error] : rows)
        EXPECT_EQ(after(sec__register_id_handler(kind, mechanism, handler)), error);
    EXPECT_EQ(acl__state.handler_count, before + 2);
    EXPECT_STREQ(acl__state.handlers[before].mechanism, "sixteen-bytes-xx");
    const auto held = [](std::uint32_t kind, const char *mechanism) {
        sec_id_compare_fn handler = never;
        return sec__get_id_handler(kind, mechanism, &handler) == 0 ? handler : never;
    };
    EXPECT_EQ(held(2, "sixteen-BYTES-xx"), same_bytes);
    EXPECT_EQ(held(2, "sixteen-bytes-x"), nullptr);
    EXPECT_EQ(held(1, "sixteen-bytes-xx"), nullptr);
}

TEST(evaluate, threads_register_and_decide_at_once) {
    std::string bytes = one(of_mechanism(4, "exact", 1, named(7, "a")));
    const sec_acl_buffer_t acl = {static_cast<std::int32_t>(bytes.size()), bytes.data()};
    const std::int32_t before = acl__state.handler_count;
    std::atomic<int> wrong = 0;
    std::vector<std::thread> threads;
    for (int thread = 0; thread < 4; ++thread)
        threads.emplace_back([&, thread] {
            for (int turn = 0; turn < 200; ++turn) {
                const std::string name = "t"s.append(std::to_string(thread * 1000 + turn));
                const auto accept = [](const char *, const char *) { return 0; };
                const auto result = [&](const char *mechanism, const char *identity) {
                    std::uint32_t mask = 9;
                    const int code = sec__single_acle_perm(&acl, 0x84, mechanism, "exact", identity, &mask);
                    return code * 10 + static_cast<int>(mask);
                };
                wrong += result(name.c_str(), "b") != 430;
                wrong += sec__register_id_handler(2, name.c_str(), accept) != 0;
                wrong += result(name.c_str(), "b") != 7 || result("exact", "A") != 430;
            }
        });
    for (std::thread &thread : threads) thread.join();
    EXPECT_EQ(wrong, 0);
    EXPECT_EQ(acl__state.handler_count, before + 800);
}

} // namespace
