// The kxacl executable, run as an administrator would run it: exit codes,
// exact output, JSON parsed back, and the files it leaves behind.
#include <gtest/gtest.h>
#include <nlohmann/json.hpp>

#include <sys/stat.h>
#include <tuple>
#include <vector>

#include "file_helpers.h"
#include "run_kxacl.h"

using kxtest::run_kxacl;
using nlohmann::json;

namespace {

constexpr const char *example_acl = "#ACL for the example resource\n"
                                    "\n"
                                    "N\n"
                                    "o r\n"
                                    "U UNIX root rwcx #administrator\n"
                                    "u unix joe\n"
                                    "g staff rw\n"
                                    "g admin rwcxCqledvsao\n"
                                    "e unix joe w\n";

class KxaclTool : public ::testing::Test {
  protected:
    void SetUp() override {
        dir = kxtest::temp_dir();
        acl = dir + "/res.acl";
        kxtest::write_file(acl, example_acl);
        kxtest::shift_mtime(acl, -10); // old enough to be cached
    }
    // Compiles the example into a buffer file and returns its path.
    std::string compiled() {
        const std::string buf = dir + "/res.buf";
        EXPECT_EQ(run_kxacl({"compile", acl, "-o", buf}).exit_code, 0);
        return buf;
    }
    static json parsed(const kxtest::run_result &r) {
        EXPECT_TRUE(json::accept(r.out)) << r.out;
        return json::parse(r.out, nullptr, false);
    }
    std::string dir, acl;
};

TEST_F(KxaclTool, CompileReportsEntriesAndWritesTheCacheAndTheBuffer) {
    const auto r = run_kxacl({"compile", acl, "--cache", "-o", dir + "/out.buf"});
    ASSERT_EQ(r.exit_code, 0) << r.err;
    // 5 header bytes; sub-ACLs n and o 17 each; users 15 + 12 + 11; groups
    // 10 + 13 + 13; expanded 15 + 11.
    EXPECT_EQ(r.out, acl + ": 7 entries in 5 sub-ACLs, 139 bytes\ncached in " + acl +
                         ".cacl\nwritten to " + dir + "/out.buf\n");
    EXPECT_EQ(r.err, "");
    const std::string cached = kxtest::read_file(acl + ".cacl");
    EXPECT_EQ(cached.size(), 139u);
    EXPECT_EQ(kxtest::read_file(dir + "/out.buf"), cached);
    EXPECT_EQ(kxtest::dir_entries(dir),
              (std::vector<std::string>{"out.buf", "res.acl", "res.acl.cacl"}));

    const json j = parsed(run_kxacl({"--json", "compile", acl}));
    EXPECT_EQ(j["entries"], 7);
    EXPECT_EQ(j["subacls"], 5);
    EXPECT_EQ(j["bytes"], 139);
    EXPECT_EQ(j["cached"], false);
    EXPECT_TRUE(j["output"].is_null());
}

TEST_F(KxaclTool, CompileFailsOnABadLineWithTheLibraryMessage) {
    kxtest::write_file(acl, "n r\no r\nu unix\n");
    auto r = run_kxacl({"compile", acl, "--cache"});
    EXPECT_EQ(r.exit_code, 2);
    EXPECT_EQ(r.out, "");
    EXPECT_EQ(r.err.rfind("2650-172 Failure: An error occurred while parsing the\nACL file.  "
                          "It appears that the ACLE at line 3 in the ACL file is missing\n",
                          0),
              0u)
        << r.err;
    EXPECT_EQ(kxtest::dir_entries(dir), std::vector<std::string>{"res.acl"});

    r = run_kxacl({"compile", acl, "--json"});
    const json j = parsed(r);
    EXPECT_EQ(j["error"]["status"], 42);
    EXPECT_EQ(j["error"]["id"], "2650-172");
    EXPECT_EQ(j["error"]["message"], r.err);
}

TEST_F(KxaclTool, CompileRefusesToWriteACachedFileByName) {
    const auto r = run_kxacl({"compile", acl, "-o", dir + "/x.cacl"});
    EXPECT_EQ(r.exit_code, 2);
    EXPECT_NE(r.err.find("refusing to write " + dir + "/x.cacl"), std::string::npos);
    EXPECT_EQ(kxtest::dir_entries(dir), std::vector<std::string>{"res.acl"});
}

TEST_F(KxaclTool, CompileWithCustomTemplates) {
    kxtest::write_file(dir + "/perms.txt", "# resource permissions\n"
                                           "v 0 view   See the resource\n"
                                           "m 5 manage Change it\n");
    kxtest::write_file(acl, "u unix ann vm\no v\n");
    const std::string tmpl = "--templates=" + dir + "/perms.txt";
    EXPECT_EQ(run_kxacl({"compile", acl, tmpl}).exit_code, 0);
    const auto r = run_kxacl({"list", acl, tmpl});
    EXPECT_EQ(r.out, "o v\nu unix ann vm\n");
    // Without the templates the default set has no 'm'.
    EXPECT_NE(run_kxacl({"compile", acl}).err.find("2650-180"), std::string::npos);

    kxtest::write_file(dir + "/perms.txt", "v 0 view\nw 0 write\n");
    const auto bad = run_kxacl({"compile", acl, tmpl});
    EXPECT_EQ(bad.exit_code, 2);
    EXPECT_EQ(bad.err, "kxacl: " + dir + "/perms.txt: line 2: bit 0 is used twice\n");
}

TEST_F(KxaclTool, CheckPrintsTheGrantAndExitsByIt) {
    struct {
        std::vector<std::string> who;
        int exit_code;
        std::string out;
    } cases[] = {
        {{"--user", "unix", "ROOT"}, 0, "rwcx 0x0000000f\n"},
        {{"--user", "unix", "joe"}, 1, "- 0x00000000\n"},
        {{"--user", "unix", "nobody"}, 1, "no entry for the requester: nothing granted\n"},
        {{"--user", "krb5", "root"}, 1, "no entry for the requester: nothing granted\n"},
        {{"--anyother"}, 0, "r 0x00000001\n"},
        {{"--unauthenticated"}, 1, "- 0x00000000\n"},
        {{"--group", "staff", "admin", "nobody"}, 0, "rwcxCqledvsao 0x00001fff\n"},
        {{"--group", "staff"}, 0, "rw 0x00000003\n"},
        {{"--expanded", "unix", "joe"}, 0, "w 0x00000002\n"},
        {{"--expanded", "unix", "JOE"}, 1, "no entry for the requester: nothing granted\n"},
    };
    for (const auto &c : cases) {
        std::vector<std::string> args{"check", acl};
        args.insert(args.end(), c.who.begin(), c.who.end());
        const auto r = run_kxacl(args);
        EXPECT_EQ(r.exit_code, c.exit_code) << c.who[0] << " " << r.err;
        EXPECT_EQ(r.out, c.out) << c.who[0];
    }
    const json j = parsed(run_kxacl({"check", acl, "--json", "--user", "unix", "joe"}));
    EXPECT_EQ(j, json::parse(R"({"entry":true,"granted":false,"perms":"","mask":0})"));
}

TEST_F(KxaclTool, CheckReadsThroughACurrentCachedFile) {
    ASSERT_EQ(run_kxacl({"compile", acl, "--cache"}).exit_code, 0);
    // A current cached file is believed without reading the text: give it
    // other contents to see which one answered.
    const std::string other = dir + "/other.buf";
    ASSERT_EQ(run_kxacl({"compile", acl, "-o", other}).exit_code, 0);
    ASSERT_EQ(run_kxacl({"add", other, "--anyother", "--perms", "rwx"}).exit_code, 0);
    kxtest::write_file(acl + ".cacl", kxtest::read_file(other));
    EXPECT_EQ(run_kxacl({"check", acl, "--anyother"}).out, "rwx 0x0000000b\n");
    // Once the text is newer, the text is compiled again.
    kxtest::shift_mtime(acl, 10);
    kxtest::shift_mtime(acl + ".cacl", -20);
    EXPECT_EQ(run_kxacl({"check", acl, "--anyother"}).out, "r 0x00000001\n");
}

TEST_F(KxaclTool, ListShowsTextThatCompilesToTheSameEntries) {
    const auto r = run_kxacl({"list", acl});
    ASSERT_EQ(r.exit_code, 0) << r.err;
    EXPECT_EQ(r.out, "e unix  joe  w\n"
                     "g admin rwcxCqledvsao\n"
                     "g staff rw\n"
                     "u unix  joe\n"
                     "u unix  root rwcx\n"
                     "o r\n"
                     "n\n");
    // Compiled again, the listing holds the same entries; sub-ACLs come out
    // in the other order, so listing twice gives back the first text.
    kxtest::write_file(dir + "/again.acl", r.out);
    const std::string again = run_kxacl({"list", dir + "/again.acl"}).out;
    EXPECT_NE(again, r.out);
    kxtest::write_file(dir + "/again.acl", again);
    EXPECT_EQ(run_kxacl({"list", dir + "/again.acl"}).out, r.out);
    // The buffer file lists the same, and filters by type and mechanism.
    const std::string buf = compiled();
    EXPECT_EQ(run_kxacl({"list", buf}).out, r.out);
    EXPECT_EQ(run_kxacl({"list", buf, "--type", "user", "--mech", "UNIX"}).out,
              "u unix joe\nu unix root rwcx\n");
    EXPECT_EQ(run_kxacl({"list", buf, "--type=g"}).out, "g admin rwcxCqledvsao\ng staff rw\n");
}

TEST_F(KxaclTool, ListJsonHoldsEveryField) {
    const json j = parsed(run_kxacl({"list", acl, "--json", "--type", "e"}));
    EXPECT_EQ(j, json::parse(R"({"entries":[{"type":"expanded","mech":"unix","id":"joe",
                                            "perms":"w","mask":2}]})"));
    const json all = parsed(run_kxacl({"list", compiled(), "--json"}));
    ASSERT_EQ(all["entries"].size(), 7u);
    EXPECT_EQ(all["entries"][6], json::parse(R"({"type":"unauthenticated","mech":null,"id":null,
                                                 "perms":"","mask":0})"));
}

