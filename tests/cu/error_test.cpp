// The per-thread error record: what cu_set_error_1 stores, what the getters
// hand out, and that threads never see each other's records.
#include <gtest/gtest.h>

#include <barrier>
#include <cstring>
#include <string>
#include <thread>

#include "cu_test_util.h"

using cu_test::current_error;
using cu_test::ErrorPtr;

namespace {

class ErrorRecordTest : public ::testing::Test {
  protected:
    void TearDown() override { cu_set_no_error_1(); }
};

void expect_no_error(const cu_error_t *err) {
    ASSERT_NE(err, nullptr);
    EXPECT_EQ(err->cu_error_id, 0);
    EXPECT_EQ(err->cu_arg_cnt, 0u);
    EXPECT_EQ(err->cu_args, nullptr);
    EXPECT_EQ(err->cu_ffdc_id, nullptr);
    EXPECT_EQ(err->cu_msg_cat, nullptr);
    EXPECT_EQ(err->cu_msg_default, nullptr);
}

TEST_F(ErrorRecordTest, RoundTripKeepsEveryField) {
    expect_no_error(current_error().get()); // nothing set yet
    const char *text = "2650-101 Function name: %1$s\n\tParameter value: 0x%3$x\n";
    ASSERT_EQ(cu_set_error_1(4, "ffdc-1", "kxseclib.cat", 1, 101, text, "sec_list_acl", 2, 0), 0);
    ErrorPtr err = current_error();
    EXPECT_EQ(err->cu_error_id, 4);
    EXPECT_STREQ(err->cu_ffdc_id, "ffdc-1");
    EXPECT_STREQ(err->cu_msg_cat, "kxseclib.cat");
    EXPECT_EQ(err->cu_msg_set, 1);
    EXPECT_EQ(err->cu_msg_num, 101);
    EXPECT_STREQ(err->cu_msg_default, text);
    ASSERT_EQ(err->cu_arg_cnt, 3u);
    EXPECT_EQ(err->cu_args[0].cu_arg_type, CU_ERROR_ARG_CHAR_STR);
    EXPECT_STREQ(err->cu_args[0].cu_arg_value.cu_arg_char_str, "sec_list_acl");
    // Number 2 is not in the text, yet takes its int argument.
    EXPECT_EQ(err->cu_args[1].cu_arg_type, CU_ERROR_ARG_INT);
    EXPECT_EQ(err->cu_args[1].cu_arg_value.cu_arg_int, 2);
    EXPECT_EQ(err->cu_args[2].cu_arg_type, CU_ERROR_ARG_INT);
    EXPECT_EQ(err->cu_args[2].cu_arg_value.cu_arg_int, 0);
}

TEST_F(ErrorRecordTest, ConversionsChooseArgumentKinds) {
    int anchor = 0;
    ASSERT_EQ(cu_set_error_1(7, nullptr, nullptr, 0, 0,
                             "%2$c %1$08x %3$ld %4$lld %5$.1f %6$p %7$Lg %8$hhd %9$-4lu", 0x2000,
                             'Q', -5L, 1LL << 40, 2.5, static_cast<void *>(&anchor), 0.25L, 300,
                             9UL),
              0);
    ErrorPtr err = current_error();
    ASSERT_EQ(err->cu_arg_cnt, 9u);
    const cu_error_arg_t *a = err->cu_args;
    const int kinds[] = {CU_ERROR_ARG_INT,       CU_ERROR_ARG_INT,    CU_ERROR_ARG_LONG,
                         CU_ERROR_ARG_LONG_LONG, CU_ERROR_ARG_DOUBLE, CU_ERROR_ARG_VOID_PTR,
                         CU_ERROR_ARG_DOUBLE,    CU_ERROR_ARG_INT,    CU_ERROR_ARG_LONG};
    for (int i = 0; i < 9; ++i)
        EXPECT_EQ(a[i].cu_arg_type, kinds[i]) << "argument " << i + 1;
    EXPECT_EQ(a[0].cu_arg_value.cu_arg_int, 0x2000);
    EXPECT_EQ(a[1].cu_arg_value.cu_arg_int, 'Q');
    EXPECT_EQ(a[2].cu_arg_value.cu_arg_long, -5L);
    EXPECT_EQ(a[3].cu_arg_value.cu_arg_long_long, 1LL << 40);
    EXPECT_EQ(a[4].cu_arg_value.cu_arg_double, 2.5);
    EXPECT_EQ(a[5].cu_arg_value.cu_arg_void_ptr, &anchor);
    EXPECT_EQ(a[6].cu_arg_value.cu_arg_double, 0.25); // passed as long double
    EXPECT_EQ(a[7].cu_arg_value.cu_arg_int, 300);
    EXPECT_EQ(a[8].cu_arg_value.cu_arg_long, 9L);

    // Unnumbered placeholders take the arguments in text order.
    ASSERT_EQ(cu_set_error_1(7, nullptr, nullptr, 0, 0, "%s=%d (%lx)", "key", 3, 0xABL), 0);
    err = current_error();
    ASSERT_EQ(err->cu_arg_cnt, 3u);
    EXPECT_STREQ(err->cu_args[0].cu_arg_value.cu_arg_char_str, "key");
    EXPECT_EQ(err->cu_args[1].cu_arg_value.cu_arg_int, 3);
    EXPECT_EQ(err->cu_args[2].cu_arg_value.cu_arg_long, 0xABL);
}

TEST_F(ErrorRecordTest, TextsThatAreNoPlaceholdersTakeNoArguments) {
    // %%, unknown conversions, %n, '*' widths, numbers outside 1..99 and
    // lengths that do not suit the conversion.
    ASSERT_EQ(cu_set_error_1(7, nullptr, nullptr, 0, 0,
                             "100%% %q %n %*d %0$d %100$d %1$Ld %1$ls %2$d", 5, 6),
              0);
    ErrorPtr err = current_error();
    ASSERT_EQ(err->cu_arg_cnt, 2u);
    EXPECT_EQ(err->cu_args[0].cu_arg_type, CU_ERROR_ARG_INT);
    EXPECT_EQ(err->cu_args[0].cu_arg_value.cu_arg_int, 5);
    EXPECT_EQ(err->cu_args[1].cu_arg_value.cu_arg_int, 6);
}

TEST_F(ErrorRecordTest, TextsAreCopiedIntoTheRecord) {
    char ffdc[] = "ffdc", cat[] = "cat.cat", text[] = "%1$s %2$s", name[] = "alice";
    ASSERT_EQ(cu_set_error_1(7, ffdc, cat, 1, 2, text, name, static_cast<char *>(nullptr)), 0);
    for (char *s : {ffdc, cat, text, name})
        std::memset(s, 'x', std::strlen(s));
    ErrorPtr err = current_error();
    EXPECT_STREQ(err->cu_ffdc_id, "ffdc");
    EXPECT_STREQ(err->cu_msg_cat, "cat.cat");
    EXPECT_STREQ(err->cu_msg_default, "%1$s %2$s");
    ASSERT_EQ(err->cu_arg_cnt, 2u);
    EXPECT_STREQ(err->cu_args[0].cu_arg_value.cu_arg_char_str, "alice");
    EXPECT_STREQ(err->cu_args[1].cu_arg_value.cu_arg_char_str, "(null)");
}

TEST_F(ErrorRecordTest, CopiesOutliveLaterErrorsAndClearing) {
    ASSERT_EQ(cu_set_error_1(1, nullptr, nullptr, 0, 0, "first %1$s", "a"), 0);
    ErrorPtr first = current_error();
    ASSERT_EQ(cu_set_error_1(2, nullptr, nullptr, 0, 0, "second"), 0);
    EXPECT_EQ(current_error()->cu_error_id, 2);
    cu_set_no_error_1();
    expect_no_error(current_error().get());
    EXPECT_EQ(first->cu_error_id, 1);
    EXPECT_STREQ(first->cu_args[0].cu_arg_value.cu_arg_char_str, "a");

    ASSERT_EQ(cu_set_error_1(5, nullptr, nullptr, 0, 0, "x"), 0);
    ASSERT_EQ(cu_set_error_1(0, nullptr, nullptr, 0, 0, "y"), 0); // id 0 is "no error"
    expect_no_error(current_error().get());
}

// A cleared record's block holds later, smaller records: none of the old
// record's texts may show through, and a larger one gets a block of its own.
TEST_F(ErrorRecordTest, RecordsAfterClearingAreWhole) {
    const std::string long_text(200, 'L');
    ASSERT_EQ(cu_set_error_1(1, "ffdc", "cat", 1, 2, "%1$s %2$s", long_text.c_str(), "b"), 0);
    cu_set_no_error_1();
    ASSERT_EQ(cu_set_error_1(3, nullptr, nullptr, 0, 4, "short %1$d", 9), 0);
    ErrorPtr shorter = current_error();
    EXPECT_EQ(shorter->cu_error_id, 3);
    EXPECT_EQ(shorter->cu_ffdc_id, nullptr);
    EXPECT_EQ(shorter->cu_msg_cat, nullptr);
    EXPECT_STREQ(shorter->cu_msg_default, "short %1$d");
    ASSERT_EQ(shorter->cu_arg_cnt, 1u);
    EXPECT_EQ(shorter->cu_args[0].cu_arg_value.cu_arg_int, 9);

    const std::string longer(1000, 'M');
    ASSERT_EQ(cu_set_error_1(5, nullptr, nullptr, 0, 6, "%1$s", longer.c_str()), 0);
    EXPECT_EQ(current_error()->cu_args[0].cu_arg_value.cu_arg_char_str, longer);
    EXPECT_EQ(shorter->cu_args[0].cu_arg_value.cu_arg_int, 9);
}

TEST_F(ErrorRecordTest, PsetStoresACopyAndNullClears) {
    char text[] = "%1$s at %2$d", name[] = "node";
    cu_error_arg_t args[2] = {};
    args[0].cu_arg_type = CU_ERROR_ARG_CHAR_STR;
    args[0].cu_arg_value.cu_arg_char_str = name;
    args[1].cu_arg_type = CU_ERROR_ARG_INT;
    args[1].cu_arg_value.cu_arg_int = 17;
    cu_error_t mine = {11, nullptr, nullptr, 1, 2, text, 2, args};
    ASSERT_EQ(cu_pset_error_1(&mine), 0);
    name[0] = text[0] = 'X';
    args[1].cu_arg_value.cu_arg_int = 0;

    ErrorPtr err = current_error();
    EXPECT_EQ(err->cu_error_id, 11);
    EXPECT_EQ(err->cu_msg_num, 2);
    EXPECT_STREQ(err->cu_msg_default, "%1$s at %2$d");
    ASSERT_EQ(err->cu_arg_cnt, 2u);
    EXPECT_STREQ(err->cu_args[0].cu_arg_value.cu_arg_char_str, "node");
    EXPECT_EQ(err->cu_args[1].cu_arg_value.cu_arg_int, 17);

    ASSERT_EQ(cu_pset_error_1(nullptr), 0);
    expect_no_error(current_error().get());
}

TEST_F(ErrorRecordTest, ThreadsKeepTheirOwnRecords) {
    std::barrier sync(2);
    int ids[2][2] = {};
    std::string texts[2];
    auto worker = [&](int me) {
        const std::string name = "thread-" + std::to_string(me);
        cu_set_error_1(100 + me, nullptr, nullptr, 0, 0, "%1$s", name.c_str());
        sync.arrive_and_wait(); // both records are set before either is read
        ErrorPtr err = current_error();
        ids[me][0] = err->cu_error_id;
        texts[me] = err->cu_args[0].cu_arg_value.cu_arg_char_str;
        if (me == 0)
            cu_set_no_error_1(); // must leave the other thread's record alone
        sync.arrive_and_wait();
        ids[me][1] = current_error()->cu_error_id;
        // Thread 1 ends with its record set: its exit must free it.
    };
    std::thread a(worker, 0), b(worker, 1);
    a.join();
    b.join();
    EXPECT_EQ(ids[0][0], 100);
    EXPECT_EQ(ids[1][0], 101);
    EXPECT_EQ(ids[0][1], 0);
    EXPECT_EQ(ids[1][1], 101);
    EXPECT_EQ(texts[0], "thread-0");
    EXPECT_EQ(texts[1], "thread-1");
    expect_no_error(current_error().get());
}

} // namespace
