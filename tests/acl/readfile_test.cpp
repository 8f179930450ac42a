// sec_read_acl_file: arguments, the outcome table, the cache cycle, owner
// rules with a user name, concurrent replacement, allocation failures and
// trace points.
#include <atomic>
#include <cerrno>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <mutex>
#include <pwd.h>
#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include <kx_acl.h>

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
using kxtest::last_error;
using kxtest::TEXT;
using kxtest::unset;
using names = std::vector<std::string>;

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

// ---- arguments and the ACL file ------------------------------------------

TEST(ReadAclFile, BadArgumentsLeaveAclUntouchedAndHandBackTheFlags) {
    sec_buffer_s acl{7, reinterpret_cast<void *>(8)};
    kx_uint32_t rflags = unset;
    EXPECT_EQ(sec_read_acl_file(nullptr, nullptr, nullptr, 0x105, &acl, &rflags), SEC_S_BAD_PARAM);
    auto e = last_error();
    EXPECT_EQ(e.msg_num, MSG_2650_101);
    EXPECT_EQ(e.str(0), "sec_read_acl_file");
    EXPECT_EQ(e.num(1), 1);
    EXPECT_EQ(e.num(2), 0);
    EXPECT_EQ(rflags, 0x105u);
    EXPECT_EQ(acl.length, 7);

    EXPECT_EQ(sec_read_acl_file("acl", nullptr, nullptr, 2, nullptr, &rflags), SEC_S_BAD_PARAM);
    EXPECT_EQ(last_error().num(1), 5);
    EXPECT_EQ(rflags, 2u);

    EXPECT_EQ(sec_read_acl_file("acl", "", nullptr, 3, &acl, &rflags), SEC_S_BAD_PARAM);
    EXPECT_EQ(last_error().msg_num, MSG_2650_134);
    EXPECT_EQ(rflags, 3u);
    EXPECT_EQ(acl.length, 7);
}

TEST(ReadAclFile, MissingOrNonRegularFileIsNoAclFile) {
    acl_dir d;
    acl_read missing(d.dir + "/none", CACHE | CONVERT);
    EXPECT_EQ(missing.status, SEC_S_NO_ACL_FILE);
    EXPECT_TRUE(missing.empty());
    EXPECT_EQ(missing.rflags, CACHE | CONVERT);
    auto e = last_error();
    EXPECT_EQ(e.id, SEC_S_NO_ACL_FILE);
    EXPECT_EQ(e.msg_num, MSG_2650_135);
    EXPECT_EQ(e.str(0), d.dir + "/none");
    EXPECT_EQ(e.num(1), ENOENT);

    acl_read directory(d.dir, 0);
    EXPECT_EQ(directory.status, SEC_S_NO_ACL_FILE);
    EXPECT_EQ(last_error().id, SEC_S_NO_ACL_FILE);
    EXPECT_EQ(last_error().num(1), 0);
}

TEST(ReadAclFile, UnresolvedNameFailsWithTheResolversStatus) {
    acl_read r("acl", CACHE, "kx-no-such-user");
    EXPECT_EQ(r.status, SEC_S_USER_NOT_FOUND);
    EXPECT_TRUE(r.empty());
    EXPECT_EQ(r.rflags, CACHE);
}

TEST(ReadAclFile, EmptyFileIsTheEmptyAclWithoutLookingAtTheCaclFile) {
    std::string trace = kxtest::start_tracing("_SEL:Info=1");
    acl_dir d("");
    kxtest::write_file(d.cacl, kxtest::example_acl());
    acl_read r(d.acl, CACHE | 0x100);
    EXPECT_EQ(r.status, SEC_S_OK);
    EXPECT_TRUE(r.empty());
    EXPECT_EQ(r.rflags, CACHE | 0x100);
    EXPECT_EQ(kxtest::trace_ids(trace), (std::vector<unsigned>{116}));
}

TEST(ReadAclFile, CompilesTheTextIntoTheBuffer) {
    acl_dir d;
    acl_read r(d.acl, CONVERT);
    ASSERT_EQ(r.status, SEC_S_OK);
    EXPECT_EQ(kxtest::hex_of(r.bytes().data(), r.bytes().size()),
              kxtest::hex_of(kxtest::example_acl().data(), 71));
    EXPECT_EQ(r.rflags, TEXT) << "0x4 is cleared once compiling begins";
    expect_no_error();
}

