// The kxacl executable, run as an administrator would run it: exit codes,
// exact output, JSON and the files it leaves behind.
#include <gtest/gtest.h>
#include <nlohmann/json.hpp>

#include <functional>
#include <tuple>
#include <vector>

#include <sys/stat.h>

#include "file_helpers.h"
#include "run_kxacl.h"

using kxtest::run_kxacl;
using nlohmann::json;
using strings = std::vector<std::string>;

namespace {

constexpr const char *example_acl = "#ACL for the example resource\n\nN\no r\n"
                                    "U UNIX root rwcx #administrator\nu unix joe\n"
                                    "g staff rw\ng admin rwcxCqledvsao\ne unix joe w\n";

// A run and what it gives: output and error whole, or only their start
// where the expectation ends in "...".
struct expected_run {
    strings args;
    int exit_code;
    std::string out, err = "";
};

expected_run gives(strings args, int exit_code, std::string out, std::string err = "") {
    return {std::move(args), exit_code, std::move(out), std::move(err)};
}

void expect_runs(const std::vector<expected_run> &runs) {
    for (const auto &e : runs) {
        SCOPED_TRACE(testing::PrintToString(e.args));
        const auto r = run_kxacl(e.args);
        EXPECT_EQ(r.exit_code, e.exit_code) << r.err;
        for (auto [actual, expected] : {std::pair{r.out, e.out}, {r.err, e.err}}) {
            if (expected.ends_with("...")) {
                expected.resize(expected.size() - 3);
                actual.resize(std::min(actual.size(), expected.size()));
            }
            EXPECT_EQ(actual, expected);
        }
    }
}

class KxaclTool : public ::testing::Test {
  protected:
    void SetUp() override {
        kxtest::write_file(acl, example_acl);
        kxtest::shift_mtime(acl, -10); // old enough to be cached
    }
    // Compiles the example into a buffer file and returns its path.
    std::string compiled() {
        EXPECT_EQ(run_kxacl({"compile", acl, "-o", buf}).exit_code, 0);
        return buf;
    }
    static json parsed(const kxtest::run_result &r) {
        EXPECT_TRUE(json::accept(r.out)) << r.out;
        return json::parse(r.out, nullptr, false);
    }
    strings files() const { return kxtest::dir_entries(dir); }
    std::string dir = kxtest::temp_dir(), acl = dir + "/res.acl", cacl = acl + ".cacl",
                buf = dir + "/res.buf";
};

TEST_F(KxaclTool, CompileWritesTheBufferAndTheCacheOrRefuses) {
    const std::string out = dir + "/out.buf";
    // 5 header bytes; sub-ACLs n and o 17 each; users 15 + 12 + 11; groups
    // 10 + 13 + 13; expanded 15 + 11.
    const std::string summary = acl + ": 7 entries in 5 sub-ACLs, 139 bytes\n";
    expect_runs({
        gives({"compile", acl, "--cache", "-o", out}, 0,
              summary + "cached in " + cacl + "\nwritten to " + out + "\n"),
        gives({"compile", acl, "--cache"}, 0, summary + cacl + " is current already\n"),
        gives(
            {"--json", "compile", acl}, 0,
            R"({"file":")" + acl +
                R"(","entries":7,"subacls":5,"bytes":139,"cached":false,"output":null,"note":null})"
                "\n"),
        gives({"compile", acl, "-o", dir + "/x.cacl"}, 2, "",
              "kxacl: refusing to write " + dir +
                  "/x.cacl: cached compiled files are written by the library only (use --cache)\n"),
    });
    EXPECT_EQ(kxtest::read_file(cacl).size(), 139u);
    EXPECT_EQ(kxtest::read_file(out), kxtest::read_file(cacl));
    EXPECT_EQ(files(), (strings{"out.buf", "res.acl", "res.acl.cacl"}));

    kxtest::write_file(acl, "n r\no r\nu unix\n");
    ASSERT_EQ(::unlink(cacl.c_str()), 0);
    expect_runs(
        {gives({"compile", acl, "--cache"}, 2, "",
               "2650-172 Failure: An error occurred while parsing the\nACL file.  It appears "
               "that the ACLE at line 3 in the ACL file is missing\n...")});
    const auto r = run_kxacl({"compile", acl, "--json"});
    EXPECT_EQ(parsed(r)["error"],
              json({{"kind", "library"}, {"status", 42}, {"id", "2650-172"}, {"message", r.err}}));
    EXPECT_EQ(files(), (strings{"out.buf", "res.acl"}));
}

