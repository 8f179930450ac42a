// Every system call of sec_read_acl_file fails in turn on each way through
// it: the listed outcome, no descriptor or temporary file left, and the
// CACL file the one before or the new complete one.
#include <cerrno>
#include <cstring>
#include <filesystem>
#include <map>

#include "file_helpers.h"

using namespace kxacl;
using namespace kxtest;

namespace {

constexpr int injected = EIO;

struct outcome {
    kx_int32_t status, msg;
    kx_uint32_t rflags;
    std::vector<arg> args;
};
outcome fails(kx_int32_t status, int msg, std::vector<arg> args) {
    return {status, msg, 0, std::move(args)};
}
outcome gives(kx_uint32_t rflags) {
    return {SEC_S_OK, 0, rflags, {}};
}
enum class cacl_before { absent, stale, current };

// The outcome of each call of each kind in order (a kind not listed is not called).
using fault_rows = std::map<sys_call, std::vector<outcome>>;
struct read_path {
    const char *what;
    cacl_before cacl;
    kx_uint32_t flags;
    bool relative;
    fault_rows calls;
};
int open_descriptors() {
    auto fds = std::filesystem::directory_iterator("/proc/self/fd");
    return static_cast<int>(std::distance(begin(fds), end(fds)));
}

struct prepared {
    acl_dir d;
    std::string compiled = acl_read(d.acl, TEXT).bytes();
    std::string cacl_bytes = "<missing>";
    explicit prepared(cacl_before cacl) {
        if (cacl == cacl_before::absent)
            return;
        cacl_bytes = cacl == cacl_before::current ? compiled : std::string("\x85\x01\x02\0\0", 5);
        write_file(d.cacl, cacl_bytes);
        shift_mtime(d.cacl, cacl == cacl_before::current ? 0 : -20);
    }
    void expect_files_left(bool written) const {
        std::string cacl = read_file(d.cacl);
        EXPECT_EQ(cacl, written ? compiled : cacl_bytes);
        std::vector<std::string> expected{"acl"};
        if (cacl != "<missing>")
            expected.push_back("acl.cacl");
        EXPECT_EQ(dir_entries(d.dir), expected);
    }
};

// Reads with call n of kind failing; false when fewer calls were made.
bool read_failing(const prepared &p, const std::string &name, kx_uint32_t flags, sys_call kind,
                  long n, int err, const outcome *expected, const std::string &dir) {
    int fds = open_descriptors();
    sys_fail_nth(kind, n, err);
    acl_read r(name, flags);
    bool fired = sys_fault_fired();
    sys_fail_nth(kind, -1, 0);
    if (!fired)
        return false;
    EXPECT_EQ(open_descriptors(), fds);
    if (!expected) {
        ADD_FAILURE() << "a call that this path should not make";
        return true;
    }
    EXPECT_EQ(r.status, expected->status);
    EXPECT_TRUE(record_is(expected->msg ? expected->status : 0, expected->msg,
                          in_dir(dir, expected->args)));
    if (expected->status == SEC_S_OK) {
        EXPECT_EQ(r.rflags, expected->rflags);
        EXPECT_EQ(r.bytes(), p.compiled);
    } else { // once the CACL file is passed over, 0x1 is set
        EXPECT_TRUE(r.empty());
        EXPECT_EQ(r.rflags, expected->status == SEC_S_NO_ACL_FILE ? flags : flags | TEXT);
    }
    p.expect_files_left(expected->status == SEC_S_OK && (expected->rflags & CACHE));
    return true;
}

void fail_each_call(const read_path &path) {
    for (int k = 0; k <= static_cast<int>(sys_call::fcntl); ++k) {
        auto row = path.calls.find(static_cast<sys_call>(k));
        std::size_t listed = row == path.calls.end() ? 0 : row->second.size(), n = 0;
        for (;; ++n) {
            SCOPED_TRACE(path.what + std::string(": kind ") + std::to_string(k) + " call " +
                         std::to_string(n));
            prepared p(path.cacl);
            std::string dir = p.d.dir;
            if (path.relative) {
                EXPECT_EQ(chdir(dir.c_str()), 0);
                dir = std::filesystem::canonical(dir).string();
            }
            if (!read_failing(p, path.relative ? "acl" : p.d.acl, path.flags,
                              static_cast<sys_call>(k), static_cast<long>(n), injected,
                              n < listed ? &row->second[n] : nullptr, dir))
                break;
        }
        EXPECT_EQ(n, listed) << path.what << ": calls of kind " << k;
    }
}
const long long text_size = static_cast<long long>(std::strlen(example_text));
const outcome text_only = gives(TEXT), text_cached = gives(TEXT | CACHE);
const outcome no_file = fails(SEC_S_NO_ACL_FILE, MSG_2650_135, {"$/acl", injected}),
              unreadable = fails(SEC_S_FILE_ERROR, MSG_2650_135, {"$/acl", injected}),
              unopened = fails(SEC_S_FILE_ERROR, MSG_2650_137, {"$/acl", injected}),
              short_read = fails(SEC_S_FILE_ERROR, MSG_2650_139, {-1, text_size, injected});

// stat: the ACL file's name, then the writer's last look at it before the
// rename (a failure means writing nothing). lstat: the writer's look at the
// CACL name, then a temporary name (a failure draws another one). open: the
// CACL file (a failure only means compiling), the text, then in the writer
// the CACL file and the temporary file. fstat and fcntl: the text's
// descriptor, before reading it. close: the temporary file, the writer's
// CACL descriptor, the text (the last two change nothing). Whatever fails
// in the writer, the read succeeds uncached.
// clang-format off
const fault_rows compile_and_cache = {
    {sys_call::stat, {no_file, text_only}}, {sys_call::lstat, {text_only, text_cached}},
    {sys_call::open, {text_cached, unopened, text_only, text_only}},
    {sys_call::fstat, {unreadable}}, {sys_call::fcntl, {short_read}}, {sys_call::read, {short_read}},
    {sys_call::write, {text_only}}, {sys_call::close, {text_only, text_cached, text_cached}},
    {sys_call::fchown, {text_only}}, {sys_call::fchmod, {text_only}}, {sys_call::rename, {text_only}}};
// clang-format on

// A stale CACL file is opened and judged by its descriptor first: a failed
// fstat only means compiling, and its descriptor is closed again. Any
// failure on the way to a current CACL file falls back to the text, which
// compiles to the same bytes; the CACL file, being newer, stays.
TEST(SyscallFailure, EachCallFailingOrMovingHalfTheBytes) {
    fault_rows stale = compile_and_cache;
    stale[sys_call::fstat].insert(stale[sys_call::fstat].begin(), text_cached);
    stale[sys_call::close].insert(stale[sys_call::close].begin(), text_cached);
    // clang-format off
    const read_path paths[] = {
        {"no CACL file", cacl_before::absent, CACHE, false, compile_and_cache},
        {"stale CACL file", cacl_before::stale, CACHE, false, stale},
        {"current CACL file", cacl_before::current, CACHE | CONVERT, false,
         {{sys_call::stat, {no_file}}, {sys_call::open, {text_only}}, {sys_call::fstat, {text_only}},
          {sys_call::read, {text_only}}, {sys_call::close, {gives(CONVERT)}}}},
        {"relative name, compiled", cacl_before::absent, TEXT, true,
         {{sys_call::getcwd, {fails(SEC_S_NO_ACL_FILE, MSG_2650_166, {"getcwd()", injected})}},
          {sys_call::stat, {no_file}}, {sys_call::open, {unopened}}, {sys_call::fstat, {unreadable}},
          {sys_call::fcntl, {short_read}}, {sys_call::read, {short_read}},
          {sys_call::close, {text_only}}}},
    };
    // clang-format on
    for (const read_path &path : paths)
        fail_each_call(path);
    // A read or a write that moves half the bytes: the read fails showing
    // the bytes it got; the write leaves the read uncached.
    prepared p(cacl_before::absent);
    const outcome half_read = fails(SEC_S_FILE_ERROR, MSG_2650_139, {text_size / 2, text_size, 0});
    EXPECT_TRUE(read_failing(p, p.d.acl, CACHE, sys_call::read, 0, 0, &half_read, p.d.dir));
    EXPECT_TRUE(read_failing(p, p.d.acl, CACHE, sys_call::write, 0, 0, &text_only, p.d.dir));
}
} // namespace
