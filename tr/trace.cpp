// libkx_tr: the registry of trace components with their levels of detail,
// and the trace records appended to the trace file.
#include <kx_tr.h>

#include <algorithm>
#include <array>
#include <atomic>
#include <cerrno>
#include <charconv>
#include <cstdarg>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <iterator>
#include <memory>
#include <new>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include <fcntl.h>
#include <pthread.h>
#include <unistd.h>

namespace {

constexpr kx_uint32_t highest_level = 9;

// Tracing must be invisible to its callers, errno included.
class errno_guard {
  public:
    errno_guard() noexcept : saved_(errno) {}
    ~errno_guard() { errno = saved_; }
    errno_guard(const errno_guard &) = delete;
    errno_guard &operator=(const errno_guard &) = delete;

  private:
    int saved_;
};

// ASCII only: category names must compare the same in every locale.
char ascii_lower(char c) {
    return (c >= 'A' && c <= 'Z') ? static_cast<char>(c - 'A' + 'a') : c;
}

bool equal_ignoring_case(std::string_view a, std::string_view b) {
    return std::equal(a.begin(), a.end(), b.begin(), b.end(),
                      [](char x, char y) { return ascii_lower(x) == ascii_lower(y); });
}

std::string_view trim_blanks(std::string_view text) {
    const auto first = text.find_first_not_of(" \t");
    if (first == std::string_view::npos)
        return {};
    const auto last = text.find_last_not_of(" \t");
    return text.substr(first, last - first + 1);
}

// A component name is one field of a record line: a blank or a control
// character in it would split the field or the line.
bool is_valid_component_name(const char *name) {
    if (!name || !*name)
        return false;
    for (const char *p = name; *p; ++p) {
        const auto c = static_cast<unsigned char>(*p);
        if (c <= ' ' || c == 0x7f)
            return false;
    }
    return true;
}

tr_detail_level_t clamp_level(kx_uint32_t level, kx_uint32_t minimum) {
    return static_cast<tr_detail_level_t>(std::min(std::max(level, minimum), highest_level));
}

// ---------------------------------------------------------------------------
// Registry

struct category {
    std::string name;
    kx_uint32_t id;
    kx_uint32_t minimum;
};

struct component {
    std::string name;
    tr_detail_level_t *levels;
    std::vector<category> categories;
};

bool selects_all(std::string_view selector) {
    return selector == "*" || equal_ignoring_case(selector, "all");
}

// Calls apply for each category that selector names: its name, ignoring
// case, or "*" or "all" for all. Returns whether any was named.
template <typename Apply>
bool for_each_selected(const component &c, std::string_view selector, Apply &&apply) {
    if (selector.empty())
        return false;
    bool any = false;
    for (const category &cat : c.categories) {
        if (selects_all(selector) || equal_ignoring_case(selector, cat.name)) {
            apply(cat);
            any = true;
        }
    }
    return any;
}

// A plain pthread mutex, so that locking cannot throw out of the C API.
pthread_mutex_t registry_mutex = PTHREAD_MUTEX_INITIALIZER;

class registry_lock {
  public:
    registry_lock() noexcept { pthread_mutex_lock(&registry_mutex); }
    ~registry_lock() { pthread_mutex_unlock(&registry_mutex); }
    registry_lock(const registry_lock &) = delete;
    registry_lock &operator=(const registry_lock &) = delete;
};

// Never destroyed: components may unregister from their own static
// destructors, after ours would have run.
std::vector<component> &registered_components() {
    alignas(std::vector<component>) static unsigned char storage[sizeof(std::vector<component>)];
    static auto *const components = new (storage) std::vector<component>;
    return *components;
}

component *find_component(std::string_view name) {
    auto &all = registered_components();
    auto it =
        std::find_if(all.begin(), all.end(), [&](const component &c) { return c.name == name; });
    return it == all.end() ? nullptr : &*it;
}

bool descriptions_are_valid(std::span<const tr_category_description_t> descriptions) {
    return std::all_of(descriptions.begin(), descriptions.end(), [&](const auto &d) {
        return d.category_name && d.category_id < descriptions.size();
    });
}

component describe_component(const char *name, tr_detail_level_t *levels,
                             std::span<const tr_category_description_t> descriptions) {
    component c{name, levels, {}};
    c.categories.reserve(descriptions.size());
    for (const auto &d : descriptions)
        c.categories.push_back({d.category_name, d.category_id, d.minimum_level_of_detail});
    return c;
}

// ---------------------------------------------------------------------------
// KX_TRACE_LEVELS, e.g. "_SEL:API=8,Perf=2;_XYZ:all=1"

// Warnings about the configuration go to standard error, a few at most, so
// that a long mistaken setting cannot flood a daemon's log.
constexpr int max_warnings = 8;
std::atomic<int> warnings_given{0};

// A warning that cannot be made or written is given up: it must never fail
// the registration it comes from.
void warn(const std::string &what) noexcept {
    const int given = warnings_given.fetch_add(1);
    if (given > max_warnings)
        return;
    try {
        const std::string line = given == max_warnings
                                     ? "kx_tr: KX_TRACE_LEVELS: further mistakes not shown\n"
                                     : "kx_tr: KX_TRACE_LEVELS: " + what + "\n";
        // One write, so that the line stays whole beside other output.
        if (write(STDERR_FILENO, line.data(), line.size()) < 0)
            return;
    } catch (...) {
    }
}

// Built by appending: gcc 12 at -O3 takes a one-letter literal before a
// std::string for an overlapping copy (-Wrestrict).
std::string quoted(std::string_view text) {
    std::string q;
    q.reserve(text.size() + 2);
    q += '"';
    q += text;
    q += '"';
    return q;
}

// Calls visit for each field of text separated by separator, empty ones too.
template <typename Visit>
void for_each_field(std::string_view text, char separator, Visit &&visit) {
    for (;;) {
        const auto end = text.find(separator);
        visit(text.substr(0, end));
        if (end == std::string_view::npos)
            return;
        text.remove_prefix(end + 1);
    }
}

// A level is decimal digits; anything above 9 saturates (and is clamped later).
std::optional<kx_uint32_t> parse_level(std::string_view text) {
    text = trim_blanks(text);
    if (text.empty())
        return std::nullopt;
    kx_uint32_t level = 0;
    for (char ch : text) {
        if (ch < '0' || ch > '9')
            return std::nullopt;
        level = std::min<kx_uint32_t>(level * 10 + static_cast<kx_uint32_t>(ch - '0'), 10);
    }
    return level;
}

// What is wrong with one "category=level" setting, or "" when nothing is.
std::string setting_mistake(std::string_view setting) {
    const auto equals = setting.find('=');
    if (equals == std::string_view::npos)
        return quoted(setting) + " has no \"=LEVEL\"";
    if (trim_blanks(setting.substr(0, equals)).empty())
        return quoted(setting) + " names no category";
    if (!parse_level(setting.substr(equals + 1)))
        return "the level of " + quoted(setting) + " is not a number from 0 to 9";
    return {};
}

// Warns once per process about each part of the configuration that cannot
// be read, whichever component it names; the parts are then ignored.
void check_configuration(std::string_view configured) {
    static std::atomic<bool> checked{false};
    if (checked.exchange(true))
        return;
    for_each_field(configured, ';', [&](std::string_view entry) {
        if (trim_blanks(entry).empty())
            return;
        const auto colon = entry.find(':');
        if (colon == std::string_view::npos || trim_blanks(entry.substr(0, colon)).empty())
            return warn(quoted(trim_blanks(entry)) +
                        " names no component (write COMPONENT:CATEGORY=LEVEL,...)");
        for_each_field(entry.substr(colon + 1), ',', [&](std::string_view setting) {
            if (trim_blanks(setting).empty())
                return;
            if (auto mistake = setting_mistake(trim_blanks(setting)); !mistake.empty())
                warn(mistake);
        });
    });
}

std::string category_list(const component &c) {
    std::string names;
    for (const category &cat : c.categories)
        names += (names.empty() ? "" : ", ") + cat.name;
    return names;
}

// Applies one "category=level" setting; a malformed one changes nothing,
// and a category that c does not have is warned about.
template <typename Apply>
void apply_setting(const component &c, std::string_view setting, Apply &&apply) {
    if (!setting_mistake(setting).empty())
        return;
    const auto equals = setting.find('=');
    const auto level = parse_level(setting.substr(equals + 1));
    const auto name = trim_blanks(setting.substr(0, equals));
    if (!for_each_selected(c, name, [&](const category &cat) { apply(cat, *level); }))
        warn("no category " + quoted(name) + " in " + c.name + " (" + category_list(c) +
             ", or all)");
}

// Calls apply(category, level) for each setting of component c, in order.
template <typename Apply> void for_each_configured_level(const component &c, Apply &&apply) {
    const char *configured = std::getenv("KX_TRACE_LEVELS");
    if (!configured)
        return;
    check_configuration(configured);
    for_each_field(configured, ';', [&](std::string_view entry) {
        const auto colon = entry.find(':');
        if (colon == std::string_view::npos || trim_blanks(entry.substr(0, colon)) != c.name)
            return;
        for_each_field(entry.substr(colon + 1), ',',
                       [&](std::string_view setting) { apply_setting(c, setting, apply); });
    });
}

// The levels at registration: defaults, then the configured settings. A
// level no category describes (duplicate ids leave one) starts at 0.
std::vector<tr_detail_level_t>
initial_levels(const component &c, std::span<const tr_category_description_t> descriptions) {
    std::vector<tr_detail_level_t> levels(descriptions.size(), 0);
    for (const auto &d : descriptions)
        levels[d.category_id] = clamp_level(d.default_level_of_detail, d.minimum_level_of_detail);
    for_each_configured_level(c, [&](const category &cat, kx_uint32_t level) {
        levels[cat.id] = clamp_level(level, cat.minimum);
    });
    return levels;
}

// Clients read their levels at trace points without any lock.
void store_level(tr_detail_level_t *levels, kx_uint32_t index, tr_detail_level_t level) {
    __atomic_store_n(&levels[index], level, __ATOMIC_RELAXED);
}

int register_component(const char *name, tr_detail_level_t *levels,
                       std::span<const tr_category_description_t> descriptions) {
    component c = describe_component(name, levels, descriptions);
    const auto initial = initial_levels(c, descriptions);
    registry_lock lock;
    if (find_component(name))
        return TR_ALREADY_REGISTERED;
    auto &all = registered_components();
    // Reserve first so that nothing fails after the levels are written.
    all.reserve(all.size() + 1);
    for (kx_uint32_t i = 0; i < initial.size(); ++i)
        store_level(levels, i, initial[i]);
    all.push_back(std::move(c));
    return TR_OK;
}

// ---------------------------------------------------------------------------
// Records

// Bounds the items of one record, so that a wild count reads no arguments.
constexpr kx_uint32_t max_record_items = 64;
// Records up to this size are formatted on the stack.
constexpr std::size_t stack_record_size = 1024;

struct data_item {
    const unsigned char *bytes;
    kx_uint32_t length; // 0 for a NULL pointer
};

struct trace_file {
    bool configured; // KX_TRACE_FILE is set: records are wanted
    int fd;          // -1 if it could not be opened
};

trace_file open_trace_file() {
    const char *path = std::getenv("KX_TRACE_FILE");
    if (!path || !*path)
        return {false, -1};
    // O_NONBLOCK: a FIFO without a reader must not hang the first trace point;
    // O_NOCTTY: a terminal named there must not become the process's own.
    constexpr int flags = O_WRONLY | O_APPEND | O_CREAT | O_CLOEXEC | O_NOCTTY | O_NONBLOCK;
    int fd;
    do
        fd = open(path, flags, 0644);
    while (fd < 0 && errno == EINTR);
    return {true, fd};
}

// Opened once, at the first record, and kept open for the process's life.
const trace_file &the_trace_file() {
    static const trace_file file = open_trace_file();
    return file;
}

// Room for "<seconds>.<nanoseconds> <thread id> " and " <trace id>\n".
constexpr std::size_t fixed_fields_size = 20 + 1 + 9 + 1 + 11 + 1 + 1 + 10 + 1;

// An upper bound of a record's size, or nullopt if that overflows.
std::optional<std::size_t> record_size_bound(std::string_view component,
                                             std::span<const data_item> items) {
    std::size_t size = fixed_fields_size + component.size();
    for (const auto &item : items) {
        // A space, then two hex digits a byte or "-".
        const std::size_t text = item.length == 0 ? 1 : 2 * std::size_t{item.length};
        if (__builtin_add_overflow(size, 1 + text, &size))
            return std::nullopt;
    }
    return size;
}

// Appends the fields of a record to a buffer of sufficient size.
class line_builder {
  public:
    explicit line_builder(char *buffer) : start_(buffer), end_(buffer) {}