TEST_F(KxaclTool, AddAndDelRewriteTheBufferFileWhole) {
    const std::string buf = compiled();
    ASSERT_EQ(::chmod(buf.c_str(), 0640), 0);
    auto r = run_kxacl({"add", buf, "--user", "unix", "ann@host1", "--perms", "rw"});
    ASSERT_EQ(r.exit_code, 0) << r.err;
    EXPECT_EQ(r.out, "added: u unix ann@host1 rw\n");
    EXPECT_EQ(run_kxacl({"check", buf, "--user", "unix", "ANN@host1"}).out, "rw 0x00000003\n");
    // Changing the mask of an existing entry, then refusing it with --new.
    EXPECT_EQ(run_kxacl({"add", buf, "--group", "staff", "--perms", "0x1"}).exit_code, 0);
    const std::string before = kxtest::read_file(buf);
    r = run_kxacl({"add", buf, "--group", "staff", "--new", "--json"});
    EXPECT_EQ(r.exit_code, 2);
    EXPECT_EQ(parsed(r)["error"]["id"], "2650-175");
    EXPECT_EQ(kxtest::read_file(buf), before);

    r = run_kxacl({"del", buf, "--group", "staff", "--json"});
    ASSERT_EQ(r.exit_code, 0) << r.err;
    EXPECT_EQ(parsed(r)["deleted"]["id"], "staff");
    r = run_kxacl({"del", buf, "--group", "staff"});
    EXPECT_EQ(r.exit_code, 2);
    EXPECT_EQ(r.err.rfind("2650-118 ", 0), 0u) << r.err;

    struct stat st {};
    ASSERT_EQ(::stat(buf.c_str(), &st), 0);
    EXPECT_EQ(st.st_mode & 07777, 0640u);
    EXPECT_EQ(kxtest::dir_entries(dir), (std::vector<std::string>{"res.acl", "res.buf"}));
}

