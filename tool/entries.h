// ACL entries as kxacl shows them: type names and letters, permission
// strings, listing lines and their JSON form, and the library's answer to a
// requester. Shared by the commands that read, compare and explain ACLs.
#ifndef KXACL_TOOL_ENTRIES_H
#define KXACL_TOOL_ENTRIES_H

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include <kx_acl.h>

#include "acl_io.h"
#include "json.h"
#include "options.h"
#include "templates.h"

namespace kxtool {

// Writes text to standard output as it is.
void print(const std::string &text);

// A mask as 0x and eight hex digits.
std::string hex_mask(std::uint32_t mask);

// The entry type code of a type letter (n, o, u, e, g); 0 for another.
unsigned char type_code(char letter);

struct type_names {
    unsigned char code;
    char letter;
    const char *name;
};
// The names of an entry type code; '?' and "unknown" for another code.
const type_names &names_of(unsigned char code);

// The permission string of a mask, or nothing when a bit has no template.
std::optional<std::string> perm_string(std::uint32_t mask, template_set &templates);

// A grant as people read it: "rw 0x00000003", "- 0x00000000" for nothing,
// "? 0x00002000" when a bit has no template.
std::string grant_text(std::uint32_t mask, template_set &templates);

// Adds "perms" (null when a bit has no template) and "mask" to an object.
void write_grant(json_writer &json, std::uint32_t mask, template_set &templates);

// An entry as the listing shows it.
struct shown_entry {
    const type_names *type;
    std::string mech, id;         // the process codeset, for people
    std::string raw_mech, raw_id; // as stored (UTF-8), for JSON
    std::optional<std::string> perms;
    std::uint32_t mask;
};

shown_entry show(const sec_acle_desc &acle, template_set &templates);

// The entries of acl in buffer order, or only those of one type (a letter)
// and, for user and expanded entries, of one mechanism.
std::vector<shown_entry> list_entries(acl_buffer &acl, template_set &templates, char type = 0,
                                      const std::string &mech = {});

// The entry as a JSON object: type, mech, id, perms and mask.
void write_entry(json_writer &json, const shown_entry &e);

// The entry's type letter, mechanism and identity, as a line of ACL text
// starts.
std::string entry_identity(const shown_entry &e);

// Lines of ACL text, columns aligned: the listing reads back as an ACL file
// whenever every mask has templates.
std::string entry_lines(const std::vector<shown_entry> &entries);

// The mask that acl grants to the requester, as the library's evaluation
// answers; nothing when no entry names it. Expanded identities are compared
// by kxacl's stand-in handler: equal byte for byte.
std::optional<std::uint32_t> evaluate(const identity &who, acl_buffer &acl);

} // namespace kxtool

#endif
