// Copies the two variables: the program may change its environment while other threads trace.
#include "libqz_tr/environment.h"

#include <cstdlib>
#include <cstring>
#include <pthread.h>

namespace qz::tr {
namespace {

pthread_once_t once = PTHREAD_ONCE_INIT;
constinit trace_settings settings{"", nullptr};

const char *copy_of(const char *name) {
    const char *value = secure_getenv(name);
    return value == nullptr || *value == '\0' ? nullptr : strdup(value);
}

// Without memory for its copy, a variable counts as not set: no tracing, and no harm to the traced program.
void read_environment() {
    if (const char *levels = copy_of("QZ_TRACE_LEVELS"))
        settings.levels = levels;
    settings.file = copy_of("QZ_TRACE_FILE");
}

} // namespace

const trace_settings &environment() {
    pthread_once(&once, read_environment);
    return settings;
}

} // namespace qz::tr
