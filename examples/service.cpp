// The service of service.c in C++: the same rules, the same output.
//
// usage: service_cpp ACL-FILE USER@HOST [GROUP...]
#include <qz/acl.hpp>

#include <clocale>
#include <cstdio>
#include <cstring>
#include <vector>

namespace {

constexpr char mechanism[] = "unix";

// Prints why the last operation failed.
int failed(const char *what) {
    std::fprintf(stderr, "%s: %s", what, qz::error::current().text().data());
    return 1;
}

// A user-expanded entry of "unix" names a host or, with a dot in front, a domain. It accepts every user at that
// host, or at any host in that domain.
int compare_host(const char *requested, const char *entry) {
    const char *host = std::strchr(requested, '@');
    if (host == nullptr)
        return 1;
    ++host;
    const std::size_t length = std::strlen(host), suffix = std::strlen(entry);
    if (entry[0] == '.' && length > suffix)
        host += length - suffix;
    return cu_strcasecmp_posix_1(host, entry);
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

// The most specific match decides: the user, else the user's domain, else the groups together, else any other.
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
    if (sec__register_id_handler(SEC_ID_HANDLER_EXPANDED, mechanism, compare_host) != SEC_S_OK)
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
