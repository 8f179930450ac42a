// Locating ACL files, looking up their users, and reading whole files.
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <pwd.h>
#include <string>
#include <unistd.h>

#include <gtest/gtest.h>

#include "alloc.h"
#include "files.h"
#include "frame.h"
#include "messages.h"
#include "file_helpers.h"
#include "support.h"

using namespace kxacl;
using kxtest::last_error;

namespace {

// Members in this order: the status is computed once the outputs exist.
struct resolved {
    path_buffer path{};
    uid_t uid = static_cast<uid_t>(-2);
    kx_int32_t status;
    resolved(const std::string &filename, const char *username)
        : status(sec__get_aclfname(filename.c_str(), username, path, &uid)) {}
};

std::string home_of(const char *user) {
    passwd *pw = getpwnam(user);
    return pw ? pw->pw_dir : "";
}

// ---- name resolution ------------------------------------------------------

TEST(GetAclfname, RelativeNameJoinsTheWorkingDirectory) {
    ASSERT_EQ(chdir("/"), 0);
    resolved in_root("acl", nullptr);
    ASSERT_EQ(in_root.status, SEC_S_OK);
    EXPECT_STREQ(in_root.path, "/acl");
    EXPECT_EQ(in_root.uid, static_cast<uid_t>(-2)) << "uid is set only for a user";

    ASSERT_EQ(chdir("/etc"), 0);
    resolved in_etc("acl", nullptr);
    ASSERT_EQ(in_etc.status, SEC_S_OK);
    EXPECT_STREQ(in_etc.path, "/etc/acl");
}

TEST(GetAclfname, FullPathIsTakenUnchangedUpToTheBufferSize) {
    std::string longest = "/" + std::string(4095, 'a');
    resolved fits(longest, nullptr);
    ASSERT_EQ(fits.status, SEC_S_OK);
    EXPECT_EQ(std::string(fits.path), longest);

    resolved too_long(longest + "b", nullptr);
    EXPECT_EQ(too_long.status, SEC_S_NO_ACL_FILE);
    auto e = last_error();
    EXPECT_EQ(e.id, SEC_S_NO_ACL_FILE);
    EXPECT_EQ(e.msg_num, MSG_2650_135);
    EXPECT_EQ(e.str(0), longest + "b");
    EXPECT_EQ(e.num(1), ENAMETOOLONG);
}

TEST(GetAclfname, WorkingDirectoryPlusNameMustFit) {
    std::string dir = kxtest::temp_dir();
    std::string deep = kxtest::path_of_length(dir, 3000);
    ASSERT_EQ(mkdir(deep.c_str(), 0755), 0);
    ASSERT_EQ(chdir(deep.c_str()), 0);
    // 3000 + "/" + name: 1095 characters fit exactly, 1096 do not.
    std::string name(1095, 'n');
    resolved fits(name, nullptr);
    ASSERT_EQ(fits.status, SEC_S_OK);
    EXPECT_EQ(std::strlen(fits.path), 4096u);

    resolved too_long(name + "n", nullptr);
    EXPECT_EQ(too_long.status, SEC_S_NO_ACL_FILE);
    auto e = last_error();
    EXPECT_EQ(e.id, SEC_S_NO_ACL_FILE);
    EXPECT_EQ(e.msg_num, MSG_2650_167);
    EXPECT_EQ(e.str(0), deep);
    EXPECT_EQ(e.str(1), name + "n");
}

TEST(GetAclfname, PathInTheUsersHome) {
    std::string root_home = home_of("root");
    ASSERT_FALSE(root_home.empty());
    resolved r("acl", "root");
    ASSERT_EQ(r.status, SEC_S_OK);
    EXPECT_EQ(std::string(r.path), root_home + "/acl");
    EXPECT_EQ(r.uid, 0u);
}

TEST(GetAclfname, HomeDirectoriesWithAndWithoutTrailingSlash) {
    KXTEST_REQUIRE_ROOT();
    kxtest::scoped_user at_root("/");
    kxtest::scoped_user at_home("/home/kxjoe");
    if (!at_root.ok() || !at_home.ok())
        GTEST_SKIP() << "SKIPPED: useradd failed";
    resolved r1("acl", at_root.name().c_str());
    ASSERT_EQ(r1.status, SEC_S_OK);
    EXPECT_STREQ(r1.path, "/acl");
    EXPECT_EQ(r1.uid, getpwnam(at_root.name().c_str())->pw_uid);
    resolved r2("acl", at_home.name().c_str());
    ASSERT_EQ(r2.status, SEC_S_OK);
    EXPECT_STREQ(r2.path, "/home/kxjoe/acl");
}

TEST(GetAclfname, HomePlusNameMustFit) {
    std::string home = home_of("root");
    ASSERT_FALSE(home.empty());
    // Lengths adding up to 4095 resolve (with the "/" 4096); 4096 do not.
    std::string name(4095 - home.size(), 'n');
    resolved fits(name, "root");
    ASSERT_EQ(fits.status, SEC_S_OK);
    EXPECT_EQ(std::strlen(fits.path), 4096u);

    resolved too_long(name + "n", "root");
    EXPECT_EQ(too_long.status, SEC_S_BAD_PARAM);
    auto e = last_error();
    EXPECT_EQ(e.msg_num, MSG_2650_165);
    EXPECT_EQ(e.str(0), name + "n");
    EXPECT_EQ(e.str(1), "root");
}

TEST(GetAclfname, NameWithPathRefusedBeforeTheUserIsLookedUp) {
    // The user does not exist: 2650-165 (status 4) proves no lookup happened.
    for (const char *name : {"dir/acl", "/tmp/acl", "acl/"}) {
        resolved r(name, "kx-no-such-user");
        EXPECT_EQ(r.status, SEC_S_BAD_PARAM) << name;
        auto e = last_error();
        EXPECT_EQ(e.msg_num, MSG_2650_165);
        EXPECT_EQ(e.str(0), name);
        EXPECT_EQ(e.str(1), "kx-no-such-user");
    }
}

TEST(GetAclfname, UnknownAndEmptyUsersAreNotFound) {
    for (const char *user : {"kx-no-such-user", ""}) {
        resolved r("acl", user);
        EXPECT_EQ(r.status, SEC_S_USER_NOT_FOUND) << user;
        auto e = last_error();
        EXPECT_EQ(e.id, SEC_S_USER_NOT_FOUND);
        EXPECT_EQ(e.msg_num, MSG_2650_140);
        EXPECT_EQ(e.str(0), user);
    }
}

// ---- user lookup ----------------------------------------------------------

TEST(GetUserInfo, NoMemoryForTheWorkBuffer) {
    long recommended = sysconf(_SC_GETPW_R_SIZE_MAX);
    long expected = 2 * (recommended > 0 ? recommended : 16384);
    uid_t uid = 99;
    path_buffer home{};
    std::size_t length = 0;
    mem_fail_after(0);
    kx_int32_t rc = sec__get_user_info("root", &uid, home, &length);
    mem_fail_after(-1);
    EXPECT_EQ(rc, SEC_S_NO_MEMORY);
    auto e = last_error();
    EXPECT_EQ(e.msg_num, MSG_2650_102);
    EXPECT_EQ(e.str(0), "sec__get_user_info");
    EXPECT_EQ(e.num(1), expected);
    EXPECT_EQ(uid, 99u);
}

// ---- reading --------------------------------------------------------------

struct read_result {
    char *buffer = reinterpret_cast<char *>(1);
    std::size_t size = 99;
    kx_int32_t status;
    read_result(const std::string &name, int fd)
        : status(acl__read_acl_file(name.c_str(), fd, &buffer, &size)) {}
    ~read_result() {
        if (buffer != reinterpret_cast<char *>(1))
            std::free(buffer);
    }
};

struct open_file {
    int fd;
    explicit open_file(const std::string &path) : fd(open(path.c_str(), O_RDONLY | O_CLOEXEC)) {}
    ~open_file() { close(fd); }
};

TEST(ReadWholeAclFile, EmptyFileGivesNoBuffer) {
    std::string path = kxtest::temp_dir() + "/acl";
    kxtest::write_file(path, "");
    open_file f(path);
    read_result r(path, f.fd);
    EXPECT_EQ(r.status, SEC_S_OK);
    EXPECT_EQ(r.buffer, nullptr);
    EXPECT_EQ(r.size, 0u);
}

TEST(ReadWholeAclFile, WholeFileFollowedByNul) {
    std::string path = kxtest::temp_dir() + "/acl";
    kxtest::write_file(path, "o r\ng st r");
    open_file f(path);
    read_result r(path, f.fd);
    ASSERT_EQ(r.status, SEC_S_OK);
    ASSERT_EQ(r.size, 10u);
    ASSERT_NE(r.buffer, nullptr);
    EXPECT_EQ(std::string(r.buffer, 11), std::string("o r\ng st r\0", 11));
}

TEST(ReadWholeAclFile, FileReplacedAfterOpeningIsAShortRead) {
    std::string dir = kxtest::temp_dir();
    std::string path = dir + "/acl";
    kxtest::write_file(path, "o r\n");
    open_file f(path);
    // The name now belongs to a longer file; the descriptor to the old one.
    kxtest::write_file(dir + "/new", "o rw\ng staff r\n");
    ASSERT_EQ(rename((dir + "/new").c_str(), path.c_str()), 0);
    read_result r(path, f.fd);
    EXPECT_EQ(r.status, SEC_S_FILE_ERROR);
    EXPECT_EQ(r.buffer, nullptr);
    EXPECT_EQ(r.size, 0u);
    auto e = last_error();
    EXPECT_EQ(e.msg_num, MSG_2650_139);
    EXPECT_EQ(e.num(0), 0);
    EXPECT_EQ(e.num(1), 15);
    EXPECT_EQ(e.num(2), 0);
}

TEST(ReadWholeAclFile, ShortCountIsNotRetried) {
    std::string path = kxtest::temp_dir() + "/acl";
    kxtest::write_file(path, "0123456789");
    open_file f(path);
    // Four bytes already consumed: one read returns the remaining six.
    ASSERT_EQ(lseek(f.fd, 4, SEEK_SET), 4);
    read_result r(path, f.fd);
    EXPECT_EQ(r.status, SEC_S_FILE_ERROR);
    EXPECT_EQ(r.buffer, nullptr);
    auto e = last_error();
    EXPECT_EQ(e.msg_num, MSG_2650_139);
    EXPECT_EQ(e.num(0), 6);
    EXPECT_EQ(e.num(1), 10);
    EXPECT_EQ(e.num(2), 0);
}

TEST(ReadWholeAclFile, ReadErrorShowsMinusOneAndErrno) {
    std::string dir = kxtest::temp_dir();
    open_file f(dir);
    struct stat st = kxtest::status_of(dir);
    if (st.st_size == 0)
        GTEST_SKIP() << "SKIPPED: directories have size 0 on this file system";
    read_result r(dir, f.fd);
    EXPECT_EQ(r.status, SEC_S_FILE_ERROR);
    EXPECT_EQ(r.buffer, nullptr);
    auto e = last_error();
    EXPECT_EQ(e.msg_num, MSG_2650_139);
    EXPECT_EQ(e.num(0), -1);
    EXPECT_EQ(e.num(1), st.st_size);
    EXPECT_EQ(e.num(2), EISDIR);
}

TEST(ReadWholeAclFile, NameWithoutFileFailsWith135) {
    std::string path = kxtest::temp_dir() + "/acl";
    kxtest::write_file(path, "o r\n");
    open_file f(path);
    ASSERT_EQ(unlink(path.c_str()), 0);
    read_result r(path, f.fd);
    EXPECT_EQ(r.status, SEC_S_FILE_ERROR);
    EXPECT_EQ(r.buffer, nullptr);
    auto e = last_error();
    EXPECT_EQ(e.id, SEC_S_FILE_ERROR);
    EXPECT_EQ(e.msg_num, MSG_2650_135);
    EXPECT_EQ(e.str(0), path);
    EXPECT_EQ(e.num(1), ENOENT);
}

TEST(ReadWholeAclFile, NoMemoryForTheContents) {
    std::string path = kxtest::temp_dir() + "/acl";
    kxtest::write_file(path, "0123456789");
    open_file f(path);
    mem_fail_after(0);
    read_result r(path, f.fd);
    mem_fail_after(-1);
    EXPECT_EQ(r.status, SEC_S_NO_MEMORY);
    EXPECT_EQ(r.buffer, nullptr);
    EXPECT_EQ(r.size, 0u);
    auto e = last_error();
    EXPECT_EQ(e.msg_num, MSG_2650_102);
    EXPECT_EQ(e.str(0), "sec_read_acl_file");
    EXPECT_EQ(e.num(1), 11);
}

TEST(ReadWholeAclFile, InfoAndPerfPoints) {
    std::string file = kxtest::start_tracing("_SEL:Info=1,Perf=2");
    ensure_trace_registered(); // no exported call here does it
    std::string path = kxtest::temp_dir() + "/acl";
    kxtest::write_file(path, "0123456789");
    open_file f(path);
    ASSERT_EQ(lseek(f.fd, 4, SEEK_SET), 4);
    read_result r(path, f.fd);
    ASSERT_EQ(r.status, SEC_S_FILE_ERROR);
    std::vector<unsigned> ids;
    for (const auto &rec : kxtest::read_trace(file)) {
        ids.push_back(rec.id);
        if (rec.id == 127) {
            ASSERT_EQ(rec.items.size(), 3u);
            EXPECT_EQ(rec.items[0], kxtest::hex_text(path));
            EXPECT_EQ(rec.items[1], kxtest::hex_of(std::uint64_t{10}));
            EXPECT_EQ(rec.items[2], kxtest::hex_of(std::int64_t{6}));
        }
        if (rec.id == 6) {
            EXPECT_EQ(rec.items.size(), 3u);
        }
    }
    EXPECT_EQ(ids, (std::vector<unsigned>{0, 127, 6})); // 0: registration at Perf 2
}

} // namespace
