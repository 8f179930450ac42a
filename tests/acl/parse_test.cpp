// The ACL text parser: single lines, texts line by line, and the locales.
#include <cctype>
#include <clocale>
#include <cstdint>
#include <cstring>
#include <memory>

#include "alloc.h"
#include "messages.h"
#include "parse.h"
#include "support.h"

using namespace kxacl;
using kxtest::arg;

namespace {

// The bytes and a NUL, as sec_read_acl_file hands them over, or only keep
// bytes in a block of exactly that size.
struct text_reader {
    std::size_t size, length;
    std::unique_ptr<char[]> bytes;
    char *cursor;
    int lineno = 1;
    sec_acle_desc acle{};
    sec_perm_set_t permset = nullptr;
    explicit text_reader(const std::string &text, std::size_t keep = SIZE_MAX)
        : size(std::min(keep, text.size() + 1)), length(size), bytes(new char[size]),
          cursor(bytes.get()) {
        std::memcpy(bytes.get(), text.c_str(), size);
    }
    kx_int32_t next() {
        cu_set_no_error_1();
        return sec__read_acle_from_text(permset, &cursor, &length, &lineno, &acle);
    }
    char *at(std::size_t offset) { return bytes.get() + offset; }
};
struct expected_entry {
    unsigned char type;
    const char *mech, *id; // id null for none
    kx_uint32_t perm;
};
constexpr expected_entry none{0, "", nullptr, 0};
constexpr kx_int32_t bad = SEC_S_BAD_ACL, perm = SEC_S_BAD_PERMISSION, long_line = SEC_S_FILE_ERROR;

void expect_outcome(text_reader &r, kx_int32_t rc, kx_int32_t status, const expected_entry &e,
                    int msg, const std::vector<arg> &args) {
    EXPECT_EQ(rc, status);
    if (status > 1) {
        EXPECT_TRUE(kxtest::record_is(status, msg, args));
        return;
    }
    EXPECT_EQ(kxtest::last_error().id, 0);
    EXPECT_EQ(r.acle.type, e.type);
    EXPECT_STREQ(r.acle.mech, e.mech);
    EXPECT_EQ(r.acle.perm, e.perm);
    EXPECT_STREQ(r.acle.id, e.id);
    EXPECT_TRUE(!e.id || (r.acle.id > r.at(0) && r.acle.id < r.at(r.size))) << "not in the text";
}

struct line_case {
    const char *text;
    kx_int32_t status;
    expected_entry entry; // status 1
    int msg = 0;          // otherwise
    std::vector<arg> args = {};
};
void expect_line(const line_case &c) {
    SCOPED_TRACE(c.text);
    text_reader r(c.text);
    expect_outcome(r, r.next(), c.status, c.entry, c.msg, c.args);
}

TEST(ParseText, OneLine) {
    const expected_entry n{SEC_ACLE_UNAUTHENTICATED, "", nullptr, 0},
        joe{SEC_ACLE_USER, "unix", "joe", 0}, staff{SEC_ACLE_GROUP, "", "staff", 0};
    // clang-format off
    const line_case cases[] = {
        {"N", 1, n}, {"O rw", 1, {SEC_ACLE_ANYOTHER, "", nullptr, 0x3}},
        {"g staff", 1, staff}, {"G staff r", 1, {SEC_ACLE_GROUP, "", "staff", 0x1}},
        {"u unix joe", 1, joe}, {"U UNIX joe", 1, joe},
        {"E KrB5 Joe@Realm rr", 1, {SEC_ACLE_EXPANDED, "krb5", "Joe@Realm", 0x1}},
        {"u ABCDEFGHIJKLMNOP joe", 1, {SEC_ACLE_USER, "abcdefghijklmnop", "joe", 0}},
        // A '#' inside a token belongs to it; one that starts a token ends the line.
        {"g staff#r", 1, {SEC_ACLE_GROUP, "", "staff#r", 0}}, {"g staff #rw", 1, staff},
        {"o rw #comment", 1, {SEC_ACLE_ANYOTHER, "", nullptr, 0x3}},
        // Blanks are space, tab and vertical tab.
        {" \t\vn \t\vr\t", 1, {SEC_ACLE_UNAUTHENTICATED, "", nullptr, 0x1}},
        {"\t", 1, none}, {"   # n r", 1, none},
        // Missing and extra tokens.
        {"u\n", bad, {}, MSG_2650_172, {1}}, {"e unix #joe\n", bad, {}, MSG_2650_172, {1}},
        {"g # staff\n", bad, {}, MSG_2650_172, {1}},
        {"n rw x\n", bad, {}, MSG_2650_173, {1}}, {"u unix joe r w", bad, {}, MSG_2650_173, {1}},
        // The type token must be one type character.
        {"n#x\n", bad, {}, MSG_2650_179, {1, "n#x"}}, {"  uu unix joe", bad, {}, MSG_2650_179, {1, "uu"}},
        // Bad permissions are reported as the whole token.
        {"g staff rz\n", perm, {}, MSG_2650_180, {1, "rz"}}, {"o R", perm, {}, MSG_2650_180, {1, "R"}},
        {"u ABCDEFGHIJKLMNOPQ joe\n", bad, {}, MSG_2650_145, {"ABCDEFGHIJKLMNOPQ", 1}},
    };
    // clang-format on
    for (const line_case &c : cases)
        expect_line(c);
}

// After each call: result, entry or record, line number, cursor offset (-1:
// none) and remaining length.
struct step {
    kx_int32_t rc;
    int lineno;
    long cursor;
    std::size_t length;
    expected_entry entry = none;
    int msg = 0;
    std::vector<arg> args = {};
};
struct text_case {
    std::string text;
    std::vector<step> steps;
    std::size_t keep = SIZE_MAX; // bytes of text and NUL given
    sec_perm_set_t permset = nullptr;
};

// A failure moves past its line, keeping the length; a NUL at a line's start
// ends the text, one inside a line or none is corrupt. Nothing is allocated.
TEST(ParseText, TextsLineByLine) {
    const std::string file = kxtest::start_tracing("_SEL:Errors=1");
    const expected_entry n{SEC_ACLE_UNAUTHENTICATED, "", nullptr, 0},
        o_r{SEC_ACLE_ANYOTHER, "", nullptr, 0x1}, o{SEC_ACLE_ANYOTHER, "", nullptr, 0};
    const std::string s1093(1093, 's'), longest_comment = "#" + std::string(1094, 'c') + "\n",
                                        longest_group = "g " + s1093 + "\n";
    const expected_entry long_group{SEC_ACLE_GROUP, "", s1093.c_str(), 0};
    sec_perm_desc perms[] = {{0x100, 'z', "zap", ""}, {0x1, 'r', "read", ""}};
    sec_perm_set_desc zap{2, perms}, empty{0, nullptr};
    // clang-format off
    const text_case cases[] = {
        {"#ACL for the example resource\n\nN\no r\nU UNIX root rwcx #administrator\n"
         "u unix joe\ng staff rw\ne unix joe w\n",
         {{1, 2, 30, 75}, {1, 3, 31, 74}, {1, 4, 33, 72, n}, {1, 5, 37, 68, o_r},
          {1, 6, 69, 36, {SEC_ACLE_USER, "unix", "root", 0xf}},
          {1, 7, 80, 25, {SEC_ACLE_USER, "unix", "joe", 0}},
          {1, 8, 91, 14, {SEC_ACLE_GROUP, "", "staff", 0x3}},
          {1, 9, 104, 1, {SEC_ACLE_EXPANDED, "unix", "joe", 0x2}}, {0, 9, 104, 1}}},
        {"", {{0, 1, 0, 1}}},
        {"n\no r", {{1, 2, 2, 4, n}, {1, 3, -1, 4, o_r}, {0, 3, -1, 4}}},
        {"n\nu unix\ng staff\n", {{1, 2, 2, 16, n}, {bad, 3, 9, 16, {}, MSG_2650_172, {2}}}},
        {"n r\nnr", {{1, 2, 4, 3, {n.type, "", nullptr, 0x1}},
                     {bad, 3, -1, 3, {}, MSG_2650_179, {2, "nr"}}}},
        {std::string("n\n\0o\n", 5), {{1, 2, 2, 4, n}, {0, 2, 2, 4}}},
        {std::string("n\no r\0x\n", 8), {{1, 2, 2, 7, n}, {bad, 3, 2, 7, {}, MSG_2650_144, {2}}}},
        {std::string("nr\0\n", 4), {{bad, 2, -1, 5, {}, MSG_2650_179, {1, "nr"}}}},
        {"n r", {{bad, 2, 0, 3, {}, MSG_2650_144, {1}}}, 3},
        {"n\n", {{1, 2, 2, 0, n}, {0, 2, 2, 0}}, 2},
        // CR LF is a line end and an empty line; FF ends a line too, and is no blank.
        {"n\r\no\fg staff\rN\n", {{1, 2, 2, 14, n}, {1, 3, 3, 13}, {1, 4, 5, 11, o},
                                  {1, 5, 13, 3, {SEC_ACLE_GROUP, "", "staff", 0}},
                                  {1, 6, 15, 1, n}, {0, 6, 15, 1}}},
        {"x\r\ny\r\nz\r\n", {{bad, 2, 2, 10, {}, MSG_2650_179, {1, "x"}}, {1, 3, 3, 9},
                             {bad, 4, 5, 9, {}, MSG_2650_179, {3, "y"}}, {1, 5, 6, 8},
                             {bad, 6, 8, 8, {}, MSG_2650_179, {5, "z"}}, {1, 7, 9, 7},
                             {0, 7, 9, 7}}},
        {"n\f r\n", {{1, 2, 2, 4, n}, {bad, 3, 5, 4, {}, MSG_2650_179, {2, "r"}}}},
        // A caller's permission template.
        {"o zr\no w\n", {{1, 2, 5, 5, {SEC_ACLE_ANYOTHER, "", nullptr, 0x101}},
                         {perm, 3, 9, 5, {}, MSG_2650_180, {2, "w"}}}, SIZE_MAX, &zap},
        {"n\n", {{1, 2, 2, 1, n}}, SIZE_MAX, &empty},
        // Long lines, the last one's NUL counted as its end.
        {longest_comment + longest_group + "g " + s1093,
         {{1, 2, 1096, 2192}, {1, 3, 2192, 1096, long_group}, {1, 4, -1, 1096, long_group},
          {0, 4, -1, 1096}}},
        {"n\n#" + std::string(1095, 'c') + "\ng " + s1093 + "s",
         {{1, 2, 2, 2194, n}, {long_line, 3, 1099, 2194, {}, MSG_2650_158, {2}},
          {long_line, 4, -1, 2194, {}, MSG_2650_158, {3}}}},
        {std::string(1200, 'c'), {{long_line, 2, -1, 1200, {}, MSG_2650_158, {1}}}, 1200},
    };
    // clang-format on
    unsigned long allocations = mem_allocations();
    for (const text_case &c : cases) {
        SCOPED_TRACE(c.text.substr(0, 40));
        text_reader r(c.text, c.keep);
        r.permset = c.permset;
        for (const step &s : c.steps) {
            SCOPED_TRACE(s.lineno);
            expect_outcome(r, r.next(), s.rc, s.entry, s.msg, s.args);
            EXPECT_EQ(r.lineno, s.lineno);
            EXPECT_EQ(r.cursor, s.cursor < 0 ? nullptr : r.at(static_cast<std::size_t>(s.cursor)));
            EXPECT_EQ(r.length, s.length);
        }
    }
    EXPECT_EQ(mem_allocations(), allocations);
    // Too long lines are traced with their number and size.
    std::vector<std::vector<std::string>> items;
    for (const kxtest::trace_record &t : kxtest::read_trace(file))
        if (t.id == 115)
            items.push_back(t.items);
    auto item = [](int line, int size) {
        return std::vector<std::string>{kxtest::hex_of(line), kxtest::hex_of(size)};
    };
    EXPECT_EQ(items,
              (std::vector<std::vector<std::string>>{item(2, 1097), item(3, 1097), item(1, 1201)}));
    // The mechanism is lowercased in the text itself.
    text_reader r("U UNIX root");
    ASSERT_EQ(r.next(), 1);
    EXPECT_STREQ(r.at(2), "unix");
}

// Only A to Z fold in a mechanism, as in the POSIX locale; tokens end where
// the locale sees white space, but only blanks are skipped.
TEST(ParseText, Locales) {
    ASSERT_TRUE(kxtest::use_build_locale("en_US.ISO-8859-1"));
    // volatile, or gcc -O3 folds the call as in the C locale.
    volatile int capital_e_acute = 0xc9, no_break_space = 0xa0;
    ASSERT_EQ(std::tolower(capital_e_acute), 0xe9);
    expect_line({"u UN\xc9X joe", 1, {SEC_ACLE_USER, "un\xc9x", "joe", 0}});
    const char *line = "g\xa0staff\xa0rw";
    ASSERT_TRUE(kxtest::use_build_locale("kx_space.ISO-8859-1")) << "the test locale was not built";
    ASSERT_NE(std::isspace(no_break_space), 0);
    expect_line({line, 1, {SEC_ACLE_GROUP, "", "staff", 0x3}});
    // A second separator leaves an empty token.
    expect_line({"u unix\xa0\xa0joe", bad, {}, MSG_2650_172, {1}});
    ASSERT_NE(std::setlocale(LC_ALL, "C"), nullptr);
    expect_line({line, bad, {}, MSG_2650_179, {1, line}});
}
} // namespace
