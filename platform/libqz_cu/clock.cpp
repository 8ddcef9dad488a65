// The clock: a nanosecond counter that can be read without a system call, and its conversion to a time.
#include "base/wide_product.h"
#include "qz/cu.h"

#include <cstdint>
#include <ctime>

namespace {

constexpr std::uint64_t second = 1000000000;

// Replaces a number by its quotient, bit by bit, and returns the remainder.
std::uint64_t divide(qz::wide_number &number, std::uint64_t divisor) {
    std::uint64_t rest = 0;
    for (unsigned bit = 0; bit < 128; ++bit) {
        const bool overflows = rest >> 63 != 0;
        rest = rest << 1 | number.high >> 63;
        number.high = number.high << 1 | number.low >> 63;
        number.low <<= 1;
        if (overflows || rest >= divisor) {
            rest -= divisor;
            number.low |= 1;
        }
    }
    return rest;
}

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

// The record is the length of a tick as a fraction: nanoseconds per number of ticks.
int cu_get_procspeed_1(cu_timeinfo_t *timeinfo) {
    if (timeinfo == nullptr)
        return CU_BAD_PARAMETER;
    *timeinfo = {{1, 1}};
    return CU_OK;
}

int cu_cvt_time_1(uint64_t counter, const cu_timeinfo_t *timeinfo, cu_time_t *time) {
    if (timeinfo == nullptr || time == nullptr || timeinfo->opaque[1] == 0)
        return CU_BAD_PARAMETER;
    std::uint64_t seconds = 0;
    std::uint64_t nanoseconds = 0;
    if (!__builtin_mul_overflow(counter, timeinfo->opaque[0], &nanoseconds)) {
        nanoseconds /= timeinfo->opaque[1];
        seconds = nanoseconds / second;
        nanoseconds %= second;
    } else {
        qz::wide_number time_passed = qz::wide_product(counter, timeinfo->opaque[0]);
        divide(time_passed, timeinfo->opaque[1]);
        nanoseconds = divide(time_passed, second);
        seconds = time_passed.high != 0 ? UINT64_MAX : time_passed.low;
    }
    if (seconds > INT64_MAX)
        return CU_BAD_PARAMETER;
    *time = {static_cast<std::int64_t>(seconds), static_cast<std::int64_t>(nanoseconds)};
    return CU_OK;
}
