// What a new entry hides.
#include "hidden_grant.h"

#include "entry_words.h"

using namespace qz;

namespace qzacl {

namespace {

// The hosts that services accept for an expanded entry: the host itself or, with a leading dot, every host of the
// domain.
bool is_host_of(std::string_view identity, std::string_view entry) {
    const std::size_t at = identity.rfind('@');
    if (at == std::string_view::npos)
        return false;
    const std::string_view host = identity.substr(at + 1);
    if (same_identity(host, entry))
        return true;
    return !entry.empty() && entry[0] == '.' && host.size() >= entry.size() &&
           same_identity(host.substr(host.size() - entry.size()), entry);
}

bool answers_for(const entry_fields &entry, const entry_key &key) {
    if (entry.type == SEC_ACLE_ANYOTHER)
        return key.type == SEC_ACLE_USER || key.type == SEC_ACLE_EXPANDED || key.type == SEC_ACLE_GROUP;
    return key.type == SEC_ACLE_USER && entry.type == SEC_ACLE_EXPANDED && entry.mechanism == key.mechanism &&
           is_host_of(key.stored, entry.identity);
}

struct answer {
    std::uint8_t type = 0;
    std::uint32_t permissions = 0;
    std::string line;
};

} // namespace

std::string hidden_by(const named_text &text, const permission_set &set, const text_change &change) {
    answer found;
    reading watched;
    watched.entry = [&](const entry_fields &entry, const text_place &place) {
        if (found.type == SEC_ACLE_EXPANDED || !answers_for(entry, change.key))
            return;
        found = {entry.type, entry.permissions, text.name + ":" + std::to_string(place.line) + ": "};
        append_entry(found.line, entry, set);
    };
    check_text(text, set, watched);
    if ((found.permissions & ~change.permissions) == 0)
        return {};
    return found.line + " granted more until now, which the new entry hides";
}

} // namespace qzacl
