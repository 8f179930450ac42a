// kxacl diff: two ACLs compared entry by entry, and whether the new one
// grants any requester more than the old one (a gate for change control).
#include <optional>
#include <string>
#include <vector>

#include <kx_cu.h>

#include "commands.h"
#include "entries.h"

namespace kxtool {
namespace {

// What one requester's entry became.
struct change {
    const char *kind; // added, removed, widened, narrowed, changed
    const shown_entry *entry;
    std::optional<std::uint32_t> before, after;
    std::uint32_t more = 0; // what NEW grants the entry's requesters beyond OLD
};

// The identity of an entry as the library tells entries apart: users and
// groups whatever the case of their letters, expanded identities as stored.
std::string key_of(const shown_entry &e) {
    std::string key(1, e.type->letter);
    for (const char c : e.raw_mech)
        key += static_cast<char>(cu_tolower_posix_1(static_cast<unsigned char>(c)));
    key += '\0';
    for (const char c : e.raw_id)
        key += e.type->letter == 'e'
                   ? c
                   : static_cast<char>(cu_tolower_posix_1(static_cast<unsigned char>(c)));
    return key;
}

const shown_entry *find(const std::vector<shown_entry> &entries, const std::string &key) {
    for (const auto &e : entries)
        if (key_of(e) == key)
            return &e;
    return nullptr;
}

std::uint32_t anyother_mask(const std::vector<shown_entry> &entries) {
    for (const auto &e : entries)
        if (e.type->letter == 'o')
            return e.mask;
    return 0;
}

std::vector<change> compare(const std::vector<shown_entry> &old_acl,
                            const std::vector<shown_entry> &new_acl) {
    std::vector<change> changes;
    const std::uint32_t fallback = anyother_mask(new_acl);
    for (const auto &e : old_acl) {
        const shown_entry *now = find(new_acl, key_of(e));
        if (now == nullptr) {
            // Daemons give a requester without an entry of its own what the
            // anyother entry grants.
            const bool falls_back = e.type->letter != 'o' && e.type->letter != 'n';
            changes.push_back(
                {"removed", &e, e.mask, std::nullopt, falls_back ? fallback & ~e.mask : 0u});
            continue;
        }
        const std::uint32_t gained = now->mask & ~e.mask, lost = e.mask & ~now->mask;
        if (gained || lost)
            changes.push_back({gained && lost ? "changed"
                               : gained       ? "widened"
                                              : "narrowed",
                               now, e.mask, now->mask, gained});
    }
    for (const auto &e : new_acl)
        if (find(old_acl, key_of(e)) == nullptr)
            changes.push_back({"added", &e, std::nullopt, e.mask, e.mask});
    return changes;
}

std::string perms_of(std::uint32_t mask, template_set &templates) {
    const auto perms = perm_string(mask, templates);
    return !perms ? hex_mask(mask) : perms->empty() ? "-" : *perms;
}

std::string human(const std::vector<change> &changes, template_set &templates) {
    if (changes.empty())
        return "no entry differs\n";
    std::string out;
    for (const auto &c : changes) {
        std::string line = std::string(c.kind) + ":";
        line.append(10 - line.size(), ' ');
        line += entry_identity(*c.entry) + " ";
        if (c.before && c.after) {
            const std::uint32_t gained = *c.after & ~*c.before, lost = *c.before & ~*c.after;
            line += perms_of(*c.before, templates) + " -> " + perms_of(*c.after, templates) + " (";
            // Appended piece by piece: gcc 12 at -O3 warns (-Wrestrict) on
            // a short literal added before a std::string.
            if (gained) {
                line += '+';
                line += perms_of(gained, templates);
                line += lost ? " " : "";
            }
            if (lost) {
                line += '-';
                line += perms_of(lost, templates);
            }
            line += ")";
        } else {
            line += perms_of(c.before.value_or(c.after.value_or(0)), templates);
        }
        if (c.more)
            line += c.before && !c.after ? "; its requesters fall back to the anyother entry, "
                                           "which grants more: " +
                                               perms_of(c.more, templates)
                                         : "; grants more: " + perms_of(c.more, templates);
        out += line + "\n";
    }
    return out;
}

void write_optional_grant(json_writer &json, const char *key, std::optional<std::uint32_t> mask,
                          template_set &templates) {
    json.key(key);
    if (!mask)
        json.null();
    else
        write_grant(json.begin_object(), *mask, templates), json.end_object();
}

std::string as_json(const invocation &inv, const std::vector<change> &changes, bool more,
                    template_set &templates) {
    json_writer json;
    json.begin_object().key("old").value(inv.input).key("new").value(inv.second);
    json.key("changes").begin_array();
    for (const auto &c : changes) {
        json.begin_object().key("change").value(c.kind).key("entry");
        write_entry(json, *c.entry);
        write_optional_grant(json, "old", c.before, templates);
        write_optional_grant(json, "new", c.after, templates);
        write_optional_grant(json, "grants_more", c.more ? std::optional(c.more) : std::nullopt,
                             templates);
        json.end_object();
    }
    json.end_array().key("grants_more").value(more);
    return json.end_object().str();
}

} // namespace

int run_diff(const invocation &inv) {
    invocation second = inv;
    second.input = inv.second;
    acl_input old_in(inv, SEC_F_ACL_CONVERT), new_in(second, SEC_F_ACL_CONVERT);
    // Both are shown with the templates of the invocation.
    const auto old_acl = list_entries(old_in.acl, old_in.templates);
    const auto new_acl = list_entries(new_in.acl, old_in.templates);
    const std::vector<change> changes = compare(old_acl, new_acl);
    bool more = false;
    for (const auto &c : changes)
        more = more || c.more != 0;
    print(inv.json ? as_json(inv, changes, more, old_in.templates)
                   : human(changes, old_in.templates));
    return inv.grants_more && more ? exit_grants_more : exit_ok;
}

} // namespace kxtool
