#include "support.h"

#include <clocale>
#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <sstream>
#include <unistd.h>

#include <gtest/gtest.h>

namespace kxtest {

long long error_record::num(std::size_t i) const {
    if (i >= args.size() || !std::holds_alternative<long long>(args[i])) {
        ADD_FAILURE() << "argument " << i << " is not a number";
        return -1;
    }
    return std::get<long long>(args[i]);
}

std::string error_record::str(std::size_t i) const {
    if (i >= args.size() || !std::holds_alternative<std::string>(args[i])) {
        ADD_FAILURE() << "argument " << i << " is not a text";
        return "";
    }
    return std::get<std::string>(args[i]);
}

error_record last_error() {
    cu_error_t *err = nullptr;
    cu_get_error_1(&err);
    error_record r;
    r.id = err->cu_error_id;
    r.msg_num = err->cu_msg_num;
    r.set = err->cu_msg_set;
    r.catalogue = err->cu_msg_cat ? err->cu_msg_cat : "";
    for (kx_uint32_t i = 0; i < err->cu_arg_cnt; ++i) {
        const cu_error_arg_t &a = err->cu_args[i];
        switch (a.cu_arg_type) {
        case CU_ERROR_ARG_CHAR_STR:
            r.args.emplace_back(std::string(a.cu_arg_value.cu_arg_char_str));
            break;
        case CU_ERROR_ARG_LONG:
            r.args.emplace_back(static_cast<long long>(a.cu_arg_value.cu_arg_long));
            break;
        case CU_ERROR_ARG_LONG_LONG:
            r.args.emplace_back(a.cu_arg_value.cu_arg_long_long);
            break;
        default:
            r.args.emplace_back(static_cast<long long>(a.cu_arg_value.cu_arg_int));
            break;
        }
    }
    char *msg = nullptr;
    cu_get_errmsg_1(err, &msg);
    r.text = msg ? msg : "";
    cu_rel_errmsg_1(msg);
    cu_rel_error_1(err);
    return r;
}

testing::AssertionResult record_is(int status, int msg_num, const std::vector<arg> &args) {
    error_record e = last_error();
    if (e.id == status && e.msg_num == msg_num && e.args == args)
        return testing::AssertionSuccess();
    testing::AssertionResult failure = testing::AssertionFailure();
    failure << "record has status " << e.id << ", message " << e.msg_num << ", arguments";
    for (const arg &a : e.args)
        std::visit([&](const auto &v) { failure << " " << testing::PrintToString(v); }, a);
    return failure << ": " << e.text;
}

std::string temp_dir() {
    const char *base = std::getenv("TMPDIR");
    std::string templ = std::string(base ? base : "/tmp") + "/kxacl-test-XXXXXX";
    std::vector<char> buf(templ.begin(), templ.end());
    buf.push_back('\0');
    if (!mkdtemp(buf.data()))
        ADD_FAILURE() << "mkdtemp failed";
    return buf.data();
}

bool use_build_locale(const char *name) {
    const char *build = std::getenv("KX_BUILD_DIR");
    if (!build)
        return false;
    setenv("LOCPATH", (std::string(build) + "/locales").c_str(), 1);
    return std::setlocale(LC_ALL, name) != nullptr;
}

std::string start_tracing(const std::string &levels) {
    std::string file = temp_dir() + "/trace.txt";
    setenv("KX_TRACE_FILE", file.c_str(), 1);
    setenv("KX_TRACE_LEVELS", levels.c_str(), 1);
    return file;
}

std::vector<trace_record> read_trace(const std::string &file) {
    std::vector<trace_record> records;
    std::ifstream in(file);
    std::string line;
    while (std::getline(in, line)) {
        std::istringstream words(line);
        std::string time, thread, component;
        trace_record r;
        words >> time >> thread >> component >> r.id;
        if (component != "_SEL")
            continue;
        std::string item;
        while (words >> item)
            r.items.push_back(item == "-" ? "" : item);
        records.push_back(r);
    }
    return records;
}

std::vector<unsigned> trace_ids(const std::string &file) {
    std::vector<unsigned> ids;
    for (const auto &r : read_trace(file))
        ids.push_back(r.id);
    return ids;
}

std::string hex_of(const void *p, std::size_t n) {
    static const char digits[] = "0123456789abcdef";
    std::string s;
    for (std::size_t i = 0; i < n; ++i) {
        unsigned char b = static_cast<const unsigned char *>(p)[i];
        s += digits[b >> 4];
        s += digits[b & 15];
    }
    return s;
}

std::string hex_text(const std::string &s) {
    return hex_of(s.c_str(), s.size() + 1);
}

} // namespace kxtest
