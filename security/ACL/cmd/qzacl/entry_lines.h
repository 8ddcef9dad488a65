// The entries of a document as they are stored, and the lines that they came from.
#ifndef QZACL_ENTRY_LINES_H
#define QZACL_ENTRY_LINES_H

#include "acl_document.h"

#include <bit>
#include <cstdint>
#include <span>
#include <string_view>
#include <vector>

namespace qzacl {

// Finds the lines of entries in the trees of a document. The identities are in the text, so the line feeds before
// them, which are counted for each block of the text, give the lines.
class entry_lines {
public:
    // Watches the document being read.
    reading watched() {
        return {.whole_text = [this](std::string_view text) { count_feeds(text); },
                .unnamed = [this](std::uint8_t type, std::size_t line) { unnamed_[type] = line; }};
    }

    // The line of an entry of the document; 0 if it is unknown.
    std::size_t line_of(const qz::entry_fields &entry) const {
        if (entry.identity.empty())
            return unnamed_[entry.type];
        const std::size_t place = place_of(entry.identity.data());
        if (place / block_size >= blocks_.size())
            return 0;
        const block &found = blocks_[place / block_size];
        const std::uint64_t before = (std::uint64_t{1} << place % block_size) - 1;
        return found.line + static_cast<std::size_t>(std::popcount(found.feeds & before));
    }

    // Prefetches the memory that line_of reads for an entry with this identity.
    void fetch(const char *identity) const {
        if (const std::size_t at = place_of(identity) / block_size; at < blocks_.size())
            __builtin_prefetch(&blocks_[at]);
    }

private:
    static constexpr std::size_t block_size = 64;

    struct block {
        std::uint64_t feeds = 0; // a bit for each byte
        std::size_t line = 0;    // that it begins in
    };

    void count_feeds(std::string_view text) {
        text_ = text.data();
        blocks_.resize(text.size() / block_size + 1);
        for (std::size_t at = text.find('\n'); at != std::string_view::npos; at = text.find('\n', at + 1))
            blocks_[at / block_size].feeds |= std::uint64_t{1} << at % block_size;
        std::size_t line = 1;
        for (block &each : blocks_) {
            each.line = line;
            line += static_cast<std::size_t>(std::popcount(each.feeds));
        }
    }

    // A large number for an identity outside the text.
    std::size_t place_of(const char *identity) const {
        return reinterpret_cast<std::uintptr_t>(identity) - reinterpret_cast<std::uintptr_t>(text_);
    }

    const char *text_ = nullptr;
    std::vector<block> blocks_;
    std::size_t unnamed_[UINT8_MAX + 1] = {};
};

// The entries of a tree as they are stored. They borrow its texts.
class tree_entries {
public:
    tree_entries() = default;
    tree_entries(const sec_acltree_t &tree, const entry_lines &lines)
        : tree_(&tree), lines_(&lines), entries_(tree.in_order()) {}

    std::size_t size() const { return entries_.size(); }
    bool empty() const { return entries_.empty(); }

    const char *identity(std::size_t at) const { return tree_->identity(entries_[at]); }

    qz::entry_fields operator[](std::size_t at) const {
        const qz::acle_view entry = tree_->view(entries_[at]);
        return {entry.type, entry.perm_mask, entry.mechanism, entry.identity};
    }

    // The same in a loop over all entries: prefetches the next ones, which are in memory in the order of the text.
    qz::entry_fields in_turn(std::size_t at) const {
        constexpr std::size_t fetched_ahead = 32;
        if (entries_.size() - at > fetched_ahead) {
            const char *const next = identity(at + fetched_ahead);
            __builtin_prefetch(next);
            lines_->fetch(next);
        }
        return (*this)[at];
    }

private:
    const sec_acltree_t *tree_ = nullptr;
    const entry_lines *lines_ = nullptr;
    std::span<const qz::small_entry> entries_;
};

} // namespace qzacl

#endif
