// The ACL text parser, line by line: one table of single lines with the
// entry or the refusal each gives, then the cursor, the remaining length and
// the line number across lines, line ends, long lines, NULs and locales.
#include <cctype>
#include <clocale>
#include <cstring>
#include <memory>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include <kx_acl.h>

#include "alloc.h"
#include "messages.h"
#include "parse.h"
#include "support.h"

using namespace kxacl;

namespace {

// A text as sec_read_acl_file hands it over: the file's bytes and a NUL, with
// the remaining length counting that NUL.
struct text_reader {
    std::vector<char> bytes;
    char *cursor;
    std::size_t length;
    int lineno = 1;
    sec_acle_desc acle{};
    sec_perm_set_t permset = nullptr;

    explicit text_reader(const std::string &file) : bytes(file.begin(), file.end()) {
        bytes.push_back('\0');
        cursor = bytes.data();
        length = bytes.size();
    }
    kx_int32_t next() {
        return sec__read_acle_from_text(permset, &cursor, &length, &lineno, &acle);
    }
    char *at(std::size_t offset) { return bytes.data() + offset; }
};

struct expected_entry {
    unsigned char type;
    const char *mech;
    const char *id; // null for none
    kx_uint32_t perm;
};

void expect_entry(const sec_acle_desc &acle, const expected_entry &e) {
    EXPECT_EQ(acle.type, e.type);
    EXPECT_STREQ(acle.mech, e.mech);
    if (e.id)
        EXPECT_STREQ(acle.id, e.id);
    else
        EXPECT_EQ(acle.id, nullptr);
    EXPECT_EQ(acle.perm, e.perm);
}

void expect_error(int msg_num, kx_int32_t status, kx_int32_t rc) {
    EXPECT_EQ(rc, status);
    kxtest::error_record err = kxtest::last_error();
    EXPECT_EQ(err.id, status);
    EXPECT_EQ(err.msg_num, msg_num);
}

// One line of text: the entry it gives (status 1), or its refusal with the
// message and arguments, which start with the line number.
struct line_case {
    const char *text;
    kx_int32_t status;
    expected_entry entry; // status 1
    int msg = 0;          // otherwise
    std::vector<kxtest::arg> args = {};
};

void expect_line(const line_case &c) {
    SCOPED_TRACE(c.text);
    text_reader r(c.text);
    kx_int32_t rc = r.next();
    EXPECT_EQ(rc, c.status);
    if (rc == 1)
        expect_entry(r.acle, c.entry);
    else
        EXPECT_TRUE(kxtest::record_is(c.status, c.msg, c.args));
}

const char example_file[] = "#ACL for the example resource\n"
                            "\n"
                            "N\n"
                            "o r\n"
                            "U UNIX root rwcx #administrator\n"
                            "u unix joe\n"
                            "g staff rw\n"
                            "e unix joe w\n";

// Parsing allocates nothing, not even for a failure.
TEST(ParseText, ExampleFileGivesItsSixEntries) {
    unsigned long before = mem_allocations();
    text_reader r(example_file);
    const expected_entry none{0, "", nullptr, 0};
    const expected_entry lines[] = {none,
                                    none,
                                    {SEC_ACLE_UNAUTHENTICATED, "", nullptr, 0},
                                    {SEC_ACLE_ANYOTHER, "", nullptr, 0x1},
                                    {SEC_ACLE_USER, "unix", "root", 0xf},
                                    {SEC_ACLE_USER, "unix", "joe", 0},
                                    {SEC_ACLE_GROUP, "", "staff", 0x3},
                                    {SEC_ACLE_EXPANDED, "unix", "joe", 0x2}};
    for (const expected_entry &e : lines) {
        SCOPED_TRACE(r.lineno);
        ASSERT_EQ(r.next(), 1) << kxtest::last_error().text;
        expect_entry(r.acle, e);
    }
    // The identities point into the text, which holds the lowercased mechanism.
    EXPECT_EQ(r.acle.id, r.at(std::strlen(example_file) - 6));
    EXPECT_EQ(std::string(r.at(39), 4), "unix");
    EXPECT_EQ(r.cursor, r.at(std::strlen(example_file)));
    EXPECT_EQ(r.length, 1u);
    EXPECT_EQ(r.lineno, 9);
    EXPECT_EQ(r.next(), 0);
    EXPECT_EQ(r.lineno, 9);
    EXPECT_EQ(r.length, 1u);
    EXPECT_EQ(kxtest::last_error().id, 0);
    text_reader bad("g staff rz\n");
    EXPECT_EQ(bad.next(), SEC_S_BAD_PERMISSION);
    EXPECT_EQ(mem_allocations(), before);
}

TEST(ParseText, UsedUpTextReturnsZeroAndClearsTheEntry) {
    text_reader r("");
    std::memset(&r.acle, 0x5a, sizeof r.acle);
    EXPECT_EQ(r.next(), 0);
    EXPECT_EQ(r.acle.type, 0);
    EXPECT_EQ(r.acle.id, nullptr);
    EXPECT_EQ(r.lineno, 1);
    EXPECT_EQ(r.length, 1u);

    r.cursor = nullptr;
    r.lineno = 7;
    EXPECT_EQ(r.next(), 0);
    EXPECT_EQ(r.lineno, 7);
}

// Texts read line by line: after each call its result, the message of a
// refusal (whose first argument is the line), the line number, the cursor's
// offset (-1: none) and the remaining length. A failure moves past its
// line but keeps the length; one on the last line leaves no cursor. A NUL
// at a line's start ends the text; inside a line it is corrupt, and the
// cursor stays at the line's start, unless another fault comes first.
TEST(ParseText, Sequences) {
    struct step {
        kx_int32_t rc;
        int msg;
        int lineno;
        long cursor;
        std::size_t length;
    };
    const kx_int32_t bad = SEC_S_BAD_ACL;
    const struct {
        std::string text;
        std::vector<step> steps;
    } cases[] = {
        {"n\no r", {{1, 0, 2, 2, 4}, {1, 0, 3, -1, 4}, {0, 0, 3, -1, 4}}},
        {"n\nu unix\ng staff\n", {{1, 0, 2, 2, 16}, {bad, MSG_2650_172, 3, 9, 16}}},
        {"n r\nnr", {{1, 0, 2, 4, 3}, {bad, MSG_2650_179, 3, -1, 3}}},
        {std::string("n\n\0o\n", 5), {{1, 0, 2, 2, 4}, {0, 0, 2, 2, 4}}},
        {std::string("n\no r\0x\n", 8), {{1, 0, 2, 2, 7}, {bad, MSG_2650_144, 3, 2, 7}}},
        {std::string("nr\0\n", 4), {{bad, MSG_2650_179, 2, -1, 5}}},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.text);
        text_reader r(c.text);
        for (const step &s : c.steps) {
            EXPECT_EQ(r.next(), s.rc);
            if (s.msg) {
                EXPECT_EQ(kxtest::last_error().msg_num, s.msg);
                EXPECT_EQ(kxtest::last_error().num(0), s.lineno - 1);
            }
            EXPECT_EQ(r.lineno, s.lineno);
            EXPECT_EQ(r.cursor, s.cursor < 0 ? nullptr : r.at(static_cast<std::size_t>(s.cursor)));
            EXPECT_EQ(r.length, s.length);
        }
    }
    expected_entry other_r{SEC_ACLE_ANYOTHER, "", nullptr, 0x1};
    text_reader last("n\no r"); // the last line without its line end
    last.next();
    ASSERT_EQ(last.next(), 1);
    expect_entry(last.acle, other_r);
}