TEST(ReadAclFile, FileWithoutEntriesIsTheEmptyAclAndNotCached) {
    acl_dir d("# nothing here\n\n   \t# at all\n");
    acl_read r(d.acl, CACHE);
    EXPECT_EQ(r.status, SEC_S_OK);
    EXPECT_TRUE(r.empty());
    EXPECT_EQ(r.rflags, TEXT);
    expect_no_error();
    EXPECT_EQ(dir_entries(d.dir), (names{"acl"}));
}

TEST(ReadAclFile, BadThirdLineReturnsNothingAndCachesNothing) {
    acl_dir d("o r\ng staff rw\nx joe r\nn\n");
    acl_read r(d.acl, CACHE | CONVERT | 0x100);
    EXPECT_EQ(r.status, SEC_S_BAD_ACL);
    EXPECT_TRUE(r.empty());
    EXPECT_EQ(r.rflags, TEXT | CACHE | 0x100) << "0x2 unchanged, 0x4 cleared";
    auto e = last_error();
    EXPECT_EQ(e.msg_num, MSG_2650_179);
    EXPECT_EQ(e.num(0), 3);
    EXPECT_EQ(e.str(1), "x");
    EXPECT_EQ(dir_entries(d.dir), (names{"acl"}));
}

TEST(ReadAclFile, DuplicateEntriesFail) {
    acl_dir d("g staff r\nu unix bob\ng STAFF w\n");
    acl_read r(d.acl, CACHE);
    EXPECT_EQ(r.status, SEC_S_BAD_ACLE);
    EXPECT_TRUE(r.empty());
    EXPECT_EQ(last_error().msg_num, MSG_2650_175);
    EXPECT_EQ(dir_entries(d.dir), (names{"acl"}));
}

