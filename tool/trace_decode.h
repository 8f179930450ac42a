// Decoding of trace files: each record of the library's component becomes a
// line that names its point and shows every item by its kind (or a JSON
// object), from the library's table of trace points (kx_acl_trace.h). The
// decoder touches no file and calls nothing of the library, so that tests
// and fuzzers reach it directly; kxacl trace (trace_command.cpp) feeds it.
#ifndef KXACL_TOOL_TRACE_DECODE_H
#define KXACL_TOOL_TRACE_DECODE_H

#include <array>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace kxtool {

// Which records are shown; an empty list lets every record through.
struct trace_filter {
    std::vector<std::int64_t> threads; // thread ids (a process's first thread has its pid)
    std::vector<unsigned> categories;  // kx_acl_trace_category values
    std::vector<std::string> points;   // ids, "where:event" names or "where"
};

// Builds a filter from the values given on the command line, each a
// comma-separated list; nullopt with the reason in error when one is bad.
std::optional<trace_filter> make_trace_filter(const std::vector<std::string> &threads,
                                              const std::vector<std::string> &categories,
                                              const std::vector<std::string> &points,
                                              std::string &error);

// The permission character of each bit of a mask, 0 for a bit without one.
using perm_letters = std::array<char, 32>;

class trace_decoder {
  public:
    trace_decoder(bool json, trace_filter filter, const perm_letters &letters);

    // The output for one line of a trace file, given without its newline:
    // the decoded record with its newline, the line shown raw when it is not
    // a record this decoder knows, or nothing when the filter leaves it out.
    std::string decode_line(std::string_view line);

    // How many lines were shown raw.
    std::uint64_t undecoded() const { return undecoded_; }

  private:
    bool json_;
    trace_filter filter_;
    perm_letters letters_;
    std::uint64_t undecoded_ = 0;
};

// A text as the decoded line shows it: quoted, with quotes, backslashes and
// every byte outside printable ASCII escaped.
std::string quote_text(std::string_view text);

} // namespace kxtool

#endif
