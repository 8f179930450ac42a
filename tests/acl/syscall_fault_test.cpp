// Every system call of the ACL file paths fails in turn, through the hook of
// syscalls.h, on each way through sec_read_acl_file and the CACL writer: the
// outcome is the one specified for that call, no descriptor or temporary
// file is left, and the CACL file is the one before or the new complete one.
// Leaks show in the sanitizer tree, where every test ends with a leak check.
#include <cerrno>
#include <cstring>
#include <filesystem>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "cache.h"
#include "file_helpers.h"
#include "messages.h"
#include "syscalls.h"

using namespace kxacl;
using namespace kxtest;

namespace {

constexpr int injected = EIO;

// What a call comes to when one system call fails: a failure with its
// status, message and arguments ("$" starts the directory, "<temp>" is any
// temporary name in it), or a result (the rflags of a read, the result of
// the writer: 0 written, 1 nothing to write).
struct outcome {
    kx_int32_t status;
    int msg;
    kx_uint32_t result;
    std::vector<arg> args;
    bool operator==(const outcome &) const = default;
};
outcome fails(kx_int32_t status, int msg, std::vector<arg> args) {
    return {status, msg, 0, std::move(args)};
}
outcome gives(kx_uint32_t result) {
    return {SEC_S_OK, 0, result, {}};
}

// The outcome for each call of one kind, in the order the calls are made;
// the kinds a path does not list it must not call at all.
struct fault_row {
    sys_call kind;
    std::vector<outcome> by_call;
};

enum class cacl_before { absent, stale, current };

const sys_call every_kind[] = {
    sys_call::open,   sys_call::read,   sys_call::write,  sys_call::close,  sys_call::stat,
    sys_call::lstat,  sys_call::fstat,  sys_call::fchown, sys_call::fchmod, sys_call::rename,
    sys_call::unlink, sys_call::getcwd, sys_call::fcntl};
const char *const kind_names[] = {"open",   "read",   "write",  "close",  "stat",
                                  "lstat",  "fstat",  "fchown", "fchmod", "rename",
                                  "unlink", "getcwd", "fcntl"};

int open_descriptors() {
    auto fds = std::filesystem::directory_iterator("/proc/self/fd");
    return static_cast<int>(std::distance(begin(fds), end(fds)));
}

// Whether the record is the failure expected of a call on the files in dir,
// or empty when none is.
testing::AssertionResult record_of(const outcome &expected, const std::string &dir) {
    std::vector<arg> args = in_dir(dir, expected.args);
    error_record e = last_error();
    for (std::size_t i = 0; i < args.size() && i < e.args.size(); ++i)
        if (args[i] == arg{"<temp>"} && std::holds_alternative<std::string>(e.args[i]) &&
            e.str(i).rfind(dir + "/", 0) == 0 && is_temp_name(e.str(i).substr(dir.size() + 1)))
            args[i] = e.args[i];
    return record_is(expected.msg ? expected.status : 0, expected.msg, args);
}

// A directory with the ACL file, and the CACL file the path starts from:
// the compiled buffer when current, other bytes when stale.
struct prepared {
    acl_dir d;
    std::string compiled;
    std::string cacl_bytes = "<missing>";
    explicit prepared(cacl_before cacl) {
        {
            acl_read r(d.acl, TEXT);
            compiled = r.bytes();
        }
        if (cacl == cacl_before::absent)
            return;
        cacl_bytes = cacl == cacl_before::current ? compiled : std::string("\x85\x01\x02\0\0", 5);
        write_file(d.cacl, cacl_bytes);
        shift_mtime(d.cacl, cacl == cacl_before::current ? 0 : -20);
    }
};

// After any outcome: nothing but the two files, and the CACL file either as
// it was or, when the outcome says it was written, the new one.
void expect_files_left(const prepared &p, bool written) {
    std::string cacl = read_file(p.d.cacl);
    EXPECT_EQ(cacl, written ? p.compiled : p.cacl_bytes);
    std::vector<std::string> expected{"acl"};
    if (cacl != "<missing>")
        expected.push_back("acl.cacl");
    EXPECT_EQ(dir_entries(p.d.dir), expected);
}

// Runs call() on the files in dir with call n of kind failing with err and
// checks what is common to every outcome; false when fewer calls of kind
// were made.
template <typename Call>
bool with_failure(sys_call kind, long n, int err, const outcome *expected, const std::string &dir,
                  Call call) {
    int fds = open_descriptors();
    sys_fail_nth(kind, n, err);
    kx_int32_t status = call();
    bool fired = sys_fault_fired();
    sys_fail_nth(kind, -1, 0);
    if (!fired)
        return false;
    EXPECT_EQ(open_descriptors(), fds);
    if (!expected) {
        ADD_FAILURE() << "a call that this path should not make";
        return true;
    }
    EXPECT_EQ(status, expected->status);
    EXPECT_TRUE(record_of(*expected, dir));
    return true;
}

// attempt(kind, n, expected) fails call n of kind and checks the outcome;
// every call of every kind fails once, and the number of calls of each kind
// must be the number of outcomes its row lists.
template <typename Attempt>
void fail_each_call(const std::string &path, const std::vector<fault_row> &rows, Attempt attempt) {
    for (sys_call kind : every_kind) {
        const char *kind_name = kind_names[static_cast<int>(kind)];
        const fault_row *row = nullptr;
        for (const fault_row &r : rows)
            if (r.kind == kind)
                row = &r;
        std::size_t listed = row ? row->by_call.size() : 0;
        long n = 0;
        for (;; ++n) {
            SCOPED_TRACE(path + ": " + kind_name + " number " + std::to_string(n));
            const outcome *expected = static_cast<std::size_t>(n) < listed
                                          ? &row->by_call[static_cast<std::size_t>(n)]
                                          : nullptr;
            if (!attempt(kind, n, expected))
                break;
        }
        EXPECT_EQ(static_cast<std::size_t>(n), listed) << path << ": calls of " << kind_name;
    }
}

// sec_read_acl_file with flags on the files of cacl; with relative, the name
// is given relative to the working directory.
void fail_each_call_of_read(const std::string &path, cacl_before cacl, kx_uint32_t flags,
                            bool relative, const std::vector<fault_row> &rows) {
    fail_each_call(path, rows, [&](sys_call kind, long n, const outcome *expected) {
        prepared p(cacl);
        if (relative && chdir(p.d.dir.c_str()) != 0)
            ADD_FAILURE() << "chdir " << p.d.dir;
        std::string bytes = "<unread>";
        kx_uint32_t rflags = 0;
        // A relative name joins the working directory as getcwd gives it.
        std::string dir = relative ? std::filesystem::canonical(p.d.dir).string() : p.d.dir;
        bool fired = with_failure(kind, n, injected, expected, dir, [&] {
            acl_read r(relative ? "acl" : p.d.acl, flags);
            bytes = r.bytes();
            rflags = r.rflags;
            EXPECT_TRUE(r.status == SEC_S_OK || r.empty());
            return r.status;
        });
        // Once the CACL file is passed over, 0x1 is set.
        if (fired && expected && expected->status != SEC_S_OK) {
            EXPECT_EQ(rflags, expected->status == SEC_S_NO_ACL_FILE ? flags : flags | TEXT);
        } else if (fired && expected) {
            EXPECT_EQ(rflags, expected->result);
            EXPECT_EQ(bytes, p.compiled);
        }
        if (fired)
            expect_files_left(p, expected && expected->status == SEC_S_OK &&
                                     (expected->result & CACHE));
        return fired;
    });
}

const long long text_size = static_cast<long long>(std::strlen(example_text));
const outcome text_only = gives(TEXT), text_cached = gives(TEXT | CACHE);
const outcome no_file = fails(SEC_S_NO_ACL_FILE, MSG_2650_135, {"$/acl", injected}),
              unreadable = fails(SEC_S_FILE_ERROR, MSG_2650_135, {"$/acl", injected}),
              unopened = fails(SEC_S_FILE_ERROR, MSG_2650_137, {"$/acl", injected}),
              short_read = fails(SEC_S_FILE_ERROR, MSG_2650_139, {-1, text_size, injected});

// Compiling and caching. stat: the ACL file's name, then the writer's last
// look at it before the rename (a failure means writing nothing). lstat:
// the writer's look at the CACL name, then a temporary name (a failure draws
// another one). open: the CACL file (a failure only means compiling), the
// text, then in the writer the CACL file and the temporary file. fstat and
// fcntl: the text's descriptor, before reading it. close: the temporary
// file, the writer's CACL descriptor, the text (the last two change
// nothing). Whatever fails in the writer, the read succeeds uncached.
const std::vector<fault_row> compile_and_cache = {
    {sys_call::stat, {no_file, text_only}},
    {sys_call::lstat, {text_only, text_cached}},
    {sys_call::open, {text_cached, unopened, text_only, text_only}},
    {sys_call::fstat, {unreadable}},
    {sys_call::fcntl, {short_read}},
    {sys_call::read, {short_read}},
    {sys_call::write, {text_only}},
    {sys_call::close, {text_only, text_cached, text_cached}},
    {sys_call::fchown, {text_only}},
    {sys_call::fchmod, {text_only}},
    {sys_call::rename, {text_only}}};

// A stale CACL file is opened and judged by its descriptor first: a failed
// fstat only means compiling, and its descriptor is closed again.
std::vector<fault_row> with_stale_cacl_opened() {
    std::vector<fault_row> rows = compile_and_cache;
    for (fault_row &row : rows)
        if (row.kind == sys_call::fstat || row.kind == sys_call::close)
            row.by_call.insert(row.by_call.begin(), text_cached);
    return rows;
}

TEST(SyscallFailure, CompilingAndCaching) {
    fail_each_call_of_read("no CACL file", cacl_before::absent, CACHE, false, compile_and_cache);
    fail_each_call_of_read("stale CACL file", cacl_before::stale, CACHE, false,
                           with_stale_cacl_opened());
}

// Reading a current CACL file: any failure on its way falls back to the
// text, whose compiled buffer is the same, and the CACL file, being newer,
// is not rewritten. The CACL file is opened first and judged by its
// descriptor, so that the file judged is the file read.
TEST(SyscallFailure, ReadingTheCaclFile) {
    fail_each_call_of_read("current CACL file", cacl_before::current, CACHE | CONVERT, false,
                           {{sys_call::stat, {no_file}},
                            {sys_call::open, {text_only}},
                            {sys_call::fstat, {text_only}},
                            {sys_call::read, {text_only}},
                            {sys_call::close, {gives(CONVERT)}}});
}

TEST(SyscallFailure, CompilingARelativeName) {
    fail_each_call_of_read(
        "relative name", cacl_before::absent, TEXT, true,
        {{sys_call::getcwd, {fails(SEC_S_NO_ACL_FILE, MSG_2650_166, {"getcwd()", injected})}},
         {sys_call::stat, {no_file}},
         {sys_call::open, {unopened}},
         {sys_call::fstat, {unreadable}},
         {sys_call::fcntl, {short_read}},
         {sys_call::read, {short_read}},
         {sys_call::close, {text_only}}});
}

// The CACL writer itself, whose failures the reader clears: each one is
// reported with its own message, and removes what it created.
TEST(SyscallFailure, WritingTheCaclFile) {
    const long long size = static_cast<long long>(example_acl().size());
    const std::string cacl = "$/acl.cacl";
    // The writer's result: 0 written, 1 nothing written (and no record).
    const outcome written = gives(0), nothing = {1, 0, 0, {}},
                  unexamined = fails(SEC_S_FILE_ERROR, MSG_2650_135, {"$/acl", injected});
    auto short_write = [&](long long got) {
        return fails(SEC_S_FILE_ERROR, MSG_2650_152, {got, size, injected});
    };
    const std::vector<fault_row> rows = {
        {sys_call::stat, {unexamined, nothing}},
        {sys_call::lstat, {unexamined, written}},
        {sys_call::open,
         {fails(SEC_S_FILE_ERROR, MSG_2650_151, {cacl}),
          fails(SEC_S_FILE_ERROR, MSG_2650_151, {"<temp>"})}},
        {sys_call::write, {short_write(-1)}},
        {sys_call::fchown,
         {fails(SEC_S_FILE_ERROR, MSG_2650_154,
                {cacl, std::to_string(geteuid()), static_cast<long long>(getegid())})}},
        {sys_call::fchmod, {fails(SEC_S_FILE_ERROR, MSG_2650_155, {cacl, 0644})}},
        {sys_call::close, {short_write(size), written}},
        {sys_call::rename, {fails(SEC_S_FILE_ERROR, MSG_2650_177, {"<temp>", cacl})}}};
    for (cacl_before before : {cacl_before::absent, cacl_before::stale}) {
        fail_each_call(
            before == cacl_before::absent ? "writer, no CACL file" : "writer, stale", rows,
            [&](sys_call kind, long n, const outcome *expected) {
                prepared p(before);
                sec_buffer_s acl{static_cast<kx_int32_t>(p.compiled.size()), p.compiled.data()};
                bool fired = with_failure(kind, n, injected, expected, p.d.dir, [&] {
                    return sec__cache_aclbuffer(p.d.acl.c_str(), &acl, 0);
                });
                if (fired)
                    expect_files_left(p, expected && *expected == written);
                return fired;
            });
    }
}

// A read or a write that moves half the bytes: the read fails showing the
// bytes it got; the write fails showing the bytes written, which makes the
// read go without caching.
TEST(SyscallFailure, ShortReadAndShortWrite) {
    prepared p(cacl_before::absent);
    const long long acl_size = static_cast<long long>(p.compiled.size());
    const outcome half_read = fails(SEC_S_FILE_ERROR, MSG_2650_139, {text_size / 2, text_size, 0}),
                  half_written = fails(SEC_S_FILE_ERROR, MSG_2650_152, {acl_size / 2, acl_size, 0});
    sec_buffer_s acl{static_cast<kx_int32_t>(acl_size), p.compiled.data()};
    ASSERT_TRUE(with_failure(sys_call::read, 0, 0, &half_read, p.d.dir,
                             [&] { return acl_read(p.d.acl, CACHE).status; }));
    ASSERT_TRUE(with_failure(sys_call::write, 0, 0, &half_written, p.d.dir,
                             [&] { return sec__cache_aclbuffer(p.d.acl.c_str(), &acl, 0); }));
    ASSERT_TRUE(with_failure(sys_call::write, 0, 0, &text_only, p.d.dir, [&] {
        acl_read r(p.d.acl, CACHE);
        EXPECT_EQ(r.rflags, TEXT);
        return r.status;
    }));
    expect_files_left(p, false);
}

} // namespace