TEST(ReadAclFile, PermissionsUseTheCallersTemplates) {
    sec_perm_desc perms[2] = {{0x10, 'a', "alpha", "first"}, {0x20, 'b', "beta", "second"}};
    sec_perm_set_desc set{2, perms};
    acl_dir d("o ab\n");
    acl_read r(d.acl, 0, nullptr, &set);
    ASSERT_EQ(r.status, SEC_S_OK);
    ASSERT_EQ(r.acl.length, 22);
    EXPECT_EQ(kxtest::hex_of(static_cast<char *>(r.acl.value) + 16, 4), "30000000");

    acl_read refused(d.acl, 0);
    EXPECT_EQ(refused.status, SEC_S_BAD_PERMISSION);
    EXPECT_EQ(last_error().msg_num, MSG_2650_180);
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

TEST(ReadAclFileCache, SameSecondCaclFileIsNotUsed) {
    acl_dir d;
    kxtest::write_file(d.cacl, "garbage");
    kxtest::set_mtime(d.acl, 1700000000);
    kxtest::set_mtime(d.cacl, 1700000000);
    acl_read r(d.acl, 0);
    ASSERT_EQ(r.status, SEC_S_OK);
    EXPECT_EQ(r.rflags, TEXT);
    EXPECT_EQ(r.bytes(), kxtest::example_acl());
}

TEST(ReadAclFileCache, TextFlagCompilesAnywayAndLeavesANewerCaclFile) {
    acl_dir d;
    kxtest::write_file(d.cacl, "garbage"); // newer, same owner and mode
    acl_read r(d.acl, TEXT);
    ASSERT_EQ(r.status, SEC_S_OK);
    EXPECT_EQ(r.bytes(), kxtest::example_acl());
    EXPECT_EQ(r.rflags, TEXT);

    acl_read cached(d.acl, TEXT | CACHE);
    ASSERT_EQ(cached.status, SEC_S_OK);
    EXPECT_EQ(cached.bytes(), kxtest::example_acl());
    EXPECT_EQ(cached.rflags, TEXT) << "nothing written: the CACL file is newer";
    EXPECT_EQ(kxtest::read_file(d.cacl), "garbage");
    expect_no_error();
}

TEST(ReadAclFileCache, CaclFileOfAnotherModeIsNeitherUsedNorReplaced) {
    acl_dir d;
    kxtest::write_file(d.cacl, "garbage", 0600);
    acl_read r(d.acl, CACHE);
    ASSERT_EQ(r.status, SEC_S_OK);
    EXPECT_EQ(r.bytes(), kxtest::example_acl());
    EXPECT_EQ(r.rflags, TEXT) << "the refused cache write clears 0x2";
    expect_no_error();
    EXPECT_EQ(kxtest::read_file(d.cacl), "garbage");
}

TEST(ReadAclFileCache, CaclFileOfAnotherOwnerIsNeitherUsedNorReplaced) {
    KXTEST_REQUIRE_ROOT();
    acl_dir d;
    kxtest::write_file(d.cacl, kxtest::example_acl());
    ASSERT_EQ(chown(d.cacl.c_str(), 65534, 65534), 0);
    kxtest::write_file(d.acl, "n r\n");
    kxtest::shift_mtime(d.acl, -10);
    acl_read r(d.acl, CACHE);
    ASSERT_EQ(r.status, SEC_S_OK);
    EXPECT_EQ(r.bytes(), compiled("n r\n"));
    EXPECT_EQ(r.rflags, TEXT);
    expect_no_error();
    EXPECT_EQ(kxtest::read_file(d.cacl), kxtest::example_acl());
    EXPECT_EQ(kxtest::status_of(d.cacl).st_uid, 65534u);
}

TEST(ReadAclFileCache, GarbageCaclFileIsReturnedOnlyWithoutConvert) {
    acl_dir d;
    kxtest::write_file(d.cacl, "garbage");
    acl_read unchecked(d.acl, 0);
    ASSERT_EQ(unchecked.status, SEC_S_OK);
    EXPECT_EQ(unchecked.bytes(), "garbage");
    EXPECT_EQ(unchecked.rflags, 0u);

    acl_read checked(d.acl, CONVERT);
    ASSERT_EQ(checked.status, SEC_S_OK);
    EXPECT_EQ(checked.bytes(), kxtest::example_acl());
    EXPECT_EQ(checked.rflags, TEXT);
    expect_no_error();
}

TEST(ReadAclFileCache, ForeignOrderCaclFileIsConvertedWithConvert) {
    acl_dir d;
    // The example in big-endian order, with a mark other than 2.
    std::string big = kxtest::example_acl();
    big[2] = 1;
    std::swap(big[3], big[4]);
    for (std::size_t sub : {5u, 22u, 45u}) {
        std::swap(big[sub], big[sub + 3]);
        std::swap(big[sub + 1], big[sub + 2]);
        std::swap(big[sub + 5], big[sub + 8]);
        std::swap(big[sub + 6], big[sub + 7]);
    }
    for (std::size_t entry : {15u, 32u, 60u}) {
        std::swap(big[entry + 1], big[entry + 4]);
        std::swap(big[entry + 2], big[entry + 3]);
        std::swap(big[entry + 5], big[entry + 6]);
    }
    kxtest::write_file(d.cacl, big);
    acl_read r(d.acl, CONVERT);
    ASSERT_EQ(r.status, SEC_S_OK);
    EXPECT_EQ(r.rflags, CONVERT);
    EXPECT_EQ(kxtest::hex_of(r.bytes().data(), r.bytes().size()),
              kxtest::hex_of(kxtest::example_acl().data(), 71));
}

TEST(ReadAclFileCache, SymbolicLinkAtTheCaclNameIsNeverFollowed) {
    acl_dir d;
    std::string target = d.dir + "/target";
    kxtest::write_file(target, "n r\n"); // newer, same owner and mode
    ASSERT_EQ(symlink(target.c_str(), d.cacl.c_str()), 0);
    acl_read r(d.acl, CACHE);
    ASSERT_EQ(r.status, SEC_S_OK);
    EXPECT_EQ(r.bytes(), kxtest::example_acl());
    EXPECT_EQ(r.rflags, TEXT);
    EXPECT_EQ(kxtest::read_file(target), "n r\n");
    EXPECT_TRUE(S_ISLNK(kxtest::status_of(d.cacl).st_mode));
}

TEST(ReadAclFileCache, TooLongForACaclNameIsCompiledAndNotCached) {
    std::string base = kxtest::temp_dir();
    for (std::size_t length : {4090u, 4092u}) {
        std::string under = base + "/" + std::to_string(length);
        ASSERT_EQ(mkdir(under.c_str(), 0755), 0);
        std::string path = kxtest::path_of_length(under, length);
        kxtest::write_file(path, "o r\n");
        kxtest::shift_mtime(path, -10);
        acl_read r(path, CACHE);
        ASSERT_EQ(r.status, SEC_S_OK) << length;
        EXPECT_EQ(r.bytes(), compiled("o r\n"));
        EXPECT_EQ(r.rflags, TEXT);
        expect_no_error();
    }
}

TEST(ReadAclFileCache, LongestCachedPathIsReused) {
    std::string path = kxtest::path_of_length(kxtest::temp_dir(), 4089);
    kxtest::write_file(path, kxtest::example_text);
    kxtest::shift_mtime(path, -10);
    acl_read first(path, CACHE);
    ASSERT_EQ(first.status, SEC_S_OK);
    EXPECT_EQ(first.rflags, TEXT | CACHE);
    acl_read second(path, CACHE);
    ASSERT_EQ(second.status, SEC_S_OK);
    EXPECT_EQ(second.rflags, 0u);
    EXPECT_EQ(second.bytes(), kxtest::example_acl());
}

// ---- owner rules with a user name -----------------------------------------

TEST(ReadAclFileUser, FileMustBeTheUsersAndWritableByNobodyElse) {
    KXTEST_REQUIRE_ROOT();
    std::string home = kxtest::temp_dir();
    kxtest::scoped_user user(home);
    if (!user.ok())
        GTEST_SKIP() << "SKIPPED: useradd failed";
    const char *name = user.name().c_str();
    uid_t uid = getpwnam(name)->pw_uid;
    std::string acl = home + "/acl";
    kxtest::write_file(acl, kxtest::example_text, 0644);

    acl_read not_owned("acl", CACHE, name);
    EXPECT_EQ(not_owned.status, SEC_S_BAD_PERMISSION);
    auto e = last_error();
    EXPECT_EQ(e.msg_num, MSG_2650_141);
    EXPECT_EQ(e.str(0), acl);
    EXPECT_EQ(e.str(1), user.name());
    EXPECT_EQ(not_owned.rflags, CACHE);

    ASSERT_EQ(chown(acl.c_str(), uid, static_cast<gid_t>(-1)), 0);
    acl_read owned("acl", 0, name);
    ASSERT_EQ(owned.status, SEC_S_OK);
    EXPECT_EQ(owned.bytes(), kxtest::example_acl());

    for (mode_t mode : {0664, 0646}) {
        ASSERT_EQ(chmod(acl.c_str(), mode), 0);
        acl_read writable("acl", 0, name);
        EXPECT_EQ(writable.status, SEC_S_BAD_PERMISSION) << std::oct << mode;
        EXPECT_EQ(last_error().id, SEC_S_BAD_PERMISSION);
        EXPECT_TRUE(writable.empty());
    }
}

TEST(ReadAclFileUser, EmptyFileSucceedsWhateverItsOwnerAndMode) {
    KXTEST_REQUIRE_ROOT();
    std::string home = kxtest::temp_dir();
    kxtest::scoped_user user(home);
    if (!user.ok())
        GTEST_SKIP() << "SKIPPED: useradd failed";
    kxtest::write_file(home + "/acl", "", 0666); // root's, writable by all
    acl_read r("acl", CACHE, user.name().c_str());
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
    std::vector<unsigned> ids;
    for (const auto &r : records)
        ids.push_back(r.id);
    // 117 examine, 118 absent, 121 open the text, 110 cache absent;
    // then 117 examine, 121 open the CACL file.
    ASSERT_EQ(ids, (std::vector<unsigned>{117, 118, 121, 110, 117, 121}));
    EXPECT_EQ(records[0].items, (std::vector<std::string>{kxtest::hex_text(d.cacl)}));
    EXPECT_EQ(records[1].items[1], kxtest::hex_of(ENOENT));
    EXPECT_EQ(records[2].items, (std::vector<std::string>{kxtest::hex_text(d.acl)}));
    EXPECT_EQ(records[5].items, (std::vector<std::string>{kxtest::hex_text(d.cacl)}));
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
    EXPECT_EQ(records[1].items[0], kxtest::hex_text(d.acl));
    EXPECT_EQ(records[1].items[5], kxtest::hex_of(kx_uint32_t{S_IFREG | 0644}));
    EXPECT_EQ(records[1].items[6], kxtest::hex_of(kx_uint32_t{S_IFREG | 0600}));
}

TEST(ReadAclFileTrace, EveryConsumedLineAtInfoEight) {
    std::string trace = kxtest::start_tracing("_SEL:Info=8");
    acl_dir d("o r\n# c\ng staff rw\n");
    acl_read r(d.acl, TEXT);
    ASSERT_EQ(r.status, SEC_S_OK);
    std::vector<std::vector<std::string>> lines;
    for (const auto &rec : kxtest::read_trace(trace))
        if (rec.id == 114)
            lines.push_back(rec.items);
    using kxtest::hex_of;
    using kxtest::hex_text;
    ASSERT_EQ(lines.size(), 3u);
    EXPECT_EQ(lines[0], (std::vector<std::string>{hex_of(1), hex_of(2), hex_text(""), hex_text(""),
                                                  hex_of(kx_uint32_t{1})}));
    EXPECT_EQ(lines[1], (std::vector<std::string>{hex_of(2), hex_of(0), hex_text(""), hex_text(""),
                                                  hex_of(kx_uint32_t{0})}));
    EXPECT_EQ(lines[2], (std::vector<std::string>{hex_of(3), hex_of(16), hex_text(""),
                                                  hex_text("staff"), hex_of(kx_uint32_t{3})}));
}

TEST(ReadAclFileTrace, ApiPointsCarryTheArgumentsAndTheLineReached) {
    std::string trace = kxtest::start_tracing("_SEL:API=8");
    acl_dir d("o r\n# c\ng staff rw\n");
    sec_buffer_s acl{0, nullptr};
    kx_uint32_t rflags = 0;
    ASSERT_EQ(sec_read_acl_file(d.acl.c_str(), nullptr, nullptr, TEXT, &acl, &rflags), SEC_S_OK);
    std::free(acl.value);
    std::vector<kxtest::trace_record> records;
    for (const auto &rec : kxtest::read_trace(trace))
        if (rec.id == 11 || rec.id == 14)
            records.push_back(rec);
    ASSERT_EQ(records.size(), 2u);
    sec_buffer_t acl_pointer = &acl;
    sec_perm_set_t no_set = nullptr;
    EXPECT_EQ(records[0].id, 11u);
    EXPECT_EQ(records[0].items,
              (std::vector<std::string>{kxtest::hex_text(d.acl), kxtest::hex_text(""),
                                        kxtest::hex_of(no_set), kxtest::hex_of(TEXT),
                                        kxtest::hex_of(acl_pointer)}));
    EXPECT_EQ(records[1].id, 14u);
    EXPECT_EQ(records[1].items,
              (std::vector<std::string>{kxtest::hex_of(kx_int32_t{0}), kxtest::hex_of(4)}));
}

TEST(ReadAclFileTrace, PerfPointsOfACompile) {
    std::string trace = kxtest::start_tracing("_SEL:Perf=1");
    acl_dir d;
    acl_read r(d.acl, TEXT);
    ASSERT_EQ(r.status, SEC_S_OK);
    auto records = kxtest::read_trace(trace);
    std::vector<unsigned> ids;
    for (const auto &rec : records)
        ids.push_back(rec.id);
    ASSERT_EQ(ids, (std::vector<unsigned>{0, 1, 2, 3}));
    EXPECT_EQ(records[1].items.size(), 4u);
    EXPECT_EQ(records[2].items.size(), 4u);
    ASSERT_EQ(records[3].items.size(), 5u);
    EXPECT_EQ(records[3].items[1], kxtest::hex_of(4));
}

TEST(ReadAclFileTrace, PerfPointsOfOpeningAndReading) {
    std::string trace = kxtest::start_tracing("_SEL:Perf=2");
    acl_dir d;
    acl_read r(d.acl, TEXT);
    ASSERT_EQ(r.status, SEC_S_OK);
    EXPECT_EQ(kxtest::trace_ids(trace), (std::vector<unsigned>{0, 4, 6}));
}

} // namespace
