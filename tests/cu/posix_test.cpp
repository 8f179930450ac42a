// POSIX-locale case handling: only A..Z fold, bytes compare unsigned.
#include <gtest/gtest.h>

#include <random>
#include <string>
#include <vector>

#include "cu/posix_case.h"
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

// ---- the word-at-a-time comparisons of posix_case.h -------------------------

int sign(long v) {
    return (v > 0) - (v < 0);
}

// Pairs of texts that share prefixes of every length around the word size,
// differ in case, in one byte or in length, over bytes at the edges of the
// folding range; each text is followed by bytes that do not count.
struct text_pairs {
    std::mt19937 random{7};
    const std::string edges = std::string("@AZ[`az{09~\x7f\x80\xc0\xda\xfa\xff\x01", 18);

    std::string text(std::size_t length) {
        std::string t;
        for (std::size_t i = 0; i < length; ++i)
            t += edges[random() % edges.size()];
        return t;
    }
    std::string variant(std::string t) {
        switch (random() % 4) {
        case 0: // another case
            for (char &c : t)
                c = static_cast<char>(c >= 'a' && c <= 'z' ? c - 32 : c);
            return t;
        case 1: // one byte changed
            if (!t.empty())
                t[random() % t.size()] = edges[random() % edges.size()];
            return t;
        case 2: // cut short
            return t.substr(0, random() % (t.size() + 1));
        default: // longer
            return t + text(random() % 10);
        }
    }
};

// The text, its NUL and count bytes that follow, in a block of exactly that
// size so that a read beyond it is caught by the sanitizers.
std::vector<char> with_tail(const std::string &t, std::size_t count, std::mt19937 &random) {
    std::vector<char> v(t.begin(), t.end());
    v.push_back('\0');
    for (std::size_t i = 0; i < count; ++i)
        v.push_back(static_cast<char>(random()));
    return v;
}

TEST(PosixCaseWords, AgreeWithTheExportedComparison) {
    text_pairs pairs;
    for (int n = 0; n < 20000; ++n) {
        std::string a = pairs.text(pairs.random() % 20);
        std::string b = pairs.variant(a);
        int expected = cu_strcasecmp_posix_1(a.c_str(), b.c_str());
        auto ta = with_tail(a, pairs.random() % 12, pairs.random);
        auto tb = with_tail(b, pairs.random() % 12, pairs.random);
        ASSERT_EQ(kx::posix_case::compare(ta.data(), ta.size(), tb.data(), tb.size()), expected)
            << a << " | " << b;
        kx::posix_case::prepared_text prepared(a.c_str(), a.size() + 1);
        ASSERT_EQ(sign(prepared.order(tb.data(), tb.size())), sign(expected)) << a << " | " << b;
        std::uint64_t ka = kx::posix_case::sort_key(a.c_str(), a.size() + 1);
        std::uint64_t kb = kx::posix_case::sort_key(b.c_str(), b.size() + 1);
        if (expected == 0) {
            ASSERT_EQ(kx::posix_case::folded_hash(a.c_str(), a.size() + 1),
                      kx::posix_case::folded_hash(b.c_str(), b.size() + 1))
                << a << " | " << b;
        }
        if (ka != kb) {
            ASSERT_EQ(ka < kb ? -1 : 1, sign(expected)) << a << " | " << b;
        } else if (a.size() < 8 || b.size() < 8) {
            ASSERT_EQ(expected, 0) << a << " | " << b;
        }
    }
}

} // namespace