// Editing never touches a cached file in place; compile --cache says what
// became of it.
TEST_F(KxaclTool, CachedFileIsNotEditedAndCompileSaysWhatBecameOfIt) {
    ASSERT_EQ(run_kxacl({"compile", acl, "--cache"}).exit_code, 0);
    const std::string cached = kxtest::read_file(cacl);
    expect_runs({
        gives({"del", cacl, "--anyother"}, 2, "",
              "kxacl: refusing to write " + cacl +
                  ": cached compiled files are written by the library only (use -o)\n"),
        // Written elsewhere, the cached file stays as it was.
        gives({"del", cacl, "--anyother", "-o", buf}, 0, "deleted: o\n"),
        gives({"check", buf, "--anyother"}, 1, "no entry for the requester: nothing granted\n"),
    });
    EXPECT_EQ(kxtest::read_file(cacl), cached);
    // An older-dated text replaces the one the cached file was compiled from.
    kxtest::write_file(acl, "o rwx\n");
    kxtest::shift_mtime(acl, -20);
    expect_runs({
        gives({"compile", acl, "--cache"}, 2, "...",
              "kxacl: " + cacl + " is newer than the text but holds another ACL (the text was " +
                  "replaced by an older-dated file): readers get the old entries (fix: kxacl " +
                  "compile " + acl + " --cache --force)\n"),
        // The cached file, current by its date, answers in place of the text.
        gives({"check", acl, "--anyother"}, 0, "r 0x00000001\n"),
        gives({"compile", acl, "--cache", "--force"}, 0, "..."),
        gives({"check", acl, "--anyother"}, 0, "rwx 0x0000000b\n"),
    });
    // A cached file of another mode is never replaced.
    ASSERT_EQ(::chmod(cacl.c_str(), 0600), 0);
    kxtest::shift_mtime(acl, 30);
    const auto r = run_kxacl({"compile", acl, "--cache", "--force", "--json"});
    EXPECT_EQ(r.exit_code, 2);
    EXPECT_NE(r.err.find("(fix: rm " + cacl + " && kxacl compile " + acl + " --cache)"),
              std::string::npos)
        << r.err;
    // Run by a user who may not write beside the text.
    KXTEST_REQUIRE_ROOT();
    ASSERT_EQ(::unlink(cacl.c_str()), 0);
    ASSERT_EQ(::chmod(dir.c_str(), 0755), 0);
    const auto denied = run_kxacl({"compile", acl, "--cache"}, 65534, 65534);
    EXPECT_EQ(denied.exit_code, 2);
    EXPECT_EQ(denied.err, "kxacl: " + cacl + " could not be written: this user cannot create " +
                              "files in " + dir + " (Permission denied)\n");
}

