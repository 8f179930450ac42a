// The per-thread error record.
//
// A thread's record, and every copy handed out, is one malloc'd block: the
// cu_error_t, its argument array, then all of its texts. One free releases
// it, and a failed allocation can never leave a half-built record behind.
//
// A cleared record's block is kept as the thread's spare and holds the next
// record that fits: callers refuse requests by the thousand (a requester
// without an ACL entry), and each refusal sets a record that the next call
// clears, which must not cost an allocation every time.
#include "cu_internal.h"

#include <cfloat>
#include <cmath>
#include <cstdarg>
#include <cstring>
#include <new>
#include <utility>

#include <pthread.h>

namespace kx::cu {
namespace {

char no_memory_text[] = "There is not enough memory to record the error.\n";

// Stands in for a record that could not be allocated; never freed.
cu_error_t no_memory_record = {
    CU_ERROR_ID_NO_MEMORY, nullptr, nullptr, 0, 0, no_memory_text, 0, nullptr,
};

char null_text[] = "(null)";

// The calling thread's record; NULL when no error is set. initial-exec keeps
// the check on the request path to a single load from the thread pointer.
[[gnu::tls_model("initial-exec")]] thread_local cu_error_t *thread_record = nullptr;
[[gnu::tls_model("initial-exec")]] thread_local std::size_t thread_record_size = 0;
[[gnu::tls_model("initial-exec")]] thread_local cu_error_t *thread_spare = nullptr;
[[gnu::tls_model("initial-exec")]] thread_local std::size_t thread_spare_size = 0;
[[gnu::tls_model("initial-exec")]] thread_local bool reaper_armed = false;

void release_record(cu_error_t *rec) noexcept {
    if (rec != &no_memory_record)
        std::free(rec);
}

// Keeps the block of a record that the thread no longer holds as its spare,
// the larger of it and the current spare; frees the other.
void retire_record(cu_error_t *rec, std::size_t size) noexcept {
    if (rec == nullptr || rec == &no_memory_record)
        return;
    if (size <= thread_spare_size) {
        std::free(rec);
        return;
    }
    std::free(std::exchange(thread_spare, rec));
    thread_spare_size = size;
}

// Frees the records of an ending thread. A pthread key does this rather than
// a thread_local destructor: registering one of those allocates, and glibc
// aborts the process when that allocation fails.
void reap_thread_record(void *) noexcept {
    reaper_armed = false;
    release_record(std::exchange(thread_record, nullptr));
    std::free(std::exchange(thread_spare, nullptr));
    thread_spare_size = 0;
}

bool arm_reaper() noexcept {
    if (reaper_armed)
        return true;
    static pthread_key_t key;
    static const bool have_key = pthread_key_create(&key, reap_thread_record) == 0;
    // Any non-NULL value makes the key's destructor run at thread exit.
    if (!have_key || pthread_setspecific(key, &reaper_armed) != 0)
        return false;
    reaper_armed = true;
    return true;
}

// Makes rec (a block of size bytes) the thread's record, or the no-memory
// record when rec could not be built or could not be made to go away with
// the thread.
int store_thread_record(cu_error_t *rec, std::size_t size) noexcept {
    int status = 0;
    if (rec == nullptr || !arm_reaper()) {
        release_record(rec);
        rec = &no_memory_record; // static: needs no reaping
        size = 0;
        status = CU_ERROR_ID_NO_MEMORY;
    }
    cu_error_t *old = std::exchange(thread_record, rec);
    retire_record(old, std::exchange(thread_record_size, size));
    return status;
}

bool add_size(std::size_t &total, std::size_t more) noexcept {
    return !__builtin_add_overflow(total, more, &total);
}

bool add_text_size(std::size_t &total, const char *text) noexcept {
    return text == nullptr || add_size(total, std::strlen(text) + 1);
}

const char *arg_text(const cu_error_arg_t &arg) noexcept {
    const char *text = arg.cu_arg_value.cu_arg_char_str;
    return text != nullptr ? text : null_text;
}

constexpr std::size_t args_offset = (sizeof(cu_error_t) + alignof(cu_error_arg_t) - 1) /
                                    alignof(cu_error_arg_t) * alignof(cu_error_arg_t);

// Bytes a one-block copy of src needs; 0 when that overflows.
std::size_t record_size(const cu_error_t &src, std::uint32_t arg_cnt) noexcept {
    std::size_t total = args_offset;
    std::size_t args_size = 0;
    if (__builtin_mul_overflow(std::size_t{arg_cnt}, sizeof(cu_error_arg_t), &args_size) ||
        !add_size(total, args_size) || !add_text_size(total, src.cu_ffdc_id) ||
        !add_text_size(total, src.cu_msg_cat) || !add_text_size(total, src.cu_msg_default))
        return 0;
    for (std::uint32_t i = 0; i < arg_cnt; ++i) {
        const cu_error_arg_t &arg = src.cu_args[i];
        if (arg.cu_arg_type == CU_ERROR_ARG_CHAR_STR && !add_text_size(total, arg_text(arg)))
            return 0;
    }
    return total;
}

// Hands out consecutive text slots of a block sized by record_size.
class text_area {
  public:
    explicit text_area(char *start) noexcept : next_(start) {}

