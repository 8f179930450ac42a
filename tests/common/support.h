// Helpers shared by the tests of the three libraries and of the tool: the
// thread's error record read back and checked, trace files read back with
// a strict parse of each line, hex forms, and temporary directories.
#ifndef KXACL_TEST_SUPPORT_H
#define KXACL_TEST_SUPPORT_H

#include <optional>
#include <string>
#include <variant>
#include <vector>

#include <gtest/gtest.h>

#include <kx_cu.h>

namespace kxtest {

using arg = std::variant<long long, std::string>;

// A copy of the thread's error record in plain values.
struct error_record {
    int id = 0, msg_num = 0, set = 0;
    std::string catalogue;
    std::vector<arg> args;
    std::string text; // the formatted message

    // Argument i (0-based) as an integer or a text.
    long long num(std::size_t i) const;
    std::string str(std::size_t i) const;
};
error_record last_error();

// Whether the thread's record holds message msg_num with status and exactly
// these arguments.
testing::AssertionResult record_is(int status, int msg_num, const std::vector<arg> &args);

// One record line of a trace file: "<s>.<9 digits> <tid> <component>
// <id>", then items that are "-" or lowercase hex pairs, all separated by
// single spaces. Items are kept as written.
struct trace_line {
    long long seconds = 0, nanoseconds = 0, thread = 0;
    std::string component;
    unsigned long long id = 0;
    std::vector<std::string> items;
};
// Every record of a trace file; a line not of that form fails the test.
std::vector<trace_line> read_trace_lines(const std::string &file);

// The lines of a file; a last line without its newline is marked.
std::vector<std::string> read_lines(const std::string &path);

// Sets up tracing to a fresh file with the given levels; call before the
// first library call of the test (each test runs in its own process).
std::string start_tracing(const std::string &levels);

// The records of the ACL library's component, with "-" items as empty texts.
struct trace_record {
    unsigned id = 0;
    std::vector<std::string> items;
};
std::vector<trace_record> read_trace(const std::string &file);
std::vector<unsigned> trace_ids(const std::string &file);

// The hex form of a value's bytes, as the trace file writes items; an
// empty item is written "-" (trace_item).
std::string hex_of(const void *p, std::size_t n);
template <typename T> std::string hex_of(const T &v) {
    return hex_of(&v, sizeof v);
}
std::string hex_text(const std::string &s); // with its NUL
std::string trace_item(const void *p, std::size_t n);

// A fresh empty directory under $TMPDIR, removed with its contents when
// the process that made it exits (each test runs in a process of its own).
std::string temp_dir();

// Makes name, one of the locales that the build makes for the tests (see
// CMakeLists.txt), the process locale; false when it is not available.
bool use_build_locale(const char *name);

} // namespace kxtest

#endif
