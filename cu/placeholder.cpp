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
        return kFlagMinus;
    case '+':
        return kFlagPlus;
    case ' ':
        return kFlagSpace;
    case '#':
        return kFlagHash;
    case '0':
        return kFlagZero;
    default:
        return 0;
    }
}

Length read_length(const char *&p) noexcept {
    switch (*p) {
    case 'h':
        ++p;
        if (*p != 'h')
            return Length::h;
        ++p;
        return Length::hh;
    case 'l':
        ++p;
        if (*p != 'l')
            return Length::l;
        ++p;
        return Length::ll;
    case 'z':
        ++p;
        return Length::z;
    case 'j':
        ++p;
        return Length::j;
    case 't':
        ++p;
        return Length::t;
    case 'L':
        ++p;
        return Length::L;
    default:
        return Length::none;
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

constexpr kx_int32_t kNoKind = -1;

kx_int32_t integer_kind_of(Length length) noexcept {
    switch (length) {
    case Length::none:
    case Length::hh:
    case Length::h:
        return CU_ERROR_ARG_INT; // narrower values travel as int
    case Length::l:
        return CU_ERROR_ARG_LONG;
    case Length::ll:
        return CU_ERROR_ARG_LONG_LONG;
    case Length::z:
        return integer_kind<std::size_t>();
    case Length::j:
        return integer_kind<std::intmax_t>();
    case Length::t:
        return integer_kind<std::ptrdiff_t>();
    case Length::L:
        break;
    }
    return kNoKind;
}

// The argument kind a conversion formats, or kNoKind when the conversion (or
// its pairing with the length) is not one that messages may use.
kx_int32_t kind_of(char conversion, Length length) noexcept {
    switch (conversion) {
    case 'd':
    case 'i':
    case 'u':
    case 'x':
    case 'X':
    case 'o':
        return integer_kind_of(length);
    case 'c':
        return length == Length::none ? CU_ERROR_ARG_INT : kNoKind;
    case 'f':
    case 'e':
    case 'g':
        // A long double argument is stored as a double.
        return length == Length::none || length == Length::l || length == Length::L
                   ? CU_ERROR_ARG_DOUBLE
                   : kNoKind;
    case 's':
        return length == Length::none ? CU_ERROR_ARG_CHAR_STR : kNoKind;
    case 'p':
        return length == Length::none ? CU_ERROR_ARG_VOID_PTR : kNoKind;
    default:
        return kNoKind;
    }
}

// Parses the placeholder whose '%' is at start. Returns its size in bytes,
// or 0 when the text there is not a placeholder. Never reads past the NUL.
std::size_t parse_placeholder(const char *start, Placeholder &ph) noexcept {
    const char *p = start + 1;
    if (is_digit(*p)) {
        const char *digits = p;
        const int number = read_number(p, static_cast<int>(kMaxArgs));
        if (*p == '$') {
            if (number < 1 || number > static_cast<int>(kMaxArgs))
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
        ph.width = read_number(p, kMaxField);
        if (ph.width > kMaxField)
            return 0;
    }
    if (*p == '.') {
        ++p;
        ph.precision = read_number(p, kMaxField);
        if (ph.precision > kMaxField)
            return 0;
    }
    ph.length = read_length(p);
    const kx_int32_t kind = kind_of(*p, ph.length);
    if (kind == kNoKind)
        return 0;
    ph.conversion = *p;
    ph.kind = kind;
    return static_cast<std::size_t>(p + 1 - start);
}

} // namespace

bool PlaceholderScanner::next(Piece &piece) noexcept {
    const char *p = next_;
    if (*p == '\0')
        return false;
    piece = Piece{};
    piece.text = p;
    if (*p != '%') {
        piece.size = std::strcspn(p, "%");
    } else if (p[1] == '%') {
        piece.text = p + 1; // the second '%' is the literal one
        piece.size = 1;
        next_ = p + 2;
        return true;
    } else if (const std::size_t size = parse_placeholder(p, piece.ph); size == 0) {
        piece.ph = Placeholder{};
        piece.size = 1; // a lone '%' is text; scanning resumes after it
    } else {
        piece.size = size;
        if (piece.ph.number == 0 && unnumbered_ < kMaxArgs)
            piece.ph.number = ++unnumbered_;
        piece.is_placeholder = piece.ph.number != 0;
    }
    next_ = p + piece.size;
    return true;
}

} // namespace kx::cu
