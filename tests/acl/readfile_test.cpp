// sec_read_acl_file: the names it builds, what each ACL and CACL file comes
// to, owner rules with a user name, allocation failures and trace points.
#include <cerrno>
#include <cstdio>
#include <filesystem>
#include <pwd.h>
#include <tuple>

#include <kx_tr.h>
#include "file_helpers.h"

using namespace kxacl;
using namespace kxtest;
using items = std::vector<std::string>;

namespace {

// A relative name joins the working directory, a simple name with a user
// the user's home; a name with a path is refused before the user lookup.
TEST(ReadAclFile, PathsBuiltFromTheWorkingDirectoryOrTheHome) {
    // As getcwd gives it, whatever links lead to the temporary directory.
    const std::string dir = std::filesystem::canonical(temp_dir()).string();
    const std::string deep = path_of_length(dir, 3000), fits(1095, 'n');
    ASSERT_EQ(mkdir(deep.c_str(), 0755), 0);
    std::string longest(4097, 'a'); // not "/" + std::string: gcc 12 -O3 warns
    longest[0] = '/';
    const std::string home = getpwnam("root")->pw_dir, in_home(4095 - home.size(), 'n');
    const char *nobody = "kx-no-such-user";
    struct name_case {
        std::string what, cwd, file;
        const char *user;
        kx_int32_t status;
        int msg;
        std::vector<arg> args;
    };
    std::vector<name_case> cases = {
        // clang-format off
        {"relative", dir, "none", nullptr, SEC_S_NO_ACL_FILE, MSG_2650_135, {dir + "/none", ENOENT}},
        {"relative in /", "/", "kx-none-acl", nullptr, SEC_S_NO_ACL_FILE, MSG_2650_135,
         {"/kx-none-acl", ENOENT}},
        {"directory and name of 4096", deep, fits, nullptr, SEC_S_NO_ACL_FILE, MSG_2650_135,
         {deep + "/" + fits, ENAMETOOLONG}},
        {"directory and name of 4097", deep, fits + "n", nullptr, SEC_S_NO_ACL_FILE, MSG_2650_167,
         {deep, fits + "n"}},
        {"full path of 4097", "/", longest, nullptr, SEC_S_NO_ACL_FILE, MSG_2650_135,
         {longest, ENAMETOOLONG}},
        {"unknown user", "/", "acl", nobody, SEC_S_USER_NOT_FOUND, MSG_2650_140, {nobody}},
        {"path in the name", "/", "dir/acl", nobody, SEC_S_BAD_PARAM, MSG_2650_165, {"dir/acl", nobody}},
        {"home and name of 4096", "/", in_home, "root", SEC_S_NO_ACL_FILE, MSG_2650_135,
         {home + "/" + in_home, ENAMETOOLONG}},
        {"home and name of 4097", "/", in_home + "n", "root", SEC_S_BAD_PARAM, MSG_2650_165,
         {in_home + "n", "root"}},
        // clang-format on
    };
    std::optional<scoped_user> at_root; // whose home is "/"
    if (geteuid() == 0) {
        EXPECT_TRUE(at_root.emplace("/").ok);
        // clang-format off
        cases.push_back({"home /", "/", "kx-none-acl", at_root->name.c_str(), SEC_S_NO_ACL_FILE,
                         MSG_2650_135, {"/kx-none-acl", ENOENT}});
        // clang-format on
    }
    for (const auto &c : cases) {
        SCOPED_TRACE(c.what);
        ASSERT_EQ(chdir(c.cwd.c_str()), 0) << c.cwd;
        acl_read r(c.file, CACHE, c.user);
        EXPECT_EQ(r.status, c.status);
        EXPECT_TRUE(record_is(c.status, c.msg, c.args));
        EXPECT_TRUE(r.empty());
        EXPECT_EQ(r.rflags, CACHE);
    }
}
using prepare = std::function<void(const acl_dir &)>;
prepare cacl_of(const std::string &bytes, mode_t mode = 0644) {
    return [=](const acl_dir &d) { write_file(d.cacl, bytes, mode); }; // newer than the text
}
prepare truncated(off_t size) { // holes: bytes 0
    return [=](const acl_dir &d) { ASSERT_EQ(truncate(d.acl.c_str(), size), 0); };
}

// What a read hands back and the CACL file it leaves, which when written
// carries the text's owner, group and mode.
TEST(ReadAclFile, OutcomeOfEachAclAndCaclFile) {
    const std::string ex = example_acl(), n_r = compiled("n r\n"), garbage = "garbage";
    const std::string swapped(worked_example_swapped.begin(), worked_example_swapped.end());
    const std::string none = "<missing>";
    sec_perm_desc perms[2] = {{0x10, 'a', "alpha", "first"}, {0x20, 'b', "beta", "second"}};
    sec_perm_set_desc set{2, perms};
    const std::string ab("\x85\x01\x02\x01\x00\x11\0\0\0\x02\x01\0\0\0\0\x01\x30\0\0\0\0\0", 22);
    struct {
        const char *what;
        kx_uint32_t flags;
        kx_int32_t status;
        int msg;
        std::vector<arg> args; // "$" stands for the directory
        std::string bytes;
        kx_uint32_t rflags;
        std::string cacl;
        prepare setup = {};
        std::string text = example_text;
        const char *file = "acl";
        bool needs_root = false;
        sec_perm_set_t permtmpl = nullptr;
    } cases[] = {
        // clang-format off
        {"compiled", CONVERT, SEC_S_OK, 0, {}, ex, TEXT, none},
        {"comments only: nothing to cache", CACHE, SEC_S_OK, 0, {}, "", TEXT, none, {},
         "# nothing here\n\n   \t# at all\n"},
        {"unknown type", CACHE | CONVERT | 0x100, SEC_S_BAD_ACL, MSG_2650_179, {3, "x"}, "",
         TEXT | CACHE | 0x100, none, {}, "o r\ng staff rw\nx joe r\nn\n"},
        {"the caller's template", 0, SEC_S_OK, 0, {}, ab, TEXT, none, {}, "o ab\n", "acl", false, &set},
        {"outside the default template", 0, SEC_S_BAD_PERMISSION, MSG_2650_180, {1, "ab"}, "", TEXT,
         none, {}, "o ab\n"},
        {"duplicate entry", CACHE, SEC_S_BAD_ACLE, MSG_2650_175, {'g', "STAFF"}, "", TEXT | CACHE,
         none, {}, "g staff r\nu unix bob\ng STAFF w\n"},
        {"missing", CACHE | CONVERT, SEC_S_NO_ACL_FILE, MSG_2650_135, {"$/none", ENOENT}, "",
         CACHE | CONVERT, none, {}, example_text, "none"},
        {"a directory", 0, SEC_S_NO_ACL_FILE, MSG_2650_135, {"$/.", 0}, "", 0, none, {},
         example_text, "."},
        {"over the size limit: refused unread", CACHE, SEC_S_FILE_ERROR, MSG_2650_139,
         {0, SEC_ACL_TEXT_MAX_SIZE + 1LL, EFBIG}, "", TEXT | CACHE, none,
         truncated(SEC_ACL_TEXT_MAX_SIZE + 1), ""},
        {"at the limit: read up to the first NUL", TEXT, SEC_S_OK, 0, {}, "", TEXT, none,
         truncated(SEC_ACL_TEXT_MAX_SIZE), ""},
        {"empty: the CACL file is not looked at", CACHE | 0x100, SEC_S_OK, 0, {}, "", CACHE | 0x100,
         ex, cacl_of(ex), ""},
        {"compiled and cached, set-id bit and all", CACHE, SEC_S_OK, 0, {}, ex, TEXT | CACHE, ex,
         [](const acl_dir &d) { ASSERT_EQ(chmod(d.acl.c_str(), 04640), 0); }},
        {"cached", CACHE, SEC_S_OK, 0, {}, ex, 0, ex, [](const acl_dir &d) { acl_read(d.acl, CACHE); }},
        {"CACL file of the same second: stale, replaced", CACHE, SEC_S_OK, 0, {}, ex,
         TEXT | CACHE, ex, [&](const acl_dir &d) {
             write_file(d.cacl, garbage);
             set_mtime(d.acl, 1700000000);
             set_mtime(d.cacl, 1700000000);
         }},
        {"empty CACL file: stale", 0, SEC_S_OK, 0, {}, ex, TEXT, "", cacl_of("")},
        {"newer: not replaced", TEXT | CACHE, SEC_S_OK, 0, {}, ex, TEXT, garbage, cacl_of(garbage)},
        {"garbage, unchecked without 0x4", 0, SEC_S_OK, 0, {}, garbage, 0, garbage,
         cacl_of(garbage)},
        {"garbage, refused with 0x4", CONVERT, SEC_S_OK, 0, {}, ex, TEXT, garbage, cacl_of(garbage)},
        {"the other byte order, converted with 0x4", CONVERT, SEC_S_OK, 0, {}, ex, CONVERT,
         swapped, cacl_of(swapped)},
        {"another mode: neither used nor replaced", CACHE, SEC_S_OK, 0, {}, ex, TEXT, garbage,
         cacl_of(garbage, 0600)},
        {"hard-linked from elsewhere", 0, SEC_S_OK, 0, {}, ex, TEXT, garbage, [&](const acl_dir &d) {
             write_file(d.cacl, garbage);
             ASSERT_EQ(link(d.cacl.c_str(), (d.dir + "/elsewhere").c_str()), 0);
         }},
        {"a symbolic link, never followed", CACHE, SEC_S_OK, 0, {}, ex, TEXT, "n r\n",
         [](const acl_dir &d) {
             write_file(d.dir + "/target", "n r\n"); // newer, same owner and mode
             ASSERT_EQ(symlink((d.dir + "/target").c_str(), d.cacl.c_str()), 0);
         }},
        {"another owner: neither used nor replaced", CACHE, SEC_S_OK, 0, {}, n_r, TEXT, ex,
         [&](const acl_dir &d) {
             write_file(d.cacl, ex);
             ASSERT_EQ(chown(d.cacl.c_str(), 65534, 65534), 0);
         }, "n r\n", "acl", true},
        {"the text's owner given to the CACL file", CACHE, SEC_S_OK, 0, {}, ex, TEXT | CACHE, ex,
         [](const acl_dir &d) { ASSERT_EQ(chown(d.acl.c_str(), 65534, 65533), 0); },
         example_text, "acl", true},
        // clang-format on
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.what);
        if (c.needs_root && geteuid() != 0)
            continue;
        acl_dir d(c.text);
        if (c.setup)
            c.setup(d);
        acl_read r(d.dir + "/" + c.file, c.flags, nullptr, c.permtmpl);
        EXPECT_EQ(r.status, c.status);
        EXPECT_TRUE(record_is(c.status, c.msg, in_dir(d.dir, c.args)));
        EXPECT_EQ(r.bytes(), c.bytes);
        EXPECT_EQ(r.bytes().empty(), r.empty());
        EXPECT_EQ(r.rflags, c.rflags);
        EXPECT_EQ(read_file(d.cacl), c.cacl);
        if (c.status == SEC_S_OK && (r.rflags & (TEXT | CACHE)) == (TEXT | CACHE)) {
            struct stat a = status_of(d.acl), k = status_of(d.cacl);
            EXPECT_EQ(std::tie(k.st_mode, k.st_uid, k.st_gid),
                      std::tie(a.st_mode, a.st_uid, a.st_gid));
        }
        for (const auto &name : dir_entries(d.dir)) // no temporary file left
            EXPECT_TRUE(name.rfind("acl.", 0) != 0 || name == "acl.cacl") << name;
    }
}

