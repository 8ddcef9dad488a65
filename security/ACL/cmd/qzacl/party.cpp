// The subject of a question, and the handlers for user-expanded entries.
#include "party.h"

#include "entry_words.h"
#include "trouble.h"

using namespace qz;

namespace qzacl {

namespace {

sec_id_compare_fn handler_named(const std::string &name) {
    if (name == "domain")
        return domain_handler;
    if (name == "exact")
        return exact_handler;
    if (name != "none")
        throw wrong_use("--handler is MECH=domain, MECH=exact or MECH=none");
    return nullptr;
}

} // namespace

handlers::handlers(const std::vector<std::string> &words) {
    for (const std::string &word : words) {
        const std::size_t equals = word.find('=');
        const std::string mechanism = folded(word.substr(0, equals));
        const sec_id_compare_fn handler =
            handler_named(mechanism.empty() || equals == std::string::npos ? "" : word.substr(equals + 1));
        if (!named_.emplace(mechanism, handler).second)
            throw wrong_use("--handler is given twice for " + mechanism);
    }
}

sec_id_compare_fn handlers::of(const std::string &mechanism) const {
    const auto found = named_.find(mechanism);
    return found == named_.end() ? domain_handler : found->second;
}

void handlers::register_for(const std::string &mechanism) const {
    if (const sec_id_compare_fn handler = of(mechanism); handler != nullptr)
        require(sec__register_id_handler(SEC_ID_HANDLER_EXPANDED, mechanism.c_str(), handler));
}

party::party(const std::string &mechanism, const std::string &identity, std::vector<std::string> groups)
    : is_user_(true), mechanism_(folded(mechanism)), groups_(std::move(groups)) {
    text kept;
    identity_ = stored_identity(mechanism_.c_str(), identity.c_str(), kept);
    if (kept.failed())
        throw std::bad_alloc();
    for (const std::string &group : groups_)
        group_refs_.push_back({0, group.c_str()});
}

requester party::requester() const {
    if (!is_user_)
        return requester::unauthenticated();
    return requester::user(mechanism_.c_str(), identity_.c_str()).in_groups(group_refs_);
}

} // namespace qzacl