    char *copy(const char *text) noexcept {
        if (text == nullptr)
            return nullptr;
        const std::size_t size = std::strlen(text) + 1;
        char *slot = static_cast<char *>(std::memcpy(next_, text, size));
        next_ += size;
        return slot;
    }

  private:
    char *next_;
};

std::uint32_t arg_count(const cu_error_t &src) noexcept {
    return src.cu_args != nullptr ? src.cu_arg_cnt : 0;
}

// Builds a deep copy of src in block, which has record_size() bytes.
cu_error_t *fill_record(const cu_error_t &src, std::uint32_t arg_cnt, char *block) noexcept {
    auto *rec = new (block) cu_error_t(src);
    auto *args = reinterpret_cast<cu_error_arg_t *>(block + args_offset);
    text_area texts(block + args_offset + arg_cnt * sizeof(cu_error_arg_t));
    rec->cu_ffdc_id = texts.copy(src.cu_ffdc_id);
    rec->cu_msg_cat = texts.copy(src.cu_msg_cat);
    rec->cu_msg_default = texts.copy(src.cu_msg_default);
    rec->cu_arg_cnt = arg_cnt;
    rec->cu_args = arg_cnt != 0 ? args : nullptr;
    for (std::uint32_t i = 0; i < arg_cnt; ++i) {
        new (&args[i]) cu_error_arg_t(src.cu_args[i]);
        if (args[i].cu_arg_type == CU_ERROR_ARG_CHAR_STR)
            args[i].cu_arg_value.cu_arg_char_str = texts.copy(arg_text(src.cu_args[i]));
    }
    return rec;
}

// A deep copy of src in one new block, or NULL when memory runs out.
cu_error_t *clone_record(const cu_error_t &src) noexcept {
    const std::uint32_t arg_cnt = arg_count(src);
    const std::size_t size = record_size(src, arg_cnt);
    auto *block = size != 0 ? static_cast<char *>(std::malloc(size)) : nullptr;
    return block != nullptr ? fill_record(src, arg_cnt, block) : nullptr;
}

// Makes a deep copy of src the thread's record, in the spare block when it
// is large enough.
int set_thread_record(const cu_error_t &src) noexcept {
    const std::uint32_t arg_cnt = arg_count(src);
    const std::size_t needed = record_size(src, arg_cnt);
    if (needed == 0)
        return store_thread_record(nullptr, 0);
    char *block = nullptr;
    std::size_t size = needed;
    if (thread_spare != nullptr && thread_spare_size >= needed) {
        block = reinterpret_cast<char *>(std::exchange(thread_spare, nullptr));
        size = std::exchange(thread_spare_size, 0);
    } else {
        block = static_cast<char *>(std::malloc(needed));
    }
    return store_thread_record(block != nullptr ? fill_record(src, arg_cnt, block) : nullptr, size);
}

// The kinds of the arguments a message text takes, numbered 1..count.
struct arg_kinds {
    unsigned count = 0;
    kx_int32_t kind[max_args] = {};  // CU_ERROR_ARG_INT (0) for skipped numbers
    bool long_double[max_args] = {}; // a %Lf-style double, passed as long double
    bool seen[max_args] = {};
};

// A number used with two kinds is read as the first; formatting later copies
// the mismatched placeholder as it stands.
arg_kinds collect_arg_kinds(const char *text) noexcept {
    arg_kinds kinds;
    if (text == nullptr)
        return kinds;
    placeholder_scanner scanner(text);
    for (text_piece piece; scanner.next(piece);) {
        if (!piece.is_placeholder)
            continue;
        const unsigned index = piece.ph.number - 1;
        if (!kinds.seen[index]) {
            kinds.seen[index] = true;
            kinds.kind[index] = piece.ph.kind;
            kinds.long_double[index] = piece.ph.length == length_modifier::L;
        }
        if (piece.ph.number > kinds.count)
            kinds.count = piece.ph.number;
    }
    return kinds;
}

// A long double outside the range of double becomes an infinity.
double to_double(long double value) noexcept {
    if (value > static_cast<long double>(DBL_MAX))
        return HUGE_VAL;
    if (value < -static_cast<long double>(DBL_MAX))
        return -HUGE_VAL;
    return static_cast<double>(value);
}

// Reads one variadic argument of the given kind. Texts are not copied here.
cu_error_arg_t read_arg(kx_int32_t kind, bool long_double, va_list *ap) noexcept {
    cu_error_arg_t arg{};
    arg.cu_arg_type = kind;
    switch (kind) {
    case CU_ERROR_ARG_LONG:
        arg.cu_arg_value.cu_arg_long = va_arg(*ap, long);
        break;
    case CU_ERROR_ARG_LONG_LONG:
        arg.cu_arg_value.cu_arg_long_long = va_arg(*ap, long long);
        break;
    case CU_ERROR_ARG_DOUBLE:
        arg.cu_arg_value.cu_arg_double =
            long_double ? to_double(va_arg(*ap, long double)) : va_arg(*ap, double);
        break;
    case CU_ERROR_ARG_CHAR_STR:
        arg.cu_arg_value.cu_arg_char_str = va_arg(*ap, char *);
        break;
    case CU_ERROR_ARG_VOID_PTR:
        arg.cu_arg_value.cu_arg_void_ptr = va_arg(*ap, void *);
        break;
    default:
        arg.cu_arg_type = CU_ERROR_ARG_INT;
        arg.cu_arg_value.cu_arg_int = va_arg(*ap, int);
        break;
    }
    return arg;
}

} // namespace
} // namespace kx::cu

