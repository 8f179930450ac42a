// Evaluation: sec__single_acle_perm over user sub-ACLs of 10, 1 000 and
// 100 000 entries, sec__group_acles_perm with 1, 8 and 64 group names over
// 1 000 group entries, and throughput with one and two threads on one
// buffer. Each single-thread case runs beside its baseline, the scan that
// evaluation is specified to make, done on a plain array of the same
// identifiers with cu_strcasecmp_posix_1: walk in order, stop at the first
// equal identifier or at the first one that sorts after the requester.
// Every case counts the heap allocations it makes.
#include <cctype>
#include <map>
#include <memory>

#include <kx_cu.h>

#include "support.h"

namespace kxbench {
namespace {

// A compiled ACL of n entries of one type, and the same identities packed
// one after another in one block, as the baseline reads them.
struct entry_set {
    std::vector<std::string> ids;
    owned_acl acl;
    std::string pool;
    std::vector<const char *> array;

    entry_set(std::size_t n, const char *type, const char *file) : ids(sorted_identities(n)) {
        std::string path = scratch_dir() + "/" + file;
        write_acl_file(path, user_lines(ids, type));
        compile_acl_file(path, &acl.buf);
        for (const std::string &id : ids)
            pool.append(id.c_str(), id.size() + 1);
        for (std::size_t i = 0, at = 0; i < ids.size(); at += ids[i].size() + 1, ++i)
            array.push_back(pool.c_str() + at);
    }
};

// Not for threads: the benchmarks of several threads take their set through
// shared_users.
entry_set &users(std::size_t n) {
    static std::map<std::size_t, std::unique_ptr<entry_set>> sets;
    auto &set = sets[n];
    if (!set)
        set = std::make_unique<entry_set>(n, "u unix", ("users." + std::to_string(n)).c_str());
    return *set;
}

// The 1 000 entries for the benchmarks whose threads start together: the
// first one makes it while the others wait.
entry_set &shared_users() {
    static entry_set &set = users(1000);
    return set;
}

entry_set &groups() {
    static entry_set set(1000, "g", "groups.1000");
    return set;
}

// The identity with its first letter in capitals: matching ignores case.
std::string capitalised(std::string id) {
    id[0] = static_cast<char>(std::toupper(static_cast<unsigned char>(id[0])));
    return id;
}

enum class where { first, last, none };
const char *where_name[] = {"match_first", "match_last", "no_match"};

std::string request_for(const entry_set &set, where w) {
    switch (w) {
    case where::first:
        return capitalised(set.ids.front());
    case where::last:
        return capitalised(set.ids.back());
    default:
        return "zzzzzzzzzzz~"; // sorts after every identity: the whole walk
    }
}

// The specified scan on an array: the mask bit of the matching index, or 0.
inline kx_uint32_t scan(const char *const *ids, std::size_t n, const char *id, bool *matched) {
    for (std::size_t i = 0; i < n; ++i) {
        int r = cu_strcasecmp_posix_1(id, ids[i]);
        if (r == 0) {
            *matched = true;
            return 0x3; // every entry grants "rw"
        }
        if (r < 0)
            break;
    }
    return 0;
}

// ---- one user --------------------------------------------------------------

kx_int32_t evaluate_user(entry_set &set, std::string &id, kx_uint32_t *perm) {
    return sec__single_acle_perm(&set.acl.buf, SEC_ACLE_USER, const_cast<char *>("unix"), nullptr,
                                 id.data(), perm);
}

void single_acle_perm(benchmark::State &state, std::size_t n, where w) {
    entry_set &set = users(n);
    std::string id = request_for(set, w);
    kx_uint32_t perm = 0;
    bool matched = false;
    kx_uint32_t expected = scan(set.array.data(), n, id.c_str(), &matched);
    kx_int32_t status = evaluate_user(set, id, &perm);
    if ((status == SEC_S_OK) != matched || (matched && perm != expected))
        state.SkipWithError("evaluation and scan disagree");
    start_counting_allocations();
    for (auto _ : state) {
        benchmark::DoNotOptimize(evaluate_user(set, id, &perm));
        benchmark::DoNotOptimize(perm);
    }
    report_allocations(state, stop_counting_allocations());
}

void single_scan_baseline(benchmark::State &state, std::size_t n, where w) {
    entry_set &set = users(n);
    std::string id = request_for(set, w);
    start_counting_allocations();
    for (auto _ : state) {
        bool matched = false;
        benchmark::DoNotOptimize(scan(set.array.data(), n, id.c_str(), &matched));
        benchmark::DoNotOptimize(matched);
    }
    report_allocations(state, stop_counting_allocations());
}

// ---- groups ----------------------------------------------------------------

// k group names spread evenly over the entries, in varying case.
std::vector<std::string> group_names(const entry_set &set, std::size_t k) {
    std::vector<std::string> names;
    for (std::size_t i = 0; i < k; ++i) {
        std::string name = set.ids[(2 * i + 1) * set.ids.size() / (2 * k)];
        names.push_back(i % 2 ? capitalised(name) : name);
    }
    return names;
}

void group_acles_perm(benchmark::State &state, std::size_t k) {
    entry_set &set = groups();
    std::vector<std::string> names = group_names(set, k);
    std::vector<sec_buffer_s> list = group_list(names);
    kx_uint32_t perm = 0;
    auto count = static_cast<kx_int32_t>(list.size());
    if (sec__group_acles_perm(&set.acl.buf, count, list.data(), &perm) != SEC_S_OK || perm != 0x3)
        state.SkipWithError("group evaluation failed");
    start_counting_allocations();
    for (auto _ : state) {
        benchmark::DoNotOptimize(sec__group_acles_perm(&set.acl.buf, count, list.data(), &perm));
        benchmark::DoNotOptimize(perm);
    }
    report_allocations(state, stop_counting_allocations());
}

void group_scan_baseline(benchmark::State &state, std::size_t k) {
    entry_set &set = groups();
    std::vector<std::string> names = group_names(set, k);
    start_counting_allocations();
    for (auto _ : state) {
        kx_uint32_t mask = 0;
        bool matched = false;
        for (const std::string &name : names)
            mask |= scan(set.array.data(), set.array.size(), name.c_str(), &matched);
        benchmark::DoNotOptimize(mask);
        benchmark::DoNotOptimize(matched);
    }
    report_allocations(state, stop_counting_allocations());
}

// ---- threads ---------------------------------------------------------------

// Many threads evaluating one buffer: a request that matches in the middle
// of 1 000 user entries, with no identity handler involved.
void evaluation_throughput(benchmark::State &state) {
    entry_set &set = shared_users();
    std::string id = capitalised(set.ids[set.ids.size() / 2]);
    kx_uint32_t perm = 0;
    start_counting_allocations();
    for (auto _ : state) {
        benchmark::DoNotOptimize(evaluate_user(set, id, &perm));
        benchmark::DoNotOptimize(perm);
    }
    report_allocations(state, stop_counting_allocations());
    state.SetItemsProcessed(state.iterations());
}

// The same, as the baseline scan: what two threads of this machine give
// for work that shares nothing.
void scan_throughput_baseline(benchmark::State &state) {
    entry_set &set = shared_users();
    std::string id = capitalised(set.ids[set.ids.size() / 2]);
    for (auto _ : state) {
        bool matched = false;
        benchmark::DoNotOptimize(scan(set.array.data(), set.array.size(), id.c_str(), &matched));
        benchmark::DoNotOptimize(matched);
    }
    state.SetItemsProcessed(state.iterations());
}

bool registered = [] {
    for (std::size_t n : {10, 1000, 100000})
        for (where w : {where::first, where::last, where::none}) {
            std::string args = "/n:" + std::to_string(n) + "/" + where_name[int(w)];
            benchmark::RegisterBenchmark(("single_acle_perm" + args).c_str(), single_acle_perm, n,
                                         w);
            benchmark::RegisterBenchmark(("single_acle_perm.baseline" + args).c_str(),
                                         single_scan_baseline, n, w);
        }
    for (std::size_t k : {1, 8, 64}) {
        std::string args = "/groups:" + std::to_string(k) + "/entries:1000";
        benchmark::RegisterBenchmark(("group_acles_perm" + args).c_str(), group_acles_perm, k);
        benchmark::RegisterBenchmark(("group_acles_perm.baseline" + args).c_str(),
                                     group_scan_baseline, k);
    }
    benchmark::RegisterBenchmark("evaluation_throughput/n:1000", evaluation_throughput)
        ->Threads(1)
        ->Threads(2)
        ->UseRealTime();
    benchmark::RegisterBenchmark("evaluation_throughput.baseline/n:1000", scan_throughput_baseline)
        ->Threads(1)
        ->Threads(2)
        ->UseRealTime();
    return true;
}();

} // namespace
} // namespace kxbench
