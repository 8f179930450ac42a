// The cached compiled ACL file: the rule by which a reader trusts it, and
// the writer that replaces it through a temporary file and a rename.
#include "cache.h"

#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <unistd.h>

#include "buffer_format.h"
#include "files.h"
#include "frame.h"
#include "report.h"
#include "syscalls.h"

namespace kxacl {

namespace {

constexpr kx_int32_t nothing_written = 1;

// Candidate temporary names tried before giving up. Each draw is one of
// 65536 names, so 64 taken in a row means that the directory is flooded
// with them (or someone plants them): further draws would only spin.
constexpr int max_temp_attempts = 64;

constexpr mode_t permission_bits = 07777;

bool same_owner(const struct stat &a, const struct stat &b) {
    return a.st_uid == b.st_uid && a.st_gid == b.st_gid;
}

// Whether the name aclfname still leads to the file, unchanged, whose
// status acl_st is: the last look before the rename, so that the CACL file
// of a file that was replaced or rewritten meanwhile does not land beside
// its successor. A change after this look cannot make the CACL file
// trusted: its time, that of its write, is earlier than the change's.
bool still_named(const char *aclfname, const struct stat &acl_st) {
    struct stat now;
    return sys_stat(aclfname, &now) == 0 && same_inode(acl_st, now) &&
           acl_st.st_size == now.st_size && acl_st.st_mtim.tv_sec == now.st_mtim.tv_sec &&
           acl_st.st_mtim.tv_nsec == now.st_mtim.tv_nsec;
}

// 2650-135 when a status cannot be taken; the report names the ACL file
// whichever file failed, the Errors point names the file that failed.
kx_int32_t status_failed(const char *aclfname, const char *failed, int err) {
    if (wanted<KX_ACL_TP_CACHE_STAT_FAILED>())
        trace<KX_ACL_TP_CACHE_STAT_FAILED>(text(failed), text("stat()"), num(err));
    return report<MSG_2650_135>(SEC_S_FILE_ERROR, aclfname, err);
}

// An existing CACL file of another owner or mode is never replaced: it is
// somebody else's, or a leftover, and must be put right by hand. The name
// is examined with lstat, so a symbolic link counts with its own owner and
// file type (never equal to a regular file's mode word) and is refused here.
kx_int32_t check_existing_cacl(const char *aclfname, const char *cacl, const struct stat &acl_st,
                               const struct stat &cacl_st) {
    if (!same_owner(acl_st, cacl_st)) {
        if (wanted<KX_ACL_TP_CACHE_OWNER_DIFFERS>()) {
            kx_uint32_t ids[4] = {acl_st.st_uid, acl_st.st_gid, cacl_st.st_uid, cacl_st.st_gid};
            trace<KX_ACL_TP_CACHE_OWNER_DIFFERS>(text(cacl), num(ids[0]), num(ids[1]), num(ids[2]),
                                                 num(ids[3]));
        }
        return report<MSG_2650_149>(SEC_S_FILE_ERROR, aclfname);
    }
    if (acl_st.st_mode != cacl_st.st_mode) {
        if (wanted<KX_ACL_TP_CACHE_MODE_DIFFERS>()) {
            kx_uint32_t modes[2] = {acl_st.st_mode & permission_bits,
                                    cacl_st.st_mode & permission_bits};
            trace<KX_ACL_TP_CACHE_MODE_DIFFERS>(text(cacl), num(modes[0]), num(modes[1]));
        }
        return report<MSG_2650_150>(SEC_S_FILE_ERROR, aclfname);
    }
    return SEC_S_OK;
}

// The CACL file held open while the temporary file is written (the place
// where a writer would lock). An empty CACL file that this call created is
// removed again unless the call succeeded; only if the name still denotes
// that very file, so that a concurrent writer's complete CACL file renamed
// there meanwhile stays.
class open_cacl {
  public:
    open_cacl(const char *name, int fd, bool created) : name_(name), fd_(fd), created_(created) {}
    open_cacl(const open_cacl &) = delete;
    open_cacl &operator=(const open_cacl &) = delete;
    ~open_cacl() {
        if (created_ && !succeeded_)
            remove_if_still_ours();
        sys_close(fd_);
    }
    void succeeded() { succeeded_ = true; }

