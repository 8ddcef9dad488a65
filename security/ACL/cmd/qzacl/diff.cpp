// diff: what changes from one ACL to another, regardless of order, letter case and comments.
#include "acl_document.h"
#include "cli.h"
#include "entry_lines.h"
#include "entry_words.h"
#include "trouble.h"

#include <unordered_map>
#include <vector>

namespace qzacl {

namespace {

using nodes = std::span<const sec_acle_t>;

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
    difference_list(const call &call, side &before, side &after)
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
        side &from = after != nullptr ? after_ : before_;
        const std::size_t number = from.lines.line_of(shown);
        line_.clear();
        append_entry_json(line_, from.document.file(), number, shown, call_.permissions);
        line_.resize(line_.size() - 2); // the end of the object is yet to come
        line_.append(",\"change\":\"").append(change).append("\",\"before\":");
        append_letters_or_null(before);
        line_ += ",\"after\":";
        append_letters_or_null(after);
        call_.out.line(line_ += '}');
    }

    void append_letters_or_null(const sec_acle_t *entry) {
        if (entry == nullptr)
            line_ += "null";
        else
            append_json_text(line_, call_.permissions.letters_of(entry->perm_mask));
    }

    const call &call_;
    side &before_;
    side &after_;
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
            order = qz::detail::compare_folded(fields_of(*a).identity, fields_of(*b).identity);
        if (order < 0)
            found.remove(*a++);
        else if (order > 0)
            found.add(*b++);
        else
            found.compare(*a++, *b++);
    }
}

// Finds entries by identity.
class identity_index {
public:
    explicit identity_index(nodes entries) {
        places_.reserve(entries.size());
        for (std::size_t place = 0; place < entries.size(); ++place)
            places_.emplace(folded(entries[place].identity), place);
    }

    // The place in the entries, or that behind them.
    std::size_t find(const sec_acle_t &entry) const {
        const auto found = places_.find(folded(entry.identity));
        return found == places_.end() ? places_.size() : found->second;
    }

private:
    std::unordered_map<std::string, std::size_t> places_;
};

// Entries of which the first that matches decides, so that their order is a difference.
void compare_chains(nodes before, nodes after, difference_list &found) {
    const std::string mechanism = (before.empty() ? after : before)[0].mechanism;
    while (!before.empty() && !after.empty() &&
           qz::detail::same_folded(before[0].identity, after[0].identity)) {
        found.compare(before[0], after[0]);
        before = before.subspan(1);
        after = after.subspan(1);
    }
    const identity_index index(after);
    std::vector<bool> is_in_both(after.size());
    bool is_in_order = true;
    std::size_t last = 0;
    for (const sec_acle_t &entry : before) {
        const std::size_t place = index.find(entry);
        if (place == after.size()) {
            found.remove(entry);
            continue;
        }
        found.compare(entry, after[place]);
        is_in_both[place] = true;
        is_in_order = is_in_order && place >= last;
        last = place;
    }
    for (std::size_t place = 0; place < after.size(); ++place) {
        if (!is_in_both[place])
            found.add(after[place]);
    }
    if (!is_in_order)
        found.reorder(mechanism.c_str());
}

void compare_trees(nodes before, nodes after, difference_list &found) {
    if ((before.empty() ? after : before)[0].type == SEC_ACLE_EXPANDED)
        compare_chains(before, after, found);
    else
        compare_sorted(before, after, found);
}

std::string key_of_tree(const sec_acltree_t &tree) { return key_of({tree.type(), 0, tree.mechanism(), {}}); }

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
