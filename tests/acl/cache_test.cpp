// The CACL writer on its own: what it does with the file already at the
// CACL name, how long a path it serves, temporary names that are taken,
// and writers at work together. (What readers make of CACL files, and each
// failing system call of the writer: readfile_test, syscall_fault_test.)
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <functional>
#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include "cache.h"
#include "file_helpers.h"
#include "files.h"
#include "messages.h"
#include "support.h"

using namespace kxacl;
using namespace kxtest;
using names = std::vector<std::string>;

namespace {

// An ACL file "acl" in a fresh directory, and a buffer to cache for it.
struct cache_dir : acl_dir {
    std::string bytes = example_acl();
    sec_buffer_s buffer{static_cast<kx_int32_t>(bytes.size()), bytes.data()};
    explicit cache_dir(mode_t mode = 0644) : acl_dir(example_text, mode) {}
    kx_int32_t cache(sec_boolean_t force = 0) {
        return sec__cache_aclbuffer(acl.c_str(), &buffer, force);
    }
};

// The result (0 written, 1 nothing to write), the record and the CACL file
// left. A CACL file of another owner or mode is never replaced, not even
// when forced; a symbolic link is examined itself, so its file type makes
// its mode differ. A CACL file written has the ACL file's owner and mode.
TEST(CacheAclBuffer, WhatIsAtTheCaclName) {
    const std::string ex = example_acl();
    using prepare = std::function<void(const cache_dir &)>;
    const prepare newer = [](const cache_dir &d) { write_file(d.cacl, "old"); };
    struct {
        const char *what;
        mode_t mode;
        prepare setup;
        sec_boolean_t force;
        kx_int32_t result;
        int msg;
        std::string cacl;
        bool needs_root = false;
    } cases[] = {
        // clang-format off
        {"nothing: written", 04640, {}, 0, SEC_S_OK, 0, ex},
        {"newer: kept", 0644, newer, 0, 1, 0, "old"},
        {"newer: replaced when forced", 0644, newer, 1, SEC_S_OK, 0, ex},
        {"another mode", 0644, [](const cache_dir &d) { write_file(d.cacl, "mine", 0600); }, 1,
         SEC_S_FILE_ERROR, MSG_2650_150, "mine"},
        {"a symbolic link", 0644, [](const cache_dir &d) {
             write_file(d.dir + "/target", "target bytes", 0644);
             ASSERT_EQ(symlink((d.dir + "/target").c_str(), d.cacl.c_str()), 0);
         }, 1, SEC_S_FILE_ERROR, MSG_2650_150, "target bytes"},
        {"another owner", 0644, [](const cache_dir &d) {
             write_file(d.cacl, "theirs", 0644);
             ASSERT_EQ(chown(d.cacl.c_str(), 65534, 65534), 0);
         }, 1, SEC_S_FILE_ERROR, MSG_2650_149, "theirs", true},
        // clang-format on
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.what);
        if (c.needs_root && geteuid() != 0)
            continue;
        cache_dir d(c.mode);
        if (c.setup)
            c.setup(d);
        struct stat before {};
        lstat(d.cacl.c_str(), &before);
        EXPECT_EQ(d.cache(c.force), c.result);
        EXPECT_TRUE(c.msg ? record_is(SEC_S_FILE_ERROR, c.msg, {d.acl}) : record_is(0, 0, {}));
        EXPECT_EQ(read_file(d.cacl), c.cacl);
        struct stat a = status_of(d.acl), after = status_of(d.cacl);
        if (c.result == SEC_S_OK) {
            EXPECT_EQ(after.st_mode, a.st_mode);
            EXPECT_EQ(after.st_uid, a.st_uid);
            EXPECT_EQ(after.st_gid, a.st_gid);
        } else {
            EXPECT_EQ(after.st_ino, before.st_ino);
            EXPECT_EQ(after.st_uid, before.st_uid);
        }
        for (const auto &name : dir_entries(d.dir))
            EXPECT_FALSE(is_temp_name(name)) << name;
    }
}

// A path of 4089 characters is the longest that is cached (its CACL name
// has 4094); the ACL file of a longer one is left alone.
TEST(CacheAclBuffer, LongerPathIsRefusedWith148) {
    std::string longest = path_of_length(temp_dir(), 4089);
    std::string dir = longest.substr(0, longest.rfind('/'));
    std::string too_long = dir + "/" + std::string(longest.size() - dir.size(), 'g');
    ASSERT_EQ(too_long.size(), 4090u);
    write_file(too_long, "o r\n");
    std::string bytes = example_acl();
    sec_buffer_s buffer{static_cast<kx_int32_t>(bytes.size()), bytes.data()};
    EXPECT_EQ(sec__cache_aclbuffer(too_long.c_str(), &buffer, 0), SEC_S_FILE_ERROR);
    EXPECT_TRUE(record_is(SEC_S_FILE_ERROR, MSG_2650_148, {too_long}));
    EXPECT_EQ(dir_entries(dir), (names{too_long.substr(dir.size() + 1)}));
}

// Plants a symbolic link to target at each temporary name that planted()
// chooses.
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

// Temporary names that are taken are drawn again, and never followed. With
// half of them taken a free one turns up within a few draws; with all
// taken, 2650-151 names the last one drawn, and the empty CACL file made by
// the call is removed.
TEST(CacheAclBuffer, TakenTemporaryNames) {
    cache_dir d;
    std::string target = d.dir + "/target";
    write_file(target, "target bytes", 0644);
    plant_temp_links(d.acl, target, [](unsigned n) { return n % 2 == 0; });
    ASSERT_EQ(d.cache(), SEC_S_OK);
    EXPECT_EQ(read_file(d.cacl), d.bytes);
    EXPECT_EQ(dir_entries(d.dir).size(), 0x8000u + 3);

    ASSERT_EQ(unlink(d.cacl.c_str()), 0);
    plant_temp_links(d.acl, target, [](unsigned n) { return n % 2 != 0; });
    EXPECT_EQ(d.cache(), SEC_S_FILE_ERROR);
    auto e = last_error();
    EXPECT_EQ(e.msg_num, MSG_2650_151);
    std::string failed = e.str(0);
    EXPECT_EQ(failed.substr(0, d.dir.size() + 1), d.dir + "/");
    EXPECT_TRUE(is_temp_name(failed.substr(d.dir.size() + 1))) << failed;
    EXPECT_EQ(read_file(target), "target bytes");
    EXPECT_FALSE(exists(d.cacl));
    EXPECT_EQ(dir_entries(d.dir).size(), 0x10000u + 2);
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
    EXPECT_EQ(read_file(d.cacl), d.bytes);
    EXPECT_EQ(dir_entries(d.dir), (names{"acl", "acl.cacl"}));
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
