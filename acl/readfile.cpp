// sec_read_acl_file: the ACL of an ACL file, from its cached compiled file
// when that is current, else compiled from the text (and then cached when
// the caller asks).
#include <cerrno>
#include <cstdint>
#include <cstdlib>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>
#include <utility>

#include "alloc.h"
#include "buffer_format.h"
#include "cache.h"
#include "convert.h"
#include "files.h"
#include "frame.h"
#include "parse.h"
#include "report.h"
#include "tree.h"
#include "syscalls.h"

namespace kxacl {

namespace {

constexpr const char routine[] = "sec_read_acl_file";

// Times a text ACL file is opened again when it was replaced by a rename
// while being read. Editors and deployment tools replace files that way,
// and the next open then finds the complete new file.
constexpr int max_replaced_reads = 3;

// Everything one call works with.
struct read_call {
    const char *filename;
    const char *username;
    sec_perm_set_t permtmpl;
    kx_uint32_t flags; // the working copy, handed back in rflags
    sec_buffer_t acl;
    int lineno = 0; // the line that parsing reached; 0 when nothing was parsed
    // Written before they are read; a call on the request path does not
    // clear 8 KiB of them first.
    path_buffer aclpath;
    path_buffer caclpath;
    struct stat acl_st {};
    uid_t uid = 0;

