// POSIX-locale case handling, address texts and the time base.
#include <gtest/gtest.h>

#include <sys/socket.h>
#include <time.h>

#include <cstdint>
#include <string>
#include <tuple>
#include <utility>
#include <vector>

#include <kx_cu.h>

#include "posix_case.h"

namespace {

int sign(long v) {
    return (v > 0) - (v < 0);
}

// Only A..Z fold; bytes compare unsigned.
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

// The address whose eight 16-bit groups are given.
std::vector<unsigned char> v6(std::vector<unsigned> groups) {
    std::vector<unsigned char> b;
    for (unsigned g : groups)
        b.insert(b.end(), {static_cast<unsigned char>(g >> 8), static_cast<unsigned char>(g)});
    return b;
}

// Dotted quads and the one canonical text of each IPv6 address; every
// smaller buffer fails untouched, and exactly sized heap buffers make an
// overrun visible.
TEST(IpaddrTest, TextIsCanonical) {
    const struct {
        int af;
        std::vector<unsigned char> addr;
        std::string text;
    } cases[] = {
        {AF_INET, {127, 0, 0, 1}, "127.0.0.1"},
        {AF_INET, {10, 0, 99, 200}, "10.0.99.200"},
        {AF_INET, {192, 168, 100, 255}, "192.168.100.255"},
        {AF_INET6, v6({0x2001, 0xdb8, 0, 0, 0, 0, 0, 1}), "2001:db8::1"},
        {AF_INET6, v6({0x2001, 0xdb8, 0, 1, 1, 1, 1, 1}), "2001:db8:0:1:1:1:1:1"}, // one zero stays
        {AF_INET6, v6({0x2001, 0, 0, 1, 0, 0, 0, 1}), "2001:0:0:1::1"},         // the longest run
        {AF_INET6, v6({0x2001, 0xdb8, 0, 0, 1, 0, 0, 1}), "2001:db8::1:0:0:1"}, // the first
        {AF_INET6, v6({0, 0, 0, 0, 0, 0, 0, 0}), "::"},
        {AF_INET6, v6({0, 0, 0, 0, 0, 0, 0, 1}), "::1"},
        {AF_INET6, v6({1, 0, 0, 0, 0, 0, 0, 0}), "1::"},
        {AF_INET6, v6({0x2001, 0xdb8, 0xa, 0xbc, 0xdef, 0x1234, 0, 0xABCD}),
         "2001:db8:a:bc:def:1234:0:abcd"},
        {AF_INET6, std::vector<unsigned char>(16, 0xff), "ffff:ffff:ffff:ffff:ffff:ffff:ffff:ffff"},
        {AF_INET6, v6({0, 0, 0, 0, 0, 0xffff, 0xc000, 0x0201}), "::ffff:192.0.2.1"},
        {AF_INET6, v6({0, 0, 0, 0, 0, 0xffff, 0xffff, 0xffff}), "::ffff:255.255.255.255"},
        {AF_INET6, v6({0, 0, 0, 0, 0, 0, 0xc000, 0x0201}), "::c000:201"}, // not IPv4-mapped
        {AF_INET6, v6({0, 0, 0, 0, 1, 0xffff, 0xc000, 0x0201}), "::1:ffff:c000:201"},
    };
    for (const auto &c : cases) {
        for (size_t size = 0; size <= c.text.size(); ++size) {
            std::vector<char> buf(size + 1, '#');
            EXPECT_EQ(cu_ipaddr_ntop_1(c.af, c.addr.data(), buf.data(), size), -1) << size;
            EXPECT_EQ(std::string(buf.begin(), buf.end()), std::string(size + 1, '#'));
        }
        std::vector<char> exact(c.text.size() + 1);
        ASSERT_EQ(cu_ipaddr_ntop_1(c.af, c.addr.data(), exact.data(), exact.size()), 0) << c.text;
        EXPECT_EQ(std::string(exact.data()), c.text);
    }
    const unsigned char v4[4] = {1, 2, 3, 4};
    char buf[CU_IPADDR_TEXT_MAX] = "untouched";
    EXPECT_EQ(cu_ipaddr_ntop_1(AF_UNIX, v4, buf, sizeof buf), -1);
    EXPECT_EQ(cu_ipaddr_ntop_1(AF_INET, nullptr, buf, sizeof buf), -1);
    EXPECT_EQ(cu_ipaddr_ntop_1(AF_INET, v4, nullptr, sizeof buf), -1);
    EXPECT_STREQ(buf, "untouched");
}

using seconds_nanos = std::pair<kx_int64_t, kx_int64_t>;

TEST(TimebaseTest, CounterIsTheMonotonicClockInNanosecondsAndConverts) {
    cu_timeinfo_t info = {7, 7};
    cu_get_procspeed_1(&info);
    EXPECT_EQ(info.timeinfo1, 1000000000u);
    EXPECT_EQ(info.timeinfo2, 0u);
    timespec ts{};
    clock_gettime(CLOCK_MONOTONIC, &ts);
    const kx_uint64_t before =
        static_cast<kx_uint64_t>(ts.tv_sec) * 1000000000u + static_cast<kx_uint64_t>(ts.tv_nsec);
    EXPECT_LE(before, cu_get_ctr_1());

    const kx_uint64_t fast = kx_uint64_t{1} << 63; // remainder * 1e9 would wrap 64 bits
    const struct {
        kx_uint64_t counter, ticks_per_second;
        seconds_nanos expected;
    } cases[] = {
        {1500000000u, 1000000000u, {1, 500000000}},
        {10, 3, {3, 333333333}},
        {UINT64_MAX, 1000000000u, {18446744073, 709551615}},
        {fast + fast / 2, fast, {1, 500000000}},
        {UINT64_MAX, 1, {INT64_MAX, 0}}, // clamped
        {123456789, 0, {0, 0}},          // no time base
    };
    for (const auto &c : cases) {
        info = {c.ticks_per_second, 0};
        seconds_nanos got{-1, -1};
        cu_cvt_time_1(c.counter, &info, &got.first, &got.second);
        EXPECT_EQ(got, c.expected) << c.counter << "/" << c.ticks_per_second;
    }
    seconds_nanos got{-1, -1};
    cu_cvt_time_1(123456789, nullptr, &got.first, &got.second);
    EXPECT_EQ(got, seconds_nanos(0, 0));
    info = {1000, 0};
    cu_cvt_time_1(2500, &info, &got.first, nullptr);
    EXPECT_EQ(got.first, 2);
}

// The word-at-a-time forms of posix_case.h around the word size: a
// difference or a NUL on either side of the eighth byte, case folded past
// it, bytes at the edges of the folding range. Each text is followed by its
// NUL and, in some rows, bytes that do not count, in a block of exactly that
// size.
TEST(PosixCaseWords, OrderLikeTheExportedComparison) {
    namespace pc = kx::posix_case;
    const struct {
        std::string a, b;
        int want;
    } cases[] = {
        // clang-format off
        {"ABCDEFGHij", "abcdefghIJ", 0}, {"abcdefg", "ABCDEFG", 0}, {"", "", 0},
        {"abcdefgh", "abcdefgi", -1}, {"abcdefgh", "abcdefg", 1}, {"", "a", -1},
        {"abcdefghIjklmnopq", "ABCDEFGHijklmnopqR", -1}, {"@@@@@@@@a", "````````A", -1},
        {"[[[[[[[[a", "{{{{{{{{A", -1}, {"ZzZzZzZzZ", "zZzZzZzZz", 0},
        {"Zzzzzzzz\xc1", "zZZZZZZZ\xe1", -1}, {"\xc1", "\xe1", -1}, {"\x80\xff", "\x7f", 1},
        {"x\x5b", "X\x7b", -1}, {"abc", "ABC", 0},
        // clang-format on
    };
    for (const auto &c : cases) {
        for (const auto &[a, b, want] : {std::tuple{c.a, c.b, c.want}, {c.b, c.a, -c.want}}) {
            const std::size_t sa = a.size() + 1, sb = b.size() + 1;
            std::vector<char> ta(a.c_str(), a.c_str() + sa), tb(b.c_str(), b.c_str() + sb);
            ta.insert(ta.end(), {'Q', '\x01', '@'});
            tb.insert(tb.end(), a.size() % 2 ? 9 : 0, '\xff'); // short blocks too
            SCOPED_TRACE(a + " | " + b);
            EXPECT_EQ(sign(cu_strcasecmp_posix_1(a.c_str(), b.c_str())), want);
            EXPECT_EQ(sign(pc::compare(ta.data(), ta.size(), tb.data(), tb.size())), want);
            EXPECT_EQ(sign(pc::prepared_text(a.c_str(), sa).order(tb.data(), tb.size())), want);
            EXPECT_EQ(pc::folded_hash(a.c_str(), sa) == pc::folded_hash(b.c_str(), sb), want == 0);
            // Keys that differ order the texts; equal keys of a text that
            // ends within them mean equal texts.
            const std::uint64_t ka = pc::sort_key(a.c_str(), sa), kb = pc::sort_key(b.c_str(), sb);
            EXPECT_TRUE(ka != kb ? (ka < kb ? -1 : 1) == want : want == 0 || (sa > 8 && sb > 8));
        }
    }
}

} // namespace
