// Codeset converters between a named codeset and UTF-8, on the system iconv.
//
// The UTF-8 side is checked by our own decoder: input before iconv sees it,
// output after iconv wrote it. So the UTF-8 rules of the converter's flags do
// not depend on what the system iconv happens to accept, and an EILSEQ on
// checked input can only mean "no form in the target codeset".
#include "cu_internal.h"

#include <iconv.h>
#include <pthread.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <iterator>
#include <new>

struct cu_iconv_s {
    iconv_t cd;
    pthread_mutex_t lock; // an iconv_t keeps shift state, so one user at a time
    kx_uint32_t flags;
};

namespace kx::cu {
namespace {

constexpr kx_uint32_t open_flags =
    CU_ICONV_FROM_UTF8 | CU_ICONV_UTF8_STANDARD | CU_ICONV_UTF8_BMP_ONLY;

// iconv_open's failure value, which the interface defines as (iconv_t)-1.
const iconv_t bad_iconv = reinterpret_cast<iconv_t>(-1); // NOLINT(performance-no-int-to-ptr)

bool from_utf8(const cu_iconv_s &h) noexcept {
    return (h.flags & CU_ICONV_FROM_UTF8) != 0;
}

// ---- UTF-8 checks ----------------------------------------------------------

struct utf8_check {
    int status = CU_ICONV_OK;
    bool has_encoded_nul = false; // holds C0 80, the modified form of NUL
};

bool is_continuation(unsigned char c) noexcept {
    return (c & 0xC0) == 0x80;
}

// Bounds of the second byte of a sequence led by lead, which exclude
// overlong forms, surrogates and values beyond U+10FFFF.
void second_byte_range(unsigned char lead, unsigned char &low, unsigned char &high) noexcept {
    low = 0x80;
    high = 0xBF;
    if (lead == 0xE0)
        low = 0xA0;
    else if (lead == 0xED)
        high = 0x9F;
    else if (lead == 0xF0)
        low = 0x90;
    else if (lead == 0xF4)
        high = 0x8F;
}

// Bytes of the sequence a lead byte starts; 0 when it cannot start one.
std::size_t sequence_length(unsigned char lead) noexcept {
    if (lead < 0x80)
        return 1;
    if (lead >= 0xC2 && lead <= 0xDF)
        return 2;
    if (lead >= 0xE0 && lead <= 0xEF)
        return 3;
    if (lead >= 0xF0 && lead <= 0xF4)
        return 4;
    return 0;
}

// Checks the sequence at s (avail bytes left): CU_ICONV_OK, or why not.
int check_sequence(const unsigned char *s, std::size_t avail, std::size_t length) noexcept {
    unsigned char low = 0;
    unsigned char high = 0;
    second_byte_range(s[0], low, high);
    for (std::size_t i = 1; i < length; ++i) {
        if (i == avail)
            return CU_ICONV_INCOMPLETE;
        const bool ok = i == 1 ? s[1] >= low && s[1] <= high : is_continuation(s[i]);
        if (!ok)
            return CU_ICONV_BAD_SEQUENCE;
    }
    return CU_ICONV_OK;
}

utf8_check check_utf8(const unsigned char *s, std::size_t size, kx_uint32_t flags) noexcept {
    utf8_check result;
    for (std::size_t i = 0; i < size;) {
        if (s[i] == 0xC0 && i + 1 < size && s[i + 1] == 0x80) {
            if (flags & CU_ICONV_UTF8_STANDARD) {
                result.status = CU_ICONV_BAD_SEQUENCE;
                return result;
            }
            result.has_encoded_nul = true;
            i += 2;
            continue;
        }
        const std::size_t length = sequence_length(s[i]);
        result.status =
            length == 0 ? CU_ICONV_BAD_SEQUENCE : check_sequence(s + i, size - i, length);
        if (result.status == CU_ICONV_OK && length == 4 && (flags & CU_ICONV_UTF8_BMP_ONLY))
            result.status = CU_ICONV_UNMAPPABLE;
        if (result.status != CU_ICONV_OK)
            return result;
        i += length;
    }
    return result;
}

// A copy of s with each C0 80 turned into the NUL it stands for.
unique_mem<char> decode_encoded_nuls(const char *s, std::size_t &size) noexcept {
    unique_mem<char> copy(static_cast<char *>(std::malloc(size != 0 ? size : 1)));
    if (!copy)
        return copy;
    std::size_t n = 0;
    for (std::size_t i = 0; i < size; ++i) {
        const bool encoded_nul = s[i] == '\xC0' && i + 1 < size && s[i + 1] == '\x80';
        copy.get()[n++] = encoded_nul ? '\0' : s[i];
        i += encoded_nul ? 1 : 0;
    }
    size = n;
    return copy;
}

// Checks what the system iconv wrote as UTF-8: it passes some invalid
// input through, such as UTF-8 beyond U+10FFFF when both sides are UTF-8.
int check_utf8_output(const char *s, std::size_t size, kx_uint32_t flags) noexcept {
    const utf8_check check = check_utf8(reinterpret_cast<const unsigned char *>(s), size,
                                        (flags & CU_ICONV_UTF8_BMP_ONLY) | CU_ICONV_UTF8_STANDARD);
    return check.status == CU_ICONV_INCOMPLETE ? CU_ICONV_BAD_SEQUENCE : check.status;
}

// ---- conversion ------------------------------------------------------------

class mutex_lock {
  public:
    explicit mutex_lock(pthread_mutex_t &m) noexcept
        : m_(m), locked_(pthread_mutex_lock(&m) == 0) {}
    ~mutex_lock() {
        if (locked_)
            pthread_mutex_unlock(&m_);
    }
    mutex_lock(const mutex_lock &) = delete;
    mutex_lock &operator=(const mutex_lock &) = delete;
    bool locked() const noexcept { return locked_; }

