// The cached compiled ACL file (CACL file): the ACL buffer compiled from an
// ACL file, kept beside it under the ACL file's path plus ".cacl", with the
// ACL file's owner, group and permission bits. Readers use it while it is
// newer than the ACL file; writers replace it by renaming a complete
// temporary file over it.
#ifndef KXACL_CACHE_H
#define KXACL_CACHE_H

#include <cstddef>
#include <sys/stat.h>

#include <kx_acl.h>

namespace kxacl {

// Longest ACL path that can have a CACL file: its CACL name then stays
// within 4094 characters, and its temporary names within 4094 too.
inline constexpr std::size_t max_cached_acl_path = 4089;
inline constexpr const char cacl_suffix[] = ".cacl";

// Forms the CACL name of aclfname into cacl (a path buffer); false, with
// cacl empty, when the name would not fit one.
bool cacl_name_of(const char *aclfname, char *cacl);

// Writes the bytes of acl to the CACL file of aclfname through a temporary
// file and a rename. Returns 0 when written; 1, with no error record, when
// there was nothing to write (an empty buffer) or, without force, the CACL
// file is newer than the ACL file; else a failure status with the record set.
// The old CACL file is never changed on failure.
kx_int32_t sec__cache_aclbuffer(const char *aclfname, sec_acl_buffer_t acl, sec_boolean_t force);

// sec__cache_aclbuffer for a buffer compiled from the ACL file whose
// status, taken from the descriptor that its bytes were read through, is
// compiled_from: the CACL file is judged by and given that status alone.
// When the name no longer leads to that file unchanged (another inode, size
// or modification time) just before the rename, nothing is written and the
// result is 1, so that a buffer of an older text never lands beside a newer one.
kx_int32_t cache_aclbuffer(const char *aclfname, sec_acl_buffer_t acl, sec_boolean_t force,
                           const struct stat *compiled_from);

// What a reader makes of a CACL file (see judge_cacl).
enum class cacl_state {
    trusted,      // its bytes may be returned
    unexaminable, // its status cannot be taken (err says why); absent included
    stale,        // empty, too large for a buffer, or not strictly newer
    foreign,      // not a regular file, hard-linked, or owner, group or permission bits differ
};
struct cacl_verdict {
    cacl_state state;
    int err;             // for unexaminable
    struct stat cacl_st; // for stale and foreign
};

// The reader's trust rule for the CACL file cacl of an ACL file whose
// status is acl_st. The name is examined without following a symbolic link.
cacl_verdict judge_cacl(const struct stat &acl_st, const char *cacl);

// The trust rule for a CACL file whose status, taken without following a
// symbolic link, is cacl_st; never unexaminable.
cacl_verdict judge_cacl_status(const struct stat &acl_st, const struct stat &cacl_st);

// A regular file with the ACL file's owner, group and permission bits: the
// part of the trust rule that the reader applies again to the file it opened.
bool cacl_matches_acl(const struct stat &acl_st, const struct stat &cacl_st);

} // namespace kxacl

#endif
