/*
 * Access decisions of services: the order in which answers are taken, and handlers for hosts. Part of
 * <qz/service.hpp>, which states the rules.
 */
#ifndef QZ_DECIDE_HPP
#define QZ_DECIDE_HPP

#include <qz/answer.hpp>
#include <qz/stored_entry.hpp>

namespace qz {

/* ---- Handlers for user-expanded entries, ready for sec__register_id_handler ---- */

/*
 * An entry is a host, or a domain with a leading dot. It matches if the host after the requester's last '@' equals
 * it, or if it begins with a dot and the host ends with it, ignoring the case of A to Z. An identity without '@'
 * has no host and matches nothing.
 */
inline int domain_handler(const char *requested, const char *entry) noexcept {
    const char *at = std::strrchr(requested, '@');
    if (at == nullptr || at[1] == '\0')
        return 1;
    std::string_view host = at + 1;
    const std::string_view end = entry;
    if (!end.empty() && end.front() == '.' && host.size() > end.size())
        host.remove_prefix(host.size() - end.size());
    return detail::same_folded(host, end) ? 0 : 1;
}

/* An entry matches the one identity that equals it, ignoring the case of A to Z. */
inline int exact_handler(const char *requested, const char *entry) noexcept {
    return detail::same_folded(requested, entry) ? 0 : 1;
}

/* ---- Deciding ---- */

namespace detail {

/* One requester's questions to one ACL. */
class inquiry {
public:
    inquiry(const acl &acl, const requester &whom) noexcept
        : acl_(acl), whom_(whom), identity_(stored_identity(whom.mechanism_, whom.identity_, kept_)) {}

    /* Evaluates the answers in order, and stops when the result is known. */
    [[nodiscard]] decision granted(order taken) const noexcept {
        if (kept_.failed())
            return {unrecorded(SEC_S_NO_MEMORY), 0};
        if (!whom_.is_user_)
            return single(party::unauthenticated());
        decision sum = nothing();
        for (const who each : {who::user, who::expanded, who::group, who::any_other}) {
            const decision found =
                each == who::group ? groups(whom_.groups_, whom_.group_count_) : single(party_of(each));
            if (found.failed() || (found && taken == order::closest))
                return found;
            if (found)
                sum = {SEC_S_OK, sum.permissions() | found.permissions()};
        }
        return sum ? decision{unrecorded(SEC_S_OK), sum.permissions()} : sum;
    }

    /* Takes all answers, each with its entry. */
    [[nodiscard]] int ask(answer &made) const noexcept {
        const std::size_t count = whom_.is_user_ ? 3 + whom_.group_count_ : 1;
        made.answers_.reset(new (std::nothrow) party_answer[count]);
        if (kept_.failed() || !made.answers_)
            return unrecorded(SEC_S_NO_MEMORY);
        made.count_ = count;
        party_answer *next = made.answers_.get();
        if (!whom_.is_user_)
            return look(*next, who::unauthenticated);
        int code = look(*next++, who::user);
        if (code == SEC_S_OK)
            code = look(*next++, who::expanded);
        for (std::size_t at = 0; at < whom_.group_count_ && code == SEC_S_OK; ++at)
            code = look_at_group(*next++, whom_.groups_[at]);
        return code == SEC_S_OK ? look(*next, who::any_other) : code;
    }

    /* Determines which answers decide, and the granted permissions. */
    static void weigh(answer &made, order taken) noexcept {
        party_answer *const first = made.answers_.get(), *const end = first + made.count_;
        const auto *const closest =
            std::find_if(first, end, [](const party_answer &said) { return said.has_entry(); });
        if (closest == end)
            return;
        const bool adds = taken == order::sum && closest->party != who::unauthenticated;
        made.decided_by_ = adds ? who::sum : closest->party;
        for (party_answer *said = first; said != end; ++said) {
            said->decides = said->has_entry() && (adds || said->party == made.decided_by_);
            if (said->decides)
                made.granted_ |= said->entry.permissions;
        }
    }

    static void want(answer &made, std::uint32_t wanted) noexcept { made.wanted_ = wanted; }
    static void keep(answer &made, acl_snapshot kept) noexcept { made.kept_ = std::move(kept); }

private:
    [[nodiscard]] static decision nothing() noexcept { return {SEC_S_BAD_ACLE, 0}; }

    /* An ACL without bytes, like that of a file without entries, has no entries. */
    [[nodiscard]] decision single(party asked) const noexcept {
        return acl_.bytes().empty() ? nothing() : acl_.single(asked);
    }
    [[nodiscard]] decision groups(const sec_group_ref_t *first, std::size_t count) const noexcept {
        return count == 0 || acl_.bytes().empty() ? nothing() : acl_.groups(first, count);
    }

