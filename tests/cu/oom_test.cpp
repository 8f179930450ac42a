// Running out of memory: the program's allocator (heap.h) fails every
// allocation on request, libkx_cu's included.
#include <gtest/gtest.h>

#include <string>

#include "cu_test.h"
#include "heap.h"

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

// A cleared record's block holds the next record that fits, with no
// allocation at all.
TEST_F(OutOfMemoryTest, ClearedRecordHoldsTheNextOne) {
    ASSERT_EQ(cu_set_error_1(4, "f", "c", 1, 2, "%1$s", "a longer argument"), 0);
    cu_set_no_error_1();
    EXPECT_EQ(without_memory([] { return cu_set_error_1(5, "f", "c", 1, 3, "%1$s", "short"); }), 0);
    EXPECT_EQ(current_record(), R"(5 "f" "c" 1.3 "%1$s" [s"short"])");
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

} // namespace
