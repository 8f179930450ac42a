// sec_read_acl_file: arguments, the outcome table, the cache cycle, owner
// rules with a user name, concurrent replacement, allocation failures and
// trace points.
#include <atomic>
#include <cerrno>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <functional>
#include <mutex>
#include <pwd.h>
#include <string>
#include <thread>
#include <variant>
#include <vector>

#include <gtest/gtest.h>

#include <kx_acl.h>
#include <kx_tr.h>

#include "alloc.h"
#include "file_helpers.h"
#include "messages.h"
#include "support.h"

using namespace kxacl;
using kxtest::acl_dir;
using kxtest::acl_read;
using kxtest::CACHE;
using kxtest::CONVERT;
using kxtest::dir_entries;
using kxtest::example_acl;
using kxtest::hex_of;
using kxtest::hex_text;
using kxtest::last_error;
using kxtest::record_is;
using kxtest::TEXT;
using kxtest::unset;
using names = std::vector<std::string>;
using items = std::vector<std::string>;

namespace {

// The buffer compiled from text.
std::string compiled(const std::string &text) {
    acl_dir d(text);
    acl_read r(d.acl, TEXT);
    EXPECT_EQ(r.status, SEC_S_OK);
    return r.bytes();
}

void expect_no_error() {
    EXPECT_EQ(last_error().id, 0) << last_error().text;
}

// A user made for one test, with home as its home directory.
struct test_user {
    std::string home = kxtest::temp_dir();
    kxtest::scoped_user user{home};
};

// ---- arguments and the ACL file ------------------------------------------

TEST(ReadAclFile, BadArgumentsLeaveAclUntouchedAndHandBackTheFlags) {
    sec_buffer_s acl{7, reinterpret_cast<void *>(8)};
    kx_uint32_t rflags = unset;
    EXPECT_EQ(sec_read_acl_file(nullptr, nullptr, nullptr, 0x105, &acl, &rflags), SEC_S_BAD_PARAM);
    EXPECT_TRUE(record_is(SEC_S_BAD_PARAM, MSG_2650_101, {"sec_read_acl_file", 1, 0}));
    EXPECT_EQ(rflags, 0x105u);
    EXPECT_EQ(acl.length, 7);

    EXPECT_EQ(sec_read_acl_file("acl", nullptr, nullptr, 2, nullptr, &rflags), SEC_S_BAD_PARAM);
    EXPECT_TRUE(record_is(SEC_S_BAD_PARAM, MSG_2650_101, {"sec_read_acl_file", 5, 0}));
    EXPECT_EQ(rflags, 2u);

    EXPECT_EQ(sec_read_acl_file("acl", "", nullptr, 3, &acl, &rflags), SEC_S_BAD_PARAM);
    EXPECT_TRUE(record_is(SEC_S_BAD_PARAM, MSG_2650_134, {}));
    EXPECT_EQ(rflags, 3u);
    EXPECT_EQ(acl.length, 7);
}

TEST(ReadAclFile, MissingOrNonRegularFileIsNoAclFile) {
    acl_dir d;
    acl_read missing(d.dir + "/none", CACHE | CONVERT);
    EXPECT_EQ(missing.status, SEC_S_NO_ACL_FILE);
    EXPECT_TRUE(missing.empty());
    EXPECT_EQ(missing.rflags, CACHE | CONVERT);
    EXPECT_TRUE(record_is(SEC_S_NO_ACL_FILE, MSG_2650_135, {d.dir + "/none", ENOENT}));

    EXPECT_EQ(acl_read(d.dir, 0).status, SEC_S_NO_ACL_FILE);
    EXPECT_TRUE(record_is(SEC_S_NO_ACL_FILE, MSG_2650_135, {d.dir, 0}));

    acl_read unresolved("acl", CACHE, "kx-no-such-user");
    EXPECT_EQ(unresolved.status, SEC_S_USER_NOT_FOUND);
    EXPECT_TRUE(unresolved.empty());
    EXPECT_EQ(unresolved.rflags, CACHE);
}

TEST(ReadAclFile, EmptyFileIsTheEmptyAclWithoutLookingAtTheCaclFile) {
    std::string trace = kxtest::start_tracing("_SEL:Info=1");
    acl_dir d("");
    kxtest::write_file(d.cacl, example_acl());
    acl_read r(d.acl, CACHE | 0x100);
    EXPECT_EQ(r.status, SEC_S_OK);
    EXPECT_TRUE(r.empty());
    EXPECT_EQ(r.rflags, CACHE | 0x100);
    EXPECT_EQ(kxtest::trace_ids(trace), (std::vector<unsigned>{116}));
}

// Compiling texts: what comes back, the flags handed back (0x4 is cleared
// once compiling begins, 0x2 when nothing is cached), the record, and that
// only a compiled ACL with entries is cached.
TEST(ReadAclFile, CompilesTheTextIntoTheBuffer) {
    struct {
        const char *text;
        kx_uint32_t flags;
        kx_int32_t status;
        std::string bytes;
        kx_uint32_t rflags;
        int msg_num;
        std::vector<kxtest::arg> args;
        names files;
    } cases[] = {
        // clang-format off
        {kxtest::example_text, CONVERT, SEC_S_OK, example_acl(), TEXT, 0, {}, {"acl"}},
        {"# nothing here\n\n   \t# at all\n", CACHE, SEC_S_OK, "", TEXT, 0, {}, {"acl"}},
        {"o r\ng staff rw\nx joe r\nn\n", CACHE | CONVERT | 0x100, SEC_S_BAD_ACL, "",
         TEXT | CACHE | 0x100, MSG_2650_179, {3, "x"}, {"acl"}},
        {"g staff r\nu unix bob\ng STAFF w\n", CACHE, SEC_S_BAD_ACLE, "", TEXT | CACHE,
         MSG_2650_175, {'g', "STAFF"}, {"acl"}},
        // clang-format on
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.text);
        acl_dir d(c.text);
        acl_read r(d.acl, c.flags);
        EXPECT_EQ(r.status, c.status);
        EXPECT_EQ(hex_of(r.bytes().data(), r.bytes().size()),
                  hex_of(c.bytes.data(), c.bytes.size()));
        EXPECT_EQ(r.bytes().empty(), r.empty());
        EXPECT_EQ(r.rflags, c.rflags);
        EXPECT_TRUE(record_is(c.status, c.msg_num, c.args));
        EXPECT_EQ(dir_entries(d.dir), c.files);
    }
}

