// kxacl install: deploys an ACL text file so that no reader keeps the old
// permissions. Readers trust the cached compiled file while it is newer
// than the text in whole seconds, so a text put in place with an older
// time than a cached file written for its predecessor (cp -p, rsync -t, tar,
// or a slow write before the rename) leaves the old ACL in force. install
// gives the new text the time after its rename instead.
#include <cerrno>
#include <cstring>
#include <ctime>
#include <string>

#include <pwd.h>
#include <sys/stat.h>
#include <unistd.h>

#include "cache_state.h"
#include "commands.h"
#include "entries.h"

namespace kxtool {
namespace {

struct ownership {
    uid_t uid;
    gid_t gid;
    mode_t mode;
};

mode_t parse_mode(const std::string &text) {
    if (text.empty() || text.size() > 4 || text.find_first_not_of("01234567") != std::string::npos)
        throw tool_error("--mode takes permission bits in octal, such as 0644, not '" + text + "'");
    const mode_t mode = static_cast<mode_t>(std::stoul(text, nullptr, 8));
    if (mode > 0777)
        throw tool_error("--mode takes permission bits up to 0777, not " + text);
    return mode;
}

// DEST's owner, group and mode, changed as the options say. A new DEST
// belongs to the running user, or to the named owner and that user's group.
ownership ownership_for(const invocation &inv, const std::optional<struct stat> &dest) {
    ownership o{::geteuid(), ::getegid(), mode_for(inv.second)};
    if (dest) {
        o.uid = dest->st_uid;
        o.gid = dest->st_gid;
    }
    if (!inv.owner.empty()) {
        const passwd *pw = ::getpwnam(inv.owner.c_str());
        if (pw == nullptr)
            throw tool_error("no user " + inv.owner);
        o.uid = pw->pw_uid;
        if (!dest)
            o.gid = pw->pw_gid;
    }
    if (!inv.mode.empty())
        o.mode = parse_mode(inv.mode);
    return o;
}

// Waits until the clock has passed the second of time, with a margin for
// the coarser clock that file times are taken from.
void wait_past_second(const timespec &time) {
    timespec now{};
    ::clock_gettime(CLOCK_REALTIME, &now);
    if (now.tv_sec > time.tv_sec && now.tv_nsec > 20'000'000)
        return;
    const long long wait_ns =
        (static_cast<long long>(time.tv_sec) + 1 - now.tv_sec) * 1'000'000'000LL - now.tv_nsec +
        20'000'000LL;
    timespec delay{static_cast<time_t>(wait_ns / 1'000'000'000LL),
                   static_cast<long>(wait_ns % 1'000'000'000LL)};
    while (::nanosleep(&delay, &delay) != 0 && errno == EINTR) {
    }
}

std::string octal(mode_t mode) {
    char text[8];
    std::snprintf(text, sizeof text, "%04o", static_cast<unsigned>(mode));
    return text;
}

} // namespace

int run_install(const invocation &inv) {
    const std::string &dest = inv.second;
    if (is_cache_name(dest))
        throw tool_error("refusing to write " + dest +
                         ": cached compiled files are written by the library only (use --cache)");
    const std::optional<struct stat> dest_st = file_status(dest, false);
    if (dest_st && !S_ISREG(dest_st->st_mode))
        throw tool_error(dest + " is not a regular file");
    const ownership owner = ownership_for(inv, dest_st);
    template_set templates;
    load_templates(inv, templates);
    const std::vector<unsigned char> text = read_file(inv.input);

    // The bytes compiled are the bytes installed: the staged copy.
    staged_file staged(dest);
    staged.write(text.data(), text.size());
    acl_buffer acl;
    check_status(sec_read_acl_file(staged.name().c_str(), nullptr, templates.get(), SEC_F_ACL_TEXT,
                                   acl.get(), nullptr));
    staged.give(owner.uid, owner.gid, owner.mode);
    staged.commit(true);
    sync_directory_of(dest);

    cache_outcome cache;
    if (inv.cache) {
        const auto installed = file_status(dest, false);
        if (installed)
            wait_past_second(installed->st_mtim);
        acl_buffer cached;
        kx_uint32_t rflags = 0;
        check_status(sec_read_acl_file(dest.c_str(), nullptr, templates.get(),
                                       SEC_F_ACL_TEXT | SEC_F_ACL_CACHE, cached.get(), &rflags));
        cache = settle_cache(dest, templates.get(), rflags, false);
    }
    const std::size_t entries = list_entries(acl, templates).size();
    if (inv.json && cache.problem.empty()) {
        json_writer json;
        json.begin_object().key("source").value(inv.input).key("file").value(dest);
        json.key("entries").value(static_cast<std::int64_t>(entries));
        json.key("bytes").value(static_cast<std::int64_t>(text.size()));
        json.key("uid").value(static_cast<std::int64_t>(owner.uid));
        json.key("gid").value(static_cast<std::int64_t>(owner.gid));
        json.key("mode").value(octal(owner.mode));
        print(json.key("cached").value(cache.written || cache.current).end_object().str());
    } else if (!inv.json) {
        print("installed " + inv.input + " as " + dest + ": " + std::to_string(entries) +
              " entries, owner " + std::to_string(owner.uid) + ":" + std::to_string(owner.gid) +
              ", mode " + octal(owner.mode) + "\n" +
              (cache.written || cache.current ? "cached in " + dest + ".cacl\n" : ""));
    }
    if (!cache.problem.empty())
        throw tool_error("installed " + dest + ", but " + cache.problem);
    return exit_ok;
}

} // namespace kxtool
