// kxacl lint: entries that do not do what they seem to, and file and cache
// states that change what daemons read. Each warning has a stable code and
// name, its line (or position in a buffer file), and, for file states, the
// command that puts it right.
#include <algorithm>
#include <cstring>
#include <string>
#include <vector>

#include <dirent.h>

#include <kx_acl.h>
#include <kx_cu.h>

#include "cache_state.h"
#include "commands.h"
#include "entries.h"
#include "text_lines.h"

namespace kxtool {
namespace {

struct warning {
    const char *code, *name;
    unsigned line = 0, position = 0; // 0: the file as a whole
    std::string message, fix;
};

// What lint knows of the ACL and how it judges it.
struct lint_context {
    const invocation &inv;
    template_set &templates;
    std::vector<shown_entry> entries;
    std::vector<unsigned> lines; // per entry; 0 for buffer files
    std::uint32_t every_perm = 0, read_like = 0;
    std::vector<warning> found;

    void warn(const char *code, const char *name, std::size_t entry, std::string message,
              std::string fix = {}) {
        found.push_back({code, name, lines.empty() ? 0 : lines[entry],
                         lines.empty() ? static_cast<unsigned>(entry + 1) : 0, std::move(message),
                         std::move(fix)});
    }
    void warn_file(const char *code, const char *name, std::string message, std::string fix) {
        found.push_back({code, name, 0, 0, std::move(message), std::move(fix)});
    }
    std::string where(std::size_t entry) const {
        return lines.empty() || lines[entry] == 0 ? "entry " + std::to_string(entry + 1)
                                                  : "line " + std::to_string(lines[entry]);
    }
    std::string perms(std::uint32_t mask) const {
        const auto p = perm_string(mask, templates);
        return p ? *p : hex_mask(mask);
    }
};

constexpr const char *usual_mechs[] = {"krb5", "unix", "vgn2"};

bool normalised_mech(const shown_entry &e) {
    return (e.type->letter == 'u' || e.type->letter == 'e') &&
           (e.raw_mech == "unix" || e.raw_mech == "vgn2");
}

bool is_ascii(const std::string &s) {
    return std::all_of(s.begin(), s.end(), [](char c) { return (c & 0x80) == 0; });
}

// unix and vgn2 identities as the library makes them for requesters:
// user@host, with an IPv6 host in its one canonical form.
void check_identity_form(lint_context &ctx, std::size_t i) {
    const shown_entry &e = ctx.entries[i];
    if (!normalised_mech(e) || !is_ascii(e.raw_id))
        return;
    sec_acle_t made = nullptr;
    const kx_int32_t status =
        sec_create_acle(e.type->code, 0, e.raw_mech.c_str(), e.raw_id.c_str(), &made);
    cu_set_no_error_1();
    if (status == SEC_S_BAD_PARAM)
        ctx.warn("KX101", "user-without-host", i,
                 entry_identity(e) + ": a " + e.raw_mech +
                     " identity needs a host part (user@host): the library refuses it in "
                     "sec_create_acle and kxacl add, and no requester of the usual form matches "
                     "it");
    else if (status == SEC_S_OK && e.raw_id != made->id)
        ctx.warn("KX102", "ipv6-not-canonical", i,
                 entry_identity(e) +
                     ": the IPv6 host part is not in its canonical form, so a "
                     "requester's identity (" +
                     std::string(made->id) + ") never matches it; write it that way");
    sec_release_acle(made);
}

void check_mechanism(lint_context &ctx, std::size_t i) {
    const shown_entry &e = ctx.entries[i];
    if (e.type->letter != 'u' && e.type->letter != 'e')
        return;
    const auto known = [&](const std::string &m) {
        return cu_strcasecmp_posix_1(m.c_str(), e.raw_mech.c_str()) == 0;
    };
    if (std::any_of(std::begin(usual_mechs), std::end(usual_mechs), known) ||
        std::any_of(ctx.inv.known_mechs.begin(), ctx.inv.known_mechs.end(), known))
        return;
    std::string list;
    for (const char *m : usual_mechs)
        list += std::string(list.empty() ? "" : ", ") + m;
    for (const auto &m : ctx.inv.known_mechs)
        list += ", " + m;
    ctx.warn("KX103", "unknown-mechanism", i,
             entry_identity(e) + ": the mechanism " + e.raw_mech + " is none of " + list +
                 ": no daemon asks for it (name it with --mech if it is real)");
}

// The anyother and unauthenticated entries give a requester without an
// entry of its own what a named entry may have been meant to withhold.
void check_fallbacks(lint_context &ctx, std::size_t i) {
    const shown_entry &e = ctx.entries[i];
    if (e.type->letter == 'n' || e.type->letter == 'o')
        return;
    for (std::size_t f = 0; f < ctx.entries.size(); ++f) {
        const shown_entry &fallback = ctx.entries[f];
        const std::uint32_t more = fallback.mask & ~e.mask;
        if ((fallback.type->letter != 'o' && fallback.type->letter != 'n') || more == 0)
            continue;
        ctx.warn("KX104", "fallback-grants-more", i,
                 entry_identity(e) + " lacks " + ctx.perms(more) + ", which the " +
                     fallback.type->name + " entry (" + ctx.where(f) + ") grants to " +
                     (fallback.type->letter == 'o' ? "every other authenticated requester"
                                                   : "requesters that are not authenticated"));
    }
}

void check_breadth(lint_context &ctx, std::size_t i) {
    const shown_entry &e = ctx.entries[i];
    if (e.type->letter == 'n' && (e.mask & ~ctx.read_like) != 0)
        ctx.warn("KX105", "unauthenticated-beyond-read", i,
                 "the unauthenticated entry grants " + ctx.perms(e.mask & ~ctx.read_like) +
                     ", more than the read-like " + ctx.perms(ctx.read_like) +
                     ", to requesters that are not authenticated (--read-like sets what is "
                     "read-like)");
    if (e.type->letter != 'u' && (e.mask & ctx.every_perm) == ctx.every_perm)
        ctx.warn("KX106", "grants-everything", i,
                 entry_identity(e) + " grants every permission of the templates (" +
                     ctx.perms(ctx.every_perm) + ") to whoever it covers");
}

void check_text_mode(lint_context &ctx, const cache_view &view) {
    if ((view.text_st.st_mode & 022) == 0)
        return;
    ctx.warn_file("KX201", "text-writable",
                  view.text + " is writable by its group or others: they can change the ACL, "
                              "and readers that name its owner refuse it",
                  "chmod go-w " + shell_word(view.text));
}

void check_cache(lint_context &ctx, const cache_view &view) {
    static constexpr const char *names[][2] = {
        {nullptr, nullptr},
        {"KX202", "cache-not-regular"},
        {"KX203", "cache-killed-writer"},
        {"KX204", "cache-foreign"},
        {"KX205", "cache-hard-linked"},
        {"KX206", "cache-empty"},
        {"KX207", "cache-stale"},
        {"KX208", "cache-same-second"},
    };
    const auto state = static_cast<std::size_t>(view.state);
    if (view.state != cache_state::absent && view.state != cache_state::current) {
        ctx.warn_file(names[state][0], names[state][1], cache_trouble(view), cache_fix(view));
        return;
    }
    if (view.state == cache_state::absent || cache_matches_text(view, ctx.templates.get()))
        return;
    const bool before_change = view.cache_st.st_mtim.tv_sec < view.text_st.st_ctim.tv_sec;
    ctx.warn_file("KX209", "cache-outdated",
                  view.cache + " is newer than the text but holds another ACL" +
                      (before_change ? ", and is older than the text's last status change: the "
                                       "text was replaced by an older-dated file"
                                     : "") +
                      "; readers get the old entries until the text changes again",
                  "kxacl compile " + shell_word(view.text) + " --cache --force");
}

bool is_temp_suffix(const std::string &suffix) {
    const bool library =
        suffix.size() == 4 && suffix.find_first_not_of("0123456789abcdef") == std::string::npos;
    return library || (suffix.starts_with("kxacl-") && suffix.size() == 12);
}

// Temporary files of the library's cache writer (NAME.xxxx) and of kxacl
// (NAME.kxacl-XXXXXX) that a writer killed before its rename left behind.
void check_leftovers(lint_context &ctx, const std::string &text) {
    const std::size_t slash = text.rfind('/');
    const std::string dir = slash == std::string::npos ? "." : text.substr(0, slash + 1);
    const std::string base = (slash == std::string::npos ? text : text.substr(slash + 1)) + ".";
    std::vector<std::string> found;
    if (DIR *d = ::opendir(dir.c_str())) {
        while (const dirent *e = ::readdir(d)) {
            const std::string name = e->d_name;
            if (name.starts_with(base) && is_temp_suffix(name.substr(base.size())))
                found.push_back(name);
        }
        ::closedir(d);
    }
    std::sort(found.begin(), found.end());
    for (const auto &name : found) {
        const std::string path = slash == std::string::npos ? name : dir + name;
        ctx.warn_file("KX210", "temp-file",
                      path + " is a temporary file left by a writer that did not finish",
                      "rm " + shell_word(path));
    }
}

std::uint32_t read_like_mask(const invocation &inv, template_set &templates) {
    kx_uint32_t mask = 0;
    if (inv.read_like) {
        check_status(sec_translate_perms(inv.read_like->c_str(), templates.get(), &mask));
        return mask;
    }
    for (const char c : std::string("rqlev")) {
        const char one[2] = {c, 0};
        kx_uint32_t bit = 0;
        if (sec_translate_perms(one, templates.get(), &bit) == SEC_S_OK)
            mask |= bit;
    }
    cu_set_no_error_1();
    return mask;
}

std::string human(const std::vector<warning> &found, const std::string &file) {
    std::string out;
    for (const auto &w : found) {
        out += file + ":" +
               (w.line       ? std::to_string(w.line) + ":"
                : w.position ? " entry " + std::to_string(w.position) + ":"
                             : "") +
               " " + w.code + " " + w.name + ": " + w.message + "\n";
        if (!w.fix.empty())
            out += "  fix: " + w.fix + "\n";
    }
    return out;
}

std::string as_json(const std::vector<warning> &found, const std::string &file) {
    json_writer json;
    json.begin_object().key("file").value(file).key("warnings").begin_array();
    for (const auto &w : found) {
        json.begin_object().key("code").value(w.code).key("name").value(w.name).key("line");
        w.line ? json.value(static_cast<std::int64_t>(w.line)) : json.null();
        json.key("position");
        w.position ? json.value(static_cast<std::int64_t>(w.position)) : json.null();
        json.key("message").value(w.message).key("fix");
        w.fix.empty() ? json.null() : json.value(w.fix);
        json.end_object();
    }
    return json.end_array().end_object().str();
}

} // namespace

int run_lint(const invocation &inv) {
    invocation text = inv;
    const bool buffer = is_buffer_input(inv);
    text.kind = buffer ? input_kind::buffer : input_kind::text;
    acl_input in(text, buffer ? 0u : SEC_F_ACL_TEXT);
    lint_context ctx{inv, in.templates, list_entries(in.acl, in.templates), {}, 0, 0, {}};
    if (!buffer) {
        const std::vector<text_entry> lines = text_entries_of(inv);
        for (const auto &e : ctx.entries)
            ctx.lines.push_back(line_of(lines, e));
    }
    const template_set defaults = default_templates();
    for (const auto &t : in.templates.get() ? in.templates.perms : defaults.perms)
        ctx.every_perm |= t.code;
    ctx.read_like = read_like_mask(inv, in.templates);
    for (std::size_t i = 0; i < ctx.entries.size(); ++i) {
        check_identity_form(ctx, i);
        check_mechanism(ctx, i);
        check_fallbacks(ctx, i);
        check_breadth(ctx, i);
    }
    std::stable_sort(ctx.found.begin(), ctx.found.end(), [](const warning &a, const warning &b) {
        return a.line != b.line ? a.line < b.line : a.position < b.position;
    });
    if (!buffer) {
        const std::string path = text_path(inv);
        const cache_view view = judge_cache(path);
        check_text_mode(ctx, view);
        check_cache(ctx, view);
        check_leftovers(ctx, path);
    }
    print(inv.json ? as_json(ctx.found, inv.input) : human(ctx.found, inv.input));
    return ctx.found.empty() ? exit_ok : exit_warnings;
}

} // namespace kxtool
