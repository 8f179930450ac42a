// The message table and the reporting helper.
#include <cstring>
#include <string>

#include <gtest/gtest.h>

#include <kx_acl.h>

#include "messages.h"
#include "report.h"
#include "support.h"

using namespace kxacl;

TEST(MessageTable, FixedEntries) {
    EXPECT_STREQ(cu_mesgtbl_kxseclib_msg[0], "Reserved: DO NOT USE!");
    EXPECT_EQ(std::strlen(cu_badid_kxseclib_msg) + 1, 44u);
    EXPECT_STREQ(cu_mesgtbl_kxseclib_msg[82], "The ACL provided is not valid!\n");
    EXPECT_STREQ(cu_mesgtbl_kxseclib_msg[87], "%1$stype = %2$c; permission = %3$s\n");
    // Entries of other components are empty, never null.
    for (int i = 0; i < KXSECLIB_MSG_COUNT; ++i)
        ASSERT_NE(cu_mesgtbl_kxseclib_msg[i], nullptr) << i;
    EXPECT_STREQ(cu_mesgtbl_kxseclib_msg[90], "");
    EXPECT_STREQ(cu_mesgtbl_kxseclib_msg[622], "");
}

// The numbered messages stand at their catalogue indices: 2650-101 at 88
// up to 2650-158 at 145, then 2650-165 at 151 onwards.
TEST(MessageTable, NumberedMessagesStandAtTheirIndex) {
    int filled = 0;
    for (int i = 88; i <= 166; ++i) {
        const char *text = cu_mesgtbl_kxseclib_msg[i];
        if (!*text)
            continue;
        ++filled;
        int number = i <= 145 ? i + 13 : i + 14;
        std::string prefix = "2650-" + std::to_string(number) + " ";
        EXPECT_EQ(std::string(text).substr(0, prefix.size()), prefix) << i;
        EXPECT_EQ(text[std::strlen(text) - 1], '\n') << i;
    }
    EXPECT_EQ(filled, 61);
}

// Each message carries exactly the placeholders its reports fill.
TEST(MessageTable, PlaceholderCounts) {
    struct expectation {
        int index;
        int count;
    } table[] = {{83, 4},  {84, 6},  {85, 5},  {88, 3},  {89, 2},  {91, 3},  {93, 0},  {94, 1},
                 {97, 2},  {105, 3}, {106, 3}, {109, 2}, {110, 3}, {111, 3}, {113, 3}, {114, 3},
                 {118, 3}, {122, 2}, {126, 3}, {134, 3}, {141, 3}, {142, 2}, {145, 1}, {160, 1},
                 {161, 2}, {163, 2}, {164, 1}, {165, 2}, {166, 2}};
    for (const auto &e : table)
        EXPECT_EQ(placeholder_count(message_text(e.index)), e.count) << e.index;
    // 2650-126 and 2650-127 start at their second placeholder.
    EXPECT_EQ(placeholder_kind(message_text(MSG_2650_126), 1), arg_kind::integer);
    EXPECT_EQ(placeholder_kind(message_text(MSG_2650_127), 2), arg_kind::text);
}

TEST(Report, FillsTheRecordAsTheCatalogueExpects) {
    int x = 0;
    EXPECT_EQ(bad_param("sec_list_acl", 2, static_cast<void *>(nullptr)), SEC_S_BAD_PARAM);
    auto e = kxtest::last_error();
    EXPECT_EQ(e.id, SEC_S_BAD_PARAM);
    EXPECT_EQ(e.catalogue, "kxseclib.cat");
    EXPECT_EQ(e.set, 1);
    EXPECT_EQ(e.msg_num, 88);
    ASSERT_EQ(e.args.size(), 3u);
    EXPECT_EQ(e.str(0), "sec_list_acl");
    EXPECT_EQ(e.num(1), 2);
    EXPECT_EQ(e.num(2), 0);
    const std::string expected = "2650-101 Failure: incorrect parameters provided.\n"
                                 "\tFunction name: sec_list_acl\n"
                                 "\tPositional parameter number: 2\n\tParameter value: 0x0\n"
                                 "If this failure ";
    EXPECT_EQ(e.text.substr(0, expected.size()), expected);
    // A pointer shows as its low 32 bits.
    bad_param("sec_list_acl", 1, &x);
    EXPECT_EQ(static_cast<unsigned>(kxtest::last_error().num(2)), pointer_value(&x));
}

TEST(Report, SkippedPlaceholderGetsZeroAndPositionFollows) {
    source_pos pos = here(src_acl);
    report<MSG_2650_127>(SEC_S_BAD_ACLE, 0, pos.file, pos.line);
    auto e = kxtest::last_error();
    EXPECT_EQ(e.msg_num, 114);
    ASSERT_EQ(e.args.size(), 3u);
    EXPECT_EQ(e.num(0), 0);
    EXPECT_EQ(e.str(1), "kxacl_acl");
    EXPECT_EQ(e.num(2), pos.line);
    EXPECT_NE(e.text.find("(File name: kxacl_acl; line number: " + std::to_string(pos.line) + ")"),
              std::string::npos);
}

TEST(Report, HugeByteCountsDoNotWrap) {
    no_memory("sec_read_acl_file", std::size_t{1} << 40);
    auto e = kxtest::last_error();
    EXPECT_EQ(e.msg_num, 89);
    EXPECT_EQ(e.num(1), 2147483647);
}
