// Tests of service.hpp: decisions against single questions, texts, and files that change while they are followed. What
// qzacl shows of them, with the hosts that handlers know, is in qzacl.cases.
#include "support.h"

#include <atomic>
#include <fcntl.h>
#include <qz/service.hpp>
#include <sys/stat.h>
#include <thread>

namespace {

using namespace support;
using qz::order;
using qz::requester;
using qz::who;

int is_alias(const char *requested, const char *entry) {
    return requested == "root"s && entry == "admin"s ? 0 : 1;
}
[[maybe_unused]] const int registered[] = {
    sec__register_id_handler(SEC_ID_HANDLER_EXPANDED, "unix", qz::domain_handler),
    sec__register_id_handler(SEC_ID_HANDLER_EXPANDED, "hba2", qz::domain_handler),
    sec__register_id_handler(SEC_ID_HANDLER_EXPANDED, "krb5", qz::exact_handler),
    sec__register_id_handler(SEC_ID_HANDLER_USER, "krb5", is_alias),
};

qz::acl acl_of(const std::string &lines) {
    auto read = qz::from_text(lines);
    EXPECT_EQ(read.code(), SEC_S_OK) << qz::error::current().text();
    return std::move(*read);
}

// ---- Decisions ----

// What the single questions answer, combined by hand: the mask and who decided.
std::pair<std::uint32_t, who> by_hand(const qz::acl &acl, const std::string &mechanism,
                                      const std::string &identity, const std::vector<sec_group_ref_t> &groups,
                                      order taken) {
    const qz::decision nothing(SEC_S_BAD_ACLE, 0);
    const qz::decision found[] = {
        acl.single(qz::party::user(mechanism.c_str(), identity.c_str())),
        acl.single(qz::party::expanded(mechanism.c_str(), identity.c_str())),
        groups.empty() ? nothing : acl.groups(groups),
        acl.single(qz::party::any_other()),
    };
    constexpr who parties[] = {who::user, who::expanded, who::group, who::any_other};
    const auto *first = std::ranges::find_if_not(found, &qz::decision::no_entry);
    if (first == std::end(found))
        return {0, who::nobody};
    if (taken == order::closest)
        return {first->permissions(), parties[first - found]};
    std::uint32_t sum = 0;
    for (const qz::decision &each : found)
        sum |= each.permissions();
    return {sum, who::sum};
}

// ACLs and parties of few words, so that they meet.
std::mt19937 random_numbers;

std::size_t below(std::size_t limit) { return random_numbers() % limit; }

std::string any_of(const std::string &text) {
    const arguments choices = words(text);
    return choices[below(choices.size())];
}
std::string any_mechanism() { return any_of("unix hba2 krb5 none"); }
std::string any_user() { return any_of("al Al bob") + any_of("@h.x @H.x @k.y @x h.x"); }
std::vector<sec_group_ref_t> any_groups() {
    std::vector<const char *> names(below(4));
    for (const char *&each : names)
        each = std::array{"ops", "OPS", "audit", "staff"}[below(4)];
    return group_references(names);
}
std::string any_identity(int type) {
    if (type == SEC_ACLE_GROUP)
        return any_of("ops audit staff");
    return type == SEC_ACLE_EXPANDED ? any_of(".x h.x k.y .Y al@h.x X") : any_user();
}
qz::acl any_acl() {
    qz::acl made = *qz::acl::create_empty();
    for (auto left = below(24); left != 0; --left) {
        const int type = 1 << below(5);
        const std::string identity = any_identity(type);
        const auto mask = static_cast<std::uint32_t>(below(8192));
        const char *const name = type < SEC_ACLE_USER ? nullptr : identity.c_str();
        EXPECT_EQ(made.add(entry(type, any_mechanism(), name, mask)), SEC_S_OK);
    }
    return made;
}

TEST(service, decides_as_the_single_questions_do) {
    random_numbers.seed(20261125);
    for (int round = 0; round < (QZ_SANITIZED ? 500 : 5000); ++round) {
        const qz::acl acl = any_acl();
        const std::string mechanism = any_mechanism();
        const std::string identity = any_user();
        const auto groups = any_groups();
        const requester whom = requester::user(mechanism.c_str(), identity.c_str()).in_groups(groups);
        for (const order taken : {order::closest, order::sum}) {
            const auto [mask, by] = by_hand(acl, mechanism, identity, groups, taken);
            const auto answer = qz::decide(acl, whom, 1, taken);
            ASSERT_EQ(answer.code(), SEC_S_OK);
            EXPECT_EQ(answer->granted(), mask) << answer->explain()->view();
            EXPECT_EQ(answer->decided_by(), by) << answer->explain()->view();
            EXPECT_EQ(qz::granted(acl, whom, taken).permissions(), mask);
        }
    }
}

TEST(service, stays_within_bytes_that_are_no_acl) {
    random_numbers.seed(7);
    const auto groups = group_references({"ops", "audit"});
    for (int round = 0; round < 3000; ++round) {
        std::string bytes(any_acl().bytes());
        for (auto left = below(4); left != 0; --left)
            bytes[below(bytes.size())] = static_cast<char>(below(256));
        bytes.resize(bytes.size() - below(2));
        const auto acl = qz::acl::from_bytes(bytes.data(), bytes.size());
        const auto answer = qz::decide(*acl, requester::user("unix", "al@h.x").in_groups(groups), 1);
        EXPECT_TRUE(answer || answer->granted() == 0);
        EXPECT_TRUE(answer || answer->size() == 0);
        EXPECT_TRUE(answer->explain() || answer->explain().code() == SEC_S_BAD_PERMISSION);
        EXPECT_EQ(qz::same(*acl, *acl).code() == SEC_S_OK, acl->list().code() == SEC_S_OK);
        // Further than any decision looks.
        const auto never = [](const qz::entry_fields &entry) { return entry.identity == "nobody"; };
        EXPECT_EQ(qz::detail::find_entry(acl->bytes(), SEC_ACLE_USER, "unix", never).type, 0);
    }
}

TEST(service, finds_the_entry_that_a_handler_accepts) {
    const qz::acl acl = acl_of("u krb5 admin rw\nu krb5 Root x\ne unix .y w\ne unix .X r\n");
    const requester root = requester::user("krb5", "root");
    EXPECT_EQ(qz::decide(acl, root, 1)->begin()->entry.identity, "Root");
    const auto through = qz::decide(acl, root.through_handler(), 1);
    EXPECT_TRUE(through->explain()->view().starts_with("user: u krb5 admin rw (decides)\n"));
    EXPECT_EQ(through->granted(), 3u);
    const auto of_domain = qz::decide(acl, requester::user("UNIX", "al@h.x"), 0);
    EXPECT_EQ(of_domain->begin()[1].entry.identity, ".X");
    EXPECT_FALSE(of_domain->allowed()); // nothing was wanted
}

TEST(service, what_cannot_be_asked_grants_nothing) {
    const auto bad = qz::acl::from_bytes("none", 4);
    const requester al = requester::user("unix", "al@h");
    EXPECT_EQ(qz::decide(*bad, al, 1).code(), SEC_S_BAD_ACL);
    EXPECT_EQ(qz::granted(*bad, al).code(), SEC_S_BAD_ACL);
    EXPECT_EQ(qz::decide(qz::acl_snapshot(), al, 1).code(), SEC_S_BAD_ACL);
    EXPECT_EQ(qz::decide(acl_of("o r\n"), requester::user("unix", ""), 1).code(), SEC_S_BAD_PARAMETER);
    const auto nobody = qz::decide(qz::acl(), al, 1); // what a file without entries gives
    EXPECT_EQ(nobody.code(), SEC_S_OK);
    EXPECT_EQ(nobody->decided_by(), who::nobody);
    EXPECT_EQ(qz::granted(qz::acl(), al).code(), SEC_S_BAD_ACLE);
}

// ---- Texts ----

const std::string service_text = read_file(QZ_SOURCE "/examples/service.acl");

TEST(service, texts_lead_back_to_the_same_bytes) {
    for (const std::string &lines :
         {service_text, "g b r\nu m z w\nu m A\ne m z\ne m a rw\nu k a x\no\nn q\n"s, ""s}) {
        const qz::acl acl = acl_of(lines);
        const auto written = qz::to_text(acl);
        ASSERT_EQ(written.code(), SEC_S_OK);
        EXPECT_EQ(acl_of(std::string(written->view())).bytes(), acl.bytes()) << written->view();
    }
    EXPECT_EQ(qz::to_text(acl_of("u HBA2 A@B wr # why\n"))->view(), "u hba2 A@B rw\n");
    EXPECT_EQ(qz::from_text("o r\nx y\n").code(), SEC_S_BAD_ACL);
    EXPECT_EQ(recorded_error(), error_of(SEC_S_BAD_ACL, msg::bad_type_token, 2, "x"));
}

TEST(service, texts_are_read_in_a_thread_that_is_cancelled) {
    std::size_t entry_count = 0;
    run_cancelled([&] {
        const auto entries = qz::from_text(service_text)->list();
        entry_count = entries->size();
    });
    EXPECT_EQ(entry_count, acl_of(service_text).list()->size());
}

// In a service without standard streams, output of other threads does not become part of a text.
TEST(service, texts_are_in_no_file_of_a_standard_stream) {
    const int status = status_of_child([] {
        for (const int stream : {STDIN_FILENO, STDOUT_FILENO, STDERR_FILENO})
            close(stream);
        const qz::detail::descriptor file(qz::detail::make_memory_file());
        const bool are_free = fcntl(STDIN_FILENO, F_GETFD) < 0 && fcntl(STDERR_FILENO, F_GETFD) < 0;
        _exit(file.number() > STDERR_FILENO && are_free ? 0 : 1);
    });
    EXPECT_EQ(status, 0);
}

TEST(service, no_text_holds_what_no_line_can) {
    const std::string longest(1091, 'n');
    const std::tuple<std::string, std::uint32_t, int> groups[] = {
        {"a b", 1, SEC_S_BAD_ACLE},    {"#a", 1, SEC_S_BAD_ACLE},
        {"a#", 1, SEC_S_OK},           {"", 1, SEC_S_BAD_ACLE},
        {longest, 1, SEC_S_OK},        {longest + "n", 1, SEC_S_BAD_ACLE},
        {longest + "nn", 0, SEC_S_OK}, {"a", 0x80000000, SEC_S_BAD_PERMISSION},
    };
    // Bytes from elsewhere may hold entries that cannot be added.
    const auto code_of_text = [](const std::string &subacl) {
        const std::string bytes = acl_of_one(subacl);
        return qz::to_text(*qz::acl::from_bytes(bytes.data(), bytes.size())).code();
    };
    for (const auto &[name, mask, code] : groups) {
        const std::string entries = packed_entry(mask, text_field(name));
        EXPECT_EQ(code_of_text(packed_subacl(SEC_ACLE_GROUP, "", 1, entries)), code) << name;
    }
    EXPECT_EQ(code_of_text(subacl_bytes("u #m: al 1")), SEC_S_BAD_ACLE);
    // A service's own set with the same letter for two bits.
    const sec_perm_template_t shared[] = {{1, 'a', "", ""}, {2, 'a', "", ""}};
    const sec_perm_set_t set = {2, shared};
    EXPECT_EQ(qz::to_text(acl_of("o w\n"), &set).code(), SEC_S_BAD_ACLE);
}

TEST(service, same_sees_what_decides) {
    const std::tuple<const char *, const char *, bool> rows[] = {
        {"", "# nobody\n", true},
        {"u unix a@h r\nu unix b@h w\no\n", "o\nU UNIX B@h w\nu unix A@H r\n", true},
        {"e unix .x r\ne unix .y r\n", "e unix .y r\ne unix .x r\n", false},
        {"e unix .x r\ne hba2 .y r\n", "e hba2 .y r\ne unix .x r\n", true},
        {"u unix a@h r\n", "u unix a@h rw\n", false},
        {"u unix a@h r\n", "e unix a@h r\n", false},
        {"u unix a@h r\n", "u hba2 a@h r\n", false},
        {"o\n", "", false},
    };
    for (const auto &[a, b, is_same] : rows)
        EXPECT_EQ(*qz::same(acl_of(a), acl_of(b)), is_same) << a << "and\n" << b;
    EXPECT_TRUE(*qz::same(*qz::acl::create_empty(), qz::acl()));
}

// ---- Files that change ----

struct live_acl : testing::Test {
    const temporary_folder folder;
    const std::string path = folder / "live.acl";
    qz::live_acl live{path.c_str()};
};

std::uint32_t granted_to_others(const qz::live_acl &live) {
    return qz::granted(live.snapshot(), requester::user("unix", "al@h")).permissions();
}

void expect_refresh(qz::live_acl &live, int code, bool is_new) {
    const auto outcome = live.refresh();
    EXPECT_EQ(outcome.code(), code);
    EXPECT_EQ(*outcome, is_new);
    EXPECT_EQ(live.code(), code);
    EXPECT_EQ(qz::error::current().code(), code); // a failure says what is wrong
}

TEST_F(live_acl, keeps_the_last_good_one) {
    expect_refresh(live, SEC_S_FILE_ERROR, false);
    EXPECT_FALSE(live.snapshot());
    write_file(path, "o r\n");
    expect_refresh(live, SEC_S_OK, true);
    write_file(path, "# the same\no r\n");
    expect_refresh(live, SEC_S_OK, false);
    write_file(path, "o rw\nx\n");
    expect_refresh(live, SEC_S_BAD_ACL, false);
    expect_refresh(live, SEC_S_BAD_ACL, false); // as long as it is so
    EXPECT_EQ(granted_to_others(live), 1u);
    const auto answer = qz::decide(live.snapshot(), requester::user("unix", "al@h"), 1);
    write_file(path, "");
    expect_refresh(live, SEC_S_OK, true);
    EXPECT_EQ(granted_to_others(live), 0u);
    EXPECT_TRUE(answer->explain()->view().starts_with("user: no entry")); // of the ACL that it keeps
    std::filesystem::remove(path);
    expect_refresh(live, SEC_S_FILE_ERROR, false);
}

TEST_F(live_acl, trusts_times_that_are_behind) {
    // When the file changed, when it was read, and whether the time of a later change must differ.
    const std::tuple<const char *, timespec, timespec, bool> rows[] = {
        {"within a tick of the clock", {100, 5'000'000}, {100, 24'000'000}, false},
        {"after it", {100, 5'000'000}, {100, 26'000'000}, true},
        {"in the next second", {100, 990'000'000}, {101, 9'000'000}, false},
        {"a file system of whole seconds", {100, 0}, {101, 900'000'000}, false},
        {"after those", {100, 0}, {102, 100'000'000}, true},
        {"the clock was set back a little", {100, 5'000'000}, {99, 999'000'000}, false},
        {"the clock was set back far", {1000, 5'000'000}, {100, 0}, true},
    };
    for (const auto &[what, changed, now, is_settled] : rows) {
        qz::detail::file_stamp stamp;
        stamp.changed = changed;
        EXPECT_EQ(stamp.is_settled(now), is_settled) << what;
    }
}

TEST_F(live_acl, looks_at_a_file_again_that_had_settled) {
    for (const char *text : {"o r\n", "o w\n", "o x\n"}) {
        write_file(path, text);
        std::this_thread::sleep_for(std::chrono::milliseconds(50));
        expect_refresh(live, SEC_S_OK, true);
        expect_refresh(live, SEC_S_OK, false);
    }
}

TEST_F(live_acl, reads_foreign_caches_only_when_told) {
    write_file(path, "o r\n", 60);
    write_file(path + ".cacl", acl_bytes("o: 2"));
    qz::live_acl from_cache(path.c_str(), qz::default_permissions);
    expect_refresh(live, SEC_S_OK, true);
    expect_refresh(from_cache, SEC_S_OK, true);
    EXPECT_EQ(granted_to_others(live), 1u);
    EXPECT_EQ(granted_to_others(from_cache), 2u);
}

TEST_F(live_acl, is_shared_by_threads) {
    const std::string next = folder / "next.acl";
    write_file(path, "o r\n");
    expect_refresh(live, SEC_S_OK, true);
    std::atomic<bool> is_done = false;
    const auto use = [&] {
        while (!is_done) {
            EXPECT_EQ(live.refresh().code(), SEC_S_OK);
            const std::uint32_t granted = granted_to_others(live);
            EXPECT_TRUE(granted == 1 || granted == 2);
        }
    };
    std::vector<std::jthread> threads;
    for (int count = 0; count < 4; ++count)
        threads.emplace_back(use);
    for (int round = 0; round < (QZ_SANITIZED ? 50 : 300); ++round) {
        write_file(next, round % 2 == 0 ? "o w\n" : "o r\n");
        std::filesystem::rename(next, path);
    }
    is_done = true;
    threads.clear();
    EXPECT_EQ(live.refresh().code(), SEC_S_OK);
    EXPECT_EQ(granted_to_others(live), 1u);
}

// Another thread nearly always holds a lock when the child is made.
TEST_F(live_acl, goes_on_in_the_child_of_a_fork) {
    if (QZ_SANITIZED)
        GTEST_SKIP() << "the allocators of sanitizers have locks that a fork leaves held";
    write_file(path, "o r\n");
    expect_refresh(live, SEC_S_OK, true);
    std::atomic<bool> is_done = false;
    std::jthread refreshing([&] {
        for (int round = 0; !is_done; ++round) {
            write_file(path, round % 2 == 0 ? "o w\n" : "o r\n");
            EXPECT_EQ(live.refresh().code(), SEC_S_OK);
        }
    });
    const auto go_on = [&] {
        alarm(10);
        const bool is_held = static_cast<bool>(live.snapshot());
        _exit(is_held && live.refresh().code() != SEC_S_NO_MEMORY && live.snapshot() ? 0 : 1);
    };
    int status = 0;
    for (int left = 20; left != 0 && status == 0; --left)
        status = status_of_child(go_on);
    is_done = true;
    EXPECT_EQ(status, 0);
}

} // namespace
