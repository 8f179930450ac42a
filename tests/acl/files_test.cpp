// Where sec_read_acl_file looks for an ACL file (the path shows in the
// record of a file not found), and reading a whole open file.
#include <cerrno>
#include <cstdint>
#include <cstdlib>
#include <filesystem>
#include <functional>
#include <optional>
#include <pwd.h>
#include <string>
#include <unistd.h>
#include <vector>

#include <gtest/gtest.h>

#include "files.h"
#include "file_helpers.h"
#include "frame.h"
#include "messages.h"
#include "support.h"

using namespace kxacl;
using namespace kxtest;

namespace {

// A relative name joins the working directory, a simple name with a user
// the user's home (with no second slash after "/"); a name with a path is
// refused before the user is looked up (the user does not exist).
TEST(ReadAclFileNames, PathsBuiltFromTheWorkingDirectoryOrTheHome) {
    // As getcwd gives it, whatever links lead to the temporary directory.
    const std::string dir = std::filesystem::canonical(temp_dir()).string();
    const std::string deep = path_of_length(dir, 3000);
    ASSERT_EQ(mkdir(deep.c_str(), 0755), 0);
    const std::string fits(1095, 'n');
    // Not "/" + std::string: gcc 12 at -O3 takes that for an overlapping copy.
    std::string longest(4097, 'a');
    longest[0] = '/';
    const std::string home = getpwnam("root")->pw_dir, in_home(4095 - home.size(), 'n');
    const char *nobody = "kx-no-such-user";
    // clang-format off
    struct name_case {
        std::string what, cwd, file;
        const char *user;
        kx_int32_t status;
        int msg;
        std::vector<arg> args;
    };
    std::vector<name_case> cases = {
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
        {"full path", "/", "/tmp/acl", nobody, SEC_S_BAD_PARAM, MSG_2650_165, {"/tmp/acl", nobody}},
        {"trailing slash", "/", "acl/", nobody, SEC_S_BAD_PARAM, MSG_2650_165, {"acl/", nobody}},
        {"home and name of 4096", "/", in_home, "root", SEC_S_NO_ACL_FILE, MSG_2650_135,
         {home + "/" + in_home, ENAMETOOLONG}},
        {"home and name of 4097", "/", in_home + "n", "root", SEC_S_BAD_PARAM, MSG_2650_165,
         {in_home + "n", "root"}},
    };
    // clang-format on
    std::optional<scoped_user> at_root, at_home;
    if (geteuid() == 0) {
        at_root.emplace("/");
        at_home.emplace("/home/kxjoe");
        EXPECT_TRUE(at_root->ok() && at_home->ok());
        for (auto &[user, home] : {std::pair{&*at_root, "/"}, {&*at_home, "/home/kxjoe/"}})
            cases.push_back({home,
                             "/",
                             "kx-none-acl",
                             user->name().c_str(),
                             SEC_S_NO_ACL_FILE,
                             MSG_2650_135,
                             {home + std::string("kx-none-acl"), ENOENT}});
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

// ---- acl__read_acl_file ------------------------------------------------------

struct open_file {
    int fd;
    explicit open_file(const std::string &path) : fd(open(path.c_str(), O_RDONLY | O_CLOEXEC)) {}
    ~open_file() { close(fd); }
};

// Each read of a file holding bytes: its status and record, and the buffer
// (the bytes and a NUL; none when empty or on failure). A short read also
// shows in its Info point, with the name, the size and what was read.
TEST(ReadWholeAclFile, BufferOrReport) {
    std::string trace = start_tracing("_SEL:Info=1");
    ensure_trace_registered(); // no exported call here does it
    const std::string dir = temp_dir(), path = dir + "/acl", subdir = dir + "/sub";
    ASSERT_EQ(mkdir(subdir.c_str(), 0755), 0);
    write_file(subdir + "/file", "x"); // no file system gives it size 0
    const long long subdir_size = status_of(subdir).st_size;
    struct {
        const char *what;
        std::string name, bytes;
        std::function<void(int fd)> after_open;
        kx_int32_t status;
        int msg;
        std::vector<arg> args;
    } cases[] = {
        // clang-format off
        {"empty", path, "", {}, SEC_S_OK, 0, {}},
        {"bytes", path, "o r\ng st r", {}, SEC_S_OK, 0, {}},
        {"replaced after opening", path, "o r\n", [&](int) {
             write_file(dir + "/new", "o rw\ng staff r\n");
             ASSERT_EQ(rename((dir + "/new").c_str(), path.c_str()), 0);
         }, SEC_S_FILE_ERROR, MSG_2650_139, {0, 15, 0}},
        {"short count, not retried", path, "0123456789", [](int fd) {
             ASSERT_EQ(lseek(fd, 4, SEEK_SET), 4);
         }, SEC_S_FILE_ERROR, MSG_2650_139, {6, 10, 0}},
        {"a read error", subdir, "", {}, SEC_S_FILE_ERROR, MSG_2650_139, {-1, subdir_size, EISDIR}},
        {"name without file", path, "o r\n", [&](int) { ASSERT_EQ(unlink(path.c_str()), 0); },
         SEC_S_FILE_ERROR, MSG_2650_135, {path, ENOENT}},
        {"no memory", path, "0123456789", [](int) { mem_fail_after(0); }, SEC_S_NO_MEMORY,
         MSG_2650_102, {"sec_read_acl_file", 11}},
        // clang-format on
    };
    std::vector<std::string> short_reads, expected_short_reads;
    for (const auto &c : cases) {
        SCOPED_TRACE(c.what);
        if (c.name == path)
            write_file(path, c.bytes);
        open_file f(c.name);
        if (c.after_open)
            c.after_open(f.fd);
        char *buffer = reinterpret_cast<char *>(1);
        std::size_t size = 99;
        kx_int32_t status = acl__read_acl_file(c.name.c_str(), f.fd, &buffer, &size);
        mem_fail_after(-1);
        unique_mem<char> owned(buffer);
        EXPECT_EQ(status, c.status);
        EXPECT_TRUE(record_is(c.status, c.msg, c.args));
        std::string expected = c.status == SEC_S_OK && !c.bytes.empty() ? c.bytes + '\0' : "";
        EXPECT_EQ(size, expected.empty() ? 0 : expected.size() - 1);
        EXPECT_EQ(buffer ? std::string(buffer, size + 1) : "", expected);
        if (c.msg == MSG_2650_139)
            expected_short_reads.push_back(
                hex_text(c.name) + hex_of(static_cast<std::uint64_t>(std::get<0>(c.args[1]))) +
                hex_of(static_cast<std::int64_t>(std::get<0>(c.args[0]))));
    }
    for (const auto &rec : read_trace(trace))
        if (rec.id == 127)
            short_reads.push_back(rec.items[0] + rec.items[1] + rec.items[2]);
    EXPECT_EQ(short_reads, expected_short_reads);
}

} // namespace
