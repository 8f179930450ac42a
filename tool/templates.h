// Permission template files: the permissions of a resource, one per line.
//
//   # CHAR BIT NAME HELP...
//   r  0  read    Read the resource
//   w  1  write   Change the resource
//
// CHAR is one printable ASCII character other than '#'; BIT is the bit
// number, 0 to 31; NAME is one word of at most 13 bytes; HELP is the rest of
// the line, at most 63 bytes, and may be empty. Blank lines and lines whose
// first non-blank character is '#' are ignored. Characters and bits are
// unique within a file, which must hold at least one template.
#ifndef KXACL_TOOL_TEMPLATES_H
#define KXACL_TOOL_TEMPLATES_H

#include <string>
#include <string_view>
#include <vector>

#include <kx_acl.h>

namespace kxtool {

// A template set that owns its templates.
struct template_set {
    std::vector<sec_perm_desc> perms;
    sec_perm_set_desc set{};

    // The set to hand to the library; NULL (the default set) when empty.
    sec_perm_set_t get();
};

// The library's default templates with their names and help texts, for
// listing: the library itself is handed NULL for them.
template_set default_templates();

// Parses the text of a template file into set. On failure returns false
// and describes the first bad line in error as "line N: reason".
bool parse_templates(std::string_view text, template_set &set, std::string &error);

} // namespace kxtool

#endif
