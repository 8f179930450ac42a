// Every allocation of the library goes through these functions, so that
// tests can make the Nth one fail and check that each failure is reported
// and cleaned up. They never report: the caller knows the routine name that
// its 2650-102 message carries.
#ifndef KXACL_ALLOC_H
#define KXACL_ALLOC_H

#include <cstddef>

#include "unique_mem.h"

namespace kxacl {

void *mem_alloc(std::size_t size);
void *mem_zalloc(std::size_t size);
void *mem_realloc(void *p, std::size_t size);
// A copy of the length bytes at s followed by a NUL.
char *mem_strndup(const char *s, std::size_t length);

// Memory from the malloc family, freed on every path unless released.
using kx::unique_mem;

// Fault injection for tests: after `successes` more allocations succeed, every
// following one fails until the hook is reset with a negative value.
void mem_fail_after(long successes);
// Number of allocations attempted since the process started.
unsigned long mem_allocations();

} // namespace kxacl

#endif
