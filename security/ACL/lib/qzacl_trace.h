// Tracing: registration, level tests, and how points, timings and operations are described and recorded. A disabled
// point costs a once-guard and the comparison of one byte; nothing is measured for it. The points themselves are in
// trace_points.h.
#ifndef QZACL_TRACE_H
#define QZACL_TRACE_H

#include "qz/cu.h"
#include "qz/tr.h"
#include "trace_items.h"

#include <cstddef>
#include <cstdint>
#include <pthread.h>
#include <string_view>
#include <tuple>
#include <type_traits>

namespace qz {

enum class trace_category : std::uint8_t { errors, info, api, buffer, perf };

inline constexpr int trace_category_count = 5;
inline constexpr char trace_component[] = "_SEL";

} // namespace qz

extern std::uint8_t acl__trace_detail_levels[qz::trace_category_count];
extern pthread_once_t acl__trace_register_once;
// Set once registration is complete, so that later trace points skip the once-guard.
extern bool acl__trace_is_registered;
extern cu_timeinfo_t timeinfo;

int acl__trace_register_component();
int acl__trace_unregister_component();

namespace qz {

// The category's detail level. The first call in the process registers the component.
inline unsigned trace_level(trace_category category) {
    if (!__atomic_load_n(&acl__trace_is_registered, __ATOMIC_ACQUIRE)) [[unlikely]]
        pthread_once(&acl__trace_register_once, [] { static_cast<void>(acl__trace_register_component()); });
    return __atomic_load_n(&acl__trace_detail_levels[static_cast<std::size_t>(category)], __ATOMIC_RELAXED);
}

inline bool traces(trace_category category) { return trace_level(category) != 0; }

// Records a number with its items, without a level test.
template <class... Items>
void record(int id, const Items &...items) {
    if constexpr (sizeof...(Items) == 0) {
        static_cast<void>(tr_record_id_1(trace_component, id));
    } else {
        std::apply(
            [id](auto... parts) {
                constexpr int count = sizeof...(parts) / 2;
                static_cast<void>(tr_record_data_1(trace_component, id, count, parts...));
            },
            std::tuple_cat(items.parts()...));
    }
}

// ---- Points ----

// The category and levels at which a point is recorded.
struct traced_at {
    trace_category category;
    unsigned first = 1;
    unsigned last = UINT8_MAX;

    constexpr bool includes(unsigned level) const { return level >= first && level <= last; }
};

// A point and the items that it takes, by number and kind.
template <int Id, traced_at At, class... Items>
struct trace_point {
    static constexpr traced_at at = At;

    template <class... Args>
    static constexpr bool takes = traced::fit<traced::list<Items...>, traced::list<Args...>>;

    template <class... Args>
    void record(const Args &...args) const {
        qz::record(Id, Items{args}...);
    }
};

template <class Point>
bool traces(Point) {
    return Point::at.includes(trace_level(Point::at.category));
}

// Records a point if its level is set.
template <class Point, class... Args>
requires(Point::template takes<Args...>) void trace(Point point, const Args &...args) {
    if (traces(point)) [[unlikely]]
        point.record(args...);
}

// ---- Timings ----

inline std::uint64_t read_counter() {
    std::uint64_t counter = 0;
    static_cast<void>(cu_get_ctr_1(&counter));
    return counter;
}

// The time between two counter values. Its nanoseconds are never negative.
cu_time_t elapsed_time(std::uint64_t start, std::uint64_t end);

// A point that records the duration of a step after its own items: ticks, seconds and nanoseconds.
template <int Id, traced_at At, class... Items>
struct timed_point {
    static constexpr traced_at at = At;

    template <class... Args>
    static constexpr bool takes = traced::fit<traced::list<Items...>, traced::list<Args...>>;

    template <class... Args>
    static void record_since(std::uint64_t start, const Args &...args) {
        const std::uint64_t end = read_counter();
        const cu_time_t time = elapsed_time(start, end);
        record(Id, Items{args}..., traced::number{end - start}, traced::number{time.seconds},
               traced::number{time.nanoseconds});
    }
};

// Times a step from construction to stop(), if the level of its point is set and `is_wanted`.
template <auto Point>
class trace_timer {
public:
    explicit trace_timer(bool is_wanted = true)
        : is_running_(is_wanted && traces(Point)), start_(is_running_ ? read_counter() : 0) {}

