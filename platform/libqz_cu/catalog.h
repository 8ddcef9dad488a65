// The message catalogs of the process, each opened once.
#ifndef QZ_CU_CATALOG_H
#define QZ_CU_CATALOG_H

namespace qz::cu {

// The text of a message in a catalog, or null when there is none. It stays valid as long as the process runs
// and is not to be trusted: a catalog is a file that anybody may have put there.
const char *catalog_text(const char *catalog, int set, int message_id);

} // namespace qz::cu

#endif
