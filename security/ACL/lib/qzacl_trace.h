// Trace points of the library: registration, the level tests, and the records of operations and timings. A
// point that is switched off costs a once-guard and a comparison of one byte; nothing is measured for it.
#ifndef QZACL_TRACE_H
#define QZACL_TRACE_H

#include "qz/cu.h"
#include "qz/tr.h"

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <pthread.h>
#include <string_view>
#include <tuple>

namespace qz {

enum class trace_category : std::uint8_t { errors, info, api, buffer, perf };

inline constexpr int trace_category_count = 5;
inline constexpr char trace_component[] = "_SEL";

} // namespace qz

extern std::uint8_t acl__trace_detail_levels[qz::trace_category_count];
extern pthread_once_t acl__trace_register_once;
// Set when registration is complete, so that later trace points need not call into the once-guard.
extern bool acl__trace_is_registered;
extern cu_timeinfo_t timeinfo;

int acl__trace_register_component();
int acl__trace_unregister_component();

namespace qz {

// The category's detail level; registers the component when this is the first trace point of the process.
inline unsigned trace_level(trace_category category) {
    if (!__atomic_load_n(&acl__trace_is_registered, __ATOMIC_ACQUIRE)) [[unlikely]]
        pthread_once(&acl__trace_register_once, [] { static_cast<void>(acl__trace_register_component()); });
    return __atomic_load_n(&acl__trace_detail_levels[static_cast<std::size_t>(category)], __ATOMIC_RELAXED);
}

inline bool traces(trace_category category) { return trace_level(category) != 0; }

// One data item of a record: an address and a number of bytes.
struct trace_item {
    const void *address;
    std::size_t length;
};

// A string with its NUL, an empty one standing for null.
inline trace_item item(const char *text) {
    return text == nullptr ? trace_item{"", 1} : trace_item{text, std::strlen(text) + 1};
}

// A string whose length is known, with its NUL.
inline trace_item item(std::string_view text) { return {text.data(), text.size() + 1}; }

// A string in an array that a caller filled: no more of it than the array, whether a NUL ends it or not.
template <std::size_t Size>
trace_item bounded_item(const char (&text)[Size]) {
    const std::size_t length = strnlen(text, Size);
    return {text, length < Size ? length + 1 : Size};
}

// A number by its address, with the width of its type: 4 bytes, or 8 for sizes, pointers and times.
template <class Number>
trace_item number(const Number &value) {
    static_assert(sizeof value == 4 || sizeof value == 8);
    return {&value, sizeof value};
}

// Records a bare number.
inline void trace_id(int id) { static_cast<void>(tr_record_id_1(trace_component, id)); }

// Records a number with its items.
template <class... Items>
void trace_data(int id, const Items &...items) {
    std::apply(
        [id](auto... pairs) {
            static_cast<void>(
                tr_record_data_1(trace_component, id, static_cast<int>(sizeof...(Items)), pairs...));
        },
        std::tuple_cat(std::make_tuple(items.address, items.length)...));
}

// The entry point of a public operation: the bare number at level 1, the data record at level 8.
template <class Record>
void trace_entry(int entry, const Record &record) {
    const unsigned level = trace_level(trace_category::api);
    if (level == 1)
        trace_id(entry);
    else if (level == 8)
        record();
}

// The exit point of an operation whose success has a data record of its own, numbered two above the exit
// point.
template <class Record>
void trace_exit(int exit, int result, const Record &success) {
    const unsigned level = trace_level(trace_category::api);
    if (level == 1)
        trace_id(exit);
    else if (level == 8 && result != 0)
        trace_data(exit + 1, number(result));
    else if (level == 8)
        success();
}

// The exit point of an operation that records its result and nothing else.
inline void trace_exit(int exit, int result) {
    const unsigned level = trace_level(trace_category::api);
    if (level == 1)
        trace_id(exit);
    else if (level == 8)
        trace_data(exit + 1, number(result));
}

// The exit point of a release operation, recorded at every level.
inline void trace_release_exit(int exit) {
    if (traces(trace_category::api))
        trace_id(exit);
}

inline std::uint64_t read_counter() {
    std::uint64_t counter = 0;
    static_cast<void>(cu_get_ctr_1(&counter));
    return counter;
}

// The time between two counter values, with a nanosecond part that is never negative.
cu_time_t elapsed_time(std::uint64_t start, std::uint64_t end);

// Records what a step took since `start`, after the items that belong to the point.
template <class... Items>
void trace_elapsed(int id, std::uint64_t start, const Items &...items) {
    const std::uint64_t end = read_counter();
    const std::uint64_t ticks = end - start;
    const cu_time_t time = elapsed_time(start, end);
    trace_data(id, items..., number(ticks), number(time.seconds), number(time.nanoseconds));
}

} // namespace qz

#endif
