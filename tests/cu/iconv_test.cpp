// Codeset converters: exact bytes both ways, the UTF-8 rules that the open
// flags select, failures that leave the outputs alone, one handle shared by
// several threads.
#include <gtest/gtest.h>

#include <cstdlib>
#include <map>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "cu_test.h"
#include "unique_mem.h"

namespace {

using cu_test::unique_iconv;

const std::string nul(1, '\0');

// A status and the output, as counted by out_length.
using result = std::pair<int, std::string>;

// Converts bytes, NULs included. The outputs start as sentinels so that a
// failure can be checked to leave them alone.
result convert(cu_iconv_t h, const std::string &bytes) {
    char sentinel = 0;
    char *out = &sentinel;
    size_t out_length = 12345;
    size_t in_length = bytes.size();
    const int status = cu_iconv_str_1(h, 0, bytes.data(), &in_length, &out, &out_length);
    if (status != CU_ICONV_OK) {
        EXPECT_TRUE(out == &sentinel && out_length == 12345u) << "outputs changed on failure";
        return {status, {}};
    }
    const kx::unique_mem<char> owned(out);
    return {status, std::string(out, out_length)};
}

unique_iconv open_converter(const char *codeset, kx_uint32_t flags) {
    cu_iconv_t h = nullptr;
    EXPECT_EQ(cu_iconv_open_1(codeset, flags, &h), CU_ICONV_OK) << codeset;
    return unique_iconv(h);
}

constexpr kx_uint32_t to = CU_ICONV_TO_UTF8, from = CU_ICONV_FROM_UTF8;
constexpr kx_uint32_t standard = CU_ICONV_UTF8_STANDARD, bmp = CU_ICONV_UTF8_BMP_ONLY;

struct conversion {
    const char *codeset;
    kx_uint32_t flags;
    std::string in;
    result out;
};

std::vector<conversion> conversions() {
    const std::string grin8 = "\xF0\x9F\x98\x80", grin16("\x3D\xD8\x00\xDE", 4);
    std::string a32;
    for (int i = 0; i < 5000; ++i)
        a32 += std::string("a\0\0\0", 4);
    std::vector<conversion> all = {
        {"ISO-8859-1", to, "caf\xE9" + nul, {CU_ICONV_OK, "caf\xC3\xA9" + nul}},
        {"ISO-8859-1", from, "caf\xC3\xA9" + nul, {CU_ICONV_OK, "caf\xE9" + nul}},
        {"ISO-8859-1", to, "\xE9", {CU_ICONV_OK, "\xC3\xA9"}}, // no terminator in, none out
        {"ISO-8859-1", to, "", {CU_ICONV_OK, ""}},
        {"UTF-32LE", from, std::string(5000, 'a'), {CU_ICONV_OK, a32}}, // beyond the first guess
        {"ISO-8859-1", from, "ab\xE2\x82", {CU_ICONV_INCOMPLETE, ""}},
        {"ISO-8859-1", from, "price \xE2\x82\xAC" + nul, {CU_ICONV_UNMAPPABLE, ""}},
        {"UTF-16LE", to, std::string("a\0b", 3), {CU_ICONV_INCOMPLETE, ""}},
        // C0 80, the modified form of NUL, only where standard UTF-8 is not asked for.
        {"ISO-8859-1", from | standard, "a\xC0\x80\xC3\xA9" + nul, {CU_ICONV_BAD_SEQUENCE, ""}},
        {"ISO-8859-1", from, "a\xC0\x80\xC3\xA9" + nul, {CU_ICONV_OK, "a" + nul + "\xE9" + nul}},
        {"ISO-8859-1", from, "a\xC0\x62", {CU_ICONV_BAD_SEQUENCE, ""}}, // C0 before 'b'
        // Characters beyond U+FFFF, refused when the BMP is the limit.
        {"UTF-16LE", from | bmp, "a" + grin8, {CU_ICONV_UNMAPPABLE, ""}},
        {"UTF-16LE", to | bmp, grin16, {CU_ICONV_UNMAPPABLE, ""}},
        {"UTF-16LE", from | bmp, "\xEF\xBF\xBD", {CU_ICONV_OK, "\xFD\xFF"}},
        {"UTF-16LE", to | bmp, "\xAC\x20", {CU_ICONV_OK, "\xE2\x82\xAC"}},
        {"UTF-16LE", from, grin8, {CU_ICONV_OK, grin16}},
        {"UTF-16LE", to, grin16, {CU_ICONV_OK, grin8}},
        // ISO-2022-JP keeps state: a failure mid-text must not leak into the
        // next text, and each text ends in the initial state.
        {"ISO-2022-JP", to, "\x1B$BF|\xFF", {CU_ICONV_BAD_SEQUENCE, ""}},
        {"ISO-2022-JP", to, "AB", {CU_ICONV_OK, "AB"}},
        {"ISO-2022-JP", from, "\xE6\x97\xA5", {CU_ICONV_OK, "\x1B$BF|\x1B(B"}},
    };
    const std::string bad_utf8[] = {
        "\xFF",
        "a\x80",
        "\xC3\x28",               // no sequence
        "\xC1\xBF",               // overlong DEL
        "\xE0\x80\xAF",           // overlong '/'
        "\xED\xA0\x80",           // surrogate
        "\xF4\x90\x80\x80",       // beyond U+10FFFF
        std::string("\xC3\0", 2), // a sequence cut by the terminator
    };
    for (const std::string &in : bad_utf8)
        for (auto [codeset, flags] :
             {std::pair{"ISO-8859-1", from}, {"UTF-8", from}, {"UTF-8", to}})
            all.push_back({codeset, flags, in, {CU_ICONV_BAD_SEQUENCE, ""}});
    return all;
}

// Each codeset and flags get one handle, which the rows after share.
TEST(IconvTest, ConvertsExactlyOrFailsWithTheReason) {
    std::map<std::pair<std::string, kx_uint32_t>, unique_iconv> handles;
    for (const conversion &c : conversions()) {
        unique_iconv &h = handles[{c.codeset, c.flags}];
        if (!h)
            h = open_converter(c.codeset, c.flags);
        EXPECT_EQ(convert(h.get(), c.in), c.out)
            << c.codeset << " " << c.flags << " " << ::testing::PrintToString(c.in);
    }
}

TEST(IconvTest, BadArgumentsAndUnknownCodesets) {
    cu_iconv_t h = reinterpret_cast<cu_iconv_t>(&h);
    EXPECT_EQ(cu_iconv_open_1("NO-SUCH-CODESET-42", 0, &h), CU_ICONV_NOT_SUPPORTED);
    EXPECT_EQ(h, nullptr);
    h = reinterpret_cast<cu_iconv_t>(&h);
    EXPECT_EQ(cu_iconv_open_1(nullptr, 0, &h), CU_ICONV_BAD_ARGUMENT);
    EXPECT_EQ(h, nullptr);
    EXPECT_EQ(cu_iconv_open_1("UTF-8", 0, nullptr), CU_ICONV_BAD_ARGUMENT);
    EXPECT_EQ(cu_iconv_open_1("UTF-8", 0x40, &h), CU_ICONV_BAD_ARGUMENT);
    EXPECT_EQ(cu_iconv_open_1("ISO-8859-1//IGNORE", from, &h), CU_ICONV_BAD_ARGUMENT);

    unique_iconv conv = open_converter("ISO-8859-1", to);
    char *out = nullptr;
    size_t len = 2, out_len = 0;
    EXPECT_EQ(cu_iconv_str_1(nullptr, 0, "a", &len, &out, &out_len), CU_ICONV_BAD_ARGUMENT);
    EXPECT_EQ(cu_iconv_str_1(conv.get(), 1, "a", &len, &out, &out_len), CU_ICONV_BAD_ARGUMENT);
    EXPECT_EQ(cu_iconv_str_1(conv.get(), 0, nullptr, &len, &out, &out_len), CU_ICONV_BAD_ARGUMENT);
    EXPECT_EQ(cu_iconv_str_1(conv.get(), 0, "a", nullptr, &out, &out_len), CU_ICONV_BAD_ARGUMENT);
    EXPECT_EQ(cu_iconv_str_1(conv.get(), 0, "a", &len, nullptr, &out_len), CU_ICONV_BAD_ARGUMENT);
    EXPECT_EQ(cu_iconv_str_1(conv.get(), 0, "a", &len, &out, nullptr), CU_ICONV_BAD_ARGUMENT);
    EXPECT_EQ(out, nullptr);
}

TEST(IconvTest, OneHandleServesManyThreads) {
    // A stateful codeset with failures mixed in: a text that starts in
    // another text's shift state decodes wrongly.
    unique_iconv h = open_converter("ISO-2022-JP", to);
    std::string good, want;
    for (int i = 0; i < 64; ++i) {
        good += "x\x1B$BF|F|\x1B(B";
        want += "x\xE6\x97\xA5\xE6\x97\xA5";
    }
    const std::string bad = "\x1B$B" + std::string(256, 'F') + "\xFF";
    std::vector<int> wrong(4, 0);
    std::vector<std::thread> threads;
    for (int t = 0; t < 4; ++t) {
        threads.emplace_back([&, t] {
            for (int i = 0; i < 500; ++i) {
                const bool fail = (i + t) % 2 == 0;
                const result r = convert(h.get(), fail ? bad : good + nul);
                wrong[t] += fail ? r.first != CU_ICONV_BAD_SEQUENCE : r.second != want + nul;
            }
        });
    }
    for (auto &t : threads)
        t.join();
    EXPECT_EQ(wrong, std::vector<int>(4, 0));
}

TEST(IconvTest, SettingsAreReadOnceFromTheEnvironment) {
    ASSERT_EQ(setenv("KX_CU_UTF8_ASSUMED", "yes", 1), 0);
    ASSERT_EQ(setenv("KX_CU_UTF8_STANDARD", "1", 1), 0);
    ASSERT_EQ(setenv("KX_CU_UTF8_BMP_ONLY", "no", 1), 0);
    EXPECT_TRUE(cu_utf8_is_assumed_1());
    EXPECT_TRUE(cu_utf8_is_not_modified_1());
    EXPECT_FALSE(cu_utf8_is_limited_to_bmp_1());
    ASSERT_EQ(setenv("KX_CU_UTF8_ASSUMED", "0", 1), 0);
    ASSERT_EQ(setenv("KX_CU_UTF8_BMP_ONLY", "true", 1), 0);
    EXPECT_TRUE(cu_utf8_is_assumed_1());
    EXPECT_FALSE(cu_utf8_is_limited_to_bmp_1());
}

} // namespace
