// Puts a new file in the place of one that is edited, whole or not at all.
#ifndef QZACL_REPLACED_FILE_H
#define QZACL_REPLACED_FILE_H

#include "edited_file.h"

#include <string_view>

namespace qzacl {

// Replaces a file that was read, under its lock. Before the new one gets its name, it has the owner, group, mode,
// access control entries and extended attributes of the old one, and is on disk. Throws trouble; the old file is then
// still in place, unless only the sync of the folder failed.
void replace_file(const edited_file &file, std::string_view bytes);

} // namespace qzacl

#endif