TEST(ParseText, EachLineEndEndsOneLine) {
    // CR LF is a line end and an empty line; FF ends a line too.
    text_reader r("n\r\no\fg staff\rN\n");
    std::vector<int> types;
    kx_int32_t rc;
    while ((rc = r.next()) == 1)
        types.push_back(r.acle.type);
    EXPECT_EQ(rc, 0);
    EXPECT_EQ(types, (std::vector<int>{SEC_ACLE_UNAUTHENTICATED, 0, SEC_ACLE_ANYOTHER,
                                       SEC_ACLE_GROUP, SEC_ACLE_UNAUTHENTICATED}));
    EXPECT_EQ(r.lineno, 6);

    // So bad lines ending in CR LF are lines 1, 3 and 5.
    text_reader crlf("x\r\ny\r\nz\r\n");
    std::vector<long long> failed;
    while ((rc = crlf.next()) != 0) {
        if (rc == 1) {
            EXPECT_EQ(crlf.acle.type, 0);
            continue;
        }
        EXPECT_EQ(rc, SEC_S_BAD_ACL);
        failed.push_back(kxtest::last_error().num(0));
    }
    EXPECT_EQ(failed, (std::vector<long long>{1, 3, 5}));
    EXPECT_EQ(crlf.lineno, 7);

    // FF is no blank: it ends the line before the permissions.
    text_reader ff("n\f r\n");
    ASSERT_EQ(ff.next(), 1);
    expect_entry(ff.acle, {SEC_ACLE_UNAUTHENTICATED, "", nullptr, 0});
    EXPECT_EQ(ff.next(), SEC_S_BAD_ACL);
    EXPECT_TRUE(kxtest::record_is(SEC_S_BAD_ACL, MSG_2650_179, {2, "r"}));
}

