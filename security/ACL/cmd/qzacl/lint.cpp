// lint: likely mistakes that the checker accepts.
#include "acl_document.h"
#include "cli.h"
#include "entry_words.h"
#include "trouble.h"
#include "utf8.h"

#include <algorithm>
#include <arpa/inet.h>
#include <map>
#include <unordered_set>
#include <vector>

using namespace qz;

namespace qzacl {

namespace {

struct warning {
    const char *name;
    std::string text;
    std::size_t line;
    entry_fields entry; // of type 0 if it is about no entry
};

bool names_hosts(std::string_view mechanism) { return mechanism == "unix" || mechanism == "hba2"; }

// An IPv6 address in the form in which identities are compared; empty for anything else.
std::string one_form_of(const std::string &host) {
    in6_addr address = {};
    char formatted[INET6_ADDRSTRLEN] = "";
    if (inet_pton(AF_INET6, host.c_str(), &address) != 1)
        return "";
    require(cu_ipaddr_ntop_1(&address, formatted));
    return formatted;
}

// Looks at the entries of one file, in their order.
class linter {
public:
    // `document` is known once it is read.
    reading watched() {
        return {.entry = [this](const entry_fields &entry, const text_place &place) { look(entry, place); },
                .whole_text = [this](std::string_view text) { look_for_crlf(text); },
                .names_file = true};
    }

    // By line; within a line, warnings about the whole file come first.
    std::vector<warning> take_warnings() {
        std::stable_sort(found_.begin(), found_.end(),
                         [](const warning &a, const warning &b) { return a.line < b.line; });
        return std::move(found_);
    }

private:
    void look_for_crlf(std::string_view text) {
        const std::size_t at = text.find("\r\n");
        if (at == std::string_view::npos)
            return;
        const auto line = std::count(text.begin(), text.begin() + static_cast<std::ptrdiff_t>(at), '\n') + 1;
        found_.push_back({"crlf", "lines end in CR LF", static_cast<std::size_t>(line), {}});
    }

    void look(const entry_fields &entry, const text_place &place) {
        const auto warn = [&](const char *name, const std::string &text) {
            found_.push_back({name, text, place.line, entry});
        };
        const std::string mechanism = folded(entry.mechanism);
        if (names_hosts(mechanism))
            look_at_host(entry, warn);
        if (!is_utf8(entry.mechanism) || !is_utf8(entry.identity))
            warn("utf-8", "the entry is not UTF-8");
        if (entry.type == SEC_ACLE_EXPANDED)
            look_for_former(mechanism, folded(entry.identity), warn);
        if (entry.type == SEC_ACLE_USER && entry.permissions == 0)
            warn("denial", "the user is granted nothing, whatever other entries grant");
        count_key(entry.type, mechanism, warn);
    }

    template <class Warn>
    static void look_at_host(const entry_fields &entry, const Warn &warn) {
        const std::size_t at = entry.identity.find('@');
        if (at == std::string_view::npos && entry.type == SEC_ACLE_USER)
            return warn("no-host", "matches nobody: a user of this mechanism is USER@HOST");
        const std::string host(entry.identity.substr(at == std::string_view::npos ? 0 : at + 1));
        if (host.empty())
            return warn("no-host", "matches nobody: there is no host behind the @");
        const std::string form = one_form_of(host);
        if (!form.empty() && !detail::same_folded(form, host))
            warn("ipv6-form", "matches nobody: the address is compared as " + form);
    }

    // Former entries that begin with a dot accept every host that ends with them.
    template <class Warn>
    void look_for_former(const std::string &mechanism, const std::string &identity, const Warn &warn) {
        std::unordered_set<std::string> &former = domains_[mechanism];
        for (std::size_t dot = identity.find('.', 1); dot != std::string::npos && !former.empty();
             dot = identity.find('.', dot + 1)) {
            const std::string domain = identity.substr(dot);
            if (former.contains(domain)) {
                warn("hidden", "is never reached: " + domain + " above accepts the same");
                break;
            }
        }
        if (!identity.empty() && identity[0] == '.')
            former.insert(identity);
    }

    template <class Warn>
    void count_key(std::uint8_t type, const std::string &mechanism, const Warn &warn) {
        constexpr std::size_t most = 65535;
        const std::string key = static_cast<char>(type) + mechanism;
        if (key == last_key_)
            return;
        last_key_ = key;
        if (keys_.insert(key).second && keys_.size() == most + 1)
            warn("too-many", "more than 65535 pairs of type and mechanism do not compile");
    }

    std::vector<warning> found_;
    std::map<std::string, std::unordered_set<std::string>> domains_;
    std::unordered_set<std::string> keys_;
    std::string last_key_;
};

void tell(const warning &found, const acl_document &document, const call &call) {
    if (!call.out.is_json())
        return call.out.line(document.place(found.line) + ": warning: " + found.text + " [" + found.name +
                             "]");
    json object;
    object["warning"] = found.name;
    object["text"] = json_text(found.text);
    if (found.entry.type != 0) {
        put_entry(object, document.file(), found.line, found.entry, call.permissions);
    } else {
        object["file"] = json_text(document.file());
        object["line"] = found.line;
        for (const char *key : {"type", "mechanism", "identity", "permissions"})
            object[key] = nullptr;
    }
    call.out.object(object);
}

// Returns the status of one file.
int lint_file(const std::string &file, const call &call) {
    linter looking;
    const acl_document document(file, call.permissions, looking.watched());
    const std::vector<warning> found = looking.take_warnings();
    for (const warning &each : found)
        tell(each, document, call);
    return found.empty() ? yes : no;
}

} // namespace

int lint(const call &call) {
    int status = yes;
    for (const std::string &file : call.line.words) {
        try {
            status = std::max(status, lint_file(file, call));
        } catch (const told_trouble &) {
            status = failed;
        } catch (const recorded_trouble &) {
            print_recorded_error();
            status = failed;
        }
    }
    return status;
}

} // namespace qzacl
