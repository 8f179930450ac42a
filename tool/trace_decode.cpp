#include "trace_decode.h"

#include <algorithm>
#include <charconv>
#include <cinttypes>
#include <cstdio>
#include <cstring>
#include <ctime>
#include <span>

#include <kx_acl.h>
#include <kx_acl_trace.h>

#include "json.h"

namespace kxtool {
namespace {

// ---- The table of kx_acl_trace.h, as the decoder reads it --------------------

struct item_desc {
    kx_acl_trace_item_kind kind;
    const char *name;
};
constexpr item_desc make_item(kx_acl_trace_item_kind kind, const char *name) {
    return {kind, name};
}

struct item_list {
    std::array<item_desc, KX_ACL_TRACE_MAX_ITEMS> item{};
    std::size_t count = 0;
};
constexpr item_list operator+(item_list list, item_desc item) {
    list.item[list.count++] = item;
    return list;
}

struct point_desc {
    kx_uint32_t id;
    kx_acl_trace_category category;
    const char *where;
    const char *event;
    item_list items;
    std::span<const item_desc> kinds() const { return {items.item.data(), items.count}; }
};

// The table passes items through other macros: they must stay unparenthesised.
// NOLINTBEGIN(bugprone-macro-parentheses)
#define KXDEC_ITEM(kind, name) +make_item(kind, name)
#define KXDEC_POINT(row, id, category, level, rule, where, event, items)                           \
    point_desc{id, category, where, event, item_list{} items},
// NOLINTEND(bugprone-macro-parentheses)
constexpr point_desc points[] = {KX_ACL_TRACE_POINTS(KXDEC_POINT, KXDEC_ITEM)};
#undef KXDEC_POINT
#undef KXDEC_ITEM

#define KXDEC_CATEGORY(category, name) name,
constexpr const char *category_names[] = {KX_ACL_TRACE_CATEGORIES(KXDEC_CATEGORY)};
#undef KXDEC_CATEGORY

std::string point_name(const point_desc &p) {
    return std::string(p.where) + ":" + p.event;
}

// ---- Names of values ------------------------------------------------------------

struct named_value {
    std::uint32_t value;
    const char *name;
};

#define KXDEC_NAMED(name)                                                                          \
    named_value {                                                                                  \
        static_cast<std::uint32_t>(name), #name                                                    \
    }
constexpr named_value status_names[] = {
    KXDEC_NAMED(SEC_S_OK),
    KXDEC_NAMED(SEC_S_BAD_PARAM),
    KXDEC_NAMED(SEC_S_NO_MEMORY),
    KXDEC_NAMED(SEC_S_USER_NOT_FOUND),
    KXDEC_NAMED(SEC_S_ACLE_NOT_FOUND),
    KXDEC_NAMED(SEC_S_INTERNAL_ERROR),
    KXDEC_NAMED(SEC_S_CODESET_ERROR),
    KXDEC_NAMED(SEC_S_BAD_PERMISSION),
    KXDEC_NAMED(SEC_S_FILE_ERROR),
    KXDEC_NAMED(SEC_S_BAD_ACL),
    KXDEC_NAMED(SEC_S_BAD_ACLE),
    KXDEC_NAMED(SEC_S_NO_ACL_FILE),
};
constexpr named_value flag_names[] = {KXDEC_NAMED(SEC_F_ACL_TEXT), KXDEC_NAMED(SEC_F_ACL_CACHE),
                                      KXDEC_NAMED(SEC_F_ACL_CONVERT)};
#undef KXDEC_NAMED
constexpr named_value type_names[] = {{0, "none"},
                                      {SEC_ACLE_UNAUTHENTICATED, "unauthenticated"},
                                      {SEC_ACLE_ANYOTHER, "anyother"},
                                      {SEC_ACLE_USER, "user"},
                                      {SEC_ACLE_EXPANDED, "expanded"},
                                      {SEC_ACLE_GROUP, "group"}};

const char *name_of(std::span<const named_value> names, std::uint32_t value) {
    for (const auto &n : names)
        if (n.value == value)
            return n.name;
    return nullptr;
}

std::string hex32(std::uint32_t value) {
    char text[16];
    std::snprintf(text, sizeof text, "0x%08" PRIx32, value);
    return text;
}

// An entry type by name; a user request may carry the handler bit.
std::string type_name(std::uint32_t type) {
    const std::uint32_t base = type & ~std::uint32_t{SEC_ACLE_HANDLER_BIT};
    const char *name = name_of(type_names, base);
    if (!name || (base == 0 && type != 0))
        return std::to_string(type);
    return std::string(name) + (type & SEC_ACLE_HANDLER_BIT ? "+handler" : "");
}

std::string flags_text(std::uint32_t flags) {
    std::string out;
    for (const auto &f : flag_names) {
        if (flags & f.value) {
            // Appended piece by piece: gcc 12 at -O3 warns (-Wrestrict) on
            // a short literal added before a std::string.
            out += out.empty() ? "" : "|";
            out += f.name;
            flags &= ~f.value;
        }
    }
    if (flags != 0 || out.empty()) {
        out += out.empty() ? "" : "|";
        out += hex32(flags);
    }
    return out;
}

std::string errno_text(std::uint32_t err) {
    const char *name = strerrorname_np(static_cast<int>(err));
    return name ? name : std::to_string(err);
}

std::string mode_text(std::uint32_t mode) {
    char text[16];
    std::snprintf(text, sizeof text, "0%03" PRIo32, mode);
    return text;
}

// ---- One record line ------------------------------------------------------------

struct record {
    std::int64_t seconds = 0;
    std::int64_t nanoseconds = 0;
    std::int64_t thread = 0;
    std::string_view component;
    std::uint32_t id = 0;
    std::vector<std::string> items; // the bytes of each item
};

template <typename Number> bool parse_number(std::string_view text, Number &value) {
    if (text.empty() || text[0] == '+' || text[0] == '-')
        return false;
    const auto result = std::from_chars(text.data(), text.data() + text.size(), value);
    return result.ec == std::errc{} && result.ptr == text.data() + text.size();
}

int hex_digit(char c) {
    if (c >= '0' && c <= '9')
        return c - '0';
    if (c >= 'a' && c <= 'f')
        return c - 'a' + 10;
    return -1;
}

// An item as written: "-" for no bytes, else lowercase hex pairs.
bool parse_item(std::string_view text, std::string &bytes) {
    if (text == "-")
        return true;
    if (text.empty() || text.size() % 2 != 0)
        return false;
    bytes.reserve(text.size() / 2);
    for (std::size_t i = 0; i < text.size(); i += 2) {
        const int high = hex_digit(text[i]), low = hex_digit(text[i + 1]);
        if (high < 0 || low < 0)
            return false;
        bytes += static_cast<char>(high * 16 + low);
    }
    return true;
}

// "<seconds>.<9 digits> <thread> <component> <id> [<item>...]", single spaces.
std::optional<record> parse_record(std::string_view line) {
    std::vector<std::string_view> fields;
    for (std::size_t start = 0;;) {
        const auto space = line.find(' ', start);
        fields.push_back(line.substr(start, space - start));
        if (space == std::string_view::npos)
            break;
        start = space + 1;
    }
    if (fields.size() < 4)
        return std::nullopt;
    record r;
    const auto dot = fields[0].find('.');
    if (dot == std::string_view::npos || fields[0].size() != dot + 10 ||
        !parse_number(fields[0].substr(0, dot), r.seconds) ||
        !parse_number(fields[0].substr(dot + 1), r.nanoseconds) ||
        !parse_number(fields[1], r.thread) || fields[2].empty() || !parse_number(fields[3], r.id))
        return std::nullopt;
    r.component = fields[2];
    for (std::size_t i = 4; i < fields.size(); ++i)
        if (!parse_item(fields[i], r.items.emplace_back()))
            return std::nullopt;
    return r;
}

// Whether an item's bytes can be of a kind: a text ends in its only NUL.
bool item_has_kind(const std::string &bytes, kx_acl_trace_item_kind kind) {
    if (kind == KX_TRI_TEXT)
        return !bytes.empty() && bytes.find('\0') == bytes.size() - 1;
    return bytes.size() == KX_ACL_TRACE_ITEM_SIZE(kind);
}

const point_desc *find_point(const record &r) {
    if (r.component != KX_ACL_TRACE_COMPONENT)
        return nullptr;
    for (const auto &p : points) {
        if (p.id != r.id || p.items.count != r.items.size())
            continue;
        bool fits = true;
        for (std::size_t i = 0; i < r.items.size() && fits; ++i)
            fits = item_has_kind(r.items[i], p.items.item[i].kind);
        if (fits)
            return &p;
    }
    return nullptr;
}

template <typename Number> Number number_of(const std::string &bytes) {
    Number value{};
    std::memcpy(&value, bytes.data(), sizeof value); // the bytes of the writing host
    return value;
}

// The local time of a record, to the microsecond; the ISO form for JSON.
std::string local_time(const record &r, bool iso) {
    const auto seconds = static_cast<std::time_t>(r.seconds);
    std::tm tm{};
    if (!localtime_r(&seconds, &tm))
        return std::to_string(r.seconds);
    char date[64], zone[16];
    std::strftime(date, sizeof date, iso ? "%Y-%m-%dT%H:%M:%S" : "%Y-%m-%d %H:%M:%S", &tm);
    std::snprintf(date + std::strlen(date), sizeof date - std::strlen(date), ".%06" PRId64,
                  r.nanoseconds / 1000);
    if (!iso)
        return date;
    // "+0100" becomes "+01:00".
    std::strftime(zone, sizeof zone, "%z", &tm);
    std::string z = date;
    const std::size_t zone_length = std::strlen(zone);
    z.append(zone, zone_length < 3 ? zone_length : 3);
    if (zone_length == 5)
        z += ':';
    if (zone_length > 3)
        z.append(zone + 3);
    return z;
}

// ---- Items as values ------------------------------------------------------------

// One decoded item: its text form, and how JSON shows it.
class item_printer {
  public:
    item_printer(bool json, const perm_letters &letters) : json_(json), letters_(letters) {}

