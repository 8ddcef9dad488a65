// Registration of the trace component and its category table.
#include "qzacl_trace.h"

#include "trace_points.h"

using namespace qz;

std::uint8_t acl__trace_detail_levels[trace_category_count] = {};
pthread_once_t acl__trace_register_once = PTHREAD_ONCE_INIT;
bool acl__trace_is_registered = false;
cu_timeinfo_t timeinfo = {};

namespace {

constexpr tr_category_t acl__trace_categories[trace_category_count] = {
    {0, "Errors", 0}, {1, "Info", 0}, {2, "API", 0}, {3, "Buffer", 0}, {4, "Perf", 0},
};

// The levels of the Perf category at which registration is recorded.
bool perf_level_is_recorded(unsigned level) { return (level >= 1 && level <= 4) || level == 7 || level == 8; }

// Queries the facility before the first timing is recorded. The record carries only the level: readers of the file know
// its size and name.
void ask_about_trace_file() {
    std::uint32_t size = 0;
    char name[TR_FILENAME_SIZE] = {};
    static_cast<void>(tr_get_size_1(&size));
    static_cast<void>(tr_get_filename_1(name));
}

} // namespace

int acl__trace_register_component() {
    // The operation that reached the first trace point must keep its recorded error.
    cu_error_t *error = nullptr;
    const int saved = cu_get_error_1(&error);
    const int result = tr_register_component_1(trace_component, acl__trace_detail_levels,
                                               acl__trace_categories, trace_category_count);
    if (saved == 0) {
        static_cast<void>(cu_pset_error_1(error));
        cu_rel_error_1(error);
    }
    static_cast<void>(cu_get_procspeed_1(&timeinfo));

    const std::uint32_t level = __atomic_load_n(
        &acl__trace_detail_levels[static_cast<std::size_t>(trace_category::perf)], __ATOMIC_RELAXED);
    if (perf_level_is_recorded(level)) {
        ask_about_trace_file();
        point::registered.record(level);
    }
    __atomic_store_n(&acl__trace_is_registered, true, __ATOMIC_RELEASE);
    return result;
}

int acl__trace_unregister_component() { return tr_unregister_component_1(trace_component); }

namespace qz {

cu_time_t elapsed_time(std::uint64_t start, std::uint64_t end) {
    cu_time_t from = {};
    cu_time_t to = {};
    static_cast<void>(cu_cvt_time_1(start, &timeinfo, &from));
    static_cast<void>(cu_cvt_time_1(end, &timeinfo, &to));
    cu_time_t difference = {to.seconds - from.seconds, to.nanoseconds - from.nanoseconds};
    if (difference.nanoseconds < 0) {
        difference.seconds -= 1;
        difference.nanoseconds += 1000000000;
    }
    return difference;
}

} // namespace qz
