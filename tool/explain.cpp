// kxacl explain: for one requester, each question that a daemon usually
// asks the library, the library's answer, and the entry that gave it or the
// reason that none did. The answers are the library's evaluation calls; the
// entries are the library's listing, traced back to their lines.
#include <optional>
#include <string>
#include <vector>

#include <kx_cu.h>

#include "commands.h"
#include "entries.h"
#include "text_lines.h"

namespace kxtool {
namespace {

// One question and its answer.
struct answer {
    identity who;                       // the question, as check would ask it
    std::optional<std::uint32_t> mask;  // the library's answer; none: no entry
    std::optional<std::size_t> decider; // index of the deciding entry in the listing
    std::string why;                    // why no entry applied
};

// The ACL being explained: its entries in buffer order and their lines.
struct explained_acl {
    std::vector<shown_entry> entries;
    std::vector<unsigned> lines; // 0 where the line is unknown (and for buffer files)
};

bool in_subacl(const shown_entry &e, const identity &who) {
    return e.type->letter == who.type &&
           (who.type != 'u' && who.type != 'e'
                ? true
                : cu_strcasecmp_posix_1(e.raw_mech.c_str(), who.mech.c_str()) == 0);
}

// Whether the entry is the one that answers the identity id: the library's
// comparison for users and groups, kxacl's stand-in handler for expanded.
bool names(const shown_entry &e, const std::string &id) {
    return e.type->letter == 'e' ? e.raw_id == id
                                 : cu_strcasecmp_posix_1(id.c_str(), e.raw_id.c_str()) == 0;
}

std::string where(const explained_acl &acl, std::size_t i) {
    return acl.lines[i] ? "line " + std::to_string(acl.lines[i]) : "entry " + std::to_string(i + 1);
}

std::string question_text(const identity &who) {
    std::string text =
        who.type == 'g' && who.ids.size() > 1 ? "groups" : names_of(type_code(who.type)).name;
    if (!who.mech.empty())
        text += " " + who.mech;
    for (const auto &id : who.ids)
        text += " " + id;
    return text;
}

// Why the user or group walk found no entry for id: it stops at the first
// entry that id sorts before, the library's stored order being ascending.
std::string walk_end(const explained_acl &acl, const std::vector<std::size_t> &candidates,
                     const std::string &id, const std::string &kind) {
    for (const std::size_t i : candidates)
        if (cu_strcasecmp_posix_1(id.c_str(), acl.entries[i].raw_id.c_str()) < 0)
            return id + " sorts before " + acl.entries[i].id + " (" + where(acl, i) +
                   "), where the walk stops";
    return id + " sorts after every " + kind + " (" + std::to_string(candidates.size()) + ")";
}

std::string no_entry_reason(const explained_acl &acl, const identity &who) {
    std::vector<std::size_t> candidates;
    for (std::size_t i = 0; i < acl.entries.size(); ++i)
        if (in_subacl(acl.entries[i], who))
            candidates.push_back(i);
    const std::string type = names_of(type_code(who.type)).name;
    const std::string of_mech = who.mech.empty() ? "" : " of mechanism " + who.mech;
    if (candidates.empty())
        return "no " + type + " entry" + of_mech;
    const std::string &id = who.ids.empty() ? std::string() : who.ids[0];
    switch (who.type) {
    case 'e':
        return "no expanded entry" + of_mech + " is " + id + " byte for byte (" +
               std::to_string(candidates.size()) +
               " compared by kxacl's stand-in for the mechanism's handler)";
    case 'u': {
        std::string why = "no user entry" + of_mech + " names " + id + ": " +
                          walk_end(acl, candidates, id, "user entry" + of_mech);
        if ((who.mech == "unix" || who.mech == "vgn2") && id.find('@') == std::string::npos)
            why += "; " + who.mech + " user identities are written user@host";
        return why;
    }
    case 'g':
        return "no group entry names " + id + ": " + walk_end(acl, candidates, id, "group entry");
    default:
        return "the library found no " + type + " entry";
    }
}

answer ask(acl_buffer &buffer, const explained_acl &acl, const identity &who) {
    answer a{who, evaluate(who, buffer), std::nullopt, {}};
    if (!a.mask) {
        if (who.ids.size() <= 1)
            a.why = no_entry_reason(acl, who);
        return a;
    }
    if (who.ids.size() > 1) // groups together: several entries decide
        return a;
    for (std::size_t i = 0; i < acl.entries.size() && !a.decider; ++i)
        if (in_subacl(acl.entries[i], who) &&
            (who.ids.empty() || names(acl.entries[i], who.ids[0])))
            a.decider = i;
    if (a.decider && acl.entries[*a.decider].mask != *a.mask) {
        a.decider.reset();
        a.why = "the library's answer matches no listed entry";
    }
    return a;
}

// The questions in the order a daemon usually asks them: the user's own
// entry, its expanded identity, each group and the groups together, then
// the anyother and unauthenticated entries.
std::vector<identity> questions(const invocation &inv) {
    std::vector<identity> asked;
    for (const char type : {'u', 'e'})
        for (const auto &who : inv.asks)
            if (who.type == type)
                asked.push_back(who);
    for (const auto &who : inv.asks)
        if (who.type == 'g') {
            for (const auto &name : who.ids)
                asked.push_back(identity{'g', {}, {name}});
            if (who.ids.size() > 1)
                asked.push_back(who);
        }
    asked.push_back(identity{'o', {}, {}});
    asked.push_back(identity{'n', {}, {}});
    return asked;
}

std::string human(const std::vector<answer> &answers, const explained_acl &acl,
                  template_set &templates) {
    std::string out;
    for (const auto &a : answers) {
        out += question_text(a.who) + ": " +
               (a.mask ? grant_text(*a.mask, templates) : std::string("no entry")) + "\n";
        if (a.decider)
            out += "  decided by " + where(acl, *a.decider) + ": " +
                   entry_lines({acl.entries[*a.decider]});
        else if (!a.why.empty())
            out += "  " + a.why + "\n";
    }
    return out;
}

std::string as_json(const std::vector<answer> &answers, const explained_acl &acl,
                    template_set &templates, const invocation &inv, const char *source) {
    json_writer json;
    json.begin_object().key("file").value(inv.input).key("source").value(source);
    json.key("answers").begin_array();
    for (const auto &a : answers) {
        json.begin_object()
            .key("question")
            .value(a.who.ids.size() > 1 ? "groups" : names_of(type_code(a.who.type)).name);
        json.key("mech");
        a.who.mech.empty() ? json.null() : json.value(a.who.mech);
        json.key("ids").begin_array();
        for (const auto &id : a.who.ids)
            json.value(id);
        json.end_array().key("entry").value(a.mask.has_value());
        write_grant(json, a.mask.value_or(0), templates);
        json.key("decided_by");
        if (a.decider) {
            json.begin_object().key("line");
            acl.lines[*a.decider] ? json.value(static_cast<std::int64_t>(acl.lines[*a.decider]))
                                  : json.null();
            json.key("position").value(static_cast<std::int64_t>(*a.decider + 1)).key("entry");
            write_entry(json, acl.entries[*a.decider]);
            json.end_object();
        } else {
            json.null();
        }
        json.key("why");
        a.why.empty() ? json.null() : json.value(a.why);
        json.end_object();
    }
    return json.end_array().end_object().str();
}

} // namespace

int run_explain(const invocation &inv) {
    unsigned rflags = 0;
    acl_input in(inv, SEC_F_ACL_CONVERT, &rflags);
    const bool buffer = is_buffer_input(inv);
    // A cached file is never empty: an empty ACL came from the text.
    const bool from_cache = !buffer && (rflags & SEC_F_ACL_TEXT) == 0 && in.acl.bytes().length;
    const char *source = buffer ? "buffer" : from_cache ? "cache" : "text";
    explained_acl acl{list_entries(in.acl, in.templates), {}};
    const std::vector<text_entry> lines = buffer ? std::vector<text_entry>{} : text_entries_of(inv);
    for (const auto &e : acl.entries)
        acl.lines.push_back(line_of(lines, e));
    std::vector<answer> answers;
    for (const auto &who : questions(inv))
        answers.push_back(ask(in.acl, acl, who));
    if (inv.json) {
        print(as_json(answers, acl, in.templates, inv, source));
        return exit_ok;
    }
    if (from_cache)
        print("answered from " + text_path(inv) + ".cacl, the cached file that readers use\n");
    print(human(answers, acl, in.templates));
    return exit_ok;
}

} // namespace kxtool