TEST(ReadAclFile, PermissionsUseTheCallersTemplates) {
    sec_perm_desc perms[2] = {{0x10, 'a', "alpha", "first"}, {0x20, 'b', "beta", "second"}};
    sec_perm_set_desc set{2, perms};
    acl_dir d("o ab\n");
    acl_read r(d.acl, 0, nullptr, &set);
    ASSERT_EQ(r.status, SEC_S_OK);
    ASSERT_EQ(r.acl.length, 22);
    EXPECT_EQ(hex_of(static_cast<char *>(r.acl.value) + 16, 4), "30000000");

    acl_read refused(d.acl, 0);
    EXPECT_EQ(refused.status, SEC_S_BAD_PERMISSION);
    EXPECT_TRUE(record_is(SEC_S_BAD_PERMISSION, MSG_2650_180, {1, "ab"}));
}

TEST(ReadAclFile, UnreadableTextFailsWith137) {
    KXTEST_REQUIRE_ROOT();
    acl_dir d("o r\n", 0600);
    ASSERT_EQ(chmod(d.dir.c_str(), 0755), 0);
    int code = kxtest::exit_code_as_user(65534, 65534, [&] {
        acl_read r(d.acl, CACHE | CONVERT);
        auto e = last_error();
        if (r.status != SEC_S_FILE_ERROR || e.msg_num != MSG_2650_137 || e.str(0) != d.acl ||
            e.num(1) != EACCES)
            return 1;
        return r.rflags == (TEXT | CACHE | CONVERT) && r.empty() ? 0 : 2;
    });
    EXPECT_EQ(code, 0);
}

// ---- the cache cycle -----------------------------------------------------

