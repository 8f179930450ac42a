// Locating an ACL file, looking up the user who owns it, and reading an
// open file into memory.
#include "files.h"

#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <pwd.h>
#include <sys/stat.h>
#include <unistd.h>

#include "alloc.h"
#include "frame.h"
#include "parse.h"
#include "report.h"
#include "syscalls.h"

namespace kxacl {

namespace {

// Work buffer of the user lookup when the system recommends no size:
// sysconf answers -1 where the size is unbounded, and a doubled -1 would
// make the lookup fail for every user. 16 KiB, doubled, holds any sane
// password entry. A recommendation above 1 MiB is capped at that, so that
// the doubled size stays a signed 32-bit byte count.
constexpr kx_int32_t fallback_pw_buffer_size = 16384;
constexpr kx_int32_t largest_pw_buffer_size = 1 << 20;

kx_int32_t pw_buffer_size() {
    long recommended = sysconf(_SC_GETPW_R_SIZE_MAX);
    if (recommended <= 0)
        return fallback_pw_buffer_size;
    if (recommended > largest_pw_buffer_size)
        return largest_pw_buffer_size;
    return static_cast<kx_int32_t>(recommended);
}

kx_int32_t user_not_found(const char *uname) {
    return report<MSG_2650_140>(SEC_S_USER_NOT_FOUND, uname);
}

// Writes "/" unless the directory already in path (dir_length characters)
// ends with one, then name. The caller has made sure that the result fits.
void append_name(char *path, std::size_t dir_length, const char *name, std::size_t name_length) {
    if (dir_length == 0 || path[dir_length - 1] != '/')
        path[dir_length++] = '/';
    std::memcpy(path + dir_length, name, name_length + 1);
}

kx_int32_t path_in_home(const char *filename, const char *username, char *aclfname, uid_t *uid) {
    // A path in the name would lead out of the user's home directory.
    if (std::strchr(filename, '/'))
        return report<MSG_2650_165>(SEC_S_BAD_PARAM, filename, username);
    std::size_t home_length = 0;
    kx_int32_t rc = sec__get_user_info(username, uid, aclfname, &home_length);
    if (rc != SEC_S_OK)
        return rc;
    // A home directory longer than a path buffer fails here too, since it
    // alone already exceeds the limit.
    std::size_t name_length = std::strlen(filename);
    if (home_length + name_length + 1 > max_path_length)
        return report<MSG_2650_165>(SEC_S_BAD_PARAM, filename, username);
    append_name(aclfname, home_length, filename, name_length);
    return SEC_S_OK;
}

kx_int32_t path_from_working_dir(const char *filename, char *aclfname) {
    std::size_t name_length = std::strlen(filename);
    if (filename[0] == '/') {
        // A full path longer than a path buffer names no file that the
        // system could open: the same report as a file that is not there.
        if (name_length > max_path_length)
            return report<MSG_2650_135>(SEC_S_NO_ACL_FILE, filename, ENAMETOOLONG);
        std::memcpy(aclfname, filename, name_length + 1);
        return SEC_S_OK;
    }
    if (!sys_getcwd(aclfname, max_path_length + 1))
        return report<MSG_2650_166>(SEC_S_NO_ACL_FILE, "getcwd()", errno);
    std::size_t dir_length = std::strlen(aclfname);
    if (dir_length + name_length + 1 > max_path_length)
        return report<MSG_2650_167>(SEC_S_NO_ACL_FILE, aclfname, filename);
    append_name(aclfname, dir_length, filename, name_length);
    return SEC_S_OK;
}

// Runs read() and records its time in its Perf point.
template <typename Read> kx_int32_t timed_read(Read read) {
    perf_timer timer(wanted<KX_ACL_TP_READ_BYTES>());
    kx_int32_t rc = read();
    if (timer.wanted()) {
        perf_elapsed e = timer.elapsed();
        trace<KX_ACL_TP_READ_BYTES>(num(e.ticks), num(e.seconds), num(e.nanoseconds));
    }
    return rc;
}

// 2650-102 for the bytes asked for to read a file of size bytes.
kx_int32_t no_memory_for(const char *aclfname, std::uint64_t size, std::size_t asked) {
    if (wanted<KX_ACL_TP_READ_NO_MEMORY>())
        trace<KX_ACL_TP_READ_NO_MEMORY>(text(aclfname), num(size));
    return no_memory("sec_read_acl_file", asked);
}

kx_int32_t read_sized(const char *aclfname, int aclfdes, std::uint64_t size, char **aclfbuf,
                      std::size_t *aclfsize) {
    if (size == 0)
        return SEC_S_OK;
    // The read fills every byte before the NUL, or the buffer goes: only
    // the NUL needs writing, not the whole buffer zeroing first.
    unique_mem<char> buffer(static_cast<char *>(mem_alloc(size + 1)));
    if (!buffer)
        return no_memory_for(aclfname, size, size + 1);
    // One read of the whole size; a short count is not retried.
    errno = 0;
    ssize_t got = sys_read(aclfdes, buffer.get(), size);
    if (got < 0 || static_cast<std::uint64_t>(got) != size)
        return report_short_read(aclfname, size, got, got < 0 ? errno : 0);
    buffer.get()[size] = '\0';
    *aclfbuf = buffer.release();
    *aclfsize = size;
    return SEC_S_OK;
}

// The window of a text_reader: large enough for many lines per read, and
// always for more than the longest line, so that a window full of one
// line proves that line too long.
constexpr std::size_t text_window_size = std::size_t{64} * 1024;
static_assert(text_window_size > max_line_length);

} // namespace

// 2650-135 for a file whose status cannot be taken, with its Info point.
kx_int32_t report_unexaminable(const char *aclfname, int err) {
    if (wanted<KX_ACL_TP_READ_FSTAT_FAILED>())
        trace<KX_ACL_TP_READ_FSTAT_FAILED>(text(aclfname), num(err));
    return report<MSG_2650_135>(SEC_S_FILE_ERROR, aclfname, err);
}

// 2650-139: got bytes (-1 for a read error) of a file of size bytes.
kx_int32_t report_short_read(const char *aclfname, std::uint64_t size, std::int64_t got, int err) {
    if (wanted<KX_ACL_TP_READ_SHORT>())
        trace<KX_ACL_TP_READ_SHORT>(text(aclfname), num(size), num(got));
    int shown = got < 0 ? -1 : byte_count(static_cast<std::size_t>(got));
    return report<MSG_2650_139>(SEC_S_FILE_ERROR, shown, byte_count(size), err);
}

kx_int32_t sec__get_aclfname(const char *filename, const char *username, char *aclfname,
                             uid_t *uid) {
    return username ? path_in_home(filename, username, aclfname, uid)
                    : path_from_working_dir(filename, aclfname);
}

kx_int32_t sec__get_user_info(const char *uname, uid_t *uid, char *hdir, std::size_t *hdir_length) {
    kx_int32_t size = pw_buffer_size();
    std::size_t bytes = 2 * static_cast<std::size_t>(size);
    unique_mem<char> work(static_cast<char *>(mem_alloc(bytes)));
    if (!work)
        return no_memory("sec__get_user_info", bytes);
    // An empty name names nobody; the system is not asked, since what it
    // answers for "" differs between name services.
    if (uname[0] == '\0')
        return user_not_found(uname);
    passwd entry{};
    passwd *found = nullptr;
    if (getpwnam_r(uname, &entry, work.get(), bytes, &found) != 0 || !found)
        return user_not_found(uname);
    // Name services may match loosely (case, aliases); the user must be
    // found under exactly the name given.
    if (std::strncmp(found->pw_name, uname, static_cast<std::size_t>(size)) != 0)
        return user_not_found(uname);
    const char *home = found->pw_dir ? found->pw_dir : "";
    std::size_t length = std::strlen(home);
    *uid = found->pw_uid;
    *hdir_length = length;
    if (length > max_path_length)
        hdir[0] = '\0';
    else
        std::memcpy(hdir, home, length + 1);
    return SEC_S_OK;
}

kx_int32_t acl__lock_acl_file(const char *, int, kx_uint32_t) {
    return SEC_S_OK;
}

kx_int32_t read_known_size(const char *aclfname, int aclfdes, std::uint64_t size, char **aclfbuf,
                           std::size_t *aclfsize) {
    *aclfbuf = nullptr;
    *aclfsize = 0;
    return timed_read([&] { return read_sized(aclfname, aclfdes, size, aclfbuf, aclfsize); });
}

text_reader::text_reader(const char *aclfname, int aclfdes, std::uint64_t size)
    : name_(aclfname), fd_(aclfdes), size_(size),
      capacity_(static_cast<std::size_t>(std::min<std::uint64_t>(size, text_window_size))) {}

text_reader::~text_reader() {
    std::free(window_);
}

// Reads what the window can take into it.
kx_int32_t text_reader::fill() {
    std::size_t want =
        static_cast<std::size_t>(std::min<std::uint64_t>(capacity_ - held_, size_ - read_));
    errno = 0;
    ssize_t got = 0;
    timed_read([&] {
        got = sys_read(fd_, window_ + held_, want);
        return SEC_S_OK;
    });
    if (got < 0 || static_cast<std::size_t>(got) != want) {
        std::int64_t total = got < 0 ? -1 : static_cast<std::int64_t>(read_) + got;
        return report_short_read(name_, size_, total, got < 0 ? errno : 0);
    }
    held_ += want;
    read_ += want;
    window_[held_] = '\0'; // nothing past the bytes read is ever left unwritten
    return SEC_S_OK;
}

kx_int32_t text_reader::next(text_run *run) {
    if (!window_) {
        window_ = static_cast<char *>(mem_alloc(capacity_ + 1));
        if (!window_)
            return no_memory_for(name_, size_, capacity_ + 1);
    }
    // The line that the last run left unfinished moves to the front.
    std::memmove(window_, window_ + consumed_, held_ - consumed_);
    held_ -= consumed_;
    consumed_ = 0;
    for (;;) {
        if (read_ == size_) {
            window_[held_] = '\0';
            *run = {window_, held_ + 1, true};
            return SEC_S_OK;
        }
        std::size_t scanned = held_;
        if (scanned == capacity_) {
            *run = {window_, held_, false};
            return SEC_S_OK;
        }
        kx_int32_t rc = fill();
        if (rc != SEC_S_OK)
            return rc;
        // The window never holds a NUL before this read: one among the new
        // bytes ends the text, and one more byte than the NUL's own is
        // counted so that the parser sees it inside the file.
        if (auto *nul =
                static_cast<char *>(std::memchr(window_ + scanned, '\0', held_ - scanned))) {
            *run = {window_, static_cast<std::size_t>(nul - window_) + 2, true};
            return SEC_S_OK;
        }
        if (read_ == size_)
            continue; // all of it is in: one final run
        for (std::size_t end = held_; end > scanned; --end) {
            if (ends_line(window_[end - 1])) {
                consumed_ = end;
                *run = {window_, end, false};
                return SEC_S_OK;
            }
        }
    }
}

} // namespace kxacl
