// The process's message catalogs, each opened once.
#ifndef QZ_CU_CATALOG_H
#define QZ_CU_CATALOG_H

namespace qz::cu {

// The text of a message in a catalog, or null. It is valid for the life of the process and must not be trusted:
// anybody may have installed the catalog.
const char *catalog_text(const char *catalog, int set, int message_id);

} // namespace qz::cu

#endif