TEST(ReadAclFileCache, WrittenThenReusedByteForByte) {
    acl_dir d;
    acl_read first(d.acl, CACHE);
    ASSERT_EQ(first.status, SEC_S_OK);
    EXPECT_EQ(first.rflags, TEXT | CACHE);
    EXPECT_EQ(kxtest::read_file(d.cacl), first.bytes());
    EXPECT_EQ(dir_entries(d.dir), (names{"acl", "acl.cacl"}));

    acl_read second(d.acl, CACHE);
    ASSERT_EQ(second.status, SEC_S_OK);
    EXPECT_EQ(second.rflags, 0u);
    EXPECT_EQ(second.bytes(), first.bytes());

    acl_read converted(d.acl, CACHE | CONVERT | 0x100);
    ASSERT_EQ(converted.status, SEC_S_OK);
    EXPECT_EQ(converted.rflags, CONVERT | 0x100);
    EXPECT_EQ(converted.bytes(), first.bytes());
}

TEST(ReadAclFileCache, TouchedAclFileIsCompiledAgain) {
    acl_dir d;
    acl_read first(d.acl, CACHE);
    ASSERT_EQ(first.status, SEC_S_OK);
    kxtest::write_file(d.acl, "n r\n");
    kxtest::shift_mtime(d.acl, 100); // later than the CACL file
    acl_read second(d.acl, CACHE);
    ASSERT_EQ(second.status, SEC_S_OK);
    EXPECT_EQ(second.rflags, TEXT | CACHE);
    EXPECT_EQ(second.bytes(), compiled("n r\n"));
    EXPECT_EQ(kxtest::read_file(d.cacl), second.bytes()) << "the stale CACL file is replaced";
}

// A file at the CACL name that is not to be trusted, or not without
// checking: what the read gives, the flags it hands back, and the file
// that stays at the CACL name.
TEST(ReadAclFileCache, CaclFilesThatAreNotTrusted) {
    const std::string swapped(kxtest::worked_example_swapped.begin(),
                              kxtest::worked_example_swapped.end());
    auto garbage = [](const acl_dir &d) { kxtest::write_file(d.cacl, "garbage"); };
    struct {
        const char *what;
        std::function<void(const acl_dir &)> prepare;
        kx_uint32_t flags;
        std::string bytes;
        kx_uint32_t rflags;
        std::string cacl;
    } cases[] = {
        // clang-format off
        {"changed in the same second", [&](const acl_dir &d) {
             garbage(d);
             kxtest::set_mtime(d.acl, 1700000000);
             kxtest::set_mtime(d.cacl, 1700000000);
         }, 0, example_acl(), TEXT, "garbage"},
        {"newer, yet the text flag compiles", garbage, TEXT, example_acl(), TEXT, "garbage"},
        {"newer, so nothing is cached", garbage, TEXT | CACHE, example_acl(), TEXT, "garbage"},
        {"another mode: the refused write clears 0x2", [](const acl_dir &d) {
             kxtest::write_file(d.cacl, "garbage", 0600);
         }, CACHE, example_acl(), TEXT, "garbage"},
        {"garbage, unchecked without 0x4", garbage, 0, "garbage", 0, "garbage"},
        {"garbage, refused with 0x4", garbage, CONVERT, example_acl(), TEXT, "garbage"},
        {"the other byte order, converted with 0x4", [&](const acl_dir &d) {
             kxtest::write_file(d.cacl, swapped);
         }, CONVERT, example_acl(), CONVERT, swapped},
        {"hard-linked from elsewhere", [&](const acl_dir &d) {
             garbage(d);
             ASSERT_EQ(link(d.cacl.c_str(), (d.dir + "/elsewhere").c_str()), 0);
         }, 0, example_acl(), TEXT, "garbage"},
        {"a symbolic link, never followed", [](const acl_dir &d) {
             kxtest::write_file(d.dir + "/target", "n r\n"); // newer, same owner and mode
             ASSERT_EQ(symlink((d.dir + "/target").c_str(), d.cacl.c_str()), 0);
         }, CACHE, example_acl(), TEXT, "n r\n"},
        // clang-format on
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.what);
        acl_dir d;
        c.prepare(d);
        acl_read r(d.acl, c.flags);
        ASSERT_EQ(r.status, SEC_S_OK);
        EXPECT_EQ(hex_of(r.bytes().data(), r.bytes().size()),
                  hex_of(c.bytes.data(), c.bytes.size()));
        EXPECT_EQ(r.rflags, c.rflags);
        expect_no_error();
        EXPECT_EQ(kxtest::read_file(d.cacl), c.cacl);
    }
}

