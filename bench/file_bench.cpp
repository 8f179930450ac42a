// ACL files: compiling texts of 10 000, 100 000 and 1 000 000 user lines,
// their identities shuffled and sorted; and reading the ACL from a current
// cached compiled file beside a bare open/fstat/read/close of that file.
#include <fcntl.h>
#include <map>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

#include "support.h"

namespace kxbench {
namespace {

// ---- compiling -------------------------------------------------------------

enum class order { shuffled, sorted };
const char *order_name[] = {"shuffled", "sorted"};

// The ACL file of n user lines in the given order, written once.
const std::string &acl_text_file(std::size_t n, order o) {
    static std::map<std::pair<std::size_t, order>, std::string> files;
    std::string &path = files[{n, o}];
    if (path.empty()) {
        std::vector<std::string> ids = sorted_identities(n);
        if (o == order::shuffled)
            ids = shuffled(std::move(ids));
        path = scratch_dir() + "/compile." + std::to_string(n) + "." + order_name[int(o)];
        write_acl_file(path, user_lines(ids));
    }
    return path;
}

double stack_limit_kib() {
    struct rlimit limit;
    if (getrlimit(RLIMIT_STACK, &limit) != 0 || limit.rlim_cur == RLIM_INFINITY)
        return -1;
    return static_cast<double>(limit.rlim_cur) / 1024;
}

// Compiles on the benchmark's own thread, so with the process's default
// stack; the limit in force is reported beside the time.
void read_acl_file_compile(benchmark::State &state, std::size_t n, order o) {
    const std::string &path = acl_text_file(n, o);
    long allocations = 0;
    for (auto _ : state) {
        sec_buffer_s acl{0, nullptr};
        kx_uint32_t rflags = 0;
        start_counting_allocations();
        kx_int32_t status =
            sec_read_acl_file(path.c_str(), nullptr, nullptr, SEC_F_ACL_TEXT, &acl, &rflags);
        allocations += stop_counting_allocations();
        if (status != SEC_S_OK || acl.length == 0)
            state.SkipWithError("compiling failed");
        sec_release_acl(&acl);
    }
    state.SetItemsProcessed(static_cast<std::int64_t>(state.iterations() * n));
    state.counters["allocs_per_line"] =
        static_cast<double>(allocations) / static_cast<double>(state.iterations() * n);
    state.counters["stack_limit_kib"] = stack_limit_kib();
}

// ---- reading the cached file -----------------------------------------------

// An ACL file of n user lines with its current cached compiled file.
const std::string &cached_acl_file(std::size_t n) {
    static std::map<std::size_t, std::string> files;
    std::string &path = files[n];
    if (path.empty()) {
        path = scratch_dir() + "/cached." + std::to_string(n);
        write_acl_file(path, user_lines(sorted_identities(n)));
        owned_acl acl;
        kx_uint32_t rflags = 0;
        if (sec_read_acl_file(path.c_str(), nullptr, nullptr, SEC_F_ACL_CACHE, &acl.buf, &rflags) !=
                SEC_S_OK ||
            !(rflags & SEC_F_ACL_CACHE))
            fail("cannot cache " + path);
    }
    return path;
}

void read_acl_file_cached(benchmark::State &state, std::size_t n) {
    const std::string &path = cached_acl_file(n);
    long allocations = 0;
    for (auto _ : state) {
        sec_buffer_s acl{0, nullptr};
        kx_uint32_t rflags = ~0u;
        start_counting_allocations();
        kx_int32_t status = sec_read_acl_file(path.c_str(), nullptr, nullptr, 0, &acl, &rflags);
        allocations += stop_counting_allocations();
        if (status != SEC_S_OK || rflags != 0)
            state.SkipWithError("the cached file was not used");
        sec_release_acl(&acl);
    }
    state.counters["allocs_per_op"] =
        static_cast<double>(allocations) / static_cast<double>(state.iterations());
}

// The least a reader of the cached file does: open it, learn its size, read
// it into a new block for the caller, close it. The block is freed, as the
// caller frees the ACL.
void bare_read_baseline(benchmark::State &state, std::size_t n) {
    std::string cacl = cached_acl_file(n) + ".cacl";
    for (auto _ : state) {
        int fd = open(cacl.c_str(), O_RDONLY | O_CLOEXEC);
        struct stat st;
        if (fd < 0 || fstat(fd, &st) != 0)
            state.SkipWithError("cannot open the cached file");
        auto size = static_cast<std::size_t>(st.st_size);
        void *bytes = std::malloc(size);
        if (!bytes || read(fd, bytes, size) != static_cast<ssize_t>(size))
            state.SkipWithError("cannot read the cached file");
        close(fd);
        benchmark::DoNotOptimize(bytes);
        std::free(bytes);
    }
}

bool registered = [] {
    for (std::size_t n : {10000, 100000, 1000000})
        for (order o : {order::shuffled, order::sorted})
            benchmark::RegisterBenchmark(
                ("read_acl_file_compile/lines:" + std::to_string(n) + "/" + order_name[int(o)])
                    .c_str(),
                read_acl_file_compile, n, o)
                ->Unit(benchmark::kMillisecond)
                ->MeasureProcessCPUTime()
                ->UseRealTime();
    for (std::size_t n : {10, 1000, 100000}) {
        std::string args = "/entries:" + std::to_string(n);
        benchmark::RegisterBenchmark(("read_acl_file_cached" + args).c_str(), read_acl_file_cached,
                                     n)
            ->Unit(benchmark::kMicrosecond);
        benchmark::RegisterBenchmark(("read_acl_file_cached.baseline" + args).c_str(),
                                     bare_read_baseline, n)
            ->Unit(benchmark::kMicrosecond);
    }
    return true;
}();

} // namespace
} // namespace kxbench
