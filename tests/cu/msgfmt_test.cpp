// Message formatting: substitution of the record's arguments, texts that
// must be copied unchanged, and catalogue lookup through NLSPATH.
#include <gtest/gtest.h>

#include <climits>
#include <cstdlib>
#include <fstream>
#include <string>
#include <vector>

#include "cu_test.h"
#include "support.h"

namespace {

using cu_test::current_message;
using cu_test::message_of;

class MessageTest : public ::testing::Test {
  protected:
    void TearDown() override { cu_set_no_error_1(); }
};

template <typename... Args> std::string formatted(const char *text, Args... args) {
    EXPECT_EQ(cu_set_error_1(1, nullptr, nullptr, 0, 0, text, args...), 0);
    return current_message();
}

// Formats a caller-built record, an int 7 and a text "t", with no catalogue.
std::string with_int_and_text(const char *text) {
    cu_error_arg_t args[2] = {};
    args[0].cu_arg_value.cu_arg_int = 7;
    args[1].cu_arg_type = CU_ERROR_ARG_CHAR_STR;
    args[1].cu_arg_value.cu_arg_char_str = const_cast<char *>("t");
    const cu_error_t err = {1, nullptr, nullptr, 0, 0, const_cast<char *>(text), 2, args};
    return message_of(&err);
}

TEST_F(MessageTest, ConversionsHonourFlagsWidthPrecisionAndLength) {
    EXPECT_EQ(formatted("[%1$08x][%2$c][%3$-5d][%4$+d][%5$X][%6$#o][%7$u][%8$hhx][%9$ld][%10$llu]",
                        0x2000, 'A', 42, 7, 0xBEEF, 8, -1, 0x1FF, LONG_MIN, 1ULL << 63),
              "[00002000][A][42   ][+7][BEEF][010][4294967295][ff][" + std::to_string(LONG_MIN) +
                  "][9223372036854775808]");
    EXPECT_EQ(formatted("[%1$5s][%2$.2s][%3$.2f][%4$e][%5$g][%6$p][%7$.3Lf]", "ab", "xyz", 3.14159,
                        1000.0, 0.5, reinterpret_cast<void *>(0x1234), 2.5L),
              "[   ab][xy][3.14][1.000000e+03][0.5][0x1234][2.500]");
    EXPECT_EQ(formatted("%2$s failed with %1$d (%2$s)", 13, "open"), "open failed with 13 (open)");
    EXPECT_EQ(formatted("%s has %d entries, 100%% full", "acl", 3), "acl has 3 entries, 100% full");
}

// What a hostile translation could do with an int and a text argument: a
// placeholder that does not suit its argument, or has none, is copied.
TEST_F(MessageTest, PlaceholdersWithoutASuitableArgumentAreCopied) {
    const char *copied[] = {
        "%1$s|%1$p|%1$f|%1$ld|%1$lld|%2$d|%2$c",
        "%2$-3d %99$x %3$d",
        "%n %1$n %q %*d %1$Ld %1$ls %0$d %100$d %1$99999d trailing %",
    };
    for (const char *text : copied)
        EXPECT_EQ(with_int_and_text(text), text);
    EXPECT_EQ(with_int_and_text("%1$d|%2$s|%d %s %s"), "7|t|7 t %s");
    // A count without an argument array must not be followed.
    cu_error_t err = {3, nullptr, nullptr, 0, 0, const_cast<char *>("v=%1$d"), 4, nullptr};
    EXPECT_EQ(message_of(&err), "v=%1$d");
    // No record or no text gives an empty text.
    EXPECT_EQ(message_of(nullptr), "");
    err.cu_msg_default = nullptr;
    EXPECT_EQ(message_of(&err), "");
}

// A catalogue built with gencat, found through NLSPATH.
TEST_F(MessageTest, CatalogueTextReplacesTheDefault) {
    const std::string dir = kxtest::temp_dir();
    std::ofstream(dir + "/kxcutest.msg") << "$set 1\n"
                                            "101 Übersetzt: %2$d von %1$s ist 0x%3$x.\\n\n"
                                            "102 Böswillig: %1$s %2$s\n";
    const std::string gencat = "gencat " + dir + "/kxcutest.cat " + dir + "/kxcutest.msg";
    if (std::system((gencat + " >/dev/null 2>&1").c_str()) != 0)
        GTEST_SKIP() << "gencat is not available";
    ASSERT_EQ(setenv("NLSPATH", (dir + "/%N").c_str(), 1), 0);
    const struct {
        const char *catalogue;
        int set, number;
        std::string expected;
    } cases[] = {
        {"kxcutest.cat", 1, 101, "Übersetzt: 2 von list ist 0xff.\n"},
        // The translation wants two texts; the second argument is an int.
        {"kxcutest.cat", 1, 102, "Böswillig: list %2$s"},
        {"kxcutest.cat", 1, 999, "default list 2 0xff"},
        {"kxcutest.cat", 2, 101, "default list 2 0xff"},
        {"kxcu-absent.cat", 1, 101, "default list 2 0xff"},
    };
    for (const auto &c : cases) {
        ASSERT_EQ(cu_set_error_1(4, nullptr, c.catalogue, c.set, c.number,
                                 "default %1$s %2$d 0x%3$x", "list", 2, 255),
                  0);
        EXPECT_EQ(current_message(), c.expected) << c.catalogue << " " << c.set << "." << c.number;
    }
    unsetenv("NLSPATH");
}

} // namespace
