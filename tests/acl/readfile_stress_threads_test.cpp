// Stress: threads read the same ACL file through its cached file, list and
// evaluate what they read, while one thread rewrites the file and another
// registers identity handlers. Bounded by iteration counts, not time; meant
// for ThreadSanitizer as well as plain runs.
#include <atomic>
#include <cstdio>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>
#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include <kx_acl.h>
#include <kx_cu.h>

#include "file_helpers.h"
#include "messages.h"

using namespace kxtest;

namespace {

const char text_a[] = "u unix bob rw\ng staff r\no r\n";
const char text_b[] = "u unix bob rcx\ng staff w\ng wheel r\n";
constexpr kx_uint32_t bob_in_a = 0x3, bob_in_b = 0xd;

kx_int32_t same_user(char *id, char *acle_id) {
    return cu_strcasecmp_posix_1(id, acle_id);
}

// Everything a reader does with one read; false when anything is off. A
// reader that finds the file replaced under it on every one of its retries
// gives up with 2650-139, which a slow scheduler (valgrind, the sanitizers)
// can bring about: that is an answer, not a fault.
bool read_list_and_evaluate(const std::string &path, const std::string &a, const std::string &b,
                            std::string *what) {
    acl_read r(path, CACHE | CONVERT);
    if (r.status == SEC_S_FILE_ERROR && last_error().msg_num == kxacl::MSG_2650_139 &&
        last_error().num(0) == 0)
        return true;
    if (r.status != SEC_S_OK || (r.bytes() != a && r.bytes() != b)) {
        *what = "read: " + std::to_string(r.status) + " " + last_error().text;
        return false;
    }
    bool is_a = r.bytes() == a;
    sec_acle_list_s list{0, nullptr};
    kx_int32_t rc = sec_list_acl(&r.acl, &list);
    kx_int32_t count = list.count;
    sec_release_aclelist(&list);
    if (rc != SEC_S_OK || count != 3) {
        *what = "list: " + std::to_string(rc) + ", " + std::to_string(count) + " entries";
        return false;
    }
    char mech[] = "unix", bob[] = "BOB";
    kx_uint32_t perm = 0;
    rc = sec__single_acle_perm(&r.acl, SEC_ACLE_USER | SEC_ACLE_HANDLER_BIT, mech, nullptr, bob,
                               &perm);
    if (rc != SEC_S_OK || perm != (is_a ? bob_in_a : bob_in_b)) {
        *what = "evaluate: " + std::to_string(rc) + ", mask " + std::to_string(perm);
        return false;
    }
    char staff[] = "staff";
    sec_buffer_s groups[] = {{6, staff}};
    rc = sec__group_acles_perm(&r.acl, 1, groups, &perm);
    if (rc != SEC_S_OK || perm != (is_a ? 0x1u : 0x2u)) {
        *what = "groups: " + std::to_string(rc) + ", mask " + std::to_string(perm);
        return false;
    }
    return true;
}

TEST(ReadAclFileThreads, ReadersListersAndEvaluatorsWhileTheFileIsRewritten) {
    acl_dir d(text_a);
    std::string acl_a, acl_b;
    {
        acl_read a(d.acl, TEXT);
        acl_a = a.bytes();
        acl_dir other(text_b);
        acl_read b(other.acl, TEXT);
        acl_b = b.bytes();
    }
    ASSERT_EQ(sec__register_id_handler(SEC_ID_HANDLER_USER, "unix", same_user), SEC_S_OK);

    std::atomic<int> failures{0};
    std::string first_failure;
    std::atomic<bool> failure_noted{false};
    auto note = [&](const std::string &what) {
        if (failures++ == 0) {
            first_failure = what;
            failure_noted = true;
        }
    };

    // Readers go on while the file is rewritten, at least 150 times each
    // and at most 5000.
    std::atomic<bool> rewritten{false};
    std::vector<std::thread> threads;
    for (int t = 0; t < 3; ++t)
        threads.emplace_back([&] {
            for (int i = 0; i < 5000 && (i < 150 || !rewritten); ++i) {
                std::string what;
                if (!read_list_and_evaluate(d.acl, acl_a, acl_b, &what))
                    note(what);
            }
        });
    // Rewrites by renaming a complete file over the ACL file, as editors
    // do; the text B is dated ahead of any cached file written meanwhile.
    threads.emplace_back([&] {
        std::string staged = d.dir + "/staged";
        time_t now = time(nullptr);
        for (int i = 0; i < 60; ++i) {
            bool b = i % 2 == 0;
            write_file(staged, b ? text_b : text_a);
            set_mtime(staged, b ? now + 100 : now - 100);
            if (std::rename(staged.c_str(), d.acl.c_str()) != 0)
                note("rename");
        }
        rewritten = true;
    });
    threads.emplace_back([&] {
        for (int i = 0; i < 200; ++i) {
            std::string mech = "m";
            mech += std::to_string(i);
            kx_uint32_t type = i % 2 ? SEC_ID_HANDLER_USER : SEC_ID_HANDLER_EXPANDED;
            if (sec__register_id_handler(type, mech.c_str(), same_user) != SEC_S_OK)
                note("register " + mech);
        }
    });
    for (std::thread &t : threads)
        t.join();
    EXPECT_EQ(failures.load(), 0) << (failure_noted ? first_failure : "");
    for (const std::string &name : dir_entries(d.dir))
        EXPECT_TRUE(name == "acl" || name == "acl.cacl") << name;
}

// A local user's race against a reader that caches: the ACL file's name, a
// symbolic link in the user's directory, flips between root's ACL file and
// the user's own while readers read it with the cache flag. Every CACL file
// that a reader leaves must hold the bytes compiled from the file whose
// owner it carries; it is removed after the check so that more get written.
// The cycle is bounded by the readers' count of reads.
TEST(ReadAclFileThreads, CacheOfAFlippedNameHoldsTheBytesOfTheFileWhoseOwnerItCarries) {
    KXTEST_REQUIRE_ROOT();
    acl_dir root_file(text_a);
    acl_dir user_dir(text_b, 0600);
    ASSERT_EQ(chown(user_dir.acl.c_str(), 1, 1), 0);
    std::string acl_a, acl_b;
    {
        acl_read a(root_file.acl, TEXT), b(user_dir.acl, TEXT);
        acl_a = a.bytes();
        acl_b = b.bytes();
    }
    const std::string name = user_dir.dir + "/flipped", cacl = name + ".cacl";
    ASSERT_EQ(symlink(root_file.acl.c_str(), name.c_str()), 0);

    std::atomic<int> readers_left{3}, forged{0}, failed{0}, checked{0};
    std::vector<std::thread> threads;
    for (int t = 0; t < 3; ++t)
        threads.emplace_back([&] {
            for (int i = 0; i < 300; ++i) {
                acl_read r(name, CACHE);
                if (r.status != SEC_S_OK && last_error().msg_num != kxacl::MSG_2650_139)
                    ++failed;
                int fd = open(cacl.c_str(), O_RDONLY | O_NOFOLLOW | O_CLOEXEC);
                if (fd < 0)
                    continue;
                struct stat st;
                std::string bytes(4096, '\0');
                ssize_t n = fstat(fd, &st) == 0 ? read(fd, bytes.data(), bytes.size()) : -1;
                close(fd);
                bytes.resize(n > 0 ? static_cast<std::size_t>(n) : 0);
                // Empty: the writer's place holder, which no reader trusts.
                if (bytes.empty())
                    continue;
                ++checked;
                if (bytes != (st.st_uid == 0 ? acl_a : acl_b))
                    ++forged;
                unlink(cacl.c_str());
            }
            --readers_left;
        });
    threads.emplace_back([&] {
        const std::string staged = user_dir.dir + "/staged";
        for (int i = 0; readers_left > 0 && i < 1000000; ++i) {
            unlink(staged.c_str());
            if (symlink(i % 2 ? user_dir.acl.c_str() : root_file.acl.c_str(), staged.c_str()) !=
                    0 ||
                rename(staged.c_str(), name.c_str()) != 0)
                ++failed;
        }
    });
    for (std::thread &t : threads)
        t.join();
    EXPECT_GT(checked.load(), 0);
    EXPECT_EQ(forged.load(), 0);
    EXPECT_EQ(failed.load(), 0);
}

} // namespace
