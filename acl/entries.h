// ACL entries: creating, releasing and displaying them.
#ifndef KXACL_ENTRIES_H
#define KXACL_ENTRIES_H

#include <cstddef>
#include <memory>

#include <kx_acl.h>

namespace kxacl {

// True for the five entry type codes.
inline bool valid_entry_type(unsigned type) {
    return type == SEC_ACLE_UNAUTHENTICATED || type == SEC_ACLE_ANYOTHER || type == SEC_ACLE_USER ||
           type == SEC_ACLE_EXPANDED || type == SEC_ACLE_GROUP;
}
// User and expanded entries carry a mechanism.
inline bool type_has_mech(unsigned type) {
    return type == SEC_ACLE_USER || type == SEC_ACLE_EXPANDED;
}
// User, expanded and group entries carry an identity.
inline bool type_has_id(unsigned type) {
    return type_has_mech(type) || type == SEC_ACLE_GROUP;
}

// The letter of an entry type in ACL files and dumps ('?' for no type).
char type_letter(unsigned type);

// Builds an entry from checked values. With translate, mech and id are in
// the process codeset and are converted to UTF-8; without, they are copied.
// *acle is null after any failure.
kx_int32_t sec__create_acle(unsigned char type, kx_uint32_t perm, const char *mech, const char *id,
                            sec_boolean_t translate, sec_acle_t *acle);

// A copy of acle's permission, type and mechanism and, when id_size is not
// 0, of the id_size bytes at id (a NUL included) as its identifier, in one
// block with the identifier right behind the record; null when memory ran
// out (nothing reported). release_acle releases it like any other entry.
sec_acle_t copy_acle_in_one_block(const sec_acle_desc &acle, const char *id, std::size_t id_size);

// The bytes that copy_acle_in_one_block asks for.
std::size_t one_block_size(std::size_t id_size);

// Releases an entry and its identity without trace points.
void release_acle(sec_acle_t acle);

struct acle_deleter {
    void operator()(sec_acle_t acle) const noexcept { release_acle(acle); }
};
// An entry released on every path unless handed on.
using unique_acle = std::unique_ptr<sec_acle_desc, acle_deleter>;

} // namespace kxacl

#endif
