// Every public operation, as a service that uses all of the library would call it: once, so that trace_test can
// read what that leaves, and from many threads at once.
#include "support.h"
#include <thread>

namespace {

using namespace support;

int prefix_matches(const char *requested, const char *entry) {
    return std::strncmp(requested, entry, std::strlen(entry));
}

// The code that an operation recorded. Then records an error that must not affect the next operation.
std::string end() {
    const int code = recorded_error().code;
    cu_set_error_1(SEC_S_WARNING, 0, "none.cat", 1, 1, "stale");
    return " (" + std::to_string(code) + ")\n";
}

std::string edit_and_list(sec_acl_buffer_t &acl) {
    std::ostringstream found;
    sec_acle_t *entry = nullptr;
    char *mechanism = nullptr;
    char *identity = nullptr;
    sec_aclelist_t list = {};
    found << "create: " << sec_create_acle(SEC_ACLE_USER, 3, "kRb", "Bob", &entry) << end();
    found << "display: " << sec_display_acle_id(entry, &mechanism, &identity);
    found << ' ' << mechanism << ' ' << identity << end();
    std::free(mechanism);
    std::free(identity);
    found << "add: " << sec_add_acle_to_acl(entry, &acl) << ' ' << acl.length << end();
    found << "replace: " << sec_add_acle_to_acl(entry, &acl) << ' ' << acl.length << end();
    found << "add new: " << sec_add_acle_to_acl2(entry, &acl) << ' ' << acl.length << end();
    found << "list: " << sec_list_acl(&acl, &list) << ' ' << list.count << end();
    sec_release_aclelist(&list);
    found << "list users: " << sec_list_acl_by_type(&acl, SEC_ACLE_USER, "krb", &list) << ' ' << list.count
          << end();
    sec_release_aclelist(&list);
    found << "delete: " << sec_del_acle_from_acl(entry, &acl) << ' ' << acl.length << end();
    sec_release_acle(entry);
    return found.str();
}

std::string decide(const sec_acl_buffer_t &acl) {
    std::ostringstream found;
    std::uint32_t mask = 0;
    const sec_group_ref_t groups[] = {{1, "STAFF"}, {2, "admins"}, {3, "none"}};
    const auto single = [&](std::uint8_t type, const char *mechanism, const char *identity) {
        found << sec__single_acle_perm(&acl, type, mechanism, nullptr, identity, &mask) << ' ' << mask
              << end();
    };
    found << "register: " << sec__register_id_handler(SEC_ID_HANDLER_EXPANDED, "kRb5", prefix_matches)
          << end();
    single(SEC_ACLE_USER, "unix", "AL");
    single(SEC_ACLE_EXPANDED, "krb5", "apple");
    single(SEC_ACLE_USER, "unix", "nobody");
    found << "groups: " << sec__group_acles_perm(&acl, 3, groups, &mask) << ' ' << mask << end();
    return found.str();
}

// The results of one round through the operations. Each thread has its own files and buffers, except for one shared
// buffer.
std::string use_all(const std::string &path, const sec_acl_buffer_t &shared) {
    std::ostringstream found;
    std::uint32_t mask = 0;
    char letters[33] = "";
    sec_acl_buffer_t acl = {};
    sec_acl_buffer_t copy = {};
    sec_acl_buffer_t empty = {};
    const auto read = [&](unsigned flags) {
        found << "read: " << sec_read_acl_file(path.c_str(), nullptr, nullptr, flags, &acl, &flags);
        found << ' ' << acl.length << end();
    };
    read(SEC_READ_ACL_CONVERT | SEC_READ_ACL_CACHE);
    sec_release_acl(&acl);
    read(SEC_READ_ACL_CONVERT);
    found << "copy: " << sec_read_acl_from_data(acl.length, acl.data, &copy) << end();
    found << "convert: " << sec_convert_acl_to_host(with_check, &copy) << end();
    found << "create empty: " << sec_create_empty_acl(&empty) << ' ' << empty.length << end();
    found << "release: " << sec_release_acl(&empty) << end();
    found << "to a mask: " << sec_translate_perms("wr", nullptr, &mask) << ' ' << mask << end();
    found << "to letters: " << sec_translate_bitmask(mask, nullptr, letters) << ' ' << letters << end();
    found << edit_and_list(copy);
    found << decide(shared);
    sec_release_acl(&copy);
    sec_release_acl(&acl);
    return found.str();
}

// As a thread of a service would see it that is alone. Some operations leave an earlier error.
const std::string expected =
    "read: 0 75 (0)\nread: 0 75 (0)\ncopy: 0 (0)\nconvert: 0 (0)\n"
    "create empty: 0 5 (99)\nrelease: 0 (0)\nto a mask: 0 3 (99)\nto letters: 0 rw (99)\n"
    "create: 0 (0)\ndisplay: 0 kRb Bob (0)\nadd: 0 100 (0)\nreplace: 0 100 (0)\n"
    "add new: 43 100 (43)\nlist: 0 4 (0)\nlist users: 0 1 (0)\ndelete: 0 75 (0)\n"
    "register: 0 (0)\n0 1 (0)\n0 5 (0)\n43 0 (43)\ngroups: 0 19 (0)\n";

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
    std::vector<std::jthread> threads;
    for (std::size_t index = 0; index < 8; ++index)
        threads.emplace_back([&, index] {
            for (int round = 0; round < 30; ++round)
                EXPECT_EQ(use_all(paths[index % 3], shared.acl), expected);
        });
}

TEST_F(operations, finish_in_a_thread_that_is_cancelled) {
    const std::string path = written("acl");
    std::string found;
    testing::internal::CaptureStderr();
    run_cancelled([&] {
        const std::string result = use_all(path, shared.acl);
        sec__dump_acl(&shared.acl);
        found = result;
    });
    EXPECT_NE(testing::internal::GetCapturedStderr(), "");
    EXPECT_EQ(found, expected);
}

TEST_F(operations, answer_once) { EXPECT_EQ(use_all(written("acl"), shared.acl), expected); }

} // namespace
