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

// File helpers of the tool tests.
std::string fresh_dir();
void write_text(const std::string &path, const std::string &text);
std::string read_bytes(const std::string &path);
// Sets a file's modification time this many seconds into the past.
void age_file(const std::string &path, int seconds);
std::vector<std::string> dir_entries(const std::string &dir);

} // namespace kxtest

#endif
