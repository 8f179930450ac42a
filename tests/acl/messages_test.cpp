// The message table and the reporting helper.
#include <cstring>
#include <string>
#include <gtest/gtest.h>
#include <kx_acl.h>
#include "messages.h"
#include "report.h"
#include "support.h"

using namespace kxacl;

// Other components' entries are empty; 2650-101 at 88 .. 2650-158 at 145,
// then 2650-165 at 151 onwards.
TEST(MessageTable, FixedEntriesAndNumberedMessages) {
    EXPECT_STREQ(cu_mesgtbl_kxseclib_msg[0], "Reserved: DO NOT USE!");
    EXPECT_EQ(std::strlen(cu_badid_kxseclib_msg) + 1, 44u);
    EXPECT_STREQ(cu_mesgtbl_kxseclib_msg[82], "The ACL provided is not valid!\n");
    EXPECT_STREQ(cu_mesgtbl_kxseclib_msg[87], "%1$stype = %2$c; permission = %3$s\n");
    for (int i = 0; i < KXSECLIB_MSG_COUNT; ++i)
        ASSERT_NE(cu_mesgtbl_kxseclib_msg[i], nullptr) << i;
    EXPECT_STREQ(cu_mesgtbl_kxseclib_msg[90], "");
    EXPECT_STREQ(cu_mesgtbl_kxseclib_msg[622], "");
    int filled = 0;
    for (int i = 88; i <= 166; ++i) {
        const std::string text = cu_mesgtbl_kxseclib_msg[i];
        if (text.empty())
            continue;
        ++filled;
        std::string prefix = "2650-" + std::to_string(i <= 145 ? i + 13 : i + 14) + " ";
        EXPECT_EQ(text.substr(0, prefix.size()), prefix) << i;
        EXPECT_EQ(text.back(), '\n') << i;
    }
    EXPECT_EQ(filled, 61);
}

// Pointers show their low 32 bits; huge byte counts do not wrap.
// The scan by which reports are checked against their message at compile
// time: numbered conversions with flags, "%%", unnumbered conversions (not
// counted), and numbers that a text skips (integers).
TEST(MessageTable, PlaceholderCounts) {
    EXPECT_EQ(placeholder_count("none: 100%%1$s sure, %d %s"), 0);
    const char *text = "%%%4$#x %2$s at %1$08x, %3$-4d";
    EXPECT_EQ(placeholder_count(text), 4);
    EXPECT_EQ(placeholder_kind(text, 1), arg_kind::integer);
    EXPECT_EQ(placeholder_kind(text, 2), arg_kind::text);
    EXPECT_EQ(placeholder_kind(text, 5), arg_kind::none);
    // 2650-126 and 2650-127 start at their second placeholder.
    EXPECT_EQ(placeholder_count(message_text(MSG_2650_127)), 3);
    EXPECT_EQ(placeholder_kind(message_text(MSG_2650_126), 1), arg_kind::integer);
    EXPECT_EQ(placeholder_kind(message_text(MSG_2650_127), 2), arg_kind::text);
}

TEST(Report, FillsTheRecordAsTheCatalogueExpects) {
    int x = 0;
    EXPECT_EQ(bad_param("sec_list_acl", 2, static_cast<void *>(nullptr)), SEC_S_BAD_PARAM);
    EXPECT_TRUE(kxtest::record_is(SEC_S_BAD_PARAM, MSG_2650_101, {"sec_list_acl", 2, 0}));
    auto e = kxtest::last_error();
    EXPECT_TRUE(e.catalogue == "kxseclib.cat" && e.set == 1 && e.msg_num == 88);
    const std::string expected = "2650-101 Failure: incorrect parameters provided.\n"
                                 "\tFunction name: sec_list_acl\n"
                                 "\tPositional parameter number: 2\n\tParameter value: 0x0\n"
                                 "If this failure ";
    EXPECT_EQ(e.text.substr(0, expected.size()), expected);
    bad_param("sec_list_acl", 1, &x);
    EXPECT_EQ(static_cast<unsigned>(kxtest::last_error().num(2)), pointer_value(&x));

    source_pos pos = here(src_acl);
    report<MSG_2650_127>(SEC_S_BAD_ACLE, 0, pos.file, pos.line);
    EXPECT_TRUE(kxtest::record_is(SEC_S_BAD_ACLE, MSG_2650_127, {0, "kxacl_acl", pos.line}));
    e = kxtest::last_error();
    EXPECT_EQ(e.msg_num, 114);
    EXPECT_NE(e.text.find("(File name: kxacl_acl; line number: " + std::to_string(pos.line) + ")"),
              std::string::npos);

    no_memory("sec_read_acl_file", std::size_t{1} << 40);
    EXPECT_TRUE(
        kxtest::record_is(SEC_S_NO_MEMORY, MSG_2650_102, {"sec_read_acl_file", 2147483647}));
}