TEST(ReadAclFileCache, CaclFileOfAnotherOwnerIsNeitherUsedNorReplaced) {
    KXTEST_REQUIRE_ROOT();
    acl_dir d("n r\n");
    kxtest::write_file(d.cacl, example_acl());
    ASSERT_EQ(chown(d.cacl.c_str(), 65534, 65534), 0);
    acl_read r(d.acl, CACHE);
    ASSERT_EQ(r.status, SEC_S_OK);
    EXPECT_EQ(r.bytes(), compiled("n r\n"));
    EXPECT_EQ(r.rflags, TEXT);
    expect_no_error();
    EXPECT_EQ(kxtest::read_file(d.cacl), example_acl());
    EXPECT_EQ(kxtest::status_of(d.cacl).st_uid, 65534u);
}

// A path of 4089 characters is the longest whose CACL file is written and
// then read; longer ones are compiled each time and leave no record.
TEST(ReadAclFileCache, LongestCachedPathIsReused) {
    std::string base = kxtest::temp_dir();
    for (std::size_t length : {4089u, 4090u, 4092u}) {
        SCOPED_TRACE(length);
        std::string under = base + "/" + std::to_string(length);
        ASSERT_EQ(mkdir(under.c_str(), 0755), 0);
        std::string path = kxtest::path_of_length(under, length);
        kxtest::write_file(path, kxtest::example_text);
        kxtest::shift_mtime(path, -10);
        bool cached = length == 4089;
        acl_read first(path, CACHE);
        ASSERT_EQ(first.status, SEC_S_OK);
        EXPECT_EQ(first.rflags, cached ? TEXT | CACHE : TEXT);
        expect_no_error();
        acl_read second(path, CACHE);
        ASSERT_EQ(second.status, SEC_S_OK);
        EXPECT_EQ(second.rflags, cached ? 0u : TEXT);
        EXPECT_EQ(second.bytes(), example_acl());
    }
}

// ---- owner rules with a user name -----------------------------------------

TEST(ReadAclFileUser, FileMustBeTheUsersAndWritableByNobodyElse) {
    KXTEST_REQUIRE_ROOT();
    test_user t;
    if (!t.user.ok())
        GTEST_SKIP() << "SKIPPED: useradd failed";
    const char *name = t.user.name().c_str();
    std::string acl = t.home + "/acl";
    kxtest::write_file(acl, kxtest::example_text, 0644);

    acl_read not_owned("acl", CACHE, name);
    EXPECT_EQ(not_owned.status, SEC_S_BAD_PERMISSION);
    EXPECT_TRUE(record_is(SEC_S_BAD_PERMISSION, MSG_2650_141, {acl, t.user.name()}));
    EXPECT_EQ(not_owned.rflags, CACHE);

    ASSERT_EQ(chown(acl.c_str(), getpwnam(name)->pw_uid, static_cast<gid_t>(-1)), 0);
    acl_read owned("acl", 0, name);
    ASSERT_EQ(owned.status, SEC_S_OK);
    EXPECT_EQ(owned.bytes(), example_acl());

    for (mode_t mode : {0664, 0646}) {
        ASSERT_EQ(chmod(acl.c_str(), mode), 0);
        acl_read writable("acl", 0, name);
        EXPECT_EQ(writable.status, SEC_S_BAD_PERMISSION) << std::oct << mode;
        EXPECT_TRUE(record_is(SEC_S_BAD_PERMISSION, MSG_2650_141, {acl, t.user.name()}));
        EXPECT_TRUE(writable.empty());
    }
}

TEST(ReadAclFileUser, EmptyFileSucceedsWhateverItsOwnerAndMode) {
    KXTEST_REQUIRE_ROOT();
    test_user t;
    if (!t.user.ok())
        GTEST_SKIP() << "SKIPPED: useradd failed";
    kxtest::write_file(t.home + "/acl", "", 0666); // root's, writable by all
    acl_read r("acl", CACHE, t.user.name().c_str());
    EXPECT_EQ(r.status, SEC_S_OK);
    EXPECT_TRUE(r.empty());
    EXPECT_EQ(r.rflags, CACHE);
}