TEST(ParseText, OneLine) {
    const kx_int32_t ok = 1, bad = SEC_S_BAD_ACL, perm = SEC_S_BAD_PERMISSION;
    const expected_entry none{0, "", nullptr, 0}, n{SEC_ACLE_UNAUTHENTICATED, "", nullptr, 0},
        joe{SEC_ACLE_USER, "unix", "joe", 0}, staff{SEC_ACLE_GROUP, "", "staff", 0};
    // clang-format off
    const line_case cases[] = {
        {"n", ok, n}, {"N", ok, n},
        {"O rw", ok, {SEC_ACLE_ANYOTHER, "", nullptr, 0x3}},
        {"g staff", ok, staff}, {"G staff r", ok, {SEC_ACLE_GROUP, "", "staff", 0x1}},
        {"u unix joe", ok, joe}, {"U unix joe", ok, joe}, {"u UNIX joe", ok, joe},
        {"E KrB5 Joe@Realm rr", ok, {SEC_ACLE_EXPANDED, "krb5", "Joe@Realm", 0x1}},
        {"u ABCDEFGHIJKLMNOP joe", ok, {SEC_ACLE_USER, "abcdefghijklmnop", "joe", 0}},
        // A '#' inside a token belongs to it; one that starts a token ends the line.
        {"g staff#r", ok, {SEC_ACLE_GROUP, "", "staff#r", 0}},
        {"o rw #comment", ok, {SEC_ACLE_ANYOTHER, "", nullptr, 0x3}},
        {"g staff #rw", ok, staff},
        // Blanks are space, tab and vertical tab.
        {" \t\vn \t\vr\t", ok, {SEC_ACLE_UNAUTHENTICATED, "", nullptr, 0x1}},
        {"\t", ok, none}, {"   # n r", ok, none},
        // Missing and extra tokens.
        {"u unix\n", bad, {}, MSG_2650_172, {1}}, {"u\n", bad, {}, MSG_2650_172, {1}},
        {"e unix #joe\n", bad, {}, MSG_2650_172, {1}}, {"g # staff\n", bad, {}, MSG_2650_172, {1}},
        {"n rw x\n", bad, {}, MSG_2650_173, {1}}, {"o rw extra", bad, {}, MSG_2650_173, {1}},
        {"u unix joe r w", bad, {}, MSG_2650_173, {1}},
        // The type token must be one type character.
        {"x joe r\n", bad, {}, MSG_2650_179, {1, "x"}}, {"nr\n", bad, {}, MSG_2650_179, {1, "nr"}},
        {"n#x\n", bad, {}, MSG_2650_179, {1, "n#x"}},
        {"  uu unix joe", bad, {}, MSG_2650_179, {1, "uu"}},
        // Bad permissions are reported as the whole token.
        {"g staff rz\n", perm, {}, MSG_2650_180, {1, "rz"}}, {"o R", perm, {}, MSG_2650_180, {1, "R"}},
        {"u ABCDEFGHIJKLMNOPQ joe\n", bad, {}, MSG_2650_145, {"ABCDEFGHIJKLMNOPQ", 1}},
    };
    // clang-format on
    for (const line_case &c : cases)
        expect_line(c);
}

// The mechanism is lowercased in the text itself, as in the POSIX locale;
// a refused one moves the cursor past its line.
TEST(ParseText, MechanismIsLowercasedInPlaceAsInThePosixLocale) {
    text_reader r("u ABCDEFGHIJKLMNOP joe\nu ABCDEFGHIJKLMNOPQ joe\n");
    ASSERT_EQ(r.next(), 1);
    EXPECT_STREQ(r.at(2), "abcdefghijklmnop");
    EXPECT_EQ(r.next(), SEC_S_BAD_ACL);
    EXPECT_EQ(r.cursor, r.at(47));

    ASSERT_TRUE(kxtest::use_build_locale("en_US.ISO-8859-1"));
    ASSERT_EQ(std::tolower(0xc9), 0xe9); // the locale itself would fold it
    expect_line({"u UN\xc9X joe", 1, {SEC_ACLE_USER, "un\xc9x", "joe", 0}});
}

TEST(ParseText, CallerTemplateSetTranslatesPermissions) {
    sec_perm_desc perms[] = {{0x100, 'z', "zap", ""}, {0x1, 'r', "read", ""}};
    sec_perm_set_desc set{2, perms};
    text_reader r("o zr\no w\n");
    r.permset = &set;
    ASSERT_EQ(r.next(), 1);
    EXPECT_EQ(r.acle.perm, 0x101u);
    EXPECT_EQ(r.next(), SEC_S_BAD_PERMISSION);
    EXPECT_TRUE(kxtest::record_is(SEC_S_BAD_PERMISSION, MSG_2650_180, {2, "w"}));

    sec_perm_set_desc empty{0, nullptr};
    text_reader none("n\n");
    none.permset = &empty;
    EXPECT_EQ(none.next(), 1); // no permission token, nothing to translate
}

