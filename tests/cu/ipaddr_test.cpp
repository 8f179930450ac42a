// Address text: dotted quads and the one canonical text of each IPv6 address.
#include <gtest/gtest.h>

#include <sys/socket.h>

#include <array>
#include <string>
#include <vector>

#include "cu_test_util.h"

namespace {

// The address whose eight 16-bit groups are given.
std::array<unsigned char, 16> v6(std::array<unsigned, 8> groups) {
    std::array<unsigned char, 16> b{};
    for (int i = 0; i < 8; ++i) {
        b[2 * i] = static_cast<unsigned char>(groups[i] >> 8);
        b[2 * i + 1] = static_cast<unsigned char>(groups[i]);
    }
    return b;
}

// Checks the text of addr, and that every smaller buffer fails untouched.
// Heap buffers of the exact size make an overrun visible.
void expect_text(int af, const void *addr, const std::string &text) {
    for (size_t size = 0; size <= text.size(); ++size) {
        std::vector<char> buf(size + 1, '#');
        EXPECT_EQ(cu_ipaddr_ntop_1(af, addr, buf.data(), size), -1) << text << " in " << size;
        EXPECT_EQ(std::string(buf.begin(), buf.end()), std::string(size + 1, '#'));
    }
    std::vector<char> exact(text.size() + 1);
    ASSERT_EQ(cu_ipaddr_ntop_1(af, addr, exact.data(), exact.size()), 0) << text;
    EXPECT_EQ(std::string(exact.data()), text);
}

TEST(IpaddrTest, Ipv6TextIsCanonical) {
    const struct {
        std::array<unsigned, 8> groups;
        const char *text;
    } cases[] = {
        {{0x2001, 0xdb8, 0, 0, 0, 0, 0, 1}, "2001:db8::1"},
        {{0x2001, 0xdb8, 0, 1, 1, 1, 1, 1}, "2001:db8:0:1:1:1:1:1"}, // one zero group stays
        {{0x2001, 0, 0, 1, 0, 0, 0, 1}, "2001:0:0:1::1"},            // the longest run
        {{0x2001, 0xdb8, 0, 0, 1, 0, 0, 1}, "2001:db8::1:0:0:1"},    // the first of equals
        {{0, 0, 0, 0, 0, 0, 0, 0}, "::"},
        {{0, 0, 0, 0, 0, 0, 0, 1}, "::1"},
        {{1, 0, 0, 0, 0, 0, 0, 0}, "1::"},
        {{0x2001, 0xdb8, 0xa, 0xbc, 0xdef, 0x1234, 0, 0xABCD}, "2001:db8:a:bc:def:1234:0:abcd"},
        {{0xffff, 0xffff, 0xffff, 0xffff, 0xffff, 0xffff, 0xffff, 0xffff},
         "ffff:ffff:ffff:ffff:ffff:ffff:ffff:ffff"},
        {{0, 0, 0, 0, 0, 0xffff, 0xc000, 0x0201}, "::ffff:192.0.2.1"},
        {{0, 0, 0, 0, 0, 0xffff, 0xffff, 0xffff}, "::ffff:255.255.255.255"},
        {{0, 0, 0, 0, 0, 0, 0xc000, 0x0201}, "::c000:201"}, // not IPv4-mapped
        {{0, 0, 0, 0, 1, 0xffff, 0xc000, 0x0201}, "::1:ffff:c000:201"},
    };
    for (const auto &c : cases)
        expect_text(AF_INET6, v6(c.groups).data(), c.text);
}

TEST(IpaddrTest, Ipv4IsDottedQuad) {
    const unsigned char loopback[4] = {127, 0, 0, 1}, mixed[4] = {10, 0, 99, 200},
                        widest[4] = {192, 168, 100, 255};
    expect_text(AF_INET, loopback, "127.0.0.1");
    expect_text(AF_INET, mixed, "10.0.99.200");
    expect_text(AF_INET, widest, "192.168.100.255");
}

TEST(IpaddrTest, BadArgumentsFail) {
    const unsigned char v4[4] = {1, 2, 3, 4};
    char buf[CU_IPADDR_TEXT_MAX] = "untouched";
    EXPECT_EQ(cu_ipaddr_ntop_1(AF_UNIX, v4, buf, sizeof buf), -1);
    EXPECT_EQ(cu_ipaddr_ntop_1(AF_INET, nullptr, buf, sizeof buf), -1);
    EXPECT_EQ(cu_ipaddr_ntop_1(AF_INET, v4, nullptr, sizeof buf), -1);
    EXPECT_STREQ(buf, "untouched");
}

} // namespace
