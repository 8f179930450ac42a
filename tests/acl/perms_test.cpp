// Translation between permission strings and masks.
#include <cstring>
#include <string>
#include <gtest/gtest.h>
#include <kx_acl.h>

namespace {
const char default_chars[] = "rwcxCqledvsao";

// Repeats count once; a mask translates in ascending bit order.
TEST(Translate, DefaultTemplates) {
    const struct {
        const char *text;
        kx_uint32_t mask;
        const char *back;
    } cases[] = {{"", 0, ""},
                 {nullptr, 0, ""},
                 {"rwrw", 0x3, "rw"},
                 {"cC", 0x14, "cC"},
                 {"erw", 0x83, "rwe"},
                 {"oCr", 0x1011, "rCo"},
                 {default_chars, 0x1fff, default_chars}};
    for (const auto &c : cases) {
        kx_uint32_t mask = 0xdead;
        char out[33];
        std::memset(out, 'x', sizeof out);
        EXPECT_EQ(sec_translate_perms(c.text, nullptr, &mask), SEC_S_OK);
        EXPECT_EQ(mask, c.mask) << (c.text ? c.text : "(null)");
        EXPECT_EQ(sec_translate_bitmask(c.mask, nullptr, out), SEC_S_OK);
        EXPECT_STREQ(out, c.back);
    }
}

// Template order does not change the output; the first of two templates
// with one character wins; one of several bits translates one way only.
TEST(CustomTemplates, SetsAreReadAsGiven) {
    sec_perm_desc perms[] = {
        {0x4, 'b', "b", ""}, {0x1, 'a', "a", ""}, {0x8, 'a', "a2", ""}, {0x30, 'm', "multi", ""}};
    sec_perm_set_desc set = {4, perms};
    kx_uint32_t ab = 0, m = 0, mask = 0;
    EXPECT_EQ(sec_translate_perms("ab", &set, &ab) | sec_translate_perms("m", &set, &m), SEC_S_OK);
    EXPECT_TRUE(ab == 0x5 && m == 0x30) << ab << " " << m;
    char out[33];
    EXPECT_EQ(sec_translate_bitmask(0xd, &set, out), SEC_S_OK);
    EXPECT_STREQ(out, "aba");
    EXPECT_EQ(sec_translate_bitmask(0x10, &set, out), SEC_S_BAD_PERMISSION);

    // An empty set rejects everything but nothing.
    sec_perm_set_desc empty = {0, nullptr};
    EXPECT_EQ(sec_translate_perms("r", &empty, &mask), SEC_S_BAD_PERMISSION);
    EXPECT_EQ(sec_translate_bitmask(1, &empty, out), SEC_S_BAD_PERMISSION);
    EXPECT_EQ(sec_translate_bitmask(0, &empty, out), SEC_S_OK);
    EXPECT_EQ(sec_translate_perms("", &empty, &mask), SEC_S_OK);
}
} // namespace
