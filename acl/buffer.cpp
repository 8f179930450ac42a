// The lifecycle of ACL buffers: the empty ACL, buffers from a caller's
// bytes, conversion from the other byte order, and release.
#include <cstdlib>
#include <cstring>

#include "alloc.h"
#include "buffer_format.h"
#include "byteorder.h"
#include "frame.h"
#include "report.h"

namespace kxacl {

namespace {

kx_int32_t create_empty_acl(sec_acl_buffer_t acl) {
    if (!acl)
        return bad_param("sec_create_empty_acl", 1, acl);
    if (!new_empty_buffer(acl)) {
        acl->value = nullptr;
        return no_memory("sec_create_empty_acl", layout::header_size);
    }
    return SEC_S_OK;
}

kx_int32_t read_acl_from_data(kx_int32_t length, unsigned char *buffer, sec_acl_buffer_t acl) {
    if (length < 1)
        return bad_param("sec_read_acl_from_data", 1, static_cast<unsigned>(length));
    if (!buffer)
        return bad_param("sec_read_acl_from_data", 2, buffer);
    if (!acl)
        return bad_param("sec_read_acl_from_data", 3, acl);
    void *copy = mem_alloc(static_cast<std::size_t>(length));
    if (!copy)
        return no_memory("sec_read_acl_from_data", static_cast<std::size_t>(length));
    std::memcpy(copy, buffer, static_cast<std::size_t>(length));
    acl->length = length;
    acl->value = copy;
    return SEC_S_OK;
}

// Reverses the multi-byte fields of a buffer of the other byte order, in
// place, walking by the converted counts and lengths: each header and record
// is reversed just before the walk reads it, once it is known to lie within
// the buffer. A walk that would leave the buffer, or a sub-ACL that does not
// start where the records of the one before end, stops with 2650-110 and
// leaves the buffer partly converted.
kx_int32_t reverse_fields(unsigned char *data, std::size_t size) {
    if (size < layout::header_size)
        return report_corrupt(here(src_acl));
    reverse_u16(data + layout::at_subacl_count);
    const acl_bytes b{data, size};
    // The walks hand out read-only places within data, which is ours.
    auto writable = [&](const unsigned char *p) { return data + (p - data); };
    auto reverse_subacl_header = [&](const unsigned char *p) {
        reverse_u32(writable(p) + layout::at_subacl_length);
        reverse_u32(writable(p) + layout::at_acle_count);
    };
    auto reverse_record = [&](const unsigned char *p) {
        reverse_u32(writable(p) + layout::at_perm);
        reverse_u16(writable(p) + layout::at_id_length);
    };
    kx_int32_t rc = walk_subacls(
        b, records_bound::buffer_length,
        [&](const subacl_view &v, acl_bytes records, bool last) {
            std::size_t end = 0;
            kx_int32_t walked = walk_acles(
                records, v, [](const acle_record &) { return SEC_S_OK; }, &end, reverse_record);
            if (walked == SEC_S_OK && !last && !records_end_where_length_says(v, end))
                return report_corrupt(here(src_acl));
            return walked;
        },
        reverse_subacl_header);
    if (rc == SEC_S_OK)
        data[layout::at_byte_order] = layout::host_order;
    return rc;
}

kx_int32_t convert_acl_to_host(sec_boolean_t verify, sec_acl_buffer_t acl) {
    if (!acl)
        return bad_param("sec_convert_acl_to_host", 1, acl);
    // The type, version and mark must lie within the buffer to be read; a
    // shorter buffer in host order is left to validation to refuse.
    auto *data = static_cast<unsigned char *>(acl->value);
    if (acl->length < 3 || !data || data[layout::at_buffer_type] != layout::buffer_type ||
        data[layout::at_version] != layout::version)
        return report<MSG_2650_109>(SEC_S_BAD_ACL);
    if (data[layout::at_byte_order] == layout::host_order) {
        if (wanted<KX_ACL_TP_CONVERT_HOST_ORDER>())
            trace<KX_ACL_TP_CONVERT_HOST_ORDER>();
        return verify ? sec__check_acl_buffer(acl) : SEC_S_OK;
    }
    if (wanted<KX_ACL_TP_CONVERT_SWAP>())
        trace<KX_ACL_TP_CONVERT_SWAP>();
    return reverse_fields(data, static_cast<std::size_t>(acl->length));
}

kx_int32_t release_acl(sec_acl_buffer_t acl) {
    if (!acl || (acl->length == 0 && !acl->value))
        return SEC_S_OK;
    // Only bytes that start like an ACL buffer are freed: anything else is
    // not ours to free.
    if (acl->value && acl->length > 0 &&
        static_cast<unsigned char *>(acl->value)[0] == layout::buffer_type) {
        std::free(acl->value);
        acl->value = nullptr;
        acl->length = 0;
        return SEC_S_OK;
    }
    return report<MSG_2650_106>(SEC_S_BAD_ACL);
}

} // namespace

} // namespace kxacl

using namespace kxacl;

extern "C" ACL_EXTERN kx_int32_t sec_create_empty_acl(sec_acl_buffer_t acl) noexcept {
    return create_empty_acl(acl);
}

extern "C" ACL_EXTERN kx_int32_t sec_read_acl_from_data(kx_int32_t length, unsigned char *buffer,
                                                        sec_acl_buffer_t acl) noexcept {
    using points = api_read_acl_from_data;
    api_enter<points>(clears_record::yes,
                      [&] { trace<points::entry_data>(num(length), num(buffer), num(acl)); });
    return api_leave<points>(read_acl_from_data(length, buffer, acl));
}

extern "C" ACL_EXTERN kx_int32_t sec_convert_acl_to_host(sec_boolean_t verify,
                                                         sec_acl_buffer_t acl) noexcept {
    using points = api_convert_acl_to_host;
    api_enter<points>(clears_record::yes, [&] {
        traced_descriptor d(acl);
        trace<points::entry_data>(num(verify), num(acl), num(d.length), num(d.value));
    });
    return api_leave<points>(convert_acl_to_host(verify, acl));
}

extern "C" ACL_EXTERN kx_int32_t sec_release_acl(sec_acl_buffer_t acl) noexcept {
    using points = api_release_acl;
    api_enter<points>(clears_record::yes, [&] {
        traced_descriptor d(acl);
        trace<points::entry_data>(num(acl), num(d.length), num(d.value));
    });
    kx_int32_t status = release_acl(acl);
    api_leave_release<points>();
    return status;
}
