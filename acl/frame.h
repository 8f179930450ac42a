// The frame of every exported function: trace registration once per process,
// the API entry and exit trace points, clearing the thread's error record,
// and the timing helpers of the Perf trace points.
#ifndef KXACL_FRAME_H
#define KXACL_FRAME_H

#include <cstring>
#include <tuple>
#include <type_traits>
#include <utility>
#include <pthread.h>

#include <kx_acl_trace.h>
#include <kx_cu.h>
#include <kx_sec.h>
#include <kx_tr.h>

namespace kxacl {

inline constexpr const char trace_component[] = KX_ACL_TRACE_COMPONENT;

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
inline tr_detail_level_t trace_level(kx_acl_trace_category category) {
    return __atomic_load_n(&acl__trace_detail_levels[category], __ATOMIC_RELAXED);
}

// ---- The rows of kx_acl_trace.h, checked at compile time ------------------

// The kinds of a row's items, in order.
struct item_kinds {
    kx_acl_trace_item_kind kind[KX_ACL_TRACE_MAX_ITEMS] = {};
    std::size_t count = 0;
};
constexpr item_kinds operator+(item_kinds list, kx_acl_trace_item_kind kind) {
    list.kind[list.count++] = kind;
    return list;
}

// A row of the table as a type: trace<P>() checks its items against it.
template <kx_acl_trace_point P> struct point_row;

// The table passes items through other macros: they must stay unparenthesised.
// NOLINTBEGIN(bugprone-macro-parentheses)
#define KXACL_ITEM_KIND(kind, name) +(kind)
#define KXACL_POINT_ROW(row, id_, category_, level_, rule_, where, event, items_)                  \
    template <> struct point_row<KX_ACL_TP_##row> {                                                \
        static constexpr kx_uint32_t id = id_;                                                     \
        static constexpr kx_acl_trace_category category = category_;                               \
        static constexpr tr_detail_level_t level = level_;                                         \
        static constexpr kx_acl_trace_rule rule = rule_;                                           \
        static constexpr item_kinds items = (item_kinds {} items_);                                \
    };
// NOLINTEND(bugprone-macro-parentheses)
KX_ACL_TRACE_POINTS(KXACL_POINT_ROW, KXACL_ITEM_KIND)
#undef KXACL_POINT_ROW
#undef KXACL_ITEM_KIND

// Whether a point of this rule and row level is recorded at a category level.
constexpr bool level_records(kx_acl_trace_rule rule, tr_detail_level_t row_level,
                             tr_detail_level_t level) {
    switch (rule) {
    case KX_TRL_AT_LEAST:
        return level >= row_level;
    case KX_TRL_EXACTLY:
        return level == row_level;
    case KX_TRL_ANNOUNCED:
        return (level >= 1 && level <= 4) || level == 7 || level == 8;
    }
    return false;
}

// Whether point P is recorded at this level of its category.
template <kx_acl_trace_point P> bool records_at(tr_detail_level_t level) {
    return level_records(point_row<P>::rule, point_row<P>::level, level);
}

// Whether point P is recorded at its category's current level.
template <kx_acl_trace_point P> bool wanted() {
    return records_at<P>(trace_level(point_row<P>::category));
}

// One data item: the bytes of a variable (a pointer's own bytes, its
// address, not what it points to), or a text with its NUL.
template <typename T> struct num_item {
    const T *value;
    const void *data() const { return value; }
    kx_uint32_t length() const { return sizeof(T); } // NOLINT(bugprone-sizeof-expression)
};
struct text_item {
    const char *text;
    const void *data() const { return text; }
    kx_uint32_t length() const { return static_cast<kx_uint32_t>(std::strlen(text) + 1); }
};
template <typename T> num_item<T> num(const T &value) {
    return {&value};
}
inline text_item text(const char *s, const char *if_null = "") {
    return {s ? s : if_null};
}

// Whether an item may stand where the row has an item of kind K: a text for
// a text, a pointer for a pointer, an integer of the kind's size otherwise.
template <kx_acl_trace_item_kind K, typename Item> inline constexpr bool item_fits = false;
template <kx_acl_trace_item_kind K>
inline constexpr bool item_fits<K, text_item> = K == KX_TRI_TEXT;
template <kx_acl_trace_item_kind K, typename T>
inline constexpr bool item_fits<K, num_item<T>> = K == KX_TRI_POINTER
                                                      ? std::is_pointer_v<T>
                                                      : K != KX_TRI_TEXT &&std::is_integral_v<T> &&
                                                            sizeof(T) == KX_ACL_TRACE_ITEM_SIZE(K);

template <typename Row, typename... Items, std::size_t... I>
constexpr bool items_fit(std::index_sequence<I...>) {
    return (item_fits<Row::items.kind[I], Items> && ...);
}

