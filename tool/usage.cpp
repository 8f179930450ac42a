// The help texts of kxacl; the man page kxacl.1 says the same at length.
#include "options.h"

namespace kxtool {

const char *usage_summary() {
    return "Usage: kxacl [--json] COMMAND [OPTIONS] ARGUMENTS\n"
           "\n"
           "Commands:\n"
           "  compile FILE       compile an ACL text file; --cache writes FILE.cacl\n"
           "  check FILE WHO     show what an ACL grants to a requester\n"
           "  list FILE          list the entries of an ACL file or buffer file\n"
           "  add BUFFER WHO     add an entry to a buffer file, or change its permissions\n"
           "  del BUFFER WHO     delete an entry from a buffer file\n"
           "  dump FILE          print an ACL in full detail\n"
           "  perms [PERMS]      translate a permission string or mask; list the templates\n"
           "  trace [FILE...]    decode the library's trace file (KX_TRACE_FILE)\n"
           "\n"
           "WHO is one of --unauthenticated, --anyother, --user MECH ID, --expanded MECH ID,\n"
           "--group NAME... (check takes several group names).\n"
           "Every command takes --json (JSON on standard output) and --help.\n"
           "Exit status: 0 success, 1 check found nothing granted, 2 failure.\n";
}

const char *command_help(command cmd) {
    switch (cmd) {
    case command::compile:
        return "Usage: kxacl compile FILE [--user NAME] [--cache] [--templates FILE] [-o OUT]\n"
               "\n"
               "Compiles the ACL text file FILE and reports its entries. A bad line is\n"
               "reported with the library's message, which names the line.\n"
               "  --user NAME, --owner NAME  FILE is a name in NAME's home directory and must\n"
               "                      belong to NAME, writable by NAME only\n"
               "  --cache             also write the compiled ACL to FILE.cacl for readers\n"
               "  --templates FILE    the permission templates of the file (see perms --help)\n"
               "  -o, --output OUT    write the compiled buffer to OUT\n"
               "  --json              report as JSON\n";
    case command::check:
        return "Usage: kxacl check FILE WHO [--owner NAME] [--templates FILE] [--text|--buffer]\n"
               "\n"
               "Prints the permissions that the ACL of FILE grants to one requester, and\n"
               "their mask. FILE is read through its cached compiled file when that is\n"
               "current. Entry types are not combined: a user without a user entry is\n"
               "not given the anyother entry's permissions.\n"
               "  --unauthenticated       the unauthenticated entry\n"
               "  --anyother              the anyother entry\n"
               "  --user MECH ID          the user ID of mechanism MECH\n"
               "  --expanded MECH ID      an expanded entry whose identity is ID exactly\n"
               "  --group NAME...         the group entries of the NAMEs (all arguments up\n"
               "                          to the next option)\n"
               "  --text, --buffer        take FILE as ACL text or as a compiled buffer\n"
               "                          (default: by its first byte)\n"
               "Exit status: 0 something granted, 1 nothing granted, 2 failure.\n";
    case command::list:
        return "Usage: kxacl list FILE [--type TYPE] [--mech MECH] [--owner NAME]\n"
               "                  [--templates FILE] [--text|--buffer] [--json]\n"
               "\n"
               "Lists the entries of an ACL text file or buffer file as lines of ACL text:\n"
               "sub-ACL by sub-ACL, users and groups in identity order.\n"
               "  --type TYPE   only entries of TYPE: n, o, u, e, g or unauthenticated,\n"
               "                anyother, user, expanded, group\n"
               "  --mech MECH   with --type user or expanded: only mechanism MECH\n";
    case command::add:
        return "Usage: kxacl add BUFFER WHO [--perms PERMS] [--new] [--templates FILE] [-o OUT]\n"
               "\n"
               "Adds an entry to the compiled buffer file BUFFER, or gives an existing\n"
               "entry of the same identity the new permissions, and writes the file back\n"
               "whole through a rename. A cached compiled file (.cacl) is never edited.\n"
               "  --perms PERMS   permission characters, or a mask such as 0x3 (default none)\n"
               "  --new           fail when the entry exists already\n"
               "  -o, --output OUT  write the result to OUT instead of BUFFER\n"
               "WHO takes one identity: --unauthenticated, --anyother, --user MECH ID,\n"
               "--expanded MECH ID or --group NAME.\n";
    case command::del:
        return "Usage: kxacl del BUFFER WHO [-o OUT]\n"
               "\n"
               "Deletes the entry of WHO from the compiled buffer file BUFFER and writes\n"
               "the file back whole through a rename; a sub-ACL left empty is removed.\n"
               "WHO takes one identity: --unauthenticated, --anyother, --user MECH ID,\n"
               "--expanded MECH ID or --group NAME.\n";
    case command::dump:
        return "Usage: kxacl dump FILE [--owner NAME] [--templates FILE] [--text|--buffer]\n"
               "\n"
               "Prints every byte-level field of the ACL of FILE, as the library's dump\n"
               "writes it. With --json, its lines as an array of strings.\n";
    case command::perms:
        return "Usage: kxacl perms [PERMS|MASK] [--string|--mask] [--templates FILE]\n"
               "\n"
               "Translates a permission string into its mask and a mask into its string.\n"
               "An argument of digits, or 0x and hex digits, is a mask unless --string is\n"
               "given. Without an argument, lists the templates.\n"
               "\n"
               "A template file holds one permission per line: CHAR BIT NAME HELP, where\n"
               "CHAR is one printable character (not '#'), BIT a bit number 0 to 31, NAME\n"
               "one word of at most 13 bytes and HELP the rest of the line (at most 63\n"
               "bytes). Blank lines and lines starting with '#' are ignored.\n";
    case command::trace:
        return "Usage: kxacl trace [FILE...] [--follow] [--pid PID] [--thread TID]\n"
               "                   [--category NAME] [--point POINT] [--templates FILE] [--json]\n"
               "\n"
               "Decodes the records that the library wrote to its trace file (see\n"
               "KX_TRACE_FILE and KX_TRACE_LEVELS in kxacl(1)): one line per record with\n"
               "its local time, thread, category, point and every item by name. FILE is\n"
               "read whole, standard input without FILE or for '-'. A line that is not a\n"
               "record of the library is shown raw, after \"raw: \".\n"
               "  --follow          keep reading FILE as it grows\n"
               "  --pid PID         only the threads of process PID\n"
               "  --thread TID      only thread TID\n"
               "  --category NAME   only category NAME: Errors, Info, API, Buffer, Perf\n"
               "  --point POINT     only POINT: an id, a name such as sec_read_acl_file:exit,\n"
               "                    or a function or step such as read\n"
               "  --templates FILE  show permission masks with the letters of FILE\n"
               "  --json            one JSON object per record (JSON Lines)\n"
               "Filters take comma-separated lists and may be repeated.\n"
               "Exit status: 0 every line decoded, 1 some shown raw, 2 failure.\n";
    case command::none:
        break;
    }
    return usage_summary();
}

} // namespace kxtool