TEST(ParseText, LinesUpTo1096BytesWithTheirEnd) {
    std::string comment = "#" + std::string(1094, 'c') + "\n";
    std::string entry = "g " + std::string(1093, 's') + "\n";
    std::string last = "g " + std::string(1093, 's'); // and the text's NUL
    ASSERT_EQ(comment.size(), max_line_length);
    ASSERT_EQ(entry.size(), max_line_length);
    text_reader r(comment + entry + last);
    EXPECT_EQ(r.next(), 1);
    ASSERT_EQ(r.next(), 1);
    EXPECT_EQ(std::strlen(r.acle.id), 1093u);
    ASSERT_EQ(r.next(), 1);
    EXPECT_EQ(std::strlen(r.acle.id), 1093u);
    EXPECT_EQ(r.next(), 0);
}

TEST(ParseText, LongerLinesFailWithTheirNumberAndLength) {
    std::string file = kxtest::start_tracing("_SEL:Errors=1");
    std::string comment = "#" + std::string(1095, 'c') + "\n";
    text_reader r("n\n" + comment + "g " + std::string(1094, 's'));
    ASSERT_EQ(r.next(), 1);
    std::size_t length = r.length;
    expect_error(MSG_2650_158, SEC_S_FILE_ERROR, r.next());
    EXPECT_EQ(kxtest::last_error().num(0), 2);
    EXPECT_EQ(r.cursor, r.at(2 + 1097));
    EXPECT_EQ(r.length, length);
    expect_error(MSG_2650_158, SEC_S_FILE_ERROR, r.next());
    EXPECT_EQ(kxtest::last_error().num(0), 3);
    EXPECT_EQ(r.cursor, nullptr);

    std::vector<kxtest::trace_record> records = kxtest::read_trace(file);
    std::vector<std::vector<std::string>> items;
    for (const auto &rec : records)
        if (rec.id == 115)
            items.push_back(rec.items);
    int two = 2, three = 3, first = 1097, second = 1097;
    EXPECT_EQ(items, (std::vector<std::vector<std::string>>{
                         {kxtest::hex_of(two), kxtest::hex_of(first)},
                         {kxtest::hex_of(three), kxtest::hex_of(second)}}));
}

TEST(ParseText, NeverReadsPastTheRemainingLength) {
    // Three bytes without a NUL of their own: a length of 3 promises a
    // terminator within them, and nothing beyond may be read.
    std::unique_ptr<char[]> bytes(new char[3]{'n', ' ', 'r'});
    char *cursor = bytes.get();
    std::size_t length = 3;
    int lineno = 1;
    sec_acle_desc acle{};
    expect_error(MSG_2650_144, SEC_S_BAD_ACL,
                 sec__read_acle_from_text(nullptr, &cursor, &length, &lineno, &acle));
    EXPECT_EQ(cursor, bytes.get());
    EXPECT_EQ(lineno, 2);

    // A length used up before the text's NUL ends the text.
    text_reader r("n\n");
    r.length = 2;
    ASSERT_EQ(r.next(), 1);
    EXPECT_EQ(r.length, 0u);
    EXPECT_EQ(r.next(), 0);

    // Too long a line without an end within the length leaves no cursor.
    std::unique_ptr<char[]> long_bytes(new char[1200]);
    std::memset(long_bytes.get(), 'c', 1200);
    cursor = long_bytes.get();
    length = 1200;
    expect_error(MSG_2650_158, SEC_S_FILE_ERROR,
                 sec__read_acle_from_text(nullptr, &cursor, &length, &lineno, &acle));
    EXPECT_EQ(cursor, nullptr);
}

TEST(ParseText, TokensEndAtLocaleWhiteSpace) {
    const std::string line = "g\xa0staff\xa0rw";
    ASSERT_TRUE(kxtest::use_build_locale("kx_space.ISO-8859-1")) << "the test locale was not built";
    ASSERT_NE(std::isspace(0xa0), 0);
    expect_line({line.c_str(), 1, {SEC_ACLE_GROUP, "", "staff", 0x3}});
    // Only blanks are skipped: a second separator leaves an empty token,
    // which cannot stand for a mechanism or an identity.
    expect_line({"u unix\xa0\xa0joe", SEC_S_BAD_ACL, {}, MSG_2650_172, {1}});

    ASSERT_NE(std::setlocale(LC_ALL, "C"), nullptr);
    expect_line({line.c_str(), SEC_S_BAD_ACL, {}, MSG_2650_179, {1, line}});
}

} // namespace
