// show: the entries as a text that compiles to the same bytes.
#include "acl_document.h"
#include "cli.h"
#include "entry_lines.h"
#include "entry_words.h"
#include "qzacl_acl/entry_parser.h"
#include "trouble.h"

namespace qzacl {

namespace {

// Whether lines lead back to the entries that they show.
class line_checker {
public:
    // The words of an entry that was read from a text are words.
    line_checker(const permission_set &set, bool is_of_text) : set_(set), is_of_text_(is_of_text) {}

    void require_readable(const qz::entry_fields &entry, std::string_view line) {
        const bool has_mechanism = (entry.type & (SEC_ACLE_USER | SEC_ACLE_EXPANDED)) != 0;
        const bool has_identity = has_mechanism || entry.type == SEC_ACLE_GROUP;
        const bool has_words = is_of_text_ || ((!has_mechanism || qz::detail::is_word(entry.mechanism)) &&
                                               (!has_identity || qz::detail::is_word(entry.identity)));
        if (!has_words || line.size() + 1 > qz::line_length_max || !leads_back(entry.permissions))
            throw trouble("no line can hold the entry: " + std::string(line));
    }

private:
    // Letters that two permissions share do not lead back to the second one.
    bool leads_back(std::uint32_t mask) {
        if (mask == 0 || mask == last_mask_)
            return true;
        const std::string letters(set_.letters_of(mask));
        if (!qz::detail::is_word(letters) || set_.mask_of(letters) != mask)
            return false;
        last_mask_ = mask;
        return true;
    }

    const permission_set &set_;
    bool is_of_text_;
    std::uint32_t last_mask_ = 0;
};

} // namespace

int show(const call &call) {
    constexpr std::size_t fetched_ahead = 16;
    entry_lines numbers;
    const bool is_json = call.out.is_json();
    acl_document document(call.line.words[0], call.permissions, is_json ? numbers.watched() : reading());
    line_checker checker(call.permissions, !document.is_compiled());
    held_lines text; // until all of it is known to be readable
    std::string words;
    for (const sec_acltree_t *tree : document.trees()) {
        const std::span<sec_acle_t *const> nodes = nodes_of(*tree);
        for (std::size_t at = 0; at < nodes.size(); ++at) {
            // Entries lie in memory as they stood in the text.
            if (nodes.size() - at > fetched_ahead)
                __builtin_prefetch(nodes[at + fetched_ahead]);
            const qz::entry_fields entry = fields_of(*nodes[at]);
            words.clear();
            append_entry(words, entry, call.permissions);
            checker.require_readable(entry, words);
            if (is_json)
                append_entry_json(text.next(), document.file(), numbers.line_of(entry), entry,
                                  call.permissions);
            else
                text.next().append(words).append("\n");
        }
    }
    call.out.lines(text);
    return yes;
}

} // namespace qzacl
