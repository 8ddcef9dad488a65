// The clock: a counter of nanoseconds, which the kernel lets us read without a system call, as a time.
#include "qz/cu.h"

#include <cstdint>
#include <ctime>

namespace {

__extension__ using uint128 = unsigned __int128;

constexpr std::uint64_t second = 1000000000;

} // namespace

int cu_get_ctr_1(uint64_t *counter) {
    if (counter == nullptr)
        return CU_BAD_PARAMETER;
    timespec now;
    if (clock_gettime(CLOCK_MONOTONIC, &now) != 0)
        return CU_INTERNAL;
    *counter = static_cast<std::uint64_t>(now.tv_sec) * second + static_cast<std::uint64_t>(now.tv_nsec);
    return CU_OK;
}

// The record is the length of a tick as a fraction: nanoseconds, in how many ticks.
int cu_get_procspeed_1(cu_timeinfo_t *timeinfo) {
    if (timeinfo == nullptr)
        return CU_BAD_PARAMETER;
    *timeinfo = {{1, 1}};
    return CU_OK;
}

int cu_cvt_time_1(uint64_t counter, const cu_timeinfo_t *timeinfo, cu_time_t *time) {
    if (timeinfo == nullptr || time == nullptr || timeinfo->opaque[1] == 0)
        return CU_BAD_PARAMETER;
    const uint128 nanoseconds = uint128{counter} * timeinfo->opaque[0] / timeinfo->opaque[1];
    const uint128 seconds = nanoseconds / second;
    if (seconds > INT64_MAX)
        return CU_BAD_PARAMETER;
    time->seconds = static_cast<std::int64_t>(seconds);
    time->nanoseconds = static_cast<std::int64_t>(nanoseconds % second);
    return CU_OK;
}
