// The ACL buffer: one self-contained block of bytes in which ACLs travel,
// are stored and are evaluated. Nothing is aligned and there is no padding.
//
// Buffer header (5 bytes)
//   offset size  field
//   0      1     buffer type, always 0x85
//   1      1     version, always 1
//   2      1     byte-order mark: 2 for little-endian, the only host order
//   3      2     sub-ACL count
// then the sub-ACLs, back to back.
//
// Sub-ACL header (10 + mechanism length bytes)
//   0      4     sub-ACL length: header plus all its entries
//   4      1     entry type of all its entries: 1, 2, 4, 8 or 16
//   5      4     entry count
//   9      1     mechanism length, its NUL included (0 but for types 4, 8)
//   10     n     mechanism and its NUL (types 4 and 8)
// then the entries.
//
// Entry (7 + identifier length bytes)
//   0      1     entry version, always 1
//   1      4     permission mask
//   5      2     identifier length, its NUL included (0 for types 1, 2)
//   7      n     identifier and its NUL (types 4, 8, 16)
//
// User and group entries stand in ascending order of identifier, compared
// case-insensitively in the POSIX locale and never equal; expanded entries
// in the order they were added. Evaluation stops early on that order.
//
// Buffers from outside may be anything: every reader below checks each
// field against the buffer's length before it reads it, so a count or a
// length that leads past the end is reported, never followed.
#ifndef KXACL_BUFFER_FORMAT_H
#define KXACL_BUFFER_FORMAT_H

#include <cstddef>
#include <cstdint>

#include <kx_acl.h>

#include "byteorder.h"
#include "report.h"

