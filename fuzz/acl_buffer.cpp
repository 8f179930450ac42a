// Fuzz target: arbitrary bytes as an ACL buffer in host byte order.
#include "acl_exercise.h"

extern "C" int LLVMFuzzerInitialize(int *, char ***) {
    kxfuzz::prepare_process();
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
    kxfuzz::trace_levels_for(size);
    kxfuzz::exercise_host_order(data, size);
    return 0;
}
