#include "trace_command.h"

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <dirent.h>
#include <string>
#include <string_view>
#include <vector>

#include <fcntl.h>
#include <sys/stat.h>
#include <time.h>
#include <unistd.h>

#include <kx_acl.h>
#include <kx_cu.h>

#include "acl_io.h"
#include "commands.h"
#include "templates.h"
#include "trace_decode.h"

namespace kxtool {
namespace {

// How long --follow waits at the end of the file before looking again.
constexpr long follow_pause_ns = 200'000'000;

// The permission character of each bit under the invocation's templates,
// as the library translates it.
perm_letters letters_of(const invocation &inv) {
    template_set templates;
    load_templates(inv, templates);
    perm_letters letters{};
    for (unsigned bit = 0; bit < 32; ++bit) {
        char text[33];
        if (sec_translate_bitmask(1u << bit, templates.get(), text) == SEC_S_OK)
            letters[bit] = text[0];
    }
    cu_set_no_error_1();
    return letters;
}

// The threads of a process: the process itself (its first thread), and
// those that /proc lists while it runs.
std::vector<std::string> threads_of(const std::string &pid) {
    std::vector<std::string> threads{pid};
    DIR *dir = opendir(("/proc/" + pid + "/task").c_str());
    if (!dir)
        return threads;
    while (const dirent *entry = readdir(dir))
        if (entry->d_name[0] != '.' && pid != entry->d_name)
            threads.emplace_back(entry->d_name);
    closedir(dir);
    return threads;
}

bool all_digits(const std::string &s) {
    return !s.empty() && s.find_first_not_of("0123456789") == std::string::npos;
}

// The threads named by --thread and --pid; --pid alone with a process that
// has ended selects its first thread.
std::vector<std::string> selected_threads(const trace_request &t) {
    std::vector<std::string> threads = t.threads;
    for (const auto &list : t.pids) {
        std::string_view rest = list;
        for (;;) {
            const auto comma = rest.find(',');
            const std::string pid(rest.substr(0, comma));
            if (!all_digits(pid))
                throw tool_error("not a process id: '" + pid + "'");
            for (auto &thread : threads_of(pid))
                threads.push_back(std::move(thread));
            if (comma == std::string_view::npos)
                break;
            rest.remove_prefix(comma + 1);
        }
    }
    return threads;
}

void write_out(const std::string &text) {
    if (!text.empty())
        std::fwrite(text.data(), 1, text.size(), stdout);
}

// Reads a trace file and writes what the decoder makes of each line. A
// last line without its newline is decoded at the end, unless following,
// when it is still being written.
class line_reader {
  public:
    line_reader(int fd, std::string name, trace_decoder &decoder)
        : fd_(fd), name_(std::move(name)), decoder_(decoder) {}

    // Reads until the end of the file; false when a read failed.
    bool read_available() {
        char chunk[65536];
        for (;;) {
            const ssize_t got = read(fd_, chunk, sizeof chunk);
            if (got < 0 && errno == EINTR)
                continue;
            if (got < 0)
                return false;
            if (got == 0)
                return true;
            offset_ += got;
            pending_.append(chunk, static_cast<std::size_t>(got));
            decode_complete_lines();
        }
    }

    void finish() {
        if (!pending_.empty())
            write_out(decoder_.decode_line(pending_));
        pending_.clear();
    }

    // A file cut shorter than what was read (a rotated or truncated trace
    // file) is read again from its start.
    void restart_if_truncated() {
        struct stat st;
        if (fstat(fd_, &st) == 0 && S_ISREG(st.st_mode) && st.st_size < offset_) {
            lseek(fd_, 0, SEEK_SET);
            offset_ = 0;
            pending_.clear();
        }
    }

    const std::string &name() const { return name_; }

  private:
    void decode_complete_lines() {
        std::size_t start = 0;
        for (std::size_t end; (end = pending_.find('\n', start)) != std::string::npos;
             start = end + 1)
            write_out(decoder_.decode_line(std::string_view(pending_).substr(start, end - start)));
        pending_.erase(0, start);
    }

    int fd_;
    std::string name_;
    trace_decoder &decoder_;
    std::string pending_;
    off_t offset_ = 0;
};

struct open_file {
    int fd;
    explicit open_file(const std::string &path)
        : fd(path == "-" ? STDIN_FILENO : open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NOCTTY)) {}
    ~open_file() {
        if (fd > STDIN_FILENO)
            close(fd);
    }
    open_file(const open_file &) = delete;
    open_file &operator=(const open_file &) = delete;
};

[[noreturn]] void cannot_read(const std::string &path, int err) {
    throw tool_error("cannot read " + (path == "-" ? std::string("standard input") : path) + ": " +
                     std::strerror(err));
}

void follow(line_reader &reader) {
    for (;;) {
        std::fflush(stdout);
        const timespec pause{0, follow_pause_ns};
        nanosleep(&pause, nullptr);
        reader.restart_if_truncated();
        if (!reader.read_available())
            cannot_read(reader.name(), errno);
    }
}

} // namespace

int run_trace(const invocation &inv) {
    // The decoder's own library calls must never add records to the trace
    // it reads (the library opens the trace file at its first record).
    unsetenv("KX_TRACE_FILE");
    const trace_request &t = inv.trace;
    std::vector<std::string> files = t.files.empty() ? std::vector<std::string>{"-"} : t.files;
    if (t.follow && files.size() != 1)
        throw tool_error("--follow takes one file");
    std::string error;
    auto filter = make_trace_filter(selected_threads(t), t.categories, t.points, error);
    if (!filter)
        throw tool_error(error);
    trace_decoder decoder(inv.json, std::move(*filter), letters_of(inv));
    for (const auto &path : files) {
        open_file file(path);
        if (file.fd < 0)
            cannot_read(path, errno);
        line_reader reader(file.fd, path, decoder);
        if (!reader.read_available())
            cannot_read(path, errno);
        if (t.follow)
            follow(reader);
        reader.finish();
    }
    if (decoder.undecoded() == 0)
        return exit_ok;
    std::fprintf(stderr, "kxacl: %llu line(s) not decoded, shown raw\n",
                 static_cast<unsigned long long>(decoder.undecoded()));
    return exit_trace_undecoded;
}

} // namespace kxtool
