// Threads read an ACL file while it is replaced, or while its name flips
// between two owners' files. Bounded by counts, not time; also for TSan.
#include <atomic>
#include <cstdio>
#include <thread>

#include "file_helpers.h"
#include "messages.h"

using namespace kxtest;

namespace {

const char text_a[] = "u unix bob rw\ng staff r\no r\n";
const char text_b[] = "u unix bob rcx\ng staff w\ng wheel r\n";

// reader(i) for i up to reads on three threads, work() on a fourth; the
// readers' first failure, or "".
template <typename Reader, typename Work>
std::string run_threads(int reads, Reader reader, Work work, std::atomic<bool> &readers_done) {
    std::atomic<int> failures{0}, left{3};
    std::string first;
    std::vector<std::thread> threads;
    for (int t = 0; t < 3; ++t)
        threads.emplace_back([&] {
            for (int i = 0; i < reads; ++i)
                if (std::string failed = reader(i); !failed.empty() && failures++ == 0)
                    first = failed;
            if (--left == 0)
                readers_done = true;
        });
    threads.emplace_back(work);
    for (std::thread &t : threads)
        t.join();
    return first;
}

// Readers see one whole version while the file is replaced by renaming a
// complete file over it, as editors do; B is dated ahead of any CACL file,
// so that readers compile and cache it, A behind, so that they take the
// CACL file of either. Finding the file replaced on every retry gives up
// (2650-139, nothing read): a slow scheduler's doing, not a fault.
TEST(ReadAclFileThreads, ReadersSeeOneWholeVersionWhileTheFileIsReplaced) {
    const std::string acl_a = compiled(text_a), acl_b = compiled(text_b);
    acl_dir d(text_a);
    std::atomic<bool> replaced{false}, done{false};
    auto reader = [&](int i) -> std::string {
        if (i >= 150 && replaced)
            return {};
        acl_read r(d.acl, CACHE | CONVERT);
        bool whole = r.status == SEC_S_OK && (r.bytes() == acl_a || r.bytes() == acl_b);
        bool gave_up = r.status == SEC_S_FILE_ERROR &&
                       last_error().msg_num == kxacl::MSG_2650_139 && last_error().num(0) == 0;
        return whole || gave_up ? "" : std::to_string(r.status) + " " + last_error().text;
    };
    auto replace = [&] {
        std::string staged = d.dir + "/staged";
        time_t now = time(nullptr);
        for (int i = 0; i < 60; ++i) {
            write_file(staged, i % 2 ? text_a : text_b);
            set_mtime(staged, i % 2 ? now - 100 : now + 100);
            EXPECT_EQ(std::rename(staged.c_str(), d.acl.c_str()), 0);
        }
        replaced = true;
    };
    EXPECT_EQ(run_threads(5000, reader, replace, done), "");
    const std::string cacl = read_file(d.cacl);
    EXPECT_TRUE(cacl == "<missing>" || cacl == acl_a || cacl == acl_b);
    for (const std::string &name : dir_entries(d.dir))
        EXPECT_TRUE(name == "acl" || name == "acl.cacl") << name;
}

// The ACL file's name, a symbolic link in a user's directory, flips between
// root's ACL file and the user's own while readers cache: every CACL file
// left holds the bytes of the file whose owner it carries (and is removed,
// so that more get written).
TEST(ReadAclFileThreads, CacheOfAFlippedNameHoldsTheBytesOfTheFileWhoseOwnerItCarries) {
    KXTEST_REQUIRE_ROOT();
    const std::string acl_a = compiled(text_a), acl_b = compiled(text_b);
    acl_dir root_file(text_a), user_dir(text_b, 0600);
    ASSERT_EQ(chown(user_dir.acl.c_str(), 1, 1), 0);
    const std::string name = user_dir.dir + "/flipped", cacl = name + ".cacl";
    ASSERT_EQ(symlink(root_file.acl.c_str(), name.c_str()), 0);
    std::atomic<int> checked{0};
    std::atomic<bool> done{false};
    auto reader = [&](int) -> std::string {
        acl_read r(name, CACHE);
        if (r.status != SEC_S_OK && last_error().msg_num != kxacl::MSG_2650_139)
            return last_error().text;
        int fd = open(cacl.c_str(), O_RDONLY | O_NOFOLLOW | O_CLOEXEC);
        if (fd < 0)
            return {};
        struct stat st;
        std::string bytes(4096, '\0');
        ssize_t n = fstat(fd, &st) == 0 ? read(fd, bytes.data(), bytes.size()) : -1;
        close(fd);
        if (n <= 0) // the writer's place holder, which no reader trusts
            return {};
        ++checked;
        bytes.resize(static_cast<std::size_t>(n));
        unlink(cacl.c_str());
        return bytes == (st.st_uid == 0 ? acl_a : acl_b) ? "" : "forged";
    };
    auto flip = [&] {
        const std::string staged = user_dir.dir + "/staged";
        for (int i = 0; !done && i < 1000000; ++i) {
            unlink(staged.c_str());
            if (symlink((i % 2 ? user_dir.acl : root_file.acl).c_str(), staged.c_str()) != 0 ||
                rename(staged.c_str(), name.c_str()) != 0) {
                ADD_FAILURE() << "flip " << i;
                break;
            }
        }
    };
    EXPECT_EQ(run_threads(300, reader, flip, done), "");
    EXPECT_GT(checked.load(), 0);
}

} // namespace
