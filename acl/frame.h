// The frame of every exported function: trace registration once per process,
// the API entry and exit trace points, clearing the thread's error record,
// and the timing helpers of the Perf trace points.
#ifndef KXACL_FRAME_H
#define KXACL_FRAME_H

#include <cstring>
#include <tuple>
#include <pthread.h>

#include <kx_cu.h>
#include <kx_sec.h>
#include <kx_tr.h>

namespace kxacl {

inline constexpr const char trace_component[] = "_SEL";

// Trace categories of the component, in the order of their levels.
enum trace_category : int {
    TRC_ERRORS = 0,
    TRC_INFO = 1,
    TRC_API = 2,
    TRC_BUFFER = 3,
    TRC_PERF = 4
};

extern tr_detail_level_t acl__trace_detail_levels[5];
extern const tr_category_description_t acl__trace_categories[5];
extern pthread_once_t acl__trace_register_once;
extern cu_timeinfo_t timeinfo;

extern "C" void acl__trace_register_component_once();
kx_int32_t acl__trace_unregister_component();

// Registers the trace component unless that has been done.
inline void ensure_trace_registered() {
    pthread_once(&acl__trace_register_once, acl__trace_register_component_once);
}

// The current level of a category; the trace library may change it at any time.
inline tr_detail_level_t trace_level(trace_category category) {
    return __atomic_load_n(&acl__trace_detail_levels[category], __ATOMIC_RELAXED);
}

// One data item of a trace point: the bytes of a variable, or a text with its NUL.
struct trace_item {
    const void *data;
    kx_uint32_t length;
};
// A pointer is recorded as its own bytes (its address), not what it points to.
template <typename T> trace_item num(const T &value) {
    return {&value, static_cast<kx_uint32_t>(sizeof value)}; // NOLINT(bugprone-sizeof-expression)
}
inline trace_item text(const char *s, const char *if_null = "") {
    const char *t = s ? s : if_null;
    return {t, static_cast<kx_uint32_t>(std::strlen(t) + 1)};
}

// The trace items of an ACL descriptor: its length and value, zero for null.
struct traced_descriptor {
    kx_int32_t length = 0;
    void *value = nullptr;
    explicit traced_descriptor(const sec_buffer_s *acl) {
        if (acl) {
            length = acl->length;
            value = acl->value;
        }
    }
};

inline void trace_id(kx_uint32_t id) {
    tr_record_id_1(trace_component, id);
}

// Records a trace point with its items, each passed as a pointer and a length.
template <typename... Items> void trace_data(kx_uint32_t id, Items... items) {
    auto pairs = std::tuple_cat(std::make_tuple(items.data, items.length)...);
    std::apply(
        [id](auto... flat) {
            tr_record_data_1(trace_component, id, static_cast<kx_uint32_t>(sizeof...(Items)),
                             flat...);
        },
        pairs);
}

// The API trace point ids of one exported function.
struct api_points {
    kx_uint32_t entry;      // level 1
    kx_uint32_t entry_data; // level 8
    kx_uint32_t exit;       // level 1
    kx_uint32_t exit_fail;  // level 8, failure: the status alone
    kx_uint32_t exit_ok;    // level 8, success: the status and the function's items
};

inline constexpr api_points api_read_acl_file{9, 11, 12, 13, 14};
inline constexpr api_points api_read_acl_from_data{15, 17, 18, 19, 19};
inline constexpr api_points api_list_acl{20, 24, 25, 26, 27};
inline constexpr kx_uint32_t api_list_acl_null_entry = 22;
inline constexpr api_points api_list_acl_by_type{28, 32, 33, 34, 35};
inline constexpr kx_uint32_t api_list_acl_by_type_null_entry = 30;
inline constexpr api_points api_release_aclelist{36, 38, 39, 0, 0};
inline constexpr api_points api_create_acle{40, 42, 43, 44, 44};
inline constexpr api_points api_release_acle{45, 47, 48, 0, 0};
inline constexpr api_points api_display_acle_id{49, 51, 52, 53, 54};
inline constexpr api_points api_convert_acl_to_host{55, 57, 58, 59, 59};
inline constexpr api_points api_add_acle_to_acl{60, 62, 63, 64, 64};
inline constexpr api_points api_del_acle_from_acl{65, 67, 68, 69, 69};
inline constexpr api_points api_release_acl{70, 72, 73, 0, 0};
inline constexpr api_points api_register_id_handler{74, 76, 77, 78, 78};
inline constexpr api_points api_single_acle_perm{79, 81, 82, 83, 84};
inline constexpr api_points api_group_acles_perm{85, 87, 88, 89, 90};
inline constexpr api_points api_translate_perms{91, 93, 94, 95, 96};
inline constexpr api_points api_translate_bitmask{97, 99, 100, 101, 102};

// Whether a function clears the thread's error record on entry.
enum class clears_record : bool { no = false, yes = true };

// Entry of an exported function. At API level 8 entry_items() records the
// entry-with-data point (it picks the id, since a few functions have two).
template <typename EntryItems>
void api_enter(const api_points &points, clears_record clears, EntryItems &&entry_items) {
    ensure_trace_registered();
    tr_detail_level_t level = trace_level(TRC_API);
    if (level == 1)
        trace_id(points.entry);
    else if (level == 8)
        entry_items();
    if (clears == clears_record::yes)
        cu_set_no_error_1();
}

// Exit of an exported function with its status. At API level 8 a failure
// records the status alone, a success records exit_items() (which records
// the exit-on-success point with its items).
template <typename ExitItems>
kx_int32_t api_leave(const api_points &points, kx_int32_t status, ExitItems &&exit_items) {
    ensure_trace_registered();
    tr_detail_level_t level = trace_level(TRC_API);
    if (level == 1) {
        trace_id(points.exit);
    } else if (level == 8) {
        if (status != 0)
            trace_data(points.exit_fail, num(status));
        else
            exit_items();
    }
    return status;
}

// Exit whose level-8 point carries only the status, on both outcomes.
inline kx_int32_t api_leave(const api_points &points, kx_int32_t status) {
    return api_leave(points, status, [&] { trace_data(points.exit_ok, num(status)); });
}

// Exit of the release functions: the bare exit id at every non-zero level.
inline void api_leave_release(const api_points &points) {
    ensure_trace_registered();
    if (trace_level(TRC_API) != 0)
        trace_id(points.exit);
}

// Elapsed time of a measured step, as the Perf trace points record it.
struct perf_elapsed {
    kx_uint64_t ticks;
    kx_int64_t seconds;
    kx_int64_t nanoseconds;
};

// A measurement that only reads the counter when the Perf level asks for it.
class perf_timer {
  public:
    explicit perf_timer(bool wanted) : wanted_(wanted), start_(wanted ? cu_get_ctr_1() : 0) {}
    bool wanted() const { return wanted_; }
    perf_elapsed elapsed() const;

  private:
    bool wanted_;
    kx_uint64_t start_;
};

// True when the Perf level is exactly level.
inline bool perf_at(int level) {
    return trace_level(TRC_PERF) == level;
}

} // namespace kxacl

#endif
