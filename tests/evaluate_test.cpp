// Tests of access decisions and identity handlers. Decisions on any buffer that passes the check are compared with a
// walk over its entries one by one by fuzz/buffer_fuzz.cpp.
#include "qzacl_acl/id_handlers.h"
#include "qzacl_init.h"
#include "support.h"

namespace {

using namespace support;

constexpr std::uint32_t no_kind = 0x80000001; // of handler
constexpr std::uint32_t untouched = 0xabad1dea;
constexpr int any_other_by_handler = SEC_ACLE_ANYOTHER | SEC_ACLE_USE_ID_HANDLER;
// With bits that no type has.
constexpr int unauthenticated = SEC_ACLE_UNAUTHENTICATED | SEC_ACLE_USE_ID_HANDLER | 0x60;
constexpr int no_type = 99;

// The mask, and the error beside the result.
using decision = std::pair<std::uint32_t, failure>;
decision granted(std::uint32_t mask) { return {mask, no_error}; }
decision refused(const failure &error) { return {untouched, error}; }
decision denied(int type, const std::string &mechanism, const std::string &identity) {
    return {0, bad_acle(msg::no_matching_acle, type, mechanism, identity)};
}
decision unreadable() { return {0, bad_acl(msg::buffer_corrupted)}; }

struct question {
    int type;
    const char *mechanism;
    const char *identity;
    const char *stored_as = nullptr;
};

decision answer(const std::string &bytes, const question &asked) {
    const buffer held(bytes);
    std::uint32_t mask = untouched;
    const int result = sec__single_acle_perm(&held.acl, static_cast<std::uint8_t>(asked.type),
                                             asked.mechanism, asked.stored_as, asked.identity, &mask);
    return {mask, outcome_of(result)};
}

decision answer_to_groups(const std::string &bytes, const std::vector<const char *> &names) {
    const buffer held(bytes);
    const auto groups = group_references(names);
    std::uint32_t mask = untouched;
    const auto count = static_cast<std::int32_t>(groups.size());
    const int result = sec__group_acles_perm(&held.acl, count, groups.data(), &mask);
    return {mask, outcome_of(result)};
}

int same_end(const char *wanted, const char *held) {
    if (std::string_view(wanted).ends_with(held))
        return 0;
    cu_set_error_1(SEC_S_WARNING, 0, "none.cat", 1, 1, "no match"); // not the error of the decision
    return -1;
}
int never(const char *, const char *) { return 1; }
[[maybe_unused]] const int registered[] = {
    sec__register_id_handler(SEC_ID_HANDLER_EXPANDED, "kRb5", same_end),
    sec__register_id_handler(SEC_ID_HANDLER_USER, "exact", std::strcmp),
};

TEST(evaluate, decides_by_exactly_one_entry) {
    const std::string acl = acl_bytes("u unix: Alice 1; e krb5: .x 32, x 64; u Exact: A 8, a 16, C 4;"
                                      "e unix: alice 1; o: 256");
    constexpr std::uint32_t nothing = 0;
    const std::tuple<const char *, question, std::uint32_t> rows[] = {
        {"any other needs no names", {any_other_by_handler, "unused", "unused"}, 256},
        {"without a handler as without the flag", {by_handler, "unix", "ALICE"}, 1},
        {"the handler sorts it before the second", {by_handler, "exact", "C"}, nothing},
        {"the requester's handler", {by_handler, "exact", "alice", "unix"}, nothing},
        {"no handler of the other kind", {by_handler, "krb5", "a", "exact"}, 8},
        {"the handler sorts it before the first, which ends nothing", {SEC_ACLE_EXPANDED, "krb5", "hx"}, 64},
        {"entries, but no handler", {SEC_ACLE_EXPANDED, "unix", "alice"}, nothing},
    };
    for (const auto &[what, asked, mask] : rows) {
        const decision wanted =
            mask == nothing ? denied(asked.type, asked.mechanism, asked.identity) : granted(mask);
        EXPECT_EQ(answer(acl, asked), wanted) << what;
    }
    EXPECT_EQ(answer(acl, {unauthenticated, "shown", "unused"}), denied(unauthenticated, "shown", ""));
}

TEST(evaluate, fails_at_what_it_cannot_read_when_it_gets_there) {
    const question anybody = {SEC_ACLE_UNAUTHENTICATED, "m", "i"};
    EXPECT_EQ(answer(acl_of_one(packed_subacl(SEC_ACLE_UNAUTHENTICATED, "", 0, "")), anybody),
              denied(SEC_ACLE_UNAUTHENTICATED, "m", ""));
    EXPECT_EQ(answer(acl_of_one(packed_subacl(SEC_ACLE_UNAUTHENTICATED, "", 1, "")), anybody), unreadable());
    EXPECT_EQ(answer(acl_bytes("n: 1, 1"), anybody), decision(0, bad_acl(msg::more_than_one_acle)));
    const std::string a_and_unended_m = entry_bytes("a 1") + packed_entry(2, "m");
    const std::string users =
        acl_of_one(packed_subacl(SEC_ACLE_USER, text_field("unix"), 2, a_and_unended_m));
    EXPECT_EQ(answer(users, {SEC_ACLE_USER, "unix", "a"}), granted(1));
    EXPECT_EQ(answer(users, {SEC_ACLE_USER, "unix", "m"}), unreadable());
    EXPECT_EQ(answer(users, {by_handler, "exact", "m", "unix"}), unreadable());
    const std::string groups = acl_of_one(packed_subacl(SEC_ACLE_GROUP, "", 2, a_and_unended_m));
    EXPECT_EQ(answer_to_groups(groups, {"a", "0"}), granted(1));
    EXPECT_EQ(answer_to_groups(groups, {"a", "m"}), unreadable());
}

TEST(evaluate, asks_about_many_groups_and_about_none) {
    std::vector<const char *> names(200, nullptr);
    EXPECT_EQ(answer_to_groups(rich, names), denied(SEC_ACLE_GROUP, "", ""));
    names[150] = "Staff";
    EXPECT_EQ(answer_to_groups(rich, names), granted(18));
    EXPECT_EQ(answer_to_groups(rich, {}), granted(0));
}

TEST(evaluate, refuses_what_is_no_question) {
    const failure no_mechanism = error_of(SEC_S_BAD_PARAMETER, msg::mechanism_required);
    const failure no_identity = error_of(SEC_S_BAD_PARAMETER, msg::identity_required);
    const failure bad_type = error_of(SEC_S_BAD_PARAMETER, msg::type_not_evaluated, SEC_ACLE_GROUP);
    EXPECT_EQ(answer(rich, {SEC_ACLE_GROUP, "unix", "a"}), refused(bad_type));
    EXPECT_EQ(answer(rich, {SEC_ACLE_USER, nullptr, "a", "unix"}), refused(no_mechanism));
    EXPECT_EQ(answer(rich, {SEC_ACLE_EXPANDED, "", "a", "unix"}), refused(no_mechanism));
    EXPECT_EQ(answer(rich, {SEC_ACLE_EXPANDED | SEC_ACLE_USE_ID_HANDLER, "unix", ""}), refused(no_identity));
    const buffer held(rich);
    const sec_acl_buffer_t &acl = held.acl;
    const sec_group_ref_t group = {1, "staff"};
    std::uint32_t mask = untouched;
    const std::string single = "sec__single_acle_perm";
    const std::string groups = "sec__group_acles_perm";
    EXPECT_EQ(outcome_of(sec__single_acle_perm(nullptr, no_type, "", "", "", nullptr)),
              bad_parameter(single, 1));
    EXPECT_EQ(outcome_of(sec__single_acle_perm(&acl, no_type, "", "", "", nullptr)),
              bad_parameter(single, 5));
    EXPECT_EQ(outcome_of(sec__group_acles_perm(nullptr, 1, nullptr, nullptr)), bad_parameter(groups, 1));
    EXPECT_EQ(outcome_of(sec__group_acles_perm(&acl, 1, nullptr, nullptr)), bad_parameter(groups, 3));
    EXPECT_EQ(outcome_of(sec__group_acles_perm(&acl, 1, &group, nullptr)), bad_parameter(groups, 4));
    EXPECT_EQ(outcome_of(sec__group_acles_perm(&acl, -1, &group, &mask)),
              bad_acle(msg::no_matching_acle, SEC_ACLE_GROUP, "", ""));
}

TEST(evaluate, refuses_bytes_that_are_no_acl_of_this_host) {
    const std::pair<std::string, failure> rows[] = {
        {"", bad_acl(msg::not_an_acl_buffer)},
        {"\x85"s, bad_acl(msg::not_an_acl_buffer)},
        {"\x84\1\1\0\0"s, bad_acl(msg::not_an_acl_buffer)},
        {"\x85\2\1\0\0"s, bad_acl(msg::not_an_acl_buffer)},
        {example.substr(0, 4), bad_acl(msg::buffer_corrupted)},
        {foreign.substr(0, 4), bad_acl(msg::wrong_byte_order)},
    };
    for (const auto &[bytes, error] : rows) {
        EXPECT_EQ(answer(bytes, {no_type, nullptr, nullptr}), refused(error)); // before the type
        EXPECT_EQ(answer_to_groups(bytes, {}), refused(error));
    }
    const buffer acl(rich);
    const sec_acl_buffer_t negative = {-1, acl.acl.data};
    std::uint32_t mask = untouched;
    EXPECT_EQ(outcome_of(sec__group_acles_perm(&negative, 0, nullptr, &mask)),
              bad_acl(msg::not_an_acl_buffer));
}

// If the table cannot be locked, the decision is made without it and leaves no error of that.
TEST(evaluate, goes_on_when_handlers_cannot_be_looked_up) {
    const pthread_mutex_t kept = std::exchange(acl__state.lock, PTHREAD_ERRORCHECK_MUTEX_INITIALIZER_NP);
    pthread_mutex_lock(&acl__state.lock);
    EXPECT_EQ(answer(rich, {by_handler, "unix", "al"}), granted(1));
    EXPECT_EQ(answer(rich, {SEC_ACLE_EXPANDED, "kRb5", "z"}), denied(SEC_ACLE_EXPANDED, "kRb5", "z"));
    pthread_mutex_unlock(&acl__state.lock);
    acl__state.lock = kept;
}

TEST(evaluate, registrations_stay_in_the_order_in_which_they_came) {
    const std::string name = "acl__register_id_handler";
    const failure bad_mechanism = error_of(SEC_S_BAD_PARAMETER, msg::bad_handler_mechanism);
    const std::tuple<std::uint32_t, const char *, sec_id_compare_fn, failure> rows[] = {
        {no_kind, nullptr, nullptr, bad_parameter(name, 1, "80000001")},
        {SEC_ID_HANDLER_EXPANDED, nullptr, nullptr, bad_parameter(name, 2)},
        {SEC_ID_HANDLER_USER, "", nullptr, bad_parameter(name, 3)},
        {SEC_ID_HANDLER_USER, "", never, bad_mechanism},
        {SEC_ID_HANDLER_EXPANDED, "seventeen-bytes-x", never, bad_mechanism},
        {SEC_ID_HANDLER_USER, "sixteen-bytes-xx", std::strcmp, no_error},
        {SEC_ID_HANDLER_USER, "SIXTEEN-bytes-XX", never, no_error},
    };
    for (const auto &[kind, mechanism, handler, error] : rows)
        EXPECT_EQ(outcome_of(sec__register_id_handler(kind, mechanism, handler)), error);
    const std::string acl = acl_bytes("u m: A 1, a 2");
    EXPECT_EQ(answer(acl, {by_handler, "sixteen-BYTES-xx", "a", "m"}), granted(2));
    EXPECT_EQ(answer(acl, {by_handler, "sixteen-bytes-x", "a", "m"}), granted(1));
}

} // namespace
