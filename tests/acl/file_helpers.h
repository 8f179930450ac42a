// Helpers of the ACL file tests.
#ifndef KXACL_TEST_FILE_HELPERS_H
#define KXACL_TEST_FILE_HELPERS_H

#include <dirent.h>
#include <fcntl.h>
#include <functional>
#include <sys/stat.h>
#include <unistd.h>
#include <variant>

#include "acl_fixtures.h"
#include "syscalls.h"

namespace kxtest {

inline void write_file(const std::string &path, const std::string &bytes, mode_t mode = 0644) {
    int fd = open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0600);
    ASSERT_GE(fd, 0) << path;
    ASSERT_EQ(write(fd, bytes.data(), bytes.size()), static_cast<ssize_t>(bytes.size()));
    ASSERT_EQ(fchmod(fd, mode), 0);
    close(fd);
}
inline std::string read_file(const std::string &path) {
    std::string bytes;
    int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC);
    if (fd < 0)
        return "<missing>";
    char chunk[4096];
    for (ssize_t n; (n = read(fd, chunk, sizeof chunk)) > 0;)
        bytes.append(chunk, static_cast<std::size_t>(n));
    close(fd);
    return bytes;
}
inline struct stat status_of(const std::string &path) {
    struct stat st {};
    EXPECT_EQ(lstat(path.c_str(), &st), 0) << path;
    return st;
}

inline void shift_mtime(const std::string &path, long delta) {
    timespec times[2] = {{0, UTIME_OMIT}, status_of(path).st_mtim};
    times[1].tv_sec += delta;
    ASSERT_EQ(utimensat(AT_FDCWD, path.c_str(), times, AT_SYMLINK_NOFOLLOW), 0) << path;
}

inline void set_mtime(const std::string &path, time_t seconds) {
    timespec times[2] = {{0, UTIME_OMIT}, {seconds, 0}};
    ASSERT_EQ(utimensat(AT_FDCWD, path.c_str(), times, AT_SYMLINK_NOFOLLOW), 0) << path;
}

// Sorted, without "." and "..".
inline std::vector<std::string> dir_entries(const std::string &dir) {
    std::vector<std::string> names;
    if (DIR *d = opendir(dir.c_str())) {
        while (dirent *e = readdir(d)) {
            std::string n = e->d_name;
            if (n != "." && n != "..")
                names.push_back(n);
        }
        closedir(d);
    }
    std::sort(names.begin(), names.end());
    return names;
}

// Message arguments with a leading "$" of a text standing for dir.
inline std::vector<arg> in_dir(const std::string &dir, std::vector<arg> args) {
    for (arg &a : args)
        if (auto *s = std::get_if<std::string>(&a); s && !s->empty() && (*s)[0] == '$')
            *s = dir + s->substr(1);
    return args;
}

// A path of exactly length characters under base; its directories are made.
inline std::string path_of_length(const std::string &base, std::size_t length) {
    std::string p = base;
    while (length - p.size() > 256) {
        p += "/" + std::string(200, 'd');
        EXPECT_EQ(mkdir(p.c_str(), 0755), 0) << p.size();
    }
    return p + "/" + std::string(length - p.size() - 1, 'f');
}

inline std::string example_acl() {
    return std::string(worked_example.begin(), worked_example.end());
}
inline const char example_text[] = "u unix bob rw\ng staff r\no r\n";
constexpr kx_uint32_t TEXT = SEC_F_ACL_TEXT, CACHE = SEC_F_ACL_CACHE, CONVERT = SEC_F_ACL_CONVERT;

// One call of sec_read_acl_file.
struct acl_read {
    sec_buffer_s acl{0, nullptr};
    kx_uint32_t rflags = 0xdeadbeef; // until the call sets it
    kx_int32_t status;
    acl_read(const std::string &file, kx_uint32_t flags, const char *user = nullptr,
             sec_perm_set_t permtmpl = nullptr)
        : status(sec_read_acl_file(file.c_str(), user, permtmpl, flags, &acl, &rflags)) {}
    ~acl_read() { std::free(acl.value); }
    acl_read(const acl_read &) = delete;
    acl_read &operator=(const acl_read &) = delete;
    std::string bytes() const {
        return acl.value ? std::string(static_cast<const char *>(acl.value),
                                       static_cast<std::size_t>(acl.length))
                         : std::string();
    }
    bool empty() const { return acl.length == 0 && acl.value == nullptr; }
};

// An ACL file "acl" in a fresh directory, last changed 10 seconds ago so
// that a CACL file written now is strictly newer.
struct acl_dir {
    std::string dir = temp_dir();
    std::string acl = dir + "/acl";
    std::string cacl = acl + ".cacl";
    explicit acl_dir(const std::string &text = example_text, mode_t mode = 0644) {
        write_file(acl, text, mode);
        shift_mtime(acl, -10);
    }
};

// Runs flip just before the reader's system call of kind numbered nth
// (counted from now): a name given to another file between its steps.
inline void flip_before(kxacl::sys_call kind, long nth, std::function<void()> *flip) {
    kxacl::sys_before_nth(
        kind, nth, [](void *f) { (*static_cast<std::function<void()> *>(f))(); }, flip);
}

inline std::string compiled(const std::string &text) {
    acl_dir d(text);
    return acl_read(d.acl, SEC_F_ACL_TEXT).bytes();
}

// A user made for one test; commands are retried while useradd locks files.
struct scoped_user {
    static inline int made = 0;
    std::string name = "kxt" + std::to_string(getpid()) + "x" + std::to_string(made++);
    bool ok;
    explicit scoped_user(const std::string &home)
        : ok(run("useradd -M -N -s /usr/sbin/nologin -d '" + home + "' " + name)) {}
    ~scoped_user() {
        if (ok)
            run("userdel " + name);
    }
    scoped_user(const scoped_user &) = delete;
    scoped_user &operator=(const scoped_user &) = delete;
    static bool run(const std::string &command) {
        for (int attempt = 0; attempt < 50; ++attempt, usleep(100000))
            if (std::system((command + " >/dev/null 2>&1").c_str()) == 0)
                return true;
        return false;
    }
};
#define KXTEST_REQUIRE_ROOT()                                                                      \
    do {                                                                                           \
        if (geteuid() != 0)                                                                        \
            GTEST_SKIP() << "SKIPPED: needs root (creates users or changes file owners)";          \
    } while (0)
} // namespace kxtest

#endif
