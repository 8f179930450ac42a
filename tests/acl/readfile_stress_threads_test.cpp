// Threads read an ACL file while it is replaced. Bounded by counts, not
// time; also for TSan.
#include <atomic>
#include <cstdio>
#include <thread>

#include "file_helpers.h"
#include "messages.h"

using namespace kxtest;

namespace {

// Readers see one whole version while the file is renamed over, B dated
// ahead of any CACL file, A behind. Giving up (2650-139, nothing read)
// after a replacement on every retry is a slow scheduler's doing.
TEST(ReadAclFileThreads, ReadersSeeOneWholeVersionWhileTheFileIsReplaced) {
    const char text_a[] = "u unix bob rw\ng staff r\no r\n",
               text_b[] = "u unix bob rcx\ng staff w\ng wheel r\n";
    const std::string acl_a = compiled(text_a), acl_b = compiled(text_b);
    acl_dir d(text_a);
    std::atomic<bool> replaced{false};
    std::atomic<int> failures{0};
    std::string first_failure;
    auto reader = [&] {
        for (int i = 0; i < 5000 && (i < 150 || !replaced); ++i) {
            acl_read r(d.acl, CACHE | CONVERT);
            bool whole = r.status == SEC_S_OK && (r.bytes() == acl_a || r.bytes() == acl_b);
            bool gave_up = r.status == SEC_S_FILE_ERROR &&
                           last_error().msg_num == kxacl::MSG_2650_139 && last_error().num(0) == 0;
            if (!whole && !gave_up && failures++ == 0)
                first_failure = std::to_string(r.status) + " " + last_error().text;
        }
    };
    std::vector<std::thread> threads(3);
    for (std::thread &t : threads)
        t = std::thread(reader);
    std::string staged = d.dir + "/staged";
    time_t now = time(nullptr);
    for (int i = 0; i < 60; ++i) {
        write_file(staged, i % 2 ? text_a : text_b);
        set_mtime(staged, i % 2 ? now - 100 : now + 100);
        EXPECT_EQ(std::rename(staged.c_str(), d.acl.c_str()), 0);
    }
    replaced = true;
    for (std::thread &t : threads)
        t.join();
    EXPECT_EQ(first_failure, "");
    const std::string cacl = read_file(d.cacl);
    EXPECT_TRUE(cacl == "<missing>" || cacl == acl_a || cacl == acl_b);
    for (const std::string &name : dir_entries(d.dir))
        EXPECT_TRUE(name == "acl" || name == "acl.cacl") << name;
}

} // namespace
