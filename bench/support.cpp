// Benchmark support; see support.h.
#include "support.h"

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <random>
#include <sys/stat.h>
#include <sys/time.h>

#include <kx_cu.h>

// ---- counting allocator ------------------------------------------------------
//
// These replace the C library's functions for the whole process, the shared
// libraries included. The counters are the calling thread's own, so that
// threads measured together do not contend on them, and live in static TLS,
// which needs no allocation to reach.

extern "C" {
void *__libc_malloc(std::size_t size);
void *__libc_calloc(std::size_t count, std::size_t size);
void *__libc_realloc(void *p, std::size_t size);
}

namespace {
thread_local bool counting = false;
thread_local long allocations = 0;

inline void note_allocation() {
    if (counting)
        ++allocations;
}
} // namespace

extern "C" {
__attribute__((visibility("default"))) void *malloc(std::size_t size) noexcept {
    note_allocation();
    return __libc_malloc(size);
}
__attribute__((visibility("default"))) void *calloc(std::size_t count, std::size_t size) noexcept {
    note_allocation();
    return __libc_calloc(count, size);
}
__attribute__((visibility("default"))) void *realloc(void *p, std::size_t size) noexcept {
    note_allocation();
    return __libc_realloc(p, size);
}
}

namespace kxbench {

void start_counting_allocations() {
    allocations = 0;
    counting = true;
}

long stop_counting_allocations() {
    counting = false;
    return allocations;
}

void report_allocations(benchmark::State &state, long count) {
    double per_op = state.iterations() ? static_cast<double>(count) / state.iterations() : 0;
    state.counters["allocs_per_op"] = benchmark::Counter(per_op, benchmark::Counter::kAvgThreads);
}

[[noreturn]] void fail(const std::string &what) {
    std::fprintf(stderr, "kxacl_bench: %s\n", what.c_str());
    std::exit(2);
}

// ---- identities --------------------------------------------------------------

std::vector<std::string> sorted_identities(std::size_t n, unsigned seed) {
    std::mt19937 random(seed);
    std::uniform_int_distribution<int> length(6, 10), letter('a', 'z');
    std::vector<std::string> ids;
    ids.reserve(n);
    // Letters never contain digits, so the number makes every name unique.
    for (std::size_t i = 0; i < n; ++i) {
        std::string id;
        for (int k = length(random); k > 0; --k)
            id += static_cast<char>(letter(random));
        ids.push_back(id + std::to_string(i));
    }
    std::sort(ids.begin(), ids.end(), [](const std::string &a, const std::string &b) {
        return cu_strcasecmp_posix_1(a.c_str(), b.c_str()) < 0;
    });
    return ids;
}

std::vector<std::string> shuffled(std::vector<std::string> ids, unsigned seed) {
    std::shuffle(ids.begin(), ids.end(), std::mt19937(seed));
    return ids;
}

// ---- files -------------------------------------------------------------------

namespace {
struct scratch {
    std::string path;
    scratch() {
        char tmpl[] = "/tmp/kxacl_bench.XXXXXX";
        if (!mkdtemp(tmpl))
            fail("cannot create a scratch directory");
        path = tmpl;
    }
    ~scratch() {
        std::error_code ignored;
        std::filesystem::remove_all(path, ignored);
    }
};
} // namespace

const std::string &scratch_dir() {
    static scratch dir;
    return dir.path;
}

void write_acl_file(const std::string &path, const std::string &text) {
    {
        std::ofstream out(path, std::ios::binary | std::ios::trunc);
        out << text;
        if (!out)
            fail("cannot write " + path);
    }
    chmod(path.c_str(), 0644);
    struct timeval past[2];
    gettimeofday(&past[0], nullptr);
    past[0].tv_sec -= 2;
    past[1] = past[0];
    if (utimes(path.c_str(), past) != 0)
        fail("cannot set the time of " + path);
}

std::string user_lines(const std::vector<std::string> &ids, const char *type) {
    std::string text;
    text.reserve(ids.size() * 24);
    for (const std::string &id : ids) {
        text += type;
        text += ' ';
        text += id;
        text += " rw\n";
    }
    return text;
}

void compile_acl_file(const std::string &path, sec_buffer_s *acl) {
    kx_uint32_t rflags = 0;
    if (sec_read_acl_file(path.c_str(), nullptr, nullptr, SEC_F_ACL_TEXT, acl, &rflags) != SEC_S_OK)
        fail("cannot compile " + path);
}

std::vector<sec_buffer_s> group_list(const std::vector<std::string> &names) {
    std::vector<sec_buffer_s> groups;
    for (const std::string &name : names)
        groups.push_back(
            {static_cast<kx_int32_t>(name.size() + 1), const_cast<char *>(name.c_str())});
    return groups;
}

} // namespace kxbench
