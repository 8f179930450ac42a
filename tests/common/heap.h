// One replacement of the process's malloc, calloc and realloc for the tests
// that count or fail heap allocations. Linked only into the executables that
// need it (target kx_test_heap): it replaces the allocator of the whole
// process. The sanitizers bring their own allocator, so their trees do not
// build those executables, and valgrind's own allocator bypasses it.
#ifndef KX_TEST_HEAP_H
#define KX_TEST_HEAP_H

namespace kxtest::heap {

// Every allocation fails while on.
void fail_all(bool on);

// Allocation n (0-based, counted from now) fails, once; fired() tells
// whether it came.
void fail_nth(long n);
void disarm();
bool fired();

// Counts allocations while on; counted() is the number since start_counting.
void start_counting();
long stop_counting();

} // namespace kxtest::heap

#endif
