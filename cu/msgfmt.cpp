// Formatting an error record's message: catalogue lookup, then placeholder
// substitution in which every conversion is checked against the kind of the
// argument it would read.
#include "cu_internal.h"

#include <nl_types.h>

#include <cstdio>
#include <cstring>
#include <type_traits>

namespace kx::cu {
namespace {

char no_memory_message[] = "There is not enough memory to format the error message.\n";

// A growing malloc'd text; every failure is an allocation failure.
class text_buffer {
  public:
    bool append(const char *text, std::size_t size) noexcept {
        char *dst = reserve(size);
        if (dst == nullptr)
            return false;
        std::memcpy(dst, text, size);
        commit(size);
        return true;
    }

    // Room for size more bytes and a NUL at the end, or NULL.
    char *reserve(std::size_t size) noexcept {
        std::size_t need = 0;
        if (__builtin_add_overflow(size_, size, &need) ||
            __builtin_add_overflow(need, std::size_t{1}, &need))
            return nullptr;
        if (need > capacity_) {
            std::size_t capacity = capacity_ < 64 ? 64 : capacity_;
            while (capacity < need)
                if (__builtin_mul_overflow(capacity, std::size_t{2}, &capacity))
                    return nullptr;
            auto *grown = static_cast<char *>(std::realloc(text_.get(), capacity));
            if (grown == nullptr)
                return nullptr;
            (void)text_.release();
            text_.reset(grown);
            capacity_ = capacity;
        }
        return text_.get() + size_;
    }

    void commit(std::size_t size) noexcept { size_ += size; }

    // The NUL-terminated text, now owned by the caller; NULL on no memory.
    char *release() noexcept {
        char *end = reserve(0);
        if (end == nullptr)
            return nullptr;
        *end = '\0';
        return text_.release();
    }