// Taken temporary names are drawn again, never followed; with all taken
// nothing is cached and the place holder goes again.
TEST(ReadAclFile, TakenTemporaryNames) {
    acl_dir d;
    const std::string target = d.dir + "/target";
    write_file(target, "target bytes");
    for (unsigned first : {0u, 1u}) {
        SCOPED_TRACE(first ? "all taken" : "half taken");
        char suffix[8];
        for (unsigned n = first; n < 0x10000; n += 2) {
            std::snprintf(suffix, sizeof suffix, ".%04x", n);
            ASSERT_EQ(symlink(target.c_str(), (d.acl + suffix).c_str()), 0);
        }
        acl_read r(d.acl, TEXT | CACHE);
        EXPECT_EQ(r.status, SEC_S_OK);
        EXPECT_EQ(r.rflags, first ? TEXT : TEXT | CACHE);
        EXPECT_EQ(read_file(d.cacl), first ? "<missing>" : example_acl());
        EXPECT_EQ(dir_entries(d.dir).size(), first ? 0x10000u + 2 : 0x8000u + 3);
        EXPECT_EQ(read_file(target), "target bytes");
        unlink(d.cacl.c_str());
    }
}

// 4089 characters is the longest path whose CACL file is written and read.
TEST(ReadAclFile, LongestCachedPathIsReused) {
    std::string base = temp_dir();
    for (std::size_t length : {4089u, 4090u, 4092u}) {
        SCOPED_TRACE(length);
        std::string under = base + "/" + std::to_string(length);
        ASSERT_EQ(mkdir(under.c_str(), 0755), 0);
        std::string path = path_of_length(under, length);
        write_file(path, example_text);
        shift_mtime(path, -10);
        bool cached = length == 4089;
        acl_read first(path, CACHE);
        ASSERT_EQ(first.status, SEC_S_OK);
        EXPECT_EQ(first.rflags, cached ? TEXT | CACHE : TEXT);
        EXPECT_TRUE(record_is(SEC_S_OK, 0, {}));
        acl_read second(path, CACHE);
        ASSERT_EQ(second.status, SEC_S_OK);
        EXPECT_EQ(second.rflags, cached ? 0u : TEXT);
        EXPECT_EQ(second.bytes(), example_acl());
        EXPECT_EQ(dir_entries(path.substr(0, path.rfind('/'))).size(), cached ? 2u : 1u);
    }
}

