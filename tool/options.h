// The command line of kxacl: what the user asked for, as plain values.
// Parsing is separate from running so that it can be tested and fuzzed on
// its own; it touches no file and calls nothing of the library.
#ifndef KXACL_TOOL_OPTIONS_H
#define KXACL_TOOL_OPTIONS_H

#include <optional>
#include <span>
#include <string>
#include <vector>

namespace kxtool {

enum class command {
    none,
    compile,
    check,
    explain,
    list,
    lint,
    diff,
    add,
    del,
    dump,
    perms,
    install,
    trace
};

// How an input file is taken: by its first byte, or as the user says.
enum class input_kind { detect, text, buffer };

// How the argument of `perms` is taken.
enum class perms_mode { detect, string, mask };

// An entry or a requester: a type letter (n, o, u, e, g) with its mechanism
// and identity where the type has them. Groups may name several identities.
struct identity {
    char type = 0;
    std::string mech;
    std::vector<std::string> ids;
};

// trace: the files to decode and the records to show. Each filter may be
// given more than once, each time with a comma-separated list.
struct trace_request {
    std::vector<std::string> files; // none, or "-": standard input
    bool follow = false;
    std::vector<std::string> pids, threads, categories, points;
};

struct invocation {
    command cmd = command::none;
    bool help = false;
    bool version = false;
    bool json = false;

    std::string input;     // the ACL file or buffer file; diff: OLD; install: SRC
    std::string second;    // diff: NEW; install: DEST
    std::string owner;     // the user who owns the ACL file (install: gives it)
    std::string templates; // a permission template file
    std::string output;    // -o: where a buffer is written
    input_kind kind = input_kind::detect;

    bool cache = false;       // compile, install: write the cached compiled file
    bool force = false;       // compile: rewrite a cached file newer than the text
    bool add_only = false;    // add: an existing entry is a failure
    bool grants_more = false; // diff: exit 1 when NEW grants more than OLD
    std::string mode;         // install: the permission bits, in octal

    identity who;                         // check, add, del
    std::vector<identity> asks;           // explain: the requester's identities
    std::vector<std::string> known_mechs; // lint: mechanisms besides the usual ones
    std::optional<std::string> read_like; // lint: what unauthenticated entries may grant
    std::string perm;                     // add: the permissions of the entry
    char list_type = 0;                   // list: only this type
    std::string list_mech;                // list: only this mechanism

    std::string perms_arg; // perms: a permission string or a mask
    perms_mode perms_as = perms_mode::detect;

    trace_request trace;
};

// The parse result: the invocation, or the reason it is not one.
struct parsed {
    invocation inv;
    std::string error; // empty on success
    // Where to read more: "kxacl --help" or "kxacl COMMAND --help".
    std::string help_hint() const;
};

// Parses argv[1..]; args excludes the program name.
parsed parse_command_line(std::span<const char *const> args);

// The name of a command as typed, and the type letter of a type name
// ("user" or "u" give 'u'); 0 when unknown.
const char *command_name(command cmd);
char type_letter(const std::string &name);

// Usage texts: the summary of every command, and one command's help.
const char *usage_summary();
const char *command_help(command cmd);

} // namespace kxtool

#endif
