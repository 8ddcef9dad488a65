// The service of service.c in C++, which service.hpp makes shorter: the same rules, the same output.
//
// usage: service_cpp ACL-FILE USER@HOST [GROUP...]
#include <qz/service.hpp>

#include <clocale>
#include <cstdio>
#include <vector>

namespace {

constexpr char mechanism[] = "unix";

// Prints why the last operation failed.
int failed(const char *what) {
    std::fprintf(stderr, "%s: %s", what, qz::error::current().text().data());
    return 1;
}

// The most specific match decides: the user, else the user's domain, else the groups together, else any other.
int decide(const qz::acl &acl, const char *user, const std::vector<sec_group_ref_t> &groups) {
    const auto answer = qz::decide(acl, qz::requester::user(mechanism, user).in_groups(groups), 0);
    const auto letters = qz::to_letters(answer->granted());
    if (!answer || !letters)
        return failed("decision");
    if (answer->decided_by() == qz::who::nobody)
        std::puts("nothing is granted");
    else
        std::printf("granted by %s: %s\n", qz::name_of(answer->decided_by()).data(),
                    letters->view().empty() ? "nothing" : letters->c_str());
    return 0;
}

// Adds an entry for a user who has none, asks again, and deletes it. Only the ACL in memory changes.
int edit(qz::acl &acl, const char *user) {
    const auto entry = qz::acl_entry::create(SEC_ACLE_USER, *qz::to_mask("r"), mechanism, user);
    const int added = entry ? acl.add_new(*entry) : entry.code();
    if (added == SEC_S_BAD_ACLE) {
        std::puts("has an entry of its own, which stays");
        return 0;
    }
    if (added != SEC_S_OK)
        return failed("edit");
    const int status = decide(acl, user, {});
    if (acl.remove(*entry) != SEC_S_OK)
        return failed("edit");
    std::puts("deleted again");
    return status;
}

} // namespace

int main(int argc, char **argv) {
    std::setlocale(LC_ALL, ""); // before the library first converts a name or fetches a message
    if (argc < 3) {
        std::fputs("usage: service_cpp ACL-FILE USER@HOST [GROUP...]\n", stderr);
        return 2;
    }
    std::vector<sec_group_ref_t> groups;
    for (int at = 3; at < argc; ++at)
        groups.push_back({0, argv[at]});
    if (sec__register_id_handler(SEC_ID_HANDLER_EXPANDED, mechanism, qz::domain_handler) != SEC_S_OK)
        return failed("handler");
    std::uint32_t flags = SEC_READ_ACL_CONVERT | SEC_READ_ACL_CACHE;
    auto acl = qz::acl::read_file(argv[1], nullptr, nullptr, flags, &flags);
    if (!acl)
        return failed(argv[1]);
    // An empty file has no cache and sets no flag.
    const char *source = acl->bytes().empty() || (flags & SEC_READ_ACL_TEXT) != 0 ? "text" : "cache";
    std::printf("read from the %s, %zu bytes%s\n", source, acl->bytes().size(),
                (flags & SEC_READ_ACL_CACHE) != 0 ? ", cached" : "");
    const int status = decide(*acl, argv[2], groups);
    return status == 0 ? edit(*acl, argv[2]) : status;
}
