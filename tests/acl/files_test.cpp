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
using kxtest::record_is;

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

    EXPECT_EQ(resolved(longest + "b", nullptr).status, SEC_S_NO_ACL_FILE);
    EXPECT_TRUE(record_is(SEC_S_NO_ACL_FILE, MSG_2650_135, {longest + "b", ENAMETOOLONG}));
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

    EXPECT_EQ(resolved(name + "n", nullptr).status, SEC_S_NO_ACL_FILE);
    EXPECT_TRUE(record_is(SEC_S_NO_ACL_FILE, MSG_2650_167, {deep, name + "n"}));
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

// The user's home joins the name; lengths adding up to 4095 resolve (with
// the "/" 4096), 4096 do not.
TEST(GetAclfname, HomePlusNameMustFit) {
    std::string home = home_of("root");
    ASSERT_FALSE(home.empty());
    std::string name(4095 - home.size(), 'n');
    resolved fits(name, "root");
    ASSERT_EQ(fits.status, SEC_S_OK);
    EXPECT_EQ(std::string(fits.path), home + "/" + name);
    EXPECT_EQ(fits.uid, 0u);

    EXPECT_EQ(resolved(name + "n", "root").status, SEC_S_BAD_PARAM);
    EXPECT_TRUE(record_is(SEC_S_BAD_PARAM, MSG_2650_165, {name + "n", "root"}));
}

TEST(GetAclfname, NameWithPathRefusedBeforeTheUserIsLookedUp) {
    // The user does not exist: 2650-165 (status 4) proves no lookup happened.
    for (const char *name : {"dir/acl", "/tmp/acl", "acl/"}) {
        EXPECT_EQ(resolved(name, "kx-no-such-user").status, SEC_S_BAD_PARAM) << name;
        EXPECT_TRUE(record_is(SEC_S_BAD_PARAM, MSG_2650_165, {name, "kx-no-such-user"}));
    }
}

TEST(GetAclfname, UnknownAndEmptyUsersAreNotFound) {
    for (const char *user : {"kx-no-such-user", ""}) {
        EXPECT_EQ(resolved("acl", user).status, SEC_S_USER_NOT_FOUND) << user;
        EXPECT_TRUE(record_is(SEC_S_USER_NOT_FOUND, MSG_2650_140, {user}));
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

// The path of a file "acl" with the given bytes in a fresh directory.
std::string acl_file_with(const std::string &bytes) {
    std::string path = kxtest::temp_dir() + "/acl";
    kxtest::write_file(path, bytes);
    return path;
}

// A failed read: no buffer, and 2650-139 with what one read gave, the size
// expected and errno.
void expect_short_read(const read_result &r, long long got, long long size, int err) {
    EXPECT_EQ(r.status, SEC_S_FILE_ERROR);
    EXPECT_EQ(r.buffer, nullptr);
    EXPECT_EQ(r.size, 0u);
    EXPECT_TRUE(record_is(SEC_S_FILE_ERROR, MSG_2650_139, {got, size, err}));
}

TEST(ReadWholeAclFile, WholeFileFollowedByNul) {
    std::string empty = acl_file_with("");
    read_result none(empty, open_file(empty).fd);
    EXPECT_EQ(none.status, SEC_S_OK);
    EXPECT_EQ(none.buffer, nullptr);
    EXPECT_EQ(none.size, 0u);

    std::string path = acl_file_with("o r\ng st r");
    read_result r(path, open_file(path).fd);
    ASSERT_EQ(r.status, SEC_S_OK);
    ASSERT_EQ(r.size, 10u);
    ASSERT_NE(r.buffer, nullptr);
    EXPECT_EQ(std::string(r.buffer, 11), std::string("o r\ng st r\0", 11));
}

TEST(ReadWholeAclFile, FileReplacedAfterOpeningIsAShortRead) {
    std::string path = acl_file_with("o r\n");
    open_file f(path);
    // The name now belongs to a longer file; the descriptor to the old one.
    kxtest::write_file(path + ".new", "o rw\ng staff r\n");
    ASSERT_EQ(rename((path + ".new").c_str(), path.c_str()), 0);
    expect_short_read(read_result(path, f.fd), 0, 15, 0);
}

TEST(ReadWholeAclFile, ReadErrorShowsMinusOneAndErrno) {
    std::string dir = kxtest::temp_dir();
    struct stat st = kxtest::status_of(dir);
    if (st.st_size == 0)
        GTEST_SKIP() << "SKIPPED: directories have size 0 on this file system";
    expect_short_read(read_result(dir, open_file(dir).fd), -1, st.st_size, EISDIR);
}

TEST(ReadWholeAclFile, NameWithoutFileFailsWith135) {
    std::string path = acl_file_with("o r\n");
    open_file f(path);
    ASSERT_EQ(unlink(path.c_str()), 0);
    read_result r(path, f.fd);
    EXPECT_EQ(r.status, SEC_S_FILE_ERROR);
    EXPECT_EQ(r.buffer, nullptr);
    EXPECT_TRUE(record_is(SEC_S_FILE_ERROR, MSG_2650_135, {path, ENOENT}));
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

// A read that returns fewer bytes than the size is not retried: four
// bytes consumed, one read returns the remaining six.
TEST(ReadWholeAclFile, ShortCountIsNotRetried) {
    std::string file = kxtest::start_tracing("_SEL:Info=1,Perf=2");
    ensure_trace_registered(); // no exported call here does it
    std::string path = acl_file_with("0123456789");
    open_file f(path);
    ASSERT_EQ(lseek(f.fd, 4, SEEK_SET), 4);
    expect_short_read(read_result(path, f.fd), 6, 10, 0);
    // The Info point shows the name, the size and the read's result.
    auto r = kxtest::read_trace(file);
    EXPECT_EQ(kxtest::trace_ids(file), (std::vector<unsigned>{0, 127, 6})); // 0: Perf 2 announced
    ASSERT_EQ(r.size(), 3u);
    EXPECT_EQ(r[1].items,
              (std::vector<std::string>{kxtest::hex_text(path), kxtest::hex_of(std::uint64_t{10}),
                                        kxtest::hex_of(std::int64_t{6})}));
    EXPECT_EQ(r[2].items.size(), 3u);
}

} // namespace
