// What the tests of libkx_cu share: owners of what it hands out, and error
// records written out whole, so that one comparison checks every field.
#ifndef KX_CU_TEST_H
#define KX_CU_TEST_H

#include <memory>
#include <sstream>
#include <string>
#include <type_traits>

#include <kx_cu.h>

namespace cu_test {

template <auto release> struct releaser {
    template <typename T> void operator()(T *p) const { release(p); }
};
using unique_error = std::unique_ptr<cu_error_t, releaser<cu_rel_error_1>>;
using unique_message = std::unique_ptr<char, releaser<cu_rel_errmsg_1>>;
using unique_iconv = std::unique_ptr<std::remove_pointer_t<cu_iconv_t>, releaser<cu_iconv_close_1>>;

// A copy of the calling thread's record.
inline unique_error current_error() {
    cu_error_t *err = nullptr;
    cu_get_error_1(&err);
    return unique_error(err);
}

inline std::string message_of(const cu_error_t *err) {
    char *msg = nullptr;
    cu_get_errmsg_1(err, &msg);
    const unique_message owned(msg);
    return msg != nullptr ? msg : "<NULL>";
}

inline std::string current_message() {
    return message_of(current_error().get());
}

inline std::string quoted(const char *s) {
    return s != nullptr ? '"' + std::string(s) + '"' : "NULL";
}

// "id ffdc catalogue set.number default [arguments]", each argument with
// its kind (i, l, ll, d, s, p); "NULL" for a missing text or array.
inline std::string describe(const cu_error_t *err) {
    std::ostringstream out;
    out << err->cu_error_id << ' ' << quoted(err->cu_ffdc_id) << ' ' << quoted(err->cu_msg_cat)
        << ' ' << err->cu_msg_set << '.' << err->cu_msg_num << ' ' << quoted(err->cu_msg_default);
    if (err->cu_args == nullptr)
        return out.str() + (err->cu_arg_cnt == 0 ? " NULL" : " NULL with a count");
    for (kx_uint32_t i = 0; i < err->cu_arg_cnt; ++i) {
        const auto &v = err->cu_args[i].cu_arg_value;
        out << (i == 0 ? " [" : " ");
        const int kind = err->cu_args[i].cu_arg_type;
        if (kind == CU_ERROR_ARG_INT)
            out << 'i' << v.cu_arg_int;
        else if (kind == CU_ERROR_ARG_LONG)
            out << 'l' << v.cu_arg_long;
        else if (kind == CU_ERROR_ARG_LONG_LONG)
            out << "ll" << v.cu_arg_long_long;
        else if (kind == CU_ERROR_ARG_DOUBLE)
            out << 'd' << v.cu_arg_double;
        else if (kind == CU_ERROR_ARG_CHAR_STR)
            out << 's' << quoted(v.cu_arg_char_str);
        else
            out << 'p' << v.cu_arg_void_ptr;
    }
    return out.str() + (err->cu_arg_cnt == 0 ? " []" : "]");
}

inline std::string current_record() {
    return describe(current_error().get());
}

} // namespace cu_test

#endif // KX_CU_TEST_H
