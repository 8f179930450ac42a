// The help texts of kxacl; the man page kxacl.1 says the same at length.
#include "options.h"

namespace kxtool {

const char *usage_summary() {
    return "Usage: kxacl [--json] COMMAND [OPTIONS] ARGUMENTS\n"
           "\n"
           "Commands:\n"
           "  compile FILE       compile an ACL text file; --cache writes FILE.cacl\n"
           "  check FILE WHO     show what an ACL grants to a requester\n"
           "  explain FILE WHO   show which entry decides each answer for a requester\n"
           "  lint FILE          warn of entries and file states that mislead\n"
           "  diff OLD NEW       show the entries added, removed, widened and narrowed\n"
           "  install SRC DEST   deploy an ACL text file safely, with its cached file\n"
           "  list FILE          list the entries of an ACL file or buffer file\n"
           "  add BUFFER WHO     add an entry to a buffer file, or change its permissions\n"
           "  del BUFFER WHO     delete an entry from a buffer file\n"
           "  dump FILE          print an ACL in full detail\n"
           "  perms [PERMS]      translate a permission string or mask; list the templates\n"
           "  trace [FILE...]    decode the library's trace file (KX_TRACE_FILE)\n"
           "\n"
           "WHO is one of --unauthenticated, --anyother, --user MECH ID, --expanded MECH ID,\n"
           "--group NAME... (check takes several group names; explain takes several of\n"
           "these together). --owner NAME: the file must belong to NAME.\n"
           "Every command takes --json (JSON on standard output) and --help.\n"
           "Exit status: 0 success; 1 check found nothing granted, lint warned, or\n"
           "diff --grants-more found more granted; 2 failure.\n";
}

const char *command_help(command cmd) {
    switch (cmd) {
    case command::compile:
        return "Usage: kxacl compile FILE [--owner NAME] [--cache [--force]] [--templates FILE]\n"
               "                    [-o OUT]\n"
               "\n"
               "Compiles the ACL text file FILE and reports its entries. A bad line is\n"
               "reported with the library's message, which names the line.\n"
               "  --owner NAME        FILE is a name in NAME's home directory and must\n"
               "                      belong to NAME, writable by NAME only\n"
               "  --cache             also write the compiled ACL to FILE.cacl for readers;\n"
               "                      fails (exit 2) unless FILE.cacl then holds it or was\n"
               "                      current already, and says why\n"
               "  --force             with --cache: rewrite a FILE.cacl that is newer than\n"
               "                      FILE but holds another ACL (FILE was replaced by an\n"
               "                      older-dated file), or is empty or hard-linked\n"
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
    case command::explain:
        return "Usage: kxacl explain FILE [WHO...] [--owner NAME] [--templates FILE]\n"
               "                    [--text|--buffer] [--json]\n"
               "\n"
               "For each question a daemon usually asks about one requester, in its usual\n"
               "order (user; expanded; each group; anyother; unauthenticated), shows what\n"
               "the library answers, the entry that decided it (its line in a text file,\n"
               "its position in a buffer file), or why no entry applied. The answers are\n"
               "the library's own; they are not combined.\n"
               "  --user MECH ID       the requester's user identity\n"
               "  --expanded MECH ID   its expanded identity, compared byte for byte as by\n"
               "                       check --expanded\n"
               "  --group NAME...      its groups\n"
               "The anyother and unauthenticated questions are always shown.\n";
    case command::lint:
        return "Usage: kxacl lint FILE [--mech MECH]... [--read-like PERMS] [--owner NAME]\n"
               "                 [--templates FILE] [--text|--buffer] [--json]\n"
               "\n"
               "Warns of entries that do not do what they seem to, and of file and cache\n"
               "states that change what daemons read, each with a stable code, its line\n"
               "and the command that fixes it.\n"
               "  --mech MECH        a mechanism to know besides unix, krb5 and vgn2\n"
               "  --read-like PERMS  what an unauthenticated entry may grant without a\n"
               "                     warning (default: those of r q l e v in the templates)\n"
               "Exit status: 0 no warning, 1 warnings, 2 failure.\n";
    case command::diff:
        return "Usage: kxacl diff OLD NEW [--grants-more] [--templates FILE] [--text|--buffer]\n"
               "                 [--json]\n"
               "\n"
               "Compares two ACLs, text or buffer files in any mix, entry by entry: entries\n"
               "added and removed, and entries whose permissions were widened, narrowed or\n"
               "both (changed).\n"
               "  --grants-more  exit 1 when NEW grants any requester a permission that OLD\n"
               "                 does not: an entry added or given more, or an entry removed\n"
               "                 whose requesters the anyother entry of NEW gives more\n"
               "Exit status: 0 success (with --grants-more: NEW grants nothing more),\n"
               "1 NEW grants more, 2 failure.\n";
    case command::install:
        return "Usage: kxacl install SRC DEST [--owner NAME] [--mode MODE] [--cache]\n"
               "                    [--templates FILE] [--json]\n"
               "\n"
               "Deploys the ACL text file SRC as DEST so that no reader keeps the old\n"
               "permissions: compiles it first (refusing it with the library's message),\n"
               "writes it beside DEST and flushes it, gives it its owner and mode, renames\n"
               "it over DEST, sets DEST's modification time to after the rename (so that\n"
               "a cached file written before counts as stale) and flushes the directory.\n"
               "  --owner NAME   give DEST to user NAME (default: DEST's owner and group,\n"
               "                 or the running user's for a new DEST)\n"
               "  --mode MODE    the permission bits in octal, at most 0777 (default:\n"
               "                 DEST's, or 0644 less the umask)\n"
               "  --cache        write DEST.cacl at once (waiting for the next second, so\n"
               "                 that readers trust it)\n";
    case command::perms:
        return "Usage: kxacl perms [PERMS|MASK] [--string|--mask] [--templates FILE]\n"
               "\n"
               "Translates a permission string into its mask and a mask into its string.\n"
               "An argument of digits, or 0x and hex digits, is a mask unless --string is\n"
               "given. Without an argument, lists the templates with their names and help\n"
               "(the library's default set unless --templates is given).\n"
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
