// Tests of access decisions and identity handlers. Decisions on any buffer that passes the check are compared with a
// walk over its entries one by one by fuzz/buffer_fuzz.cpp.
#include "qzacl_acl/id_handlers.h"
#include "qzacl_init.h"
#include "support.h"

namespace {

using namespace support;

constexpr std::uint32_t untouched = 0xabad1dea;
using decision = std::pair<std::uint32_t, failure>; // the mask, and the error beside the result
decision granted(std::uint32_t mask) { return {mask, no_error}; }
decision refused(const failure &error) { return {untouched, error}; }
decision denied(int type, const std::string &mechanism, const std::string &identity) {
    return {0, error_of(43, 134, {std::to_string(type), mechanism, identity})};
}

decision single(const std::string &bytes, std::uint8_t type, const char *mechanism, const char *identity,
                const char *stored_as = nullptr) {
    const buffer held(bytes);
    std::uint32_t mask = untouched;
    const failure error = after(sec__single_acle_perm(&held.acl, type, mechanism, stored_as, identity, &mask));
    return {mask, error};
}

decision groups(const std::string &bytes, const std::vector<const char *> &names) {
    const buffer held(bytes);
    std::vector<sec_group_ref_t> refs;
    for (const char *name : names) refs.push_back({0, name});
    std::uint32_t mask = untouched;
    const auto count = static_cast<std::int32_t>(refs.size());
    const failure error = after(sec__group_acles_perm(&held.acl, count, refs.data(), &mask));
    return {mask, error};
}

int same_end(const char *wanted, const char *held) {
    if (std::string_view(wanted).ends_with(held)) return 0;
    cu_set_error_1(99, 0, "none.cat", 1, 1, "no match"); // which is nobody else's business
    return -1;
}
int never(const char *, const char *) { return 1; }
[[maybe_unused]] const int registered[] = {sec__register_id_handler(1, "kRb5", same_end),
                                           sec__register_id_handler(2, "exact", std::strcmp)};

TEST(evaluate, decides_by_exactly_one_entry) {
    const std::string few = of_mechanism(4, "unix", 2, named(1, "Alice") + named(2, "bob"));
    const std::string exact = of_mechanism(4, "Exact", 3, named(8, "A") + named(16, "a") + named(4, "C"));
    const std::string hosts = of_mechanism(8, "krb5", 3, named(32, ".x") + named(64, "x") + named(128, ""));
    const std::string others =
        of_mechanism(8, "unix", 1, named(1, "alice")) + packed_subacl(2, "", 1, packed_entry(256, ""));
    const std::string acl = packed_acl(5, few + exact + hosts + others);
    const std::string cut = one(of_mechanism(4, "unix", 2, named(1, "a") + packed_entry(2, "m")));
    const std::tuple<std::string, std::uint8_t, const char *, const char *, const char *, decision> rows[] = {
        {acl, 0x82, "unused", "unused", "unused", granted(256)},
        {acl, 0xe1, "shown", "unused", "unused", denied(225, "shown", "")},
        {one(packed_subacl(1, "", 0, "")), 1, nullptr, nullptr, "i", denied(1, "", "")},
        {one(packed_subacl(1, "", 2, "")), 1, "m", nullptr, "i", {0, located(42, 109)}},
        {one(packed_subacl(1, "", 1, "")), 1, "m", nullptr, "i", {0, located(42, 97)}},
        {acl, 4, "none", "unix", "BOB", granted(2)},
        {acl, 0x84, "unix", nullptr, "ALICE", granted(1)},                    // no handler: as without the flag
        {acl, 0x84, "EXACT", nullptr, "a", granted(16)},                      // the handler's mechanism in any case
        {acl, 0x84, "exact", nullptr, "C", denied(132, "exact", "C")},        // which sorts before the second
        {acl, 0x84, "exact", "unix", "alice", denied(132, "exact", "alice")}, // the requester's handler
        {acl, 0x84, "krb5", "exact", "a", granted(8)},                  // a handler of the other kind does not count
        {acl, 8, "krb5", nullptr, "h.x", granted(32)},                  // the first that accepts
        {acl, 8, "krb5", nullptr, "hx", granted(64)},                   // whatever the sign for the first
        {acl, 8, "unix", nullptr, "alice", denied(8, "unix", "alice")}, // entries, but no handler
        {cut, 4, "unix", nullptr, "a", granted(1)},
        {cut, 4, "unix", nullptr, "m", {0, located(42, 97)}}, // a walk fails at what it cannot read when it gets there
        {cut, 0x84, "exact", "unix", "m", {0, located(42, 97)}},
        {acl, 16, "unix", nullptr, "a", refused(error_of(4, 115, {"16"}))},
        {acl, 4, nullptr, "unix", "a", refused(error_of(4, 116))},
        {acl, 8, "", "unix", "a", refused(error_of(4, 116))},
        {acl, 0x88, "unix", nullptr, "", refused(error_of(4, 117))},
    };
    for (const auto &[bytes, type, mechanism, stored_as, identity, answer] : rows)
        EXPECT_EQ(single(bytes, type, mechanism, identity, stored_as), answer) << "type " << type;
    const std::string cut_group = one(packed_subacl(16, "", 2, named(1, "a") + packed_entry(2, "m")));
    EXPECT_EQ(groups(cut_group, {"a", "0"}), granted(1));
    EXPECT_EQ(groups(cut_group, {"a", "m"}), decision(0, located(42, 97)));
    // Groups that are none, and none at all.
    EXPECT_EQ(groups(rich, std::vector<const char *>(65, nullptr)), denied(16, "", ""));
    std::vector<const char *> many(200, "none");
    many[150] = "Staff";
    EXPECT_EQ(groups(rich, many), granted(0x12));
    EXPECT_EQ(groups(example, {"staff"}), denied(16, "", ""));
    EXPECT_EQ(groups(rich, {}), granted(0));
}

TEST(evaluate, refuses_bytes_that_are_no_acl_of_this_host) {
    for (const auto &[bytes, error] : {std::pair(""s, error_of(42, 96)),
                                       {"\x85"s, error_of(42, 96)},
                                       {"\x84\1\1\0\0"s, error_of(42, 96)},
                                       {"\x85\2\1\0\0"s, error_of(42, 96)},
                                       {example.substr(0, 4), located(42, 97)},
                                       {foreign.substr(0, 4), error_of(42, 102)}}) {
        EXPECT_EQ(single(bytes, 99, nullptr, nullptr), refused(error)); // before the type
        EXPECT_EQ(groups(bytes, {}), refused(error));
    }
    const buffer acl(rich);
    const sec_acl_buffer_t negative = {-1, acl.acl.data};
    const sec_group_ref_t group = {1, "staff"};
    std::uint32_t mask = untouched;
    EXPECT_EQ(after(sec__group_acles_perm(&negative, 0, nullptr, &mask)), error_of(42, 96));
    const char *const of_single = "sec__single_acle_perm", *const of_groups = "sec__group_acles_perm";
    EXPECT_EQ(after(sec__single_acle_perm(nullptr, 99, "", "", "", nullptr)), bad_parameter(of_single, 1));
    EXPECT_EQ(after(sec__single_acle_perm(&acl.acl, 99, "", "", "", nullptr)), bad_parameter(of_single, 5));
    EXPECT_EQ(after(sec__group_acles_perm(nullptr, 1, nullptr, nullptr)), bad_parameter(of_groups, 1));
    EXPECT_EQ(after(sec__group_acles_perm(&acl.acl, 1, nullptr, nullptr)), bad_parameter(of_groups, 3));
    EXPECT_EQ(after(sec__group_acles_perm(&acl.acl, 1, &group, nullptr)), bad_parameter(of_groups, 4));
    EXPECT_EQ(after(sec__group_acles_perm(&acl.acl, -1, &group, &mask)), error_of(43, 134, {"16", "", ""}));
}

// A table that cannot be locked leaves no error behind a decision that was made without it.
TEST(evaluate, bears_a_failing_look_up_of_a_handler) {
    const pthread_mutex_t kept = std::exchange(acl__state.lock, PTHREAD_ERRORCHECK_MUTEX_INITIALIZER_NP);
    pthread_mutex_lock(&acl__state.lock);
    EXPECT_EQ(single(rich, 0x84, "unix", "al"), granted(1));
    EXPECT_EQ(single(rich, 8, "kRb5", "z"), denied(8, "kRb5", "z"));
    pthread_mutex_unlock(&acl__state.lock);
    acl__state.lock = kept;
}

TEST(evaluate, registrations_stay_in_the_order_in_which_they_came) {
    const std::string name = "acl__register_id_handler";
    const std::tuple<std::uint32_t, const char *, sec_id_compare_fn, failure> rows[] = {
        {0x80000001, nullptr, nullptr, bad_parameter(name, 1, "80000001")},
        {1, nullptr, nullptr, bad_parameter(name, 2)},
        {2, "", nullptr, bad_parameter(name, 3)},
        {2, "", never, error_of(4, 119)},
        {1, "seventeen-bytes-x", never, error_of(4, 119)},
        {2, "sixteen-bytes-xx", std::strcmp, no_error},
        {2, "SIXTEEN-bytes-XX", never, no_error},
    };
    for (const auto &[kind, mechanism, handler, error] : rows)
        EXPECT_EQ(after(sec__register_id_handler(kind, mechanism, handler)), error);
    const std::string acl = one(of_mechanism(4, "m", 2, named(1, "A") + named(2, "a")));
    EXPECT_EQ(single(acl, 0x84, "sixteen-BYTES-xx", "a", "m"), granted(2));
    EXPECT_EQ(single(acl, 0x84, "sixteen-bytes-x", "a", "m"), granted(1));
}

} // namespace
