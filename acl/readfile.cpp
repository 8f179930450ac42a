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

// Times a text ACL file is opened when its name was given to another file
// between its status and its opening. Editors and deployment tools replace
// files by a rename, and the next open then finds the complete new file.
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
    struct stat acl_st {}; // by name; once the text is opened, its descriptor's
    uid_t uid = 0;

    read_call(const char *filename_, const char *username_, sec_perm_set_t permtmpl_,
              kx_uint32_t flags_, sec_buffer_t acl_)
        : filename(filename_), username(username_), permtmpl(permtmpl_), flags(flags_), acl(acl_) {
        aclpath[0] = caclpath[0] = '\0';
    }
};

template <kx_acl_trace_point P> void trace_perf(const char *name, const perf_timer &timer) {
    perf_elapsed e = timer.elapsed();
    trace<P>(text(name), num(e.ticks), num(e.seconds), num(e.nanoseconds));
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

// The report of a name that leads to no usable file: missing, or not a
// regular file. SEC_S_NO_ACL_FILE, in the record and as the result alike
// (2650-135 otherwise comes with SEC_S_FILE_ERROR, for files that exist but
// fail later). A file that exists but is not regular has no system error
// number: 0 is shown.
kx_int32_t not_found(const read_call &c, int err) {
    return report<MSG_2650_135>(SEC_S_NO_ACL_FILE, c.aclpath, err);
}
kx_int32_t not_a_regular_file(const read_call &c) {
    return not_found(c, 0);
}

// Takes the status of the ACL file by its name.
kx_int32_t examine_acl_name(read_call &c) {
    if (sys_stat(c.aclpath, &c.acl_st) != 0)
        return not_found(c, errno);
    return S_ISREG(c.acl_st.st_mode) ? SEC_S_OK : not_a_regular_file(c);
}

// Resolves and examines the ACL file.
kx_int32_t examine_acl_file(read_call &c) {
    perf_timer timer(wanted<KX_ACL_TP_READ_RESOLVED>());
    kx_int32_t rc = sec__get_aclfname(c.filename, c.username, c.aclpath, &c.uid);
    if (rc != SEC_S_OK)
        return rc;
    rc = examine_acl_name(c);
    if (timer.wanted())
        trace_perf<KX_ACL_TP_READ_RESOLVED>(c.aclpath, timer);
    return rc;
}

void trace_verdict(const read_call &c, const cacl_verdict &v) {
    switch (v.state) {
    case cacl_state::trusted:
        break;
    case cacl_state::unexaminable:
        trace<KX_ACL_TP_READ_CACL_UNEXAMINABLE>(text(c.caclpath), num(v.err));
        break;
    case cacl_state::stale:
        trace<KX_ACL_TP_READ_CACL_STALE>(text(c.caclpath));
        break;
    case cacl_state::foreign: {
        kx_uint32_t ids[6] = {c.acl_st.st_uid,  c.acl_st.st_gid,  v.cacl_st.st_uid,
                              v.cacl_st.st_gid, c.acl_st.st_mode, v.cacl_st.st_mode};
        trace<KX_ACL_TP_READ_CACL_FOREIGN>(text(c.aclpath), num(ids[0]), num(ids[1]), num(ids[2]),
                                           num(ids[3]), num(ids[4]), num(ids[5]));
        break;
    }
    }
}

// Opens a file for reading, with the Perf point of opening. Neither file
// can hang the call if a FIFO replaced it, nor become the controlling
// terminal of a daemon if a terminal did; whatever is not a regular file is
// refused on the descriptor's status before a byte is read.
int open_timed(const char *source, int flags) {
    perf_timer timer(wanted<KX_ACL_TP_READ_OPENED>());
    int fd = sys_open(source, O_RDONLY | O_NOCTTY | O_NONBLOCK | O_CLOEXEC | flags);
    int err = errno;
    if (timer.wanted())
        trace_perf<KX_ACL_TP_READ_OPENED>(source, timer);
    errno = err;
    return fd;
}

struct descriptor {
    int fd;
    explicit descriptor(int fd_) : fd(fd_) {}
    descriptor(const descriptor &) = delete;
    descriptor &operator=(const descriptor &) = delete;
    ~descriptor() { reset(-1); }
    void reset(int other) {
        if (fd >= 0)
            sys_close(fd);
        fd = other;
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
    // One level for the check and its verdict, whose points share it.
    bool info = wanted<KX_ACL_TP_READ_CACL_CHECK>();
    if (info)
        trace<KX_ACL_TP_READ_CACL_CHECK>(text(c.caclpath));
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

// Reads the trusted CACL file open as fd, whose status is cacl_st, a
// regular file: O_NONBLOCK, which it was opened with, changes nothing for
// its read, and a read that fails would only mean compiling. Its
// bytes become the ACL buffer, passed through sec_convert_acl_to_host when
// the caller asks. False, with the error record cleared and acl empty,
// when the text must be compiled instead: the CACL file is optional, and
// nothing about it reaches the caller.
bool take_cacl(read_call &c, int fd, const struct stat &cacl_st) {
    descriptor file{fd};
    if (wanted<KX_ACL_TP_READ_OPEN>())
        trace<KX_ACL_TP_READ_OPEN>(text(c.caclpath));
    perf_timer timer(wanted<KX_ACL_TP_READ_LOADED>());
    acl__lock_acl_file(c.caclpath, fd, 1);
    char *bytes = nullptr;
    std::size_t size = 0;
    kx_int32_t rc =
        read_known_size(c.caclpath, fd, static_cast<std::uint64_t>(cacl_st.st_size), &bytes, &size);
    unique_mem<char> owned(bytes);
    if (timer.wanted())
        trace_perf<KX_ACL_TP_READ_LOADED>(c.caclpath, timer);
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
    trace<KX_ACL_TP_PARSE_LINE>(num(lineno), num(type), text(entry.mech), text(entry.id),
                                num(entry.perm));
}

// Opens the text ACL file, once: every decision about the text comes from
// the status of this descriptor, which must be of the file whose status was
// taken by name. A name given to another file between the two (a rename,
// a symbolic link flipped) is examined again, up to max_replaced_reads times.
kx_int32_t open_text(read_call &c, descriptor *file, struct stat *st) {
    for (int attempt = 1;; ++attempt) {
        if (attempt > 1) {
            kx_int32_t rc = examine_acl_name(c);
            if (rc != SEC_S_OK)
                return rc;
        }
        if (wanted<KX_ACL_TP_READ_OPEN>())
            trace<KX_ACL_TP_READ_OPEN>(text(c.aclpath));
        file->reset(open_timed(c.aclpath, 0));
        if (file->fd < 0) {
            int err = errno;
            if (wanted<KX_ACL_TP_READ_OPEN_FAILED>())
                trace<KX_ACL_TP_READ_OPEN_FAILED>(text(c.aclpath), num(err));
            return report<MSG_2650_137>(SEC_S_FILE_ERROR, c.aclpath, err);
        }
        if (sys_fstat(file->fd, st) != 0)
            return report_unexaminable(c.aclpath, errno);
        if (same_inode(c.acl_st, *st))
            return SEC_S_OK;
        if (attempt == max_replaced_reads)
            return report_short_read(c.aclpath, static_cast<std::uint64_t>(c.acl_st.st_size), 0, 0);
    }
}

// The rules of the text, applied to the file that was opened: a regular
// file, the user's own when a user name is given (empty or not), within
// the size limit; then the descriptor reads blocking again.
kx_int32_t check_opened_text(const read_call &c, int fd, const struct stat &st) {
    if (!S_ISREG(st.st_mode))
        return not_a_regular_file(c);
    if (c.username && !owner_rule_holds(c, st))
        return wrong_owner(c);
    auto size = static_cast<std::uint64_t>(st.st_size);
    if (size > SEC_ACL_TEXT_MAX_SIZE)
        return report_short_read(c.aclpath, size, 0, EFBIG);
    if (sys_clear_nonblock(fd) != 0)
        return report_short_read(c.aclpath, size, -1, errno);
    return SEC_S_OK;
}

// Parses one run of lines into the trees. The parser stops at the end of a
// run that is not final (its lines all end within it), and where the text
// ends in a final one.
kx_int32_t compile_run(read_call &c, const text_run &run, const space_bytes &spaces,
                       tree_array &trees) {
    bool lines_traced = wanted<KX_ACL_TP_PARSE_LINE>();
    char *cursor = run.start;
    std::size_t remaining = run.length;
    for (;;) {
        sec_acle_desc entry{};
        kx_int32_t rc =
            read_acle_from_text(spaces, c.permtmpl, &cursor, &remaining, &c.lineno, &entry);
        if (rc == 0)
            return SEC_S_OK;
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
}

// Reads the text from fd run by run, parses it line by line into trees, and
// writes them as one buffer.
kx_int32_t compile_text(read_call &c, int fd, std::uint64_t size, const perf_timer &timer) {
    tree_array trees;
    text_reader reader(c.aclpath, fd, size);
    const space_bytes spaces;
    c.lineno = 1;
    for (text_run run{nullptr, 0, false}; !run.final;) {
        kx_int32_t rc = reader.next(&run);
        if (rc != SEC_S_OK)
            return rc;
        if (run.final && timer.wanted())
            trace_perf<KX_ACL_TP_READ_LOADED>(c.aclpath, timer);
        rc = compile_run(c, run, spaces, trees);
        if (rc != SEC_S_OK)
            return rc;
    }
    return trees.count > 0 ? sec__acltrees_to_acl(trees.trees, trees.count, c.acl) : SEC_S_OK;
}

// Opens, checks and compiles the text, then caches the buffer when asked.
// Caching is optional work: whatever it finds, the read succeeds, and only
// the missing 0x2 in rflags tells that nothing was cached. The cache is
// given the status of the file whose bytes were compiled.
kx_int32_t compile_and_cache(read_call &c) {
    descriptor file{-1};
    struct stat st;
    kx_int32_t rc = open_text(c, &file, &st);
    if (rc == SEC_S_OK)
        rc = check_opened_text(c, file.fd, st);
    if (rc != SEC_S_OK)
        return rc;
    c.acl_st = st;
    c.flags &= ~kx_uint32_t{SEC_F_ACL_CONVERT};
    // Measures both the read (loaded) and the whole compile, at one level.
    perf_timer timer(wanted<KX_ACL_TP_READ_COMPILED>());
    acl__lock_acl_file(c.aclpath, file.fd, 1);
    rc = compile_text(c, file.fd, static_cast<std::uint64_t>(st.st_size), timer);
    if (timer.wanted()) {
        perf_elapsed e = timer.elapsed();
        trace<KX_ACL_TP_READ_COMPILED>(text(c.aclpath), num(c.lineno), num(e.ticks), num(e.seconds),
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
        if (wanted<KX_ACL_TP_READ_EMPTY>())
            trace<KX_ACL_TP_READ_EMPTY>(text(c.aclpath));
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
    return compile_and_cache(c);
}

} // namespace

} // namespace kxacl

using namespace kxacl;

extern "C" ACL_EXTERN kx_int32_t sec_read_acl_file(const char *filename, const char *username,
                                                   sec_perm_set_t permtmpl, kx_uint32_t flags,
                                                   sec_buffer_t acl, kx_uint32_t *rflags) noexcept {
    using points = api_read_acl_file;
    api_enter<points>(clears_record::yes, [&] {
        trace<points::entry_data>(text(filename), text(username), num(permtmpl), num(flags),
                                  num(acl));
    });
    read_call c{filename, username, permtmpl, flags, acl};
    kx_int32_t status = read_acl_file(c);
    if (rflags)
        *rflags = c.flags;
    return api_leave<points>(status, [&] { trace<points::exit_ok>(num(status), num(c.lineno)); });
}
