// The cached compiled ACL file: writing it through a temporary file, the
// files that are never replaced or followed, cleanup after every failure,
// and the rule by which readers trust it.
#include <cerrno>
#include <csignal>
#include <cstring>
#include <string>
#include <sys/resource.h>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include "cache.h"
#include "file_helpers.h"
#include "files.h"
#include "messages.h"
#include "support.h"

using namespace kxacl;
using kxtest::dir_entries;
using kxtest::last_error;
using kxtest::record_is;
using names = std::vector<std::string>;

namespace {

// An ACL file "acl" in a fresh directory, and a buffer to cache for it.
struct cache_dir : kxtest::acl_dir {
    std::string bytes = kxtest::example_acl();
    sec_buffer_s buffer{static_cast<kx_int32_t>(bytes.size()), bytes.data()};
    explicit cache_dir(mode_t mode = 0644) : acl_dir(kxtest::example_text, mode) {}
    kx_int32_t cache(sec_boolean_t force = 0) {
        return sec__cache_aclbuffer(acl.c_str(), &buffer, force);
    }
};

void expect_report(kx_int32_t rc, int msg_num, const std::vector<kxtest::arg> &args) {
    EXPECT_EQ(rc, SEC_S_FILE_ERROR);
    EXPECT_TRUE(record_is(SEC_S_FILE_ERROR, msg_num, args));
}

// "acl." and four lowercase hex digits.
bool is_temp_name(const std::string &name) {
    if (name.size() != 8 || name.compare(0, 4, "acl.") != 0)
        return false;
    return name.find_first_not_of("0123456789abcdef", 4) == std::string::npos;
}

// ---- writing ------------------------------------------------------------

TEST(CacheAclBuffer, WritesTheBytesWithTheAclFilesOwnerAndMode) {
    cache_dir d(04640);
    ASSERT_EQ(d.cache(), SEC_S_OK);
    EXPECT_EQ(kxtest::read_file(d.cacl), d.bytes);
    struct stat a = kxtest::status_of(d.acl), c = kxtest::status_of(d.cacl);
    EXPECT_EQ(c.st_mode, a.st_mode);
    EXPECT_EQ(c.st_mode & 07777, 04640u);
    EXPECT_EQ(c.st_uid, a.st_uid);
    EXPECT_EQ(c.st_gid, a.st_gid);
    EXPECT_EQ(dir_entries(d.dir), (names{"acl", "acl.cacl"}));
}

TEST(CacheAclBuffer, EmptyBufferWritesNothingAndReportsNothing) {
    cache_dir d;
    sec_buffer_s empty{0, nullptr};
    EXPECT_EQ(sec__cache_aclbuffer(d.acl.c_str(), &empty, 1), 1);
    EXPECT_EQ(last_error().id, 0);
    EXPECT_EQ(dir_entries(d.dir), (names{"acl"}));
}

TEST(CacheAclBuffer, NewerCaclFileIsKeptUnlessForced) {
    cache_dir d;
    ASSERT_EQ(d.cache(), SEC_S_OK);
    std::string old_bytes = d.bytes;
    d.bytes[5] ^= 0xff; // a different buffer of the same length
    EXPECT_EQ(d.cache(), 1);
    EXPECT_EQ(last_error().id, 0);
    EXPECT_EQ(kxtest::read_file(d.cacl), old_bytes);
    EXPECT_EQ(d.cache(1), SEC_S_OK);
    EXPECT_EQ(kxtest::read_file(d.cacl), d.bytes);
}

TEST(CacheAclBuffer, SameSecondCaclFileIsReplaced) {
    cache_dir d;
    kxtest::write_file(d.cacl, "old", 0644);
    kxtest::set_mtime(d.acl, 1700000000);
    kxtest::set_mtime(d.cacl, 1700000000);
    EXPECT_EQ(d.cache(), SEC_S_OK);
    EXPECT_EQ(kxtest::read_file(d.cacl), d.bytes);
}

TEST(CacheAclBuffer, PathOf4089CharactersIsTheLongestCached) {
    std::string base = kxtest::temp_dir();
    std::string longest = kxtest::path_of_length(base, 4089);
    kxtest::write_file(longest, "o r\n");
    std::string bytes = kxtest::example_acl();
    sec_buffer_s buffer{static_cast<kx_int32_t>(bytes.size()), bytes.data()};
    ASSERT_EQ(sec__cache_aclbuffer(longest.c_str(), &buffer, 0), SEC_S_OK);
    EXPECT_EQ((longest + ".cacl").size(), 4094u);
    EXPECT_EQ(kxtest::read_file(longest + ".cacl"), bytes);

    std::string dir = longest.substr(0, longest.rfind('/'));
    std::string too_long = dir + "/" + std::string(longest.size() - dir.size(), 'g');
    ASSERT_EQ(too_long.size(), 4090u);
    kxtest::write_file(too_long, "o r\n");
    expect_report(sec__cache_aclbuffer(too_long.c_str(), &buffer, 0), MSG_2650_148, {too_long});
    EXPECT_EQ(dir_entries(dir).size(), 3u) << "the 4089 pair and the 4090 file only";
}

TEST(CacheAclBuffer, MissingAclFileFailsWith135) {
    cache_dir d;
    ASSERT_EQ(unlink(d.acl.c_str()), 0);
    expect_report(d.cache(), MSG_2650_135, {d.acl, ENOENT});
    EXPECT_TRUE(dir_entries(d.dir).empty());
}

// ---- files that are never replaced or followed ---------------------------

// A file at the CACL name that is not the caller's to replace: refused,
// and left as it was.
void expect_kept(cache_dir &d, int msg_num, const std::string &contents, const names &files) {
    expect_report(d.cache(1), msg_num, {d.acl});
    EXPECT_EQ(kxtest::read_file(d.cacl), contents);
    EXPECT_EQ(dir_entries(d.dir), files);
}

TEST(CacheAclBuffer, CaclFileOfAnotherModeIsNeverReplaced) {
    cache_dir d(0644);
    kxtest::write_file(d.cacl, "mine", 0600);
    kxtest::shift_mtime(d.cacl, -100);
    expect_kept(d, MSG_2650_150, "mine", {"acl", "acl.cacl"});

    // A symbolic link is examined itself: its file type makes its mode differ.
    cache_dir l;
    kxtest::write_file(l.dir + "/target", "target bytes", 0644);
    ASSERT_EQ(symlink((l.dir + "/target").c_str(), l.cacl.c_str()), 0);
    expect_kept(l, MSG_2650_150, "target bytes", {"acl", "acl.cacl", "target"});
    EXPECT_TRUE(S_ISLNK(kxtest::status_of(l.cacl).st_mode));
}

TEST(CacheAclBuffer, CaclFileOfAnotherOwnerIsNeverReplaced) {
    KXTEST_REQUIRE_ROOT();
    cache_dir d;
    kxtest::write_file(d.cacl, "theirs", 0644);
    ASSERT_EQ(chown(d.cacl.c_str(), 65534, 65534), 0);
    expect_kept(d, MSG_2650_149, "theirs", {"acl", "acl.cacl"});
}

// Plants a symbolic link to target at every temporary name whose number
// passes planted().
template <typename Planted>
void plant_temp_links(const std::string &acl, const std::string &target, Planted planted) {
    char suffix[8];
    for (unsigned n = 0; n < 0x10000; ++n) {
        if (!planted(n))
            continue;
        std::snprintf(suffix, sizeof suffix, ".%04x", n);
        ASSERT_EQ(symlink(target.c_str(), (acl + suffix).c_str()), 0);
    }
}

TEST(CacheAclBuffer, TakenTemporaryNamesAreDrawnAgainAndNeverFollowed) {
    cache_dir d;
    kxtest::removed_at_end cleanup{d.dir}; // tens of thousands of links
    std::string target = d.dir + "/target";
    kxtest::write_file(target, "target bytes", 0644);
    // Half of the names are taken: a free one turns up within a few draws.
    plant_temp_links(d.acl, target, [](unsigned n) { return n % 2 == 0; });
    ASSERT_EQ(d.cache(), SEC_S_OK);
    EXPECT_EQ(kxtest::read_file(d.cacl), d.bytes);
    EXPECT_EQ(kxtest::read_file(target), "target bytes");
    EXPECT_EQ(dir_entries(d.dir).size(), 0x8000u + 3);
}

TEST(CacheAclBuffer, NoFreeTemporaryNameFailsWith151AndLeavesNothing) {
    cache_dir d;
    kxtest::removed_at_end cleanup{d.dir}; // tens of thousands of links
    std::string target = d.dir + "/target";
    kxtest::write_file(target, "target bytes", 0644);
    plant_temp_links(d.acl, target, [](unsigned) { return true; });
    kx_int32_t rc = d.cache();
    EXPECT_EQ(rc, SEC_S_FILE_ERROR);
    auto e = last_error();
    EXPECT_EQ(e.msg_num, MSG_2650_151);
    std::string failed = e.str(0);
    EXPECT_EQ(failed.substr(0, d.dir.size() + 1), d.dir + "/");
    EXPECT_TRUE(is_temp_name(failed.substr(d.dir.size() + 1))) << failed;
    EXPECT_EQ(kxtest::read_file(target), "target bytes");
    EXPECT_FALSE(kxtest::exists(d.cacl)) << "the empty CACL file made by the call is removed";
    EXPECT_EQ(dir_entries(d.dir).size(), 0x10000u + 2);
}

// ---- failures while writing ----------------------------------------------

// Limits the size of files that the process may write, as a full disk would.
struct file_size_limit {
    rlimit old{};
    explicit file_size_limit(rlim_t bytes) {
        std::signal(SIGXFSZ, SIG_IGN);
        getrlimit(RLIMIT_FSIZE, &old);
        rlimit limit{bytes, old.rlim_max};
        setrlimit(RLIMIT_FSIZE, &limit);
    }
    ~file_size_limit() { setrlimit(RLIMIT_FSIZE, &old); }
};

// A short write shows the bytes written, a failed one -1 and errno; either
// removes the files of the call and keeps an older CACL file.
TEST(CacheAclBuffer, ShortWriteFailsWith152AndRemovesItsFiles) {
    for (rlim_t limit : {10, 0}) {
        SCOPED_TRACE(limit);
        cache_dir d;
        if (limit == 0) {
            kxtest::write_file(d.cacl, "old", 0644);
            kxtest::shift_mtime(d.cacl, -100);
        }
        kx_int32_t rc;
        {
            file_size_limit full(limit);
            rc = d.cache();
        }
        expect_report(rc, MSG_2650_152, {limit ? 10 : -1, 71, limit ? 0 : EFBIG});
        EXPECT_EQ(kxtest::read_file(d.cacl), limit ? "<missing>" : "old");
        EXPECT_EQ(dir_entries(d.dir), (limit ? names{"acl"} : names{"acl", "acl.cacl"}));
    }
}

TEST(CacheAclBuffer, OwnerThatCannotBeGivenFailsWith154AndLeavesNothing) {
    KXTEST_REQUIRE_ROOT();
    cache_dir d; // owned by root
    ASSERT_EQ(chmod(d.dir.c_str(), 0777), 0);
    int code = kxtest::exit_code_as_user(65534, 65534, [&] {
        kx_int32_t rc = d.cache();
        auto e = last_error();
        if (rc != SEC_S_FILE_ERROR || e.msg_num != MSG_2650_154)
            return 1;
        if (e.str(0) != d.cacl || e.str(1) != "0" || e.num(2) != 0)
            return 2;
        return 0;
    });
    EXPECT_EQ(code, 0);
    EXPECT_EQ(dir_entries(d.dir), (names{"acl"}));
}

TEST(CacheAclBuffer, UnwritableDirectoryFailsWith151ForTheCaclName) {
    KXTEST_REQUIRE_ROOT();
    cache_dir d;
    ASSERT_EQ(chmod(d.dir.c_str(), 0755), 0);
    int code = kxtest::exit_code_as_user(65534, 65534, [&] {
        kx_int32_t rc = d.cache();
        auto e = last_error();
        return rc == SEC_S_FILE_ERROR && e.msg_num == MSG_2650_151 && e.str(0) == d.cacl ? 0 : 1;
    });
    EXPECT_EQ(code, 0);
    EXPECT_EQ(dir_entries(d.dir), (names{"acl"}));
}

TEST(CacheAclBuffer, ConcurrentWritersLeaveOneCompleteFile) {
    cache_dir d;
    std::vector<std::thread> writers;
    std::vector<int> unexpected(4, 0);
    for (int t = 0; t < 4; ++t)
        writers.emplace_back([&, t] {
            for (int i = 0; i < 50; ++i) {
                kx_int32_t rc = d.cache(1);
                // A writer that finds another's fresh empty CACL file gives way.
                if (rc != SEC_S_OK && rc != SEC_S_FILE_ERROR)
                    ++unexpected[t];
            }
        });
    for (auto &w : writers)
        w.join();
    EXPECT_EQ(unexpected, std::vector<int>(4, 0));
    EXPECT_EQ(kxtest::read_file(d.cacl), d.bytes);
    EXPECT_EQ(dir_entries(d.dir), (names{"acl", "acl.cacl"}));
}

// ---- the trust rule --------------------------------------------------------

TEST(JudgeCacl, TrustsOnlyANewerNonEmptyRegularFileOfTheSameOwnerAndMode) {
    cache_dir d;
    kxtest::set_mtime(d.acl, 1700000000);
    struct stat acl_st = kxtest::status_of(d.acl);
    auto judge = [&] { return judge_cacl(acl_st, d.cacl.c_str()); };

    cacl_verdict absent = judge();
    EXPECT_EQ(absent.state, cacl_state::unexaminable);
    EXPECT_EQ(absent.err, ENOENT);

    kxtest::write_file(d.cacl, "", 0644);
    kxtest::set_mtime(d.cacl, 1700000001);
    EXPECT_EQ(judge().state, cacl_state::stale) << "empty";

    kxtest::write_file(d.cacl, "bytes", 0644);
    kxtest::set_mtime(d.cacl, 1700000000);
    EXPECT_EQ(judge().state, cacl_state::stale) << "same second";
    kxtest::set_mtime(d.cacl, 1700000001);
    EXPECT_EQ(judge().state, cacl_state::trusted);

    ASSERT_EQ(chmod(d.cacl.c_str(), 0640), 0);
    EXPECT_EQ(judge().state, cacl_state::foreign) << "mode";
    ASSERT_EQ(chmod(d.cacl.c_str(), 0644), 0);

    ASSERT_EQ(rename(d.cacl.c_str(), (d.dir + "/real").c_str()), 0);
    ASSERT_EQ(symlink((d.dir + "/real").c_str(), d.cacl.c_str()), 0);
    EXPECT_EQ(judge().state, cacl_state::foreign) << "symbolic link";
}

TEST(CaclName, AppendsTheSuffixWhenItFits) {
    path_buffer cacl;
    EXPECT_TRUE(cacl_name_of("/etc/acl", cacl));
    EXPECT_STREQ(cacl, "/etc/acl.cacl");
    std::string longest(4091, 'a');
    EXPECT_TRUE(cacl_name_of(longest.c_str(), cacl));
    EXPECT_EQ(std::strlen(cacl), 4096u);
    EXPECT_FALSE(cacl_name_of((longest + "a").c_str(), cacl));
    EXPECT_STREQ(cacl, "");
}

} // namespace
