// Puts a new file in the place of one that is edited, whole or not at all.
#ifndef QZACL_REPLACED_FILE_H
#define QZACL_REPLACED_FILE_H

#include "edited_file.h"

#include <string_view>

namespace qzacl {

// Replaces a file that was read, under its lock. The new one has the owner, group, mode, access control entries and
// extended attributes of the old one before it gets its name, and is on disk then. Throws trouble; the old file
// is there then, unless only the folder could not be synced.
void replace_file(const edited_file &file, std::string_view bytes);

} // namespace qzacl

#endif
