// The lines of a text's entries, by what the entries speak of; and the entries of a tree.
#ifndef QZACL_ENTRY_LINES_H
#define QZACL_ENTRY_LINES_H

#include "acl_document.h"
#include "entry_words.h"
#include "trouble.h"

#include <bit>
#include <functional>
#include <string>
#include <vector>

namespace qzacl {

// Gathers lines while a document is read, where an answer that is put together from its trees shows them. Used as
// long as the document lives.
class entry_lines {
public:
    reading watched() {
        return {.entry = [this](const qz::entry_fields &entry, const text_place &place) {
            if (place.line != 0)
                known_.push_back({entry, place.line});
        }};
    }

    // 0 where it is not known.
    std::size_t line_of(const qz::entry_fields &entry) {
        if (slots_.empty())
            index();
        const std::uint32_t number = slots_[slot_of(entry)];
        return number == 0 ? 0 : known_[number - 1].line;
    }

private:
    struct known_entry {
        qz::entry_fields entry;
        std::size_t line;
    };

    void index() {
        slots_.resize(std::bit_ceil(2 * known_.size() + 1));
        for (std::size_t at = 0; at < known_.size(); ++at)
            slots_[slot_of(known_[at].entry)] = static_cast<std::uint32_t>(at + 1);
    }

    // The slot that holds the entry, or the free one where it would go.
    std::size_t slot_of(const qz::entry_fields &entry) const {
        const std::size_t last = slots_.size() - 1;
        std::size_t slot = std::hash<std::string>()(key_of(entry)) & last;
        while (slots_[slot] != 0 && !is_same(known_[slots_[slot] - 1].entry, entry))
            slot = (slot + 1) & last;
        return slot;
    }

    static bool is_same(const qz::entry_fields &a, const qz::entry_fields &b) {
        return a.type == b.type && qz::detail::same_folded(a.identity, b.identity) &&
               qz::detail::same_folded(a.mechanism, b.mechanism);
    }

    std::vector<known_entry> known_;
    std::vector<std::uint32_t> slots_; // a number of the known ones plus one; 0 where it is free
};

// The entries of a tree as they are stored. They borrow its texts.
inline std::vector<sec_acle_t> nodes_of(const sec_acltree_t &tree) {
    std::vector<sec_acle_t> nodes;
    nodes.reserve(tree.held_count());
    for (const qz::small_entry &entry : tree.in_order())
        nodes.push_back(tree.record(entry));
    return nodes;
}

} // namespace qzacl

#endif
