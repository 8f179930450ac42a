// Registration of the trace component "_SEL" and the time base of the
// Perf trace points.
#include "frame.h"

#include <cassert>

namespace kxacl {

tr_detail_level_t acl__trace_detail_levels[5];

#define KXACL_CATEGORY(category, name) {category, name, 0, 0},
const tr_category_description_t acl__trace_categories[5] = {
    KX_ACL_TRACE_CATEGORIES(KXACL_CATEGORY)};
#undef KXACL_CATEGORY

pthread_once_t acl__trace_register_once = PTHREAD_ONCE_INIT;
cu_timeinfo_t timeinfo;

namespace {

constexpr kx_uint32_t no_cats = sizeof acl__trace_categories / sizeof acl__trace_categories[0];

kx_int32_t acl__trace_register_component() {
    assert(no_cats == sizeof(acl__trace_detail_levels) / sizeof(acl__trace_detail_levels[0]));
    // A failure inside the trace library must never reach our caller's record.
    cu_error_t *saved = nullptr;
    cu_get_error_1(&saved);
    kx_int32_t rc = tr_register_component_1(trace_component, acl__trace_detail_levels,
                                            acl__trace_categories, no_cats);
    cu_pset_error_1(saved);
    cu_rel_error_1(saved);
    cu_get_procspeed_1(&timeinfo);
    if (wanted<KX_ACL_TP_PERF_LEVEL>()) {
        kx_int32_t perf = trace_level(KX_TRC_PERF);
        trace<KX_ACL_TP_PERF_LEVEL>(num(perf));
    }
    return rc;
}

} // namespace

extern "C" void acl__trace_register_component_once() {
    (void)acl__trace_register_component();
}

kx_int32_t acl__trace_unregister_component() {
    return tr_unregister_component_1(trace_component);
}

perf_elapsed perf_timer::elapsed() const {
    kx_uint64_t end = cu_get_ctr_1();
    kx_int64_t start_s = 0, start_ns = 0, end_s = 0, end_ns = 0;
    cu_cvt_time_1(start_, &timeinfo, &start_s, &start_ns);
    cu_cvt_time_1(end, &timeinfo, &end_s, &end_ns);
    perf_elapsed e{end - start_, end_s - start_s, end_ns - start_ns};
    if (e.nanoseconds < 0) {
        e.seconds -= 1;
        e.nanoseconds += 1000000000;
    }
    return e;
}

} // namespace kxacl
