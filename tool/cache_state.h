// The cached compiled file NAME.cacl of an ACL text file as the library's
// readers and writer judge it, why it is in that state, and the command
// that puts it right. compile --cache, install --cache and lint share it.
#ifndef KXACL_TOOL_CACHE_STATE_H
#define KXACL_TOOL_CACHE_STATE_H

#include <string>

#include <sys/stat.h>

#include <kx_acl.h>

namespace kxtool {

enum class cache_state {
    absent,        // no file of that name
    not_regular,   // a symbolic link, a directory, ...: never trusted
    killed_writer, // empty with mode 0: a writer died before its rename
    foreign,       // another owner, group or mode: never trusted nor replaced
    hard_linked,   // more than one name: never trusted
    empty,         // size 0: never trusted
    stale,         // older than the text: the next caching read replaces it
    same_second,   // written in the second the text last changed: not trusted
    current,       // trusted by readers
};

struct cache_view {
    std::string text, cache; // the paths
    struct stat text_st {};
    struct stat cache_st {};
    cache_state state = cache_state::absent;
};

// Takes the status of the text and of its cached file and judges the
// cached file. Throws tool_error when the text's status cannot be taken.
cache_view judge_cache(const std::string &text);

// Why the cached file in this state does not serve readers, in a sentence;
// empty for absent and current.
std::string cache_trouble(const cache_view &view);

// The shell command that puts the cached file right; empty when there is
// nothing to do.
std::string cache_fix(const cache_view &view);

// Whether a current cached file holds the ACL that the text compiles to.
// Compiles the text with the templates given (NULL for the default).
bool cache_matches_text(const cache_view &view, sec_perm_set_t templates);

// What a compile that asked for the cached file achieved.
struct cache_outcome {
    bool written = false; // this compile wrote the cached file
    bool current = false; // it was current already, holding the same ACL
    std::string note;     // something to know about a written file
    std::string problem;  // why no cached file serves readers, with the fix
};

// Settles the cached file after the text at path text was read with
// SEC_F_ACL_TEXT and SEC_F_ACL_CACHE, which ended with rflags. With force, a
// cached file that the library keeps because it is newer than the text
// (holding another ACL, empty or hard-linked) is removed and written again.
cache_outcome settle_cache(const std::string &text, sec_perm_set_t templates, unsigned rflags,
                           bool force);

// A path or word as one shell word: quoted when it holds anything but
// letters, digits and /._-+,:=@%.
std::string shell_word(const std::string &word);

} // namespace kxtool

#endif