    std::string_view line() const { return {start_, static_cast<std::size_t>(end_ - start_)}; }

    void text(std::string_view s) {
        std::memcpy(end_, s.data(), s.size());
        end_ += s.size();
    }
    void character(char c) { *end_++ = c; }

    template <typename Integer> void number(Integer value) {
        // 20 characters hold any 64-bit value with its sign.
        char digits[20];
        const auto result = std::to_chars(std::begin(digits), std::end(digits), value);
        text({digits, static_cast<std::size_t>(result.ptr - digits)});
    }

    void nine_digits(long value) {
        for (int i = 8; i >= 0; --i) {
            end_[i] = static_cast<char>('0' + value % 10);
            value /= 10;
        }
        end_ += 9;
    }

    void hex(const data_item &item) {
        static constexpr char digits[] = "0123456789abcdef";
        if (item.length == 0) {
            character('-');
            return;
        }
        for (kx_uint32_t i = 0; i < item.length; ++i) {
            *end_++ = digits[item.bytes[i] >> 4];
            *end_++ = digits[item.bytes[i] & 0xf];
        }
    }

  private:
    char *start_;
    char *end_;
};

std::string_view format_record(char *buffer, std::string_view component, kx_uint32_t id,
                               std::span<const data_item> items) {
    timespec now{};
    clock_gettime(CLOCK_REALTIME, &now);
    line_builder line(buffer);
    line.number(static_cast<std::int64_t>(now.tv_sec));
    line.character('.');
    line.nine_digits(now.tv_nsec);
    line.character(' ');
    line.number(static_cast<std::int32_t>(gettid()));
    line.character(' ');
    line.text(component);
    line.character(' ');
    line.number(id);
    for (const auto &item : items) {
        line.character(' ');
        line.hex(item);
    }
    line.character('\n');
    return line.line();
}

// One write(2) keeps concurrent records whole; only an oversized record or
// a full disk can leave a remainder to write.
bool write_all(int fd, std::string_view data) {
    while (!data.empty()) {
        const ssize_t written = write(fd, data.data(), data.size());
        if (written < 0 && errno == EINTR)
            continue;
        if (written <= 0)
            return false;
        data.remove_prefix(static_cast<std::size_t>(written));
    }
    return true;
}

int write_record(std::string_view component, kx_uint32_t id, std::span<const data_item> items) {
    const trace_file &file = the_trace_file();
    if (!file.configured)
        return TR_OK;
    if (file.fd < 0)
        return TR_WRITE_FAILED;
    const auto size = record_size_bound(component, items);
    if (!size)
        return TR_WRITE_FAILED;
    std::array<char, stack_record_size> stack_buffer;
    std::unique_ptr<char[]> heap_buffer;
    char *buffer = stack_buffer.data();
    if (*size > stack_buffer.size()) {
        heap_buffer.reset(new (std::nothrow) char[*size]);
        if (!heap_buffer)
            return TR_WRITE_FAILED;
        buffer = heap_buffer.get();
    }
    return write_all(file.fd, format_record(buffer, component, id, items)) ? TR_OK
                                                                           : TR_WRITE_FAILED;
}

} // namespace