    // Appends the items of a point; seconds and nanoseconds become one
    // elapsed time in microseconds.
    void print(const point_desc &p, const record &r) {
        for (std::size_t i = 0; i < r.items.size(); ++i) {
            const auto kind = p.items.item[i].kind;
            if (kind == KX_TRI_SECONDS && i + 1 < r.items.size() &&
                p.items.item[i + 1].kind == KX_TRI_NANOSECONDS) {
                elapsed(number_of<std::int64_t>(r.items[i]),
                        number_of<std::int64_t>(r.items[i + 1]));
                ++i;
                continue;
            }
            item(p.items.item[i].name, kind, r.items[i]);
        }
    }

    std::string text;
    json_writer json;

  private:
    void key(std::string_view name) {
        if (json_)
            json.key(name);
        else {
            text += ' ';
            text += name;
            text += '=';
        }
    }
    void number(std::string_view name, std::int64_t value) {
        key(name);
        json_ ? (void)json.value(value) : (void)(text += std::to_string(value));
    }
    void word(std::string_view name, const std::string &value) {
        key(name);
        json_ ? (void)json.value(value) : (void)(text += value);
    }
    // A value with a code and a name, such as a status: "SEC_S_OK", or
    // {"code":0,"name":"SEC_S_OK"} in JSON.
    void coded(std::string_view name, std::int64_t code, const std::string &shown) {
        key(name);
        if (json_)
            json.begin_object().key("code").value(code).key("name").value(shown).end_object();
        else
            text += shown;
    }

