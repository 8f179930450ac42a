// Listing the entries of an ACL buffer: all of them, or those of one entry
// type (and mechanism), in buffer order, each entry in one block with its
// identifier.
#include <cstdlib>
#include <cstring>

#include "buffer_format.h"
#include "convert.h"
#include "entries.h"
#include "frame.h"
#include "report.h"

namespace kxacl {

namespace {

// Appends the entries of every sub-ACL that wanted() accepts, in buffer order.
template <typename Wanted>
kx_int32_t append_subacls(const sec_buffer_s &acl, sec_acle_list_t list, Wanted wanted) {
    return walk_subacls(bytes_of(acl), records_bound::next_subacl,
                        [&](const subacl_view &v, acl_bytes records, bool) {
                            return wanted(v) ? append_subacl_to_list(records, v, list) : SEC_S_OK;
                        });
}

void release_list(sec_acle_list_t list) {
    for (kx_int32_t i = 0; i < list->count; ++i)
        release_acle(list->acles[i]);
    std::free(list->acles);
    list->count = 0;
    list->acles = nullptr;
}

// Fills the list from a checked buffer: the empty ACL lists as the empty
// list; a buffer the readers cannot take leaves the list untouched; after a
// failure of fill() the list is emptied again.
template <typename Fill>
kx_int32_t fill_list(const sec_buffer_s &acl, sec_acle_list_t list, Fill fill) {
    if (!is_empty_acl(acl)) {
        kx_int32_t rc = check_read_header(acl);
        if (rc != SEC_S_OK)
            return rc;
    }
    list->count = 0;
    list->acles = nullptr;
    if (is_empty_acl(acl))
        return SEC_S_OK;
    kx_int32_t rc = fill();
    if (rc != SEC_S_OK)
        release_list(list);
    return rc;
}

kx_int32_t list_acl(sec_acl_buffer_t acl, sec_acle_list_t list) {
    if (!acl)
        return bad_param("sec_list_acl", 1, acl);
    if (!list)
        return bad_param("sec_list_acl", 2, list);
    return fill_list(*acl, list, [&] {
        return append_subacls(*acl, list, [](const subacl_view &) { return true; });
    });
}

kx_int32_t list_acl_by_type(sec_acl_buffer_t acl, unsigned char type, const char *mech,
                            sec_acle_list_t list) {
    if (!acl)
        return bad_param("sec_list_acl_by_type", 1, acl);
    if (!valid_entry_type(type))
        return bad_param("sec_list_acl_by_type", 2, type);
    if (type_has_mech(type) && mech && (!*mech || std::strlen(mech) > SEC_MECH_MAX))
        return bad_param("sec_list_acl_by_type", 3, mech);
    if (!list)
        return bad_param("sec_list_acl_by_type", 4, list);
    return fill_list(*acl, list, [&] {
        if (type_has_mech(type) && !mech)
            return append_subacls(*acl, list,
                                  [type](const subacl_view &v) { return v.type == type; });
        subacl_view v;
        bool found = false;
        kx_int32_t rc = find_subacl_view(*acl, type, mech, &v, &found);
        if (rc != SEC_S_OK || !found)
            return rc;
        return append_subacl_to_list(bytes_of(*acl), v, list);
    });
}

// The list's count for trace points; 0 for a null list.
kx_int32_t list_count(sec_acle_list_t list) {
    return list ? list->count : 0;
}

} // namespace

} // namespace kxacl

using namespace kxacl;

extern "C" ACL_EXTERN kx_int32_t sec_list_acl(sec_acl_buffer_t acl,
                                              sec_acle_list_t aclelist) noexcept {
    using points = api_list_acl;
    api_enter<points>(clears_record::yes, [&] {
        if (acl)
            trace<points::entry_data>(num(acl->length), num(acl->value), num(aclelist));
        else
            trace<KX_ACL_TP_LIST_ACL_ENTER_NULL>(num(acl), num(aclelist));
    });
    kx_int32_t status = list_acl(acl, aclelist);
    return api_leave<points>(status, [&] {
        kx_int32_t count = list_count(aclelist);
        trace<points::exit_ok>(num(status), num(count));
    });
}

extern "C" ACL_EXTERN kx_int32_t sec_list_acl_by_type(sec_acl_buffer_t acl, unsigned char type,
                                                      char *mech,
                                                      sec_acle_list_t aclelist) noexcept {
    using points = api_list_acl_by_type;
    api_enter<points>(clears_record::yes, [&] {
        kx_uint32_t wide_type = type;
        if (acl)
            trace<points::entry_data>(num(acl->length), num(acl->value), num(wide_type), text(mech),
                                      num(aclelist));
        else
            trace<KX_ACL_TP_LIST_ACL_BY_TYPE_ENTER_NULL>(num(acl), num(wide_type), text(mech),
                                                         num(aclelist));
    });
    kx_int32_t status = list_acl_by_type(acl, type, mech, aclelist);
    return api_leave<points>(status, [&] {
        kx_int32_t count = list_count(aclelist);
        trace<points::exit_ok>(num(status), num(count));
    });
}

extern "C" ACL_EXTERN void sec_release_aclelist(sec_acle_list_t aclelist) noexcept {
    using points = api_release_aclelist;
    api_enter<points>(clears_record::no, [&] {
        kx_int32_t count = list_count(aclelist);
        trace<points::entry_data>(num(aclelist), num(count));
    });
    if (aclelist && aclelist->count != 0 && aclelist->acles)
        release_list(aclelist);
    api_leave_release<points>();
}