// The reading commands on the example text and its buffer file.
TEST_F(KxaclTool, ReadingCommandsPrintExactlyAndExitByTheirAnswer) {
    compiled();
    const std::string none = "no entry for the requester: nothing granted\n";
    const std::string listing = "e unix  joe  w\ng admin rwcxCqledvsao\ng staff rw\n"
                                "u unix  joe\nu unix  root rwcx\no r\nn\n";
    expect_runs({
        gives({"check", acl, "--user", "unix", "ROOT"}, 0, "rwcx 0x0000000f\n"),
        gives({"check", acl, "--user", "unix", "joe"}, 1, "- 0x00000000\n"),
        gives({"check", acl, "--user", "unix", "nobody"}, 1, none),
        gives({"check", acl, "--anyother"}, 0, "r 0x00000001\n"),
        gives({"check", acl, "--unauthenticated"}, 1, "- 0x00000000\n"),
        gives({"check", acl, "--group", "staff", "admin", "nobody"}, 0,
              "rwcxCqledvsao 0x00001fff\n"),
        gives({"check", acl, "--expanded", "unix", "JOE"}, 1, none),
        gives({"check", acl, "--json", "--user", "unix", "joe"}, 1,
              R"({"entry":true,"granted":false,"perms":"","mask":0})"
              "\n"),
        gives({"list", acl}, 0, listing),
        gives({"list", buf}, 0, listing),
        gives({"list", buf, "--type", "U", "--mech", "UNIX"}, 0, "u unix joe\nu unix root rwcx\n"),
        gives(
            {"list", buf, "--json", "--type", "unauthenticated"}, 0,
            R"({"entries":[{"type":"unauthenticated","mech":null,"id":null,"perms":"","mask":0}]})"
            "\n"),
        gives({"explain", acl, "--user", "unix", "ROOT", "--group", "staff", "aaa", "--expanded",
               "unix", "JOE"},
              0,
              "user unix ROOT: rwcx 0x0000000f\n  decided by line 5: u unix root rwcx\n"
              "expanded unix JOE: no entry\n  no expanded entry of mechanism unix is JOE byte for "
              "byte "
              "(1 compared by kxacl's stand-in for the mechanism's handler)\n"
              "group staff: rw 0x00000003\n  decided by line 7: g staff rw\n"
              "group aaa: no entry\n  no group entry names aaa: aaa sorts before admin (line 8), "
              "where the walk stops\ngroups staff aaa: rw 0x00000003\n"
              "anyother: r 0x00000001\n  decided by line 4: o r\n"
              "unauthenticated: - 0x00000000\n  decided by line 3: n\n"),
        gives(
            {"explain", acl, "--json", "--user", "unix", "nobody", "--expanded", "unix", "joe"}, 0,
            R"({"file":")" + acl +
                R"j(","source":"text","answers":[{"question":"user","mech":)j"
                R"j("unix","ids":["nobody"],"entry":false,"perms":"","mask":0,"decided_by":null,)j"
                R"j("why":"no user entry of mechanism unix names nobody: nobody sorts before root )j"
                R"j((line 5), where the walk stops; unix user identities are written user@host"},)j"
                R"j({"question":"expanded","mech":"unix","ids":["joe"],"entry":true,"perms":"w",)j"
                R"j("mask":2,"decided_by":{"line":9,"position":1,"entry":{"type":"expanded",)j"
                R"j("mech":"unix","id":"joe","perms":"w","mask":2}},"why":null},...)j"),
        // A buffer file has positions instead of lines.
        gives({"explain", buf, "--user", "krb5", "root"}, 0,
              "user krb5 root: no entry\n  no user entry of mechanism krb5\n"
              "anyother: r 0x00000001\n  decided by entry 6: o r\n"
              "unauthenticated: - 0x00000000\n  decided by entry 7: n\n"),
        // The library's dump, whose lines its own tests check.
        gives({"dump", acl}, 0, "ACL descriptor: 139 byte(s) long\n\tVersion: 1\n..."),
        gives({"dump", buf, "--json"}, 0,
              R"({"lines":["ACL descriptor: 139 byte(s) long","\tVersion: 1",)"
              R"("\tByte Ordering: 2","\tNumber of sub-ACLs: 5","\tSubacl:",)"
              R"j("\t(length = 26 byte(s); type = 8; mech = unix; ACLE count = 1)","",)j"
              R"("\t\ttype = e; mech = unix; id = joe; permission = w","\tSubacl:",...)"),
    });
}

TEST_F(KxaclTool, DiffShowsEachEntrysChangeAndGatesOnGrantingMore) {
    const std::tuple<const char *, const char *, const char *, int> cases[] = {
        {"o r\n", "O r # same\n", "no entry differs\n", 0},
        {"u unix Ann@h rw\n", "u unix ann@H rw\n", "no entry differs\n", 0},
        {"g web rw\n", "g web r\n", "narrowed: g web rw -> r (-w)\n", 0},
        {"g web r\n", "g web rwx\n", "widened:  g web r -> rwx (+wx); grants more: wx\n", 1},
        {"n r\n", "n w\n", "changed:  n r -> w (+w -r); grants more: w\n", 1},
        {"o r\n", "o r\nu unix a@h\n", "added:    u unix a@h -\n", 0},
        {"e unix x r\n", "e unix X r\n",
         "removed:  e unix x r\nadded:    e unix X r; grants more: r\n", 1},
        {"o r\nu unix a@h rw\n", "o r\n", "removed:  u unix a@h rw\n", 0},
        {"o rw\nu unix a@h r\n", "o rw\n",
         "removed:  u unix a@h r; its requesters fall back to the anyother entry, which grants "
         "more: w\n",
         1},
    };
    const std::string old_acl = dir + "/old.acl", new_acl = dir + "/new.acl";
    for (const auto &[old_text, new_text, out, grants_more] : cases) {
        kxtest::write_file(old_acl, old_text);
        kxtest::write_file(new_acl, new_text);
        expect_runs({gives({"diff", old_acl, new_acl}, 0, out),
                     gives({"diff", old_acl, new_acl, "--grants-more"}, grants_more, out)});
    }
    // A buffer file against a text, as JSON.
    kxtest::write_file(new_acl, "g admin rwcxCqledvsao\ng staff rwx\n");
    const json j = parsed(run_kxacl({"diff", compiled(), new_acl, "--json", "--grants-more"}));
    ASSERT_EQ(j["changes"].size(), 6u) << j; // n, o, two users and the expanded entry removed
    EXPECT_EQ(j["changes"][1], json::parse(R"({"change":"widened","entry":{"type":"group",
        "mech":null,"id":"staff","perms":"rwx","mask":11},"old":{"perms":"rw","mask":3},
        "new":{"perms":"rwx","mask":11},"grants_more":{"perms":"x","mask":8}})"));
    EXPECT_EQ(j["grants_more"], true);
}

