// The subject of a question, and the handlers for user-expanded entries.
#ifndef QZACL_PARTY_H
#define QZACL_PARTY_H

#include "qz/service.hpp"

#include <map>
#include <string>
#include <vector>

namespace qzacl {

// One handler for each mechanism: the domain handler, unless another one is named.
class handlers {
public:
    // Words "MECH=domain|exact|none". Throws wrong_use.
    explicit handlers(const std::vector<std::string> &words);

    // Null for a mechanism without one.
    sec_id_compare_fn of(const std::string &mechanism) const;

    // Registers it with the library, for decisions.
    void register_for(const std::string &mechanism) const;

private:
    std::map<std::string, sec_id_compare_fn> named_;
};

// A requester that owns its texts: the mechanism in lower case, the identity in its stored form.
class party {
public:
    // An unauthenticated party.
    party() = default;

    party(const std::string &mechanism, const std::string &identity, std::vector<std::string> groups);
    party(const party &) = delete;
    party &operator=(const party &) = delete;

    bool is_user() const { return is_user_; }
    const std::string &mechanism() const { return mechanism_; }
    const std::string &identity() const { return identity_; }
    const std::vector<std::string> &groups() const { return groups_; }

    // Valid as long as the party.
    qz::requester requester() const;

private:
    bool is_user_ = false;
    std::string mechanism_;
    std::string identity_;
    std::vector<std::string> groups_;
    std::vector<sec_group_ref_t> group_refs_;
};

} // namespace qzacl

#endif
