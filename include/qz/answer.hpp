/*
 * Requesters and answers: part of <qz/service.hpp>, which states the rules.
 */
#ifndef QZ_ANSWER_HPP
#define QZ_ANSWER_HPP

#include <qz/acl_text.hpp>
#include <qz/live_acl.hpp>

namespace qz {

namespace detail {
class inquiry;
}

/* ---- Requesters ---- */

/* The subject of a decision. Stores the given pointers, to texts in UTF-8, without copying. */
class requester {
public:
    /* An unauthenticated requester. */
    [[nodiscard]] static constexpr requester unauthenticated() noexcept { return {}; }

    /* An identity of a mechanism. Its IPv6 host may be in any form: see stored_identity. */
    [[nodiscard]] static constexpr requester user(const char *mechanism, const char *identity) noexcept {
        requester made;
        made.is_user_ = true;
        made.mechanism_ = mechanism;
        made.identity_ = identity;
        return made;
    }

    /* The same user as a member of an array of groups; may be null when count is 0. */
    [[nodiscard]] constexpr requester in_groups(const sec_group_ref_t *first,
                                                std::size_t count) const noexcept {
        requester changed = *this;
        changed.groups_ = first;
        changed.group_count_ = first != nullptr ? count : 0;
        return changed;
    }
    template <class Range>
    [[nodiscard]] constexpr requester in_groups(const Range &range) const noexcept {
        return in_groups(std::data(range), std::size(range));
    }

    /* The same user, compared with user entries through the mechanism's SEC_ID_HANDLER_USER. */
    [[nodiscard]] constexpr requester through_handler() const noexcept {
        requester changed = *this;
        changed.uses_handler_ = true;
        return changed;
    }

private:
    friend class detail::inquiry;

    constexpr requester() noexcept = default;

    bool is_user_ = false;
    bool uses_handler_ = false;
    const char *mechanism_ = nullptr;
    const char *identity_ = nullptr;
    const sec_group_ref_t *groups_ = nullptr;
    std::size_t group_count_ = 0;
};

/* ---- Answers ---- */

/*
 * The order in which answers are taken.
 *
 *   closest   the user's own entry, else the first user-expanded entry that the mechanism's handler accepts,
 *             else those of all groups together, else any other
 *   sum       all of them together
 */
enum class order : std::uint8_t { closest, sum };

/* The party of an answer, and who decided: nobody when there is no entry, sum in the order of that name. */
enum class who : std::uint8_t { nobody, user, expanded, group, any_other, unauthenticated, sum };

/* "user", "expanded", "group", "any other", "unauthenticated", "sum"; nobody: "". */
inline std::string_view name_of(who party) noexcept {
    constexpr std::string_view names[] = {"",   "user", "expanded", "group", "any other", "unauthenticated",
                                          "sum"};
    return names[static_cast<std::size_t>(party)];
}

/* The answer of an ACL about one party. */
struct party_answer {
    who party = who::nobody;
    bool decides = false;
    entry_fields entry;     /* as stored; its type is 0 if there is none */
    std::string_view group; /* for a group: its name, as the requester gave it */

    [[nodiscard]] bool has_entry() const noexcept { return entry.type != 0; }
};

/*
 * A decision: all answers, which of them decide, and the granted permissions. Movable. Its texts are valid while
 * the ACL does not change and the requester's texts live; an answer from a snapshot keeps the snapshot.
 */
class answer {
public:
    /* Nothing granted, nothing answered. */
    answer() noexcept = default;

    /* Permissions; allowed says whether all wanted ones are granted. */
    [[nodiscard]] std::uint32_t granted() const noexcept { return granted_; }
    [[nodiscard]] std::uint32_t wanted() const noexcept { return wanted_; }
    [[nodiscard]] bool allowed() const noexcept { return wanted_ != 0 && (granted_ & wanted_) == wanted_; }

    /* Who decided. */
    [[nodiscard]] who decided_by() const noexcept { return decided_by_; }

    /*
     * The answers. For a user: user, expanded, each group in the requester's order, any other; otherwise only
     * unauthenticated.
     */
    [[nodiscard]] const party_answer *begin() const noexcept { return answers_.get(); }
    [[nodiscard]] const party_answer *end() const noexcept { return answers_.get() + count_; }
    [[nodiscard]] std::size_t size() const noexcept { return count_; }

    /*
     * Explains the decision in lines for people:
     *
     *   user: no entry
     *   expanded: PLACE: e unix .cluster.example rql (decides)
     *   group operators: PLACE: g operators rwxCqle
     *   any other: PLACE: o rql
     *   granted: rql
     *   wanted rw: no             (unless nothing was wanted)
     *
     *   write   called as write(std::string_view line) for each, which ends with a line feed
     *   place   called as place(const party_answer &) for each entry; returns a text, "FILE:LINE" for
     *           example; when it is empty, ": " is left out, too
     *   set     null: acl__default_perm_set
     *
     * Codes: those of to_letters, before anything is written; 6.
     */
    template <class Write, class Place>
    int explain(Write &&write, Place &&place, const sec_perm_set_t *set = nullptr) const {
        const auto granted = to_letters(granted_, set), wanted = to_letters(wanted_, set);
        if (!granted || !wanted)
            return granted ? wanted.code() : granted.code();
        for (const party_answer &each : *this) {
            if (const auto letters = to_letters(each.entry.permissions, set); !letters)
                return letters.code();
        }
        text line;
        for (const party_answer &each : *this) {
            line.clear();
            describe(line, each, each.has_entry() ? std::string_view(place(each)) : std::string_view(), set);
            if (line.failed())
                return detail::unrecorded(SEC_S_NO_MEMORY);
            write(line.view());
        }
        line.clear();
        write(line.append("granted:")
                  .append(granted_ != 0 ? " " : "")
                  .append(granted->view())
                  .append("\n")
                  .view());
        line.clear();
        if (wanted_ != 0)
            write(line.append("wanted ")
                      .append(wanted->view())
                      .append(allowed() ? ": yes\n" : ": no\n")
                      .view());
        return line.failed() ? detail::unrecorded(SEC_S_NO_MEMORY) : SEC_S_OK;
    }

    /* The same in one text, without places. */
    [[nodiscard]] result<text> explain(const sec_perm_set_t *set = nullptr) const noexcept {
        text lines;
        const int code = explain([&](std::string_view line) { lines.append(line); },
                                 [](const party_answer &) { return std::string_view(); }, set);
        return {lines.failed() ? detail::unrecorded(SEC_S_NO_MEMORY) : code, std::move(lines)};
    }

private:
    friend class detail::inquiry;

    static void describe(text &line, const party_answer &said, std::string_view place,
                         const sec_perm_set_t *set) noexcept {
        line.append(name_of(said.party));
        if (!said.has_entry()) {
            if (said.party == who::group)
                line.append(" ").append(said.group);
            line.append(": no entry\n");
            return;
        }
        line.append(": ").append(place).append(place.empty() ? "" : ": ");
        static_cast<void>(
            append_entry(line, said.entry, set)); /* its letters are known, and failed() stays */
        line.append(said.decides ? " (decides)\n" : "\n");
    }

    acl_snapshot kept_; /* whose bytes the texts are in; null for an ACL that the caller keeps */
    std::unique_ptr<party_answer[]> answers_;
    std::size_t count_ = 0;
    std::uint32_t granted_ = 0;
    std::uint32_t wanted_ = 0;
    who decided_by_ = who::nobody;
};

} // namespace qz

#endif