// What a daemon reads from the ACL file, through its cached file when that
// is current: the anyother entry's mask tells the versions apart.
std::int64_t daemon_read(const std::string &file) {
    kxtest::acl_read r(file, SEC_F_ACL_CACHE | SEC_F_ACL_CONVERT);
    kx_uint32_t mask = 0;
    if (r.status != 0 || sec__single_acle_perm(&r.acl, 2, nullptr, nullptr, nullptr, &mask) != 0)
        return -1;
    return mask;
}

TEST_F(KxaclTool, InstallNeverLeavesTheOldVersionTrusted) {
    const std::string src = dir + "/src.acl", staged = dir + "/staged";
    for (int version = 1; version <= 6; ++version) {
        const std::string text = "o " + std::string("rwcxCq").substr(0, version) + "\n";
        // The file in place was compiled and cached long after it was written
        // (forced past a cached file that a replacement left in force).
        kxtest::shift_mtime(acl, -30);
        expect_runs({gives({"compile", acl, "--cache", "--force"}, 0, "...")});
        const std::int64_t before = daemon_read(acl);
        // The new text is older-dated than that cached file, as cp -p, rsync -t
        // and tar leave it.
        kxtest::write_file(src, text);
        kxtest::shift_mtime(src, -20);
        if (version % 2) { // without install, the old version stays in force
            kxtest::write_file(staged, text);
            kxtest::shift_mtime(staged, -20);
            EXPECT_EQ(::rename(staged.c_str(), acl.c_str()), 0);
            EXPECT_EQ(daemon_read(acl), before);
            continue;
        }
        expect_runs({gives({"install", src, acl}, 0, "...")});
        EXPECT_EQ(daemon_read(acl), (1 << version) - 1) << version;
    }
}

TEST_F(KxaclTool, InstallGivesOwnerAndModeAndRefusesWhatDoesNotCompile) {
    const std::string src = dir + "/src.acl", dest = dir + "/dest.acl";
    kxtest::write_file(src, "o rw\n");
    expect_runs({
        gives({"install", src, dest, "--mode", "0640", "--cache"}, 0,
              "installed " + src + " as " + dest + ": 1 entries, owner 0:0, mode 0640\ncached in " +
                  dest + ".cacl\n"),
        // The cached file serves readers at once.
        gives({"explain", dest}, 0, "answered from " + dest + ".cacl..."),
        gives({"install", acl, dest, "--mode", "4755"}, 2, "",
              "kxacl: --mode takes permission bits up to 0777, not 4755\n"),
        gives({"install", acl, dir}, 2, "", "kxacl: " + dir + " is not a regular file\n"),
        gives({"install", acl, dest + ".cacl"}, 2, "",
              "kxacl: refusing to write " + dest +
                  ".cacl: cached compiled files are written by the library only (use --cache)\n"),
    });
    EXPECT_EQ(kxtest::status_of(dest).st_mode & 07777, 0640u);
    // Owner and mode stay DEST's unless given.
    ASSERT_EQ(::chown(dest.c_str(), 65534, 65534), 0);
    expect_runs({gives({"install", src, dest, "--json"}, 0,
                       R"({"source":")" + src + R"(","file":")" + dest +
                           R"(","entries":1,"bytes":5,"uid":65534,"gid":65534,"mode":"0640",)"
                           R"("cached":false})"
                           "\n")});
    kxtest::write_file(src, "o rw\ng\n");
    expect_runs({gives({"install", src, dest}, 2, "", "2650-172 Failure...")});
    EXPECT_EQ(kxtest::read_file(dest), "o rw\n");
    EXPECT_EQ(files(), (strings{"dest.acl", "dest.acl.cacl", "res.acl", "src.acl"}));
}

