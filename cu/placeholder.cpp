// The placeholder grammar of message texts: %[N$][flags][width][.prec][len]conv
#include "cu_internal.h"

#include <cstring>

namespace kx::cu {
namespace {

constexpr bool is_digit(char c) noexcept {
    return c >= '0' && c <= '9';
}

// Reads decimal digits. The value stops growing once it passes limit, so a
// long run of digits cannot overflow; the caller rejects values above limit.
int read_number(const char *&p, int limit) noexcept {
    int value = 0;
    for (; is_digit(*p); ++p) {
        if (value <= limit)
            value = value * 10 + (*p - '0');
    }
    return value;
}

unsigned flag_bit(char c) noexcept {
    switch (c) {
    case '-':
        return flag_minus;
    case '+':
        return flag_plus;
    case ' ':
        return flag_space;
    case '#':
        return flag_hash;
    case '0':
        return flag_zero;
    default:
        return 0;
    }
}

length_modifier read_length(const char *&p) noexcept {
    switch (*p) {
    case 'h':
        ++p;
        if (*p != 'h')
            return length_modifier::h;
        ++p;
        return length_modifier::hh;
    case 'l':
        ++p;
        if (*p != 'l')
            return length_modifier::l;
        ++p;
        return length_modifier::ll;
    case 'z':
        ++p;
        return length_modifier::z;
    case 'j':
        ++p;
        return length_modifier::j;
    case 't':
        ++p;
        return length_modifier::t;
    case 'L':
        ++p;
        return length_modifier::L;
    default:
        return length_modifier::none;
    }
}

// The record kind that holds a value of integer type T.
template <typename T> constexpr kx_int32_t integer_kind() noexcept {
    if constexpr (sizeof(T) <= sizeof(int))
        return CU_ERROR_ARG_INT;
    else if constexpr (sizeof(T) <= sizeof(long))
        return CU_ERROR_ARG_LONG;
    else
        return CU_ERROR_ARG_LONG_LONG;
}

constexpr kx_int32_t no_kind = -1;

kx_int32_t integer_kind_of(length_modifier length) noexcept {
    switch (length) {
    case length_modifier::none:
    case length_modifier::hh:
    case length_modifier::h:
        return CU_ERROR_ARG_INT; // narrower values travel as int
    case length_modifier::l:
        return CU_ERROR_ARG_LONG;
    case length_modifier::ll:
        return CU_ERROR_ARG_LONG_LONG;
    case length_modifier::z:
        return integer_kind<std::size_t>();
    case length_modifier::j:
        return integer_kind<std::intmax_t>();
    case length_modifier::t:
        return integer_kind<std::ptrdiff_t>();
    case length_modifier::L:
        break;
    }
    return no_kind;
}

// The argument kind a conversion formats, or no_kind when the conversion (or
// its pairing with the length) is not one that messages may use.
kx_int32_t kind_of(char conversion, length_modifier length) noexcept {
    switch (conversion) {
    case 'd':
    case 'i':
    case 'u':
    case 'x':
    case 'X':
    case 'o':
        return integer_kind_of(length);
    case 'c':
        return length == length_modifier::none ? CU_ERROR_ARG_INT : no_kind;
    case 'f':
    case 'e':
    case 'g':
        // A long double argument is stored as a double.
        return length == length_modifier::none || length == length_modifier::l ||
                       length == length_modifier::L
                   ? CU_ERROR_ARG_DOUBLE
                   : no_kind;
    case 's':
        return length == length_modifier::none ? CU_ERROR_ARG_CHAR_STR : no_kind;
    case 'p':
        return length == length_modifier::none ? CU_ERROR_ARG_VOID_PTR : no_kind;
    default:
        return no_kind;
    }
}

// Parses the placeholder whose '%' is at start. Returns its size in bytes,
// or 0 when the text there is not a placeholder. Never reads past the NUL.
std::size_t parse_placeholder(const char *start, placeholder &ph) noexcept {
    const char *p = start + 1;
    if (is_digit(*p)) {
        const char *digits = p;
        const int number = read_number(p, static_cast<int>(max_args));
        if (*p == '$') {
            if (number < 1 || number > static_cast<int>(max_args))
                return 0;
            ph.number = static_cast<unsigned>(number);
            ++p;
        } else {
            p = digits; // they were flags and width
        }
    }
    for (unsigned bit; (bit = flag_bit(*p)) != 0; ++p)
        ph.flags |= bit;
    if (is_digit(*p)) {
        ph.width = read_number(p, max_field);
        if (ph.width > max_field)
            return 0;
    }
    if (*p == '.') {
        ++p;
        ph.precision = read_number(p, max_field);
        if (ph.precision > max_field)
            return 0;
    }
    ph.length = read_length(p);
    const kx_int32_t kind = kind_of(*p, ph.length);
    if (kind == no_kind)
        return 0;
    ph.conversion = *p;
    ph.kind = kind;
    return static_cast<std::size_t>(p + 1 - start);
}

} // namespace

bool placeholder_scanner::next(text_piece &piece) noexcept {
    const char *p = next_;
    if (*p == '\0')
        return false;
    piece = text_piece{};
    piece.text = p;
    if (*p != '%') {
        piece.size = std::strcspn(p, "%");
    } else if (p[1] == '%') {
        piece.text = p + 1; // the second '%' is the literal one
        piece.size = 1;
        next_ = p + 2;
        return true;
    } else if (const std::size_t size = parse_placeholder(p, piece.ph); size == 0) {
        piece.ph = placeholder{};
        piece.size = 1; // a lone '%' is text; scanning resumes after it
    } else {
        piece.size = size;
        if (piece.ph.number == 0 && unnumbered_ < max_args)
            piece.ph.number = ++unnumbered_;
        piece.is_placeholder = piece.ph.number != 0;
    }
    next_ = p + piece.size;
    return true;
}

} // namespace kx::cu
