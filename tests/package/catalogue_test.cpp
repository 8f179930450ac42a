// The compiled message catalogue holds exactly the library's default texts,
// and a translated catalogue found through NLSPATH and the locale replaces
// the default text in the messages of failing calls.
#include <nl_types.h>

#include <clocale>
#include <cstdlib>
#include <string>

#include <gtest/gtest.h>

#include <kx_acl.h>
#include <kx_cu.h>

#include "support.h"

namespace {

TEST(Catalogue, HoldsEveryDefaultTextByteForByte) {
    const nl_catd catalogue = catopen(KX_CATALOGUE_FILE, 0);
    ASSERT_NE(catalogue, reinterpret_cast<nl_catd>(-1)) << KX_CATALOGUE_FILE;
    for (int number = 1; number < KXSECLIB_MSG_COUNT; ++number) {
        const std::string expected = cu_mesgtbl_kxseclib_msg[number];
        const char *text = catgets(catalogue, 1, number, nullptr);
        // Entries left to the family's other components stay out of ours.
        if (expected.empty()) {
            EXPECT_EQ(text, nullptr) << number;
            continue;
        }
        ASSERT_NE(text, nullptr) << number;
        EXPECT_EQ(text, expected) << number;
    }
    catclose(catalogue);
}

// The thread's message formatted from its default text, as if no catalogue
// were installed.
std::string default_message() {
    cu_error_t *err = nullptr;
    cu_get_error_1(&err);
    cu_error_t without_catalogue = *err;
    without_catalogue.cu_msg_cat = nullptr;
    char *msg = nullptr;
    cu_get_errmsg_1(&without_catalogue, &msg);
    std::string text = msg;
    cu_rel_errmsg_1(msg);
    cu_rel_error_1(err);
    return text;
}

// kxseclib_de.msg translates 2650-146 alone, for the en_US.ISO-8859-1 locale.
class TranslatedCatalogue : public ::testing::Test {
  protected:
    void SetUp() override {
        ASSERT_TRUE(kxtest::use_build_locale("en_US.ISO-8859-1"));
        ASSERT_EQ(setenv("NLSPATH", KX_TRANSLATION_DIR "/%L/LC_MESSAGES/%N", 1), 0);
    }

    void TearDown() override { unsetenv("NLSPATH"); }
};

TEST_F(TranslatedCatalogue, ReplacesTheDefaultTextOfAFailingCall) {
    kx_uint32_t mask = 0;
    ASSERT_EQ(sec_translate_perms("rwz", nullptr, &mask), SEC_S_BAD_PERMISSION);
    EXPECT_EQ(kxtest::last_error().text,
              "2650-146 Fehler: Das Zeichen 'z' der Berechtigung entspricht keiner Vorlage.\n");
}

TEST_F(TranslatedCatalogue, MessagesItLacksKeepTheirDefaultText) {
    ASSERT_EQ(sec_translate_perms("rw", nullptr, nullptr), SEC_S_BAD_PARAM);
    const std::string text = kxtest::last_error().text;
    EXPECT_EQ(text.rfind("2650-101 Failure: incorrect parameters provided.\n", 0), 0u) << text;
    EXPECT_EQ(text, default_message());
}

TEST_F(TranslatedCatalogue, IsNotUsedInAnotherLocale) {
    ASSERT_NE(std::setlocale(LC_ALL, "C"), nullptr);
    kx_uint32_t mask = 0;
    ASSERT_EQ(sec_translate_perms("rwz", nullptr, &mask), SEC_S_BAD_PERMISSION);
    const std::string text = kxtest::last_error().text;
    EXPECT_EQ(text.rfind("2650-146 Failure: One of the characters", 0), 0u) << text;
    EXPECT_EQ(text, default_message());
}

} // namespace
