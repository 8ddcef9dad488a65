// The process's message catalogs. Each is opened when its first text is fetched, and stays open because callers keep
// pointers to its texts.
#include "libqz_cu/catalog.h"

#include "base/uncancelled.h"

#include <algorithm>
#include <atomic>
#include <cstddef>
#include <cstring>
#include <iterator>
#include <nl_types.h>
#include <pthread.h>

namespace qz::cu {
namespace {

struct opened_catalog {
    char name[64];
    nl_catd descriptor; // from catopen; a failure is kept, too, so that it does not search again
};

// Entries are only ever added, and the count is raised last. So the counted ones are read without the lock.
constinit opened_catalog catalogs[8] = {};
constinit std::atomic<std::size_t> catalog_count = 0;
pthread_mutex_t catalogs_mutex = PTHREAD_MUTEX_INITIALIZER;

void lock() { pthread_mutex_lock(&catalogs_mutex); }
void unlock() { pthread_mutex_unlock(&catalogs_mutex); }

// Otherwise a child forked while another thread opens a catalog would wait forever for a thread that it does not
// have.
[[gnu::constructor]] void keep_free_over_fork() { pthread_atfork(lock, unlock, unlock); }

const nl_catd no_catalog = reinterpret_cast<nl_catd>(-1);

const opened_catalog *find(const char *name) {
    const std::size_t count = catalog_count.load(std::memory_order_acquire);
    const opened_catalog *const found =
        std::find_if(catalogs, catalogs + count,
                     [name](const opened_catalog &each) { return std::strcmp(each.name, name) == 0; });
    return found == catalogs + count ? nullptr : found;
}

// The caller holds the lock. Null if there is no room for another catalog.
const opened_catalog *find_or_open(const char *name) {
    if (const opened_catalog *const found = find(name))
        return found;
    const std::size_t count = catalog_count.load(std::memory_order_relaxed);
    const std::size_t length = std::strlen(name);
    if (count == std::size(catalogs) || length >= sizeof catalogs->name)
        return nullptr;
    opened_catalog &added = catalogs[count];
    std::memcpy(added.name, name, length + 1);
    added.descriptor = catopen(name, NL_CAT_LOCALE);
    catalog_count.store(count + 1, std::memory_order_release);
    return &added;
}

const opened_catalog *lock_and_open(const char *name) {
    const uncancelled until_unlocked;
    lock();
    const opened_catalog *const found = find_or_open(name);
    unlock();
    return found;
}

} // namespace

const char *catalog_text(const char *catalog, int set, int message_id) {
    const opened_catalog *opened = find(catalog);
    if (opened == nullptr)
        opened = lock_and_open(catalog);
    if (opened == nullptr || opened->descriptor == no_catalog)
        return nullptr;
    // POSIX lets it be a cancellation point, and callers hold memory.
    const uncancelled until_found;
    return catgets(opened->descriptor, set, message_id, nullptr);
}

} // namespace qz::cu
