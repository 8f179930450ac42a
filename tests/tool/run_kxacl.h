// Runs the kxacl executable as a user would, and collects what it printed.
#ifndef KXACL_TEST_RUN_KXACL_H
#define KXACL_TEST_RUN_KXACL_H

#include <string>
#include <vector>

#include <fcntl.h>
#include <grp.h>
#include <sys/wait.h>
#include <unistd.h>

#include "file_helpers.h"

namespace kxtest {

struct run_result {
    int exit_code = -1;
    std::string out, err;
};

// Runs kxacl with args; as the user uid (and its group gid) when uid is not
// -1, which needs root. Standard output and error go to files of one
// directory per test process, replaced by each run.
inline run_result run_kxacl(const std::vector<std::string> &args,
                            uid_t uid = static_cast<uid_t>(-1),
                            gid_t gid = static_cast<gid_t>(-1)) {
    static const std::string dir = temp_dir();
    const std::string out = dir + "/out", err = dir + "/err";
    std::vector<char *> argv{const_cast<char *>(KXACL_EXE)};
    for (const auto &a : args)
        argv.push_back(const_cast<char *>(a.c_str()));
    argv.push_back(nullptr);
    const pid_t pid = ::fork();
    if (pid == 0) {
        const int o = ::open(out.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0666);
        const int e = ::open(err.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0666);
        if (o < 0 || e < 0 || ::dup2(o, 1) < 0 || ::dup2(e, 2) < 0)
            ::_exit(127);
        if (uid != static_cast<uid_t>(-1) &&
            (::setgroups(0, nullptr) != 0 || ::setgid(gid) != 0 || ::setuid(uid) != 0))
            ::_exit(126);
        ::execv(KXACL_EXE, argv.data());
        ::_exit(127);
    }
    int status = 0, code = -1;
    if (pid > 0) {
        while (::waitpid(pid, &status, 0) < 0) {
        }
        code = WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
    }
    return {code, read_file(out), read_file(err)};
}

} // namespace kxtest

#endif