TEST_F(KxaclTool, EditingNeverTouchesACachedFileInPlace) {
    ASSERT_EQ(run_kxacl({"compile", acl, "--cache"}).exit_code, 0);
    const std::string cacl = acl + ".cacl", before = kxtest::read_file(cacl);
    auto r = run_kxacl({"del", cacl, "--anyother"});
    EXPECT_EQ(r.exit_code, 2);
    EXPECT_NE(r.err.find("refusing to write " + cacl), std::string::npos);
    EXPECT_EQ(kxtest::read_file(cacl), before);
    // Written elsewhere, the cached file stays as it was.
    r = run_kxacl({"del", cacl, "--anyother", "-o", dir + "/edited.buf"});
    ASSERT_EQ(r.exit_code, 0) << r.err;
    EXPECT_EQ(kxtest::read_file(cacl), before);
    EXPECT_EQ(run_kxacl({"check", dir + "/edited.buf", "--anyother"}).exit_code, 1);
}

// A FIFO, a device or a directory is neither read (a FIFO would hang the
// tool) nor replaced.
TEST_F(KxaclTool, OnlyRegularFilesAreReadOrReplaced) {
    const std::string fifo = dir + "/fifo";
    ASSERT_EQ(::mkfifo(fifo.c_str(), 0644), 0);
    const std::vector<std::vector<std::string>> runs = {
        {"list", "--buffer", fifo},         {"list", fifo},
        {"list", acl, "--templates", fifo}, {"check", "/dev/null", "--anyother"},
        {"compile", acl, "-o", fifo},       {"compile", acl, "-o", dir}};
    for (const auto &args : runs) {
        auto r = run_kxacl(args);
        EXPECT_EQ(r.exit_code, 2) << args.back();
        EXPECT_NE(r.err.find("is not a regular file"), std::string::npos) << r.err;
    }
}

