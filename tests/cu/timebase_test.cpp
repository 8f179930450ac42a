// The time base: a monotonic nanosecond counter and counter conversion.
#include <gtest/gtest.h>

#include <time.h>

#include <cstdint>
#include <utility>

#include <kx_cu.h>

namespace {

using seconds_nanos = std::pair<kx_int64_t, kx_int64_t>;

seconds_nanos converted(kx_uint64_t counter, const cu_timeinfo_t *info) {
    seconds_nanos c{-1, -1};
    cu_cvt_time_1(counter, info, &c.first, &c.second);
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
}

TEST(TimebaseTest, ConversionSplitsSecondsAndNanoseconds) {
    const kx_uint64_t fast = kx_uint64_t{1} << 63; // remainder * 1e9 would wrap 64 bits
    const struct {
        kx_uint64_t counter, ticks_per_second;
        seconds_nanos expected;
    } cases[] = {
        {1500000000u, 1000000000u, {1, 500000000}},
        {10, 3, {3, 333333333}},
        {UINT64_MAX, 1000000000u, {18446744073, 709551615}},
        {fast + fast / 2, fast, {1, 500000000}},
        {UINT64_MAX, 1, {INT64_MAX, 0}}, // clamped
        {123456789, 0, {0, 0}},          // no time base
    };
    for (const auto &c : cases) {
        const cu_timeinfo_t info = {c.ticks_per_second, 0};
        EXPECT_EQ(converted(c.counter, &info), c.expected)
            << c.counter << "/" << c.ticks_per_second;
    }
    EXPECT_EQ(converted(123456789, nullptr), seconds_nanos(0, 0));
    const cu_timeinfo_t info = {1000, 0};
    kx_int64_t seconds = -1;
    cu_cvt_time_1(2500, &info, &seconds, nullptr);
    EXPECT_EQ(seconds, 2);
}

} // namespace
