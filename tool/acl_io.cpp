#include "acl_io.h"

#include <cerrno>
#include <climits>
#include <cstring>
#include <string_view>
#include <utility>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <kx_cu.h>

namespace kxtool {
namespace {

constexpr unsigned char buffer_type_byte = 0x85;
constexpr std::size_t max_file_size = INT_MAX;

std::string system_error(const std::string &what, const std::string &path) {
    return what + " " + path + ": " + std::strerror(errno);
}

class unique_fd {
  public:
    explicit unique_fd(int fd) : fd_(fd) {}
    unique_fd(unique_fd &&other) noexcept : fd_(std::exchange(other.fd_, -1)) {}
    unique_fd(const unique_fd &) = delete;
    unique_fd &operator=(const unique_fd &) = delete;
    ~unique_fd() {
        if (fd_ >= 0)
            ::close(fd_);
    }
    int get() const { return fd_; }

  private:
    int fd_;
};

// Moves all size bytes with read or write, across short transfers and
// interruptions; false on an error or an early end of file.
template <typename Byte, typename Io> bool transfer_all(int fd, Byte *p, std::size_t size, Io io) {
    while (size > 0) {
        const ssize_t n = io(fd, p, size);
        if (n < 0 && errno == EINTR)
            continue;
        if (n <= 0)
            return false;
        p += n;
        size -= static_cast<std::size_t>(n);
    }
    return true;
}
bool read_all(int fd, unsigned char *data, std::size_t size) {
    return transfer_all(fd, data, size, ::read);
}
bool write_all(int fd, const void *data, std::size_t size) {
    return transfer_all(fd, static_cast<const unsigned char *>(data), size, ::write);
}

// Opens a file to read without letting it hang the open (a FIFO) or become
// the controlling terminal (a terminal device): anything but a regular file
// is refused before a byte is read.
unique_fd open_regular_file(const std::string &path, struct stat &st) {
    unique_fd fd(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NOCTTY | O_NONBLOCK));
    if (fd.get() < 0)
        throw tool_error(system_error("cannot open", path));
    if (::fstat(fd.get(), &st) != 0)
        throw tool_error(system_error("cannot read", path));
    if (!S_ISREG(st.st_mode))
        throw tool_error(path + " is not a regular file");
    const int flags = ::fcntl(fd.get(), F_GETFL);
    if (flags < 0 || ::fcntl(fd.get(), F_SETFL, flags & ~O_NONBLOCK) != 0)
        throw tool_error(system_error("cannot read", path));
    return fd;
}

std::vector<unsigned char> read_file(const std::string &path) {
    struct stat st {};
    const unique_fd fd = open_regular_file(path, st);
    if (static_cast<unsigned long long>(st.st_size) > max_file_size)
        throw tool_error(path + " is too large for an ACL buffer");
    std::vector<unsigned char> bytes(static_cast<std::size_t>(st.st_size));
    if (!read_all(fd.get(), bytes.data(), bytes.size()))
        throw tool_error(path + " changed or could not be read whole");
    return bytes;
}

// The mode of a file that replaces path: that of the file it replaces, else
// 0644 less the process's umask. Only a file of the running user's own
// passes on its set-user-id, set-group-id and sticky bits: nobody gets a
// set-id file of the tool's user (root, often) by leaving such bits on a
// file of theirs. Anything but a regular file at path is not replaced.
mode_t mode_for(const std::string &path) {
    struct stat st {};
    if (::lstat(path.c_str(), &st) != 0) {
        if (errno != ENOENT)
            throw tool_error(system_error("cannot examine", path));
        const mode_t mask = ::umask(0);
        ::umask(mask);
        return 0644 & ~mask;
    }
    if (!S_ISREG(st.st_mode))
        throw tool_error(path + " is not a regular file: it is not replaced");
    return st.st_mode & (st.st_uid == ::geteuid() ? 07777 : 0777);
}

// A temporary file beside its target, removed unless it was renamed.
class temp_file {
  public:
    explicit temp_file(const std::string &target) : name_(target + ".XXXXXX") {
        fd_ = ::mkostemp(name_.data(), O_CLOEXEC | O_NOCTTY);
        if (fd_ < 0)
            throw tool_error(system_error("cannot create a temporary file for", target));
    }
    temp_file(const temp_file &) = delete;
    temp_file &operator=(const temp_file &) = delete;
    ~temp_file() {
        if (fd_ >= 0)
            ::close(fd_);
        if (!renamed_)
            ::unlink(name_.c_str());
    }
    int fd() const { return fd_; }
    bool close() { return ::close(std::exchange(fd_, -1)) == 0; }
    bool rename_to(const std::string &target) {
        renamed_ = ::rename(name_.c_str(), target.c_str()) == 0;
        return renamed_;
    }

