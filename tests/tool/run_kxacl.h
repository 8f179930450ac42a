// Runs the kxacl executable as a user would, and collects what it printed.
#ifndef KXACL_TEST_RUN_KXACL_H
#define KXACL_TEST_RUN_KXACL_H

#include <string>
#include <vector>

namespace kxtest {

struct run_result {
    int exit_code = -1;
    std::string out, err;
};

run_result run_kxacl(const std::vector<std::string> &args);

} // namespace kxtest

#endif
