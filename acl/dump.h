// Printing an ACL buffer for diagnosis, one catalogue message per line.
#ifndef KXACL_DUMP_H
#define KXACL_DUMP_H

#include <kx_acl.h>

#include "buffer_format.h"
#include "tree.h"

namespace kxacl {

// Prints the header line of the sub-ACL v of b and then its entries, each
// line preceded by leadspace (the entries by leadspace and a tab). A sub-ACL
// whose entries cannot be read prints the failure on standard output.
void sec__dump_subacl(acl_bytes b, const subacl_view &v, const char *leadspace);

// Prints the entries of tree in the order of its sub-ACL.
void sec__dump_acltree(sec_acltree_t tree, const char *leadspace);

// Prints one entry's line with ptplset (the default templates when null), or
// the failure that stops it from being displayed. A null entry prints nothing.
void sec__dump_acle(sec_acle_t acle, sec_perm_set_t ptplset, const char *leadspace);

} // namespace kxacl

#endif