    read_call(const char *filename_, const char *username_, sec_perm_set_t permtmpl_,
              kx_uint32_t flags_, sec_buffer_t acl_)
        : filename(filename_), username(username_), permtmpl(permtmpl_), flags(flags_), acl(acl_) {
        aclpath[0] = caclpath[0] = '\0';
    }
};

void trace_perf(kx_uint32_t id, const char *name, const perf_timer &timer) {
    perf_elapsed e = timer.elapsed();
    trace_data(id, text(name), num(e.ticks), num(e.seconds), num(e.nanoseconds));
}

bool info_traced() {
    return trace_level(TRC_INFO) != 0;
}

void clear_acl(sec_buffer_s *acl) {
    std::free(acl->value);
    acl->value = nullptr;
    acl->length = 0;
}

kx_int32_t check_arguments(const read_call &c) {
    if (!c.filename)
        return bad_param(routine, 1, c.filename);
    if (!c.acl)
        return bad_param(routine, 5, c.acl);
    if (c.username && c.username[0] == '\0')
        return report<MSG_2650_134>(SEC_S_BAD_PARAM);
    return SEC_S_OK;
}

// With a user name, the file must be the user's and writable by nobody else.
bool owner_rule_holds(const read_call &c, const struct stat &st) {
    return st.st_uid == c.uid && (st.st_mode & (S_IWGRP | S_IWOTH)) == 0;
}

kx_int32_t wrong_owner(const read_call &c) {
    return report<MSG_2650_141>(SEC_S_BAD_PERMISSION, c.aclpath, c.username);
}

// Resolves and examines the ACL file. A missing or non-regular ACL file is
// reported with SEC_S_NO_ACL_FILE, the status of a name that leads to no
// usable file, in the record and as the result alike (2650-135 otherwise
// comes with SEC_S_FILE_ERROR, for files that exist but fail later). A file
// that exists but is not regular has no system error number: 0 is shown.
kx_int32_t examine_acl_file(read_call &c) {
    perf_timer timer(perf_at(1));
    kx_int32_t rc = sec__get_aclfname(c.filename, c.username, c.aclpath, &c.uid);
    if (rc != SEC_S_OK)
        return rc;
    int err = sys_stat(c.aclpath, &c.acl_st) != 0 ? errno : 0;
    if (timer.wanted())
        trace_perf(1, c.aclpath, timer);
    if (err != 0 || !S_ISREG(c.acl_st.st_mode))
        return report<MSG_2650_135>(SEC_S_NO_ACL_FILE, c.aclpath, err);
    return SEC_S_OK;
}

void trace_verdict(const read_call &c, const cacl_verdict &v) {
    switch (v.state) {
    case cacl_state::trusted:
        break;
    case cacl_state::unexaminable:
        trace_data(118, text(c.caclpath), num(v.err));
        break;
    case cacl_state::stale:
        trace_data(119, text(c.caclpath));
        break;
    case cacl_state::foreign: {
        kx_uint32_t ids[6] = {c.acl_st.st_uid,  c.acl_st.st_gid,  v.cacl_st.st_uid,
                              v.cacl_st.st_gid, c.acl_st.st_mode, v.cacl_st.st_mode};
        trace_data(120, text(c.aclpath), num(ids[0]), num(ids[1]), num(ids[2]), num(ids[3]),
                   num(ids[4]), num(ids[5]));
        break;
    }
    }
}

// Opens a file for reading, with the Perf point of opening. Neither file
// can hang the call if a FIFO replaced it.
int open_timed(const char *source, int flags) {
    perf_timer timer(perf_at(2));
    int fd = sys_open(source, O_RDONLY | O_NONBLOCK | O_CLOEXEC | flags);
    int err = errno;
    if (timer.wanted())
        trace_perf(4, source, timer);
    errno = err;
    return fd;
}

struct descriptor {
    int fd;
    ~descriptor() {
        if (fd >= 0)
            sys_close(fd);
    }
};

// Opens the CACL file and applies the trust rule to the file opened, so
// that the file judged is the file read, with no second look at its name.
// A symbolic link at the name is never followed; refused by O_NOFOLLOW, it
// is judged from its own status. The descriptor, or -1 when the bytes may
// not be used; an ACL path too long for a CACL name cannot have a CACL file.
int open_trusted_cacl(read_call &c, struct stat *cacl_st) {
    if (!cacl_name_of(c.aclpath, c.caclpath))
        return -1;
    bool info = info_traced();
    if (info)
        trace_data(117, text(c.caclpath));
    descriptor file{open_timed(c.caclpath, O_NOFOLLOW)};
    cacl_verdict v{cacl_state::unexaminable, errno, {}};
    if (file.fd < 0 && v.err == ELOOP) {
        v = judge_cacl(c.acl_st, c.caclpath);
        if (v.state == cacl_state::trusted) // replaced since the open
            v = cacl_verdict{cacl_state::unexaminable, ELOOP, {}};
    } else if (file.fd >= 0) {
        struct stat st;
        v = sys_fstat(file.fd, &st) == 0 ? judge_cacl_status(c.acl_st, st)
                                         : cacl_verdict{cacl_state::unexaminable, errno, {}};
    }
    if (info)
        trace_verdict(c, v);
    if (v.state != cacl_state::trusted)
        return -1;
    *cacl_st = v.cacl_st;
    return std::exchange(file.fd, -1);
}

// Opens the text ACL file for reading.
int open_text(const read_call &c) {
    int fd = open_timed(c.aclpath, 0);
    if (fd < 0) {
        int err = errno;
        if (info_traced())
            trace_data(122, text(c.aclpath), num(err));
        errno = err;
    }
    return fd;
}

// With a user name, the text ACL file that was opened must again be that
// user's: it may have been replaced since its name was examined.
bool opened_text_acceptable(const read_call &c, int fd) {
    if (!c.username)
        return true;
    struct stat st;
    if (sys_fstat(fd, &st) != 0)
        return false;
    return st.st_size == 0 || owner_rule_holds(c, st);
}

// Opens, locks and reads the text ACL file whole. *replaced tells a read
// that failed because the name was given to another file meanwhile.
kx_int32_t read_source(read_call &c, unique_mem<char> *contents, std::size_t *size,
                       bool *replaced) {
    *replaced = false;
    if (info_traced())
        trace_data(121, text(c.aclpath));
    descriptor file{open_text(c)};
    if (file.fd < 0) {
        int err = errno;
        return report<MSG_2650_137>(SEC_S_FILE_ERROR, c.aclpath, err);
    }
    if (!opened_text_acceptable(c, file.fd))
        return wrong_owner(c);
    perf_timer timer(perf_at(1));
    acl__lock_acl_file(c.aclpath, file.fd, 1);
    char *bytes = nullptr;
    kx_int32_t rc = read_whole_file(c.aclpath, file.fd, &bytes, size, replaced);
    contents->reset(bytes);
    if (timer.wanted())
        trace_perf(2, c.aclpath, timer);
    return rc;
}

// Reads the trusted CACL file open as fd, whose status is cacl_st: its
// bytes become the ACL buffer, passed through sec_convert_acl_to_host when
// the caller asks. False, with the error record cleared and acl empty,
// when the text must be compiled instead: the CACL file is optional, and
// nothing about it reaches the caller.
bool take_cacl(read_call &c, int fd, const struct stat &cacl_st) {
    descriptor file{fd};
    if (info_traced())
        trace_data(121, text(c.caclpath));
    perf_timer timer(perf_at(1));
    acl__lock_acl_file(c.caclpath, fd, 1);
    char *bytes = nullptr;
    std::size_t size = 0;
    kx_int32_t rc =
        read_known_size(c.caclpath, fd, static_cast<std::uint64_t>(cacl_st.st_size), &bytes, &size);
    unique_mem<char> owned(bytes);
    if (timer.wanted())
        trace_perf(2, c.caclpath, timer);
    if (rc != SEC_S_OK || size == 0 || size > layout::max_buffer_length) {
        cu_set_no_error_1();
        return false;
    }
    c.acl->value = owned.release();
    c.acl->length = static_cast<kx_int32_t>(size);
    if ((c.flags & SEC_F_ACL_CONVERT) && sec_convert_acl_to_host(1, c.acl) != SEC_S_OK) {
        clear_acl(c.acl);
        cu_set_no_error_1();
        return false;
    }
    c.flags &= ~kx_uint32_t{SEC_F_ACL_CACHE};
    return true;
}

// Reads the text ACL file whole, opening it again if it was replaced while
// being read.
kx_int32_t read_text(read_call &c, unique_mem<char> *contents, std::size_t *size) {
    for (int attempt = 1;; ++attempt) {
        bool replaced = false;
        kx_int32_t rc = read_source(c, contents, size, &replaced);
        if (rc == SEC_S_OK || !replaced || attempt == max_replaced_reads)
            return rc;
        cu_set_no_error_1();
    }
}

// The array of entry trees of one compile, freed from the last to the first.
struct tree_array {
    sec_acltree_t *trees = nullptr;
    int count = 0;
    tree_array() = default;
    tree_array(const tree_array &) = delete;
    tree_array &operator=(const tree_array &) = delete;
    ~tree_array() { free_acltrees(trees, count); }
};

void trace_line(int lineno, const sec_acle_desc &entry) {
    auto type = static_cast<kx_int32_t>(entry.type);
    trace_data(114, num(lineno), num(type), text(entry.mech), text(entry.id), num(entry.perm));
}

// Parses the text line by line into trees, and writes them as one buffer.
kx_int32_t compile_text(read_call &c, char *contents, std::size_t size) {
    tree_array trees;
    char *cursor = contents;
    std::size_t remaining = size + 1; // the NUL that follows the file's bytes
    c.lineno = 1;
    bool lines_traced = trace_level(TRC_INFO) > 7;
    const space_bytes spaces;
    for (;;) {
        sec_acle_desc entry{};
        kx_int32_t rc =
            read_acle_from_text(spaces, c.permtmpl, &cursor, &remaining, &c.lineno, &entry);
        if (rc == 0)
            break;
        if (rc != 1)
            return rc;
        if (lines_traced)
            trace_line(c.lineno - 1, entry);
        if (entry.type == 0)
            continue;
        rc = sec__add_acle_to_trees(&entry, &trees.trees, &trees.count);
        if (rc != SEC_S_OK)
            return rc;
    }
    return trees.count > 0 ? sec__acltrees_to_acl(trees.trees, trees.count, c.acl) : SEC_S_OK;
}

// Compiles the text, then caches the buffer when asked. Caching is
// optional work: whatever it finds, the read succeeds, and only the missing
// 0x2 in rflags tells that nothing was cached.
kx_int32_t compile_and_cache(read_call &c, char *contents, std::size_t size) {
    c.flags &= ~kx_uint32_t{SEC_F_ACL_CONVERT};
    perf_timer timer(perf_at(1));
    kx_int32_t rc = compile_text(c, contents, size);
    if (timer.wanted()) {
        perf_elapsed e = timer.elapsed();
        trace_data(3, text(c.aclpath), num(c.lineno), num(e.ticks), num(e.seconds),
                   num(e.nanoseconds));
    }
    if (rc != SEC_S_OK) {
        clear_acl(c.acl);
        return rc;
    }
    if ((c.flags & SEC_F_ACL_CACHE) && cache_aclbuffer(c.aclpath, c.acl, 0, &c.acl_st) != 0) {
        cu_set_no_error_1();
        c.flags &= ~kx_uint32_t{SEC_F_ACL_CACHE};
    }
    return SEC_S_OK;
}

kx_int32_t read_acl_file(read_call &c) {
    kx_int32_t rc = check_arguments(c);
    if (rc != SEC_S_OK)
        return rc;
    c.acl->length = 0;
    c.acl->value = nullptr;
    rc = examine_acl_file(c);
    if (rc != SEC_S_OK)
        return rc;
    if (c.acl_st.st_size == 0) {
        if (info_traced())
            trace_data(116, text(c.aclpath));
        return SEC_S_OK;
    }
    if (c.username && !owner_rule_holds(c, c.acl_st))
        return wrong_owner(c);

    if (!(c.flags & SEC_F_ACL_TEXT)) {
        struct stat cacl_st;
        int fd = open_trusted_cacl(c, &cacl_st);
        if (fd >= 0 && take_cacl(c, fd, cacl_st))
            return SEC_S_OK;
        c.flags |= SEC_F_ACL_TEXT;
    }
    unique_mem<char> contents;
    std::size_t size = 0;
    rc = read_text(c, &contents, &size);
    if (rc != SEC_S_OK)
        return rc;
    return compile_and_cache(c, contents.get(), size);
}

} // namespace

} // namespace kxacl

using namespace kxacl;

extern "C" ACL_EXTERN kx_int32_t sec_read_acl_file(const char *filename, const char *username,
                                                   sec_perm_set_t permtmpl, kx_uint32_t flags,
                                                   sec_buffer_t acl, kx_uint32_t *rflags) noexcept {
    constexpr api_points points = api_read_acl_file;
    api_enter(points, clears_record::yes, [&] {
        trace_data(points.entry_data, text(filename), text(username), num(permtmpl), num(flags),
                   num(acl));
    });
    read_call c{filename, username, permtmpl, flags, acl};
    kx_int32_t status = read_acl_file(c);
    if (rflags)
        *rflags = c.flags;
    return api_leave(points, status,
                     [&] { trace_data(points.exit_ok, num(status), num(c.lineno)); });
}
