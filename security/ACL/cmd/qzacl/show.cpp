// show: the entries as a text that compiles to the same bytes.
#include "acl_document.h"
#include "cli.h"
#include "entry_lines.h"
#include "entry_words.h"
#include "qzacl_acl/entry_parser.h"
#include "trouble.h"

using namespace qz;

namespace qzacl {

namespace {

// True if the parser reads the same entries from the lines. Those of a text qualify.
class line_checker {
public:
    explicit line_checker(const permission_set &set) : set_(set) {}

    void require_readable(const entry_fields &entry) {
        const bool has_mechanism = (entry.type & (SEC_ACLE_USER | SEC_ACLE_EXPANDED)) != 0;
        const bool has_identity = has_mechanism || entry.type == SEC_ACLE_GROUP;
        const bool has_words = (!has_mechanism || detail::is_word(entry.mechanism)) &&
                               (!has_identity || detail::is_word(entry.identity));
        line_.clear();
        append_entry(line_, entry, set_);
        if (!has_words || line_.size() + 1 > line_length_max || !leads_back(entry.permissions))
            throw trouble("no line can hold the entry: " + line_);
    }

private:
    // Letters that two permissions share do not lead back to the second one.
    bool leads_back(std::uint32_t mask) const {
        const std::string letters(set_.letters_of(mask));
        return mask == 0 || (detail::is_word(letters) && set_.mask_of(letters) == mask);
    }

    const permission_set &set_;
    std::string line_;
};

template <class Each>
void for_each_entry(acl_document &document, const entry_lines &numbers, const Each &each) {
    for (const sec_acltree_t *tree : document.trees()) {
        const tree_entries entries(*tree, numbers);
        for (std::size_t at = 0; at < entries.size(); ++at)
            each(entries.in_turn(at));
    }
}

} // namespace

int show(const call &call) {
    entry_lines numbers;
    const bool is_json = call.out.is_json();
    acl_document document(call.line.words[0], call.permissions, is_json ? numbers.watched() : reading());
    if (document.is_compiled()) {
        line_checker checker(call.permissions);
        for_each_entry(document, numbers,
                       [&](const entry_fields &entry) { checker.require_readable(entry); });
    }
    entry_json as_json(document.file(), call.permissions);
    std::string lines;
    for_each_entry(document, numbers, [&](const entry_fields &entry) {
        if (is_json)
            as_json.append(lines, numbers.line_of(entry), entry);
        else
            append_entry(lines, entry, call.permissions);
        lines += '\n';
        if (lines.size() >= enough_to_write) {
            call.out.lines(lines);
            lines.clear();
        }
    });
    call.out.lines(lines);
    return yes;
}

} // namespace qzacl