  private:
    pthread_mutex_t &m_;
    bool locked_;
};

// The output of a conversion, grown as iconv asks for room.
class conversion_output {
  public:
    bool init(std::size_t input_size) noexcept {
        std::size_t capacity = 0;
        if (__builtin_mul_overflow(input_size, std::size_t{2}, &capacity) ||
            __builtin_add_overflow(capacity, std::size_t{16}, &capacity))
            return false;
        return resize(capacity);
    }

    bool grow() noexcept {
        std::size_t capacity = 0;
        return !__builtin_mul_overflow(capacity_, std::size_t{2}, &capacity) && resize(capacity);
    }

    char *next() noexcept { return buf_.get() + used_; }
    std::size_t room() const noexcept { return capacity_ - used_; }
    void advance_to(const char *end) noexcept {
        used_ = static_cast<std::size_t>(end - buf_.get());
    }
    std::size_t size() const noexcept { return used_; }
    const char *data() const noexcept { return buf_.get(); }
    char *release() noexcept { return buf_.release(); }

  private:
    bool resize(std::size_t capacity) noexcept {
        auto *grown = static_cast<char *>(std::realloc(buf_.get(), capacity));
        if (grown == nullptr)
            return false;
        (void)buf_.release();
        buf_.reset(grown);
        capacity_ = capacity;
        return true;
    }

