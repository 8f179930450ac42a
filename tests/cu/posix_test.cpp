// POSIX-locale case handling: only A..Z fold, bytes compare unsigned.
#include <gtest/gtest.h>

#include <vector>

#include "cu_test_util.h"

namespace {

TEST(PosixCaseTest, ToLowerFoldsOnlyAsciiCapitals) {
    for (int c = -1; c <= 255; ++c)
        EXPECT_EQ(cu_tolower_posix_1(c), c >= 'A' && c <= 'Z' ? c - 'A' + 'a' : c) << c;
}

TEST(PosixCaseTest, CompareFoldsOnlyAsciiCapitals) {
    EXPECT_EQ(cu_strcasecmp_posix_1("ReadWrite", "rEADwRITE"), 0);
    EXPECT_EQ(cu_strcasecmp_posix_1("AZaz09_@[`{", "azAZ09_@[`{"), 0);
    // "É" and "é" in UTF-8 (C3 89, C3 A9) and in Latin-1 (C9, E9).
    EXPECT_LT(cu_strcasecmp_posix_1("\xC3\x89", "\xC3\xA9"), 0);
    EXPECT_LT(cu_strcasecmp_posix_1("\xC9", "\xE9"), 0);
    // Folded bytes compare as unsigned.
    // '[' (5B) sorts before 'a' (61), and so before 'A', which folds to 'a'.
    EXPECT_LT(cu_strcasecmp_posix_1("[", "A"), 0);
    EXPECT_GT(cu_strcasecmp_posix_1("A", "["), 0);
    EXPECT_GT(cu_strcasecmp_posix_1("\x80", "z"), 0); // bytes above 7F sort last
    EXPECT_LT(cu_strcasecmp_posix_1("abc", "ABCD"), 0);
    EXPECT_GT(cu_strcasecmp_posix_1("ABCD", "abc"), 0);
    EXPECT_LT(cu_strcasecmp_posix_1(nullptr, ""), 0); // NULL sorts first
    EXPECT_EQ(cu_strcasecmp_posix_1(nullptr, nullptr), 0);
}

TEST(PosixCaseTest, BoundedCompareStopsAtNOrTheTerminator) {
    EXPECT_EQ(cu_strncasecmp_posix_1("abcX", "ABCy", 3), 0);
    EXPECT_LT(cu_strncasecmp_posix_1("abcX", "ABCy", 4), 0);
    EXPECT_EQ(cu_strncasecmp_posix_1("x", "y", 0), 0);
    EXPECT_LT(cu_strncasecmp_posix_1("[", "A", 1), 0);
    EXPECT_LT(cu_strncasecmp_posix_1(nullptr, "a", 1), 0);
    // Exactly sized heap texts: reading past a NUL would be caught.
    const std::vector<char> ab = {'a', 'b', 0}, AB = {'A', 'B', 0}, a = {'a', 0};
    EXPECT_EQ(cu_strncasecmp_posix_1(ab.data(), AB.data(), 1000), 0);
    EXPECT_GT(cu_strncasecmp_posix_1(ab.data(), a.data(), 1000), 0);
}

} // namespace