    [[nodiscard]] party party_of(who each) const noexcept {
        if (each == who::any_other)
            return party::any_other();
        if (each == who::unauthenticated)
            return party::unauthenticated();
        if (each == who::expanded)
            return party::expanded(whom_.mechanism_, identity_);
        const party user = party::user(whom_.mechanism_, identity_);
        return whom_.uses_handler_ ? user.through_handler() : user;
    }

    [[nodiscard]] int look(party_answer &said, who each) const noexcept {
        said.party = each;
        const party asked = party_of(each);
        const decision found = single(asked);
        if (!found)
            return found.failed() ? found.code() : SEC_S_OK;
        const bool is_named = each == who::user || each == who::expanded;
        const bool is_compared = each == who::user && !whom_.uses_handler_;
        const std::uint8_t type = each == who::user              ? SEC_ACLE_USER
                                  : each == who::expanded        ? SEC_ACLE_EXPANDED
                                  : each == who::unauthenticated ? SEC_ACLE_UNAUTHENTICATED
                                                                 : SEC_ACLE_ANYOTHER;
        said.entry =
            find_entry(acl_.bytes(), type, is_named ? whom_.mechanism_ : "", [&](const entry_fields &entry) {
                if (is_compared)
                    return same_folded(entry.identity, identity_);
                return !is_named || is_accepted(entry, asked);
            });
        said.entry.type = type;
        said.entry.permissions = found.permissions();
        return SEC_S_OK;
    }

    [[nodiscard]] int look_at_group(party_answer &said, const sec_group_ref_t &group) const noexcept {
        said.party = who::group;
        said.group = group.name != nullptr ? group.name : "";
        const decision found = groups(&group, 1);
        if (!found)
            return found.failed() ? found.code() : SEC_S_OK;
        said.entry = find_entry(acl_.bytes(), SEC_ACLE_GROUP, "", [&](const entry_fields &entry) {
            return same_folded(entry.identity, said.group);
        });
        said.entry.type = SEC_ACLE_GROUP;
        said.entry.permissions = found.permissions();
        return SEC_S_OK;
    }

    /* Whether the mechanism's handler, which only the library knows, accepts this entry by itself. */
    [[nodiscard]] static bool is_accepted(const entry_fields &entry, party asked) noexcept {
        sec_acle_t record = {entry.permissions, "", entry.type, const_cast<char *>(entry.identity.data())};
        entry.mechanism.copy(record.mechanism, sizeof record.mechanism - 1);
        acl alone;
        return alone.add(record) == SEC_S_OK && static_cast<bool>(alone.single(asked));
    }

    const acl &acl_;
    requester whom_;
    text kept_;
    const char *identity_;
};

} // namespace detail

/*
 * Decides what a requester may do, and returns every answer with its entry. To find the user-expanded entry that a
 * handler accepted, the handler is called again for one entry after the other; if it then accepts none, the entry
 * has no identity.
 *
 *   acl      may have no bytes, like that of a file without entries: nothing is granted
 *   wanted   permissions: answer::allowed says whether all are granted; 0: none is wanted, and allowed is false
 *   taken    the order in which answers are taken
 *
 * Codes: those of sec__single_acle_perm and sec__group_acles_perm, but for 43; 6. No matching entry is
 * not a failure. After a failure the answer grants nothing.
 */
inline result<answer> decide(const acl &acl, const requester &whom, std::uint32_t wanted,
                             order taken = order::closest) noexcept {
    const detail::inquiry asking(acl, whom);
    answer made;
    const int code = asking.ask(made);
    if (code != SEC_S_OK)
        return {code, answer()};
    detail::inquiry::weigh(made, taken);
    detail::inquiry::want(made, wanted);
    return {detail::unrecorded(SEC_S_OK), std::move(made)};
}

/* The same for a snapshot, which the answer keeps. A null one fails with 42 (3417-109). */
inline result<answer> decide(const acl_snapshot &snapshot, const requester &whom, std::uint32_t wanted,
                             order taken = order::closest) noexcept {
    if (!snapshot)
        return {acl().single(party::any_other()).code(), answer()};
    auto made = decide(*snapshot, whom, wanted, taken);
    detail::inquiry::keep(*made, snapshot);
    return made;
}

/*
 * The permissions that decide would grant. Evaluates no more answers than the order needs, and allocates only to
 * convert an IPv6 host.
 *
 * Codes: those of decide; 43: no entry decides.
 */
inline decision granted(const acl &acl, const requester &whom, order taken = order::closest) noexcept {
    return detail::inquiry(acl, whom).granted(taken);
}
inline decision granted(const acl_snapshot &snapshot, const requester &whom,
                        order taken = order::closest) noexcept {
    return snapshot ? granted(*snapshot, whom, taken) : acl().single(party::any_other());
}

} // namespace qz

#endif
