// The time base: a monotonic nanosecond counter and counter conversion.
#include <gtest/gtest.h>

#include <time.h>

#include <cstdint>

#include "cu_test_util.h"

namespace {

struct Converted {
    kx_int64_t seconds = -1;
    kx_int64_t nanoseconds = -1;
    bool operator==(const Converted &) const = default;
};

Converted convert(kx_uint64_t counter, kx_uint64_t ticks_per_second) {
    const cu_timeinfo_t info = {ticks_per_second, 0};
    Converted c;
    cu_cvt_time_1(counter, &info, &c.seconds, &c.nanoseconds);
    return c;
}

TEST(TimebaseTest, CounterIsTheMonotonicClockInNanoseconds) {
    cu_timeinfo_t info = {7, 7};
    cu_get_procspeed_1(&info);
    EXPECT_EQ(info.timeinfo1, 1000000000u);
    EXPECT_EQ(info.timeinfo2, 0u);

    auto monotonic_ns = [] {
        timespec ts{};
        clock_gettime(CLOCK_MONOTONIC, &ts);
        return static_cast<kx_uint64_t>(ts.tv_sec) * 1000000000u +
               static_cast<kx_uint64_t>(ts.tv_nsec);
    };
    const kx_uint64_t before = monotonic_ns();
    const kx_uint64_t counter = cu_get_ctr_1();
    EXPECT_LE(before, counter);
    EXPECT_LE(counter, monotonic_ns());
    kx_uint64_t last = counter;
    for (int i = 0; i < 10000; ++i) {
        const kx_uint64_t now = cu_get_ctr_1();
        ASSERT_GE(now, last);
        last = now;
    }
}

TEST(TimebaseTest, ConversionSplitsSecondsAndNanoseconds) {
    EXPECT_EQ(convert(1500000000u, 1000000000u), (Converted{1, 500000000}));
    EXPECT_EQ(convert(10, 3), (Converted{3, 333333333}));
    EXPECT_EQ(convert(UINT64_MAX, 1000000000u), (Converted{18446744073, 709551615}));
    // remainder * 1e9 would wrap 64 bits with this time base.
    const kx_uint64_t fast = kx_uint64_t{1} << 63;
    EXPECT_EQ(convert(fast + fast / 2, fast), (Converted{1, 500000000}));
    EXPECT_EQ(convert(UINT64_MAX, 1), (Converted{INT64_MAX, 0})); // clamped
}

TEST(TimebaseTest, MissingOrZeroTimeBaseGivesZero) {
    EXPECT_EQ(convert(123456789, 0), (Converted{0, 0}));
    Converted c;
    cu_cvt_time_1(123456789, nullptr, &c.seconds, &c.nanoseconds);
    EXPECT_EQ(c, (Converted{0, 0}));
    const cu_timeinfo_t info = {1000, 0};
    cu_cvt_time_1(2500, &info, &c.seconds, nullptr);
    EXPECT_EQ(c.seconds, 2);
}

} // namespace
