// Message formatting: substitution of the record's arguments, texts that
// must be copied unchanged, and catalogue lookup through NLSPATH.
#include <gtest/gtest.h>

#include <climits>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include "cu_test_util.h"

using cu_test::current_message;
using cu_test::message_of;

namespace {

class MessageTest : public ::testing::Test {
  protected:
    void TearDown() override { cu_set_no_error_1(); }
};

cu_error_arg_t int_arg(int v) {
    cu_error_arg_t a{};
    a.cu_arg_type = CU_ERROR_ARG_INT;
    a.cu_arg_value.cu_arg_int = v;
    return a;
}

cu_error_arg_t text_arg(const char *s) {
    cu_error_arg_t a{};
    a.cu_arg_type = CU_ERROR_ARG_CHAR_STR;
    a.cu_arg_value.cu_arg_char_str = const_cast<char *>(s);
    return a;
}

// Formats a caller-built record: text as its default, no catalogue.
std::string format_with(const char *text, std::vector<cu_error_arg_t> args) {
    cu_error_t err = {1,
                      nullptr,
                      nullptr,
                      0,
                      0,
                      const_cast<char *>(text),
                      static_cast<kx_uint32_t>(args.size()),
                      args.empty() ? nullptr : args.data()};
    return message_of(&err);
}

TEST_F(MessageTest, IntegerConversionsHonourFlagsWidthAndLength) {
    ASSERT_EQ(cu_set_error_1(1, nullptr, nullptr, 0, 0,
                             "[%1$08x][%2$c][%3$-5d][%4$+d][%5$X][%6$#o][%7$u][%8$hhx][%9$ld]"
                             "[%10$llu]",
                             0x2000, 'A', 42, 7, 0xBEEF, 8, -1, 0x1FF, LONG_MIN, 1ULL << 63),
              0);
    EXPECT_EQ(current_message(), "[00002000][A][42   ][+7][BEEF][010][4294967295][ff][" +
                                     std::to_string(LONG_MIN) + "][9223372036854775808]");
}

TEST_F(MessageTest, TextsDoublesAndPointers) {
    ASSERT_EQ(cu_set_error_1(1, nullptr, nullptr, 0, 0,
                             "[%1$5s][%2$.2s][%3$.2f][%4$e][%5$g][%6$p][%7$.3Lf]", "ab", "xyz",
                             3.14159, 1000.0, 0.5, reinterpret_cast<void *>(0x1234), 2.5L),
              0);
    EXPECT_EQ(current_message(), "[   ab][xy][3.14][1.000000e+03][0.5][0x1234][2.500]");
}

TEST_F(MessageTest, ArgumentsAreFoundByNumberOrInTurn) {
    ASSERT_EQ(cu_set_error_1(1, nullptr, nullptr, 0, 0, "%2$s failed with %1$d (%2$s)", 13, "open"),
              0);
    EXPECT_EQ(current_message(), "open failed with 13 (open)");
    ASSERT_EQ(cu_set_error_1(1, nullptr, nullptr, 0, 0, "%s has %d entries, 100%% full", "acl", 3),
              0);
    EXPECT_EQ(current_message(), "acl has 3 entries, 100% full");
}

TEST_F(MessageTest, ConversionNotSuitingTheArgumentIsCopied) {
    // What a hostile translation could do with an int and a text argument.
    EXPECT_EQ(
        format_with("%1$s|%1$p|%1$f|%1$ld|%1$lld|%2$d|%2$c|%1$d|%2$s", {int_arg(7), text_arg("t")}),
        "%1$s|%1$p|%1$f|%1$ld|%1$lld|%2$d|%2$c|7|t");
    // So is a placeholder without argument, and a text that is no placeholder.
    EXPECT_EQ(format_with("a %1$d b %2$-3s c %99$x d %s %s", {int_arg(5)}),
              "a 5 b %2$-3s c %99$x d %s %s");
    EXPECT_EQ(
        format_with("%n %1$n %q %*d %1$Ld %1$ls %0$d %100$d %1$99999d trailing %", {int_arg(1)}),
        "%n %1$n %q %*d %1$Ld %1$ls %0$d %100$d %1$99999d trailing %");
    // A count without an argument array must not be followed.
    cu_error_t err = {3, nullptr, nullptr, 0, 0, const_cast<char *>("v=%1$d"), 4, nullptr};
    EXPECT_EQ(message_of(&err), "v=%1$d");
    // No record or no text gives an empty text.
    EXPECT_EQ(message_of(nullptr), "");
    err.cu_msg_default = nullptr;
    EXPECT_EQ(message_of(&err), "");
}

// A catalogue built with gencat in a private directory, found through NLSPATH.
class CatalogueTest : public MessageTest {
  protected:
    void SetUp() override {
        char pattern[] = "/tmp/kx_cu_catXXXXXX";
        ASSERT_NE(mkdtemp(pattern), nullptr);
        dir_ = pattern;
        std::ofstream(dir_ / "kxcutest.msg") << "$set 1\n"
                                                "101 Übersetzt: %2$d von %1$s ist 0x%3$x.\\n\n"
                                                "102 Böswillig: %1$s %2$s\n";
        const std::string command = "gencat " + (dir_ / "kxcutest.cat").string() + " " +
                                    (dir_ / "kxcutest.msg").string() + " >/dev/null 2>&1";
        if (std::system(command.c_str()) != 0)
            GTEST_SKIP() << "gencat is not available";
        ASSERT_EQ(setenv("NLSPATH", (dir_.string() + "/%N").c_str(), 1), 0);
    }

    void TearDown() override {
        unsetenv("NLSPATH");
        std::error_code ignored;
        std::filesystem::remove_all(dir_, ignored);
        MessageTest::TearDown();
    }

    std::filesystem::path dir_;
};

TEST_F(CatalogueTest, TranslatedTextReplacesTheDefault) {
    ASSERT_EQ(cu_set_error_1(4, nullptr, "kxcutest.cat", 1, 101, "Default: %1$s %2$d 0x%3$x.\n",
                             "sec_list_acl", 2, 255),
              0);
    EXPECT_EQ(current_message(), "Übersetzt: 2 von sec_list_acl ist 0xff.\n");
    // The translation wants two texts; the record holds an int and a text.
    ASSERT_EQ(cu_set_error_1(4, nullptr, "kxcutest.cat", 1, 102, "default %1$d %2$s", 77, "t"), 0);
    EXPECT_EQ(current_message(), "Böswillig: %1$s t");
}

TEST_F(CatalogueTest, DefaultIsUsedWhenTheCatalogueLacksTheMessage) {
    ASSERT_EQ(cu_set_error_1(4, nullptr, "kxcutest.cat", 1, 999, "default %1$d", 5), 0);
    EXPECT_EQ(current_message(), "default 5");
    ASSERT_EQ(cu_set_error_1(4, nullptr, "kxcutest.cat", 2, 101, "other set %1$d", 6), 0);
    EXPECT_EQ(current_message(), "other set 6");
    ASSERT_EQ(cu_set_error_1(4, nullptr, "kxcu-absent.cat", 1, 101, "no catalogue"), 0);
    EXPECT_EQ(current_message(), "no catalogue");
}

} // namespace
