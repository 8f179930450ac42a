#include <cctype>
#include <clocale>
#include <cstring>
#include <memory>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include <kx_acl.h>

#include "alloc.h"
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

// One line that parses to one entry.
void expect_line(const std::string &line, const expected_entry &e) {
    SCOPED_TRACE(line);
    text_reader r(line);
    ASSERT_EQ(r.next(), 1) << kxtest::last_error().text;
    expect_entry(r.acle, e);
}

void expect_error(int msg_num, kx_int32_t status, kx_int32_t rc) {
    EXPECT_EQ(rc, status);
    kxtest::error_record err = kxtest::last_error();
    EXPECT_EQ(err.id, status);
    EXPECT_EQ(err.msg_num, msg_num);
}

// A line that fails with a message carrying the line number and a token.
void expect_token_error(const std::string &file, int msg_num, kx_int32_t status,
                        const std::string &token) {
    SCOPED_TRACE(file);
    text_reader r(file);
    expect_error(msg_num, status, r.next());
    kxtest::error_record err = kxtest::last_error();
    ASSERT_EQ(err.args.size(), 2u);
    EXPECT_EQ(err.num(0), 1);
    EXPECT_EQ(err.str(1), token);
}

// A line that fails with a message carrying the line number alone.
void expect_line_error(const std::string &file, int msg_num, kx_int32_t status) {
    SCOPED_TRACE(file);
    text_reader r(file);
    expect_error(msg_num, status, r.next());
    kxtest::error_record err = kxtest::last_error();
    ASSERT_EQ(err.args.size(), 1u);
    EXPECT_EQ(err.num(0), 1);
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

TEST(ParseText, LastLineWithoutLineEndIsParsed) {
    text_reader r("n\no r");
    ASSERT_EQ(r.next(), 1);
    EXPECT_EQ(r.cursor, r.at(2));
    EXPECT_EQ(r.length, 4u);
    ASSERT_EQ(r.next(), 1);
    expect_entry(r.acle, {SEC_ACLE_ANYOTHER, "", nullptr, 0x1});
    EXPECT_EQ(r.cursor, nullptr);
    EXPECT_EQ(r.length, 4u);
    EXPECT_EQ(r.lineno, 3);
    EXPECT_EQ(r.next(), 0);
    EXPECT_EQ(r.lineno, 3);
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
}

TEST(ParseText, TypesMechanismsAndIdentities) {
    expect_line("n", {SEC_ACLE_UNAUTHENTICATED, "", nullptr, 0});
    expect_line("N", {SEC_ACLE_UNAUTHENTICATED, "", nullptr, 0});
    expect_line("O rw", {SEC_ACLE_ANYOTHER, "", nullptr, 0x3});
    expect_line("g staff", {SEC_ACLE_GROUP, "", "staff", 0});
    expect_line("G staff r", {SEC_ACLE_GROUP, "", "staff", 0x1});
    expect_line("u unix joe", {SEC_ACLE_USER, "unix", "joe", 0});
    expect_line("U unix joe", {SEC_ACLE_USER, "unix", "joe", 0});
    expect_line("u UNIX joe", {SEC_ACLE_USER, "unix", "joe", 0});
    expect_line("E KrB5 Joe@Realm rr", {SEC_ACLE_EXPANDED, "krb5", "Joe@Realm", 0x1});
    // A '#' inside a token belongs to it.
    expect_line("g staff#r", {SEC_ACLE_GROUP, "", "staff#r", 0});
    expect_line("o rw #comment", {SEC_ACLE_ANYOTHER, "", nullptr, 0x3});
    expect_line("g staff #rw", {SEC_ACLE_GROUP, "", "staff", 0});
    // Blanks are space, tab and vertical tab.
    expect_line(" \t\vn \t\vr\t", {SEC_ACLE_UNAUTHENTICATED, "", nullptr, 0x1});
    expect_line("\t", {0, "", nullptr, 0});
    expect_line("   # n r", {0, "", nullptr, 0});
    // FF is not skipped: it ends the line before the permissions.
    text_reader r("n\f r\n");
    ASSERT_EQ(r.next(), 1);
    expect_entry(r.acle, {SEC_ACLE_UNAUTHENTICATED, "", nullptr, 0});
    EXPECT_EQ(r.next(), SEC_S_BAD_ACL);
    EXPECT_EQ(kxtest::last_error().msg_num, 165);
    EXPECT_EQ(kxtest::last_error().num(0), 2);
}

TEST(ParseText, MechanismOfSixteenCharactersIsLowercasedInPlace) {
    text_reader r("u ABCDEFGHIJKLMNOP joe\n");
    ASSERT_EQ(r.next(), 1);
    EXPECT_STREQ(r.acle.mech, "abcdefghijklmnop");
    EXPECT_STREQ(r.at(2), "abcdefghijklmnop");

    text_reader longer("u ABCDEFGHIJKLMNOPQ joe\n");
    expect_error(132, SEC_S_BAD_ACL, longer.next());
    kxtest::error_record err = kxtest::last_error();
    ASSERT_EQ(err.args.size(), 2u);
    EXPECT_EQ(err.str(0), "ABCDEFGHIJKLMNOPQ");
    EXPECT_EQ(err.num(1), 1);
    EXPECT_EQ(longer.cursor, longer.at(24));
}

TEST(ParseText, MechanismIsLowercasedAsInThePosixLocale) {
    ASSERT_TRUE(kxtest::use_build_locale("en_US.ISO-8859-1"));
    ASSERT_EQ(std::tolower(0xc9), 0xe9); // the locale itself would fold it
    expect_line("u UN\xc9X joe", {SEC_ACLE_USER, "un\xc9x", "joe", 0});
}

TEST(ParseText, MissingAndExtraTokens) {
    expect_line_error("u unix\n", 158, SEC_S_BAD_ACL);
    expect_line_error("u\n", 158, SEC_S_BAD_ACL);
    expect_line_error("e unix #joe\n", 158, SEC_S_BAD_ACL);
    expect_line_error("g # staff\n", 158, SEC_S_BAD_ACL);
    expect_line_error("n rw x\n", 159, SEC_S_BAD_ACL);
    expect_line_error("o rw extra", 159, SEC_S_BAD_ACL);
    expect_line_error("u unix joe r w", 159, SEC_S_BAD_ACL);
    // The type token must be one type character.
    expect_token_error("x joe r\n", 165, SEC_S_BAD_ACL, "x");
    expect_token_error("nr\n", 165, SEC_S_BAD_ACL, "nr");
    expect_token_error("n#x\n", 165, SEC_S_BAD_ACL, "n#x");
    expect_token_error("  uu unix joe", 165, SEC_S_BAD_ACL, "uu");
    // Bad permissions are reported as the whole token.
    expect_token_error("g staff rz\n", 166, SEC_S_BAD_PERMISSION, "rz");
    expect_token_error("o R", 166, SEC_S_BAD_PERMISSION, "R");
}

TEST(ParseText, CallerTemplateSetTranslatesPermissions) {
    sec_perm_desc perms[] = {{0x100, 'z', "zap", ""}, {0x1, 'r', "read", ""}};
    sec_perm_set_desc set{2, perms};
    text_reader r("o zr\no w\n");
    r.permset = &set;
    ASSERT_EQ(r.next(), 1);
    EXPECT_EQ(r.acle.perm, 0x101u);
    expect_error(166, SEC_S_BAD_PERMISSION, r.next());
    kxtest::error_record err = kxtest::last_error();
    EXPECT_EQ(err.num(0), 2);
    EXPECT_EQ(err.str(1), "w");

    sec_perm_set_desc empty{0, nullptr};
    text_reader none("n\n");
    none.permset = &empty;
    EXPECT_EQ(none.next(), 1); // no permission token, nothing to translate
}

TEST(ParseText, FailureMovesPastTheLineAndKeepsTheLength) {
    text_reader r("n\nu unix\ng staff\n");
    ASSERT_EQ(r.next(), 1);
    std::size_t length = r.length;
    expect_error(158, SEC_S_BAD_ACL, r.next());
    EXPECT_EQ(kxtest::last_error().num(0), 2);
    EXPECT_EQ(r.cursor, r.at(9));
    EXPECT_EQ(r.length, length);
    EXPECT_EQ(r.lineno, 3);

    // Failing on the last line leaves no cursor.
    text_reader last("n r\nnr");
    ASSERT_EQ(last.next(), 1);
    EXPECT_EQ(last.next(), SEC_S_BAD_ACL);
    EXPECT_EQ(last.cursor, nullptr);
    EXPECT_EQ(last.length, 3u);
    EXPECT_EQ(last.lineno, 3);
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
    expect_error(145, SEC_S_FILE_ERROR, r.next());
    EXPECT_EQ(kxtest::last_error().num(0), 2);
    EXPECT_EQ(r.cursor, r.at(2 + 1097));
    EXPECT_EQ(r.length, length);
    expect_error(145, SEC_S_FILE_ERROR, r.next());
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

TEST(ParseText, NulAtTheStartOfALineEndsTheText) {
    std::string file("n\n\0o\n", 5);
    text_reader r(file);
    ASSERT_EQ(r.next(), 1);
    EXPECT_EQ(r.next(), 0);
    EXPECT_EQ(r.cursor, r.at(2));
    EXPECT_EQ(r.lineno, 2);
    EXPECT_EQ(kxtest::last_error().id, 0);
}

TEST(ParseText, NulInsideALineIsCorrupt) {
    std::string file("n\no r\0x\n", 8);
    text_reader r(file);
    ASSERT_EQ(r.next(), 1);
    std::size_t length = r.length;
    expect_error(131, SEC_S_BAD_ACL, r.next());
    EXPECT_EQ(kxtest::last_error().num(0), 2);
    // The cursor stays at the line's start, the length as it was.
    EXPECT_EQ(r.cursor, r.at(2));
    EXPECT_EQ(r.length, length);
    EXPECT_EQ(r.lineno, 3);

    // Another fault of the line is reported first.
    text_reader bad(std::string("nr\0\n", 4));
    EXPECT_EQ(bad.next(), SEC_S_BAD_ACL);
    EXPECT_EQ(kxtest::last_error().msg_num, 165);
    EXPECT_EQ(bad.cursor, nullptr);
}

TEST(ParseText, NeverReadsPastTheRemainingLength) {
    // Three bytes without a NUL of their own: a length of 3 promises a
    // terminator within them, and nothing beyond may be read.
    std::unique_ptr<char[]> bytes(new char[3]{'n', ' ', 'r'});
    char *cursor = bytes.get();
    std::size_t length = 3;
    int lineno = 1;
    sec_acle_desc acle{};
    expect_error(131, SEC_S_BAD_ACL,
                 sec__read_acle_from_text(nullptr, &cursor, &length, &lineno, &acle));
    EXPECT_EQ(cursor, bytes.get());
    EXPECT_EQ(lineno, 2);

    // A length used up before the text's NUL ends the text.
    text_reader r("n\n");
    r.length = 2;
    ASSERT_EQ(r.next(), 1);
    EXPECT_EQ(r.length, 0u);
    EXPECT_EQ(r.next(), 0);
}

TEST(ParseText, TokensEndAtLocaleWhiteSpace) {
    const std::string line = "g\xa0staff\xa0rw";
    ASSERT_TRUE(kxtest::use_build_locale("kx_space.ISO-8859-1")) << "the test locale was not built";
    ASSERT_NE(std::isspace(0xa0), 0);
    expect_line(line, {SEC_ACLE_GROUP, "", "staff", 0x3});
    // Only blanks are skipped: a second separator leaves an empty token,
    // which cannot stand for a mechanism or an identity.
    expect_line_error("u unix\xa0\xa0joe", 158, SEC_S_BAD_ACL);

    ASSERT_NE(std::setlocale(LC_ALL, "C"), nullptr);
    expect_token_error(line, 165, SEC_S_BAD_ACL, line);
}

} // namespace
