// What kxacl reads and writes: ACL text files through the library, buffer
// files as raw bytes, and library failures as the library's own messages.
#ifndef KXACL_TOOL_ACL_IO_H
#define KXACL_TOOL_ACL_IO_H

#include <cstdlib>
#include <optional>
#include <stdexcept>
#include <string>
#include <vector>

#include <sys/stat.h>

#include <kx_acl.h>

#include "options.h"
#include "templates.h"

namespace kxtool {

// A failure of the tool itself: a usage mistake or a file it cannot use.
struct tool_error : std::runtime_error {
    using std::runtime_error::runtime_error;
};

// A failed library call: its status, the number of its message (such as
// "2650-147", whatever the language of the text) and the formatted text.
struct library_error : std::runtime_error {
    int status;
    std::string id;
    library_error(int status, std::string id, const std::string &message)
        : std::runtime_error(message), status(status), id(std::move(id)) {}
};

// Throws library_error with the thread's message when status is not 0.
void check_status(int status);

// An ACL buffer that the library allocated, released on destruction.
class acl_buffer {
  public:
    acl_buffer() = default;
    acl_buffer(const acl_buffer &) = delete;
    acl_buffer &operator=(const acl_buffer &) = delete;
    // The library refuses to release bytes that are not an ACL buffer, such
    // as a file that failed validation; they came from malloc all the same.
    ~acl_buffer() {
        if (sec_release_acl(&buf_) != SEC_S_OK)
            std::free(buf_.value);
    }

    sec_buffer_t get() { return &buf_; }
    const sec_buffer_s &bytes() const { return buf_; }

  private:
    sec_buffer_s buf_{0, nullptr};
};

// The permission templates of the invocation: its file's, or the default.
void load_templates(const invocation &inv, template_set &set);

// The ACL that a reading command works on, with the templates of its file.
struct acl_input {
    template_set templates;
    acl_buffer acl;
    // Loads the templates and the ACL of inv (see load_acl).
    acl_input(const invocation &inv, unsigned flags, unsigned *rflags = nullptr);
};

// Reads the ACL of inv.input, a text file (through the cached compiled
// file when that is current) or a buffer file. flags are those of the
// library's ACL file reader; rflags receives its result flags.
void load_acl(const invocation &inv, template_set &templates, unsigned flags, acl_buffer &acl,
              unsigned *rflags = nullptr);

// Whether the file starts like a compiled ACL buffer.
bool looks_like_buffer(const std::string &path);

// Whether inv.input is taken as a buffer file: as the user says, or by its
// first byte.
bool is_buffer_input(const invocation &inv);

// Reads a buffer file and validates it, bringing it into host byte order.
void load_buffer_file(const std::string &path, acl_buffer &acl);

// The bytes of a regular file, read whole.
std::vector<unsigned char> read_file(const std::string &path);

// The status of path (of a symbolic link itself unless follow); nothing
// when there is no such file.
std::optional<struct stat> file_status(const std::string &path, bool follow);

// The mode of a file that replaces path: that of the file it replaces, its
// set-id and sticky bits only when the running user owns it, else 0644 less
// the umask. Throws tool_error when path is there but not a regular file.
mode_t mode_for(const std::string &path);

// A file written beside its target, target + ".kxacl-XXXXXX", and renamed
// over it; removed again unless commit() renamed it.
class staged_file {
  public:
    explicit staged_file(const std::string &target);
    staged_file(const staged_file &) = delete;
    staged_file &operator=(const staged_file &) = delete;
    ~staged_file();
    const std::string &name() const { return name_; }
    int fd() const { return fd_; }
    void write(const void *data, std::size_t size);
    // Gives the file an owner and group (when they differ), then the mode.
    void give(uid_t uid, gid_t gid, mode_t mode);
    // Flushes the file to disk, renames it over the target and closes it;
    // with touch_after, gives it the time after the rename as its
    // modification time first.
    void commit(bool touch_after = false);

  private:
    std::string target_, name_;
    int fd_ = -1;
    bool renamed_ = false;
};

// Flushes the directory that holds path, so that a rename in it lasts.
void sync_directory_of(const std::string &path);

// Writes an ACL buffer to path through a temporary file in the same folder
// and a rename, so that readers see the old file or the new one whole. The
// new file takes the mode of the file it replaces, or 0644 less the umask.
// The empty ACL is written as its 5-byte form.
void write_buffer_file(const std::string &path, const sec_buffer_s &acl);

// Whether path names a cached compiled file, which only the library writes.
bool is_cache_name(const std::string &path);

} // namespace kxtool

#endif
