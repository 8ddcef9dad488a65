// What all edits end with: the answer, and with -s the cache.
#ifndef QZACL_EDIT_ANSWER_H
#define QZACL_EDIT_ANSWER_H

#include "edited_file.h"
#include "text_edit.h"
#include "verbs.h"

namespace qzacl {

// The file that the first word names, read. Throws trouble.
edited_file file_to_edit(const call &call);

// Says whether the file changed, and compiles it where that is wanted. Gives the exit status.
int answer_edit(const call &call, const edited_file &file, bool has_changed);

// Makes one change of an entry, or with --check shows it: what set, remove, grant and revoke do. Gives the exit status.
int change_entry(const call &call, const text_change &change);

// The change of grant or revoke: the second word has the letters, and the key follows.
text_change change_of_letters(const call &call, edit_action action);

} // namespace qzacl

#endif
