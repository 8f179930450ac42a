// POSIX-locale case handling: only A..Z fold, bytes compare unsigned; the
// word-at-a-time comparisons of posix_case.h agree with the exported one.
#include <gtest/gtest.h>

#include <random>
#include <string>
#include <vector>

#include <kx_cu.h>

#include "posix_case.h"

namespace {

int sign(long v) {
    return (v > 0) - (v < 0);
}

TEST(PosixCaseTest, FoldsOnlyAsciiCapitalsAndComparesBytesUnsigned) {
    for (int c = -1; c <= 255; ++c)
        EXPECT_EQ(cu_tolower_posix_1(c), c >= 'A' && c <= 'Z' ? c - 'A' + 'a' : c) << c;
    // Exactly sized heap texts, so that a read past a NUL is caught.
    const std::vector<char> ab = {'a', 'b', 0}, AB = {'A', 'B', 0}, a = {'a', 0};
    const struct {
        const char *s1, *s2;
        size_t n; // 0: cu_strcasecmp_posix_1
        int sign;
    } cases[] = {
        {"ReadWrite", "rEADwRITE", 0, 0},
        {"AZaz09_@[`{", "azAZ09_@[`{", 0, 0},
        {"\xC3\x89", "\xC3\xA9", 0, -1}, // "É" and "é" in UTF-8,
        {"\xC9", "\xE9", 0, -1},         // and in Latin-1
        {"[", "A", 0, -1},               // '[' (5B) sorts before 'a' (61)
        {"A", "[", 0, 1},
        {"\x80", "z", 0, 1}, // bytes above 7F sort last
        {"abc", "ABCD", 0, -1},
        {"ABCD", "abc", 0, 1},
        {nullptr, "", 0, -1}, // NULL sorts first
        {nullptr, nullptr, 0, 0},
        {"abcX", "ABCy", 3, 0},
        {"abcX", "ABCy", 4, -1},
        {"[", "A", 1, -1},
        {nullptr, "a", 1, -1},
        {ab.data(), AB.data(), 1000, 0},
        {ab.data(), a.data(), 1000, 1},
    };
    for (const auto &c : cases) {
        const int result =
            c.n == 0 ? cu_strcasecmp_posix_1(c.s1, c.s2) : cu_strncasecmp_posix_1(c.s1, c.s2, c.n);
        EXPECT_EQ(sign(result), c.sign) << (c.s1 ? c.s1 : "NULL") << " | " << c.s2 << " " << c.n;
    }
    EXPECT_EQ(cu_strncasecmp_posix_1("x", "y", 0), 0);
}

// The text, its NUL and count random bytes that do not count, in a block
// of exactly that size so that a read beyond it is caught.
std::vector<char> with_tail(const std::string &t, std::mt19937 &random) {
    std::vector<char> v(t.c_str(), t.c_str() + t.size() + 1);
    for (std::size_t n = random() % 12; n > 0; --n)
        v.push_back(static_cast<char>(random()));
    return v;
}

// Pairs of texts that share prefixes of every length around the word size
// and differ in case, in one byte or in length, over bytes at the edges of
// the folding range.
TEST(PosixCaseWords, AgreeWithTheExportedComparison) {
    namespace pc = kx::posix_case;
    std::mt19937 random{7};
    const std::string edges("@AZ[`az{09~\x7f\x80\xc0\xda\xfa\xff\x01", 18);
    auto text = [&](std::size_t length) {
        std::string t;
        while (t.size() < length)
            t += edges[random() % edges.size()];
        return t;
    };
    for (int n = 0; n < 20000; ++n) {
        const std::string a = text(random() % 20);
        std::string b = a;
        switch (random() % 4) {
        case 0: // another case
            for (char &c : b)
                c = static_cast<char>(c >= 'a' && c <= 'z' ? c - 32 : c);
            break;
        case 1: // one byte changed
            if (!b.empty())
                b[random() % b.size()] = edges[random() % edges.size()];
            break;
        case 2: // cut short
            b.resize(random() % (b.size() + 1));
            break;
        default: // longer
            b += text(random() % 10);
        }
        const int expected = cu_strcasecmp_posix_1(a.c_str(), b.c_str());
        const auto ta = with_tail(a, random), tb = with_tail(b, random);
        const std::size_t sa = a.size() + 1, sb = b.size() + 1;
        SCOPED_TRACE(a + " | " + b);
        ASSERT_EQ(pc::compare(ta.data(), ta.size(), tb.data(), tb.size()), expected);
        ASSERT_EQ(sign(pc::prepared_text(a.c_str(), sa).order(tb.data(), tb.size())),
                  sign(expected));
        if (expected == 0) {
            ASSERT_EQ(pc::folded_hash(a.c_str(), sa), pc::folded_hash(b.c_str(), sb));
        }
        // Keys that differ order the texts; equal keys of a text that ends
        // within them mean equal texts.
        const std::uint64_t ka = pc::sort_key(a.c_str(), sa), kb = pc::sort_key(b.c_str(), sb);
        if (ka != kb) {
            ASSERT_EQ(ka < kb ? -1 : 1, sign(expected));
        } else if (sa <= 8 || sb <= 8) {
            ASSERT_EQ(expected, 0);
        }
    }
}

} // namespace
