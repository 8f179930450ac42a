// Codeset converters: exact bytes both ways, the UTF-8 rules that the open
// flags select, failures that leave the outputs alone, one handle shared by
// several threads.
#include <gtest/gtest.h>

#include <cstdlib>
#include <string>
#include <thread>
#include <vector>

#include "cu_test_util.h"

using cu_test::IconvPtr;

namespace {

const std::string kNul(1, '\0');

IconvPtr open_converter(const char *codeset, kx_uint32_t flags) {
    cu_iconv_t h = nullptr;
    EXPECT_EQ(cu_iconv_open_1(codeset, flags, &h), CU_ICONV_OK) << codeset;
    return IconvPtr(h);
}

struct Result {
    int status;
    std::string bytes; // the output, as counted by out_length
};

// Converts bytes, NULs included. The outputs start as sentinels so that a
// failure can be checked to leave them alone.
Result convert(cu_iconv_t h, const std::string &bytes) {
    char sentinel = 0;
    char *out = &sentinel;
    size_t out_length = 12345;
    size_t in_length = bytes.size();
    const int status = cu_iconv_str_1(h, 0, bytes.data(), &in_length, &out, &out_length);
    if (status != CU_ICONV_OK) {
        EXPECT_TRUE(out == &sentinel && out_length == 12345u) << "outputs changed on failure";
        return {status, {}};
    }
    const cu_test::MallocText owned(out);
    return {status, std::string(out, out_length)};
}

TEST(IconvTest, Latin1AndUtf8RoundTrip) {
    IconvPtr to = open_converter("ISO-8859-1", CU_ICONV_TO_UTF8);
    IconvPtr from = open_converter("ISO-8859-1", CU_ICONV_FROM_UTF8);
    EXPECT_EQ(convert(to.get(), "caf\xE9" + kNul).bytes, "caf\xC3\xA9" + kNul);
    EXPECT_EQ(convert(from.get(), "caf\xC3\xA9" + kNul).bytes, "caf\xE9" + kNul);
    EXPECT_EQ(convert(to.get(), "\xE9").bytes, "\xC3\xA9"); // no terminator in, none out
    const Result empty = convert(to.get(), "");
    EXPECT_EQ(empty.status, CU_ICONV_OK);
    EXPECT_EQ(empty.bytes, "");
}

TEST(IconvTest, OutputGrowsBeyondItsFirstGuess) {
    IconvPtr h = open_converter("UTF-32LE", CU_ICONV_FROM_UTF8);
    std::string expected;
    for (int i = 0; i < 5000; ++i)
        expected += std::string("a\0\0\0", 4);
    EXPECT_EQ(convert(h.get(), std::string(5000, 'a')).bytes, expected);
}

TEST(IconvTest, InvalidUtf8IsABadSequence) {
    const std::string cases[] = {
        "\xFF",
        "a\x80",
        "\xC3\x28",
        "\xC1\xBF",               // overlong DEL
        "\xE0\x80\xAF",           // overlong '/'
        "\xED\xA0\x80",           // surrogate
        "\xF4\x90\x80\x80",       // beyond U+10FFFF
        std::string("\xC3\0", 2), // a sequence cut by the terminator
    };
    IconvPtr to_latin1 = open_converter("ISO-8859-1", CU_ICONV_FROM_UTF8);
    IconvPtr utf8_from = open_converter("UTF-8", CU_ICONV_FROM_UTF8);
    IconvPtr utf8_to = open_converter("UTF-8", CU_ICONV_TO_UTF8);
    for (const std::string &input : cases) {
        const std::string shown = ::testing::PrintToString(input);
        EXPECT_EQ(convert(to_latin1.get(), input).status, CU_ICONV_BAD_SEQUENCE) << shown;
        EXPECT_EQ(convert(utf8_from.get(), input).status, CU_ICONV_BAD_SEQUENCE) << shown;
        EXPECT_EQ(convert(utf8_to.get(), input).status, CU_ICONV_BAD_SEQUENCE) << shown;
    }
}

TEST(IconvTest, IncompleteAndUnmappableInput) {
    IconvPtr from = open_converter("ISO-8859-1", CU_ICONV_FROM_UTF8);
    EXPECT_EQ(convert(from.get(), "ab\xE2\x82").status, CU_ICONV_INCOMPLETE);
    EXPECT_EQ(convert(from.get(), "price \xE2\x82\xAC" + kNul).status, CU_ICONV_UNMAPPABLE);
    IconvPtr to = open_converter("UTF-16LE", CU_ICONV_TO_UTF8);
    EXPECT_EQ(convert(to.get(), std::string("a\0b", 3)).status, CU_ICONV_INCOMPLETE);
}

TEST(IconvTest, EncodedNulIsRefusedOnlyInTheStandardForm) {
    const std::string text = "a\xC0\x80\xC3\xA9" + kNul;
    IconvPtr standard = open_converter("ISO-8859-1", CU_ICONV_FROM_UTF8 | CU_ICONV_UTF8_STANDARD);
    EXPECT_EQ(convert(standard.get(), text).status, CU_ICONV_BAD_SEQUENCE);
    IconvPtr modified = open_converter("ISO-8859-1", CU_ICONV_FROM_UTF8);
    EXPECT_EQ(convert(modified.get(), text).bytes, "a" + kNul + "\xE9" + kNul);
    EXPECT_EQ(convert(modified.get(), "a\xC0"
                                      "b")
                  .status,
              CU_ICONV_BAD_SEQUENCE);
}

TEST(IconvTest, BmpOnlyRefusesCharactersBeyondU_FFFF) {
    const std::string grin_utf8 = "\xF0\x9F\x98\x80";
    const std::string grin_utf16("\x3D\xD8\x00\xDE", 4);
    const kx_uint32_t bmp = CU_ICONV_UTF8_BMP_ONLY;
    IconvPtr from_limited = open_converter("UTF-16LE", CU_ICONV_FROM_UTF8 | bmp);
    IconvPtr to_limited = open_converter("UTF-16LE", CU_ICONV_TO_UTF8 | bmp);
    EXPECT_EQ(convert(from_limited.get(), "a" + grin_utf8).status, CU_ICONV_UNMAPPABLE);
    EXPECT_EQ(convert(to_limited.get(), grin_utf16).status, CU_ICONV_UNMAPPABLE);
    EXPECT_EQ(convert(from_limited.get(), "\xEF\xBF\xBD").bytes, "\xFD\xFF"); // U+FFFD
    EXPECT_EQ(convert(to_limited.get(), std::string("\xAC\x20", 2)).bytes, "\xE2\x82\xAC");

    IconvPtr from_open = open_converter("UTF-16LE", CU_ICONV_FROM_UTF8);
    IconvPtr to_open = open_converter("UTF-16LE", CU_ICONV_TO_UTF8);
    EXPECT_EQ(convert(from_open.get(), grin_utf8).bytes, grin_utf16);
    EXPECT_EQ(convert(to_open.get(), grin_utf16).bytes, grin_utf8);
}

TEST(IconvTest, EachTextStartsAndEndsInTheInitialShiftState) {
    // ISO-2022-JP keeps state: a failure mid-text must not leak into the next.
    IconvPtr h = open_converter("ISO-2022-JP", CU_ICONV_TO_UTF8);
    EXPECT_EQ(convert(h.get(), "\x1B$BF|\xFF").status, CU_ICONV_BAD_SEQUENCE);
    EXPECT_EQ(convert(h.get(), "AB").bytes, "AB");
    IconvPtr back = open_converter("ISO-2022-JP", CU_ICONV_FROM_UTF8);
    EXPECT_EQ(convert(back.get(), "\xE6\x97\xA5").bytes, "\x1B$BF|\x1B(B");
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
    EXPECT_EQ(cu_iconv_open_1("ISO-8859-1//IGNORE", CU_ICONV_FROM_UTF8, &h), CU_ICONV_BAD_ARGUMENT);

    IconvPtr conv = open_converter("ISO-8859-1", CU_ICONV_TO_UTF8);
    char *out = nullptr;
    size_t len = 2;
    size_t out_len = 0;
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
    IconvPtr h = open_converter("ISO-2022-JP", CU_ICONV_TO_UTF8);
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
                const Result r = convert(h.get(), fail ? bad : good + kNul);
                wrong[t] += fail ? r.status != CU_ICONV_BAD_SEQUENCE : r.bytes != want + kNul;
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
