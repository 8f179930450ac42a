// Stress: threads read an ACL file through its CACL file while it is
// replaced, or while its name flips between two owners' files. Bounded by
// iteration counts, not time; meant for ThreadSanitizer as well as plain
// runs. (Evaluating while handlers are registered: eval_threads_test.)
#include <atomic>
#include <cstdio>
#include <fcntl.h>
#include <string>
#include <sys/stat.h>
#include <thread>
#include <unistd.h>
#include <vector>

#include <gtest/gtest.h>

#include <kx_acl.h>

#include "file_helpers.h"
#include "messages.h"

using namespace kxtest;

namespace {

const char text_a[] = "u unix bob rw\ng staff r\no r\n";
const char text_b[] = "u unix bob rcx\ng staff w\ng wheel r\n";

std::string compiled(const char *text) {
    acl_dir d(text);
    return acl_read(d.acl, TEXT).bytes();
}

// A reader that finds the file replaced under it on every one of its
// retries gives up with 2650-139 and nothing read, which a slow scheduler
// (valgrind, the sanitizers) can bring about: that is an answer, not a fault.
bool gave_up(const acl_read &r) {
    return r.status == SEC_S_FILE_ERROR && last_error().msg_num == kxacl::MSG_2650_139 &&
           last_error().num(0) == 0;
}

// Readers see one whole version while the file is replaced by renaming a
// complete file over it, as editors do; B is dated ahead of any CACL file
// written meanwhile, so that readers compile it, A behind, so that they
// take the CACL file of either.
TEST(ReadAclFileThreads, ReadersSeeOneWholeVersionWhileTheFileIsReplaced) {
    const std::string acl_a = compiled(text_a), acl_b = compiled(text_b);
    acl_dir d(text_a);
    std::atomic<int> failures{0};
    std::atomic<bool> replaced{false};
    std::string first_failure;
    std::vector<std::thread> threads;
    // At least 150 reads each, and at most 5000.
    for (int t = 0; t < 3; ++t)
        threads.emplace_back([&] {
            for (int i = 0; i < 5000 && (i < 150 || !replaced); ++i) {
                acl_read r(d.acl, CACHE | CONVERT);
                bool whole = r.status == SEC_S_OK && (r.bytes() == acl_a || r.bytes() == acl_b);
                if (!whole && !gave_up(r) && failures++ == 0)
                    first_failure = std::to_string(r.status) + " " + last_error().text;
            }
        });
    threads.emplace_back([&] {
        std::string staged = d.dir + "/staged";
        time_t now = time(nullptr);
        for (int i = 0; i < 60; ++i) {
            bool b = i % 2 == 0;
            write_file(staged, b ? text_b : text_a);
            set_mtime(staged, b ? now + 100 : now - 100);
            if (std::rename(staged.c_str(), d.acl.c_str()) != 0)
                ++failures;
        }
        replaced = true;
    });
    for (std::thread &t : threads)
        t.join();
    EXPECT_EQ(failures.load(), 0) << first_failure;
    for (const std::string &name : dir_entries(d.dir))
        EXPECT_TRUE(name == "acl" || name == "acl.cacl") << name;
}

// A local user's race against readers that cache: the ACL file's name, a
// symbolic link in the user's directory, flips between root's ACL file and
// the user's own. Every CACL file that a reader leaves must hold the bytes
// compiled from the file whose owner it carries; it is removed after the
// check so that more get written. Bounded by the readers' count of reads.
TEST(ReadAclFileThreads, CacheOfAFlippedNameHoldsTheBytesOfTheFileWhoseOwnerItCarries) {
    KXTEST_REQUIRE_ROOT();
    const std::string acl_a = compiled(text_a), acl_b = compiled(text_b);
    acl_dir root_file(text_a), user_dir(text_b, 0600);
    ASSERT_EQ(chown(user_dir.acl.c_str(), 1, 1), 0);
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
                if (bytes.empty()) // the writer's place holder, which no reader trusts
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
            const std::string &target = i % 2 ? user_dir.acl : root_file.acl;
            if (symlink(target.c_str(), staged.c_str()) != 0 ||
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
