// Tests of service.hpp: decisions against cases and against the questions of the C interface, texts, and files that
// change while they are followed.
#include "support.h"

#include <atomic>
#include <qz/service.hpp>
#include <sys/stat.h>
#include <thread>

namespace {

using namespace support;
using qz::order;
using qz::requester;
using qz::who;

const std::string folder_of_examples = QZ_SOURCE "/examples/";
const std::string service_text = read_file(folder_of_examples + "service.acl");
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

// Borrows the names.
std::vector<sec_group_ref_t> references(const arguments &names) {
    std::vector<sec_group_ref_t> made;
    for (const std::string &name : names)
        made.push_back({0, name.c_str()});
    return made;
}

std::string explanation(const qz::acl &acl, const requester &whom, const char *wanted, order taken) {
    const auto answer = qz::decide(acl, whom, *qz::to_mask(wanted), taken);
    EXPECT_EQ(answer.code(), SEC_S_OK);
    return std::string(answer->explain()->view());
}

// ---- Decisions ----

struct access_case {
    std::string mechanism, identity, letters, expected;
    arguments groups;
};

// A line of a file of cases; one without words gives no mechanism.
access_case case_of(const std::string &line) {
    arguments parts = words(line.substr(0, line.find('#')));
    if (parts.empty())
        return {};
    access_case made{parts[0], parts[1], parts.end()[-2], parts.end()[-1]};
    for (std::size_t at = 2; at + 2 < parts.size(); ++at)
        made.groups.push_back(parts[at].substr(1));
    return made;
}

void expect_cases(const std::string &path, order taken) {
    const qz::acl acl = acl_of(service_text);
    std::istringstream lines(read_file(path));
    int count = 0;
    for (std::string line; std::getline(lines, line);) {
        const access_case read = case_of(line);
        if (read.mechanism.empty())
            continue;
        ++count;
        const auto groups = references(read.groups);
        const requester user =
            requester::user(read.mechanism.c_str(), read.identity.c_str()).in_groups(groups);
        const requester whom = read.mechanism == "-" ? requester::unauthenticated() : user;
        const std::uint32_t wanted = *qz::to_mask(read.letters.c_str());
        const auto answer = qz::decide(acl, whom, wanted, taken);
        EXPECT_EQ(answer->allowed() ? "yes" : "no", read.expected) << line << "\n"
                                                                   << answer->explain()->view();
        EXPECT_EQ(qz::granted(acl, whom, taken).grants(wanted), answer->allowed()) << line;
    }
    EXPECT_GT(count, 5);
}

TEST(service, grants_what_the_cases_say) {
    expect_cases(folder_of_examples + "service.cases", order::closest);
    expect_cases(QZ_SOURCE "/tests/service_sum.cases", order::sum);
}

TEST(service, explains_itself) {
    const qz::acl acl = acl_of("u unix Al@h.x r\ne unix .y w\ne unix .X w\ng Ops x\ng all w\no\n");
    const arguments names = {"ops", "none", "ALL"};
    const auto groups = references(names);
    const requester al = requester::user("UNIX", "al@H.x").in_groups(groups);
    EXPECT_EQ(explanation(acl, al, "rw", order::closest), "user: u unix Al@h.x r (decides)\n"
                                                          "expanded: e unix .X w\n"
                                                          "group: g Ops x\n"
                                                          "group none: no entry\n"
                                                          "group: g all w\n"
                                                          "any other: o\n"
                                                          "granted: r\n"
                                                          "wanted rw: no\n");
    EXPECT_EQ(explanation(acl, al, "rw", order::sum), "user: u unix Al@h.x r (decides)\n"
                                                      "expanded: e unix .X w (decides)\n"
                                                      "group: g Ops x (decides)\n"
                                                      "group none: no entry\n"
                                                      "group: g all w (decides)\n"
                                                      "any other: o (decides)\n"
                                                      "granted: rwx\n"
                                                      "wanted rw: yes\n");
    EXPECT_EQ(explanation(acl, requester::unauthenticated(), "r", order::sum), "unauthenticated: no entry\n"
                                                                               "granted:\n"
                                                                               "wanted r: no\n");
    const auto answer = qz::decide(acl, al, 0);
    arguments lines;
    const auto write = [&](std::string_view line) { lines.emplace_back(line); };
    const auto place = [](const qz::party_answer &said) {
        return "site.acl:" + std::to_string(said.entry.type);
    };
    EXPECT_EQ(answer->explain(write, place), SEC_S_OK);
    EXPECT_EQ(lines.front(), "user: site.acl:4: u unix Al@h.x r (decides)\n");
    EXPECT_FALSE(answer->allowed()); // nothing was wanted
    const sec_perm_set_t none = {0, nullptr};
    lines.clear();
    EXPECT_EQ(answer->explain(write, place, &none), SEC_S_BAD_PERMISSION);
    EXPECT_TRUE(lines.empty());
}

// What the questions of the C interface answer, combined by hand: the mask and who decided.
std::pair<std::uint32_t, who> by_hand(const qz::acl &acl, const std::string &mechanism,
                                      const std::string &identity, const std::vector<sec_group_ref_t> &groups,
                                      order taken) {
    std::uint32_t sum = 0;
    bool is_found = false;
    for (const who each : {who::user, who::expanded, who::group, who::any_other}) {
        const std::uint8_t type = each == who::user ? 4 : each == who::expanded ? 8 : 2;
        const auto count = static_cast<std::int32_t>(groups.size());
        std::uint32_t mask = 0;
        const int code = each == who::group ? sec__group_acles_perm(acl.get(), count, groups.data(), &mask)
                                            : sec__single_acle_perm(acl.get(), type, mechanism.c_str(),
                                                                    nullptr, identity.c_str(), &mask);
        if (code != SEC_S_OK || (each == who::group && groups.empty()))
            continue;
        if (taken == order::closest)
            return {mask, each};
        is_found = true;
        sum |= mask;
    }
    return {sum, is_found ? who::sum : who::nobody};
}

// ACLs and parties of few words, so that they meet.
class generator {
public:
    explicit generator(unsigned seed) : random_(seed) {}

