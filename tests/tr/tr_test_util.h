// Helpers of the trace library's tests, in the names they use: a scratch
// directory, and the trace file read back with a strict parse of each line.
#ifndef KX_TR_TEST_UTIL_H
#define KX_TR_TEST_UTIL_H

#include <optional>
#include <string>
#include <vector>

#include "support.h"

namespace tr_test {

// A fresh directory, removed with everything in it when the test ends.
struct scratch_dir {
    std::string path = kxtest::temp_dir();
    std::string file(const char *name) const { return path + "/" + name; }
};

using kxtest::read_lines;
using record = kxtest::trace_line;

inline std::optional<record> parse_record(const std::string &line) {
    return kxtest::parse_trace_line(line);
}

// Every record of the trace file; a line not of the record format fails.
inline std::vector<record> read_records(const std::string &path) {
    return kxtest::read_trace_lines(path);
}

// The item text of some bytes, computed independently of the library.
inline std::string hex_of(const void *data, std::size_t length) {
    return kxtest::trace_item(data, length);
}

} // namespace tr_test

#endif // KX_TR_TEST_UTIL_H
