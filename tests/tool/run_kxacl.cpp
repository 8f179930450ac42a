#include "run_kxacl.h"

#include <dirent.h>
#include <fcntl.h>
#include <spawn.h>
#include <sys/stat.h>
#include <sys/time.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cstdlib>
#include <fstream>
#include <sstream>
#include <stdexcept>

extern char **environ;

namespace kxtest {
namespace {

std::string temp_root() {
    const char *t = std::getenv("TMPDIR");
    return t && *t ? t : "/tmp";
}

} // namespace

std::string fresh_dir() {
    std::string templ = temp_root() + "/kxacl-tool-XXXXXX";
    if (!::mkdtemp(templ.data()))
        throw std::runtime_error("mkdtemp failed");
    return templ;
}

run_result run_kxacl(const std::vector<std::string> &args) {
    const std::string dir = fresh_dir();
    const std::string out = dir + "/out", err = dir + "/err";
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_addopen(&actions, 1, out.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0600);
    posix_spawn_file_actions_addopen(&actions, 2, err.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0600);
    std::vector<char *> argv{const_cast<char *>(KXACL_EXE)};
    for (const auto &a : args)
        argv.push_back(const_cast<char *>(a.c_str()));
    argv.push_back(nullptr);
    pid_t pid = 0;
    run_result r;
    if (posix_spawn(&pid, KXACL_EXE, &actions, nullptr, argv.data(), environ) == 0) {
        int status = 0;
        while (::waitpid(pid, &status, 0) < 0) {
        }
        r.exit_code = WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
    }
    posix_spawn_file_actions_destroy(&actions);
    r.out = read_bytes(out);
    r.err = read_bytes(err);
    ::unlink(out.c_str());
    ::unlink(err.c_str());
    ::rmdir(dir.c_str());
    return r;
}

void write_text(const std::string &path, const std::string &text) {
    std::ofstream(path, std::ios::binary) << text;
}

std::string read_bytes(const std::string &path) {
    std::ifstream in(path, std::ios::binary);
    std::ostringstream s;
    s << in.rdbuf();
    return s.str();
}

void age_file(const std::string &path, int seconds) {
    struct timeval now {};
    ::gettimeofday(&now, nullptr);
    struct timeval times[2] = {now, now};
    times[1].tv_sec -= seconds;
    ::utimes(path.c_str(), times);
}

std::vector<std::string> dir_entries(const std::string &dir) {
    std::vector<std::string> names;
    if (DIR *d = ::opendir(dir.c_str())) {
        while (const dirent *e = ::readdir(d))
            if (std::string(e->d_name) != "." && std::string(e->d_name) != "..")
                names.emplace_back(e->d_name);
        ::closedir(d);
    }
    std::sort(names.begin(), names.end());
    return names;
}

} // namespace kxtest
