// The subcommands of kxacl. Each writes its result to standard output and
// returns the exit status; failures are thrown as tool_error or
// library_error (acl_io.h) and reported by the caller.
#ifndef KXACL_TOOL_COMMANDS_H
#define KXACL_TOOL_COMMANDS_H

#include "options.h"

namespace kxtool {

// Exit statuses.
inline constexpr int exit_ok = 0;
inline constexpr int exit_nothing_granted = 1; // check
inline constexpr int exit_warnings = 1;        // lint
inline constexpr int exit_grants_more = 1;     // diff --grants-more
inline constexpr int exit_error = 2;

int run_command(const invocation &inv);

// The commands of their own source files.
int run_explain(const invocation &inv);
int run_lint(const invocation &inv);
int run_diff(const invocation &inv);
int run_install(const invocation &inv);

} // namespace kxtool

#endif
