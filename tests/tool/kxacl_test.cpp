// The kxacl executable, run as an administrator would run it: exit codes,
// exact output, JSON parsed back, and the files it leaves behind.
#include <gtest/gtest.h>
#include <nlohmann/json.hpp>

#include <atomic>
#include <functional>
#include <random>
#include <thread>

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

TEST_F(KxaclTool, CompileCacheSaysWhatBecameOfTheCachedFile) {
    const std::string cacl = acl + ".cacl";
    ASSERT_EQ(run_kxacl({"compile", acl, "--cache"}).exit_code, 0);
    auto r = run_kxacl({"compile", acl, "--cache"});
    EXPECT_EQ(r.exit_code, 0) << r.err;
    EXPECT_NE(r.out.find(cacl + " is current already\n"), std::string::npos) << r.out;
    // An older-dated text replaces the one the cached file was compiled from.
    kxtest::write_file(acl, "o rwx\n");
    kxtest::shift_mtime(acl, -20);
    r = run_kxacl({"compile", acl, "--cache"});
    EXPECT_EQ(r.exit_code, 2);
    EXPECT_EQ(r.err, "kxacl: " + cacl + " is newer than the text but holds another ACL (the text " +
                         "was replaced by an older-dated file): readers get the old entries " +
                         "(fix: kxacl compile " + acl + " --cache --force)\n");
    EXPECT_EQ(run_kxacl({"check", acl, "--anyother"}).out, "r 0x00000001\n");
    r = run_kxacl({"compile", acl, "--cache", "--force"});
    EXPECT_EQ(r.exit_code, 0) << r.err;
    EXPECT_EQ(run_kxacl({"check", acl, "--anyother"}).out, "rwx 0x0000000b\n");
    // A cached file of another mode is never replaced.
    ASSERT_EQ(::chmod(cacl.c_str(), 0600), 0);
    kxtest::shift_mtime(acl, 30);
    r = run_kxacl({"compile", acl, "--cache", "--force", "--json"});
    EXPECT_EQ(r.exit_code, 2);
    EXPECT_NE(r.err.find("(fix: rm " + cacl + " && kxacl compile " + acl + " --cache)"),
              std::string::npos)
        << r.err;
    // Run by a user who may not write beside the text.
    KXTEST_REQUIRE_ROOT();
    ASSERT_EQ(::unlink(cacl.c_str()), 0);
    ASSERT_EQ(::chmod(dir.c_str(), 0755), 0);
    r = run_kxacl({"compile", acl, "--cache"}, 65534, 65534);
    EXPECT_EQ(r.exit_code, 2);
    EXPECT_EQ(r.err, "kxacl: " + cacl + " could not be written: this user cannot create files in " +
                         dir + " (Permission denied)\n");
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

// The answers of explain against those of check and of the library's own
// evaluation, over random ACLs and requesters; and each deciding entry
// against the line that was written for it.
kx_int32_t byte_equal(char *id, char *acle_id) {
    return std::strcmp(id, acle_id) == 0 ? 0 : 1;
}

struct random_acl {
    std::string text;
    std::vector<std::pair<std::string, std::string>> line_ids; // per line: type and identity
};

random_acl make_acl(std::mt19937 &rng) {
    const auto coin = [&] { return rng() % 2 == 0; };
    const auto perms = [&] {
        std::string p;
        for (const char c : std::string("rwxq"))
            if (coin())
                p += c;
        return p;
    };
    random_acl acl;
    const auto add = [&](const std::string &type, const std::string &mech, const std::string &id) {
        acl.text += type.substr(0, 1) + (mech.empty() ? "" : " " + mech) +
                    (id.empty() ? "" : " " + id) + " " + perms() + "\n";
        acl.line_ids.emplace_back(type, id);
    };
    if (coin())
        add("n", "", "");
    if (coin())
        add("o", "", "");
    for (const char *mech : {"unix", "krb5"})
        for (const char *user : {"ann@h1", "Bob@h1", "carl@h2", "dora@h2"})
            if (coin())
                add("user", mech, user);
    for (const char *group : {"adm", "Staff", "web"})
        if (coin())
            add("group", "", group);
    for (const char *id : {"uid=1@h1", "uid=2@h1"})
        if (coin())
            add("expanded", "unix", id);
    return acl;
}

std::string flip_case(std::mt19937 &rng, std::string s) {
    for (char &c : s)
        if (std::isalpha(static_cast<unsigned char>(c)) && rng() % 3 == 0)
            c = static_cast<char>(c ^ 0x20);
    return s;
}

// The library's answer: the mask, or -1 when no entry names the requester.
std::int64_t library_answer(sec_buffer_s &acl, const json &a) {
    kx_uint32_t mask = 0;
    kx_int32_t status;
    const std::string question = a["question"];
    std::vector<std::string> ids = a["ids"];
    if (question == "group" || question == "groups") {
        std::vector<sec_buffer_s> groups;
        for (auto &id : ids)
            groups.push_back({static_cast<kx_int32_t>(id.size() + 1), id.data()});
        status = sec__group_acles_perm(&acl, static_cast<kx_int32_t>(groups.size()), groups.data(),
                                       &mask);
    } else {
        const unsigned char type = question == "user"       ? 4
                                   : question == "expanded" ? 8
                                   : question == "anyother" ? 2
                                                            : 1;
        std::string mech = a["mech"].is_null() ? "" : a["mech"].get<std::string>();
        status = sec__single_acle_perm(&acl, type, mech.data(), nullptr,
                                       ids.empty() ? nullptr : ids[0].data(), &mask);
    }
    return status == SEC_S_OK ? std::int64_t{mask} : status == SEC_S_BAD_ACLE ? -1 : -2;
}

std::vector<std::string> check_args(const json &a) {
    const std::string question = a["question"];
    if (question == "user" || question == "expanded")
        return {"--" + question, a["mech"], a["ids"][0]};
    if (question == "group" || question == "groups") {
        std::vector<std::string> args{"--group"};
        for (const auto &id : a["ids"])
            args.push_back(id);
        return args;
    }
    return {"--" + question};
}

TEST_F(KxaclTool, ExplainAnswersAsCheckAndTheLibraryDo) {
    std::mt19937 rng(17);
    ASSERT_EQ(sec__register_id_handler(SEC_ID_HANDLER_EXPANDED, "unix", byte_equal), 0);
    int decided = 0, undecided = 0;
    for (int round = 0; round < 16; ++round) {
        const random_acl made = make_acl(rng);
        kxtest::write_file(acl, made.text);
        const char *users[] = {"ann@h1", "bob@h1", "carl@h2", "eve@h1"};
        const char *groups[] = {"adm", "staff", "web", "zzz"};
        const std::string mech = rng() % 2 ? "unix" : "KRB5";
        const json j = parsed(
            run_kxacl({"explain", acl, "--json", "--user", mech, flip_case(rng, users[rng() % 4]),
                       "--expanded", "unix", rng() % 2 ? "uid=1@h1" : "UID=2@h1", "--group",
                       flip_case(rng, groups[rng() % 4]), flip_case(rng, groups[rng() % 4])}));
        kxtest::acl_read lib(acl, SEC_F_ACL_TEXT);
        ASSERT_EQ(lib.status, 0) << made.text;
        ASSERT_EQ(j["answers"].size(), 7u) << j;
        for (const json &a : j["answers"]) {
            std::vector<std::string> args{"check", acl, "--json"};
            for (const auto &arg : check_args(a))
                args.push_back(arg);
            const json c = parsed(run_kxacl(args));
            SCOPED_TRACE(made.text + a.dump());
            EXPECT_EQ(c["entry"], a["entry"]);
            EXPECT_EQ(c["mask"], a["mask"]);
            EXPECT_EQ(library_answer(lib.acl, a), a["entry"] ? a["mask"].get<std::int64_t>() : -1);
            if (a["decided_by"].is_null()) {
                undecided += a["entry"] ? 0 : 1;
                EXPECT_NE(a["why"].is_null(), !a["entry"] && a["question"] != "groups");
                continue;
            }
            ++decided;
            const json &d = a["decided_by"];
            EXPECT_EQ(d["entry"]["mask"], a["mask"]);
            const auto &[type, id] = made.line_ids.at(d["line"].get<std::size_t>() - 1);
            if (type.size() > 1) { // the anyother and unauthenticated lines are n and o
                EXPECT_EQ(type, d["entry"]["type"]);
                EXPECT_EQ(id, d["entry"]["id"]);
            }
        }
    }
    // Both kinds of answer came up.
    EXPECT_GT(decided, 20);
    EXPECT_GT(undecided, 20);
}

TEST_F(KxaclTool, ExplainShowsTheDecidingLineOrWhyNoneApplied) {
    const std::string buf = compiled();
    auto r = run_kxacl({"explain", acl, "--user", "unix", "ROOT", "--group", "staff", "aaa",
                        "--expanded", "unix", "JOE"});
    ASSERT_EQ(r.exit_code, 0) << r.err;
    EXPECT_EQ(r.out, "user unix ROOT: rwcx 0x0000000f\n"
                     "  decided by line 5: u unix root rwcx\n"
                     "expanded unix JOE: no entry\n"
                     "  no expanded entry of mechanism unix is JOE byte for byte (1 compared by "
                     "kxacl's stand-in for the mechanism's handler)\n"
                     "group staff: rw 0x00000003\n"
                     "  decided by line 7: g staff rw\n"
                     "group aaa: no entry\n"
                     "  no group entry names aaa: aaa sorts before admin (line 8), where the walk "
                     "stops\n"
                     "groups staff aaa: rw 0x00000003\n"
                     "anyother: r 0x00000001\n"
                     "  decided by line 4: o r\n"
                     "unauthenticated: - 0x00000000\n"
                     "  decided by line 3: n\n");
    // A buffer file has positions instead of lines; no user entry of krb5.
    r = run_kxacl({"explain", buf, "--user", "krb5", "root"});
    EXPECT_EQ(r.out.substr(0, r.out.find("anyother")), "user krb5 root: no entry\n"
                                                       "  no user entry of mechanism krb5\n");
    EXPECT_NE(r.out.find("  decided by entry 6: o r\n"), std::string::npos) << r.out;
}

TEST_F(KxaclTool, DiffShowsEachEntrysChangeAndGatesOnGrantingMore) {
    struct {
        const char *old_text, *new_text, *out;
        int grants_more;
    } cases[] = {
        {"o r\n", "O r # same\n", "no entry differs\n", 0},
        {"u unix Ann@h rw\n", "u unix ann@H rw\n", "no entry differs\n", 0},
        {"g web rw\n", "g web r\n", "narrowed: g web rw -> r (-w)\n", 0},
        {"g web r\n", "g web rwx\n", "widened:  g web r -> rwx (+wx); grants more: wx\n", 1},
        {"n r\n", "n w\n", "changed:  n r -> w (+w -r); grants more: w\n", 1},
        {"o r\n", "o r\nu unix a@h\n", "added:    u unix a@h -\n", 0},
        {"o r\n", "o r\ng web q\n", "added:    g web q; grants more: q\n", 1},
        {"e unix x r\n", "e unix X r\n",
         "removed:  e unix x r\nadded:    e unix X r; grants more: r\n", 1},
        {"o r\nu unix a@h rw\n", "o r\n", "removed:  u unix a@h rw\n", 0},
        {"o rw\nu unix a@h r\n", "o rw\n",
         "removed:  u unix a@h r; its requesters fall back to the anyother entry, which grants "
         "more: w\n",
         1},
        {"n r\n", "\n", "removed:  n r\n", 0},
    };
    const std::string old_acl = dir + "/old.acl", new_acl = dir + "/new.acl";
    for (const auto &c : cases) {
        kxtest::write_file(old_acl, c.old_text);
        kxtest::write_file(new_acl, c.new_text);
        auto r = run_kxacl({"diff", old_acl, new_acl});
        EXPECT_EQ(r.exit_code, 0) << r.err;
        EXPECT_EQ(r.out, c.out) << c.old_text << "->" << c.new_text;
        EXPECT_EQ(run_kxacl({"diff", old_acl, new_acl, "--grants-more"}).exit_code, c.grants_more)
            << c.old_text << "->" << c.new_text;
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
    // Daemons read and cache the file all along.
    std::atomic<bool> done{false};
    std::thread readers([&] {
        while (!done)
            daemon_read(acl);
    });
    for (int version = 1; version <= 6; ++version) {
        const std::string text = "o " + std::string("rwcxCq").substr(0, version) + "\n";
        // The file in place was compiled and cached long after it was written
        // (forced past a cached file that a replacement left in force).
        kxtest::shift_mtime(acl, -30);
        const auto compiled = run_kxacl({"compile", acl, "--cache", "--force"});
        EXPECT_EQ(compiled.exit_code, 0) << compiled.err;
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
        const auto r = run_kxacl({"install", src, acl});
        EXPECT_EQ(r.exit_code, 0) << r.err;
        EXPECT_EQ(daemon_read(acl), (1 << version) - 1) << version;
    }
    done = true;
    readers.join();
}

TEST_F(KxaclTool, InstallGivesOwnerAndModeAndRefusesWhatDoesNotCompile) {
    const std::string src = dir + "/src.acl", dest = dir + "/dest.acl";
    kxtest::write_file(src, "o rw\n");
    auto r = run_kxacl({"install", src, dest, "--mode", "0640", "--cache"});
    ASSERT_EQ(r.exit_code, 0) << r.err;
    EXPECT_EQ(r.out, "installed " + src + " as " + dest + ": 1 entries, owner 0:0, mode 0640\n" +
                         "cached in " + dest + ".cacl\n");
    EXPECT_EQ(kxtest::status_of(dest).st_mode & 07777, 0640u);
    // The cached file serves readers at once.
    EXPECT_EQ(run_kxacl({"explain", dest}).out.rfind("answered from " + dest + ".cacl", 0), 0u);
    // Owner and mode stay DEST's unless given.
    ASSERT_EQ(::chown(dest.c_str(), 65534, 65534), 0);
    r = run_kxacl({"install", src, dest, "--json"});
    ASSERT_EQ(r.exit_code, 0) << r.err;
    EXPECT_EQ(parsed(r), json::parse("{\"source\":\"" + src + "\",\"file\":\"" + dest +
                                     "\",\"entries\":1,\"bytes\":5,\"uid\":65534,"
                                     "\"gid\":65534,\"mode\":\"0640\",\"cached\":false}"));

    const std::vector<std::pair<std::vector<std::string>, std::string>> refused = {
        {{"install", acl, dest, "--mode", "4755"},
         "kxacl: --mode takes permission bits up to "
         "0777, not 4755\n"},
        {{"install", acl, dir}, "kxacl: " + dir + " is not a regular file\n"},
        {{"install", acl, dest + ".cacl"},
         "kxacl: refusing to write " + dest +
             ".cacl: cached compiled files are written by the library only (use --cache)\n"},
    };
    for (const auto &[args, err] : refused) {
        r = run_kxacl(args);
        EXPECT_EQ(r.exit_code, 2);
        EXPECT_EQ(r.err, err);
    }
    kxtest::write_file(src, "o rw\ng\n");
    r = run_kxacl({"install", src, dest});
    EXPECT_EQ(r.exit_code, 2);
    EXPECT_EQ(r.err.rfind("2650-172 Failure", 0), 0u) << r.err;
    EXPECT_EQ(kxtest::read_file(dest), "o rw\n");
    EXPECT_EQ(kxtest::dir_entries(dir),
              (std::vector<std::string>{"dest.acl", "dest.acl.cacl", "res.acl", "src.acl"}));
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
                       "# planted problems\n"
                       "n rx\n"
                       "o rx\n"
                       "u unix root rwcxCqledvsao\n"
                       "u unix bob@fe80:0:0:0:0:0:0:1 rx\n"
                       "u unx ann@h rx\n"
                       "u unix carl@h r\n"
                       "g admins rwcxCqledvsao\n"
                       "e vgn2 svc@ rx\n",
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
    kxtest::write_file(acl, "o r\n");
    const std::string cacl = acl + ".cacl";
    const auto cache = [&] { ASSERT_EQ(run_kxacl({"compile", acl, "--cache"}).exit_code, 0); };
    struct {
        const char *code;
        std::function<void()> plant;
    } cases[] = {
        {nullptr, cache},
        {"KX202", [&] { ASSERT_EQ(::mkdir(cacl.c_str(), 0755), 0); }},
        {"KX203", [&] { kxtest::write_file(cacl, "", 0); }},
        {"KX204",
         [&] {
             cache();
             ASSERT_EQ(::chmod(cacl.c_str(), 0600), 0);
         }},
        {"KX205",
         [&] {
             cache();
             ASSERT_EQ(::link(cacl.c_str(), (dir + "/x").c_str()), 0);
         }},
        {"KX206",
         [&] {
             kxtest::write_file(cacl, "");
             kxtest::shift_mtime(cacl, 5);
         }},
        {"KX207",
         [&] {
             cache();
             kxtest::shift_mtime(acl, 20);
         }},
        {"KX208",
         [&] {
             cache();
             kxtest::set_mtime(acl, kxtest::status_of(cacl).st_mtim.tv_sec);
         }},
        {"KX209",
         [&] {
             cache();
             kxtest::write_file(acl, "o rw\n");
             kxtest::shift_mtime(acl, -20);
         }},
        {"KX210", [&] { kxtest::write_file(acl + ".0f3a", ""); }},
        {"KX210", [&] { kxtest::write_file(acl + ".kxacl-Ab12Cd", ""); }},
    };
    for (const auto &c : cases) {
        ::rmdir(cacl.c_str());
        for (const auto &name : kxtest::dir_entries(dir))
            if (name != "res.acl")
                ::unlink((dir + "/" + name).c_str());
        kxtest::write_file(acl, "o r\n");
        kxtest::shift_mtime(acl, -10);
        c.plant();
        EXPECT_EQ(lint_codes(acl),
                  c.code ? std::vector<std::string>{c.code} : std::vector<std::string>{})
            << (c.code ? c.code : "clean");
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

TEST_F(KxaclTool, LintIsSilentOnTheExampleFile) {
    kxtest::write_file(acl, kxtest::read_file(KXACL_EXAMPLE_ACL));
    kxtest::shift_mtime(acl, -10);
    for (int round = 0; round < 2; ++round) { // without and with its cached file
        const auto r = run_kxacl({"lint", acl});
        EXPECT_EQ(r.exit_code, 0) << r.out << r.err;
        EXPECT_EQ(r.out + r.err, "");
        ASSERT_EQ(run_kxacl({"compile", acl, "--cache"}).exit_code, 0);
    }
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
        ASSERT_EQ(run_kxacl({"add", buf, "--group", std::to_string(owner) + "g"}).exit_code, 0);
        EXPECT_EQ(kxtest::status_of(buf).st_mode & 07777, kept) << std::oct << mode;
    }
}

TEST_F(KxaclTool, AddRefusesATextFileAndReportsLibraryFailures) {
    auto r = run_kxacl({"add", acl, "--anyother"});
    EXPECT_EQ(r.exit_code, 2);
    EXPECT_EQ(r.err, "kxacl: " + acl + " is an ACL text file, not a compiled buffer file: " +
                         "compile it first with 'kxacl compile " + acl +
                         " -o BUFFER' and use BUFFER\n");
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
    // The default set has names too; each character is the library's own.
    const json listed = parsed(run_kxacl({"perms", "--json"}));
    ASSERT_EQ(listed["templates"].size(), 13u);
    EXPECT_EQ(listed["templates"][8], json::parse(R"({"char":"d","mask":256,"name":"define",
                                                      "help":"QBT define/undefine resource"})"));
    for (const json &t : listed["templates"])
        EXPECT_EQ(parsed(run_kxacl({"perms", "--json", t["char"]}))["mask"], t["mask"]);
}

TEST_F(KxaclTool, HelpAndUsageMistakes) {
    for (const char *cmd : {"compile", "check", "explain", "lint", "diff", "install", "list", "add",
                            "del", "dump", "perms"}) {
        const auto r = run_kxacl({cmd, "--help"});
        EXPECT_EQ(r.exit_code, 0);
        EXPECT_EQ(r.out.rfind(std::string("Usage: kxacl ") + cmd + " ", 0), 0u) << r.out;
    }
    EXPECT_EQ(run_kxacl({"--help"}).out.rfind("Usage: kxacl [--json] COMMAND", 0), 0u);
    EXPECT_EQ(run_kxacl({"--version"}).out, "kxacl 1.0.0\n");

    auto r = run_kxacl({"frobnicate"});
    EXPECT_EQ(r.exit_code, 2);
    EXPECT_EQ(r.err, "kxacl: unknown command 'frobnicate'\nTry 'kxacl --help'.\n");
    r = run_kxacl({"--json", "check", acl});
    EXPECT_EQ(parsed(r)["error"],
              json({{"kind", "usage"}, {"help", "kxacl check --help"}, {"message", r.err}}));
    r = run_kxacl({"--json", "check", dir, "--buffer", "--anyother"});
    EXPECT_EQ(parsed(r)["error"],
              json({{"kind", "tool"}, {"message", "kxacl: " + dir + " is not a regular file\n"}}));
    r = run_kxacl({"check", acl, "--user", "unix"});
    EXPECT_EQ(r.exit_code, 2);
    EXPECT_EQ(r.err, "kxacl: option --user needs a value\nTry 'kxacl check --help'.\n");
    r = run_kxacl({"list", dir + "/missing.acl", "--json"});
    EXPECT_EQ(r.exit_code, 2);
    EXPECT_EQ(parsed(r)["error"]["id"], "2650-135");
}

} // namespace
