// Running out of memory in libkx_cu and libkx_tr: the program's allocator
// (heap.h) fails every allocation, or a chosen one, on request.
#include <gtest/gtest.h>

#include <array>
#include <cstdlib>
#include <string>
#include <vector>

#include <kx_tr.h>

#include "cu_test.h"
#include "heap.h"
#include "support.h"

namespace {

using namespace cu_test;

// Runs call with every allocation failing.
template <typename F> auto without_memory(F call) {
    kxtest::heap::fail_all(true);
    auto result = call();
    kxtest::heap::fail_all(false);
    return result;
}

const std::string no_memory_record = std::to_string(CU_ERROR_ID_NO_MEMORY) +
                                     " NULL NULL 0.0 \"There is not enough memory to record the "
                                     "error.\n\" NULL";

class OutOfMemoryTest : public ::testing::Test {
  protected:
    void TearDown() override { cu_set_no_error_1(); }
};

// The texts are larger than any record before them, so that the block that
// a cleared record leaves for the next one cannot hold them.
TEST_F(OutOfMemoryTest, StoringLeavesTheNoMemoryRecord) {
    static const std::string big(100000, 't');
    EXPECT_EQ(without_memory([] { return cu_set_error_1(4, "f", "c", 1, 2, "%1$s", big.c_str()); }),
              CU_ERROR_ID_NO_MEMORY);
    EXPECT_EQ(current_record(), no_memory_record);
    cu_set_no_error_1(); // must not free the static record
    EXPECT_EQ(current_error()->cu_error_id, 0);

    const cu_error_t mine = {9, nullptr, nullptr, 0, 0, const_cast<char *>(big.c_str()),
                             0, nullptr};
    EXPECT_EQ(without_memory([&] { return cu_pset_error_1(&mine); }), CU_ERROR_ID_NO_MEMORY);
    EXPECT_EQ(current_record(), no_memory_record);
}

TEST_F(OutOfMemoryTest, GettersHandOutStaticResultsThatReleaseAccepts) {
    ASSERT_EQ(cu_set_error_1(4, nullptr, nullptr, 0, 0, "value %1$d", 1), 0);
    const unique_error copy = current_error();
    const unique_error with_error(without_memory([] { return current_error().release(); }));
    cu_set_no_error_1();
    // No memory for the empty copy either.
    const unique_error without_error(without_memory([] { return current_error().release(); }));
    EXPECT_EQ(describe(with_error.get()), no_memory_record);
    EXPECT_EQ(describe(without_error.get()), no_memory_record);
    char *text = nullptr;
    without_memory([&] {
        cu_get_errmsg_1(copy.get(), &text);
        return 0;
    });
    const unique_message message(text);
    EXPECT_STREQ(message.get(), "There is not enough memory to format the error message.\n");
}

using levels_t = std::array<tr_detail_level_t, 2>;
constexpr levels_t untouched = {0xAA, 0xAA};

// Registers a trace component with allocation n failing, for n = 0, 1, ...
// until none fails. Each failure fails the registration without a level
// written or the component left registered; returns how many registrations
// succeeded although an allocation failed.
int register_while_allocations_fail(levels_t &levels) {
    constexpr tr_category_description_t categories[] = {{0, "Errors", 1, 0}, {1, "API", 2, 0}};
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

// Only a warning's own allocation may fail without failing the
// registration: the warning is given up.
TEST_F(OutOfMemoryTest, TraceRegistrationFailsWithoutEffect) {
    levels_t levels{};
    setenv("KX_TRACE_LEVELS", "_TST:API=5", 1);
    EXPECT_EQ(register_while_allocations_fail(levels), 0);
    setenv("KX_TRACE_LEVELS", "_TST:API=5,Nope=1", 1);
    EXPECT_EQ(register_while_allocations_fail(levels), 1);
}

// A record too large for the stack needs memory.
TEST_F(OutOfMemoryTest, TraceRecordWithoutMemoryFails) {
    const std::string trace = kxtest::temp_dir() + "/trace.out";
    setenv("KX_TRACE_FILE", trace.c_str(), 1);
    const std::string big(2000, 'x');
    EXPECT_EQ(without_memory(
                  [&] { return tr_record_data_1("_TST", 1, 1, big.data(), kx_uint32_t{2000}); }),
              TR_WRITE_FAILED);
    EXPECT_EQ(kxtest::read_lines(trace), std::vector<std::string>{});
}

} // namespace