    unique_mem<char> buf_;
    std::size_t capacity_ = 0;
    std::size_t used_ = 0;
};

int status_of_errno(int err, const cu_iconv_s &h) noexcept {
    switch (err) {
    case EILSEQ:
        // UTF-8 input was checked already: what iconv refuses has no form
        // in the target.
        return from_utf8(h) ? CU_ICONV_UNMAPPABLE : CU_ICONV_BAD_SEQUENCE;
    case EINVAL:
        return CU_ICONV_INCOMPLETE;
    case ENOMEM:
        return CU_ICONV_NO_MEMORY;
    default:
        return CU_ICONV_INTERNAL;
    }
}

// Runs one iconv step (in NULL flushes the shift state), growing the output
// while iconv runs out of room.
int run_iconv(cu_iconv_s &h, char **in, std::size_t *in_left, conversion_output &out) noexcept {
    for (;;) {
        char *next = out.next();
        std::size_t room = out.room();
        const std::size_t rc = iconv(h.cd, in, in_left, &next, &room);
        out.advance_to(next);
        if (rc != static_cast<std::size_t>(-1))
            return CU_ICONV_OK;
        const int err = errno;
        if (err != E2BIG)
            return status_of_errno(err, h);
        if (!out.grow())
            return CU_ICONV_NO_MEMORY;
    }
}

int convert_locked(cu_iconv_s &h, const char *in, std::size_t size,
                   conversion_output &out) noexcept {
    const mutex_lock guard(h.lock);
    if (!guard.locked())
        return CU_ICONV_INTERNAL;
    iconv(h.cd, nullptr, nullptr, nullptr, nullptr); // a fresh shift state per text
    char *next = const_cast<char *>(in);             // iconv never writes the input
    std::size_t left = size;
    const int status = run_iconv(h, &next, &left, out);
    return status != CU_ICONV_OK ? status : run_iconv(h, nullptr, nullptr, out);
}

int convert(cu_iconv_s &h, const char *in, std::size_t size, char **out,
            std::size_t *out_size) noexcept {
    unique_mem<char> decoded;
    if (from_utf8(h)) {
        const utf8_check check =
            check_utf8(reinterpret_cast<const unsigned char *>(in), size, h.flags);
        if (check.status != CU_ICONV_OK)
            return check.status;
        if (check.has_encoded_nul) {
            decoded = decode_encoded_nuls(in, size);
            if (!decoded)
                return CU_ICONV_NO_MEMORY;
            in = decoded.get();
        }
    }
    conversion_output output;
    if (!output.init(size))
        return CU_ICONV_NO_MEMORY;
    const int status = convert_locked(h, in, size, output);
    if (status != CU_ICONV_OK)
        return status;
    if (!from_utf8(h)) {
        if (const int verdict = check_utf8_output(output.data(), output.size(), h.flags);
            verdict != CU_ICONV_OK)
            return verdict;
    }
    *out_size = output.size();
    *out = output.release();
    return CU_ICONV_OK;
}

// ---- process settings ------------------------------------------------------

bool env_is_true(const char *name) noexcept {
    const char *value = std::getenv(name);
    if (value == nullptr)
        return false;
    static constexpr const char *yes[] = {"1", "yes", "true"};
    return std::any_of(std::begin(yes), std::end(yes),
                       [value](const char *y) { return cu_strcasecmp_posix_1(value, y) == 0; });
}

struct utf8_env_settings {
    bool assumed;
    bool standard;
    bool bmp_only;
};

const utf8_env_settings &utf8_settings() noexcept {
    // Read once: the environment may change later, the answers must not.
    static const utf8_env_settings settings = {
        env_is_true("KX_CU_UTF8_ASSUMED"),
        env_is_true("KX_CU_UTF8_STANDARD"),
        env_is_true("KX_CU_UTF8_BMP_ONLY"),
    };
    return settings;
}

} // namespace
} // namespace kx::cu

using namespace kx::cu;

extern "C" {

CU_EXTERN int cu_iconv_open_1(const char *codeset, kx_uint32_t flags, cu_iconv_t *handle) {
    if (handle == nullptr)
        return CU_ICONV_BAD_ARGUMENT;
    *handle = nullptr;
    // Suffixes such as "//IGNORE" would change what counts as an error.
    if (codeset == nullptr || *codeset == '\0' || std::strchr(codeset, '/') != nullptr ||
        (flags & ~open_flags) != 0)
        return CU_ICONV_BAD_ARGUMENT;

    kx::unique_mem<void> memory(std::malloc(sizeof(cu_iconv_s)));
    if (!memory)
        return CU_ICONV_NO_MEMORY;
    const bool to_codeset = (flags & CU_ICONV_FROM_UTF8) != 0;
    const iconv_t cd = to_codeset ? iconv_open(codeset, "UTF-8") : iconv_open("UTF-8", codeset);
    if (cd == bad_iconv)
        return errno == ENOMEM ? CU_ICONV_NO_MEMORY : CU_ICONV_NOT_SUPPORTED;
    *handle = new (memory.release()) cu_iconv_s{cd, PTHREAD_MUTEX_INITIALIZER, flags};
    return CU_ICONV_OK;
}

CU_EXTERN void cu_iconv_close_1(cu_iconv_t handle) {
    if (handle == nullptr)
        return;
    iconv_close(handle->cd);
    pthread_mutex_destroy(&handle->lock);
    handle->~cu_iconv_s();
    std::free(handle);
}

CU_EXTERN int cu_iconv_str_1(cu_iconv_t handle, kx_uint32_t flags, const char *in,
                             size_t *in_length, char **out, size_t *out_length) {
    if (handle == nullptr || flags != 0 || in == nullptr || in_length == nullptr ||
        out == nullptr || out_length == nullptr)
        return CU_ICONV_BAD_ARGUMENT;
    return convert(*handle, in, *in_length, out, out_length);
}

CU_EXTERN int cu_utf8_is_assumed_1(void) {
    return utf8_settings().assumed;
}

CU_EXTERN int cu_utf8_is_not_modified_1(void) {
    return utf8_settings().standard;
}

CU_EXTERN int cu_utf8_is_limited_to_bmp_1(void) {
    return utf8_settings().bmp_only;
}

} // extern "C"
