// The high-resolution time base: CLOCK_MONOTONIC in nanoseconds.
#include "cu_internal.h"

#include <time.h>

#include <cstdint>

namespace {

constexpr kx_uint64_t nanos_per_second = 1000000000;

} // namespace

extern "C" {

CU_EXTERN kx_uint64_t cu_get_ctr_1(void) {
    timespec now{};
    clock_gettime(CLOCK_MONOTONIC, &now); // cannot fail for this clock
    return static_cast<kx_uint64_t>(now.tv_sec) * nanos_per_second +
           static_cast<kx_uint64_t>(now.tv_nsec);
}

CU_EXTERN void cu_get_procspeed_1(cu_timeinfo_t *info) {
    if (info == nullptr)
        return;
    info->timeinfo1 = nanos_per_second;
    info->timeinfo2 = 0;
}

CU_EXTERN void cu_cvt_time_1(kx_uint64_t counter, const cu_timeinfo_t *info, kx_int64_t *seconds,
                             kx_int64_t *nanoseconds) {
    kx_uint64_t whole = 0;
    kx_uint64_t nanos = 0;
    if (info != nullptr && info->timeinfo1 != 0) {
        const kx_uint64_t ticks_per_second = info->timeinfo1;
        whole = counter / ticks_per_second;
        // The remainder is below ticks_per_second, so 128 bits hold the
        // product for any time base.
        const unsigned __int128 rest = counter % ticks_per_second;
        nanos = static_cast<kx_uint64_t>(rest * nanos_per_second / ticks_per_second);
    }
    if (seconds != nullptr)
        *seconds = whole > INT64_MAX ? INT64_MAX : static_cast<kx_int64_t>(whole);
    if (nanoseconds != nullptr)
        *nanoseconds = static_cast<kx_int64_t>(nanos);
}

} // extern "C"
