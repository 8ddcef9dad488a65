// What the administrator asks for, as it stood in the environment when tracing first needed it.
#ifndef QZ_TR_ENVIRONMENT_H
#define QZ_TR_ENVIRONMENT_H

namespace qz::tr {

struct trace_settings {
    const char *levels; // QZ_TRACE_LEVELS, empty when not set
    const char *file;   // QZ_TRACE_FILE, null when not set or empty
};

// Read once in the life of the process; the copies stay to its end.
const trace_settings &environment();

} // namespace qz::tr

#endif
