// Permission templates and the translation between permission strings and
// permission masks.
#ifndef KXACL_PERMS_H
#define KXACL_PERMS_H

#include <kx_acl.h>

namespace kxacl {

extern sec_perm_set_desc acl__default_perm_set;

// The set to use for a caller's set: the default set when it is null.
inline sec_perm_set_t perm_set_or_default(sec_perm_set_t set) {
    return set ? set : &acl__default_perm_set;
}

// ORs the codes of the characters of ps into *perm; reports 2650-146 at the
// first character without template. permset must not be null.
kx_int32_t sec__translate_perms(const char *ps, sec_perm_set_t permset, kx_uint32_t *perm);

// Writes the characters of the bits of pbm into perm (one per bit, ascending,
// then a NUL); reports 2650-178 at the first bit without template.
kx_int32_t sec__translate_bitmask(kx_uint32_t pbm, sec_perm_set_t permset, char *perm);

} // namespace kxacl

#endif
