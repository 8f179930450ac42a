// kxacl trace: decodes trace files of the library for people and for log
// shippers (trace_decode.h does the decoding).
#ifndef KXACL_TOOL_TRACE_COMMAND_H
#define KXACL_TOOL_TRACE_COMMAND_H

#include "options.h"

namespace kxtool {

// Exit status when some lines were shown raw, not decoded.
inline constexpr int exit_trace_undecoded = 1;

int run_trace(const invocation &inv);

} // namespace kxtool

#endif
