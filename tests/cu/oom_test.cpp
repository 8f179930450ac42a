// Running out of memory: the program's allocator (heap.h) fails every
// allocation on request, libkx_cu's included.
#include <gtest/gtest.h>

#include <cstring>
#include <string>

#include "cu_test_util.h"

#include "heap.h"

namespace {

using cu_test::current_error;

// Runs call with every allocation failing.
template <typename F> auto without_memory(F call) {
    kxtest::heap::fail_all(true);
    auto result = call();
    kxtest::heap::fail_all(false);
    return result;
}

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
    EXPECT_EQ(current_error()->cu_error_id, CU_ERROR_ID_NO_MEMORY);
    cu_set_no_error_1(); // must not free the static record
    EXPECT_EQ(current_error()->cu_error_id, 0);

    const cu_error_t mine = {9, nullptr, nullptr, 0, 0, const_cast<char *>(big.c_str()),
                             0, nullptr};
    EXPECT_EQ(without_memory([&] { return cu_pset_error_1(&mine); }), CU_ERROR_ID_NO_MEMORY);
    EXPECT_EQ(current_error()->cu_error_id, CU_ERROR_ID_NO_MEMORY);
}

// A cleared record's block holds the next record that fits, with no
// allocation at all.
TEST_F(OutOfMemoryTest, ClearedRecordHoldsTheNextOne) {
    ASSERT_EQ(cu_set_error_1(4, "f", "c", 1, 2, "%1$s", "a longer argument"), 0);
    cu_set_no_error_1();
    EXPECT_EQ(without_memory([] { return cu_set_error_1(5, "f", "c", 1, 3, "%1$s", "short"); }), 0);
    cu_test::ErrorPtr err = current_error();
    EXPECT_EQ(err->cu_error_id, 5);
    EXPECT_STREQ(err->cu_args[0].cu_arg_value.cu_arg_char_str, "short");
}

TEST_F(OutOfMemoryTest, GettersHandOutStaticResultsThatReleaseAccepts) {
    ASSERT_EQ(cu_set_error_1(4, nullptr, nullptr, 0, 0, "value %1$d", 1), 0);
    cu_test::ErrorPtr copy = current_error();
    auto get = [] {
        cu_error_t *err = nullptr;
        cu_get_error_1(&err);
        return err;
    };
    cu_test::ErrorPtr with_error(without_memory(get));
    cu_set_no_error_1();
    cu_test::ErrorPtr without_error(without_memory(get)); // no memory for the empty copy
    ASSERT_TRUE(with_error && without_error);
    EXPECT_EQ(with_error->cu_error_id, CU_ERROR_ID_NO_MEMORY);
    EXPECT_EQ(without_error->cu_error_id, CU_ERROR_ID_NO_MEMORY);

    char *text = nullptr;
    without_memory([&] {
        cu_get_errmsg_1(copy.get(), &text);
        return 0;
    });
    const cu_test::MessagePtr msg(text);
    ASSERT_NE(msg, nullptr);
    EXPECT_NE(std::strlen(msg.get()), 0u);
    EXPECT_EQ(std::strstr(msg.get(), "value"), nullptr);
}

} // namespace