    void elapsed(std::int64_t seconds, std::int64_t nanoseconds) {
        const std::int64_t total = seconds * 1000000000 + nanoseconds;
        if (json_) {
            json.key("elapsed_ns").value(total);
            return;
        }
        char shown[48];
        std::snprintf(shown, sizeof shown, " elapsed=%" PRId64 ".%03" PRId64 "us", total / 1000,
                      (total < 0 ? -total : total) % 1000);
        text += shown;
    }

    std::string letters_of(std::uint32_t mask) const {
        std::string shown;
        std::uint32_t unnamed = 0;
        for (unsigned bit = 0; bit < 32; ++bit) {
            if (!(mask & (1u << bit)))
                continue;
            if (letters_[bit])
                shown += letters_[bit];
            else
                unnamed |= 1u << bit;
        }
        return unnamed ? shown + "+" + hex32(unnamed) : shown;
    }

    void item(const char *name, kx_acl_trace_item_kind kind, const std::string &bytes) {
        switch (kind) {
        case KX_TRI_TEXT: {
            const std::string_view t(bytes.data(), bytes.size() - 1);
            key(name);
            json_ ? (void)json.value(t) : (void)(text += quote_text(t));
            return;
        }
        case KX_TRI_POINTER: {
            char shown[24];
            std::snprintf(shown, sizeof shown, "0x%" PRIxPTR, number_of<std::uintptr_t>(bytes));
            return word(name, shown);
        }
        case KX_TRI_STATUS: {
            const auto status = number_of<std::int32_t>(bytes);
            const char *known = name_of(status_names, static_cast<std::uint32_t>(status));
            return coded(name, status, known ? known : std::to_string(status));
        }
        case KX_TRI_PERMS: {
            const auto mask = number_of<std::uint32_t>(bytes);
            key(name);
            if (json_)
                json.begin_object().key("mask").value(std::int64_t{mask}).key("letters");
            json_ ? (void)json.value(letters_of(mask)).end_object()
                  : (void)(text += hex32(mask) + "(" + letters_of(mask) + ")");
            return;
        }
        case KX_TRI_TYPE:
            return coded(name, number_of<std::uint32_t>(bytes),
                         type_name(number_of<std::uint32_t>(bytes)));
        case KX_TRI_TYPE_BYTE:
            return coded(name, number_of<std::uint8_t>(bytes),
                         type_name(number_of<std::uint8_t>(bytes)));
        case KX_TRI_FLAGS:
            return coded(name, number_of<std::uint32_t>(bytes),
                         flags_text(number_of<std::uint32_t>(bytes)));
        case KX_TRI_BOOL:
            key(name);
            json_ ? (void)json.value(number_of<std::uint32_t>(bytes) != 0)
                  : (void)(text += number_of<std::uint32_t>(bytes) ? "true" : "false");
            return;
        case KX_TRI_ERRNO:
            return coded(name, number_of<std::int32_t>(bytes),
                         errno_text(number_of<std::uint32_t>(bytes)));
        case KX_TRI_MODE:
            return word(name, mode_text(number_of<std::uint32_t>(bytes)));
        case KX_TRI_OWNER:
            return number(name, number_of<std::uint32_t>(bytes));
        case KX_TRI_INT:
            return number(name, number_of<std::int32_t>(bytes));
        case KX_TRI_TICKS:
            return number(name, static_cast<std::int64_t>(number_of<std::uint64_t>(bytes)));
        case KX_TRI_SIZE:
        case KX_TRI_SECONDS:
        case KX_TRI_NANOSECONDS:
            return number(name, number_of<std::int64_t>(bytes));
        }
        word(name, "?");
    }

