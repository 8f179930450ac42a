// What the fuzz targets share: stopping loudly when the library breaks a
// promise, the outcome rules every call must keep, silencing the dump, and
// trace levels that vary with the input so that the trace points run too.
#ifndef KXACL_FUZZ_SUPPORT_H
#define KXACL_FUZZ_SUPPORT_H

#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

#include <kx_acl.h>
#include <kx_cu.h>
#include <kx_tr.h>

namespace kxfuzz {

// A broken promise: print what and abort, so that libFuzzer saves the input.
[[noreturn]] inline void broken(const char *what, long long detail = 0) {
    std::fprintf(stderr, "\nbroken promise: %s (%lld)\n", what, detail);
    std::abort();
}

inline void expect(bool holds, const char *what, long long detail = 0) {
    if (!holds)
        broken(what, detail);
}

// The thread's error record: its status and message number.
struct record {
    kx_int32_t id;
    kx_int32_t msg;
};
inline record current_record() {
    cu_error_t *err = nullptr;
    cu_get_error_1(&err);
    record r{err ? err->cu_error_id : -1, err ? err->cu_msg_num : -1};
    cu_rel_error_1(err);
    return r;
}

inline bool known_status(kx_int32_t rc) {
    switch (rc) {
    case SEC_S_OK:
    case SEC_S_BAD_PARAM:
    case SEC_S_NO_MEMORY:
    case SEC_S_USER_NOT_FOUND:
    case SEC_S_ACLE_NOT_FOUND:
    case SEC_S_INTERNAL_ERROR:
    case SEC_S_CODESET_ERROR:
    case SEC_S_BAD_PERMISSION:
    case SEC_S_FILE_ERROR:
    case SEC_S_BAD_ACL:
    case SEC_S_BAD_ACLE:
    case SEC_S_NO_ACL_FILE:
        return true;
    default:
        return false;
    }
}

// The outcome of a function that clears the error record on entry: a known
// status; after a failure one record of that status, after a success none.
inline kx_int32_t checked(kx_int32_t rc, const char *call) {
    if (!known_status(rc))
        broken(call, rc);
    record r = current_record();
    if (r.id != rc)
        broken(call, r.id);
    return rc;
}

// An exactly sized heap copy of some bytes, so that AddressSanitizer sees
// any access past its length; the empty ACL when there are none.
struct owned_acl {
    sec_buffer_s d{0, nullptr};
    owned_acl() = default;
    owned_acl(const void *bytes, std::size_t size) {
        if (size == 0)
            return;
        d.value = std::malloc(size);
        std::memcpy(d.value, bytes, size);
        d.length = static_cast<kx_int32_t>(size);
    }
    owned_acl(const owned_acl &) = delete;
    owned_acl &operator=(const owned_acl &) = delete;
    ~owned_acl() { std::free(d.value); }
    std::vector<unsigned char> contents() const {
        auto *p = static_cast<const unsigned char *>(d.value);
        return p && d.length > 0 ? std::vector<unsigned char>(p, p + d.length)
                                 : std::vector<unsigned char>{};
    }
};

struct owned_list {
    sec_acle_list_s l{0, nullptr};
    owned_list() = default;
    owned_list(const owned_list &) = delete;
    owned_list &operator=(const owned_list &) = delete;
    ~owned_list() { sec_release_aclelist(&l); }
};

// Standard output and error go to /dev/null while it lives. The stdio
// streams are swapped rather than the descriptors, so that a sanitizer's
// report, which is written to descriptor 2 directly, still shows.
class silenced {
  public:
    silenced() : out_(stdout), err_(stderr) {
        static std::FILE *null_stream = std::fopen("/dev/null", "w");
        if (null_stream) {
            stdout = null_stream;
            stderr = null_stream;
        }
    }
    silenced(const silenced &) = delete;
    silenced &operator=(const silenced &) = delete;
    ~silenced() {
        stdout = out_;
        stderr = err_;
    }

  private:
    std::FILE *out_;
    std::FILE *err_;
};

// Records go to /dev/null unless the caller named a trace file; call from
// LLVMFuzzerInitialize, before the first library call.
inline void trace_to_null() {
    setenv("KX_TRACE_FILE", "/dev/null", 0);
}

// Three trace settings picked by the input's size, so that one run covers
// no tracing, the bare ids and the points with their data; the same input
// always runs with the same setting.
inline void trace_levels_for(std::size_t size) {
    static const tr_detail_level_t settings[3][5] = {
        {0, 0, 0, 0, 0}, {1, 1, 1, 1, 1}, {9, 8, 8, 9, 2}};
    static const char *const categories[5] = {"Errors", "Info", "API", "Buffer", "Perf"};
    // The component registers on the first call of the library.
    kx_uint32_t ignored = 0;
    sec_translate_perms(nullptr, nullptr, &ignored);
    for (int c = 0; c < 5; ++c)
        tr_set_detail_level_1("_SEL", categories[c], settings[size % 3][c]);
}

} // namespace kxfuzz

#endif
