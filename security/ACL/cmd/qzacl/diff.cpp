// diff: what changes from one ACL to another, regardless of order, letter case and comments.
#include "acl_document.h"
#include "cli.h"
#include "entry_lines.h"
#include "entry_words.h"
#include "qzacl_acl/identity_table.h"
#include "trouble.h"

#include <algorithm>
#include <new>
#include <unordered_map>
#include <vector>

using namespace qz;

namespace qzacl {

namespace {

struct side {
    entry_lines lines; // which watch the document being read
    acl_document document;

    side(const call &call, std::size_t word)
        : document(call.line.words[word], call.permissions, watched(call)) {}
    side(const side &) = delete;
    side &operator=(const side &) = delete;

private:
    reading watched(const call &call) {
        reading made = call.out.is_json() ? lines.watched() : reading();
        made.names_file = true;
        return made;
    }
};

// Prints the differences.
class difference_list {
public:
    difference_list(const call &call, const side &before, const side &after)
        : call_(call), before_(before), after_(after), before_json_(before.document.file(), call.permissions),
          after_json_(after.document.file(), call.permissions) {}

    bool is_empty() const { return is_empty_; }

    void remove(const entry_fields &entry) { tell("- ", "remove", &entry, nullptr); }
    void add(const entry_fields &entry) { tell("+ ", "add", nullptr, &entry); }
    void compare(const entry_fields &before, const entry_fields &after) {
        if (before.permissions != after.permissions)
            tell("~ ", "alter", &before, &after);
    }

    void reorder(std::string_view mechanism) {
        is_empty_ = false;
        if (!call_.out.is_json())
            return call_.out.line("! e " + folded(mechanism) + ": other order");
        json object;
        object["change"] = "order";
        object["file"] = json_text(after_.document.file());
        object["line"] = nullptr;
        object["type"] = "e";
        object["mechanism"] = json_text(folded(mechanism));
        for (const char *key : {"identity", "permissions", "before", "after"})
            object[key] = nullptr;
        call_.out.object(object);
    }

private:
    void tell(const char *sign, const char *change, const entry_fields *before, const entry_fields *after) {
        is_empty_ = false;
        const entry_fields &shown = after != nullptr ? *after : *before;
        if (call_.out.is_json())
            return tell_json(change, shown, before, after);
        line_ = sign;
        if (before != nullptr && after != nullptr) {
            append_key(line_, shown);
            append_letters(" +", after->permissions & ~before->permissions);
            append_letters(" -", before->permissions & ~after->permissions);
        } else {
            append_entry(line_, shown, call_.permissions);
        }
        call_.out.line(line_);
    }

    void append_letters(const char *sign, std::uint32_t mask) {
        if (mask != 0)
            line_.append(sign).append(call_.permissions.letters_of(mask));
    }

    void tell_json(const char *change, const entry_fields &shown, const entry_fields *before,
                   const entry_fields *after) {
        const side &from = after != nullptr ? after_ : before_;
        const std::size_t number = from.lines.line_of(shown);
        line_.clear();
        (after != nullptr ? after_json_ : before_json_).append(line_, number, shown);
        line_.pop_back(); // the end of the object is yet to come
        line_.append(",\"change\":\"").append(change).append("\",\"before\":");
        append_letters_or_null(before);
        line_ += ",\"after\":";
        append_letters_or_null(after);
        call_.out.line(line_ += '}');
    }

    void append_letters_or_null(const entry_fields *entry) {
        if (entry == nullptr)
            line_ += "null";
        else
            append_json_text(line_, call_.permissions.letters_of(entry->permissions));
    }

    const call &call_;
    const side &before_;
    const side &after_;
    entry_json before_json_;
    entry_json after_json_;
    bool is_empty_ = true;
    std::string line_;
};

// Entries that are stored in the order of their identities.
void compare_sorted(const tree_entries &before, const tree_entries &after, difference_list &found) {
    std::size_t a = 0;
    std::size_t b = 0;
    while (a != before.size() && b != after.size()) {
        const entry_fields one = before.in_turn(a);
        const entry_fields other = after.in_turn(b);
        const int order = detail::compare_folded(one.identity, other.identity);
        if (order < 0)
            found.remove(one);
        else if (order > 0)
            found.add(other);
        else
            found.compare(one, other);
        a += order <= 0 ? 1 : 0;
        b += order >= 0 ? 1 : 0;
    }
    for (; a != before.size(); ++a)
        found.remove(before[a]);
    for (; b != after.size(); ++b)
        found.add(after[b]);
}

// Finds entries by identity, starting at a place.
class identity_index {
public:
    identity_index(const tree_entries &entries, std::size_t first) : entries_(entries) {
        if (const shortage lacking = table_.reset(static_cast<std::uint32_t>(entries.size() - first + 1)))
            throw std::bad_alloc();
        for (std::size_t place = first; place < entries.size(); ++place)
            table_.enter(hash_of(entries.identity(place)), static_cast<std::uint32_t>(place));
    }

