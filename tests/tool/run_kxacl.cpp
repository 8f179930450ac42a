#include "run_kxacl.h"

#include <fcntl.h>
#include <grp.h>
#include <sys/wait.h>
#include <unistd.h>

#include "file_helpers.h"

namespace kxtest {
namespace {

// In the child: standard output and error to the files, the user, the program.
[[noreturn]] void exec_kxacl(const std::string &out, const std::string &err,
                             std::vector<char *> &argv, uid_t uid, gid_t gid) {
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

} // namespace

run_result run_kxacl(const std::vector<std::string> &args, uid_t uid, gid_t gid) {
    const std::string dir = temp_dir();
    const removed_at_end cleanup{dir};
    const std::string out = dir + "/out", err = dir + "/err";
    std::vector<char *> argv{const_cast<char *>(KXACL_EXE)};
    for (const auto &a : args)
        argv.push_back(const_cast<char *>(a.c_str()));
    argv.push_back(nullptr);
    run_result r;
    const pid_t pid = ::fork();
    if (pid == 0)
        exec_kxacl(out, err, argv, uid, gid);
    int status = 0;
    if (pid > 0) {
        while (::waitpid(pid, &status, 0) < 0) {
        }
        r.exit_code = WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
    }
    r.out = read_file(out);
    r.err = read_file(err);
    return r;
}

} // namespace kxtest