    std::size_t below(std::size_t limit) { return random_() % limit; }
    std::string any_of(const arguments &words) { return words[below(words.size())]; }
    std::string mechanism() { return any_of({"unix", "hba2", "krb5", "none"}); }
    std::string identity() {
        return any_of({"al", "Al", "bob", "carol"}) + any_of({"", "@"}) + any_of({"h.x", "H.x", "k.y", "x"});
    }
    arguments groups() {
        arguments made(random_() % 4);
        for (std::string &each : made)
            each = any_of({"ops", "OPS", "audit", "staff"});
        return made;
    }
    qz::acl acl() {
        qz::acl made = *qz::acl::create_empty();
        for (auto left = random_() % 24; left != 0; --left) {
            const auto type = static_cast<std::uint8_t>(1u << random_() % 5);
            const std::string name = type == 16  ? any_of({"ops", "audit", "staff"})
                                     : type == 8 ? any_of({".x", "h.x", "k.y", ".Y", "al@h.x", "X"})
                                                 : identity();
            const sec_acle_t added =
                entry(type, mechanism(), type < 4 ? nullptr : name.c_str(), random_() % 8192);
            EXPECT_EQ(made.add(added), SEC_S_OK);
        }
        return made;
    }

private:
    std::mt19937 random_;
};

// Each answer's entry is one of the list, and its permissions are those of the question about it alone.
void expect_entries_of(const qz::acl &acl, const qz::answer &answer) {
    const auto listed = acl.list();
    for (const qz::party_answer &said : answer) {
        if (!said.has_entry())
            continue;
        const bool is_listed = std::any_of(listed->begin(), listed->end(), [&](qz::entry_view entry) {
            return entry.type() == said.entry.type && entry.mechanism() == said.entry.mechanism &&
                   entry.identity() == said.entry.identity && entry.permissions() == said.entry.permissions;
        });
        EXPECT_TRUE(is_listed) << said.entry.identity;
    }
}

TEST(service, decides_as_the_questions_of_the_c_interface_do) {
    generator random(20261125);
    for (int round = 0; round < (QZ_SANITIZED ? 500 : 5000); ++round) {
        const qz::acl acl = random.acl();
        const std::string mechanism = random.mechanism(), identity = random.identity();
        const arguments names = random.groups();
        const auto groups = references(names);
        const requester whom = requester::user(mechanism.c_str(), identity.c_str()).in_groups(groups);
        for (const order taken : {order::closest, order::sum}) {
            const auto [mask, by] = by_hand(acl, mechanism, identity, groups, taken);
            const auto answer = qz::decide(acl, whom, 1, taken);
            ASSERT_EQ(answer.code(), SEC_S_OK);
            EXPECT_EQ(answer->granted(), mask) << answer->explain()->view();
            EXPECT_EQ(answer->decided_by(), by) << answer->explain()->view();
            EXPECT_EQ(qz::granted(acl, whom, taken).permissions(), mask);
            expect_entries_of(acl, *answer);
        }
    }
}

TEST(service, stays_within_bytes_that_are_no_acl) {
    generator random(7);
    for (int round = 0; round < 3000; ++round) {
        std::string bytes(random.acl().bytes());
        for (auto left = random.below(4); left != 0; --left)
            bytes[random.below(bytes.size())] = static_cast<char>(random.below(256));
        bytes.resize(bytes.size() - random.below(2));
        const auto acl = qz::acl::from_bytes(bytes.data(), bytes.size());
        const arguments names = random.groups();
        const auto groups = references(names);
        const auto answer = qz::decide(*acl, requester::user("unix", "al@h.x").in_groups(groups), 1);
        EXPECT_TRUE(answer || (answer->size() == 0 && answer->granted() == 0));
        EXPECT_TRUE(answer->explain() || answer->explain().code() == SEC_S_BAD_PERMISSION);
        EXPECT_EQ(qz::same(*acl, *acl).code() == SEC_S_OK, acl->list().code() == SEC_S_OK);
        // Further than any decision looks.
        const auto never = [](const qz::entry_fields &entry) { return entry.identity == "nobody"; };
        EXPECT_EQ(qz::detail::find_entry(acl->bytes(), SEC_ACLE_USER, "unix", never).type, 0);
    }
}

TEST(service, handlers_know_hosts) {
    const std::tuple<const char *, const char *, bool, bool> rows[] = {
        // requested, entry, and whether domain and exact match
        {"a@h.x", "h.x", true, false},   {"a@H.X", "h.x", true, false},      {"a@h.x", ".x", true, false},
        {"a@h.x", "x", false, false},    {"a@hx", ".x", false, false},       {"a@.x", ".x", true, false},
        {"h.x", "h.x", false, true},     {"a@b@h.x", "b@h.x", false, false}, {"a@b@h.x", "h.x", true, false},
        {"a@", "", false, false},        {"a@h.x", "", false, false},        {"a@x", ".h.x", false, false},
        {"A@h.x", "a@H.x", false, true}, {"a@h.x.", ".x", false, false},
    };
    for (const auto &[requested, held, by_domain, by_name] : rows) {
        EXPECT_EQ(qz::domain_handler(requested, held) == 0, by_domain) << requested << " " << held;
        EXPECT_EQ(qz::exact_handler(requested, held) == 0, by_name) << requested << " " << held;
    }
}

TEST(service, finds_the_entry_that_a_handler_of_users_accepts) {
    const qz::acl acl = acl_of("u krb5 admin rw\nu krb5 Root x\n");
    const requester root = requester::user("krb5", "root");
    EXPECT_EQ(qz::decide(acl, root, 1)->begin()->entry.identity, "Root");
    const auto through = qz::decide(acl, root.through_handler(), 1);
    EXPECT_EQ(through->begin()->entry.identity, "admin");
    EXPECT_EQ(through->granted(), 3u);
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
    EXPECT_EQ(qz::error::current().text().substr(0, 8), "3417-179");
}

TEST(service, no_text_holds_what_no_line_can) {
    const std::string long_name(1092, 'n'), longer_name(1093, 'n');
    const std::tuple<std::uint8_t, const char *, const char *, std::uint32_t, int> rows[] = {
        {16, "", "a b", 1, 43},
        {16, "", "#a", 1, 43},
        {16, "", "a#", 1, 0},
        {4, "a\tb", "al", 1, 43},
        {4, "#m", "al", 1, 43},
        {16, "", "", 1, 43},
        {16, "", long_name.c_str(), 1, 43},
        {16, "", "a", 0x80000000, 36},
        {16, "", long_name.c_str() + 1, 1, 0},
        {16, "", longer_name.c_str(), 0, 0},
    };
    for (const auto &[type, mechanism, identity, mask, code] : rows) {
        // Bytes from elsewhere may hold what cannot be added.
        const std::string field = type == 4 ? text_field(mechanism) : "";
        const std::string bytes =
            acl_of_one(packed_subacl(type, field, 1, packed_entry(mask, text_field(identity))));
        const auto acl = qz::acl::from_bytes(bytes.data(), bytes.size());
        EXPECT_EQ(qz::to_text(*acl).code(), code) << std::string_view(identity).substr(0, 8);
    }
    // A set of a service's own, whose letters do not tell all bits apart.
    const sec_perm_template_t shared[] = {{1, 'a', "", ""}, {2, 'a', "", ""}};
    const sec_perm_set_t set = {2, shared};
    qz::acl acl;
    ASSERT_EQ(acl.add(entry(2, "", nullptr, 2)), SEC_S_OK);
    EXPECT_EQ(qz::to_text(acl, &set).code(), SEC_S_BAD_ACLE);
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

TEST(service, identities_are_asked_in_their_stored_form) {
    const std::tuple<const char *, const char *, const char *> rows[] = {
        {"unix", "a@FE80::0:1", "a@fe80::1"},
        {"HBA2", "a@::FFFF:102:304", "a@::ffff:1.2.3.4"},
        {"krb5", "a@FE80::0:1", "a@FE80::0:1"},
        {"unix", "FE80::0:1", "FE80::0:1"},
        {"unix", "A@H", "A@H"},
    };
    for (const auto &[mechanism, given, stored] : rows) {
        qz::text kept;
        EXPECT_STREQ(qz::stored_identity(mechanism, given, kept), stored);
    }
}

// ---- Files that change ----

std::uint32_t granted_to_others(const qz::live_acl &live) {
    return qz::granted(live.snapshot(), requester::user("unix", "al@h")).permissions();
}

// Refreshes, and tells the code and whether there is a new snapshot.
std::pair<int, bool> refreshed(qz::live_acl &live) {
    const auto outcome = live.refresh();
    EXPECT_EQ(live.code(), outcome.code());
    EXPECT_EQ(qz::error::current().code(), outcome.code()); // a failure says what is wrong
    return {outcome.code(), *outcome};
}

TEST(live_acl, keeps_the_last_good_one) {
    const temporary_folder dir;
    const std::string path = dir / "live.acl";
    qz::live_acl live(path.c_str());
    EXPECT_EQ(refreshed(live), std::pair(SEC_S_FILE_ERROR, false));
    EXPECT_FALSE(live.snapshot());
    write_file(path, "o r\n");
    EXPECT_EQ(refreshed(live), std::pair(SEC_S_OK, true));
    write_file(path, "# the same\no r\n");
    EXPECT_EQ(refreshed(live), std::pair(SEC_S_OK, false));
    write_file(path, "o rw\nx\n");
    EXPECT_EQ(refreshed(live), std::pair(SEC_S_BAD_ACL, false));
    EXPECT_EQ(refreshed(live), std::pair(SEC_S_BAD_ACL, false)); // as long as it is so
    EXPECT_EQ(granted_to_others(live), 1u);
    const auto answer = qz::decide(live.snapshot(), requester::user("unix", "al@h"), 1);
    write_file(path, "");
    EXPECT_EQ(refreshed(live), std::pair(SEC_S_OK, true));
    EXPECT_EQ(granted_to_others(live), 0u);
    EXPECT_EQ(answer->explain()->view().substr(0, 14), "user: no entry"); // of the ACL that it keeps
    std::filesystem::remove(path);
    EXPECT_EQ(refreshed(live), std::pair(SEC_S_FILE_ERROR, false));
}

TEST(live_acl, trusts_times_that_are_behind) {
    const std::tuple<timespec, timespec, bool> rows[] = {
        // when the file changed, the clock before it was read, and whether the time of a later change must differ
        {{100, 5'000'000}, {100, 5'000'000}, false},
        {{100, 5'000'000}, {100, 24'000'000}, false},
        {{100, 5'000'000}, {100, 26'000'000}, true},
        {{100, 990'000'000}, {101, 9'000'000}, false},
        {{100, 0}, {101, 900'000'000}, false}, // whole seconds
        {{100, 0}, {102, 100'000'000}, true},
        {{100, 5'000'000}, {99, 999'000'000}, false}, // the clock was set back a little
        {{1000, 5'000'000}, {100, 0}, true},          // or far
    };
    for (const auto &[changed, now, is_settled] : rows) {
        qz::detail::file_stamp stamp;
        stamp.changed = changed;
        EXPECT_EQ(stamp.is_settled(now), is_settled)
            << changed.tv_nsec << " " << now.tv_sec << "." << now.tv_nsec;
    }
}

TEST(live_acl, looks_at_a_file_again_that_had_settled) {
    using namespace std::chrono_literals;
    const temporary_folder dir;
    const std::string path = dir / "live.acl";
    qz::live_acl live(path.c_str());
    for (const std::string letter : {"r", "w", "x"}) {
        write_file(path, "o " + letter + "\n");
        std::this_thread::sleep_for(50ms);
        EXPECT_EQ(refreshed(live), std::pair(SEC_S_OK, true));
        EXPECT_EQ(refreshed(live), std::pair(SEC_S_OK, false));
    }
}

TEST(live_acl, reads_foreign_caches_only_when_told) {
    const temporary_folder dir;
    const std::string path = dir / "live.acl", cache = path + ".cacl";
    write_file(path, "o r\n", 60);
    write_file(cache, std::string(acl_of("o w\n").bytes()));
    qz::live_acl text(path.c_str()), cached(path.c_str(), qz::default_permissions);
    EXPECT_EQ(refreshed(text), std::pair(SEC_S_OK, true));
    EXPECT_EQ(refreshed(cached), std::pair(SEC_S_OK, true));
    EXPECT_EQ(granted_to_others(text), 1u);
    EXPECT_EQ(granted_to_others(cached), 2u);
}

TEST(live_acl, is_shared_by_threads) {
    const temporary_folder dir;
    const std::string path = dir / "live.acl", next = dir / "next.acl";
    write_file(path, "o r\n");
    qz::live_acl live(path.c_str());
    ASSERT_EQ(refreshed(live), std::pair(SEC_S_OK, true));
    std::atomic<bool> is_done = false;
    std::vector<std::thread> threads;
    for (int count = 0; count < 4; ++count) {
        threads.emplace_back([&] {
            while (!is_done) {
                EXPECT_EQ(live.refresh().code(), SEC_S_OK);
                const auto answer = qz::decide(live.snapshot(), requester::user("unix", "al@h"), 1);
                EXPECT_TRUE(answer->granted() == 1 || answer->granted() == 2);
            }
        });
    }
    for (int round = 0; round < (QZ_SANITIZED ? 50 : 300); ++round) {
        write_file(next, round % 2 == 0 ? "o w\n" : "o r\n");
        std::filesystem::rename(next, path);
    }
    is_done = true;
    for (std::thread &each : threads)
        each.join();
    EXPECT_EQ(live.refresh().code(), SEC_S_OK);
    EXPECT_EQ(granted_to_others(live), 1u);
}

} // namespace
