// The service of service.c in C++: it decides by the same rules and says the same.
//
// usage: service_cpp ACL-FILE USER@HOST [GROUP...]
#include <qz/acl.hpp>

#include <cstdio>
#include <string_view>
#include <vector>

namespace {

constexpr char mechanism[] = "unix";

// Says why the last operation failed.
int failed(const char *what) {
    std::fprintf(stderr, "%s: %s", what, qz::error::current().text().data());
    return 1;
}

// A user-expanded entry of "unix" names a domain: it stands for everybody whose name ends with it.
int is_in_domain(const char *requested, const char *entry) {
    const std::string_view name = requested, end = entry;
    return name.size() < end.size() || name.substr(name.size() - end.size()) != end;
}

int say(const char *by, qz::decision found) {
    if (found.no_entry()) {
        std::puts("nothing is granted");
        return 0;
    }
    const auto letters = qz::to_letters(found.permissions());
    if (found.failed() || !letters)
        return failed("decision");
    std::printf("granted by %s: %s\n", by, letters->view().empty() ? "nothing" : letters->c_str());
    return 0;
}

// The closest answer wins: what is said about the user, the user's domain, the groups, anybody.
int decide(const qz::acl &acl, const char *user, const std::vector<sec_group_ref_t> &groups) {
    if (acl.bytes().empty()) // a file without entries
        return say("nobody", {SEC_S_BAD_ACLE, 0});
    if (const auto found = acl.single(qz::party::user(mechanism, user)); !found.no_entry())
        return say("user", found);
    if (const auto found = acl.single(qz::party::expanded(mechanism, user)); !found.no_entry())
        return say("domain", found);
    if (const auto found = acl.groups(groups); !groups.empty() && !found.no_entry())
        return say("groups", found);
    return say("any other", acl.single(qz::party::any_other()));
}

// Grants a user without an entry of its own reading, asks again, and takes it back; the file does not change.
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
    if (argc < 3) {
        std::fputs("usage: service_cpp ACL-FILE USER@HOST [GROUP...]\n", stderr);
        return 2;
    }
    std::vector<sec_group_ref_t> groups;
    for (int at = 3; at < argc; ++at)
        groups.push_back({0, argv[at]});
    if (sec__register_id_handler(SEC_ID_HANDLER_EXPANDED, mechanism, is_in_domain) != SEC_S_OK)
        return failed("handler");
    std::uint32_t flags = SEC_READ_ACL_CONVERT | SEC_READ_ACL_CACHE;
    auto acl = qz::acl::read_file(argv[1], nullptr, nullptr, flags, &flags);
    if (!acl)
        return failed(argv[1]);
    std::printf("read from %s, %zu bytes%s\n", (flags & SEC_READ_ACL_TEXT) != 0 ? "the text" : "the cache",
                acl->bytes().size(), (flags & SEC_READ_ACL_CACHE) != 0 ? ", cached" : "");
    const int status = decide(*acl, argv[2], groups);
    return status == 0 ? edit(*acl, argv[2]) : status;
}
