// Helpers of the library's tests: reading the thread's error record back
// and checking it, and reading trace records from a trace file.
#ifndef KXACL_TEST_SUPPORT_H
#define KXACL_TEST_SUPPORT_H

#include <string>
#include <variant>
#include <vector>

#include <gtest/gtest.h>

#include <kx_cu.h>

namespace kxtest {

// A copy of the thread's error record in plain values.
struct error_record {
    int id = 0;
    int msg_num = 0;
    std::string catalogue;
    int set = 0;
    std::vector<std::variant<long long, std::string>> args;
    std::string text; // the formatted message

    // Argument i (0-based) as an integer or a text.
    long long num(std::size_t i) const;
    std::string str(std::size_t i) const;
};

error_record last_error();

// Whether the thread's record holds message msg_num with status and exactly
// these arguments (numbers and texts).
using arg = std::variant<long long, std::string>;
testing::AssertionResult record_is(int status, int msg_num, const std::vector<arg> &args);

// One record of the trace file: its id and its items as hex texts.
struct trace_record {
    unsigned id = 0;
    std::vector<std::string> items;
};

// Sets up tracing to a fresh file with the given levels; call before the
// first library call of the test (each test runs in its own process).
std::string start_tracing(const std::string &levels);
std::vector<trace_record> read_trace(const std::string &file);
std::vector<unsigned> trace_ids(const std::string &file);

// The hex form of a value's bytes, as the trace file writes items.
std::string hex_of(const void *p, std::size_t n);
template <typename T> std::string hex_of(const T &v) {
    return hex_of(&v, sizeof v);
}
std::string hex_text(const std::string &s); // with its NUL

// A fresh empty directory under the test temporary directory.
std::string temp_dir();

// Makes name, one of the locales that the build makes for the tests (see
// CMakeLists.txt), the process locale; false when it is not available.
bool use_build_locale(const char *name);

} // namespace kxtest

#endif
