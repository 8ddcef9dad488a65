// The lines of a text's entries, by what the entries speak of; and the entries of a tree.
#ifndef QZACL_ENTRY_LINES_H
#define QZACL_ENTRY_LINES_H

#include "acl_document.h"
#include "entry_words.h"
#include "trouble.h"

#include <string>
#include <unordered_map>

namespace qzacl {

// Gathers lines while a document is read, where an answer that is put together from its trees shows them.
class entry_lines {
public:
    reading watched() {
        return {.entry = [this](const qz::entry_fields &entry, const text_place &place) {
            if (place.line != 0)
                lines_.emplace(key_of(entry), place.line);
        }};
    }

    // 0 where it is not known.
    std::size_t line_of(const qz::entry_fields &entry) const {
        const auto found = lines_.find(key_of(entry));
        return found == lines_.end() ? 0 : found->second;
    }

private:
    std::unordered_map<std::string, std::size_t> lines_;
};

// The entries of a tree as they are stored.
inline std::span<sec_acle_t *const> nodes_of(const sec_acltree_t &tree) {
    std::span<sec_acle_t *const> nodes;
    std::size_t refused = 0;
    if (!tree.in_order(nodes, refused))
        throw std::bad_alloc();
    return nodes;
}

} // namespace qzacl

#endif
