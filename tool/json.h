// A small JSON writer: objects, arrays, strings, numbers and booleans,
// with the commas placed for the caller. Strings are written as UTF-8;
// bytes that are not valid UTF-8 become U+FFFD so that the output is always
// valid JSON.
#ifndef KXACL_TOOL_JSON_H
#define KXACL_TOOL_JSON_H

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

namespace kxtool {

class json_writer {
  public:
    json_writer &begin_object();
    json_writer &end_object();
    json_writer &begin_array();
    json_writer &end_array();
    json_writer &key(std::string_view name);
    json_writer &value(std::string_view s);
    json_writer &value(const char *s) { return value(std::string_view(s)); }
    json_writer &value(std::int64_t n);
    json_writer &value(bool b);
    json_writer &null();

    // The text, with a final newline.
    std::string str() const { return out_ + "\n"; }

  private:
    void separate();
    std::string out_;
    std::vector<bool> first_; // per open container: nothing written yet
    bool after_key_ = false;
};

// The JSON string literal of s, quotes included.
std::string json_quote(std::string_view s);

} // namespace kxtool

#endif
