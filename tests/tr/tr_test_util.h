// Helpers of the trace library's tests: a scratch directory, and the trace
// file read back with a strict parse of each record line.
#ifndef KX_TR_TEST_UTIL_H
#define KX_TR_TEST_UTIL_H

#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <optional>
#include <string>
#include <vector>

#include <gtest/gtest.h>

namespace tr_test {

// A fresh directory under /tmp, removed with everything in it.
struct scratch_dir {
    std::string path;
    scratch_dir() : path("/tmp/kx_tr_test.XXXXXX") { EXPECT_NE(mkdtemp(path.data()), nullptr); }
    ~scratch_dir() { std::filesystem::remove_all(path); }
    std::string file(const char *name) const { return path + "/" + name; }
};

// The lines of a file; a last line without its newline is marked.
inline std::vector<std::string> read_lines(const std::string &path) {
    std::ifstream in(path, std::ios::binary);
    std::vector<std::string> lines;
    for (std::string line; std::getline(in, line);)
        lines.push_back(in.eof() ? line + "<no newline>" : line);
    return lines;
}

struct record {
    long long seconds = 0, nanoseconds = 0, thread = 0;
    std::string component;
    unsigned long long id = 0;
    std::vector<std::string> items;
};

inline bool only(const std::string &s, const char *allowed) {
    return !s.empty() && s.find_first_not_of(allowed) == std::string::npos;
}

// A record line: "<s>.<9 digits> <tid> <component> <id>", then items that
// are "-" or lowercase hex pairs, all separated by single spaces.
inline std::optional<record> parse_record(const std::string &line) {
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
    record r{std::stoll(f[0].substr(0, dot)),
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

// Every record of the trace file; a line not of the record format fails.
inline std::vector<record> read_records(const std::string &path) {
    std::vector<record> records;
    for (const auto &line : read_lines(path)) {
        if (auto r = parse_record(line))
            records.push_back(*r);
        else
            ADD_FAILURE() << "malformed record line: " << line;
    }
    return records;
}

// The item text of some bytes, computed independently of the library.
inline std::string hex_of(const void *data, std::size_t length) {
    std::string out = length == 0 ? "-" : "";
    for (std::size_t i = 0; i < length; ++i) {
        char pair[3];
        std::snprintf(pair, sizeof pair, "%02x", static_cast<const unsigned char *>(data)[i]);
        out += pair;
    }
    return out;
}

} // namespace tr_test

#endif // KX_TR_TEST_UTIL_H
