// Reading the layout of ACL buffers: header inspection, sub-ACL and entry
// readers bounded by the buffer's length, validation and sub-ACL lookup.
#include "buffer_format.h"

#include <algorithm>
#include <cstring>

#include <kx_cu.h>

#include "alloc.h"
#include "byteorder.h"
#include "posix_case.h"
#include "entries.h"
#include "report.h"

namespace kxacl {

header_state inspect_header(const sec_buffer_s &acl) {
    if (acl.length < static_cast<kx_int32_t>(layout::header_size) || !acl.value)
        return header_state::no_bytes;
    const auto *p = static_cast<const unsigned char *>(acl.value);
    if (p[layout::at_buffer_type] != layout::buffer_type)
        return header_state::bad_type;
    if (p[layout::at_version] != layout::version)
        return header_state::bad_version;
    if (p[layout::at_byte_order] != layout::host_order)
        return header_state::foreign_order;
    return header_state::ok;
}

kx_int32_t check_read_header(const sec_buffer_s &acl) {
    switch (inspect_header(acl)) {
    case header_state::ok:
        return SEC_S_OK;
    case header_state::foreign_order:
        return report<MSG_2650_115>(SEC_S_BAD_ACL);
    default:
        return report<MSG_2650_109>(SEC_S_BAD_ACL);
    }
}

std::uint16_t subacl_count(acl_bytes b) {
    return load_u16(b.data + layout::at_subacl_count);
}

bool read_subacl(acl_bytes b, std::size_t offset, subacl_view *v) {
    if (offset > b.size || b.size - offset < layout::subacl_header_size)
        return false;
    const unsigned char *p = b.data + offset;
    v->offset = offset;
    v->length = load_u32(p + layout::at_subacl_length);
    v->type = p[layout::at_subacl_type];
    v->count = load_u32(p + layout::at_acle_count);
    v->mech_length = p[layout::at_mech_length];
    if (b.size - offset - layout::subacl_header_size < v->mech_length)
        return false;
    v->mech = v->mech_length ? reinterpret_cast<const char *>(p + layout::at_mech) : nullptr;
    v->first_entry = offset + layout::subacl_header_size + v->mech_length;
    return true;
}

bool subacl_length_covers_header(const subacl_view &v) {
    return v.length >= v.first_entry - v.offset;
}

bool acle_record::id_well_formed() const {
    // Bounded: a field without NUL may end the buffer.
    return id_length > 0 && strnlen(id, id_length) + 1 == id_length;
}

bool acle_record::id_terminated() const {
    return id_length > 0 && std::memchr(id, '\0', id_length) != nullptr;
}

bool subacl_mech_equals(const subacl_view &v, const char *mech, std::size_t mech_size) {
    // The stored NUL must lie within the field, so the comparison ends there.
    return mech && v.mech && std::memchr(v.mech, '\0', v.mech_length) &&
           kx::posix_case::compare(mech, mech_size, v.mech, v.mech_length) == 0;
}

bool new_empty_buffer(sec_buffer_s *acl) {
    auto *data = static_cast<unsigned char *>(mem_alloc(layout::header_size));
    if (!data)
        return false;
    data[layout::at_buffer_type] = layout::buffer_type;
    data[layout::at_version] = layout::version;
    data[layout::at_byte_order] = layout::host_order;
    store_u16(data + layout::at_subacl_count, 0);
    acl->value = data;
    acl->length = layout::header_size;
    return true;
}

kx_int32_t report_corrupt(source_pos pos) {
    return report<MSG_2650_110>(SEC_S_BAD_ACL, pos.file, pos.line);
}

namespace {

// Checks one entry of a validated sub-ACL of the given type.
kx_int32_t check_acle(const acle_record &e, unsigned char type) {
    if (e.version() != layout::acle_version) {
        source_pos pos = here(src_acl);
        return report<MSG_2650_125>(SEC_S_BAD_ACLE, e.version(), pos.file, pos.line);
    }
    if (!type_has_id(type) && e.id_length != 0) {
        source_pos pos = here(src_acl);
        return report<MSG_2650_126>(SEC_S_BAD_ACLE, 0, pos.file, pos.line);
    }
    if (type_has_id(type) && !e.id_well_formed()) {
        source_pos pos = here(src_acl);
        return report<MSG_2650_127>(SEC_S_BAD_ACLE, 0, pos.file, pos.line);
    }
    return SEC_S_OK;
}

// Checks a sub-ACL header. Mechanisms longer than an entry can hold are
// refused here, so that no later copy into an entry can overflow it.
kx_int32_t check_subacl_header(const subacl_view &v) {
    if (!valid_entry_type(v.type)) {
        source_pos pos = here(src_acl);
        return report<MSG_2650_120>(SEC_S_BAD_ACL, v.type, pos.file, pos.line);
    }
    if (!type_has_mech(v.type)) {
        if (v.mech_length != 0) {
            source_pos pos = here(src_acl);
            return report<MSG_2650_121>(SEC_S_BAD_ACL, v.type, pos.file, pos.line);
        }
        if (!type_has_id(v.type) && v.count > 1) {
            source_pos pos = here(src_acl);
            return report<MSG_2650_122>(SEC_S_BAD_ACL, pos.file, pos.line);
        }
        return SEC_S_OK;
    }
    if (v.mech_length < 2 || v.mech_length > layout::max_mech_length) {
        source_pos pos = here(src_acl);
        return report<MSG_2650_123>(SEC_S_BAD_ACL, v.mech_length, pos.file, pos.line);
    }
    if (strnlen(v.mech, v.mech_length) + 1 != v.mech_length) {
        // The field may hold no NUL at all: show only its own bytes.
        char shown[layout::max_mech_length + 1] = {};
        std::memcpy(shown, v.mech, v.mech_length);
        source_pos pos = here(src_acl);
        return report<MSG_2650_124>(SEC_S_BAD_ACL, static_cast<const char *>(shown), pos.file,
                                    pos.line);
    }
    return SEC_S_OK;
}

} // namespace

bool records_end_where_length_says(const subacl_view &v, std::size_t records_end) {
    return records_end == v.end();
}

kx_int32_t sec__check_acl_buffer(sec_acl_buffer_t acl) {
    if (acl->length < static_cast<kx_int32_t>(layout::header_size)) {
        source_pos pos = here(src_acl);
        return report<MSG_2650_119>(SEC_S_BAD_ACL, acl->length, pos.file, pos.line);
    }
    acl_bytes b = bytes_of(*acl);
    return walk_subacls(
        b, records_bound::buffer_length, [&](const subacl_view &v, acl_bytes records, bool last) {
            kx_int32_t rc = check_subacl_header(v);
            std::size_t end = 0;
            if (rc == SEC_S_OK)
                rc = walk_acles(
                    records, v, [&](const acle_record &e) { return check_acle(e, v.type); }, &end);
            if (rc != SEC_S_OK)
                return rc;
            // Each sub-ACL is followed by the next where its
            // length says, and lies within the buffer.
            if ((!last && !records_end_where_length_says(v, end)) || v.end() > b.size)
                return report_corrupt(here(src_acl));
            return SEC_S_OK;
        });
}

kx_int32_t find_subacl_view(const sec_buffer_s &acl, unsigned char type, const char *mech,
                            subacl_view *v, bool *found) {
    *found = false;
    *v = subacl_view{};
    acl_bytes b = bytes_of(acl);
    std::size_t mech_size = type_has_mech(type) && mech ? std::strlen(mech) + 1 : 0;
    return walk_subacls(
        b, records_bound::buffer_length, [&](const subacl_view &s, acl_bytes, bool) {
            if (s.type != type || (type_has_mech(type) && !subacl_mech_equals(s, mech, mech_size)))
                return SEC_S_OK;
            if (s.end() > b.size)
                return report_corrupt(here(src_acl));
            *v = s;
            *found = true;
            return walk_stop;
        });
}

kx_int32_t sec__find_subacl(const sec_acl_buffer_t acl, const unsigned char type, const char *mech,
                            unsigned char **subacl) {
    *subacl = nullptr;
    subacl_view v;
    bool found = false;
    kx_int32_t rc = find_subacl_view(*acl, type, mech, &v, &found);
    if (rc == SEC_S_OK && found)
        *subacl = static_cast<unsigned char *>(acl->value) + v.offset;
    return rc;
}

} // namespace kxacl
