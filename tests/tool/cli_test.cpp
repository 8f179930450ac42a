// The command line, template file and JSON text of kxacl, without running it.
#include <gtest/gtest.h>

#include "json.h"
#include "options.h"
#include "templates.h"

namespace kxtool {
namespace {

parsed parse(std::vector<const char *> args) {
    return parse_command_line(std::span<const char *const>(args.data(), args.size()));
}

TEST(CommandLine, MistakesAreNamed) {
    const std::pair<std::vector<const char *>, const char *> cases[] = {
        {{}, "no command given"},
        {{"add", "buf", "--group", "a", "b"}, "--group takes one name here"},
        {{"check", "f", "--user=unix"}, "option --user takes MECH ID as two arguments"},
        {{"list"}, "list needs a file"},
        {{"list", "a", "b"}, "unexpected argument 'b'"},
        {{"list", "a", "--cache"}, "unknown option --cache for list"},
        {{"--cache", "compile"}, "unknown option --cache (before the command)"},
        {{"list", "a", "--type"}, "option --type needs a value"},
        {{"list", "a", "--type", "x"}, "unknown entry type 'x'"},
        {{"list", "a", "--mech", "unix"}, "--mech needs --type user or --type expanded"},
        {{"list", "a", "--buffer", "--owner", "u"},
         "--owner applies to ACL text files, not to buffers"},
        {{"check", "a", "--anyother", "--unauthenticated"},
         "give one of --unauthenticated, --anyother, --user, --expanded, --group"},
        {{"del", "a", "--json=yes", "--anyother"}, "option --json takes no value"},
        {{"perms", "--mask"}, "--string and --mask need an argument"},
        {{"compile", "a", "--user", "bob"},
         "--user names a requester; the owner of the file is --owner NAME"},
        {{"compile", "a", "--force"}, "--force goes with --cache"},
        {{"diff", "a"}, "diff needs two files, OLD and NEW"},
        {{"explain", "a", "--anyother", "--anyother"},
         "explain takes each of --unauthenticated, --anyother, --user and --expanded once"},
    };
    for (const auto &[args, error] : cases)
        EXPECT_EQ(parse(args).error, error);
    // Help wins over whatever else is missing.
    EXPECT_TRUE(parse({"check", "--help"}).inv.help);
    EXPECT_EQ(parse({"check", "--help"}).error, "");
}

// Comments and blank lines are skipped, help texts trimmed; a name of 13
// bytes and a help text of 63 are the most a template holds.
TEST(TemplateFile, ParsesTemplatesAndNamesBadLines) {
    const std::string name13(13, 'n'), help63(63, 'h');
    template_set set;
    std::string error, shown;
    ASSERT_TRUE(parse_templates("# perms\n\n  r 0 read  Read the thing \nW 31 write\t\nx 1 " +
                                    name13 + " " + help63 + "\n",
                                set, error))
        << error;
    for (const auto &p : set.perms) {
        shown += p.printchar;
        shown += ' ';
        shown += std::to_string(p.code) + ' ' + p.printstring + " [" + p.printhelp + "]\n";
    }
    EXPECT_EQ(shown, "r 1 read [Read the thing]\nW 2147483648 write []\nx 2 " + name13 + " [" +
                         help63 + "]\n");
    sec_perm_set_t lib = set.get();
    ASSERT_NE(lib, nullptr);
    EXPECT_EQ(lib->count, 3);
    EXPECT_EQ(lib->perms, set.perms.data());

    const std::pair<std::string, std::string> cases[] = {
        {"r 0\n", "line 1: expected CHAR BIT NAME [HELP]"},
        {"\nrw 0 read\n", "line 2: the permission character must be one printable character"},
        {"\x01 0 read\n", "line 1: the permission character must be one printable character"},
        {"r 32 read\n", "line 1: the bit must be a number from 0 to 31"},
        {"r 007 read\n", "line 1: the bit must be a number from 0 to 31"},
        {"r 1 " + name13 + "n\n", "line 1: the name is longer than 13 bytes"},
        {"r 1 n " + help63 + "h\n", "line 1: the help text is longer than 63 bytes"},
        {"r 1 a\nr 2 b\n", "line 2: the character 'r' is used twice"},
        {"r 1 a\nw 1 b\n", "line 2: bit 1 is used twice"},
        {"# nothing\n\n", "no permission template in the file"},
        {std::string("r 1 a\0\n", 7), "the file holds a NUL byte"},
    };
    for (const auto &[text, why] : cases) {
        EXPECT_FALSE(parse_templates(text, set, error)) << text;
        EXPECT_EQ(error, why);
        EXPECT_TRUE(set.perms.empty());
    }
}

TEST(JsonText, EscapesAndKeepsValidUtf8Only) {
    EXPECT_EQ(json_quote("a\"b\\c\n\t\x01"), "\"a\\\"b\\\\c\\n\\t\\u0001\"");
    EXPECT_EQ(json_quote("caf\xc3\xa9 \xe2\x82\xac \xf0\x9f\x94\x92"),
              "\"caf\xc3\xa9 \xe2\x82\xac \xf0\x9f\x94\x92\"");
    // A stray continuation byte, an overlong form, a surrogate, a cut sequence.
    EXPECT_EQ(json_quote("\x80"), "\"\\ufffd\"");
    EXPECT_EQ(json_quote("\xc0\xaf"), "\"\\ufffd\\ufffd\"");
    EXPECT_EQ(json_quote("\xed\xa0\x80"), "\"\\ufffd\\ufffd\\ufffd\"");
    EXPECT_EQ(json_quote("x\xe2\x82"), "\"x\\ufffd\\ufffd\"");
}

} // namespace
} // namespace kxtool
