// The per-thread error record: what cu_set_error_1 and cu_pset_error_1
// store, the copies the getters hand out, that threads never see each
// other's records; and the messages formatted from records, with the
// catalogue's text found through NLSPATH.
#include <gtest/gtest.h>

#include <barrier>
#include <climits>
#include <cstdlib>
#include <fstream>
#include <string>
#include <thread>

#include "cu_test.h"
#include "support.h"

namespace {

using namespace cu_test;

// A record with only an id and a text.
template <typename... Args> int set(int id, const char *text, Args... args) {
    return cu_set_error_1(id, nullptr, nullptr, 0, 0, text, args...);
}

const std::string no_error = "0 NULL NULL 0.0 NULL NULL";

class ErrorTest : public ::testing::Test {
  protected:
    void TearDown() override { cu_set_no_error_1(); }
};
using ErrorRecordTest = ErrorTest;
using MessageTest = ErrorTest;

// Each record replaces the one before it, whose block may hold the next.
TEST_F(ErrorRecordTest, StoresEveryFieldAndTheArgumentsTheTextTakes) {
    EXPECT_EQ(current_record(), no_error);
    const struct {
        int (*set)();
        std::string expected;
    } cases[] = {
        // Number 2 is not in the text, yet takes its int argument.
        {[] { return cu_set_error_1(4, "ffdc", "kx.cat", 1, 101, "%1$s 0x%3$x", "list", 2, 0); },
         R"(4 "ffdc" "kx.cat" 1.101 "%1$s 0x%3$x" [s"list" i2 i0])"},
        {[] {
             return set(7, "%2$c %1$08x %3$ld %4$lld %5$.1f %6$p", 0x2000, 'Q', -5L, 1LL << 40, 2.5,
                        reinterpret_cast<void *>(0x1234));
         },
         R"(7 NULL NULL 0.0 "%2$c %1$08x %3$ld %4$lld %5$.1f %6$p" [i8192 i81 l-5 ll1099511627776 d2.5 p0x1234])"},
        // A long double is stored as a double; short ones travel as int.
        {[] { return set(8, "%1$Lg %2$hhd %3$-4lu", 0.25L, 300, 9UL); },
         R"(8 NULL NULL 0.0 "%1$Lg %2$hhd %3$-4lu" [d0.25 i300 l9])"},
        // Unnumbered placeholders take the arguments in text order.
        {[] { return set(7, "%s=%d (%lx)", "key", 3, 0xABL); },
         R"-(7 NULL NULL 0.0 "%s=%d (%lx)" [s"key" i3 l171])-"},
        // %%, unknown conversions, %n, '*' widths, numbers outside 1..99 and
        // lengths that do not suit the conversion take no argument.
        {[] { return set(7, "100%% %q %n %*d %0$d %100$d %1$Ld %1$ls %2$d", 5, 6); },
         R"(7 NULL NULL 0.0 "100%% %q %n %*d %0$d %100$d %1$Ld %1$ls %2$d" [i5 i6])"},
        {[] { return set(3, "%s", static_cast<char *>(nullptr)); },
         R"-(3 NULL NULL 0.0 "%s" [s"(null)"])-"},
        {[] { return set(2, "no arguments"); }, R"(2 NULL NULL 0.0 "no arguments" NULL)"},
        {[] { return cu_set_error_1(0, "f", nullptr, 0, 0, "id 0 is no error"); }, no_error},
        {[] { return cu_pset_error_1(nullptr); }, no_error},
    };
    for (const auto &c : cases) {
        ASSERT_EQ(c.set(), 0) << c.expected;
        EXPECT_EQ(current_record(), c.expected);
    }
}

TEST_F(ErrorRecordTest, ThreadsKeepTheirOwnRecords) {
    std::barrier sync(2);
    std::string seen[2][2];
    auto worker = [&](int me) {
        cu_set_error_1(100 + me, nullptr, nullptr, 0, 0, "%1$d", me);
        sync.arrive_and_wait(); // both records are set before either is read
        seen[me][0] = current_record();
        if (me == 0)
            cu_set_no_error_1(); // must leave the other thread's record alone
        sync.arrive_and_wait();
        seen[me][1] = current_record();
        // Thread 1 ends with its record set: its exit must free it.
    };
    std::thread a(worker, 0), b(worker, 1);
    a.join();
    b.join();
    const std::string one = R"(101 NULL NULL 0.0 "%1$d" [i1])";
    EXPECT_EQ(seen[0][0], R"(100 NULL NULL 0.0 "%1$d" [i0])");
    EXPECT_EQ(seen[0][1], no_error);
    EXPECT_EQ(seen[1][0], one);
    EXPECT_EQ(seen[1][1], one);
    EXPECT_EQ(current_record(), no_error);
}

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
    EXPECT_EQ(formatted("%s has %05i entries, 100%% full", "acl", 3),
              "acl has 00003 entries, 100% full");
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

TEST_F(ErrorRecordTest, RecordsHoldCopiesOfTheCallersData) {
    char ffdc[] = "ffdc", cat[] = "c.cat", text[] = "%1$s %2$d", name[] = "alice";
    cu_error_arg_t args[2] = {};
    args[0].cu_arg_type = CU_ERROR_ARG_CHAR_STR;
    args[0].cu_arg_value.cu_arg_char_str = name;
    args[1].cu_arg_value.cu_arg_int = 17;
    const cu_error_t mine = {7, ffdc, cat, 1, 2, text, 2, args};
    const std::string expected = R"(7 "ffdc" "c.cat" 1.2 "%1$s %2$d" [s"alice" i17])";
    auto spoil = [&] { // twice restores
        for (char *s : {ffdc, cat, text, name})
            s[0] ^= 1;
        args[1].cu_arg_value.cu_arg_int ^= 1;
    };
    ASSERT_EQ(cu_set_error_1(7, ffdc, cat, 1, 2, text, name, 17), 0);
    spoil();
    EXPECT_EQ(current_record(), expected);
    spoil();
    ASSERT_EQ(cu_pset_error_1(&mine), 0);
    spoil();
    EXPECT_EQ(current_record(), expected);
}

// A cleared record's block holds the next record that fits: nothing of the
// old one may show through, and a larger one gets a block of its own.
TEST_F(ErrorRecordTest, CopiesOutliveRecordsAndClearedBlocksHoldWholeRecords) {
    const std::string long_text(200, 'L'), longer(1000, 'M');
    ASSERT_EQ(cu_set_error_1(1, "ffdc", "cat", 1, 2, "%1$s %2$s", long_text.c_str(), "b"), 0);
    const unique_error first = current_error();
    cu_set_no_error_1();
    EXPECT_EQ(current_record(), no_error);
    ASSERT_EQ(cu_set_error_1(3, nullptr, nullptr, 0, 4, "short %1$d", 9), 0);
    EXPECT_EQ(current_record(), R"(3 NULL NULL 0.4 "short %1$d" [i9])");
    ASSERT_EQ(cu_set_error_1(5, nullptr, nullptr, 0, 6, "%1$s", longer.c_str()), 0);
    EXPECT_EQ(current_record(), "5 NULL NULL 0.6 \"%1$s\" [s\"" + longer + "\"]");
    EXPECT_EQ(describe(first.get()),
              "1 \"ffdc\" \"cat\" 1.2 \"%1$s %2$s\" [s\"" + long_text + "\" s\"b\"]");
}

} // namespace