// Records point P with its items, which must be those of its row.
template <kx_acl_trace_point P, typename... Items> void trace(Items... items) {
    using row = point_row<P>;
    static_assert(sizeof...(Items) == row::items.count,
                  "the number of items differs from the row's");
    static_assert(items_fit<row, Items...>(std::index_sequence_for<Items...>{}),
                  "an item does not match the kind of the row's item");
    if constexpr (sizeof...(Items) == 0) {
        tr_record_id_1(trace_component, row::id);
    } else {
        // The trace library takes each item as a pointer and a length.
        auto pairs = std::tuple_cat(std::make_tuple(items.data(), items.length())...);
        std::apply(
            [](auto... flat) {
                tr_record_data_1(trace_component, row::id,
                                 static_cast<kx_uint32_t>(sizeof...(Items)), flat...);
            },
            pairs);
    }
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

// ---- The API frame ---------------------------------------------------------

// The API points of one exported function (KX_ACL_TRACE_API and its kin).
template <kx_acl_trace_point Entry, kx_acl_trace_point EntryData, kx_acl_trace_point Exit,
          kx_acl_trace_point ExitFail, kx_acl_trace_point ExitOk>
struct api_points {
    static constexpr kx_acl_trace_point entry = Entry;          // level 1
    static constexpr kx_acl_trace_point entry_data = EntryData; // level 8
    static constexpr kx_acl_trace_point exit = Exit;            // level 1 (any, for releases)
    static constexpr kx_acl_trace_point exit_fail = ExitFail;   // level 8, the status alone
    static constexpr kx_acl_trace_point exit_ok = ExitOk;       // level 8, the function's items
};
#define KXACL_API(row)                                                                             \
    api_points<KX_ACL_TP_##row##_ENTER, KX_ACL_TP_##row##_ENTER_DATA, KX_ACL_TP_##row##_EXIT,      \
               KX_ACL_TP_##row##_EXIT_FAIL, KX_ACL_TP_##row##_EXIT_OK>
#define KXACL_API_STATUS(row)                                                                      \
    api_points<KX_ACL_TP_##row##_ENTER, KX_ACL_TP_##row##_ENTER_DATA, KX_ACL_TP_##row##_EXIT,      \
               KX_ACL_TP_##row##_EXIT_DATA, KX_ACL_TP_##row##_EXIT_DATA>
#define KXACL_API_RELEASE(row)                                                                     \
    api_points<KX_ACL_TP_##row##_ENTER, KX_ACL_TP_##row##_ENTER_DATA, KX_ACL_TP_##row##_EXIT,      \
               KX_ACL_TP_##row##_EXIT, KX_ACL_TP_##row##_EXIT>

using api_read_acl_file = KXACL_API(READ_ACL_FILE);
using api_read_acl_from_data = KXACL_API_STATUS(READ_ACL_FROM_DATA);
using api_list_acl = KXACL_API(LIST_ACL);
using api_list_acl_by_type = KXACL_API(LIST_ACL_BY_TYPE);
using api_release_aclelist = KXACL_API_RELEASE(RELEASE_ACLELIST);
using api_create_acle = KXACL_API_STATUS(CREATE_ACLE);
using api_release_acle = KXACL_API_RELEASE(RELEASE_ACLE);
using api_display_acle_id = KXACL_API(DISPLAY_ACLE_ID);
using api_convert_acl_to_host = KXACL_API_STATUS(CONVERT_ACL_TO_HOST);
using api_add_acle_to_acl = KXACL_API_STATUS(ADD_ACLE_TO_ACL);
using api_del_acle_from_acl = KXACL_API_STATUS(DEL_ACLE_FROM_ACL);
using api_release_acl = KXACL_API_RELEASE(RELEASE_ACL);
using api_register_id_handler = KXACL_API_STATUS(REGISTER_ID_HANDLER);
using api_single_acle_perm = KXACL_API(SINGLE_ACLE_PERM);
using api_group_acles_perm = KXACL_API(GROUP_ACLES_PERM);
using api_translate_perms = KXACL_API(TRANSLATE_PERMS);
using api_translate_bitmask = KXACL_API(TRANSLATE_BITMASK);

#undef KXACL_API
#undef KXACL_API_STATUS
#undef KXACL_API_RELEASE

// Whether a function clears the thread's error record on entry.
enum class clears_record : bool { no = false, yes = true };

// Entry of an exported function. At API level 8 entry_items() records the
// entry-with-data point (it picks the point, since a few functions have two).
template <typename Points, typename EntryItems>
void api_enter(clears_record clears, EntryItems &&entry_items) {
    ensure_trace_registered();
    tr_detail_level_t level = trace_level(KX_TRC_API);
    if (records_at<Points::entry>(level))
        trace<Points::entry>();
    else if (records_at<Points::entry_data>(level))
        entry_items();
    if (clears == clears_record::yes)
        cu_set_no_error_1();
}

// Exit of an exported function with its status. At API level 8 a failure
// records the status alone, a success records exit_items() (which records
// the exit-on-success point with its items).
template <typename Points, typename ExitItems>
kx_int32_t api_leave(kx_int32_t status, ExitItems &&exit_items) {
    ensure_trace_registered();
    tr_detail_level_t level = trace_level(KX_TRC_API);
    if (records_at<Points::exit>(level)) {
        trace<Points::exit>();
    } else if (records_at<Points::exit_ok>(level)) {
        if (status != 0)
            trace<Points::exit_fail>(num(status));
        else
            exit_items();
    }
    return status;
}

// Exit whose level-8 point carries only the status, on both outcomes.
template <typename Points> kx_int32_t api_leave(kx_int32_t status) {
    return api_leave<Points>(status, [&] { trace<Points::exit_ok>(num(status)); });
}

// Exit of the release functions: the bare exit point at every non-zero level.
template <typename Points> void api_leave_release() {
    ensure_trace_registered();
    if (wanted<Points::exit>())
        trace<Points::exit>();
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

} // namespace kxacl

#endif
