// Translation between permission strings and masks.
#include <cstring>
#include <string>

#include <gtest/gtest.h>

#include <kx_acl.h>

#include "support.h"

namespace {

const char default_chars[] = "rwcxCqledvsao";

TEST(TranslatePerms, DefaultTemplates) {
    kx_uint32_t mask = 0xdead;
    EXPECT_EQ(sec_translate_perms("", nullptr, &mask), SEC_S_OK);
    EXPECT_EQ(mask, 0u);
    mask = 0xdead;
    EXPECT_EQ(sec_translate_perms(nullptr, nullptr, &mask), SEC_S_OK);
    EXPECT_EQ(mask, 0u);
    EXPECT_EQ(sec_translate_perms("rwrw", nullptr, &mask), SEC_S_OK);
    EXPECT_EQ(mask, 0x3u);
    EXPECT_EQ(sec_translate_perms(default_chars, nullptr, &mask), SEC_S_OK);
    EXPECT_EQ(mask, 0x1fffu);
    EXPECT_EQ(sec_translate_perms("cC", nullptr, &mask), SEC_S_OK);
    EXPECT_EQ(mask, 0x14u);
}

TEST(TranslatePerms, UnknownCharacterKeepsEarlierBits) {
    kx_uint32_t mask = 0;
    EXPECT_EQ(sec_translate_perms("rwz", nullptr, &mask), SEC_S_BAD_PERMISSION);
    EXPECT_EQ(mask, 0x3u);
    auto e = kxtest::last_error();
    EXPECT_EQ(e.id, SEC_S_BAD_PERMISSION);
    EXPECT_EQ(e.msg_num, 133);
    EXPECT_EQ(e.num(0), 'z');
    EXPECT_NE(e.text.find("permission ('z') does not"), std::string::npos);
    // Characters are case-sensitive.
    EXPECT_EQ(sec_translate_perms("R", nullptr, &mask), SEC_S_BAD_PERMISSION);
    EXPECT_EQ(kxtest::last_error().num(0), 'R');
}

TEST(TranslatePerms, NullResultIsParameterThree) {
    EXPECT_EQ(sec_translate_perms("r", nullptr, nullptr), SEC_S_BAD_PARAM);
    auto e = kxtest::last_error();
    EXPECT_EQ(e.msg_num, 88);
    EXPECT_EQ(e.str(0), "sec_translate_perms");
    EXPECT_EQ(e.num(1), 3);
    EXPECT_EQ(e.num(2), 0);
}

TEST(TranslateBitmask, AscendingBitOrder) {
    char out[33];
    EXPECT_EQ(sec_translate_bitmask(0x83, nullptr, out), SEC_S_OK);
    EXPECT_STREQ(out, "rwe");
    EXPECT_EQ(sec_translate_bitmask(0x1011, nullptr, out), SEC_S_OK);
    EXPECT_STREQ(out, "rCo");
    EXPECT_EQ(sec_translate_bitmask(0x1fff, nullptr, out), SEC_S_OK);
    EXPECT_STREQ(out, default_chars);
    std::memset(out, 'x', sizeof out);
    EXPECT_EQ(sec_translate_bitmask(0, nullptr, out), SEC_S_OK);
    EXPECT_STREQ(out, "");
}

TEST(TranslateBitmask, BitWithoutTemplate) {
    char out[33];
    EXPECT_EQ(sec_translate_bitmask(0x2000, nullptr, out), SEC_S_BAD_PERMISSION);
    auto e = kxtest::last_error();
    EXPECT_EQ(e.msg_num, 164);
    EXPECT_EQ(e.num(0), 0x2000);
    EXPECT_NE(e.text.find("(0x00002000)"), std::string::npos);
    EXPECT_EQ(sec_translate_bitmask(0x80000001u, nullptr, out), SEC_S_BAD_PERMISSION);
    EXPECT_EQ(static_cast<unsigned>(kxtest::last_error().num(0)), 0x80000000u);
}

TEST(TranslateBitmask, NullBufferUsesTheRoutineNameOfTheCatalogue) {
    EXPECT_EQ(sec_translate_bitmask(1, nullptr, nullptr), SEC_S_BAD_PARAM);
    auto e = kxtest::last_error();
    EXPECT_EQ(e.str(0), "sec_translate_mask");
    EXPECT_EQ(e.num(1), 3);
}

// A caller's set: order of templates does not change the output order, the
// first of two templates with one character wins, and a template of several
// bits translates one way only.
TEST(CustomTemplates, SetsAreReadAsGiven) {
    sec_perm_desc perms[] = {
        {0x4, 'b', "b", ""}, {0x1, 'a', "a", ""}, {0x8, 'a', "a2", ""}, {0x30, 'm', "multi", ""}};
    sec_perm_set_desc set = {4, perms};
    kx_uint32_t mask = 0;
    EXPECT_EQ(sec_translate_perms("ab", &set, &mask), SEC_S_OK);
    EXPECT_EQ(mask, 0x5u);
    EXPECT_EQ(sec_translate_perms("m", &set, &mask), SEC_S_OK);
    EXPECT_EQ(mask, 0x30u);
    char out[33];
    EXPECT_EQ(sec_translate_bitmask(0xd, &set, out), SEC_S_OK);
    EXPECT_STREQ(out, "aba");
    EXPECT_EQ(sec_translate_bitmask(0x10, &set, out), SEC_S_BAD_PERMISSION);
}

TEST(CustomTemplates, EmptySetRejectsEverythingButNothing) {
    sec_perm_set_desc empty = {0, nullptr};
    sec_perm_set_desc negative = {-5, nullptr};
    kx_uint32_t mask = 0;
    char out[33];
    EXPECT_EQ(sec_translate_perms("r", &empty, &mask), SEC_S_BAD_PERMISSION);
    EXPECT_EQ(sec_translate_perms("r", &negative, &mask), SEC_S_BAD_PERMISSION);
    EXPECT_EQ(sec_translate_bitmask(1, &empty, out), SEC_S_BAD_PERMISSION);
    EXPECT_EQ(sec_translate_bitmask(0, &empty, out), SEC_S_OK);
    EXPECT_EQ(sec_translate_perms("", &empty, &mask), SEC_S_OK);
}

// The translators keep the caller's error record; a clearing function does not.
TEST(Clearing, TranslatorsKeepAnEarlierRecord) {
    kx_uint32_t mask = 0;
    char out[33];
    sec_translate_perms("z", nullptr, &mask);
    ASSERT_EQ(kxtest::last_error().id, SEC_S_BAD_PERMISSION);
    EXPECT_EQ(sec_translate_perms("r", nullptr, &mask), SEC_S_OK);
    EXPECT_EQ(sec_translate_bitmask(1, nullptr, out), SEC_S_OK);
    EXPECT_EQ(kxtest::last_error().msg_num, 133);
    sec_acle_t acle = nullptr;
    EXPECT_EQ(sec_create_acle(SEC_ACLE_ANYOTHER, 1, nullptr, nullptr, &acle), SEC_S_OK);
    EXPECT_EQ(kxtest::last_error().id, 0);
    sec_release_acle(acle);
}

} // namespace
