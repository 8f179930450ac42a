// Locating an ACL file, looking up the user who owns it, and reading an
// open file into memory.
#ifndef KXACL_FILES_H
#define KXACL_FILES_H

#include <cstddef>
#include <cstdint>
#include <sys/stat.h>
#include <sys/types.h>

#include <kx_acl.h>

namespace kxacl {

// Longest path of an ACL or cached ACL file, without its terminator; path
// buffers hold max_path_length + 1 bytes.
inline constexpr std::size_t max_path_length = 4096;
using path_buffer = char[max_path_length + 1];

// Two statuses of one file (device and inode).
inline bool same_inode(const struct stat &a, const struct stat &b) {
    return a.st_dev == b.st_dev && a.st_ino == b.st_ino;
}

// Builds the ACL file's path into aclfname. Without username, filename is a
// full path or a name relative to the working directory; with username it
// is a simple name in that user's home directory, and *uid receives the
// user's id. Checks nothing about the file itself.
kx_int32_t sec__get_aclfname(const char *filename, const char *username, char *aclfname,
                             uid_t *uid);

// Looks up the user named exactly uname. On success *uid holds the user's
// id and *hdir_length the length of the home directory, which is copied
// into hdir (max_path_length + 1 bytes) only when it fits; a longer one
// leaves hdir empty, and no path can be built from it.
kx_int32_t sec__get_user_info(const char *uname, uid_t *uid, char *hdir, std::size_t *hdir_length);

// Locks an open ACL or cached ACL file. No file is ever locked: a cached
// file is replaced by a rename instead, so this only marks where the
// reader and the writer would lock. Always 0.
kx_int32_t acl__lock_acl_file(const char *aclfname, int aclfdes, kx_uint32_t flags);

// 2650-135 (SEC_S_FILE_ERROR) for a file whose status cannot be taken.
kx_int32_t report_unexaminable(const char *aclfname, int err);

// 2650-139 (SEC_S_FILE_ERROR): got bytes (-1 for a read error) of a file of
// size bytes were read; err is the read's system error number.
kx_int32_t report_short_read(const char *aclfname, std::uint64_t size, std::int64_t got, int err);

// Reads size bytes, the size of the open file aclfdes from a status already
// taken, in one read into a new buffer of size + 1 bytes ending in NUL
// (freed with free); a short count is not retried and fails with 2650-139.
// A file of size 0 gives no buffer. On failure *aclfbuf is null and
// *aclfsize 0.
kx_int32_t read_known_size(const char *aclfname, int aclfdes, std::uint64_t size, char **aclfbuf,
                           std::size_t *aclfsize);

// A run of whole lines of a text for the line parser: start and length as
// its cursor and remaining length. A final run ends the text: the parser
// stops within it, at a NUL (the text's own, counted in length, or one
// inside the file, which is then not the last byte counted, so that the
// parser tells it apart).
struct text_run {
    char *start;
    std::size_t length;
    bool final;
};

// Reads the text of an open file of size bytes through a fixed window, so
// that compiling it costs memory in proportion to its entries, not to its
// size. Each read asks for what the window can take; a short count is not
// retried and fails with 2650-139. Reading stops at
// the first NUL byte: the text ends there.
class text_reader {
  public:
    text_reader(const char *aclfname, int aclfdes, std::uint64_t size);
    text_reader(const text_reader &) = delete;
    text_reader &operator=(const text_reader &) = delete;
    ~text_reader();

    // The next run, once the parser has consumed the previous one whole.
    // Not final: it ends with a line end, or fills the window with one
    // line too long for any ACL file.
    kx_int32_t next(text_run *run);

  private:
    kx_int32_t fill();
    const char *name_;
    int fd_;
    std::uint64_t size_;
    std::uint64_t read_ = 0; // bytes read from the file so far
    char *window_ = nullptr;
    std::size_t capacity_;
    std::size_t held_ = 0;     // bytes in the window
    std::size_t consumed_ = 0; // bytes of the last run, dropped by the next call
};

} // namespace kxacl

#endif