// A buffer file rewritten by root keeps the set-id and sticky bits only when
// it was root's own.
TEST_F(KxaclTool, EditingKeepsSetIdBitsOnlyOfTheRunningUsersFiles) {
    KXTEST_REQUIRE_ROOT();
    const std::string buf = compiled();
    for (auto [owner, mode, kept] : {std::tuple{1u, 06777u, 0777u}, {0u, 04750u, 04750u}}) {
        ASSERT_EQ(::chown(buf.c_str(), owner, owner), 0);
        ASSERT_EQ(::chmod(buf.c_str(), mode), 0);
        ASSERT_EQ(run_kxacl({"add", buf, "--group", "g" + std::to_string(owner)}).exit_code, 0);
        EXPECT_EQ(kxtest::status_of(buf).st_mode & 07777, kept) << std::oct << mode;
    }
}

TEST_F(KxaclTool, AddRefusesATextFileAndReportsLibraryFailures) {
    auto r = run_kxacl({"add", acl, "--anyother"});
    EXPECT_EQ(r.exit_code, 2);
    EXPECT_EQ(r.err.rfind("2650-", 0), 0u) << r.err; // not a buffer
    EXPECT_EQ(kxtest::read_file(acl), example_acl);
    r = run_kxacl({"add", compiled(), "--anyother", "--perms", "rz"});
    EXPECT_EQ(r.exit_code, 2);
    EXPECT_EQ(r.err.rfind("2650-146 ", 0), 0u) << r.err;
}

