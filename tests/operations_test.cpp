// Every public operation, as a service that uses all of the library would call it: once, so that trace_test can
// read what that leaves, and from many threads at once.
#include "support.h"
#include <thread>

namespace {

using namespace support;

int prefix_matches(const char *requested, const char *entry) {
    return std::strncmp(requested, entry, std::strlen(entry));
}

// The code that an operation recorded, behind which lies one that has nothing to do with the next.
std::string end() {
    const int code = recorded_error().code;
    cu_set_error_1(99, 0, "none.cat", 1, 1, "stale");
    return " (" + std::to_string(code) + ")\n";
}

// What one round through the operations came to. Each thread has files and buffers of its own, and shares one.
std::string use_all(const std::string &path, const sec_acl_buffer_t &shared) {
    std::ostringstream found;
    std::uint32_t mask = 0, flags = SEC_READ_ACL_CONVERT | SEC_READ_ACL_CACHE;
    sec_acl_buffer_t acl = {}, copy = {}, empty = {};
    found << sec_read_acl_file(path.c_str(), nullptr, nullptr, flags, &acl, &flags) << ' ' << acl.length << end();
    sec_release_acl(&acl);
    found << sec_read_acl_file(path.c_str(), nullptr, nullptr, SEC_READ_ACL_CONVERT, &acl, nullptr) << ' ' << acl.length
          << end();
    found << sec_read_acl_from_data(acl.length, acl.data, &copy) << end();
    found << sec_convert_acl_to_host(1, &copy) << end();
    found << sec_create_empty_acl(&empty) << ' ' << empty.length << end();
    found << sec_release_acl(&empty) << end();

    char letters[33] = "";
    found << sec_translate_perms("wr", nullptr, &mask) << ' ' << mask << end();
    found << sec_translate_bitmask(mask, nullptr, letters) << ' ' << letters << end();
    sec_acle_t *entry = nullptr;
    char *mechanism = nullptr, *identity = nullptr;
    found << sec_create_acle(SEC_ACLE_USER, mask, "kRb", "Bob", &entry) << end();
    found << sec_display_acle_id(entry, &mechanism, &identity) << ' ' << mechanism << ' ' << identity << end();
    std::free(mechanism);
    std::free(identity);
    found << sec_add_acle_to_acl(entry, &copy) << ' ' << copy.length << end();
    found << sec_add_acle_to_acl(entry, &copy) << ' ' << copy.length << end();
    found << sec_add_acle_to_acl2(entry, &copy) << ' ' << copy.length << end();
    sec_aclelist_t list = {};
    found << sec_list_acl(&copy, &list) << ' ' << list.count << end();
    sec_release_aclelist(&list);
    found << sec_list_acl_by_type(&copy, SEC_ACLE_USER, "krb", &list) << ' ' << list.count << ' '
          << (list.count ? list.acles[0]->identity : "") << end();
    sec_release_aclelist(&list);
    found << sec_del_acle_from_acl(entry, &copy) << ' ' << copy.length << end();
    sec_release_acle(entry);

    found << sec__register_id_handler(SEC_ID_HANDLER_EXPANDED, "kRb5", prefix_matches) << end();
    found << sec__single_acle_perm(&shared, SEC_ACLE_USER, "unix", nullptr, "AL", &mask) << ' ' << mask << end();
    found << sec__single_acle_perm(&shared, SEC_ACLE_EXPANDED, "krb5", nullptr, "apple", &mask) << ' ' << mask << end();
    found << sec__single_acle_perm(&shared, SEC_ACLE_USER, "unix", nullptr, "nobody", &mask) << ' ' << mask << end();
    const sec_group_ref_t groups[] = {{1, "STAFF"}, {2, "admins"}, {3, "none"}};
    found << sec__group_acles_perm(&shared, 3, groups, &mask) << ' ' << mask << end();
    sec_release_acl(&copy);
    sec_release_acl(&acl);
    return found.str();
}

// As a thread of a service would see it that is alone. Some operations leave an earlier error.
const std::string expected =
    "0 75 (0)\n0 75 (0)\n0 (0)\n0 (0)\n0 5 (99)\n0 (0)\n0 3 (99)\n0 rw (99)\n0 (0)\n0 kRb Bob (0)\n0 100 (0)\n"
    "0 100 (0)\n43 100 (43)\n0 4 (0)\n0 1 Bob (0)\n0 75 (0)\n0 (0)\n0 1 (0)\n0 5 (0)\n43 0 (43)\n0 19 (0)\n";

struct operations : testing::Test {
    std::string written(const std::string &name) const {
        write_file(folder / name, "n r\nu unix alice@h rw\ng staff q\n");
        return folder / name;
    }
    const temporary_folder folder;
    const buffer shared{rich};
};

TEST_F(operations, answer_alike_in_every_thread) {
    const std::string paths[] = {written("a"), written("b"), written("c")};
    std::vector<std::thread> threads;
    std::vector<int> agreed(8);
    for (std::size_t index = 0; index < agreed.size(); ++index)
        threads.emplace_back([&, index] {
            for (int round = 0; round < 30; ++round) agreed[index] += use_all(paths[index % 3], shared.acl) == expected;
        });
    for (std::thread &thread : threads) thread.join();
    EXPECT_EQ(agreed, std::vector<int>(8, 30));
}

struct cancelled_use {
    std::string path;
    const sec_acl_buffer_t *shared = nullptr;
    std::string found = {};
};

void *use_all_when_cancelled(void *given) {
    auto &use = *static_cast<cancelled_use *>(given);
    pthread_cancel(pthread_self());
    const std::string found = use_all(use.path, *use.shared);
    sec__dump_acl(use.shared);
    use.found = found;
    pthread_testcancel(); // the first point at which the thread ends
    return nullptr;
}

TEST_F(operations, finish_in_a_thread_that_is_cancelled) {
    cancelled_use use{written("acl"), &shared.acl};
    void *ended = nullptr;
    testing::internal::CaptureStderr();
    pthread_t thread = {};
    ASSERT_EQ(pthread_create(&thread, nullptr, use_all_when_cancelled, &use), 0);
    pthread_join(thread, &ended);
    EXPECT_NE(testing::internal::GetCapturedStderr(), "");
    EXPECT_EQ(use.found, expected);
    EXPECT_EQ(ended, PTHREAD_CANCELED);
}

TEST_F(operations, answer_once) { EXPECT_EQ(use_all(written("acl"), shared.acl), expected); }

} // namespace
