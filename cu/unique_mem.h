// The one owner of memory from the malloc family, shared by the libraries,
// the tool and the tests: what the C API hands out is released with free,
// so a std::unique_ptr with this deleter frees it on every path unless
// released.
#ifndef KX_CU_UNIQUE_MEM_H
#define KX_CU_UNIQUE_MEM_H

#include <cstdlib>
#include <memory>

namespace kx {

struct free_deleter {
    void operator()(void *p) const noexcept { std::free(p); }
};

template <typename T> using unique_mem = std::unique_ptr<T, free_deleter>;

} // namespace kx

#endif // KX_CU_UNIQUE_MEM_H