  private:
    void remove_if_still_ours() {
        struct stat ours, named;
        if (sys_fstat(fd_, &ours) == 0 && sys_lstat(name_, &named) == 0 && same_inode(ours, named))
            sys_unlink(name_);
    }
    const char *name_;
    int fd_;
    bool created_;
    bool succeeded_ = false;
};

// Opens the CACL file, creating it with no permission bits when it did not
// exist. O_NOFOLLOW: a symbolic link planted since the examination is never
// followed; O_NONBLOCK: a FIFO planted there cannot hang the writer.
// Nothing is written through this descriptor.
int open_cacl_file(const char *cacl, bool existed, bool *created) {
    int flags = O_WRONLY | O_NOFOLLOW | O_NOCTTY | O_NONBLOCK | O_CLOEXEC;
    // A CACL file that was absent is created exclusively, so that "created"
    // is certain; when it appeared meanwhile, another writer is at work and
    // this one gives way (2650-151) rather than racing it.
    if (!existed)
        flags |= O_CREAT | O_EXCL;
    *created = !existed;
    return sys_open(cacl, flags, 0);
}

// The temporary file, removed again unless renamed into place.
class temp_file {
  public:
    temp_file() = default;
    temp_file(const temp_file &) = delete;
    temp_file &operator=(const temp_file &) = delete;
    ~temp_file() {
        if (fd >= 0)
            sys_close(fd);
        if (created && !renamed)
            sys_unlink(name);
    }
    path_buffer name{};
    int fd = -1;
    bool created = false;
    bool renamed = false;
};

// Picks the next candidate: four lowercase hex digits replace the previous
// ones (a candidate never grows, so it stays within 4094 characters). The
// first seed is the upper half of the counter; each later draw mixes in a
// fresh counter value, since the upper half changes only every few seconds.
void draw_temp_digits(char *digits, unsigned *seed, bool first) {
    if (!first)
        *seed ^= static_cast<unsigned>(cu_get_ctr_1());
    std::snprintf(digits, 5, "%04x", static_cast<unsigned>(rand_r(seed)) & 0xffffu);
}

// Creates the temporary file aclfname + "." + 4 hex digits, with no
// permission bits. Exclusive creation (which never follows a link) makes a
// name taken between its status and its creation, by another writer or by
// a planted link, come back as EEXIST instead of being opened. A name that
// is taken, or whose status fails otherwise, is replaced by a fresh draw;
// when none of the attempts is free, 2650-151 names the last candidate.
// Any other failure to create it is reported at once.
kx_int32_t create_temp_file(const char *aclfname, std::size_t path_length, temp_file *temp) {
    std::memcpy(temp->name, aclfname, path_length);
    temp->name[path_length] = '.';
    char *digits = temp->name + path_length + 1;
    auto seed = static_cast<unsigned>(cu_get_ctr_1() >> 32);
    for (int attempt = 0; attempt < max_temp_attempts; ++attempt) {
        draw_temp_digits(digits, &seed, attempt == 0);
        struct stat st;
        if (sys_lstat(temp->name, &st) == 0 || errno != ENOENT)
            continue;
        int fd = sys_open(temp->name,
                          O_CREAT | O_EXCL | O_NOFOLLOW | O_NOCTTY | O_WRONLY | O_CLOEXEC, 0);
        if (fd >= 0) {
            temp->fd = fd;
            temp->created = true;
            return SEC_S_OK;
        }
        if (errno != EEXIST)
            break;
    }
    return report<MSG_2650_151>(SEC_S_FILE_ERROR, temp->name);
}

kx_int32_t write_failed(ssize_t written, std::size_t length, int err) {
    int shown = written < 0 ? -1 : byte_count(static_cast<std::size_t>(written));
    return report<MSG_2650_152>(SEC_S_FILE_ERROR, shown, byte_count(length), err);
}

// Fills the temporary file and gives it the ACL file's owner, then its
// permission bits (in that order: a change of owner clears the set-id
// bits), all through the open descriptor, so that no name is followed.
kx_int32_t fill_temp_file(temp_file *temp, const char *cacl, const sec_buffer_s &acl,
                          const struct stat &acl_st) {
    auto length = static_cast<std::size_t>(acl.length);
    errno = 0;
    ssize_t written = sys_write(temp->fd, acl.value, length);
    if (written < 0 || static_cast<std::size_t>(written) != length)
        return write_failed(written, length, written < 0 ? errno : 0);
    if (sys_fchown(temp->fd, acl_st.st_uid, acl_st.st_gid) != 0) {
        char uid_text[24];
        std::snprintf(uid_text, sizeof uid_text, "%lu", static_cast<unsigned long>(acl_st.st_uid));
        return report<MSG_2650_154>(SEC_S_FILE_ERROR, cacl, uid_text,
                                    static_cast<int>(acl_st.st_gid));
    }
    mode_t mode = acl_st.st_mode & permission_bits;
    if (sys_fchmod(temp->fd, mode) != 0)
        return report<MSG_2650_155>(SEC_S_FILE_ERROR, cacl, static_cast<unsigned>(mode));
    // A failing close can be the first word of a failed write (quota,
    // network file systems): the file is then not known to be complete.
    int fd = temp->fd;
    temp->fd = -1;
    if (sys_close(fd) != 0)
        return write_failed(written, length, errno);
    return SEC_S_OK;
}

kx_int32_t write_cacl(const char *aclfname, sec_acl_buffer_t acl, sec_boolean_t force,
                      const struct stat *compiled_from) {
    if (!acl || acl->length <= 0 || !acl->value)
        return nothing_written;
    std::size_t path_length = std::strlen(aclfname);
    if (path_length > max_cached_acl_path) {
        if (wanted<KX_ACL_TP_CACHE_NAME_TOO_LONG>()) {
            auto length = static_cast<kx_int32_t>(byte_count(path_length));
            trace<KX_ACL_TP_CACHE_NAME_TOO_LONG>(text(aclfname), num(length));
        }
        return report<MSG_2650_148>(SEC_S_FILE_ERROR, aclfname);
    }
    path_buffer cacl;
    cacl_name_of(aclfname, cacl);

    // The owner, group, mode and time that the CACL file is judged by and
    // given are those of the file whose bytes were compiled, never those of
    // whatever the name leads to by now.
    struct stat acl_st, cacl_st;
    if (compiled_from)
        acl_st = *compiled_from;
    else if (sys_stat(aclfname, &acl_st) != 0)
        return status_failed(aclfname, aclfname, errno);
    bool existed = sys_lstat(cacl, &cacl_st) == 0;
    if (!existed) {
        if (errno != ENOENT)
            return status_failed(aclfname, cacl, errno);
        if (wanted<KX_ACL_TP_CACHE_NEW_FILE>())
            trace<KX_ACL_TP_CACHE_NEW_FILE>(text(cacl));
    } else {
        kx_int32_t rc = check_existing_cacl(aclfname, cacl, acl_st, cacl_st);
        if (rc != SEC_S_OK)
            return rc;
    }
    // A CACL file that does not exist counts as written at time 0.
    time_t cacl_time = existed ? cacl_st.st_mtim.tv_sec : 0;
    if (!force && acl_st.st_mtim.tv_sec < cacl_time)
        return nothing_written;

    bool created = false;
    int cacl_fd = open_cacl_file(cacl, existed, &created);
    if (cacl_fd < 0)
        return report<MSG_2650_151>(SEC_S_FILE_ERROR, cacl);
    open_cacl held(cacl, cacl_fd, created);
    acl__lock_acl_file(cacl, cacl_fd, 2);

    temp_file temp;
    kx_int32_t rc = create_temp_file(aclfname, path_length, &temp);
    if (rc == SEC_S_OK)
        rc = fill_temp_file(&temp, cacl, *acl, acl_st);
    if (rc != SEC_S_OK)
        return rc;
    if (!still_named(aclfname, acl_st))
        return nothing_written;
    if (sys_rename(temp.name, cacl) != 0)
        return report<MSG_2650_177>(SEC_S_FILE_ERROR, temp.name, cacl);
    temp.renamed = true;
    held.succeeded();
    return SEC_S_OK;
}

} // namespace

bool cacl_name_of(const char *aclfname, char *cacl) {
    std::size_t length = std::strlen(aclfname);
    if (length + sizeof cacl_suffix - 1 > max_path_length) {
        cacl[0] = '\0';
        return false;
    }
    std::memcpy(cacl, aclfname, length);
    std::memcpy(cacl + length, cacl_suffix, sizeof cacl_suffix);
    return true;
}

kx_int32_t cache_aclbuffer(const char *aclfname, sec_acl_buffer_t acl, sec_boolean_t force,
                           const struct stat *compiled_from) {
    kx_int32_t rc = write_cacl(aclfname, acl, force, compiled_from);
    if (rc != SEC_S_OK && wanted<KX_ACL_TP_CACHE_NOT_WRITTEN>())
        trace<KX_ACL_TP_CACHE_NOT_WRITTEN>(text(aclfname));
    return rc;
}

kx_int32_t sec__cache_aclbuffer(const char *aclfname, sec_acl_buffer_t acl, sec_boolean_t force) {
    return cache_aclbuffer(aclfname, acl, force, nullptr);
}

bool cacl_matches_acl(const struct stat &acl_st, const struct stat &cacl_st) {
    return S_ISREG(cacl_st.st_mode) && same_owner(acl_st, cacl_st) &&
           (acl_st.st_mode & permission_bits) == (cacl_st.st_mode & permission_bits);
}

cacl_verdict judge_cacl(const struct stat &acl_st, const char *cacl) {
    // lstat: a symbolic link at the CACL name could point at any file of
    // the ACL file's owner (another ACL's CACL file) and is never trusted.
    struct stat cacl_st;
    if (sys_lstat(cacl, &cacl_st) != 0)
        return cacl_verdict{cacl_state::unexaminable, errno, {}};
    return judge_cacl_status(acl_st, cacl_st);
}

cacl_verdict judge_cacl_status(const struct stat &acl_st, const struct stat &cacl_st) {
    cacl_verdict v{cacl_state::trusted, 0, cacl_st};
    if (S_ISREG(v.cacl_st.st_mode) &&
        (v.cacl_st.st_size <= 0 ||
         static_cast<std::uint64_t>(v.cacl_st.st_size) > layout::max_buffer_length ||
         v.cacl_st.st_mtim.tv_sec <= acl_st.st_mtim.tv_sec)) {
        v.state = cacl_state::stale;
    } else if (!cacl_matches_acl(acl_st, v.cacl_st) || v.cacl_st.st_nlink != 1) {
        // Not a regular file, another owner, group or permission bits, or
        // another name for the same bytes: a hard link from elsewhere, such
        // as another ACL file's CACL file.
        v.state = cacl_state::foreign;
    }
    return v;
}

} // namespace kxacl
