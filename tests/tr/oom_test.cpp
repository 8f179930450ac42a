// Registering without memory: the program's allocator (heap.h) fails one
// allocation after another. Each failure fails the registration without a
// level written or a component left registered; only a warning's own
// allocation may fail without failing it. The suite shares its name with
// libkx_cu's, which valgrind runs leave out: valgrind's allocator bypasses
// the failing one.
#include <gtest/gtest.h>

#include <array>
#include <cstdlib>
#include <string>
#include <vector>

#include <kx_tr.h>

#include "heap.h"
#include "support.h"

namespace {

using levels_t = std::array<tr_detail_level_t, 2>;
constexpr tr_category_description_t categories[] = {{0, "Errors", 1, 0}, {1, "API", 2, 0}};
constexpr levels_t untouched = {0xAA, 0xAA};

// Registers with allocation n failing, for n = 0, 1, ... until none fails;
// returns how many registrations succeeded although an allocation failed.
int register_while_allocations_fail(levels_t &levels) {
    int survived = 0;
    for (long n = 0;; ++n) {
        levels = untouched;
        kxtest::heap::fail_nth(n);
        const int status = tr_register_component_1("_TST", levels.data(), categories, 2);
        const bool fired = kxtest::heap::fired();
        kxtest::heap::disarm();
        if (status == TR_OK) {
            EXPECT_EQ(levels, (levels_t{1, 5})) << n;
            EXPECT_EQ(tr_unregister_component_1("_TST"), TR_OK);
            if (!fired)
                return survived;
            ++survived;
            continue;
        }
        EXPECT_EQ(status, TR_NO_MEMORY) << n;
        EXPECT_TRUE(fired) << n;
        EXPECT_EQ(levels, untouched) << n;
        EXPECT_EQ(tr_unregister_component_1("_TST"), TR_NOT_REGISTERED) << n;
    }
}

TEST(OutOfMemoryTest, TraceRegistrationFailsWithoutEffect) {
    setenv("KX_TRACE_LEVELS", "_TST:API=5", 1);
    levels_t levels{};
    EXPECT_EQ(register_while_allocations_fail(levels), 0);
}

TEST(OutOfMemoryTest, TraceWarningWithoutMemoryIsGivenUp) {
    setenv("KX_TRACE_LEVELS", "_TST:API=5,Nope=1", 1);
    levels_t levels{};
    EXPECT_EQ(register_while_allocations_fail(levels), 1);
}

// A record too large for the stack needs memory.
TEST(OutOfMemoryTest, TraceRecordWithoutMemoryFails) {
    const std::string trace = kxtest::temp_dir() + "/trace.out";
    setenv("KX_TRACE_FILE", trace.c_str(), 1);
    const std::string big(2000, 'x');
    kxtest::heap::fail_all(true);
    const int status = tr_record_data_1("_TST", 1, 1, big.data(), kx_uint32_t{2000});
    kxtest::heap::fail_all(false);
    EXPECT_EQ(status, TR_WRITE_FAILED);
    EXPECT_EQ(kxtest::read_lines(trace), std::vector<std::string>{});
}

} // namespace
