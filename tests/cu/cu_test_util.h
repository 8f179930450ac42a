// Owning wrappers for what libkx_cu hands out, so that a failed assertion
// still releases it.
#ifndef KX_CU_TEST_UTIL_H
#define KX_CU_TEST_UTIL_H

#include <cstdlib>
#include <memory>
#include <string>

#include <kx_cu.h>

namespace cu_test {

struct ErrorRelease {
    void operator()(cu_error_t *err) const { cu_rel_error_1(err); }
};
struct MessageRelease {
    void operator()(char *msg) const { cu_rel_errmsg_1(msg); }
};
struct IconvClose {
    void operator()(cu_iconv_t h) const { cu_iconv_close_1(h); }
};
struct Free {
    void operator()(void *p) const { std::free(p); }
};
using ErrorPtr = std::unique_ptr<cu_error_t, ErrorRelease>;
using MessagePtr = std::unique_ptr<char, MessageRelease>;
using IconvPtr = std::unique_ptr<std::remove_pointer_t<cu_iconv_t>, IconvClose>;
using MallocText = std::unique_ptr<char, Free>;

// A copy of the calling thread's record.
inline ErrorPtr current_error() {
    cu_error_t *err = nullptr;
    cu_get_error_1(&err);
    return ErrorPtr(err);
}

inline std::string message_of(const cu_error_t *err) {
    char *msg = nullptr;
    cu_get_errmsg_1(err, &msg);
    const MessagePtr owned(msg);
    return msg != nullptr ? msg : "<NULL>";
}

// The formatted message of the calling thread's record.
inline std::string current_message() {
    return message_of(current_error().get());
}

} // namespace cu_test

#endif // KX_CU_TEST_UTIL_H
