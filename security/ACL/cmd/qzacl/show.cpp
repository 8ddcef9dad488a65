// show: the entries as a text that compiles to the same bytes.
#include "acl_document.h"
#include "cli.h"
#include "entry_lines.h"
#include "entry_words.h"
#include "qzacl_acl/entry_parser.h"
#include "trouble.h"

namespace qzacl {

namespace {

// Throws unless the line of an entry leads back to it.
void require_readable(const qz::entry_fields &entry, const std::string &line, const permission_set &set) {
    const std::string letters(set.letters_of(entry.permissions));
    std::uint32_t back = 0;
    if (!letters.empty())
        back = set.mask_of(letters);
    const bool is_sound = line.size() + 1 <= qz::line_length_max && back == entry.permissions &&
                          (letters.empty() || qz::detail::is_word(letters));
    const bool has_mechanism = (entry.type & (SEC_ACLE_USER | SEC_ACLE_EXPANDED)) != 0;
    const bool has_identity = has_mechanism || entry.type == SEC_ACLE_GROUP;
    if (!is_sound || (has_mechanism && !qz::detail::is_word(entry.mechanism)) ||
        (has_identity && !qz::detail::is_word(entry.identity)))
        throw trouble("no line can hold the entry: " + line);
}

template <class Each>
void for_each_entry(acl_document &document, const Each &each) {
    for (const sec_acltree_t *tree : document.trees()) {
        for (const sec_acle_t *record : nodes_of(*tree))
            each(fields_of(*record));
    }
}

int show_json(const call &call) {
    entry_lines lines;
    acl_document document(call.line.words[0], call.permissions, lines.watched());
    std::vector<json> objects;
    std::string line;
    for_each_entry(document, [&](const qz::entry_fields &entry) {
        line.clear();
        append_entry(line, entry, call.permissions);
        require_readable(entry, line, call.permissions);
        put_entry(objects.emplace_back(), document.file(), lines.line_of(entry), entry, call.permissions);
    });
    for (const json &each : objects)
        call.out.object(each);
    return yes;
}

} // namespace

int show(const call &call) {
    if (call.out.is_json())
        return show_json(call);
    acl_document document(call.line.words[0], call.permissions);
    std::string text;
    std::string line;
    for_each_entry(document, [&](const qz::entry_fields &entry) {
        line.clear();
        append_entry(line, entry, call.permissions);
        require_readable(entry, line, call.permissions);
        text.append(line).append("\n");
    });
    call.out.lines(text);
    return yes;
}

} // namespace qzacl
