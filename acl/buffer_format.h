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

// What a reader found of the header of a buffer.
enum class header_state { ok, no_bytes, bad_type, bad_version, foreign_order };

// Checks a descriptor and the buffer type, version and byte-order mark, in
// that order. A buffer shorter than its header counts as having no bytes.
header_state inspect_header(const sec_buffer_s &acl);

// The header checks of the readers (listing, evaluation): a buffer they
// cannot take is 2650-109, one of the other byte order 2650-115.
kx_int32_t check_read_header(const sec_buffer_s &acl);

std::uint16_t subacl_count(acl_bytes b);

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

// The bytes that the records of sub-ACL v may lie in when all the sub-ACLs
// are walked: up to where the next one starts, and for the last one up to
// the buffer's end (validation bounds only the others). Overlapping
// sub-ACLs would otherwise have their records read once for each of them,
// at a cost that grows with the square of the buffer's length.
acl_bytes subacl_records_bytes(acl_bytes b, const subacl_view &v, bool last);

// One entry, read within the buffer.
struct acle_view {
    unsigned char version;
    std::uint32_t perm;
    std::uint16_t id_length;
    const char *id; // id_length bytes, or null when there are none
    std::size_t next;
    // The identifier is a text ending at its last byte: the form writers make.
    bool id_well_formed() const;
    // The identifier holds a NUL within its bytes, so it can be read as a text.
    bool id_terminated() const;
};

// Reads the entry at offset; false when it does not fit in b. Inline: the
// walks of evaluation call it once per entry.
inline bool read_acle(acl_bytes b, std::size_t offset, acle_view *v) {
    if (offset > b.size || b.size - offset < layout::acle_header_size)
        return false;
    const unsigned char *p = b.data + offset;
    v->version = p[layout::at_acle_version];
    v->perm = load_u32(p + layout::at_perm);
    v->id_length = load_u16(p + layout::at_id_length);
    if (b.size - offset - layout::acle_header_size < v->id_length)
        return false;
    v->id = v->id_length ? reinterpret_cast<const char *>(p + layout::at_id) : nullptr;
    v->next = offset + layout::acle_header_size + v->id_length;
    return true;
}

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

// 2650-110: the lengths of a buffer do not agree with its contents.
kx_int32_t report_corrupt(source_pos pos);

} // namespace kxacl

#endif
