// diff: what changes from one ACL to another, regardless of order, letter case and comments.
#include "acl_document.h"
#include "cli.h"
#include "entry_lines.h"
#include "entry_words.h"
#include "trouble.h"

#include <algorithm>
#include <unordered_map>
#include <vector>

namespace qzacl {

namespace {

using nodes = std::span<sec_acle_t *const>;

struct side {
    entry_lines lines; // which watch the document being read
    acl_document document;

    side(const call &call, std::size_t word)
        : document(call.line.words[word], call.permissions,
                   call.out.is_json() ? lines.watched() : reading()) {}
    side(const side &) = delete;
    side &operator=(const side &) = delete;
};

// Tells the differences one by one.
class difference_list {
public:
    difference_list(const call &call, const side &before, const side &after)
        : call_(call), before_(before), after_(after) {}

    bool is_empty() const { return is_empty_; }

    void remove(const sec_acle_t &entry) { tell("- ", "remove", &entry, nullptr); }
    void add(const sec_acle_t &entry) { tell("+ ", "add", nullptr, &entry); }
    void compare(const sec_acle_t &before, const sec_acle_t &after) {
        if (before.perm_mask != after.perm_mask)
            tell("~ ", "alter", &before, &after);
    }

    void reorder(const char *mechanism) {
        is_empty_ = false;
        if (!call_.out.is_json())
            return call_.out.line(std::string("! e ") + mechanism + ": other order");
        json object;
        object["change"] = "order";
        object["file"] = json_text(after_.document.file());
        object["line"] = nullptr;
        object["type"] = "e";
        object["mechanism"] = json_text(mechanism);
        for (const char *key : {"identity", "permissions", "before", "after"})
            object[key] = nullptr;
        call_.out.object(object);
    }

private:
    void tell(const char *sign, const char *change, const sec_acle_t *before, const sec_acle_t *after) {
        is_empty_ = false;
        const qz::entry_fields shown = fields_of(after != nullptr ? *after : *before);
        if (call_.out.is_json())
            return tell_json(change, shown, before, after);
        line_ = sign;
        if (before != nullptr && after != nullptr) {
            append_key(line_, shown);
            append_letters(" +", after->perm_mask & ~before->perm_mask);
            append_letters(" -", before->perm_mask & ~after->perm_mask);
        } else {
            append_entry(line_, shown, call_.permissions);
        }
        call_.out.line(line_);
    }

    void append_letters(const char *sign, std::uint32_t mask) {
        if (mask != 0)
            line_.append(sign).append(call_.permissions.letters_of(mask));
    }

    void tell_json(const char *change, const qz::entry_fields &shown, const sec_acle_t *before,
                   const sec_acle_t *after) {
        const side &from = after != nullptr ? after_ : before_;
        json object;
        object["change"] = change;
        put_entry(object, from.document.file(), from.lines.line_of(shown), shown, call_.permissions);
        object["before"] = letters_or_null(before);
        object["after"] = letters_or_null(after);
        call_.out.object(object);
    }

    json letters_or_null(const sec_acle_t *entry) const {
        return entry == nullptr ? json() : json_text(call_.permissions.letters_of(entry->perm_mask));
    }

    const call &call_;
    const side &before_;
    const side &after_;
    bool is_empty_ = true;
    std::string line_;
};

// Entries that are stored in the order of their identities.
void compare_sorted(nodes before, nodes after, difference_list &found) {
    auto a = before.begin();
    auto b = after.begin();
    while (a != before.end() || b != after.end()) {
        int order = a == before.end() ? 1 : -1;
        if (a != before.end() && b != after.end())
            order = qz::detail::compare_folded(fields_of(**a).identity, fields_of(**b).identity);
        if (order < 0)
            found.remove(**a++);
        else if (order > 0)
            found.add(**b++);
        else
            found.compare(**a++, **b++);
    }
}

// Of the entries those that both sides have, in the order of this one, and told when the other lacks them.
template <class Lacking>
std::vector<std::string> common_of(nodes entries, nodes others, const Lacking &is_lacking) {
    std::unordered_map<std::string, const sec_acle_t *> by_identity;
    for (const sec_acle_t *other : others)
        by_identity.emplace(folded(other->identity), other);
    std::vector<std::string> common;
    for (const sec_acle_t *entry : entries) {
        const auto found = by_identity.find(folded(entry->identity));
        if (is_lacking(*entry, found == by_identity.end() ? nullptr : found->second))
            continue;
        common.push_back(found->first);
    }
    return common;
}

// Entries of which the first that matches decides.
void compare_chains(nodes before, nodes after, difference_list &found) {
    const auto in_before = common_of(before, after, [&](const sec_acle_t &entry, const sec_acle_t *other) {
        if (other == nullptr)
            found.remove(entry);
        else
            found.compare(entry, *other);
        return other == nullptr;
    });
    const auto in_after = common_of(after, before, [&](const sec_acle_t &entry, const sec_acle_t *other) {
        if (other == nullptr)
            found.add(entry);
        return other == nullptr;
    });
    if (in_before != in_after)
        found.reorder((before.empty() ? after : before)[0]->mechanism);
}

void compare_trees(nodes before, nodes after, difference_list &found) {
    if ((before.empty() ? after : before)[0]->type == SEC_ACLE_EXPANDED)
        compare_chains(before, after, found);
    else
        compare_sorted(before, after, found);
}

std::string key_of_tree(const sec_acltree_t &tree) {
    qz::entry_fields key = fields_of(tree.root());
    key.identity = {};
    return key_of(key);
}

void compare_all(acl_document &before, acl_document &after, difference_list &found) {
    std::unordered_map<std::string, const sec_acltree_t *> only_after;
    for (const sec_acltree_t *tree : after.trees())
        only_after.emplace(key_of_tree(*tree), tree);
    for (const sec_acltree_t *tree : before.trees()) {
        const auto other = only_after.find(key_of_tree(*tree));
        const bool is_common = other != only_after.end();
        compare_trees(nodes_of(*tree), is_common ? nodes_of(*other->second) : nodes(), found);
        if (is_common)
            only_after.erase(other);
    }
    for (const sec_acltree_t *tree : after.trees()) {
        if (only_after.count(key_of_tree(*tree)) != 0)
            compare_trees({}, nodes_of(*tree), found);
    }
}

} // namespace

int diff(const call &call) {
    side before(call, 0);
    side after(call, 1);
    difference_list found(call, before, after);
    compare_all(before.document, after.document, found);
    return found.is_empty() ? yes : no;
}

} // namespace qzacl
