// Reporting a failure: one helper fills the thread's error record with a
// catalogue message and its arguments and gives back the status, so that a
// failure is reported once, where it is detected. The number and kinds of the
// arguments are checked against the message's placeholders at compile time.
#ifndef KXACL_REPORT_H
#define KXACL_REPORT_H

#include <climits>
#include <cstddef>
#include <cstdint>
#include <type_traits>
#include <utility>

#include <kx_cu.h>
#include <kx_sec.h>

#include "messages.h"

namespace kxacl {

// Source file names that messages carrying a source position show.
inline constexpr const char src_acl[] = "kxacl_acl";
inline constexpr const char src_utils[] = "kxacl_utils";

// A source position for the messages that end in one: the area's file name
// and the line of the call that made it. __builtin_LINE as a default
// argument is the caller's line with GCC and Clang alike; clang 14 cannot
// compile libstdc++'s std::source_location.
struct source_pos {
    const char *file;
    int line;
};
inline source_pos here(const char *file, int line = __builtin_LINE()) {
    return {file, line};
}

// A pointer shown by a %x placeholder: its low 32 bits.
inline unsigned pointer_value(const volatile void *p) {
    return static_cast<unsigned>(reinterpret_cast<std::uintptr_t>(p));
}

// A byte count shown by a %d placeholder, clamped so that it never wraps.
inline int byte_count(std::size_t n) {
    return n > INT_MAX ? INT_MAX : static_cast<int>(n);
}

namespace detail {

template <typename T> constexpr arg_kind kind_of() {
    using U = std::decay_t<T>;
    if constexpr (std::is_integral_v<U> || std::is_enum_v<U>)
        return arg_kind::integer;
    else if constexpr (std::is_convertible_v<U, const char *>)
        return arg_kind::text;
    else
        return arg_kind::none;
}

template <int Index, typename... Args, std::size_t... I>
constexpr bool kinds_match(std::index_sequence<I...>) {
    return ((placeholder_kind(message_text(Index), static_cast<int>(I) + 1) == kind_of<Args>()) &&
            ...);
}

// One argument of a record: integers as int (the %d, %c and %x placeholders
// read int), texts as pointers; a null text shows as the empty text.
template <typename T> cu_error_arg_t record_arg(T v) {
    cu_error_arg_t arg{};
    if constexpr (kind_of<T>() == arg_kind::integer) {
        arg.cu_arg_type = CU_ERROR_ARG_INT;
        // A char goes as its int value, as a variadic %c argument would.
        arg.cu_arg_value.cu_arg_int =
            static_cast<int>(v); // NOLINT(bugprone-signed-char-misuse,cert-str34-c)
    } else {
        arg.cu_arg_type = CU_ERROR_ARG_CHAR_STR;
        arg.cu_arg_value.cu_arg_char_str = const_cast<char *>(v ? v : "");
    }
    return arg;
}

} // namespace detail

// Sets the thread's error record to message Index with args; returns status.
// The kinds of the arguments are known here, so the record is handed over
// whole (cu_pset_error_1 copies it) rather than cu_set_error_1 reading them
// from the message text again: refusing a request sets a record, and that
// is on the request path. Kept out of line: the hot loops of its callers
// keep their registers.
template <msg Index, typename... Args>
[[gnu::noinline, gnu::cold]] kx_int32_t report(kx_int32_t status, Args... args) {
    static_assert(placeholder_count(message_text(Index)) == sizeof...(Args),
                  "argument count differs from the message's placeholders");
    static_assert(detail::kinds_match<Index, Args...>(std::index_sequence_for<Args...>{}),
                  "argument kinds differ from the message's placeholders");
    cu_error_arg_t items[sizeof...(Args) + 1] = {detail::record_arg(args)...};
    const cu_error_t record = {status,
                               nullptr,
                               const_cast<char *>(catalogue_name),
                               catalogue_set,
                               Index,
                               const_cast<char *>(message_text(Index)),
                               static_cast<kx_uint32_t>(sizeof...(Args)),
                               sizeof...(Args) != 0 ? items : nullptr};
    cu_pset_error_1(&record);
    return status;
}

// 2650-101: argument number position of routine is not acceptable.
inline kx_int32_t bad_param(const char *routine, int position, unsigned value) {
    return report<MSG_2650_101>(SEC_S_BAD_PARAM, routine, position, value);
}
inline kx_int32_t bad_param(const char *routine, int position, const volatile void *value) {
    return bad_param(routine, position, pointer_value(value));
}

// 2650-102: an allocation of bytes failed in routine.
inline kx_int32_t no_memory(const char *routine, std::size_t bytes) {
    return report<MSG_2650_102>(SEC_S_NO_MEMORY, routine, byte_count(bytes));
}

// 2650-104: a callee returned code, which nothing expects.
inline kx_int32_t internal_error(source_pos pos, int code) {
    return report<MSG_2650_104>(SEC_S_INTERNAL_ERROR, pos.file, pos.line, code);
}

} // namespace kxacl

#endif