    bool json_;
    const perm_letters &letters_;
};

// ---- Filters --------------------------------------------------------------------

template <typename Visit> void for_each_value(const std::vector<std::string> &lists, Visit visit) {
    for (const auto &list : lists) {
        std::string_view rest = list;
        for (;;) {
            const auto comma = rest.find(',');
            visit(rest.substr(0, comma));
            if (comma == std::string_view::npos)
                break;
            rest.remove_prefix(comma + 1);
        }
    }
}

bool same_ignoring_case(std::string_view a, std::string_view b) {
    return std::equal(a.begin(), a.end(), b.begin(), b.end(), [](char x, char y) {
        return (x >= 'A' && x <= 'Z' ? x + 32 : x) == (y >= 'A' && y <= 'Z' ? y + 32 : y);
    });
}

bool point_named(const point_desc &p, std::string_view selector) {
    std::uint32_t id = 0;
    if (parse_number(selector, id))
        return p.id == id;
    return selector == p.where || selector == point_name(p);
}

bool known_point(std::string_view selector) {
    return std::any_of(std::begin(points), std::end(points),
                       [&](const point_desc &p) { return point_named(p, selector); });
}

template <typename T> bool listed(const std::vector<T> &list, const T &value) {
    return list.empty() || std::find(list.begin(), list.end(), value) != list.end();
}

// A line that is not a record, or a record that is not decoded, has no
// category or point to be judged by: it is shown rather than lost.
bool passes(const trace_filter &f, const std::optional<record> &r, const point_desc *p) {
    if (r && !listed(f.threads, r->thread))
        return false;
    if (!p)
        return true;
    if (!f.categories.empty() && !listed(f.categories, unsigned{p->category}))
        return false;
    return f.points.empty() || std::any_of(f.points.begin(), f.points.end(),
                                           [&](const auto &s) { return point_named(*p, s); });
}

} // namespace

std::string quote_text(std::string_view text) {
    std::string out = "\"";
    for (const char ch : text) {
        const auto c = static_cast<unsigned char>(ch);
        if (c == '"' || c == '\\') {
            out += '\\';
            out += ch;
        } else if (c == '\n') {
            out += "\\n";
        } else if (c == '\t') {
            out += "\\t";
        } else if (c < 0x20 || c >= 0x7f) {
            char hex[8];
            std::snprintf(hex, sizeof hex, "\\x%02x", c);
            out += hex;
        } else {
            out += ch;
        }
    }
    return out + "\"";
}

std::optional<trace_filter> make_trace_filter(const std::vector<std::string> &threads,
                                              const std::vector<std::string> &categories,
                                              const std::vector<std::string> &selectors,
                                              std::string &error) {
    trace_filter f;
    for_each_value(threads, [&](std::string_view v) {
        std::int64_t thread = 0;
        if (!parse_number(v, thread))
            error = "not a thread id: '" + std::string(v) + "'";
        f.threads.push_back(thread);
    });
    for_each_value(categories, [&](std::string_view v) {
        const auto *found =
            std::find_if(std::begin(category_names), std::end(category_names),
                         [&](const char *name) { return same_ignoring_case(v, name); });
        if (found == std::end(category_names))
            error = "unknown category '" + std::string(v) + "' (Errors, Info, API, Buffer or Perf)";
        f.categories.push_back(static_cast<unsigned>(found - std::begin(category_names)));
    });
    for_each_value(selectors, [&](std::string_view v) {
        if (!known_point(v))
            error = "unknown trace point '" + std::string(v) + "'";
        f.points.emplace_back(v);
    });
    if (!error.empty())
        return std::nullopt;
    return f;
}

trace_decoder::trace_decoder(bool json, trace_filter filter, const perm_letters &letters)
    : json_(json), filter_(std::move(filter)), letters_(letters) {}

std::string trace_decoder::decode_line(std::string_view line) {
    const auto r = parse_record(line);
    const point_desc *p = r ? find_point(*r) : nullptr;
    if (!passes(filter_, r, p))
        return {};
    if (!p)
        ++undecoded_;
    item_printer out(json_, letters_);
    if (json_) {
        out.json.begin_object();
        if (r) {
            out.json.key("time").value(local_time(*r, true));
            out.json.key("seconds").value(r->seconds).key("nanoseconds").value(r->nanoseconds);
            out.json.key("thread").value(r->thread).key("component").value(r->component);
            out.json.key("id").value(std::int64_t{r->id});
        }
        if (p) {
            out.json.key("category").value(category_names[p->category]);
            out.json.key("point").value(point_name(*p)).key("items").begin_object();
            out.print(*p, *r);
            out.json.end_object();
        } else {
            out.json.key("raw").value(line);
        }
        return out.json.end_object().str();
    }
    if (!p)
        return "raw: " + std::string(line) + "\n";
    out.text = local_time(*r, false) + " " + std::to_string(r->thread) + " " +
               category_names[p->category] + " " + point_name(*p);
    out.print(*p, *r);
    return out.text + "\n";
}

} // namespace kxtool