using namespace kx::cu;

extern "C" {

CU_EXTERN int cu_set_error_1(kx_int32_t error_id, const char *ffdc_id, const char *msg_cat,
                             kx_int32_t msg_set, kx_int32_t msg_num, const char *msg_default, ...) {
    if (error_id == 0) { // id 0 means "no error": nothing to keep
        cu_set_no_error_1();
        return 0;
    }
    const arg_kinds kinds = collect_arg_kinds(msg_default);

    cu_error_arg_t args[max_args];
    va_list ap;
    va_start(ap, msg_default);
    for (unsigned i = 0; i < kinds.count; ++i)
        args[i] = read_arg(kinds.kind[i], kinds.long_double[i], &ap);
    va_end(ap);

    // A view of the caller's data; set_thread_record copies everything it names.
    const cu_error_t view = {
        error_id,
        const_cast<char *>(ffdc_id),
        const_cast<char *>(msg_cat),
        msg_set,
        msg_num,
        const_cast<char *>(msg_default),
        kinds.count,
        kinds.count != 0 ? args : nullptr,
    };
    return set_thread_record(view);
}

CU_EXTERN int cu_pset_error_1(const cu_error_t *err) {
    if (err == nullptr || err->cu_error_id == 0) {
        cu_set_no_error_1();
        return 0;
    }
    return set_thread_record(*err);
}

CU_EXTERN void cu_set_no_error_1(void) {
    cu_error_t *rec = thread_record;
    if (rec == nullptr) [[likely]]
        return;
    thread_record = nullptr;
    retire_record(rec, std::exchange(thread_record_size, 0));
}

CU_EXTERN void cu_get_error_1(cu_error_t **err) {
    if (err == nullptr)
        return;
    const cu_error_t *rec = thread_record;
    cu_error_t *copy = rec != nullptr ? clone_record(*rec)
                                      : static_cast<cu_error_t *>(std::calloc(1, sizeof *copy));
    *err = copy != nullptr ? copy : &no_memory_record;
}

CU_EXTERN void cu_rel_error_1(cu_error_t *err) {
    release_record(err);
}

} // extern "C"