    template <class... Args>
    requires(decltype(Point)::template takes<Args...>) void stop(const Args &...args) const {
        if (is_running_) [[unlikely]]
            Point.record_since(start_, args...);
    }

private:
    bool is_running_;
    std::uint64_t start_;
};

// ---- Operations ----

// What entering an operation does to the recorded error.
enum class error_at_entry { cleared, kept };

// The arguments that an operation records at level 8.
template <class... Items>
struct with_arguments {
    static constexpr int numbers = 1;

    template <class... Args>
    static constexpr bool takes = traced::fit<traced::list<Items...>, traced::list<Args...>>;

    template <class... Args>
    static void record(int id, const Args &...args) {
        qz::record(id, Items{args}...);
    }
};

// The same for an operation whose first argument is an ACL. A null one is recorded as an address, under a number of its
// own.
template <class... Items>
struct with_acl_and {
    static constexpr int numbers = 2;

    template <class... Args>
    static constexpr bool takes =
        traced::fit<traced::list<traced::acl_bytes, Items...>, traced::list<Args...>>;

    template <class... Args>
    static void record(int id, const sec_acl_buffer_t *acl, const Args &...args) {
        if (acl == nullptr)
            qz::record(id, traced::address{acl}, Items{args}...);
        else
            qz::record(id + 2, traced::acl_bytes{acl}, Items{args}...);
    }
};

// What an operation records when it is left. A release records its exit number at every level.
struct leaves_bare {};
// The result.
struct leaves_result {};
// The result, and after success the outputs.
template <class... Items>
struct leaves_outputs {
    template <class... Args>
    static constexpr bool takes = traced::fit<traced::list<Items...>, traced::list<Args...>>;

    template <class... Args>
    static void record(int id, int result, const Args &...args) {
        qz::record(id, traced::number{result}, Items{args}...);
    }
};

// A public operation. Its numbers follow from its entry number: plus 2 for the arguments, plus 4 for their second form
// if there is one, then consecutive numbers for exit, result after a failure, and result after success.
template <int Entry, error_at_entry Error, class Arguments, class Leaving>
struct traced_operation {
    using arguments = Arguments;
    using leaving = Leaving;
    static constexpr bool clears_error = Error == error_at_entry::cleared;
    static constexpr int entry = Entry;
    static constexpr int entry_arguments = entry + 2;
    static constexpr int exit = entry + 2 * Arguments::numbers + 1;
    static constexpr int exit_result = exit + 1;
    static constexpr int exit_success = exit + 2;
};

inline constexpr unsigned bare_level = 1; // of the API category: numbers without items
inline constexpr unsigned full_level = 8; // with arguments and results

template <class Operation, class... Args>
void trace_entry(Operation, const std::tuple<Args &...> &arguments) {
    const unsigned level = trace_level(trace_category::api);
    if (level == 0) [[likely]]
        return;
    if (level == bare_level)
        record(Operation::entry);
    else if (level == full_level)
        std::apply(
            [](const auto &...args) { Operation::arguments::record(Operation::entry_arguments, args...); },
            arguments);
}

// `outputs` returns a tuple of the outputs. It is called only after success.
template <class Operation, class Outputs>
void trace_exit(Operation, int result, const Outputs &outputs) {
    using leaving = typename Operation::leaving;
    const unsigned level = trace_level(trace_category::api);
    if (level == 0) [[likely]]
        return;
    if (level == bare_level || std::is_same_v<leaving, leaves_bare>) {
        record(Operation::exit);
    } else if (level == full_level) {
        if constexpr (!std::is_same_v<Outputs, std::nullptr_t>) {
            if (result == 0) {
                std::apply(
                    [result](const auto &...args) {
                        static_assert(leaving::template takes<std::remove_cvref_t<decltype(args)>...>);
                        leaving::record(Operation::exit_success, result, args...);
                    },
                    outputs());
                return;
            }
        }
        record(Operation::exit_result, traced::number{result});
    }
}

// Runs a public operation: records its entry, clears the recorded error if the operation does so, runs the body and
// records the exit.
template <class Operation, class... Args, class Body, class Outputs = std::nullptr_t>
requires(Operation::arguments::template takes<std::remove_cv_t<Args>...>) int run(
    Operation operation, const std::tuple<Args &...> &arguments, const Body &body,
    const Outputs &outputs = nullptr) {
    static_assert(std::is_same_v<Outputs, std::nullptr_t> ==
                      (std::is_same_v<typename Operation::leaving, leaves_bare> ||
                       std::is_same_v<typename Operation::leaving, leaves_result>),
                  "outputs are given if and only if the operation records them");
    trace_entry(operation, arguments);
    if constexpr (Operation::clears_error)
        cu_set_no_error_1();
    const int result = body();
    trace_exit(operation, result, outputs);
    return result;
}

} // namespace qz

#endif
