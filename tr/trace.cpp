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
#include <new>
#include <optional>
#include <span>
#include <string_view>

#include <fcntl.h>
#include <pthread.h>
#include <unistd.h>

#include "unique_mem.h"

namespace {

using kx::unique_mem;

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

// The text before position end, all of it when end is npos. Unlike substr,
// these have no exception path.
std::string_view before(std::string_view text, std::size_t end) noexcept {
    return {text.data(), std::min(end, text.size())};
}

// The text after the separator at position at.
std::string_view after(std::string_view text, std::size_t at) noexcept {
    return {text.data() + at + 1, text.size() - at - 1};
}

std::string_view trim_blanks(std::string_view text) {
    const auto first = text.find_first_not_of(" \t");
    if (first == std::string_view::npos)
        return {};
    const auto last = text.find_last_not_of(" \t");
    return {text.data() + first, last - first + 1};
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
    const char *name;
    kx_uint32_t id;
    kx_uint32_t minimum;
};

// A registered component: one malloc'd block holds this record, its
// categories and the copies of all their names.
struct component {
    const char *name;
    tr_detail_level_t *levels;
    std::span<const category> categories;
};

bool selects_all(std::string_view selector) noexcept {
    return selector == "*" || equal_ignoring_case(selector, "all");
}

// Calls apply for each category that selector names: its name, ignoring
// case, or "*" or "all" for all. Returns whether any was named.
template <typename Apply>
bool for_each_selected(const component &c, std::string_view selector, Apply &&apply) noexcept {
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

// The registered components, under registry_mutex. Trivially destructible:
// components may unregister from their own static destructors, after ours
// would have run.
struct component_registry {
    component **items = nullptr; // malloc'd
    std::size_t count = 0;
    std::size_t capacity = 0;
};
component_registry registry;

component *find_component(std::string_view name) noexcept {
    for (std::size_t i = 0; i < registry.count; ++i)
        if (registry.items[i]->name == name)
            return registry.items[i];
    return nullptr;
}

// Room for one more component, so that adding it cannot fail.
bool reserve_component() noexcept {
    if (registry.count < registry.capacity)
        return true;
    const std::size_t capacity = registry.capacity == 0 ? 8 : 2 * registry.capacity;
    // An array of pointers to components, each of which is a block of its own.
    void *grown =
        std::realloc(registry.items,
                     capacity * sizeof(component *)); // NOLINT(bugprone-sizeof-expression)
    if (!grown)
        return false;
    registry.items = static_cast<component **>(grown);
    registry.capacity = capacity;
    return true;
}

void remove_component(const component *c) noexcept {
    component **end = registry.items + registry.count;
    component **found = std::find(registry.items, end, c);
    std::free(*found);
    std::copy(found + 1, end, found);
    --registry.count;
}

bool descriptions_are_valid(std::span<const tr_category_description_t> descriptions) noexcept {
    return std::all_of(descriptions.begin(), descriptions.end(), [&](const auto &d) {
        return d.category_name && d.category_id < descriptions.size();
    });
}

bool add_size(std::size_t &total, std::size_t more) noexcept {
    return !__builtin_add_overflow(total, more, &total);
}

constexpr std::size_t categories_offset =
    (sizeof(component) + alignof(category) - 1) / alignof(category) * alignof(category);

// Bytes of the block that describe_component fills; 0 when that overflows.
std::size_t component_size(const char *name,
                           std::span<const tr_category_description_t> descriptions) noexcept {
    std::size_t total = categories_offset;
    std::size_t categories_size = 0;
    if (__builtin_mul_overflow(descriptions.size(), sizeof(category), &categories_size) ||
        !add_size(total, categories_size) || !add_size(total, std::strlen(name) + 1))
        return 0;
    for (const auto &d : descriptions)
        if (!add_size(total, std::strlen(d.category_name) + 1))
            return 0;
    return total;
}

// Copies a text to next and moves next past its NUL.
const char *copy_text(char *&next, const char *text) noexcept {
    const std::size_t size = std::strlen(text) + 1;
    const char *copy = static_cast<const char *>(std::memcpy(next, text, size));
    next += size;
    return copy;
}

// The component as the registry keeps it, or NULL when memory runs out.
unique_mem<component>
describe_component(const char *name, tr_detail_level_t *levels,
                   std::span<const tr_category_description_t> descriptions) noexcept {
    const std::size_t size = component_size(name, descriptions);
    unique_mem<component> c(static_cast<component *>(size ? std::malloc(size) : nullptr));
    if (!c)
        return c;
    char *block = reinterpret_cast<char *>(c.get());
    auto *categories = reinterpret_cast<category *>(block + categories_offset);
    char *texts = reinterpret_cast<char *>(categories + descriptions.size());
    new (c.get()) component{copy_text(texts, name), levels, {categories, descriptions.size()}};
    for (std::size_t i = 0; i < descriptions.size(); ++i) {
        const auto &d = descriptions[i];
        new (&categories[i])
            category{copy_text(texts, d.category_name), d.category_id, d.minimum_level_of_detail};
    }
    return c;
}

// ---------------------------------------------------------------------------
// KX_TRACE_LEVELS, e.g. "_SEL:API=8,Perf=2;_XYZ:all=1"

// A growing malloc'd text. An allocation failure marks it failed, and later
// appends do nothing.
class text_builder {
  public:
    void append(std::string_view s) noexcept {
        if (failed_ || !reserve(s.size()))
            return;
        std::memcpy(text_.get() + size_, s.data(), s.size());
        size_ += s.size();
    }
    void append(char c) noexcept { append(std::string_view(&c, 1)); }
    void append_quoted(std::string_view s) noexcept {
        append('"');
        append(s);
        append('"');
    }
    std::size_t size() const noexcept { return size_; }
    bool failed() const noexcept { return failed_; }
    std::string_view text() const noexcept { return {text_.get(), size_}; }

  private:
    bool reserve(std::size_t more) noexcept {
        std::size_t need = 0;
        if (__builtin_add_overflow(size_, more, &need)) {
            failed_ = true;
            return false;
        }
        if (need <= capacity_)
            return true;
        std::size_t capacity = capacity_ < 128 ? 128 : capacity_;
        while (capacity < need && !__builtin_mul_overflow(capacity, std::size_t{2}, &capacity))
            ;
        void *grown = capacity >= need ? std::realloc(text_.get(), capacity) : nullptr;
        if (!grown) {
            failed_ = true;
            return false;
        }
        (void)text_.release();
        text_.reset(static_cast<char *>(grown));
        capacity_ = capacity;
        return true;
    }

    unique_mem<char> text_;
    std::size_t size_ = 0;
    std::size_t capacity_ = 0;
    bool failed_ = false;
};

// Warnings about the configuration go to standard error, a few at most, so
// that a long mistaken setting cannot flood a daemon's log.
constexpr int max_warnings = 8;
std::atomic<int> warnings_given{0};

// compose(text_builder &) writes what is wrong. A warning that cannot be
// made or written is given up: it must never fail the registration it
// comes from.
template <typename Compose> void warn(Compose &&compose) noexcept {
    const int given = warnings_given.fetch_add(1);
    if (given > max_warnings)
        return;
    text_builder line;
    line.append("kx_tr: KX_TRACE_LEVELS: ");
    if (given == max_warnings)
        line.append("further mistakes not shown");
    else
        compose(line);
    line.append('\n');
    // One write, so that the line stays whole beside other output.
    if (line.failed() || write(STDERR_FILENO, line.text().data(), line.size()) < 0)
        return;
}

// Calls visit for each field of text separated by separator, empty ones too.
template <typename Visit>
void for_each_field(std::string_view text, char separator, Visit &&visit) noexcept {
    for (;;) {
        const auto end = text.find(separator);
        visit(before(text, end));
        if (end == std::string_view::npos)
            return;
        text.remove_prefix(end + 1);
    }
}

// A level is decimal digits; anything above 9 saturates (and is clamped later).
std::optional<kx_uint32_t> parse_level(std::string_view text) noexcept {
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

enum class setting_mistake { none, no_level, no_category, bad_level };

// What is wrong with one "category=level" setting.
setting_mistake mistake_of(std::string_view setting) noexcept {
    const auto equals = setting.find('=');
    if (equals == std::string_view::npos)
        return setting_mistake::no_level;
    if (trim_blanks(before(setting, equals)).empty())
        return setting_mistake::no_category;
    if (!parse_level(after(setting, equals)))
        return setting_mistake::bad_level;
    return setting_mistake::none;
}

void warn_about_setting(std::string_view setting, setting_mistake mistake) noexcept {
    warn([&](text_builder &line) {
        if (mistake == setting_mistake::bad_level)
            line.append("the level of ");
        line.append_quoted(setting);
        if (mistake == setting_mistake::no_level)
            line.append(" has no \"=LEVEL\"");
        else if (mistake == setting_mistake::no_category)
            line.append(" names no category");
        else
            line.append(" is not a number from 0 to 9");
    });
}

// Warns once per process about each part of the configuration that cannot
// be read, whichever component it names; the parts are then ignored.
void check_configuration(std::string_view configured) noexcept {
    static std::atomic<bool> checked{false};
    if (checked.exchange(true))
        return;
    for_each_field(configured, ';', [&](std::string_view entry) {
        if (trim_blanks(entry).empty())
            return;
        const auto colon = entry.find(':');
        if (colon == std::string_view::npos || trim_blanks(before(entry, colon)).empty())
            return warn([&](text_builder &line) {
                line.append_quoted(trim_blanks(entry));
                line.append(" names no component (write COMPONENT:CATEGORY=LEVEL,...)");
            });
        for_each_field(after(entry, colon), ',', [&](std::string_view setting) {
            setting = trim_blanks(setting);
            if (setting.empty())
                return;
            if (const setting_mistake mistake = mistake_of(setting);
                mistake != setting_mistake::none)
                warn_about_setting(setting, mistake);
        });
    });
}

void warn_about_category(const component &c, std::string_view name) noexcept {
    warn([&](text_builder &line) {
        line.append("no category ");
        line.append_quoted(name);
        line.append(" in ");
        line.append(c.name);
        line.append(" (");
        const std::size_t list_start = line.size();
        for (const category &cat : c.categories) {
            if (line.size() != list_start)
                line.append(", ");
            line.append(cat.name);
        }
        line.append(", or all)");
    });
}

// Applies one "category=level" setting; a malformed one changes nothing,
// and a category that c does not have is warned about.
template <typename Apply>
void apply_setting(const component &c, std::string_view setting, Apply &&apply) noexcept {
    if (mistake_of(setting) != setting_mistake::none)
        return;
    const auto equals = setting.find('=');
    const auto level = parse_level(after(setting, equals));
    const auto name = trim_blanks(before(setting, equals));
    if (!for_each_selected(c, name, [&](const category &cat) { apply(cat, *level); }))
        warn_about_category(c, name);
}

// Calls apply(category, level) for each setting of component c, in order.
template <typename Apply>
void for_each_configured_level(const component &c, Apply &&apply) noexcept {
    const char *configured = std::getenv("KX_TRACE_LEVELS");
    if (!configured)
        return;
    check_configuration(configured);
    for_each_field(configured, ';', [&](std::string_view entry) {
        const auto colon = entry.find(':');
        if (colon == std::string_view::npos || trim_blanks(before(entry, colon)) != c.name)
            return;
        for_each_field(after(entry, colon), ',',
                       [&](std::string_view setting) { apply_setting(c, setting, apply); });
    });
}

// The levels at registration: defaults, then the configured settings; NULL
// when memory runs out. A level no category describes (duplicate ids leave
// one) starts at 0.
unique_mem<tr_detail_level_t>
initial_levels(const component &c,
               std::span<const tr_category_description_t> descriptions) noexcept {
    unique_mem<tr_detail_level_t> levels(static_cast<tr_detail_level_t *>(
        std::calloc(descriptions.size(), sizeof(tr_detail_level_t))));
    if (!levels)
        return levels;
    for (const auto &d : descriptions)
        levels.get()[d.category_id] =
            clamp_level(d.default_level_of_detail, d.minimum_level_of_detail);
    for_each_configured_level(c, [&](const category &cat, kx_uint32_t level) {
        levels.get()[cat.id] = clamp_level(level, cat.minimum);
    });
    return levels;
}

// Clients read their levels at trace points without any lock.
void store_level(tr_detail_level_t *levels, kx_uint32_t index, tr_detail_level_t level) noexcept {
    __atomic_store_n(&levels[index], level, __ATOMIC_RELAXED);
}

int register_component(const char *name, tr_detail_level_t *levels,
                       std::span<const tr_category_description_t> descriptions) noexcept {
    unique_mem<component> c = describe_component(name, levels, descriptions);
    if (!c)
        return TR_NO_MEMORY;
    const unique_mem<tr_detail_level_t> initial = initial_levels(*c, descriptions);
    if (!initial)
        return TR_NO_MEMORY;
    registry_lock lock;
    if (find_component(name))
        return TR_ALREADY_REGISTERED;
    // Reserve first so that nothing fails after the levels are written.
    if (!reserve_component())
        return TR_NO_MEMORY;
    for (kx_uint32_t i = 0; i < descriptions.size(); ++i)
        store_level(levels, i, initial.get()[i]);
    registry.items[registry.count++] = c.release();
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

trace_file open_trace_file() noexcept {
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
const trace_file &the_trace_file() noexcept {
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
    unique_mem<char> heap_buffer;
    char *buffer = stack_buffer.data();
    if (*size > stack_buffer.size()) {
        heap_buffer.reset(static_cast<char *>(std::malloc(*size)));
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
    return register_component(component, levels, descriptions);
}

TR_EXTERN int tr_unregister_component_1(const char *component) noexcept {
    errno_guard keep_errno;
    if (!component)
        return TR_BAD_ARGUMENT;
    registry_lock lock;
    const auto *found = find_component(component);
    if (!found)
        return TR_NOT_REGISTERED;
    remove_component(found);
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