// The codes of lint's warnings, with their lines ("KX101@4"; file states
// without one), in the order printed.
std::vector<std::string> lint_codes(const std::string &file) {
    const auto r = run_kxacl({"lint", file, "--json"});
    const json warnings = json::parse(r.out)["warnings"];
    EXPECT_EQ(r.exit_code, warnings.empty() ? 0 : 1) << r.err;
    std::vector<std::string> codes;
    for (const json &w : warnings) {
        std::string code = w["code"].get<std::string>();
        if (!w["line"].is_null())
            code += '@' + std::to_string(w["line"].get<int>());
        codes.push_back(code);
    }
    return codes;
}

TEST_F(KxaclTool, LintFindsEachPlantedEntryProblem) {
    kxtest::write_file(acl,
                       "# planted problems\nn rx\no rx\nu unix root rwcxCqledvsao\n"
                       "u unix bob@fe80:0:0:0:0:0:0:1 rx\nu unx ann@h rx\nu unix carl@h r\n"
                       "g admins rwcxCqledvsao\ne vgn2 svc@ rx\n",
                       0664);
    EXPECT_EQ(lint_codes(acl),
              (std::vector<std::string>{"KX105@2", "KX101@4", "KX102@5", "KX103@6", "KX104@7",
                                        "KX104@7", "KX106@8", "KX101@9", "KX201"}));
    auto r = run_kxacl({"lint", acl});
    EXPECT_NE(r.out.find(acl + ":5: KX102 ipv6-not-canonical: u unix bob@fe80:0:0:0:0:0:0:1: " +
                         "the IPv6 host part is not in its canonical form, so a requester's " +
                         "identity (bob@fe80::1) never matches it; write it that way\n"),
              std::string::npos)
        << r.out;
    EXPECT_NE(r.out.find("  fix: chmod go-w " + acl + "\n"), std::string::npos);
    // --mech knows another mechanism, --read-like widens what n may grant.
    r = run_kxacl({"lint", acl, "--mech", "UNX", "--read-like", "rx", "--json"});
    EXPECT_EQ(parsed(r)["warnings"].size(), 7u);
    // A buffer file gives positions in place of lines, and has no file states.
    const json b = parsed(run_kxacl({"lint", compiled(), "--json"}));
    EXPECT_EQ(b["warnings"][4], json::parse(R"({"code":"KX104","name":"fallback-grants-more",
        "line":null,"position":5,"message":"u unix carl@h lacks x, which the anyother entry (entry 7) grants to every other authenticated requester","fix":null})"))
        << b;
}