  private:
    std::string name_;
    int fd_ = -1;
    bool renamed_ = false;
};

} // namespace

void check_status(int status) {
    if (status == SEC_S_OK)
        return;
    cu_error_t *err = nullptr;
    char *text = nullptr;
    cu_get_error_1(&err);
    cu_get_errmsg_1(err, &text);
    std::string message = text ? text : "";
    std::string id;
    if (err && err->cu_msg_default) {
        const std::string_view dflt = err->cu_msg_default;
        id = dflt.substr(0, dflt.find(' '));
    }
    cu_rel_errmsg_1(text);
    cu_rel_error_1(err);
    if (message.empty())
        message = "the ACL library failed with status " + std::to_string(status) + "\n";
    throw library_error(status, id, message);
}

void load_templates(const invocation &inv, template_set &set) {
    if (inv.templates.empty())
        return;
    const std::vector<unsigned char> bytes = read_file(inv.templates);
    std::string error;
    if (!parse_templates(
            std::string_view(reinterpret_cast<const char *>(bytes.data()), bytes.size()), set,
            error))
        throw tool_error(inv.templates + ": " + error);
}

bool looks_like_buffer(const std::string &path) {
    struct stat st {};
    if (::lstat(path.c_str(), &st) != 0)
        return false; // the library reports what is wrong with the name
    const unique_fd fd = open_regular_file(path, st);
    unsigned char first = 0;
    return ::read(fd.get(), &first, 1) == 1 && first == buffer_type_byte;
}

void load_buffer_file(const std::string &path, acl_buffer &acl) {
    std::vector<unsigned char> bytes = read_file(path);
    if (bytes.empty())
        throw tool_error(path + " is empty: it is not a compiled ACL buffer");
    check_status(
        sec_read_acl_from_data(static_cast<kx_int32_t>(bytes.size()), bytes.data(), acl.get()));
    check_status(sec_convert_acl_to_host(1, acl.get()));
}

void load_acl(const invocation &inv, template_set &templates, unsigned flags, acl_buffer &acl,
              unsigned *rflags) {
    const bool buffer = inv.kind == input_kind::buffer ||
                        (inv.kind == input_kind::detect && looks_like_buffer(inv.input));
    if (buffer)
        return load_buffer_file(inv.input, acl);
    kx_uint32_t out_flags = 0;
    const int status =
        sec_read_acl_file(inv.input.c_str(), inv.owner.empty() ? nullptr : inv.owner.c_str(),
                          templates.get(), flags, acl.get(), &out_flags);
    if (rflags)
        *rflags = out_flags;
    check_status(status);
}

acl_input::acl_input(const invocation &inv, unsigned flags, unsigned *rflags) {
    load_templates(inv, templates);
    load_acl(inv, templates, flags, acl, rflags);
}

void write_buffer_file(const std::string &path, const sec_buffer_s &acl) {
    acl_buffer empty;
    const sec_buffer_s *bytes = &acl;
    if (acl.length == 0) {
        check_status(sec_create_empty_acl(empty.get()));
        bytes = &empty.bytes();
    }
    const mode_t mode = mode_for(path);
    temp_file tmp(path);
    if (::fchmod(tmp.fd(), mode) != 0 ||
        !write_all(tmp.fd(), bytes->value, static_cast<std::size_t>(bytes->length)) ||
        ::fsync(tmp.fd()) != 0 || !tmp.close() || !tmp.rename_to(path))
        throw tool_error(system_error("cannot write", path));
}

bool is_cache_name(const std::string &path) {
    return path.ends_with(".cacl");
}

} // namespace kxtool
