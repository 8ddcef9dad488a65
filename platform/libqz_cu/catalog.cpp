// The process's message catalogs. Each is opened when its first text is fetched, and stays open because callers keep
// pointers to its texts.
#include "libqz_cu/catalog.h"

#include "base/uncancelled.h"

#include <cstddef>
#include <cstring>
#include <nl_types.h>
#include <pthread.h>

namespace qz::cu {
namespace {

struct opened_catalog {
    char name[64];
    nl_catd descriptor; // from catopen; a failure is kept, too, so that it does not search again
};

constinit opened_catalog catalogs[8] = {};
constinit std::size_t catalog_count = 0;
pthread_mutex_t catalogs_mutex = PTHREAD_MUTEX_INITIALIZER;

void lock() { pthread_mutex_lock(&catalogs_mutex); }
void unlock() { pthread_mutex_unlock(&catalogs_mutex); }

// Otherwise a child forked while another thread opens a catalog would wait forever for a thread that it does not
// have.
[[gnu::constructor]] void keep_free_over_fork() { pthread_atfork(lock, unlock, unlock); }

const nl_catd no_catalog = reinterpret_cast<nl_catd>(-1);

nl_catd find_or_open(const char *name) {
    for (std::size_t i = 0; i < catalog_count; ++i)
        if (std::strcmp(catalogs[i].name, name) == 0)
            return catalogs[i].descriptor;
    const std::size_t length = std::strlen(name);
    if (catalog_count == sizeof catalogs / sizeof *catalogs || length >= sizeof catalogs->name)
        return no_catalog;
    opened_catalog &added = catalogs[catalog_count++];
    std::memcpy(added.name, name, length + 1);
    added.descriptor = catopen(name, NL_CAT_LOCALE);
    return added.descriptor;
}

} // namespace

const char *catalog_text(const char *catalog, int set, int message_id) {
    const uncancelled until_unlocked;
    lock();
    const nl_catd descriptor = find_or_open(catalog);
    unlock();
    return descriptor == no_catalog ? nullptr : catgets(descriptor, set, message_id, nullptr);
}

} // namespace qz::cu
