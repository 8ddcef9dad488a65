// who: the entries that hold all of some permissions.
#include "acl_document.h"
#include "cli.h"
#include "entry_words.h"
#include "trouble.h"

using namespace qz;

namespace qzacl {

int who(const call &call) {
    const std::string &file = call.line.words[0];
    const std::uint32_t wanted = call.permissions.mask_of(call.line.words[1]);
    held_lines found; // until the whole file is known to be sound
    bool is_empty = true;
    entry_json as_json(file, call.permissions);
    reading watched;
    watched.entry = [&](const entry_fields &entry, const text_place &place) {
        if ((entry.permissions & wanted) != wanted)
            return;
        is_empty = false;
        std::string &lines = found.next();
        if (call.out.is_json()) {
            as_json.append(lines, place.line, entry);
        } else {
            append_place(lines, file, place.line);
            append_entry(lines.append(": "), entry, call.permissions);
        }
        lines += '\n';
    };
    const acl_document document(file, call.permissions, watched);
    call.out.lines(found);
    return is_empty ? no : yes;
}

} // namespace qzacl