namespace kxacl {

namespace layout {
inline constexpr std::size_t header_size = 5;
inline constexpr std::size_t at_buffer_type = 0, at_version = 1, at_byte_order = 2,
                             at_subacl_count = 3;
inline constexpr std::size_t subacl_header_size = 10;
inline constexpr std::size_t at_subacl_length = 0, at_subacl_type = 4, at_acle_count = 5,
                             at_mech_length = 9, at_mech = 10;
inline constexpr std::size_t acle_header_size = 7;
inline constexpr std::size_t at_acle_version = 0, at_perm = 1, at_id_length = 5, at_id = 7;

inline constexpr unsigned char buffer_type = 0x85;
inline constexpr unsigned char version = 1;
inline constexpr unsigned char host_order = 2;
inline constexpr unsigned char acle_version = 1;

// Widths of the format: what a writer must refuse rather than truncate.
inline constexpr std::size_t max_subacls = 0xffff;
inline constexpr std::size_t max_mech_length = SEC_MECH_MAX + 1;
inline constexpr std::size_t max_id_length = 0xffff; // with its NUL
inline constexpr std::size_t max_buffer_length = 0x7fffffff;
} // namespace layout

// The bytes of a buffer, with its length as an unsigned size.
struct acl_bytes {
    const unsigned char *data;
    std::size_t size;
};
inline acl_bytes bytes_of(const sec_buffer_s &acl) {
    return {static_cast<const unsigned char *>(acl.value),
            acl.length > 0 ? static_cast<std::size_t>(acl.length) : 0};
}

// The empty ACL: no bytes and no length, which listing and adding accept.
inline bool is_empty_acl(const sec_buffer_s &acl) {
    return acl.length == 0 && !acl.value;
}

// What a reader found of the header of a buffer.
enum class header_state { ok, no_bytes, bad_type, bad_version, foreign_order };

// Checks a descriptor and the buffer type, version and byte-order mark, in
// that order. A buffer shorter than its header counts as having no bytes.
header_state inspect_header(const sec_buffer_s &acl);

// The header checks of the readers (listing, evaluation): a buffer they
// cannot take is 2650-109, one of the other byte order 2650-115.
kx_int32_t check_read_header(const sec_buffer_s &acl);

std::uint16_t subacl_count(acl_bytes b);

// 2650-110: the lengths of a buffer do not agree with its contents.
kx_int32_t report_corrupt(source_pos pos);

// One sub-ACL header, read within the buffer.
struct subacl_view {
    std::size_t offset;   // of its length field
    std::uint32_t length; // as stored
    unsigned char type;
    std::uint32_t count; // entries, as stored
    unsigned char mech_length;
    const char *mech;        // mech_length bytes, or null when there are none
    std::size_t first_entry; // offset of its first entry
    // Where the next sub-ACL starts by this one's length (a 32-bit length
    // added to an offset below 2 GiB cannot wrap a 64-bit size).
    std::size_t end() const { return offset + length; }
};

// Reads the sub-ACL header at offset; false when it does not fit in b.
bool read_subacl(acl_bytes b, std::size_t offset, subacl_view *v);

// A sub-ACL length that covers the sub-ACL's own header and mechanism: a
// shorter one leads the walk to the same bytes again (a length of 0 to the
// same sub-ACL, as many times as the count says), so no sub-ACL can follow.
bool subacl_length_covers_header(const subacl_view &v);

// ---- walks -----------------------------------------------------------------
//
// Every reader of a buffer walks it through the two walks below: the
// sub-ACLs one after the other by their lengths, and the records of one
// sub-ACL one after the other by their identifier lengths. Counts and
// lengths are never trusted: whatever the rule, a header or record that
// would run past the bytes the walk may read ends it with 2650-110.

// Returned by a visitor to end a walk early and successfully; never a status.
inline constexpr kx_int32_t walk_stop = -1;

// Where the records of a sub-ACL may lie.
enum class records_bound {
    // Anywhere up to the buffer's length.
    buffer_length,
    // Up to where the next sub-ACL starts by this one's length; the last
    // one's up to the buffer's length. A walk of all the sub-ACLs uses it,
    // so that overlapping sub-ACLs do not have their records read once for
    // each of them, at a cost that grows with the square of the length.
    next_subacl,
};

// The bytes that the records of sub-ACL v (the last one when last) may lie in.
inline acl_bytes records_bytes(acl_bytes b, const subacl_view &v, records_bound bound, bool last) {
    if (bound == records_bound::buffer_length || last)
        return b;
    return {b.data, v.end() < b.size ? v.end() : b.size};
}

// Turns a visitor's result into the walk's: walk_stop ends it successfully.
inline kx_int32_t walk_result(kx_int32_t rc) {
    return rc == walk_stop ? SEC_S_OK : rc;
}

// Calls visit(v, records, last) for each sub-ACL in buffer order, records
// being the bytes its records may lie in by bound, until visit returns
// anything but SEC_S_OK. The header of b must have been accepted. A sub-ACL
// whose length does not cover its own header can have no sub-ACL after it.
// prepare(p) is called on each sub-ACL header before it is read (conversion
// from the other byte order reverses its fields there).
struct no_prepare {
    void operator()(const unsigned char *) const {}
};
template <typename Visit, typename Prepare = no_prepare>
kx_int32_t walk_subacls(acl_bytes b, records_bound bound, Visit visit, Prepare prepare = {}) {
    const unsigned count = subacl_count(b);
    std::size_t offset = layout::header_size;
    for (unsigned i = 0; i < count; ++i) {
        const bool last = i + 1 == count;
        if (offset <= b.size && b.size - offset >= layout::subacl_header_size)
            prepare(b.data + offset);
        subacl_view v;
        if (!read_subacl(b, offset, &v))
            return report_corrupt(here(src_acl));
        kx_int32_t rc = visit(v, records_bytes(b, v, bound, last), last);
        if (rc != SEC_S_OK)
            return walk_result(rc);
        if (!last && !subacl_length_covers_header(v))
            return report_corrupt(here(src_acl));
        offset = v.end();
    }
    return SEC_S_OK;
}

// One record met by a walk. The identifier field is id_length bytes at id;
// readable is how many bytes may be read from id on (to the end of the
// walk's bytes: comparisons read eight at a time). Fields other than the
// identifier length are read only when wanted.
struct acle_record {
    const unsigned char *at;
    std::size_t id_length;
    const char *id;
    std::size_t readable;
    unsigned char version() const { return at[layout::at_acle_version]; }
    std::uint32_t perm() const { return load_u32(at + layout::at_perm); }
    // The identifier is a text ending at its last byte: the form writers make.
    bool id_well_formed() const;
    // The identifier holds a NUL within its bytes, so it can be read as a text.
    bool id_terminated() const;
};

// What a walk of records demands of each identifier field besides lying
// within the walk's bytes.
enum class id_rule {
    as_stored,
    // Ends in its NUL, so that it can be read as a text: no writer makes
    // another (validation refuses it with 2650-127), and checking that one
    // byte keeps a walk to a single pass over the identifier, the
    // comparison's own. Evaluation walks so.
    ends_in_nul,
};

// Calls visit(record) for the records of sub-ACL v in stored order, within
// records (from records_bytes), until visit returns anything but SEC_S_OK.
// When the walk ends with every record visited, *end is where the last one
// ends. prepare(p) is called on each record before it is read. Inline: the
// walks of evaluation, on the path of every request, step through it by
// pointer, every record's place depending on the length read from the one
// before.
template <id_rule Ids = id_rule::as_stored, typename Visit, typename Prepare = no_prepare>
kx_int32_t walk_acles(acl_bytes records, const subacl_view &v, Visit visit,
                      std::size_t *end = nullptr, Prepare prepare = {}) {
    const unsigned char *const limit = records.data + records.size;
    if (v.count != 0 && v.first_entry > records.size)
        return report_corrupt(here(src_acl));
    const unsigned char *at = records.data + v.first_entry;
    for (std::uint32_t left = v.count; left != 0; --left) {
        if (static_cast<std::size_t>(limit - at) < layout::acle_header_size)
            return report_corrupt(here(src_acl));
        prepare(at);
        const std::size_t id_length = load_u16(at + layout::at_id_length);
        const unsigned char *id = at + layout::at_id;
        const auto readable = static_cast<std::size_t>(limit - id);
        if (id_length > readable ||
            (Ids == id_rule::ends_in_nul && (id_length == 0 || id[id_length - 1] != '\0')))
            return report_corrupt(here(src_acl));
        kx_int32_t rc =
            visit(acle_record{at, id_length, reinterpret_cast<const char *>(id), readable});
        if (rc != SEC_S_OK)
            return walk_result(rc);
        at = id + id_length;
    }
    if (end)
        *end = static_cast<std::size_t>(at - records.data);
    return SEC_S_OK;
}

// The records of sub-ACL v, walked to records_end, end where its length
// says: the rule of every sub-ACL but the last in a valid buffer, where the
// next one starts.
bool records_end_where_length_says(const subacl_view &v, std::size_t records_end);

// The mechanism of a user or expanded sub-ACL equals mech (of mech_size
// bytes, its NUL included), ignoring case.
bool subacl_mech_equals(const subacl_view &v, const char *mech, std::size_t mech_size);

// Validates the structure of a buffer whose header has been accepted and
// which is in host byte order; reports the first fault found.
kx_int32_t sec__check_acl_buffer(sec_acl_buffer_t acl);

// Stores through subacl the first sub-ACL of type (and, for types 4 and 8,
// of mechanism mech, ignoring case), or null when there is none. Reports
// 2650-110 when the sub-ACLs run past the end of the buffer before then.
kx_int32_t sec__find_subacl(const sec_acl_buffer_t acl, const unsigned char type, const char *mech,
                            unsigned char **subacl);

// The same, as a view of the sub-ACL found; v->length is 0 when none is.
kx_int32_t find_subacl_view(const sec_buffer_s &acl, unsigned char type, const char *mech,
                            subacl_view *v, bool *found);

// Makes acl own a new buffer without sub-ACLs; false when memory ran out,
// with acl untouched. Reports nothing: callers name their own routine.
bool new_empty_buffer(sec_buffer_s *acl);

} // namespace kxacl

#endif
