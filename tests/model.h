// A plain model of ACLs, written down once more: their bytes, what they list, and what an edit does to them, which is
// to expand the sub-ACL of the entry's key, change it, and compile it again.
#ifndef QZ_TESTS_MODEL_H
#define QZ_TESTS_MODEL_H
#include "support.h"
#include <map>
#include <optional>

namespace support {

using edit_function = int (*)(const sec_acle_t *, sec_acl_buffer_t *);
// Identities and masks as they are stored: in any order, with repetitions.
using items = std::vector<std::pair<std::string, std::uint32_t>>;

inline const auto key = [](const auto &each) { return folded(each.first); };
inline auto find(items &all, const std::string &identity) { return std::ranges::find(all, folded(identity), key); }
inline bool has_mechanism(int type) { return type == 4 || type == 8; }

struct model_subacl {
    int type;
    std::string mechanism;
    items stored = {};
    unsigned flaw = 0; // 1: a version nobody looks at; bytes behind 2: the mechanism, 3: the identities
    std::optional<std::size_t> wrong_length = {};

    // Of equal ones the first spelling and the last mask; all but user-expanded ones are put in order.
    items expanded() const {
        items made;
        std::map<std::string, std::size_t> places;
        for (const auto &[identity, mask] : stored) {
            const auto [place, is_new] = places.emplace(folded(identity), made.size());
            (is_new ? made.emplace_back(identity, 0) : made[place->second]).second = mask;
        }
        if (type != 8) std::ranges::sort(made, {}, key);
        return made;
    }
    std::string bytes() const {
        std::string entries;
        for (const auto &[identity, mask] : stored)
            entries += packed_entry(mask, type < 4 ? "" : text_field(identity) + (flaw == 3 ? "more" : ""));
        if (flaw == 1 && !entries.empty()) entries[0] = 7;
        const std::string field = flaw == 2 ? (text_field(mechanism) + "m").substr(0, 17) : text_field(mechanism);
        const std::string sound = packed_subacl(type, has_mechanism(type) ? field : "", stored.size(), entries);
        return number(wrong_length.value_or(sound.size()), 4) + sound.substr(4);
    }
};

struct model {
    std::vector<model_subacl> subacls;
    std::string behind = {}; // bytes that nothing counts
    std::string bytes() const {
        std::string all;
        for (const model_subacl &each : subacls) all += each.bytes();
        return packed_acl(subacls.size(), all + behind);
    }
    auto find(int type, const std::string &mechanism) const {
        return std::ranges::find_if(subacls,
                                    [&](const auto &of) { return of.type == type && same(of.mechanism, mechanism); });
    }
    arguments entries(int type, const char *mechanism) const {
        arguments all;
        for (const model_subacl &each : subacls) {
            const bool by_mechanism = has_mechanism(type) && mechanism != nullptr;
            if (type != 0 && (each.type != type || (by_mechanism && !same(each.mechanism, mechanism)))) continue;
            for (const auto &[identity, mask] : each.expanded())
                all.push_back(
                    text_of(entry(each.type, each.mechanism, each.type < 4 ? nullptr : identity.c_str(), mask)));
            if (type != 0 && (by_mechanism || !has_mechanism(type))) break; // the first of the key
        }
        return all;
    }
    failure edit(edit_function how, const sec_acle_t &acle) {
        const std::string mechanism = has_mechanism(acle.type) ? acle.mechanism : "";
        const std::string identity = acle.type < 4 ? "" : acle.identity;
        const bool deletes = how == sec_del_acle_from_acl;
        auto at = subacls.begin() + (find(acle.type, mechanism) - subacls.begin());
        items held = at == subacls.end() ? items() : at->expanded();
        const auto old = support::find(held, identity);
        if (deletes && old == held.end())
            return error_of(at != subacls.end() && held.empty() ? 43 : 18, 105,
                            {std::to_string(acle.type), mechanism, identity});
        const std::string letter(1, " no u   e       g"[acle.type]);
        if (old != held.end() && how == sec_add_acle_to_acl2)
            return has_mechanism(acle.type) ? error_of(43, 144, {letter, mechanism, identity})
                                            : error_of(43, acle.type < 4 ? 160 : 161, {letter, identity});
        if (at == subacls.end()) {
            // A walk that follows the lengths must find it behind the entries of the last one.
            if (!subacls.empty() && subacls.back().wrong_length) return located(42, 97);
            at = subacls.insert(at, {acle.type, ""});
        } else if (at->wrong_length) {
            // What the length names goes, and what it does not stays out of force.
            behind = (at->bytes() + behind).substr(*at->wrong_length);
        }
        const std::string spelled = held.empty() ? mechanism : at->mechanism;
        if (deletes)
            held.erase(old);
        else
            held.emplace_back(identity, acle.perm_mask);
        *at = {acle.type, spelled, model_subacl{acle.type, "", held}.expanded()};
        if (held.empty()) subacls.erase(at);
        return no_error;
    }
};

// What listing a buffer gives, of one type and mechanism or (type 0) all of it.
inline arguments list_of(const sec_acl_buffer_t &acl, int type = 0, const char *mechanism = nullptr) {
    sec_aclelist_t list = {};
    EXPECT_EQ(type == 0 ? sec_list_acl(&acl, &list) : sec_list_acl_by_type(&acl, type & 31, mechanism, &list), 0);
    return taken(list);
}

} // namespace support
#endif
