// Moving entries between sub-ACLs of a buffer, entry trees and entry lists.
#ifndef KXACL_CONVERT_H
#define KXACL_CONVERT_H

#include <kx_acl.h>

#include "buffer_format.h"
#include "tree.h"

namespace kxacl {

// Builds a tree from the sub-ACL v of buffer b, reading nothing outside b.
// Entries are taken without codeset conversion; a later record of an
// identity already read gives that entry its mask. *tree is null on failure
// and for a sub-ACL without entries.
kx_int32_t sec__subacl_to_acltree(acl_bytes b, const subacl_view &v, sec_acltree_t *tree);

// Writes the entries of tree as one new sub-ACL (freed with free) into
// *subacl, which stays null when the tree holds no entry. *length is its size.
kx_int32_t sec__acltree_to_subacl(const sec_acltree_t tree, unsigned char **subacl,
                                  std::size_t *length);

// Builds a whole buffer from count trees, the last tree's sub-ACL first,
// into acl (overwritten). On failure acl is the empty ACL.
kx_int32_t sec__acltrees_to_acl(sec_acltree_t *acltrees, kx_int32_t count, sec_acl_buffer_t acl);

// Moves the tree's entries, in sub-ACL order, to the end of the list, each
// as an entry of its own; the tree's nodes keep null entries.
kx_int32_t sec__acltree_to_aclelist(sec_acltree_t tree, sec_acle_list_t aclelist);

// Appends the entries of the sub-ACL v of b to the list.
kx_int32_t append_subacl_to_list(acl_bytes b, const subacl_view &v, sec_acle_list_t list);

} // namespace kxacl

#endif
