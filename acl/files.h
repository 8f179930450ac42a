// Locating an ACL file, looking up the user who owns it, and reading a
// whole open file into memory.
#ifndef KXACL_FILES_H
#define KXACL_FILES_H

#include <cstddef>
#include <cstdint>
#include <sys/types.h>

#include <kx_acl.h>

namespace kxacl {

// Longest path of an ACL or cached ACL file, without its terminator; path
// buffers hold max_path_length + 1 bytes.
inline constexpr std::size_t max_path_length = 4096;
using path_buffer = char[max_path_length + 1];

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

// Reads the whole file aclfname, open for reading at offset 0 as aclfdes,
// into a new zero-filled buffer of its size plus 1 (freed with free). A file
// of size 0 gives no buffer. On failure *aclfbuf is null and *aclfsize 0.
kx_int32_t acl__read_acl_file(const char *aclfname, int aclfdes, char **aclfbuf,
                              std::size_t *aclfsize);

// The reading part of acl__read_acl_file for a file whose size is known
// from a status already taken: size bytes from aclfdes into a new buffer of
// size + 1 bytes ending in NUL; no buffer for size 0.
kx_int32_t read_known_size(const char *aclfname, int aclfdes, std::uint64_t size, char **aclfbuf,
                           std::size_t *aclfsize);

// acl__read_acl_file, telling through *replaced whether it failed because
// the name denoted another file than the open descriptor, so that a reader
// racing with a replacement can open the file again.
kx_int32_t read_whole_file(const char *aclfname, int aclfdes, char **aclfbuf, std::size_t *aclfsize,
                           bool *replaced);

} // namespace kxacl

#endif
