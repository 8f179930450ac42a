#include "support.h"

#include <clocale>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <optional>
#include <system_error>
#include <unistd.h>

#include <gtest/gtest.h>

namespace kxtest {

namespace {
template <typename T> T argument(const std::vector<arg> &args, std::size_t i, T otherwise) {
    if (i < args.size() && std::holds_alternative<T>(args[i]))
        return std::get<T>(args[i]);
    ADD_FAILURE() << "argument " << i << " is missing or of another kind";
    return otherwise;
}
} // namespace

long long error_record::num(std::size_t i) const {
    return argument<long long>(args, i, -1);
}
std::string error_record::str(std::size_t i) const {
    return argument<std::string>(args, i, "");
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
        const auto &v = a.cu_arg_value;
        if (a.cu_arg_type == CU_ERROR_ARG_CHAR_STR)
            r.args.emplace_back(std::string(v.cu_arg_char_str));
        else
            r.args.emplace_back(a.cu_arg_type == CU_ERROR_ARG_LONG        ? v.cu_arg_long
                                : a.cu_arg_type == CU_ERROR_ARG_LONG_LONG ? v.cu_arg_long_long
                                                                          : v.cu_arg_int);
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

namespace {

// The directories that temp_dir made, removed at the exit of the process
// that made them: a forked child that exits leaves them to its parent.
struct made_directories {
    pid_t owner = getpid();
    std::vector<std::string> paths;
    ~made_directories() {
        if (getpid() != owner)
            return;
        for (const auto &path : paths) {
            std::error_code ignored;
            std::filesystem::remove_all(path, ignored);
        }
    }
};

made_directories &made() {
    static made_directories dirs;
    return dirs;
}

} // namespace

std::string temp_dir() {
    const char *base = std::getenv("TMPDIR");
    std::string templ = std::string(base ? base : "/tmp") + "/kxacl-test-XXXXXX";
    if (!mkdtemp(templ.data())) {
        ADD_FAILURE() << "mkdtemp failed";
        return templ;
    }
    made().paths.push_back(templ);
    return templ;
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

std::vector<std::string> read_lines(const std::string &path) {
    std::ifstream in(path, std::ios::binary);
    std::vector<std::string> lines;
    for (std::string line; std::getline(in, line);)
        lines.push_back(in.eof() ? line + "<no newline>" : line);
    return lines;
}

namespace {
bool only(const std::string &s, const char *allowed) {
    return !s.empty() && s.find_first_not_of(allowed) == std::string::npos;
}

std::optional<trace_line> parse_trace_line(const std::string &line) {
    std::vector<std::string> f;
    for (std::size_t start = 0, end = 0; end != std::string::npos; start = end + 1) {
        end = line.find(' ', start);
        f.push_back(line.substr(start, end - start));
    }
    const auto dot = f[0].find('.');
    const char *digits = "0123456789";
    if (f.size() < 4 || dot == std::string::npos || f[0].size() != dot + 10 ||
        !only(f[0].substr(0, dot), digits) || !only(f[0].substr(dot + 1), digits) ||
        !only(f[1], digits) || f[2].empty() || !only(f[3], digits))
        return std::nullopt;
    trace_line r{std::stoll(f[0].substr(0, dot)),
                 std::stoll(f[0].substr(dot + 1)),
                 std::stoll(f[1]),
                 f[2],
                 std::stoull(f[3]),
                 {f.begin() + 4, f.end()}};
    for (const auto &item : r.items)
        if (item != "-" && (!only(item, "0123456789abcdef") || item.size() % 2 != 0))
            return std::nullopt;
    return r;
}
} // namespace

std::vector<trace_line> read_trace_lines(const std::string &file) {
    std::vector<trace_line> records;
    for (const auto &line : read_lines(file)) {
        if (auto r = parse_trace_line(line))
            records.push_back(*r);
        else
            ADD_FAILURE() << "malformed record line: " << line;
    }
    return records;
}

std::vector<trace_record> read_trace(const std::string &file) {
    std::vector<trace_record> records;
    for (const auto &line : read_trace_lines(file)) {
        if (line.component != "_SEL")
            continue;
        trace_record r{static_cast<unsigned>(line.id), {}};
        for (const auto &item : line.items)
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
    std::string s;
    for (std::size_t i = 0; i < n; ++i) {
        const unsigned char b = static_cast<const unsigned char *>(p)[i];
        s += {"0123456789abcdef"[b >> 4], "0123456789abcdef"[b & 15]};
    }
    return s;
}

std::string trace_item(const void *p, std::size_t n) {
    return n == 0 ? "-" : hex_of(p, n);
}

std::string hex_text(const std::string &s) {
    return hex_of(s.c_str(), s.size() + 1);
}

} // namespace kxtest
