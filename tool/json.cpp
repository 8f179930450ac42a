#include "json.h"

#include <cstdio>

namespace kxtool {
namespace {

// The length of the valid UTF-8 sequence at the start of s, or 0.
std::size_t utf8_sequence(std::string_view s) {
    const auto b = [&](std::size_t i) { return static_cast<unsigned char>(s[i]); };
    const unsigned char lead = b(0);
    std::size_t n = 0;
    unsigned min = 0, cp = 0;
    if (lead < 0x80)
        return 1;
    if ((lead & 0xe0) == 0xc0)
        n = 2, min = 0x80, cp = lead & 0x1f;
    else if ((lead & 0xf0) == 0xe0)
        n = 3, min = 0x800, cp = lead & 0x0f;
    else if ((lead & 0xf8) == 0xf0)
        n = 4, min = 0x10000, cp = lead & 0x07;
    else
        return 0;
    if (s.size() < n)
        return 0;
    for (std::size_t i = 1; i < n; ++i) {
        if ((b(i) & 0xc0) != 0x80)
            return 0;
        cp = (cp << 6) | (b(i) & 0x3f);
    }
    const bool surrogate = cp >= 0xd800 && cp <= 0xdfff;
    return cp < min || cp > 0x10ffff || surrogate ? 0 : n;
}

void append_escaped(std::string &out, unsigned char c) {
    switch (c) {
    case '"':
        out += "\\\"";
        return;
    case '\\':
        out += "\\\\";
        return;
    case '\n':
        out += "\\n";
        return;
    case '\t':
        out += "\\t";
        return;
    case '\r':
        out += "\\r";
        return;
    default:
        break;
    }
    if (c < 0x20) {
        char hex[8];
        std::snprintf(hex, sizeof hex, "\\u%04x", c);
        out += hex;
    } else {
        out += static_cast<char>(c);
    }
}

} // namespace

std::string json_quote(std::string_view s) {
    std::string out = "\"";
    while (!s.empty()) {
        const std::size_t n = utf8_sequence(s);
        if (n == 0) {
            out += "\\ufffd";
            s.remove_prefix(1);
        } else if (n == 1) {
            append_escaped(out, static_cast<unsigned char>(s[0]));
            s.remove_prefix(1);
        } else {
            out.append(s.substr(0, n));
            s.remove_prefix(n);
        }
    }
    return out + "\"";
}

void json_writer::separate() {
    if (after_key_) {
        after_key_ = false;
        return;
    }
    if (!first_.empty()) {
        if (!first_.back())
            out_ += ',';
        first_.back() = false;
    }
}

json_writer &json_writer::begin_object() {
    separate();
    out_ += '{';
    first_.push_back(true);
    return *this;
}
json_writer &json_writer::end_object() {
    out_ += '}';
    first_.pop_back();
    return *this;
}
json_writer &json_writer::begin_array() {
    separate();
    out_ += '[';
    first_.push_back(true);
    return *this;
}
json_writer &json_writer::end_array() {
    out_ += ']';
    first_.pop_back();
    return *this;
}
json_writer &json_writer::key(std::string_view name) {
    separate();
    out_ += json_quote(name);
    out_ += ':';
    after_key_ = true;
    return *this;
}
json_writer &json_writer::value(std::string_view s) {
    separate();
    out_ += json_quote(s);
    return *this;
}
json_writer &json_writer::value(std::int64_t n) {
    separate();
    out_ += std::to_string(n);
    return *this;
}
json_writer &json_writer::value(bool b) {
    separate();
    out_ += b ? "true" : "false";
    return *this;
}
json_writer &json_writer::null() {
    separate();
    out_ += "null";
    return *this;
}

} // namespace kxtool
