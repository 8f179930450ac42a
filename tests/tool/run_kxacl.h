// Runs the kxacl executable as a user would, and collects what it printed.
#ifndef KXACL_TEST_RUN_KXACL_H
#define KXACL_TEST_RUN_KXACL_H

#include <string>
#include <vector>

#include <sys/types.h>

namespace kxtest {

struct run_result {
    int exit_code = -1;
    std::string out, err;
};

// Runs kxacl with args; as the user uid (and its group gid) when uid is not
// -1, which needs root.
run_result run_kxacl(const std::vector<std::string> &args, uid_t uid = static_cast<uid_t>(-1),
                     gid_t gid = static_cast<gid_t>(-1));

} // namespace kxtest

#endif
