// Translation between permission strings and masks.
#include <cstring>
#include <string>

#include <gtest/gtest.h>

#include <kx_acl.h>

#include "messages.h"
#include "support.h"

using kxtest::record_is;

namespace {

const char default_chars[] = "rwcxCqledvsao";

TEST(TranslatePerms, DefaultTemplates) {
    const struct {
        const char *text;
        kx_uint32_t mask;
    } cases[] = {{"", 0}, {nullptr, 0}, {"rwrw", 0x3}, {default_chars, 0x1fff}, {"cC", 0x14}};
    for (const auto &c : cases) {
        kx_uint32_t mask = 0xdead;
        EXPECT_EQ(sec_translate_perms(c.text, nullptr, &mask), SEC_S_OK);
        EXPECT_EQ(mask, c.mask) << (c.text ? c.text : "(null)");
    }
}

TEST(TranslatePerms, UnknownCharacterKeepsEarlierBits) {
    kx_uint32_t mask = 0;
    EXPECT_EQ(sec_translate_perms("rwz", nullptr, &mask), SEC_S_BAD_PERMISSION);
    EXPECT_EQ(mask, 0x3u);
    EXPECT_TRUE(record_is(SEC_S_BAD_PERMISSION, kxacl::MSG_2650_146, {'z'}));
    EXPECT_NE(kxtest::last_error().text.find("permission ('z') does not"), std::string::npos);
    // Characters are case-sensitive.
    EXPECT_EQ(sec_translate_perms("R", nullptr, &mask), SEC_S_BAD_PERMISSION);
    EXPECT_TRUE(record_is(SEC_S_BAD_PERMISSION, kxacl::MSG_2650_146, {'R'}));
}

// A null result is parameter 3; the mask translator reports it under the
// routine name that the catalogue uses.
TEST(TranslatePerms, NullResultIsParameterThree) {
    EXPECT_EQ(sec_translate_perms("r", nullptr, nullptr), SEC_S_BAD_PARAM);
    EXPECT_TRUE(record_is(SEC_S_BAD_PARAM, kxacl::MSG_2650_101, {"sec_translate_perms", 3, 0}));
    EXPECT_EQ(sec_translate_bitmask(1, nullptr, nullptr), SEC_S_BAD_PARAM);
    EXPECT_TRUE(record_is(SEC_S_BAD_PARAM, kxacl::MSG_2650_101, {"sec_translate_mask", 3, 0}));
}

TEST(TranslateBitmask, AscendingBitOrder) {
    const struct {
        kx_uint32_t mask;
        const char *text;
    } cases[] = {{0x83, "rwe"}, {0x1011, "rCo"}, {0x1fff, default_chars}, {0, ""}};
    for (const auto &c : cases) {
        char out[33];
        std::memset(out, 'x', sizeof out);
        EXPECT_EQ(sec_translate_bitmask(c.mask, nullptr, out), SEC_S_OK);
        EXPECT_STREQ(out, c.text);
    }
}

TEST(TranslateBitmask, BitWithoutTemplate) {
    char out[33];
    EXPECT_EQ(sec_translate_bitmask(0x2000, nullptr, out), SEC_S_BAD_PERMISSION);
    EXPECT_TRUE(record_is(SEC_S_BAD_PERMISSION, kxacl::MSG_2650_178, {0x2000}));
    EXPECT_NE(kxtest::last_error().text.find("(0x00002000)"), std::string::npos);
    EXPECT_EQ(sec_translate_bitmask(0x80000001u, nullptr, out), SEC_S_BAD_PERMISSION);
    EXPECT_EQ(static_cast<unsigned>(kxtest::last_error().num(0)), 0x80000000u);
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

    // An empty set rejects everything but nothing.
    sec_perm_set_desc empty = {0, nullptr}, negative = {-5, nullptr};
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
    EXPECT_TRUE(record_is(SEC_S_BAD_PERMISSION, kxacl::MSG_2650_146, {'z'}));
    sec_acle_t acle = nullptr;
    EXPECT_EQ(sec_create_acle(SEC_ACLE_ANYOTHER, 1, nullptr, nullptr, &acle), SEC_S_OK);
    EXPECT_EQ(kxtest::last_error().id, 0);
    sec_release_acle(acle);
}

} // namespace
