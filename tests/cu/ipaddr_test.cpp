// Address text: dotted quads and the one canonical text of each IPv6 address.
#include <gtest/gtest.h>

#include <sys/socket.h>

#include <string>
#include <vector>

#include <kx_cu.h>

namespace {

// Checks the text of addr, and that every smaller buffer fails untouched.
// Heap buffers of the exact size make an overrun visible.
void expect_text(int af, const std::vector<unsigned char> &addr, const std::string &text) {
    for (size_t size = 0; size <= text.size(); ++size) {
        std::vector<char> buf(size + 1, '#');
        EXPECT_EQ(cu_ipaddr_ntop_1(af, addr.data(), buf.data(), size), -1)
            << text << " in " << size;
        EXPECT_EQ(std::string(buf.begin(), buf.end()), std::string(size + 1, '#'));
    }
    std::vector<char> exact(text.size() + 1);
    ASSERT_EQ(cu_ipaddr_ntop_1(af, addr.data(), exact.data(), exact.size()), 0) << text;
    EXPECT_EQ(std::string(exact.data()), text);
}

// The address whose eight 16-bit groups are given.
std::vector<unsigned char> v6(std::vector<unsigned> groups) {
    std::vector<unsigned char> b;
    for (unsigned g : groups)
        b.insert(b.end(), {static_cast<unsigned char>(g >> 8), static_cast<unsigned char>(g)});
    return b;
}

TEST(IpaddrTest, TextIsCanonical) {
    const struct {
        int af;
        std::vector<unsigned char> addr;
        const char *text;
    } cases[] = {
        {AF_INET, {127, 0, 0, 1}, "127.0.0.1"},
        {AF_INET, {10, 0, 99, 200}, "10.0.99.200"},
        {AF_INET, {192, 168, 100, 255}, "192.168.100.255"},
        {AF_INET6, v6({0x2001, 0xdb8, 0, 0, 0, 0, 0, 1}), "2001:db8::1"},
        {AF_INET6, v6({0x2001, 0xdb8, 0, 1, 1, 1, 1, 1}), "2001:db8:0:1:1:1:1:1"}, // one zero stays
        {AF_INET6, v6({0x2001, 0, 0, 1, 0, 0, 0, 1}), "2001:0:0:1::1"}, // the longest run
        {AF_INET6, v6({0x2001, 0xdb8, 0, 0, 1, 0, 0, 1}),
         "2001:db8::1:0:0:1"}, // the first of equals
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
    for (const auto &c : cases)
        expect_text(c.af, c.addr, c.text);
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