TEST_F(KxaclTool, LintFindsCacheStatesAndTheirFixes) {
    const auto cache = [&] { ASSERT_EQ(run_kxacl({"compile", acl, "--cache"}).exit_code, 0); };
    const auto nothing = [] {};
    const std::tuple<const char *, bool, std::function<void()>> cases[] = {
        // code, whether the text is cached first, what then changes
        {nullptr, true, nothing},
        {"KX202", false, [&] { ASSERT_EQ(::mkdir(cacl.c_str(), 0755), 0); }},
        {"KX203", false, [&] { kxtest::write_file(cacl, "", 0); }},
        {"KX204", true, [&] { ASSERT_EQ(::chmod(cacl.c_str(), 0600), 0); }},
        {"KX205", true, [&] { ASSERT_EQ(::link(cacl.c_str(), (dir + "/x").c_str()), 0); }},
        {"KX206", false, [&] { kxtest::write_file(cacl, ""), kxtest::shift_mtime(cacl, 5); }},
        {"KX207", true, [&] { kxtest::shift_mtime(acl, 20); }},
        {"KX208", true, [&] { kxtest::set_mtime(acl, kxtest::status_of(cacl).st_mtim.tv_sec); }},
        {"KX209", true, [&] { kxtest::write_file(acl, "o rw\n"), kxtest::shift_mtime(acl, -20); }},
        {"KX210", false, [&] { kxtest::write_file(acl + ".0f3a", ""); }},
        {"KX210", false, [&] { kxtest::write_file(acl + ".kxacl-Ab12Cd", ""); }},
    };
    for (const auto &[code, cached, plant] : cases) {
        ::rmdir(cacl.c_str());
        for (const auto &name : files())
            if (name != "res.acl")
                ::unlink((dir + "/" + name).c_str());
        kxtest::write_file(acl, "o r\n");
        kxtest::shift_mtime(acl, -10);
        if (cached)
            cache();
        plant();
        EXPECT_EQ(lint_codes(acl), code ? strings{code} : strings{}) << (code ? code : "clean");
    }
    // Each state comes with the command that puts it right.
    const json w = parsed(run_kxacl({"lint", acl, "--json"}))["warnings"][0];
    EXPECT_EQ(w["fix"], "rm " + acl + ".kxacl-Ab12Cd");
    kxtest::write_file(acl, "o r\n", 0644);
    ASSERT_EQ(::unlink((acl + ".kxacl-Ab12Cd").c_str()), 0);
    kxtest::write_file(cacl, "", 0);
    EXPECT_EQ(parsed(run_kxacl({"lint", acl, "--json"}))["warnings"][0]["fix"],
              "rm " + cacl + " && kxacl compile " + acl + " --cache");
}

TEST_F(KxaclTool, AddAndDelRewriteTheBufferFileWholeOrRefuse) {
    compiled();
    ASSERT_EQ(::chmod(buf.c_str(), 0640), 0);
    expect_runs({
        gives({"add", buf, "--user", "unix", "ann@host1", "--perms", "rw"}, 0,
              "added: u unix ann@host1 rw\n"),
        gives({"check", buf, "--user", "unix", "ANN@host1"}, 0, "rw 0x00000003\n"),
        // Changing the mask of an existing entry, then refusing it with --new.
        gives({"add", buf, "--group", "staff", "--perms", "0x1"}, 0, "added: g staff r\n"),
    });
    const std::string before = kxtest::read_file(buf);
    expect_runs({
        gives({"add", buf, "--group", "staff", "--new", "--json"}, 2,
              R"({"error":{"kind":"library","status":...)", "2650-175 ..."),
        gives({"add", buf, "--anyother", "--perms", "rz"}, 2, "", "2650-146 ..."),
        gives({"add", acl, "--anyother"}, 2, "",
              "kxacl: " + acl +
                  " is an ACL text file, not a compiled buffer file: compile it first " +
                  "with 'kxacl compile " + acl + " -o BUFFER' and use BUFFER\n"),
    });
    EXPECT_EQ(kxtest::read_file(buf), before);
    EXPECT_EQ(kxtest::read_file(acl), example_acl);
    expect_runs({
        gives(
            {"del", buf, "--group", "staff", "--json"}, 0,
            R"({"deleted":{"type":"group","mech":null,"id":"staff","perms":"","mask":0},"file":")" +
                buf + R"(","bytes":...)"),
        gives({"del", buf, "--group", "staff"}, 2, "", "2650-118 ..."),
    });
    EXPECT_EQ(kxtest::status_of(buf).st_mode & 07777, 0640u);
    EXPECT_EQ(files(), (strings{"res.acl", "res.buf"}));
}

// A FIFO, a device or a directory is neither read (a FIFO would hang the
// tool) nor replaced.
TEST_F(KxaclTool, OnlyRegularFilesAreReadOrReplaced) {
    const std::string fifo = dir + "/fifo";
    ASSERT_EQ(::mkfifo(fifo.c_str(), 0644), 0);
    const auto refused = [](const std::string &file, const char *why = "") {
        return "kxacl: " + file + " is not a regular file" + why + "\n";
    };
    expect_runs({
        gives({"list", "--buffer", fifo}, 2, "", refused(fifo)),
        gives({"list", fifo}, 2, "", refused(fifo)),
        gives({"list", acl, "--templates", fifo}, 2, "", refused(fifo)),
        gives({"check", "/dev/null", "--anyother"}, 2, "", refused("/dev/null")),
        gives({"compile", acl, "-o", fifo}, 2, "...", refused(fifo, ": it is not replaced")),
        gives({"compile", acl, "-o", dir}, 2, "...", refused(dir, ": it is not replaced")),
        gives({"--json", "check", dir, "--buffer", "--anyother"}, 2,
              R"({"error":{"kind":"tool","message":"kxacl: )" + dir +
                  R"( is not a regular file\n"}})"
                  "\n",
              refused(dir)),
    });
}

