// The administrator's settings, from the environment as it was when tracing first needed them.
#ifndef QZ_TR_ENVIRONMENT_H
#define QZ_TR_ENVIRONMENT_H

namespace qz::tr {

struct trace_settings {
    const char *levels; // QZ_TRACE_LEVELS, empty when not set
    const char *file;   // QZ_TRACE_FILE, null when not set or empty
};

// Read once per process and never freed.
const trace_settings &environment();

} // namespace qz::tr

#endif
