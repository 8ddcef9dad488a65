// ask: what a party would be granted, and why.
#include "acl_document.h"
#include "cli.h"
#include "entry_words.h"
#include "party.h"
#include "qzacl_acl/compile.h"
#include "trouble.h"

#include <optional>
#include <unordered_set>
#include <vector>

using namespace qz;

namespace qzacl {

namespace {

// The entries of a text that may answer a party. Deciding by an ACL of these alone gives what the whole one
// gives, without compiling a million others.
class candidates {
public:
    candidates(const party &asking, sec_id_compare_fn handler) : asking_(asking), handler_(handler) {
        for (const std::string &group : asking.groups())
            groups_.insert(folded(group));
    }

    void add(const entry_fields &entry, const text_place &place) {
        if (may_answer(entry))
            found_.push_back({entry, place.line});
    }

    acl compiled() const {
        sec_acltree_array trees;
        for (const found_entry &each : found_) {
            const sec_acle_t record = record_of(each.entry);
            require(sec__add_acle_to_trees(&record, trees));
        }
        sec_acl_buffer_t buffer = {};
        if (!found_.empty())
            require(sec__acltrees_to_acl(trees.trees(), &buffer));
        return acl(buffer);
    }

    // 0 if it is unknown.
    std::size_t line_of(const entry_fields &entry) const {
        for (const found_entry &each : found_) {
            if (each.entry.type == entry.type && detail::same_folded(each.entry.identity, entry.identity))
                return each.line;
        }
        return 0;
    }

private:
    struct found_entry {
        entry_fields entry;
        std::size_t line;
    };

    bool may_answer(const entry_fields &entry) const {
        if (!asking_.is_user())
            return entry.type == SEC_ACLE_UNAUTHENTICATED;
        switch (entry.type) {
        case SEC_ACLE_USER:
            return entry.mechanism == asking_.mechanism() &&
                   detail::same_folded(entry.identity, asking_.identity());
        case SEC_ACLE_EXPANDED:
            return entry.mechanism == asking_.mechanism() && handler_ != nullptr &&
                   handler_(asking_.identity().c_str(), entry.identity.data()) == 0;
        case SEC_ACLE_GROUP:
            return !groups_.empty() && groups_.contains(folded(entry.identity));
        default:
            return entry.type == SEC_ACLE_ANYOTHER;
        }
    }

    const party &asking_;
    sec_id_compare_fn handler_;
    std::unordered_set<std::string> groups_;
    std::vector<found_entry> found_;
};

// A file, and the entries that may answer.
struct question {
    const acl_document &document;
    const candidates &found;
    const permission_set &set;
};

json json_of(const party_answer &said, const question &about) {
    json object;
    object["party"] = name_of(said.party);
    if (said.has_entry()) {
        put_entry(object, about.document.file(), about.found.line_of(said.entry), said.entry, about.set);
    } else {
        for (const char *key : {"file", "line", "type", "mechanism", "identity", "permissions"})
            object[key] = nullptr;
        if (said.party == who::group)
            object["identity"] = json_text(said.group);
    }
    object["decides"] = said.decides;
    return object;
}

json json_of(const answer &made, const question &about) {
    const bool wants = made.wanted() != 0;
    const std::string_view decider = name_of(made.decided_by());
    json object;
    object["granted"] = json_text(about.set.letters_of(made.granted()));
    object["wanted"] = wants ? json_text(about.set.letters_of(made.wanted())) : json();
    object["allowed"] = wants ? json(made.allowed()) : json();
    object["decided_by"] = decider.empty() ? json() : json(decider);
    object["answers"] = json::array();
    for (const party_answer &each : made)
        object["answers"].push_back(json_of(each, about));
    return object;
}

void print(const answer &made, const question &about, output &out) {
    std::string place;
    const auto place_of = [&](const party_answer &said) -> std::string_view {
        return place = about.document.place(about.found.line_of(said.entry));
    };
    const auto write = [&](std::string_view line) { out.line(line.substr(0, line.size() - 1)); };
    require(made.explain(write, place_of, about.set.get()));
}

void make_party(const command_line &line, std::optional<party> &asking) {
    const bool is_user = line.words.size() == 2;
    if (!is_user && !line.groups.empty())
        throw wrong_use("-g needs an IDENTITY");
    if (is_user)
        asking.emplace(line.mechanism, line.words[1], line.groups);
    else
        asking.emplace();
}

} // namespace

int ask(const call &call) {
    std::optional<party> asking;
    make_party(call.line, asking);
    const handlers handling(call.line.handlers);
    const std::uint32_t wanted = call.line.wanted ? call.permissions.mask_of(*call.line.wanted) : 0;

    candidates found(*asking, handling.of(asking->mechanism()));
    reading watched;
    watched.entry = [&](const entry_fields &entry, const text_place &place) {
        if (place.line != 0)
            found.add(entry, place);
    };
    acl_document document(call.line.words[0], call.permissions, watched);
    document.require_compilable();
    const acl acl = document.is_compiled() ? document.take_acl() : found.compiled();
    if (asking->is_user())
        handling.register_for(asking->mechanism());
    const auto made =
        decide(acl, asking->requester(), wanted, call.line.takes_sum ? order::sum : order::closest);
    require(made.code());

    const question about{document, found, call.permissions};
    if (call.out.is_json())
        call.out.object(json_of(*made, about));
    else
        print(*made, about, call.out);
    return (wanted != 0 ? made->allowed() : made->granted() != 0) ? yes : no;
}

} // namespace qzacl
