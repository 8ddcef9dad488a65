// Changes one entry in the text of an ACL file.
#include "text_edit.h"

#include "entry_words.h"
#include "qzacl_acl/entry.h"
#include "qzacl_acl/entry_parser.h"
#include "qzacl_acl/line_words.h"
#include "trouble.h"

#include <algorithm>

using namespace qz;

namespace qzacl {

namespace {

constexpr std::string_view line_ends("\n\f\r");

// The permissions that an entry has after a change.
std::uint32_t permissions_after(const text_change &change, std::uint32_t before) {
    switch (change.action) {
    case edit_action::grant:
        return before | change.permissions;
    case edit_action::revoke:
        return before & ~change.permissions;
    default:
        return change.permissions;
    }
}

// To an editor these two bytes are one line end; to the parser they end a line and a blank one.
bool ends_in_crlf(std::string_view text, std::size_t end) {
    return end != 0 && end < text.size() && text[end - 1] == '\r' && text[end] == '\n';
}

std::string without_line(std::string_view text, const found_entry &entry) {
    const auto [line, begin, end] = entry.place;
    return std::string(text).erase(begin, end - begin + (ends_in_crlf(text, end) ? 1 : 0));
}

std::string with_letters(std::string_view text, const found_entry &entry, std::uint8_t type,
                         const std::string &letters) {
    const std::size_t begin = entry.place.begin;
    std::string line(text.substr(begin, entry.place.end - begin));
    const std::size_t line_end = line.find_last_not_of(line_ends) + 1;
    line_words tokens(line.data(), line.data() + line_end);
    line_word last;
    line_word word;
    const int words = 1 + (has_mechanism(type) ? 1 : 0) + (has_identity(type) ? 1 : 0);
    for (int left = words; left != 0 && tokens.next(word); --left)
        last = word;
    const std::string_view view(line);
    const auto place_of = [&](const char *at) { return begin + static_cast<std::size_t>(at - view.data()); };
    if (tokens.next(word))
        return std::string(text).replace(place_of(word.text), word.length, letters);
    return std::string(text).insert(place_of(last.text) + last.length, " " + letters);
}

// The end of the first line, which a new one gets, too.
std::string_view line_end_of(std::string_view text) {
    const std::size_t first = text.find_first_of(line_ends);
    if (first == std::string_view::npos)
        return "\n";
    return text.substr(first, ends_in_crlf(text, first + 1) ? 2 : 1);
}

// The end of the text: its last byte, or a NUL at the start of a line. Any other NUL is a mistake.
std::size_t end_of_lines(std::string_view text) { return std::min(text.find('\0'), text.size()); }

std::string with_line(std::string_view text, const std::string &words) {
    const std::size_t place = end_of_lines(text);
    const std::string_view line_end = line_end_of(text.substr(0, place));
    std::string added;
    if (place != 0 && line_ends.find(text[place - 1]) == std::string_view::npos)
        added += line_end;
    added.append(words).append(line_end);
    return std::string(text).insert(place, added);
}

bool matches(const entry_fields &entry, const entry_key &key, const std::string &identity) {
    return entry.type == key.type && entry.mechanism == key.mechanism &&
           same_identity(entry.identity, identity);
}

std::string changed_bytes(std::string_view text, const permission_set &set, const text_change &change,
                          const std::optional<found_entry> &entry) {
    if (!entry && !adds_entry(change))
        return std::string(text);
    if (!entry)
        return with_line(text, line_of(change.key, change.permissions, set));
    if (change.action == edit_action::remove)
        return without_line(text, *entry);
    const std::uint32_t permissions = permissions_after(change, entry->permissions);
    if (permissions == entry->permissions)
        return std::string(text);
    return with_letters(text, *entry, change.key.type, std::string(set.letters_of(permissions)));
}

} // namespace

void require_text(const named_text &text) {
    constexpr char first_of_compiled = '\x85';
    if (text.bytes.substr(0, 1) == std::string_view(&first_of_compiled, 1))
        throw trouble(text.name + ": only texts can be edited, and this is a compiled ACL");
}

void check_text(const named_text &text, const permission_set &set, const reading &watched) {
    require_text(text);
    const acl_document document(text.name, text.bytes, set, watched);
}

std::optional<found_entry> find_entry(const named_text &text, const permission_set &set,
                                      const entry_key &key) {
    std::optional<found_entry> written;
    std::optional<found_entry> stored;
    reading watched;
    watched.entry = [&](const entry_fields &entry, const text_place &place) {
        if (matches(entry, key, key.identity))
            written = {place, entry.permissions};
        else if (matches(entry, key, key.stored))
            stored = {place, entry.permissions};
    };
    check_text(text, set, watched);
    return written ? written : stored;
}

bool adds_entry(const text_change &change) {
    return change.action == edit_action::set || change.action == edit_action::grant;
}

std::string changed_text(const named_text &text, const permission_set &set, const text_change &change,
                         const std::optional<found_entry> &entry) {
    std::string changed = changed_bytes(text.bytes, set, change, entry);
    if (changed == text.bytes)
        return changed;
    const auto after = find_entry({text.name, changed}, set, change.key);
    // A set may use '#' as a letter, which begins a comment.
    const std::uint32_t wanted = permissions_after(change, entry ? entry->permissions : 0);
    if (change.action != edit_action::remove && (!after || after->permissions != wanted))
        throw trouble(text.name + ": no line can hold these letters");
    return changed;
}

} // namespace qzacl
