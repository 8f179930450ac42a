// Where the entries of an ACL text file stand: its lines, split into the
// tokens of an entry, so that what the library compiled can be traced back
// to the line that says it. Nothing here decides what an entry grants: the
// library's own listing and evaluation do.
#ifndef KXACL_TOOL_TEXT_LINES_H
#define KXACL_TOOL_TEXT_LINES_H

#include <string>
#include <string_view>
#include <vector>

#include "entries.h"
#include "options.h"

namespace kxtool {

// An entry line of ACL text, its tokens as written (the mechanism
// lowercased, as the library stores it).
struct text_entry {
    unsigned line = 0; // 1-based, counted as the library counts in its messages
    char type = 0;     // the type letter, lowercased
    std::string mech, id, perms;
};

// The entry lines of an ACL text. Lines that hold no entry, and lines that
// the library would refuse, are left out.
std::vector<text_entry> text_entries(std::string_view text);

// The path of the ACL text file of inv.input: in the home directory of
// inv.owner when one is given, as the library resolves it.
std::string text_path(const invocation &inv);

// The entry lines of the ACL text file of inv.input (in the home directory
// of inv.owner when one is given); none when the file cannot be read.
std::vector<text_entry> text_entries_of(const invocation &inv);

// The line of the text that holds the entry e, or 0 when none does.
unsigned line_of(const std::vector<text_entry> &lines, const shown_entry &e);

// Whether the text entry and the listed entry are one entry: the same type,
// mechanism and identity as the library compares them.
bool same_entry(const text_entry &t, const shown_entry &e);

} // namespace kxtool

#endif
