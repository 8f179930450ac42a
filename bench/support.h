// What the benchmarks share: a counting allocator, identities, ACL files in
// a scratch directory, and ACL buffers compiled from them. Everything goes
// through the public interface, as a daemon's calls would.
#ifndef KXACL_BENCH_SUPPORT_H
#define KXACL_BENCH_SUPPORT_H

#include <cstddef>
#include <string>
#include <vector>

#include <benchmark/benchmark.h>

#include <kx_acl.h>

namespace kxbench {

// Heap allocations of the calling thread (malloc, calloc, realloc; operator
// new goes through malloc) while counting is on. The benchmark binary takes
// the C library's place for these functions, so the libraries' calls are
// seen as well.
void start_counting_allocations();
long stop_counting_allocations();

// Reports allocations per iteration as the counter "allocs_per_op".
void report_allocations(benchmark::State &state, long allocations);

// n distinct identities in ascending order of the library's comparison:
// 6 to 10 lowercase letters followed by a number, like "kqzuva917".
std::vector<std::string> sorted_identities(std::size_t n, unsigned seed = 1);

// The same identities in a pseudo-random order.
std::vector<std::string> shuffled(std::vector<std::string> ids, unsigned seed = 2);

// A scratch directory removed with everything in it when the process ends.
const std::string &scratch_dir();

// Writes text to the file path with a modification time two seconds in the
// past, so that a cached compiled file written now is current.
void write_acl_file(const std::string &path, const std::string &text);

// The text of an ACL file with one user line of mechanism "unix" per identity.
std::string user_lines(const std::vector<std::string> &ids, const char *type = "u unix");

// An ACL buffer owned by the benchmark, released at the end of its scope.
struct owned_acl {
    sec_buffer_s buf{0, nullptr};
    owned_acl() = default;
    owned_acl(const owned_acl &) = delete;
    owned_acl &operator=(const owned_acl &) = delete;
    ~owned_acl() { sec_release_acl(&buf); }
};

// Compiles the ACL file at path into acl (SEC_F_ACL_TEXT); aborts the
// process with a message when that fails, since every result would be void.
void compile_acl_file(const std::string &path, sec_buffer_s *acl);

// A group list for sec__group_acles_perm, pointing into names.
std::vector<sec_buffer_s> group_list(const std::vector<std::string> &names);

// Stops the process with a message: a fixture could not be set up.
[[noreturn]] void fail(const std::string &what);

} // namespace kxbench

#endif
