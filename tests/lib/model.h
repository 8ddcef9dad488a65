// A plain model of ACLs, written down once more: their bytes, what they list, and what an edit does to them, which
// is to expand the sub-ACL of the entry's key, change it, and compile it again.
#ifndef QZ_TESTS_MODEL_H
#define QZ_TESTS_MODEL_H

#include "support.h"

#include <map>
#include <optional>

namespace support {

using edit_function = int (*)(const sec_acle_t *, sec_acl_buffer_t *);
constexpr edit_function edits[] = {sec_add_acle_to_acl, sec_add_acle_to_acl2, sec_del_acle_from_acl};
constexpr int types[] = {SEC_ACLE_UNAUTHENTICATED, SEC_ACLE_ANYOTHER, SEC_ACLE_USER, SEC_ACLE_EXPANDED,
                         SEC_ACLE_GROUP};

// Identities and masks as they are stored: in any order, with repetitions.
using items = std::vector<std::pair<std::string, std::uint32_t>>;

inline const auto key = [](const auto &each) { return folded(each.first); };

inline bool has_mechanism(int type) { return type == SEC_ACLE_USER || type == SEC_ACLE_EXPANDED; }
inline bool has_identity(int type) { return type == SEC_ACLE_GROUP || has_mechanism(type); }

// Features that no edit leaves in a sub-ACL, but bytes from elsewhere may have.
enum class oddity : std::uint8_t { none, unknown_version, bytes_after_mechanism, bytes_after_identities };

struct model_subacl {
    int type;
    std::string mechanism;
    items stored = {};
    oddity odd = oddity::none;
    std::optional<std::size_t> wrong_length = {};

    // Of equal ones the first spelling and the last mask; all but user-expanded ones are put in order.
    items expanded() const {
        items made;
        std::map<std::string, std::size_t> places;
        for (const auto &[identity, mask] : stored) {
            const auto [place, is_new] = places.emplace(folded(identity), made.size());
            if (is_new)
                made.emplace_back(identity, 0);
            made[place->second].second = mask;
        }
        if (type != SEC_ACLE_EXPANDED)
            std::ranges::sort(made, {}, key);
        return made;
    }

    std::string bytes() const {
        const std::string more = odd == oddity::bytes_after_identities ? "more" : "";
        std::string entries;
        for (const auto &[identity, mask] : stored)
            entries += packed_entry(mask, has_identity(type) ? text_field(identity) + more : "");
        if (odd == oddity::unknown_version && !entries.empty())
            entries[0] = 7;
        std::string field = text_field(mechanism);
        if (odd == oddity::bytes_after_mechanism)
            field = (field + "m").substr(0, 17);
        const std::string sound =
            packed_subacl(type, has_mechanism(type) ? field : "", stored.size(), entries);
        return number(wrong_length.value_or(sound.size()), 4) + sound.substr(4);
    }
};

struct model {
    std::vector<model_subacl> subacls;
    std::string behind = {}; // bytes that nothing counts

    std::string bytes() const {
        std::string all;
        for (const model_subacl &each : subacls)
            all += each.bytes();
        return packed_acl(subacls.size(), all + behind);
    }

    auto find(int type, const std::string &mechanism) const {
        const auto is_of_key = [&](const model_subacl &each) {
            return each.type == type && same(each.mechanism, mechanism);
        };
        return std::ranges::find_if(subacls, is_of_key);
    }

    // Those of a type and, if given, a mechanism; type 0 means all.
    arguments entries(int type, const char *mechanism) const {
        arguments all;
        for (const model_subacl &each : subacls) {
            const bool by_mechanism = has_mechanism(type) && mechanism != nullptr;
            if (type != 0 && (each.type != type || (by_mechanism && !same(each.mechanism, mechanism))))
                continue;
            for (const auto &[identity, mask] : each.expanded()) {
                const char *name = has_identity(each.type) ? identity.c_str() : nullptr;
                all.push_back(text_of(entry(each.type, each.mechanism, name, mask)));
            }
            if (type != 0 && (by_mechanism || !has_mechanism(type)))
                break; // the first of the key
        }
        return all;
    }

    failure edit(edit_function how, const sec_acle_t &acle) {
        const std::string mechanism = has_mechanism(acle.type) ? acle.mechanism : "";
        const std::string identity = has_identity(acle.type) ? acle.identity : "";
        const bool deletes = how == sec_del_acle_from_acl;
        auto at = subacls.begin() + (find(acle.type, mechanism) - subacls.begin());
        items held = at == subacls.end() ? items() : at->expanded();
        const auto old = std::ranges::find(held, folded(identity), key);
        if (deletes && old == held.end()) {
            const int code = at != subacls.end() && held.empty() ? SEC_S_BAD_ACLE : SEC_S_ACLE_NOT_FOUND;
            return error_of(code, msg::acle_not_found, acle.type, mechanism, identity);
        }
        if (old != held.end() && how == sec_add_acle_to_acl2)
            return duplicate(acle.type, mechanism, identity);
        if (at == subacls.end()) {
            // A walk that follows the lengths must find it after the entries of the last one.
            if (!subacls.empty() && subacls.back().wrong_length)
                return bad_acl(msg::buffer_corrupted);
            at = subacls.insert(at, {acle.type, ""});
        } else if (at->wrong_length) {
            // The bytes within the length go; the rest stays out of force.
            behind = (at->bytes() + behind).substr(*at->wrong_length);
        }
        const std::string spelled = held.empty() ? mechanism : at->mechanism;
        if (deletes)
            held.erase(old);
        else
            held.emplace_back(identity, acle.perm_mask);
        *at = {acle.type, spelled, model_subacl{acle.type, "", held}.expanded()};
        if (held.empty())
            subacls.erase(at);
        return no_error;
    }

    static failure duplicate(int type, const std::string &mechanism, const std::string &identity) {
        const std::string letter(1, " no u   e       g"[type]);
        if (has_mechanism(type))
            return bad_acle(msg::duplicate_acle, letter, mechanism, identity);
        if (has_identity(type))
            return bad_acle(msg::duplicate_group, letter, identity);
        return bad_acle(msg::duplicate_single_acle, letter);
    }
};

// The listed entries of a buffer, of one type and mechanism or (type 0) all.
inline arguments list_of(const sec_acl_buffer_t &acl, int type = 0, const char *mechanism = nullptr) {
    sec_aclelist_t list = {};
    if (type == 0)
        EXPECT_EQ(sec_list_acl(&acl, &list), SEC_S_OK);
    else
        EXPECT_EQ(sec_list_acl_by_type(&acl, static_cast<std::uint8_t>(type), mechanism, &list), SEC_S_OK);
    return taken(list);
}

} // namespace support

#endif
