// Authorization: the identity handler registry and the permission
// evaluation of ACL buffers.
//
// Evaluation is on the path of every authorized request of every daemon of
// the family, from any number of threads at once. It walks the caller's
// buffer in place, reading each entry once, and allocates nothing: on the
// successful path with tracing off it calls only the frame (which does not
// allocate then), the registry lookup and the comparisons.
#include "eval.h"

#include <climits>
#include <cstring>

#include <kx_cu.h>

#include "alloc.h"
#include "buffer_format.h"
#include "byteorder.h"
#include "posix_case.h"
#include "entries.h"
#include "frame.h"
#include "report.h"

namespace kxacl {

namespace posix_case = kx::posix_case;

acl__state_desc acl__state;
pthread_once_t acl__init_once_block = PTHREAD_ONCE_INIT;

extern "C" void acl__state_init() {
    std::memset(&acl__state, 0, sizeof acl__state);
    pthread_mutex_init(&acl__state.mutex, nullptr);
}

namespace {

// ---- registry --------------------------------------------------------------

constexpr const char register_routine[] = "acl__register_id_handler";

kx_int32_t lock_failure(source_pos pos, int result) {
    return report<MSG_2650_131>(SEC_S_INTERNAL_ERROR, pos.file, pos.line, result);
}

// Runs work(state) with the registry mutex held. work never calls a handler.
// A failed unlock fails the call whatever work returned.
template <typename Work> kx_int32_t with_registry_locked(Work work) {
    int result = pthread_mutex_lock(&acl__state.mutex);
    if (result != 0)
        return lock_failure(here(src_acl), result);
    kx_int32_t status = work(acl__state);
    result = pthread_mutex_unlock(&acl__state.mutex);
    if (result != 0)
        return lock_failure(here(src_acl), result);
    return status;
}

// Appends one row; on failure the rows and their count stay as they were.
kx_int32_t append_handler(acl__state_desc &state, kx_uint32_t type, const char *mech,
                          std::size_t mech_length, sec_acl_id_handler handler) {
    std::size_t rows = static_cast<std::size_t>(state.count) + 1;
    std::size_t bytes = rows * sizeof(acl__id_handler_s);
    if (state.count == INT_MAX)
        return no_memory(register_routine, bytes);
    void *grown = state.id_handlers ? mem_realloc(state.id_handlers, bytes) : mem_alloc(bytes);
    if (!grown)
        return no_memory(register_routine, bytes);
    state.id_handlers = static_cast<acl__id_handler_s *>(grown);
    acl__id_handler_s &row = state.id_handlers[state.count];
    row = acl__id_handler_s{};
    row.type = type;
    std::memcpy(row.mech, mech, mech_length);
    row.handler = handler;
    ++state.count;
    return SEC_S_OK;
}

// Registrations are never replaced or refused: a later row for the same type
// and mechanism is appended but never reached by a lookup.
kx_int32_t register_id_handler(kx_uint32_t type, const char *mech, sec_acl_id_handler handler) {
    ensure_state_initialised();
    if (type != SEC_ID_HANDLER_EXPANDED && type != SEC_ID_HANDLER_USER)
        return bad_param(register_routine, 1, type);
    if (!mech)
        return bad_param(register_routine, 2, mech);
    if (!handler)
        return bad_param(register_routine, 3, reinterpret_cast<const void *>(handler));
    std::size_t mech_length = strnlen(mech, SEC_MECH_MAX + 1);
    if (mech_length == 0 || mech_length > SEC_MECH_MAX)
        return report<MSG_2650_132>(SEC_S_BAD_PARAM);
    return with_registry_locked([&](acl__state_desc &state) {
        return append_handler(state, type, mech, mech_length, handler);
    });
}

} // namespace

kx_int32_t sec__get_id_handler(kx_uint32_t type, const char *mech, sec_acl_id_handler *handler) {
    *handler = nullptr;
    ensure_state_initialised();
    return with_registry_locked([&](const acl__state_desc &state) {
        for (int i = 0; i < state.count; ++i) {
            const acl__id_handler_s &row = state.id_handlers[i];
            if (row.type == type && cu_strcasecmp_posix_1(mech, row.mech) == 0) {
                *handler = row.handler;
                break;
            }
        }
        return SEC_S_OK;
    });
}

namespace {

// ---- walking a sub-ACL -----------------------------------------------------

constexpr const char single_routine[] = "sec__single_acle_perm";
constexpr const char group_routine[] = "sec__group_acles_perm";

// The entry type of a request; the bits above it are the handler bit and
// two that are ignored.
constexpr unsigned char entry_type_bits = 0x1F;

// 2650-147: nothing in the ACL answers the request. Messages show the whole
// type byte, handler bit included.
kx_int32_t no_entry(unsigned char type, const char *mech, const char *id) {
    return report<MSG_2650_147>(SEC_S_BAD_ACLE, type, mech, id);
}

// Calls visit(entry) for the entries of sub-ACL v in stored order until it
// returns anything but SEC_S_OK. Records may be read to the buffer's end,
// which lets comparisons read eight bytes at a time; an identifier that does
// not end in its NUL ends the walk with 2650-110.
template <typename Visit> kx_int32_t walk_entries(acl_bytes b, const subacl_view &v, Visit visit) {
    return walk_acles<id_rule::ends_in_nul>(b, v, visit);
}

// The requester's identity or group name, prepared for comparison with
// every entry of a walk; the same result as cu_strcasecmp_posix_1.
posix_case::prepared_text prepared(const char *text) {
    return posix_case::prepared_text(text, std::strlen(text) + 1);
}

// One step of a walk of user or group entries, which stand in ascending
// order, by the order r of the requester against the entry: equal, the
// entry's mask is ORed into *mask; sorting after it, the walk goes on.
kx_int32_t ordered_step(int r, const acle_record &e, kx_uint32_t *mask, bool *matched) {
    if (r == 0) {
        *mask |= e.perm();
        *matched = true;
    }
    return r > 0 ? SEC_S_OK : walk_stop;
}

// The walk of user or group entries for a requester compared as text: the
// loop that evaluation spends its time in. A function of its own, so that
// the walk's pointer and the folded requester stay in registers whatever
// the code around it.
[[gnu::noinline]] kx_int32_t ordered_walk(acl_bytes b, const subacl_view &v, const char *requester,
                                          kx_uint32_t *mask, bool *matched) {
    const posix_case::prepared_text wanted = prepared(requester);
    return walk_entries(b, v, [&](const acle_record &e) {
        return ordered_step(wanted.order(e.id, e.readable), e, mask, matched);
    });
}

// Asks a handler about one entry. A handler may leave a record about a
// mismatch; it must not outlive the mismatch.
kx_int32_t ask_handler(sec_acl_id_handler handler, char *id, const acle_record &e) {
    kx_int32_t r = handler(id, const_cast<char *>(e.id));
    if (r != 0)
        cu_set_no_error_1();
    return r;
}

// ---- one requester ---------------------------------------------------------

bool is_single_request_type(unsigned t) {
    return t == SEC_ACLE_UNAUTHENTICATED || t == SEC_ACLE_ANYOTHER || t == SEC_ACLE_USER ||
           t == SEC_ACLE_EXPANDED;
}

kx_int32_t check_single_request(sec_acl_buffer_t acl, unsigned char type, const char *mech,
                                const char *id, const kx_uint32_t *perm) {
    if (!acl)
        return bad_param(single_routine, 1, acl);
    if (!perm)
        return bad_param(single_routine, 6, perm);
    kx_int32_t rc = check_read_header(*acl);
    if (rc != SEC_S_OK)
        return rc;
    unsigned t = type & entry_type_bits;
    if (!is_single_request_type(t))
        return report<MSG_2650_128>(SEC_S_BAD_PARAM, type);
    if (type_has_mech(t)) {
        if (!mech || !*mech)
            return report<MSG_2650_129>(SEC_S_BAD_PARAM);
        if (!id || !*id)
            return report<MSG_2650_130>(SEC_S_BAD_PARAM);
    }
    return SEC_S_OK;
}

// The unauthenticated or anyother entry: the sub-ACL's only one.
kx_int32_t single_entry_perm(acl_bytes b, const subacl_view &v, unsigned char type,
                             const char *mech, kx_uint32_t *perm) {
    if (v.count > 1) {
        source_pos pos = here(src_acl);
        return report<MSG_2650_122>(SEC_S_BAD_ACL, pos.file, pos.line);
    }
    // No writer of the library leaves such a sub-ACL without its entry, but
    // caller data may hold one: it answers like a missing sub-ACL.
    if (v.count == 0)
        return no_entry(type, mech, "");
    return walk_acles(b, v, [&](const acle_record &e) {
        *perm = e.perm();
        return walk_stop;
    });
}

// User entries stand in ascending order, so a requester that sorts before
// an entry can match no later one.
kx_int32_t user_perm(acl_bytes b, const subacl_view &v, unsigned char type, char *mech, char *id,
                     kx_uint32_t *perm) {
    sec_acl_id_handler handler = nullptr;
    // A failed lookup counts as no handler: the comparison falls back.
    if (type & SEC_ACLE_HANDLER_BIT)
        (void)sec__get_id_handler(SEC_ID_HANDLER_USER, mech, &handler);
    bool matched = false;
    kx_int32_t rc = handler ? walk_entries(b, v,
                                           [&](const acle_record &e) {
                                               return ordered_step(ask_handler(handler, id, e), e,
                                                                   perm, &matched);
                                           })
                            : ordered_walk(b, v, id, perm, &matched);
    if (rc != SEC_S_OK || matched)
        return rc;
    return no_entry(type, mech, id);
}

// Expanded entries match only through the mechanism's handler; they are in
// the order they were added, the first match wins, and there is no early stop.
kx_int32_t expanded_perm(acl_bytes b, const subacl_view &v, unsigned char type, char *mech,
                         char *id, kx_uint32_t *perm) {
    sec_acl_id_handler handler = nullptr;
    (void)sec__get_id_handler(SEC_ID_HANDLER_EXPANDED, mech, &handler);
    if (!handler)
        return no_entry(type, mech, id);
    bool matched = false;
    kx_int32_t rc = walk_entries(b, v, [&](const acle_record &e) {
        if (ask_handler(handler, id, e) != 0)
            return SEC_S_OK;
        *perm = e.perm();
        matched = true;
        return walk_stop;
    });
    if (rc != SEC_S_OK || matched)
        return rc;
    return no_entry(type, mech, id);
}

// *searched receives the entry count of the sub-ACL searched, for the Perf
// trace point; 0 when none was found.
kx_int32_t single_acle_perm(sec_acl_buffer_t acl, unsigned char type, char *mech, char *zmech,
                            char *id, kx_uint32_t *perm, std::uint32_t *searched) {
    ensure_state_initialised();
    kx_int32_t rc = check_single_request(acl, type, mech, id, perm);
    if (rc != SEC_S_OK)
        return rc;
    *perm = 0;
    unsigned char t = type & entry_type_bits;
    subacl_view v;
    bool found = false;
    rc = find_subacl_view(*acl, t, zmech ? zmech : mech, &v, &found);
    if (rc != SEC_S_OK)
        return rc;
    if (!found)
        return no_entry(type, mech, "");
    *searched = v.count;
    acl_bytes b = bytes_of(*acl);
    switch (t) {
    case SEC_ACLE_USER:
        return user_perm(b, v, type, mech, id, perm);
    case SEC_ACLE_EXPANDED:
        return expanded_perm(b, v, type, mech, id, perm);
    default:
        return single_entry_perm(b, v, type, mech, perm);
    }
}

// ---- groups ----------------------------------------------------------------

kx_int32_t check_group_request(sec_acl_buffer_t acl, kx_int32_t count, sec_buffer_t groups,
                               const kx_uint32_t *perm) {
    if (!acl)
        return bad_param(group_routine, 1, acl);
    if (count != 0 && !groups)
        return bad_param(group_routine, 3, groups);
    if (!perm)
        return bad_param(group_routine, 4, perm);
    return check_read_header(*acl);
}

// Group entries stand in ascending order: each name walks from the first
// entry until it matches or sorts before an entry.
kx_int32_t group_acles_perm(sec_acl_buffer_t acl, kx_int32_t count, sec_buffer_t groups,
                            kx_uint32_t *perm) {
    ensure_state_initialised();
    kx_int32_t rc = check_group_request(acl, count, groups, perm);
    if (rc != SEC_S_OK)
        return rc;
    *perm = 0;
    if (count == 0)
        return SEC_S_OK;
    subacl_view v;
    bool found = false;
    rc = find_subacl_view(*acl, SEC_ACLE_GROUP, nullptr, &v, &found);
    if (rc != SEC_S_OK)
        return rc;
    if (!found)
        return no_entry(SEC_ACLE_GROUP, "", "");
    acl_bytes b = bytes_of(*acl);
    kx_uint32_t mask = 0;
    bool matched = false;
    for (kx_int32_t i = 0; i < count; ++i) {
        const char *name = static_cast<const char *>(groups[i].value);
        // A group without a name is none of the ACL's groups: it is skipped,
        // so that the caller's other groups still count.
        if (!name)
            continue;
        rc = ordered_walk(b, v, name, &mask, &matched);
        if (rc != SEC_S_OK)
            return rc;
    }
    if (!matched)
        return no_entry(SEC_ACLE_GROUP, "", "");
    *perm = mask;
    return SEC_S_OK;
}

} // namespace

// ---- exported functions ----------------------------------------------------

extern "C" ACL_EXTERN kx_int32_t sec__register_id_handler(kx_uint32_t type, const char *mech,
                                                          sec_acl_id_handler handler) noexcept {
    using points = api_register_id_handler;
    api_enter<points>(clears_record::yes,
                      [&] { trace<points::entry_data>(num(type), text(mech), num(handler)); });
    return api_leave<points>(register_id_handler(type, mech, handler));
}

extern "C" ACL_EXTERN kx_int32_t sec__single_acle_perm(sec_acl_buffer_t acl, unsigned char type,
                                                       char *mech, char *zmech, char *id,
                                                       kx_uint32_t *perm) noexcept {
    using points = api_single_acle_perm;
    kx_uint32_t wide_type = type;
    api_enter<points>(clears_record::yes, [&] {
        traced_descriptor d(acl);
        trace<points::entry_data>(num(acl), num(d.length), num(d.value), num(wide_type), text(mech),
                                  text(id), num(perm));
    });
    perf_timer timer(wanted<KX_ACL_TP_SINGLE_ACLE_PERM_TIMED>());
    std::uint32_t searched = 0;
    kx_int32_t status = single_acle_perm(acl, type, mech, zmech, id, perm, &searched);
    if (timer.wanted()) {
        perf_elapsed t = timer.elapsed();
        trace<KX_ACL_TP_SINGLE_ACLE_PERM_TIMED>(num(searched), num(wide_type), text(mech), text(id),
                                                num(t.ticks), num(t.seconds), num(t.nanoseconds));
    }
    return api_leave<points>(status, [&] { trace<points::exit_ok>(num(status), num(*perm)); });
}

extern "C" ACL_EXTERN kx_int32_t sec__group_acles_perm(sec_acl_buffer_t acl, kx_int32_t count,
                                                       sec_buffer_t groups,
                                                       kx_uint32_t *perm) noexcept {
    using points = api_group_acles_perm;
    api_enter<points>(clears_record::yes, [&] {
        traced_descriptor d(acl);
        trace<points::entry_data>(num(acl), num(d.length), num(d.value), num(count), num(groups),
                                  num(perm));
    });
    perf_timer timer(wanted<KX_ACL_TP_GROUP_ACLES_PERM_TIMED>());
    kx_int32_t status = group_acles_perm(acl, count, groups, perm);
    if (timer.wanted()) {
        perf_elapsed t = timer.elapsed();
        trace<KX_ACL_TP_GROUP_ACLES_PERM_TIMED>(num(t.ticks), num(t.seconds), num(t.nanoseconds));
    }
    return api_leave<points>(status, [&] { trace<points::exit_ok>(num(status), num(*perm)); });
}

} // namespace kxacl
