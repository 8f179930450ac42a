#include "commands.h"
#include "acl_io.h"
namespace kxtool {
int run_explain(const invocation &) {
    throw tool_error("not yet");
}
} // namespace kxtool