// ---- concurrency ----------------------------------------------------------

TEST(ReadAclFileConcurrency, ReadersSeeOneWholeVersionWhileTheFileIsReplaced) {
    const std::string text_a = kxtest::example_text;
    const std::string text_b = "n rwx\ne unix joe w\ne unix ann r\n";
    const std::string acl_a = compiled(text_a), acl_b = compiled(text_b);
    ASSERT_NE(acl_a, acl_b);
    acl_dir d(text_a);
    std::string staged = d.dir + "/staged";
    time_t now = time(nullptr);

    std::atomic<bool> done{false};
    std::thread writer([&] {
        for (int i = 0; i < 400; ++i) {
            bool b = i % 2 != 0;
            kxtest::write_file(staged, b ? text_b : text_a);
            // B lies ahead of any CACL file written now, so that readers
            // compile it each time; A lies behind, so that they take the
            // CACL file written for either.
            kxtest::set_mtime(staged, b ? now + 100 : now - 100);
            ASSERT_EQ(rename(staged.c_str(), d.acl.c_str()), 0);
        }
        done = true;
    });
    std::vector<std::thread> readers;
    std::atomic<int> reads{0}, wrong{0}, failed{0};
    std::string first_failure;
    std::mutex failure_lock;
    for (int t = 0; t < 3; ++t)
        readers.emplace_back([&] {
            while (!done) {
                acl_read r(d.acl, CACHE | CONVERT);
                ++reads;
                if (r.status != SEC_S_OK) {
                    std::lock_guard<std::mutex> hold(failure_lock);
                    if (failed++ == 0)
                        first_failure = last_error().text;
                } else if (r.bytes() != acl_a && r.bytes() != acl_b) {
                    ++wrong;
                }
            }
        });
    writer.join();
    for (auto &r : readers)
        r.join();
    EXPECT_GT(reads.load(), 0);
    EXPECT_EQ(wrong.load(), 0);
    EXPECT_EQ(failed.load(), 0) << first_failure;
    for (const auto &n : dir_entries(d.dir))
        EXPECT_TRUE(n == "acl" || n == "acl.cacl") << n;
}

// ---- allocation failures ---------------------------------------------------

TEST(ReadAclFileMemory, EveryAllocationFailureOnTheCompilePathIsReported) {
    acl_dir d("u unix bob rw\nu unix ann r\ng staff r\ng wheel rw\no r\ne krb x@Y w\n");
    const std::string expected = compiled(kxtest::read_file(d.acl));
    int failures = 0;
    for (long n = 0; n < 1000; ++n) {
        mem_fail_after(n);
        acl_read r(d.acl, CACHE);
        mem_fail_after(-1);
        if (r.status == SEC_S_OK) {
            EXPECT_EQ(r.bytes(), expected);
            EXPECT_EQ(r.rflags, TEXT | CACHE);
            break;
        }
        ++failures;
        EXPECT_EQ(r.status, SEC_S_NO_MEMORY) << n;
        EXPECT_EQ(last_error().msg_num, MSG_2650_102) << n;
        EXPECT_TRUE(r.empty()) << n;
        EXPECT_EQ(r.rflags, TEXT | CACHE) << n;
        EXPECT_EQ(dir_entries(d.dir), (names{"acl"})) << n;
    }
    EXPECT_GE(failures, 8) << "the file, the trees, their entries and the buffer";
}

// ---- trace points ----------------------------------------------------------

TEST(ReadAclFileTrace, InfoPointsOfACompileAndOfACachedRead) {
    std::string trace = kxtest::start_tracing("_SEL:Info=1");
    acl_dir d;
    acl_read first(d.acl, CACHE);
    ASSERT_EQ(first.status, SEC_S_OK);
    acl_read second(d.acl, CACHE);
    ASSERT_EQ(second.status, SEC_S_OK);
    auto records = kxtest::read_trace(trace);
    // 117 examine, 118 absent, 121 open the text, 110 cache absent;
    // then 117 examine, 121 open the CACL file.
    ASSERT_EQ(kxtest::trace_ids(trace), (std::vector<unsigned>{117, 118, 121, 110, 117, 121}));
    EXPECT_EQ(records[0].items, (items{hex_text(d.cacl)}));
    EXPECT_EQ(records[1].items[1], hex_of(ENOENT));
    EXPECT_EQ(records[2].items, (items{hex_text(d.acl)}));
    EXPECT_EQ(records[5].items, (items{hex_text(d.cacl)}));
}