TR_EXTERN int tr_register_component_1(const char *component, tr_detail_level_t *levels,
                                      const tr_category_description_t *categories,
                                      kx_uint32_t count) noexcept {
    errno_guard keep_errno;
    if (!is_valid_component_name(component) || !levels || !categories || count == 0)
        return TR_BAD_ARGUMENT;
    const std::span<const tr_category_description_t> descriptions(categories, count);
    if (!descriptions_are_valid(descriptions))
        return TR_BAD_ARGUMENT;
    try {
        return register_component(component, levels, descriptions);
    } catch (...) {
        // Only allocations can fail here.
        return TR_NO_MEMORY;
    }
}

TR_EXTERN int tr_unregister_component_1(const char *component) noexcept {
    errno_guard keep_errno;
    if (!component)
        return TR_BAD_ARGUMENT;
    registry_lock lock;
    auto &all = registered_components();
    const auto *found = find_component(component);
    if (!found)
        return TR_NOT_REGISTERED;
    all.erase(all.begin() + (found - all.data()));
    return TR_OK;
}

TR_EXTERN int tr_set_detail_level_1(const char *component, const char *category,
                                    tr_detail_level_t level) noexcept {
    errno_guard keep_errno;
    if (!component || !category)
        return TR_BAD_ARGUMENT;
    registry_lock lock;
    const auto *found = find_component(component);
    if (!found)
        return TR_NOT_REGISTERED;
    const bool named = for_each_selected(*found, category, [&](const auto &cat) {
        store_level(found->levels, cat.id, clamp_level(level, cat.minimum));
    });
    return named ? TR_OK : TR_BAD_ARGUMENT;
}

TR_EXTERN int tr_record_id_1(const char *component, kx_uint32_t id) noexcept {
    errno_guard keep_errno;
    if (!is_valid_component_name(component))
        return TR_BAD_ARGUMENT;
    return write_record(component, id, {});
}

TR_EXTERN int tr_record_data_1(const char *component, kx_uint32_t id, kx_uint32_t count,
                               ...) noexcept {
    errno_guard keep_errno;
    if (!is_valid_component_name(component) || count > max_record_items)
        return TR_BAD_ARGUMENT;
    std::array<data_item, max_record_items> items;
    va_list args;
    va_start(args, count);
    for (kx_uint32_t i = 0; i < count; ++i) {
        const void *bytes = va_arg(args, const void *);
        const kx_uint32_t length = va_arg(args, kx_uint32_t);
        items[i] = bytes ? data_item{static_cast<const unsigned char *>(bytes), length}
                         : data_item{nullptr, 0};
    }
    va_end(args);
    return write_record(component, id, std::span(items.data(), count));
}