// With a user name the file must be the user's and writable by nobody
// else unless empty; also when root's is swapped in before the opening.
TEST(ReadAclFile, UsersFileRules) {
    KXTEST_REQUIRE_ROOT();
    std::string home = temp_dir();
    scoped_user user(home);
    if (!user.ok)
        GTEST_SKIP() << "SKIPPED: useradd failed";
    const uid_t uid = getpwnam(user.name.c_str())->pw_uid;
    struct {
        const char *what, *text;
        bool users;
        mode_t mode;
        kx_uint32_t flags;
        kx_int32_t status;
        kx_uint32_t rflags;
        const char *swapped_in = nullptr;
    } cases[] = {
        {"root's", example_text, false, 0644, CACHE, SEC_S_BAD_PERMISSION, CACHE},
        {"the user's", example_text, true, 0644, 0, SEC_S_OK, TEXT},
        {"group-writable", example_text, true, 0664, 0, SEC_S_BAD_PERMISSION, 0},
        {"writable by others", example_text, true, 0646, 0, SEC_S_BAD_PERMISSION, 0},
        {"empty, root's, writable by all", "", false, 0666, CACHE, SEC_S_OK, CACHE},
        {"root's swapped in", example_text, true, 0644, TEXT, SEC_S_BAD_PERMISSION, TEXT, "o r\n"},
        {"root's empty file swapped in", example_text, true, 0644, TEXT, SEC_S_BAD_PERMISSION, TEXT,
         ""},
    };
    const std::string acl = home + "/acl", staged = home + "/staged";
    for (const auto &c : cases) {
        SCOPED_TRACE(c.what);
        write_file(acl, c.text, c.mode);
        ASSERT_EQ(chown(acl.c_str(), c.users ? uid : 0, static_cast<gid_t>(-1)), 0);
        std::function<void()> swap = [&] { EXPECT_EQ(rename(staged.c_str(), acl.c_str()), 0); };
        if (c.swapped_in) {
            write_file(staged, c.swapped_in);
            flip_before(sys_call::open, 0, &swap);
        }
        acl_read r("acl", c.flags, user.name.c_str());
        EXPECT_EQ(sys_fault_fired(), c.swapped_in != nullptr);
        EXPECT_EQ(r.status, c.status);
        EXPECT_TRUE(c.status == SEC_S_OK ? record_is(SEC_S_OK, 0, {})
                                         : record_is(c.status, MSG_2650_141, {acl, user.name}));
        EXPECT_EQ(r.bytes(), *c.text && c.status == SEC_S_OK ? example_acl() : "");
        EXPECT_EQ(r.rflags, c.rflags);
    }
}