TEST_F(KxaclTool, DumpPrintsTheLibraryDumpOnStandardOutput) {
    kxtest::write_file(acl, "u unix admin1 rw\n");
    auto r = run_kxacl({"dump", acl});
    ASSERT_EQ(r.exit_code, 0) << r.err;
    EXPECT_EQ(r.err, "");
    EXPECT_EQ(r.out.rfind("ACL descriptor: 34 byte(s) long\n\tVersion: 1\n", 0), 0u) << r.out;
    EXPECT_NE(r.out.find("id = admin1; permission = rw"), std::string::npos) << r.out;
    const json j = parsed(run_kxacl({"dump", acl, "--json"}));
    EXPECT_EQ(j["lines"][0], "ACL descriptor: 34 byte(s) long");
    EXPECT_EQ(j["lines"].size(),
              static_cast<std::size_t>(std::count(r.out.begin(), r.out.end(), '\n')));
}

TEST_F(KxaclTool, PermsTranslatesBothWays) {
    EXPECT_EQ(run_kxacl({"perms", "rwx"}).out, "rwx 0x0000000b\n");
    EXPECT_EQ(run_kxacl({"perms", "0xb"}).out, "rwx 0x0000000b\n");
    EXPECT_EQ(run_kxacl({"perms", "011"}).out, "rwx 0x0000000b\n"); // decimal, not octal
    EXPECT_EQ(run_kxacl({"perms", "--mask", "0xz"}).err,
              "kxacl: '0xz' is not a mask: write decimal digits, or 0x and hex digits\n");
    EXPECT_EQ(parsed(run_kxacl({"perms", "--json", "C"})),
              json::parse(R"({"perms":"C","mask":16})"));
    auto r = run_kxacl({"perms", "0x2000"});
    EXPECT_EQ(r.exit_code, 2);
    EXPECT_EQ(r.err.rfind("2650-178 ", 0), 0u) << r.err;
    r = run_kxacl({"perms", "0x100000000"});
    EXPECT_EQ(r.exit_code, 2);
    EXPECT_EQ(r.err, "kxacl: '0x100000000' is not a 32-bit mask\n");
    // Digits are permission characters when the templates say so.
    kxtest::write_file(dir + "/t", "1 4 one\n2 7 two\n");
    EXPECT_EQ(run_kxacl({"perms", "--string", "21", "--templates", dir + "/t"}).out,
              "12 0x00000090\n");
    EXPECT_EQ(run_kxacl({"perms", "--templates", dir + "/t"}).out,
              "1 0x00000010  one\n2 0x00000080  two\n");
    const json listed = parsed(run_kxacl({"perms", "--json"}));
    EXPECT_EQ(listed["templates"].size(), 13u);
    EXPECT_EQ(listed["templates"][12]["char"], "o");
}

TEST_F(KxaclTool, HelpAndUsageMistakes) {
    for (const char *cmd : {"compile", "check", "list", "add", "del", "dump", "perms"}) {
        const auto r = run_kxacl({cmd, "--help"});
        EXPECT_EQ(r.exit_code, 0);
        EXPECT_EQ(r.out.rfind(std::string("Usage: kxacl ") + cmd + " ", 0), 0u) << r.out;
    }
    EXPECT_EQ(run_kxacl({"--help"}).out.rfind("Usage: kxacl [--json] COMMAND", 0), 0u);
    EXPECT_EQ(run_kxacl({"--version"}).out, "kxacl 1.0.0\n");

    auto r = run_kxacl({"frobnicate"});
    EXPECT_EQ(r.exit_code, 2);
    EXPECT_EQ(r.err, "kxacl: unknown command 'frobnicate'\nTry 'kxacl --help'.\n");
    r = run_kxacl({"check", acl, "--user", "unix"});
    EXPECT_EQ(r.exit_code, 2);
    EXPECT_EQ(r.err, "kxacl: option --user needs a value\nTry 'kxacl check --help'.\n");
    r = run_kxacl({"list", dir + "/missing.acl", "--json"});
    EXPECT_EQ(r.exit_code, 2);
    EXPECT_EQ(parsed(r)["error"]["id"], "2650-135");
}

} // namespace
