// Changes one entry in the text of an ACL file: its line changes, and every other byte stays as it is. The checker's
// own parser finds the lines and words.
#ifndef QZACL_TEXT_EDIT_H
#define QZACL_TEXT_EDIT_H

#include "acl_document.h"
#include "entry_key.h"
#include "permission_set.h"

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace qzacl {

// A text to edit, and its name in messages.
struct named_text {
    const std::string &name;
    std::string_view bytes;
};

// Throws trouble for a compiled ACL.
void require_text(const named_text &text);

// Reads the whole text as the checker does with -c. Throws told_trouble after a mistake.
void check_text(const named_text &text, const permission_set &set, const reading &watched = {});

// The entry of a key.
struct found_entry {
    text_place place;
    std::uint32_t permissions = 0;
};

// Checks the text and looks for a key in it.
std::optional<found_entry> find_entry(const named_text &text, const permission_set &set,
                                      const entry_key &key);

enum class edit_action { set, remove, grant, revoke };

struct text_change {
    edit_action action = edit_action::set;
    entry_key key;
    std::uint32_t permissions = 0;
};

// Whether a change of a text without the entry would add one.
bool adds_entry(const text_change &change);

// The text after a change, checked; the same bytes if nothing changes. `entry` is the result of find_entry. Throws
// trouble if no line can hold the entry.
std::string changed_text(const named_text &text, const permission_set &set, const text_change &change,
                         const std::optional<found_entry> &entry);

} // namespace qzacl

#endif