    // Prefetches the memory that find reads.
    void fetch(const char *identity) const { __builtin_prefetch(table_.first_look(hash_of(identity))); }

    // The place in the entries, or their number if there is none.
    std::size_t find(const char *identity) const {
        const std::uint32_t found = table_.find(hash_of(identity), [&](std::uint32_t place) {
            return compare_identities(entries_.identity(place), identity) == 0;
        });
        return found == identity_table::none ? entries_.size() : found;
    }

private:
    std::uint64_t hash_of(const char *identity) const {
        return table_.hash(identity, ordered_word(identity));
    }

    const tree_entries &entries_;
    identity_table table_;
};

// Compares the common start of both chains. Returns its number of entries.
std::size_t compare_common(const tree_entries &before, const tree_entries &after, difference_list &found) {
    std::size_t at = 0;
    for (; at < std::min(before.size(), after.size()); ++at) {
        const entry_fields one = before[at];
        const entry_fields other = after[at];
        if (!detail::same_folded(one.identity, other.identity))
            break;
        found.compare(one, other);
    }
    return at;
}

// Compares entries whose first match decides, so another order is a difference.
void compare_chains(const tree_entries &before, const tree_entries &after, difference_list &found) {
    constexpr std::size_t fetched_ahead = 16;
    const std::size_t first = compare_common(before, after, found);
    const identity_index index(after, first);
    std::vector<bool> is_in_both(after.size());
    bool is_in_order = true;
    std::size_t last = 0;
    for (std::size_t at = first; at < before.size(); ++at) {
        if (before.size() - at > fetched_ahead)
            index.fetch(before.identity(at + fetched_ahead));
        const entry_fields entry = before[at];
        const std::size_t place = index.find(before.identity(at));
        if (place == after.size()) {
            found.remove(entry);
            continue;
        }
        found.compare(entry, after[place]);
        is_in_both[place] = true;
        is_in_order = is_in_order && place >= last;
        last = place;
    }
    for (std::size_t place = first; place < after.size(); ++place) {
        if (!is_in_both[place])
            found.add(after[place]);
    }
    if (!is_in_order)
        found.reorder(before[0].mechanism);
}

void compare_trees(const tree_entries &before, const tree_entries &after, difference_list &found) {
    if ((before.empty() ? after : before)[0].type == SEC_ACLE_EXPANDED)
        compare_chains(before, after, found);
    else
        compare_sorted(before, after, found);
}

std::string key_of_tree(const sec_acltree_t &tree) { return key_of({tree.type(), 0, tree.mechanism(), {}}); }

void compare_all(side &before, side &after, difference_list &found) {
    const auto entries_of = [](const side &from, const sec_acltree_t *tree) {
        return tree != nullptr ? tree_entries(*tree, from.lines) : tree_entries();
    };
    std::unordered_map<std::string, const sec_acltree_t *> only_after;
    for (const sec_acltree_t *tree : after.document.trees())
        only_after.emplace(key_of_tree(*tree), tree);
    for (const sec_acltree_t *tree : before.document.trees()) {
        const auto other = only_after.extract(key_of_tree(*tree));
        compare_trees(entries_of(before, tree), entries_of(after, other ? other.mapped() : nullptr), found);
    }
    for (const sec_acltree_t *tree : after.document.trees()) {
        if (only_after.contains(key_of_tree(*tree)))
            compare_trees({}, entries_of(after, tree), found);
    }
}

} // namespace

int diff(const call &call) {
    side before(call, 0);
    side after(call, 1);
    difference_list found(call, before, after);
    compare_all(before, after, found);
    return found.is_empty() ? yes : no;
}

} // namespace qzacl