TEST(ReadAclFileTrace, ForeignCaclFileIsTracedWithBothOwnersAndModes) {
    std::string trace = kxtest::start_tracing("_SEL:Info=1");
    acl_dir d;
    kxtest::write_file(d.cacl, "x", 0600);
    acl_read r(d.acl, 0);
    ASSERT_EQ(r.status, SEC_S_OK);
    auto records = kxtest::read_trace(trace);
    ASSERT_GE(records.size(), 2u);
    EXPECT_EQ(records[1].id, 120u);
    ASSERT_EQ(records[1].items.size(), 7u);
    EXPECT_EQ(records[1].items[0], hex_text(d.acl));
    EXPECT_EQ(records[1].items[5], hex_of(kx_uint32_t{S_IFREG | 0644}));
    EXPECT_EQ(records[1].items[6], hex_of(kx_uint32_t{S_IFREG | 0600}));
}

// The API points carry the arguments and the line reached; at Info 8 every
// consumed line is traced with its number, type, mechanism, identity and mask.
TEST(ReadAclFileTrace, ApiPointsCarryTheArgumentsAndTheLineReached) {
    std::string trace = kxtest::start_tracing("_SEL:API=8,Info=8");
    acl_dir d("o r\n# c\ng staff rw\n");
    sec_buffer_s acl{0, nullptr};
    kx_uint32_t rflags = 0;
    ASSERT_EQ(sec_read_acl_file(d.acl.c_str(), nullptr, nullptr, TEXT, &acl, &rflags), SEC_S_OK);
    std::free(acl.value);
    std::vector<kxtest::trace_record> api, lines;
    for (const auto &rec : kxtest::read_trace(trace))
        (rec.id == 114 ? lines : api).push_back(rec);
    sec_buffer_t acl_pointer = &acl;
    sec_perm_set_t no_set = nullptr;
    ASSERT_EQ(api.front().id, 11u);
    EXPECT_EQ(api.front().items, (items{hex_text(d.acl), hex_text(""), hex_of(no_set), hex_of(TEXT),
                                        hex_of(acl_pointer)}));
    ASSERT_EQ(api.back().id, 14u);
    EXPECT_EQ(api.back().items, (items{hex_of(kx_int32_t{0}), hex_of(4)}));
    ASSERT_EQ(lines.size(), 3u);
    EXPECT_EQ(lines[0].items,
              (items{hex_of(1), hex_of(2), hex_text(""), hex_text(""), hex_of(kx_uint32_t{1})}));
    EXPECT_EQ(lines[1].items,
              (items{hex_of(2), hex_of(0), hex_text(""), hex_text(""), hex_of(kx_uint32_t{0})}));
    EXPECT_EQ(lines[2].items, (items{hex_of(3), hex_of(16), hex_text(""), hex_text("staff"),
                                     hex_of(kx_uint32_t{3})}));
}

// Perf 1 times the compile's steps; Perf 2 the opening and reading alone.
TEST(ReadAclFileTrace, PerfPointsOfACompile) {
    std::string trace = kxtest::start_tracing("_SEL:Perf=1");
    acl_dir d;
    acl_read r(d.acl, TEXT);
    ASSERT_EQ(r.status, SEC_S_OK);
    ASSERT_EQ(tr_set_detail_level_1("_SEL", "Perf", 2), TR_OK);
    acl_read again(d.acl, TEXT);
    ASSERT_EQ(again.status, SEC_S_OK);
    auto records = kxtest::read_trace(trace);
    ASSERT_EQ(kxtest::trace_ids(trace), (std::vector<unsigned>{0, 1, 2, 3, 4, 6}));
    EXPECT_EQ(records[1].items.size(), 4u);
    EXPECT_EQ(records[2].items.size(), 4u);
    ASSERT_EQ(records[3].items.size(), 5u);
    EXPECT_EQ(records[3].items[1], hex_of(4));
}

} // namespace
