// Adding and deleting entries of an ACL buffer. An edit turns the one
// sub-ACL of the entry into a tree, changes the tree, writes it back and
// splices it into the buffer in the old one's place.
#include <algorithm>
#include <cstdlib>
#include <cstring>

#include "alloc.h"
#include "buffer_format.h"
#include "byteorder.h"
#include "convert.h"
#include "entries.h"
#include "frame.h"
#include "report.h"

namespace kxacl {

namespace {

// Checks an entry to be added or deleted: its type, then what it needs.
kx_int32_t check_edited_acle(const sec_acle_t acle) {
    if (!valid_entry_type(acle->type))
        return report<MSG_2650_116>(SEC_S_BAD_ACLE, acle->type);
    // A mechanism that fills its field without a terminator is not one.
    bool mech_bad = type_has_mech(acle->type) &&
                    (acle->mech[0] == '\0' || !std::memchr(acle->mech, '\0', sizeof acle->mech));
    if (mech_bad || (type_has_id(acle->type) && !acle->id))
        return report<MSG_2650_117>(SEC_S_BAD_ACLE, acle->type);
    return SEC_S_OK;
}

// The header checks of the edits. A descriptor that has a length but no
// bytes, bytes but no length, or fewer bytes than a header is refused
// like the empty ACL is by deletion.
kx_int32_t check_edited_header(const sec_buffer_s &acl) {
    switch (inspect_header(acl)) {
    case header_state::ok:
        return SEC_S_OK;
    case header_state::no_bytes:
        return report<MSG_2650_106>(SEC_S_BAD_ACL);
    case header_state::bad_type:
        return report<MSG_2650_113>(SEC_S_BAD_ACL);
    case header_state::bad_version:
        return report<MSG_2650_114>(SEC_S_BAD_ACL);
    case header_state::foreign_order:
        return report<MSG_2650_115>(SEC_S_BAD_ACL);
    }
    return SEC_S_OK;
}

// The tree of the sub-ACL of acle's key, read from the buffer when it is
// there; the tree is freed on every path.
struct edited_subacl {
    subacl_view view{};
    bool found = false;
    sec_acltree_t tree = nullptr;
    ~edited_subacl() { sec__free_acltree(tree); }
};

kx_int32_t load_subacl(const sec_buffer_s &acl, const sec_acle_t acle, edited_subacl *s) {
    kx_int32_t rc = find_subacl_view(acl, acle->type, acle->mech, &s->view, &s->found);
    if (rc == SEC_S_OK && s->found)
        rc = sec__subacl_to_acltree(bytes_of(acl), s->view, &s->tree);
    return rc;
}

std::uint16_t stored_subacl_count(const sec_buffer_s &acl) {
    return subacl_count(bytes_of(acl));
}

void set_subacl_count(sec_buffer_s &acl, std::uint16_t count) {
    store_u16(static_cast<unsigned char *>(acl.value) + layout::at_subacl_count, count);
}

// Replaces old_length bytes at offset with the new_length bytes of
// replacement (none when null). The buffer grows before anything moves, so
// a failed growth leaves it as it was; it shrinks after the move, and a
// failed shrink keeps the larger allocation with the new, valid contents.
kx_int32_t splice(sec_buffer_s &acl, std::size_t offset, std::size_t old_length,
                  const unsigned char *replacement, std::size_t new_length, const char *routine) {
    std::size_t length = static_cast<std::size_t>(acl.length);
    std::size_t tail = length - offset - old_length;
    std::size_t result = length - old_length + new_length;
    if (result > layout::max_buffer_length)
        return no_memory(routine, result);
    if (result > length) {
        void *grown = mem_realloc(acl.value, result);
        if (!grown)
            return no_memory(routine, result);
        acl.value = grown;
    }
    auto *data = static_cast<unsigned char *>(acl.value);
    std::memmove(data + offset + new_length, data + offset + old_length, tail);
    if (new_length)
        std::memcpy(data + offset, replacement, new_length);
    acl.length = static_cast<kx_int32_t>(result);
    if (result < length) {
        void *shrunk = mem_realloc(acl.value, result);
        if (!shrunk)
            return no_memory(routine, result);
        acl.value = shrunk;
    }
    return SEC_S_OK;
}

// Where a new sub-ACL goes: right after the last sub-ACL, ahead of any
// bytes that follow it (validation leaves those alone), so that a walk by
// the sub-ACL lengths reaches it. 2650-110 when the last sub-ACL's records
// do not end where its length says: validation compares the two only for a
// sub-ACL that another one follows, so one added after it would make the
// buffer invalid.
kx_int32_t end_of_subacls(const sec_buffer_s &acl, std::size_t *end) {
    acl_bytes b = bytes_of(acl);
    *end = layout::header_size;
    subacl_view last{};
    acl_bytes last_records{};
    kx_int32_t rc = walk_subacls(b, records_bound::buffer_length,
                                 [&](const subacl_view &v, acl_bytes records, bool) {
                                     last = v;
                                     last_records = records;
                                     *end = v.end();
                                     return SEC_S_OK;
                                 });
    if (rc != SEC_S_OK || subacl_count(b) == 0)
        return rc;
    std::size_t records_end = 0;
    rc = walk_acles(
        last_records, last, [](const acle_record &) { return SEC_S_OK; }, &records_end);
    if (rc == SEC_S_OK && (!records_end_where_length_says(last, records_end) || *end > b.size))
        return report_corrupt(here(src_acl));
    return rc;
}

// The sub-ACL of acle's key written back after a change; when the buffer
// had none, it is added after the others and counted.
kx_int32_t write_back(sec_buffer_s &acl, const edited_subacl &s, const char *routine,
                      bool *removed) {
    unsigned char *fresh = nullptr;
    std::size_t fresh_length = 0;
    kx_int32_t rc = sec__acltree_to_subacl(s.tree, &fresh, &fresh_length);
    if (rc != SEC_S_OK)
        return rc;
    unique_mem<unsigned char> owned(fresh);
    *removed = !fresh;
    if (!s.found) {
        if (stored_subacl_count(acl) == layout::max_subacls)
            return no_memory(routine, static_cast<std::size_t>(acl.length) + fresh_length);
        std::size_t end = 0;
        if ((rc = end_of_subacls(acl, &end)) != SEC_S_OK)
            return rc;
        rc = splice(acl, end, 0, fresh, fresh_length, routine);
        if (rc == SEC_S_OK)
            set_subacl_count(acl, static_cast<std::uint16_t>(stored_subacl_count(acl) + 1));
        return rc;
    }
    // A sub-ACL whose length runs past the buffer's end ends at the end.
    std::size_t old_length =
        std::min<std::size_t>(s.view.length, static_cast<std::size_t>(acl.length) - s.view.offset);
    std::uint16_t count = stored_subacl_count(acl);
    rc = splice(acl, s.view.offset, old_length, fresh, fresh_length, routine);
    // Removing never grows the buffer, so the bytes have moved even when
    // the shrink failed: the count follows them.
    if (*removed)
        set_subacl_count(acl, static_cast<std::uint16_t>(count - 1));
    return rc;
}

kx_int32_t add_acle(sec_boolean_t noupdate, sec_acle_t acle, sec_acl_buffer_t acl) {
    if (!acle)
        return bad_param("sec_add_acle_to_acl", 1, acle);
    if (!acl)
        return bad_param("sec_add_acle_to_acl", 2, acl);
    kx_int32_t rc = check_edited_acle(acle);
    if (rc != SEC_S_OK)
        return rc;
    bool created_header = false;
    if (is_empty_acl(*acl)) {
        if (!new_empty_buffer(acl))
            return no_memory("sec_add_acle_to_acl", layout::header_size);
        created_header = true;
    } else if ((rc = check_edited_header(*acl)) != SEC_S_OK) {
        return rc;
    }
    edited_subacl s;
    rc = load_subacl(*acl, acle, &s);
    if (rc == SEC_S_OK)
        rc = sec__add_acle_to_tree(noupdate, acle, &s.tree);
    if (rc == SEC_S_OK && s.found && type_has_mech(acle->type)) {
        // An existing sub-ACL keeps the spelling of its stored mechanism.
        std::memset(s.tree->sat_mech, 0, sizeof s.tree->sat_mech);
        std::memcpy(s.tree->sat_mech, s.view.mech, s.view.mech_length);
    }
    bool removed = false;
    if (rc == SEC_S_OK) {
        rc = write_back(*acl, s, "sec_add_acle_to_acl", &removed);
        // An insertion always leaves an entry to write; should none come out,
        // that is our fault, and no callee gave a code to show, hence 0.
        if (rc == SEC_S_OK && removed)
            rc = internal_error(here(src_acl), 0);
    }
    if (rc != SEC_S_OK && created_header) {
        std::free(acl->value);
        acl->value = nullptr;
        acl->length = 0;
    }
    return rc;
}

kx_int32_t del_acle(sec_acle_t acle, sec_acl_buffer_t acl) {
    if (!acle)
        return bad_param("sec_del_acle_from_acl", 1, acle);
    if (!acl)
        return bad_param("sec_del_acle_from_acl", 2, acl);
    kx_int32_t rc = check_edited_acle(acle);
    if (rc == SEC_S_OK)
        rc = check_edited_header(*acl);
    if (rc != SEC_S_OK)
        return rc;
    edited_subacl s;
    rc = load_subacl(*acl, acle, &s);
    if (rc != SEC_S_OK)
        return rc;
    if (!s.found || !s.tree) {
        const char *mech = type_has_mech(acle->type) ? acle->mech : "";
        const char *id = type_has_id(acle->type) ? acle->id : "";
        return report<MSG_2650_118>(s.found ? SEC_S_BAD_ACLE : SEC_S_ACLE_NOT_FOUND, acle->type,
                                    mech, id);
    }
    rc = sec__del_acle_from_tree(acle, s.tree);
    if (rc != SEC_S_OK)
        return rc;
    bool removed = false;
    return write_back(*acl, s, "sec_del_acle_from_acl", &removed);
}

// The trace items of an entry and a descriptor, as the edits record them.
template <kx_acl_trace_point P> void trace_edit_entry(sec_acle_t acle, sec_acl_buffer_t acl) {
    sec_acle_desc e{};
    if (acle) {
        e = *acle;
        e.mech[SEC_MECH_MAX] = '\0';
    }
    kx_uint32_t type = e.type;
    traced_descriptor d(acl);
    trace<P>(num(acle), num(type), num(e.perm), text(e.mech), text(e.id), num(acl), num(d.length),
             num(d.value));
}

kx_int32_t add_acle_framed(sec_boolean_t noupdate, sec_acle_t acle, sec_acl_buffer_t acl) {
    using points = api_add_acle_to_acl;
    api_enter<points>(clears_record::yes, [&] { trace_edit_entry<points::entry_data>(acle, acl); });
    return api_leave<points>(add_acle(noupdate, acle, acl));
}

} // namespace

} // namespace kxacl

using namespace kxacl;

extern "C" ACL_EXTERN kx_int32_t sec_add_acle_to_acl(sec_acle_t acle,
                                                     sec_acl_buffer_t acl) noexcept {
    return add_acle_framed(0, acle, acl);
}

extern "C" ACL_EXTERN kx_int32_t sec_add_acle_to_acl2(sec_acle_t acle,
                                                      sec_acl_buffer_t acl) noexcept {
    return add_acle_framed(1, acle, acl);
}

extern "C" ACL_EXTERN kx_int32_t sec_del_acle_from_acl(sec_acle_t acle,
                                                       sec_acl_buffer_t acl) noexcept {
    using points = api_del_acle_from_acl;
    api_enter<points>(clears_record::yes, [&] { trace_edit_entry<points::entry_data>(acle, acl); });
    return api_leave<points>(del_acle(acle, acl));
}