TEST(ReadAclFile, EveryAllocationFailureIsReported) {
    acl_dir d("u unix bob rw\nu unix ann r\ng staff r\ng wheel rw\no r\ne krb x@Y w\n");
    const std::string text = read_file(d.acl), expected = compiled(text);
    int failures = 0;
    for (long n = 0; n < 1000; ++n) {
        SCOPED_TRACE(n);
        mem_fail_after(n);
        acl_read r(d.acl, CACHE);
        mem_fail_after(-1);
        if (r.status == SEC_S_OK) {
            EXPECT_EQ(r.bytes(), expected);
            EXPECT_EQ(r.rflags, TEXT | CACHE);
            break;
        }
        ++failures;
        EXPECT_EQ(r.status, SEC_S_NO_MEMORY);
        EXPECT_EQ(last_error().msg_num, MSG_2650_102);
        if (n == 0) { // the window over the text, which it holds whole
            EXPECT_TRUE(record_is(SEC_S_NO_MEMORY, MSG_2650_102,
                                  {"sec_read_acl_file", static_cast<long long>(text.size() + 1)}));
        }
        EXPECT_TRUE(r.empty());
        EXPECT_EQ(r.rflags, TEXT | CACHE);
        EXPECT_EQ(dir_entries(d.dir), (std::vector<std::string>{"acl"}));
    }
    EXPECT_GE(failures, 8) << "the file, the trees, their entries and the buffer";
    // The work buffer of the user lookup: twice the recommended size.
    const long long recommended = sysconf(_SC_GETPW_R_SIZE_MAX);
    mem_fail_after(0);
    acl_read r("acl", CACHE, "root");
    mem_fail_after(-1);
    EXPECT_EQ(r.status, SEC_S_NO_MEMORY);
    EXPECT_TRUE(record_is(SEC_S_NO_MEMORY, MSG_2650_102,
                          {"sec__get_user_info", 2 * (recommended > 0 ? recommended : 16384)}));
    EXPECT_TRUE(r.empty());
}

