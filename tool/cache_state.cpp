#include "cache_state.h"

#include <cerrno>
#include <cstring>
#include <ctime>
#include <vector>

#include <grp.h>
#include <unistd.h>

#include <kx_cu.h>

#include "acl_io.h"

namespace kxtool {
namespace {

cache_state state_of(const struct stat &text, const struct stat &cache) {
    if (!S_ISREG(cache.st_mode))
        return cache_state::not_regular;
    if (cache.st_size == 0 && (cache.st_mode & 07777) == 0)
        return cache_state::killed_writer;
    if (cache.st_uid != text.st_uid || cache.st_gid != text.st_gid ||
        (cache.st_mode & 07777) != (text.st_mode & 07777))
        return cache_state::foreign;
    if (cache.st_nlink > 1)
        return cache_state::hard_linked;
    if (cache.st_size == 0)
        return cache_state::empty;
    if (cache.st_mtim.tv_sec < text.st_mtim.tv_sec)
        return cache_state::stale;
    if (cache.st_mtim.tv_sec == text.st_mtim.tv_sec)
        return cache_state::same_second;
    return cache_state::current;
}

std::string owner_and_mode(const struct stat &st) {
    char mode[8];
    std::snprintf(mode, sizeof mode, "%04o", static_cast<unsigned>(st.st_mode & 07777));
    return std::to_string(st.st_uid) + ":" + std::to_string(st.st_gid) + " mode " + mode;
}

bool in_group(gid_t gid) {
    if (gid == ::getegid())
        return true;
    const int count = ::getgroups(0, nullptr);
    std::vector<gid_t> groups(static_cast<std::size_t>(count > 0 ? count : 0));
    const int got = ::getgroups(count, groups.data());
    for (int i = 0; i < got; ++i)
        if (groups[static_cast<std::size_t>(i)] == gid)
            return true;
    return false;
}

// Why the library's writer, which had every right to, wrote no cached file:
// the likely obstacle for the running user.
std::string write_obstacle(const cache_view &view) {
    const std::size_t slash = view.text.rfind('/');
    const std::string dir = slash == std::string::npos ? "."
                            : slash == 0               ? "/"
                                                       : view.text.substr(0, slash);
    if (::access(dir.c_str(), W_OK | X_OK) != 0)
        return view.cache + " could not be written: this user cannot create files in " + dir +
               " (" + std::strerror(errno) + ")";
    if (::geteuid() != 0 && (view.text_st.st_uid != ::geteuid() || !in_group(view.text_st.st_gid)))
        return view.cache + " could not be written: it must have the text's owner and group (" +
               std::to_string(view.text_st.st_uid) + ":" + std::to_string(view.text_st.st_gid) +
               "), which only root can give it";
    return view.cache + " could not be written";
}

// Whether force may remove a cached file that the library keeps: one of the
// text's owner, group and mode that readers do not use or that holds
// another ACL than the text.
bool removable_by_force(const cache_view &view, sec_perm_set_t templates) {
    switch (view.state) {
    case cache_state::empty:
    case cache_state::hard_linked:
        return true;
    case cache_state::current:
        return !cache_matches_text(view, templates);
    default:
        return false;
    }
}

// Removes the cached file judged in view, unless another file took its name.
void remove_judged(const cache_view &view) {
    const auto now = file_status(view.cache, false);
    if (now && now->st_dev == view.cache_st.st_dev && now->st_ino == view.cache_st.st_ino &&
        ::unlink(view.cache.c_str()) != 0 && errno != ENOENT)
        throw tool_error("cannot remove " + view.cache + ": " + std::strerror(errno));
}

} // namespace

cache_outcome settle_cache(const std::string &text, sec_perm_set_t templates, unsigned rflags,
                           bool force) {
    cache_outcome out;
    cache_view view = judge_cache(text);
    if (force && (rflags & SEC_F_ACL_CACHE) == 0 && removable_by_force(view, templates)) {
        remove_judged(view);
        acl_buffer again;
        kx_uint32_t flags = 0;
        check_status(sec_read_acl_file(text.c_str(), nullptr, templates,
                                       SEC_F_ACL_TEXT | SEC_F_ACL_CACHE, again.get(), &flags));
        rflags = flags;
        view = judge_cache(text);
    }
    if (rflags & SEC_F_ACL_CACHE) {
        out.written = true;
        if (view.state == cache_state::same_second)
            out.note =
                cache_trouble(view) + " in a later second (run '" + cache_fix(view) + "' again)";
        return out;
    }
    if (view.state == cache_state::current && cache_matches_text(view, templates)) {
        out.current = true;
        return out;
    }
    if (view.state == cache_state::current)
        out.problem = view.cache +
                      " is newer than the text but holds another ACL (the text was "
                      "replaced by an older-dated file): readers get the old "
                      "entries (fix: kxacl compile " +
                      shell_word(text) + " --cache --force)";
    else if (view.state == cache_state::absent || view.state == cache_state::stale ||
             view.state == cache_state::same_second)
        out.problem = write_obstacle(view);
    else if (!force && removable_by_force(view, templates))
        out.problem =
            cache_trouble(view) + " (fix: kxacl compile " + shell_word(text) + " --cache --force)";
    else
        out.problem = cache_trouble(view) + " (fix: " + cache_fix(view) + ")";
    return out;
}

cache_view judge_cache(const std::string &text) {
    cache_view view;
    view.text = text;
    view.cache = text + ".cacl";
    const auto text_st = file_status(text, true);
    if (!text_st)
        throw tool_error(text + " does not exist");
    view.text_st = *text_st;
    // The library's writer holds an empty cached file of mode 0 while it
    // writes the new one beside it: only one that stays is a killed
    // writer's. Writing takes milliseconds; give it two seconds.
    for (int wait = 0; wait <= 40; ++wait) {
        view.state = cache_state::absent;
        if (const auto cache_st = file_status(view.cache, false)) {
            view.cache_st = *cache_st;
            view.state = state_of(view.text_st, view.cache_st);
        }
        if (view.state != cache_state::killed_writer ||
            ::time(nullptr) - view.cache_st.st_ctim.tv_sec > 2)
            break;
        ::usleep(50'000);
    }
    return view;
}

std::string cache_trouble(const cache_view &view) {
    const std::string &c = view.cache;
    switch (view.state) {
    case cache_state::absent:
    case cache_state::current:
        return {};
    case cache_state::not_regular:
        return c + " is not a regular file: readers never use it and the library cannot replace it";
    case cache_state::killed_writer:
        return c + " is empty with mode 0, left by a writer that was killed: readers never use "
                   "it and the library never replaces it";
    case cache_state::foreign:
        return c + " has another owner, group or mode (" + owner_and_mode(view.cache_st) +
               ") than the text (" + owner_and_mode(view.text_st) +
               "): readers never use it and the library never replaces it";
    case cache_state::hard_linked:
        return c + " has " + std::to_string(view.cache_st.st_nlink) +
               " names (hard links): readers never use it";
    case cache_state::empty:
        return c + " is empty: readers never use it";
    case cache_state::stale:
        return c + " is older than the text: readers compile the text until a caching read "
                   "replaces it";
    case cache_state::same_second:
        return c + " was written in the second the text last changed: readers compile the text "
                   "until it is written again";
    }
    return {};
}

std::string cache_fix(const cache_view &view) {
    std::string compile = "kxacl compile " + shell_word(view.text) + " --cache";
    switch (view.state) {
    case cache_state::absent:
    case cache_state::current:
        return {};
    case cache_state::stale:
    case cache_state::same_second:
        return compile;
    default:
        return "rm " + shell_word(view.cache) + " && " + compile;
    }
}

bool cache_matches_text(const cache_view &view, sec_perm_set_t templates) {
    acl_buffer text, cache;
    if (sec_read_acl_file(view.text.c_str(), nullptr, templates, SEC_F_ACL_TEXT, text.get(),
                          nullptr) != SEC_S_OK) {
        cu_set_no_error_1();
        return false;
    }
    try {
        load_buffer_file(view.cache, cache);
    } catch (const std::runtime_error &) {
        cu_set_no_error_1();
        return false;
    }
    const sec_buffer_s &a = text.bytes(), &b = cache.bytes();
    return a.length == b.length &&
           std::memcmp(a.value, b.value, static_cast<std::size_t>(a.length)) == 0;
}

std::string shell_word(const std::string &word) {
    static constexpr const char safe[] = "abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ"
                                         "0123456789/._-+,:=@%";
    if (!word.empty() && word.find_first_not_of(safe) == std::string::npos)
        return word;
    std::string quoted = "'";
    for (const char c : word)
        quoted += c == '\'' ? std::string("'\\''") : std::string(1, c);
    return quoted + "'";
}

} // namespace kxtool