// A buffer file rewritten by root keeps the set-id and sticky bits only when
// it was root's own.
TEST_F(KxaclTool, EditingKeepsSetIdBitsOnlyOfTheRunningUsersFiles) {
    KXTEST_REQUIRE_ROOT();
    compiled();
    for (auto [owner, mode, kept] : {std::tuple{1u, 06777u, 0777u}, {0u, 04750u, 04750u}}) {
        ASSERT_EQ(::chown(buf.c_str(), owner, owner), 0);
        ASSERT_EQ(::chmod(buf.c_str(), mode), 0);
        ASSERT_EQ(run_kxacl({"add", buf, "--group", std::to_string(owner) + "g"}).exit_code, 0);
        EXPECT_EQ(kxtest::status_of(buf).st_mode & 07777, kept) << std::oct << mode;
    }
}

TEST_F(KxaclTool, PermsHelpAndUsageMistakes) {
    kxtest::write_file(dir + "/t", "1 4 one\n2 7 two\n");
    expect_runs({
        gives({"perms", "rwx"}, 0, "rwx 0x0000000b\n"),
        gives({"perms", "0xb"}, 0, "rwx 0x0000000b\n"),
        gives({"perms", "011"}, 0, "rwx 0x0000000b\n"), // decimal, not octal
        gives({"perms", "--json", "C"}, 0, "{\"perms\":\"C\",\"mask\":16}\n"),
        gives({"perms", "--mask", "0xz"}, 2, "",
              "kxacl: '0xz' is not a mask: write decimal digits, or 0x and hex digits\n"),
        gives({"perms", "0x2000"}, 2, "", "2650-178 ..."),
        gives({"perms", "0x100000000"}, 2, "", "kxacl: '0x100000000' is not a 32-bit mask\n"),
        // Digits are permission characters when the templates say so.
        gives({"perms", "--string", "21", "--templates", dir + "/t"}, 0, "12 0x00000090\n"),
        gives({"perms", "--templates", dir + "/t"}, 0, "1 0x00000010  one\n2 0x00000080  two\n"),
        gives({"--help"}, 0, "Usage: kxacl [--json] COMMAND..."),
        gives({"--version"}, 0, "kxacl 1.0.0\n"),
        gives({"frobnicate"}, 2, "", "kxacl: unknown command 'frobnicate'\nTry 'kxacl --help'.\n"),
        gives({"check", acl, "--user", "unix"}, 2, "",
              "kxacl: option --user needs a value\nTry 'kxacl check --help'.\n"),
        gives(
            {"--json", "check", acl}, 2,
            R"({"error":{"kind":"usage","help":"kxacl check --help","message":"kxacl: check needs )"
            R"(one of --unauthenticated, --anyother, --user, --expanded, --group\nTry 'kxacl )"
            R"(check --help'.\n"}})"
            "\n",
            "kxacl: check needs one of --unauthenticated, --anyother, --user, --expanded, "
            "--group\nTry 'kxacl check --help'.\n"),
        gives({"list", dir + "/missing.acl", "--json"}, 2,
              R"({"error":{"kind":"library","status":105,"id":"2650-135",...)", "2650-135 ..."),
    });
    for (const std::string cmd : {"compile", "check", "explain", "lint", "diff", "install", "list",
                                  "add", "del", "dump", "perms"})
        expect_runs({gives({cmd, "--help"}, 0, "Usage: kxacl " + cmd + " ...")});
    // The default set has names too; each character is the library's own.
    const json listed = parsed(run_kxacl({"perms", "--json"}));
    ASSERT_EQ(listed["templates"].size(), 13u);
    EXPECT_EQ(listed["templates"][8], json::parse(R"({"char":"d","mask":256,"name":"define",
                                                      "help":"QBT define/undefine resource"})"));
    for (const json &t : listed["templates"])
        EXPECT_EQ(parsed(run_kxacl({"perms", "--json", t["char"]}))["mask"], t["mask"]);
}

} // namespace
