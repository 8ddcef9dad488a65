// who: the entries that hold all of some permissions.
#include "acl_document.h"
#include "cli.h"
#include "entry_words.h"
#include "trouble.h"

#include <vector>

namespace qzacl {

namespace {

struct holder {
    qz::entry_fields entry;
    std::size_t line;
};

} // namespace

int who(const call &call) {
    const std::uint32_t wanted = call.permissions.mask_of(call.line.words[1]);
    std::vector<holder> holders;
    reading watched;
    watched.entry = [&](const qz::entry_fields &entry, const text_place &place) {
        if ((entry.permissions & wanted) == wanted)
            holders.push_back({entry, place.line});
    };
    // Kept until the whole file is known to be sound.
    const acl_document document(call.line.words[0], call.permissions, watched);
    std::string shown;
    for (const holder &each : holders) {
        if (call.out.is_json()) {
            json object;
            put_entry(object, document.file(), each.line, each.entry, call.permissions);
            call.out.object(object);
            continue;
        }
        shown = document.place(each.line);
        shown += ": ";
        append_entry(shown, each.entry, call.permissions);
        call.out.line(shown);
    }
    return holders.empty() ? no : yes;
}

} // namespace qzacl