// At Info 1: an empty file, a compile that caches, a cached read, and reads
// beside a CACL file of another mode and beside a symbolic link.
TEST(ReadAclFileTrace, InfoPoints) {
    std::string trace = start_tracing("_SEL:Info=1");
    acl_dir empty(""), d, foreign, linked;
    write_file(empty.cacl, example_acl());
    write_file(foreign.cacl, "x", 0600);
    ASSERT_EQ(symlink("/dev/null", linked.cacl.c_str()), 0);
    ASSERT_EQ(acl_read(empty.acl, CACHE).status, SEC_S_OK);
    ASSERT_EQ(acl_read(d.acl, CACHE).status, SEC_S_OK);
    ASSERT_EQ(acl_read(d.acl, CACHE).status, SEC_S_OK);
    ASSERT_EQ(acl_read(foreign.acl, 0).status, SEC_S_OK);
    ASSERT_EQ(acl_read(linked.acl, 0).status, SEC_S_OK);
    auto records = read_trace(trace);
    ASSERT_EQ(trace_ids(trace), (std::vector<unsigned>{116, 117, 118, 121, 110, 117, 121, 117, 120,
                                                       121, 117, 120, 121}));
    EXPECT_EQ(records[0].items, (items{hex_text(empty.acl)}));
    EXPECT_EQ(records[1].items, (items{hex_text(d.cacl)}));
    EXPECT_EQ(records[2].items, (items{hex_text(d.cacl), hex_of(ENOENT)}));
    EXPECT_EQ(records[3].items, (items{hex_text(d.acl)}));
    EXPECT_EQ(records[6].items, (items{hex_text(d.cacl)}));
    ASSERT_EQ(records[8].items.size(), 7u);
    EXPECT_EQ(records[8].items[0], hex_text(foreign.acl));
    EXPECT_EQ(records[8].items[5], hex_of(kx_uint32_t{S_IFREG | 0644}));
    EXPECT_EQ(records[8].items[6], hex_of(kx_uint32_t{S_IFREG | 0600}));
    EXPECT_EQ(records[11].items[6], hex_of(kx_uint32_t{S_IFLNK | 0777}));
}

} // namespace