  private:
    unique_mem<char> text_;
    std::size_t size_ = 0;
    std::size_t capacity_ = 0;
};

enum class append_outcome { done, unsuitable, no_memory };

bool is_unsigned_conversion(char c) noexcept {
    return c == 'u' || c == 'x' || c == 'X' || c == 'o';
}

bool is_integer_conversion(char c) noexcept {
    return c == 'd' || c == 'i' || is_unsigned_conversion(c);
}

bool is_double_conversion(char c) noexcept {
    return c == 'f' || c == 'e' || c == 'g';
}

// Flags the conversion gives a meaning to; C leaves the others undefined.
unsigned meaningful_flags(char c) noexcept {
    unsigned flags = flag_minus;
    if (c == 'd' || c == 'i' || is_double_conversion(c))
        flags |= flag_plus | flag_space;
    if (c == 'o' || c == 'x' || c == 'X' || is_double_conversion(c))
        flags |= flag_hash;
    if (is_integer_conversion(c) || is_double_conversion(c))
        flags |= flag_zero;
    return flags;
}

char *put_number(char *p, int value) noexcept {
    char digits[12];
    int n = 0;
    do {
        digits[n++] = static_cast<char>('0' + value % 10);
        value /= 10;
    } while (value != 0);
    while (n > 0)
        *p++ = digits[--n];
    return p;
}

// Size of a one-conversion format: '%', 5 flags, width, '.', precision,
// length, conversion, NUL.
constexpr std::size_t format_size = 1 + 5 + 5 + 1 + 5 + 2 + 1 + 1;

// Writes the snprintf format of ph for an argument of kind arg_kind. The
// length comes from the argument's kind, so the format always matches it.
void build_format(const placeholder &ph, kx_int32_t arg_kind,
                  char (&format)[format_size]) noexcept {
    char *p = format;
    *p++ = '%';
    const unsigned flags = ph.flags & meaningful_flags(ph.conversion);
    static constexpr struct {
        unsigned bit;
        char c;
    } flag_chars[] = {
        {flag_minus, '-'}, {flag_plus, '+'}, {flag_space, ' '}, {flag_hash, '#'}, {flag_zero, '0'}};
    for (const auto &flag : flag_chars)
        if (flags & flag.bit)
            *p++ = flag.c;
    if (ph.width >= 0)
        p = put_number(p, ph.width);
    if (ph.precision >= 0 && ph.conversion != 'c' && ph.conversion != 'p') {
        *p++ = '.';
        p = put_number(p, ph.precision);
    }
    if (ph.length == length_modifier::hh || ph.length == length_modifier::h) {
        *p++ = 'h';
        if (ph.length == length_modifier::hh)
            *p++ = 'h';
    } else if (arg_kind == CU_ERROR_ARG_LONG) {
        *p++ = 'l';
    } else if (arg_kind == CU_ERROR_ARG_LONG_LONG) {
        *p++ = 'l';
        *p++ = 'l';
    }
    *p++ = ph.conversion;
    *p = '\0';
}

template <typename T>
append_outcome append_printf(text_buffer &out, const char *format, T value) noexcept {
    const int size = std::snprintf(nullptr, 0, format, value);
    if (size < 0)
        return append_outcome::unsuitable;
    char *dst = out.reserve(static_cast<std::size_t>(size));
    if (dst == nullptr)
        return append_outcome::no_memory;
    std::snprintf(dst, static_cast<std::size_t>(size) + 1, format, value);
    out.commit(static_cast<std::size_t>(size));
    return append_outcome::done;
}

// Integers go to printf with the signedness the conversion reads.
template <typename Signed>
append_outcome append_integer(text_buffer &out, const char *format, char conversion,
                              Signed value) noexcept {
    if (is_unsigned_conversion(conversion))
        return append_printf(out, format, static_cast<std::make_unsigned_t<Signed>>(value));
    return append_printf(out, format, value);
}

append_outcome append_argument(text_buffer &out, const placeholder &ph,
                               const cu_error_arg_t &arg) noexcept {
    if (ph.kind != arg.cu_arg_type)
        return append_outcome::unsuitable;
    char format[format_size];
    build_format(ph, arg.cu_arg_type, format);
    const auto &value = arg.cu_arg_value;
    switch (arg.cu_arg_type) {
    case CU_ERROR_ARG_INT:
        return append_integer(out, format, ph.conversion, value.cu_arg_int);
    case CU_ERROR_ARG_LONG:
        return append_integer(out, format, ph.conversion, value.cu_arg_long);
    case CU_ERROR_ARG_LONG_LONG:
        return append_integer(out, format, ph.conversion, value.cu_arg_long_long);
    case CU_ERROR_ARG_DOUBLE:
        return append_printf(out, format, value.cu_arg_double);
    case CU_ERROR_ARG_CHAR_STR: {
        const char *text = value.cu_arg_char_str;
        return append_printf(out, format, text != nullptr ? text : "(null)");
    }
    case CU_ERROR_ARG_VOID_PTR:
        return append_printf(out, format, value.cu_arg_void_ptr);
    default:
        return append_outcome::unsuitable;
    }
}

const cu_error_arg_t *find_argument(const cu_error_t &err, unsigned number) noexcept {
    if (err.cu_args == nullptr || number == 0 || number > err.cu_arg_cnt)
        return nullptr;
    return &err.cu_args[number - 1];
}

// The message text with its placeholders replaced; NULL on no memory.
char *format_message(const char *text, const cu_error_t &err) noexcept {
    text_buffer out;
    placeholder_scanner scanner(text);
    for (text_piece piece; scanner.next(piece);) {
        append_outcome outcome = append_outcome::unsuitable;
        if (piece.is_placeholder) {
            if (const cu_error_arg_t *arg = find_argument(err, piece.ph.number))
                outcome = append_argument(out, piece.ph, *arg);
        }
        if (outcome == append_outcome::unsuitable && !out.append(piece.text, piece.size))
            outcome = append_outcome::no_memory;
        if (outcome == append_outcome::no_memory)
            return nullptr;
    }
    return out.release();
}

struct catalogue_closer {
    void operator()(nl_catd catd) const noexcept { catclose(catd); }
};
using unique_catalogue = std::unique_ptr<std::remove_pointer_t<nl_catd>, catalogue_closer>;

unique_catalogue open_catalogue(const char *name) noexcept {
    if (name == nullptr || *name == '\0')
        return nullptr;
    const nl_catd catd = catopen(name, NL_CAT_LOCALE);
    // catopen's failure value, which the interface defines as (nl_catd)-1.
    const nl_catd failed = reinterpret_cast<nl_catd>(-1); // NOLINT(performance-no-int-to-ptr)
    return unique_catalogue(catd == failed ? nullptr : catd);
}

char *format_record(const cu_error_t &err) noexcept {
    const char *fallback = err.cu_msg_default != nullptr ? err.cu_msg_default : "";
    const unique_catalogue catalogue = open_catalogue(err.cu_msg_cat);
    // The catalogue's text lives until catclose, so it is formatted first.
    const char *text =
        catalogue ? catgets(catalogue.get(), err.cu_msg_set, err.cu_msg_num, fallback) : fallback;
    return format_message(text != nullptr ? text : fallback, err);
}

char *empty_text() noexcept {
    return static_cast<char *>(std::calloc(1, 1));
}

} // namespace
} // namespace kx::cu

using namespace kx::cu;

extern "C" {

CU_EXTERN void cu_get_errmsg_1(const cu_error_t *err, char **msg) {
    if (msg == nullptr)
        return;
    char *text = err != nullptr ? format_record(*err) : empty_text();
    *msg = text != nullptr ? text : no_memory_message;
}

CU_EXTERN void cu_rel_errmsg_1(char *msg) {
    if (msg != no_memory_message)
        std::free(msg);
}

} // extern "C"
