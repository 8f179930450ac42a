// Allocation with a test hook that fails allocations on request.
#include "alloc.h"

#include <atomic>
#include <cstring>

namespace kxacl {
namespace {

std::atomic<long> successes_left{-1};
std::atomic<unsigned long> attempts{0};

// True when the hook says this allocation is to fail.
bool injected_failure() {
    attempts.fetch_add(1, std::memory_order_relaxed);
    long left = successes_left.load(std::memory_order_relaxed);
    if (left < 0)
        return false;
    if (left == 0)
        return true;
    successes_left.fetch_sub(1, std::memory_order_relaxed);
    return false;
}

} // namespace

void *mem_alloc(std::size_t size) {
    return injected_failure() ? nullptr : std::malloc(size ? size : 1);
}

void *mem_zalloc(std::size_t size) {
    return injected_failure() ? nullptr : std::calloc(1, size ? size : 1);
}

void *mem_realloc(void *p, std::size_t size) {
    return injected_failure() ? nullptr : std::realloc(p, size ? size : 1);
}

char *mem_strndup(const char *s, std::size_t length) {
    auto *copy = static_cast<char *>(mem_alloc(length + 1));
    if (copy) {
        std::memcpy(copy, s, length);
        copy[length] = '\0';
    }
    return copy;
}

void mem_fail_after(long successes) {
    successes_left.store(successes, std::memory_order_relaxed);
}

unsigned long mem_allocations() {
    return attempts.load(std::memory_order_relaxed);
}

} // namespace kxacl
