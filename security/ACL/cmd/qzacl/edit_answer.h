// The end of every edit: the answer and, with -s, the cache.
#ifndef QZACL_EDIT_ANSWER_H
#define QZACL_EDIT_ANSWER_H

#include "edited_file.h"
#include "text_edit.h"
#include "verbs.h"

namespace qzacl {

// Reads the file named by the first word. Throws trouble.
edited_file file_to_edit(const call &call);

// Prints whether the file changed, and compiles it if requested. Returns the exit status.
int answer_edit(const call &call, const edited_file &file, bool has_changed);

// Makes one change of an entry or, with --check, shows it: the work of set, remove, grant and revoke. Returns the
// exit status.
int change_entry(const call &call, const text_change &change);

// The change of grant or revoke: the second word has the letters, and the key follows.
text_change change_of_letters(const call &call, edit_action action);

} // namespace qzacl

#endif
