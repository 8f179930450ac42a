#include "heap.h"

#include <atomic>
#include <cerrno>
#include <cstddef>

extern "C" {
void *__libc_malloc(std::size_t size);
void *__libc_calloc(std::size_t count, std::size_t size);
void *__libc_realloc(void *p, std::size_t size);
}

namespace kxtest::heap {
namespace {
// Atomics: the hooks run on every thread, and no compiler may assume that
// a call leaves them alone.
std::atomic<bool> failing_all{false};
std::atomic<bool> armed{false};
std::atomic<long> to_pass{0};
std::atomic<bool> came{false};
std::atomic<bool> counting{false};
std::atomic<long> allocations{0};

bool refuse() {
    if (counting.load(std::memory_order_relaxed))
        allocations.fetch_add(1, std::memory_order_relaxed);
    bool fail = failing_all.load(std::memory_order_relaxed);
    if (!fail && armed.load(std::memory_order_relaxed) && to_pass.fetch_sub(1) == 0) {
        armed = false;
        came = true;
        fail = true;
    }
    if (fail)
        errno = ENOMEM;
    return fail;
}
} // namespace

void fail_all(bool on) {
    failing_all = on;
}

void fail_nth(long n) {
    came = false;
    to_pass = n;
    armed = true;
}

void disarm() {
    armed = false;
}

bool fired() {
    return came;
}

void start_counting() {
    allocations = 0;
    counting = true;
}

long stop_counting() {
    counting = false;
    return allocations;
}

} // namespace kxtest::heap

// Default visibility: the build hides symbols, and the dynamic linker must
// see these to prefer them to the C library's.
extern "C" {
__attribute__((visibility("default"))) void *malloc(std::size_t size) noexcept {
    return kxtest::heap::refuse() ? nullptr : __libc_malloc(size);
}
__attribute__((visibility("default"))) void *calloc(std::size_t count, std::size_t size) noexcept {
    return kxtest::heap::refuse() ? nullptr : __libc_calloc(count, size);
}
__attribute__((visibility("default"))) void *realloc(void *p, std::size_t size) noexcept {
    return kxtest::heap::refuse() ? nullptr : __libc_realloc(p, size);
}
}
