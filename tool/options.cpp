#include "options.h"

#include <algorithm>
#include <array>
#include <cstring>
#include <string_view>

namespace kxtool {
namespace {

constexpr unsigned bit(command c) {
    return 1u << static_cast<unsigned>(c);
}
constexpr unsigned every_command =
    bit(command::compile) | bit(command::check) | bit(command::explain) | bit(command::list) |
    bit(command::lint) | bit(command::diff) | bit(command::add) | bit(command::del) |
    bit(command::dump) | bit(command::perms) | bit(command::install) | bit(command::trace);
// The commands that read ACL text files, which may have to belong to a user.
constexpr unsigned readers = bit(command::compile) | bit(command::check) | bit(command::explain) |
                             bit(command::list) | bit(command::lint) | bit(command::diff) |
                             bit(command::dump);
// The commands that take a file as text or as a buffer file.
constexpr unsigned either_kind = readers & ~bit(command::compile);
constexpr unsigned selectors =
    bit(command::check) | bit(command::explain) | bit(command::add) | bit(command::del);

struct command_entry {
    const char *name;
    command cmd;
};
constexpr std::array<command_entry, 12> commands = {{{"compile", command::compile},
                                                     {"check", command::check},
                                                     {"explain", command::explain},
                                                     {"list", command::list},
                                                     {"lint", command::lint},
                                                     {"diff", command::diff},
                                                     {"add", command::add},
                                                     {"del", command::del},
                                                     {"dump", command::dump},
                                                     {"perms", command::perms},
                                                     {"install", command::install},
                                                     {"trace", command::trace}}};

// The state of one parse: the arguments still to read and the result.
struct parser {
    std::span<const char *const> args;
    std::size_t next = 0;
    parsed out;
    std::vector<std::string> positionals;

    bool failed() const { return !out.error.empty(); }
    void fail(std::string why) {
        if (out.error.empty())
            out.error = std::move(why);
    }
    // The value of an option: its "=value" part, or the next argument.
    bool take_value(std::string_view opt, const std::optional<std::string_view> &inline_value,
                    std::string &value) {
        if (inline_value) {
            value = *inline_value;
            return true;
        }
        if (next >= args.size()) {
            fail("option " + std::string(opt) + " needs a value");
            return false;
        }
        value = args[next++];
        return true;
    }
    // The identity that an option starts: the one of check, add and del, or
    // one more of the requester that explain describes.
    identity *start_identity(char type) {
        invocation &inv = out.inv;
        if (inv.cmd != command::explain) {
            if (inv.who.type != 0 && !(type == 'g' && inv.who.type == 'g')) {
                fail("give one of --unauthenticated, --anyother, --user, --expanded, --group");
                return nullptr;
            }
            inv.who.type = type;
            return &inv.who;
        }
        for (auto &asked : inv.asks)
            if (asked.type == type) {
                if (type == 'g')
                    return &asked;
                fail("explain takes each of --unauthenticated, --anyother, --user and "
                     "--expanded once");
                return nullptr;
            }
        return &inv.asks.emplace_back(identity{type, {}, {}});
    }
    void set_identity(char type, std::string_view opt) {
        identity *who = start_identity(type);
        if (who == nullptr || (type != 'u' && type != 'e'))
            return;
        std::string mech, id;
        if (!take_value(opt, std::nullopt, mech) || !take_value(opt, std::nullopt, id))
            return;
        who->mech = mech;
        who->ids = {id};
    }
    // --group NAME...: every following argument up to the next option.
    void take_groups(const std::optional<std::string_view> &inline_value) {
        identity *who = start_identity('g');
        std::string name;
        if (who == nullptr || !take_value("--group", inline_value, name))
            return;
        who->ids.push_back(name);
        while (next < args.size() && args[next][0] != '-')
            who->ids.emplace_back(args[next++]);
    }
};

using handler = void (*)(parser &, std::string_view opt, const std::optional<std::string_view> &);

enum class arity { flag, value };

struct option_entry {
    const char *name;
    unsigned allowed; // commands that take it
    bool global;      // may also stand before the command
    arity takes;      // whether "--name=value" is accepted
    handler handle;
};

void take_string(parser &p, std::string_view opt, const std::optional<std::string_view> &v,
                 std::string &field) {
    p.take_value(opt, v, field);
}

// An option that may be given more than once.
void take_more(parser &p, std::string_view opt, const std::optional<std::string_view> &v,
               std::vector<std::string> &values) {
    if (p.take_value(opt, v, values.emplace_back()))
        return;
    values.pop_back();
}

constexpr std::array option_table =
    {
        option_entry{"--help", every_command, true, arity::flag,
                     [](parser &p, auto, auto &) { p.out.inv.help = true; }},
        option_entry{"-h", every_command, true, arity::flag,
                     [](parser &p, auto, auto &) { p.out.inv.help = true; }},
        option_entry{"--version", 0, true, arity::flag,
                     [](parser &p, auto, auto &) { p.out.inv.version = true; }},
        option_entry{"--json", every_command, true, arity::flag,
                     [](parser &p, auto, auto &) { p.out.inv.json = true; }},
        option_entry{"--templates", every_command, false, arity::value,
                     [](parser &p, auto o, auto &v) { take_string(p, o, v, p.out.inv.templates); }},
        option_entry{"--owner", readers | bit(command::install), false, arity::value,
                     [](parser &p, auto o, auto &v) { take_string(p, o, v, p.out.inv.owner); }},
        option_entry{"--cache", bit(command::compile) | bit(command::install), false, arity::flag,
                     [](parser &p, auto, auto &) { p.out.inv.cache = true; }},
        option_entry{"--force", bit(command::compile), false, arity::flag,
                     [](parser &p, auto, auto &) { p.out.inv.force = true; }},
        option_entry{"--mode", bit(command::install), false, arity::value,
                     [](parser &p, auto o, auto &v) { take_string(p, o, v, p.out.inv.mode); }},
        option_entry{"--grants-more", bit(command::diff), false, arity::flag,
                     [](parser &p, auto, auto &) { p.out.inv.grants_more = true; }},
        option_entry{"--read-like", bit(command::lint), false, arity::value,
                     [](parser &p, auto o, auto &v) {
                         std::string perms;
                         if (p.take_value(o, v, perms))
                             p.out.inv.read_like = perms;
                     }},
        option_entry{"-o", bit(command::compile) | bit(command::add) | bit(command::del), false,
                     arity::value,
                     [](parser &p, auto o, auto &v) { take_string(p, o, v, p.out.inv.output); }},
        option_entry{"--output", bit(command::compile) | bit(command::add) | bit(command::del),
                     false, arity::value,
                     [](parser &p, auto o, auto &v) { take_string(p, o, v, p.out.inv.output); }},
        option_entry{
            "--text", either_kind, false, arity::flag,
            [](parser &p, auto, auto &) { p.out.inv.kind = input_kind::text; }},
        option_entry{
            "--buffer", either_kind, false, arity::flag,
            [](parser &p, auto, auto &) { p.out.inv.kind = input_kind::buffer; }},
        option_entry{"--unauthenticated", selectors, false,
                     arity::flag, [](parser &p, auto o, auto &) { p.set_identity('n', o); }},
        option_entry{"--anyother", selectors, false,
                     arity::flag, [](parser &p, auto o, auto &) { p.set_identity('o', o); }},
        option_entry{"--expanded", selectors, false,
                     arity::flag, [](parser &p, auto o, auto &) { p.set_identity('e', o); }},
        option_entry{"--group", selectors, false, arity::value,
                     [](parser &p, auto, auto &v) { p.take_groups(v); }},
        option_entry{"--perms", bit(command::add), false, arity::value,
                     [](parser &p, auto o, auto &v) { take_string(p, o, v, p.out.inv.perm); }},
        option_entry{"--new", bit(command::add), false,
                     arity::flag, [](parser &p, auto, auto &) { p.out.inv.add_only = true; }},
        option_entry{"--type", bit(command::list), false, arity::value,
                     [](parser &p, auto o, auto &v) {
                         std::string s;
                         if (!p.take_value(o, v, s))
                             return;
                         p.out.inv.list_type = type_letter(s);
                         if (p.out.inv.list_type == 0)
                             p.fail("unknown entry type '" + s + "'");
                     }},
        option_entry{"--mech", bit(command::list) | bit(command::lint), false, arity::value,
                     [](parser &p, auto o, auto &v) {
                         std::string mech;
                         if (!p.take_value(o, v, mech))
                             return;
                         if (p.out.inv.cmd == command::lint)
                             p.out.inv.known_mechs.push_back(mech);
                         else
                             p.out.inv.list_mech = mech;
                     }},
        option_entry{"--string", bit(command::perms), false, arity::flag,
                     [](parser &p, auto, auto &) { p.out.inv.perms_as = perms_mode::string; }},
        option_entry{"--mask", bit(command::perms), false, arity::flag,
                     [](parser &p, auto, auto &) { p.out.inv.perms_as = perms_mode::mask; }},
        option_entry{"--follow", bit(command::trace), false, arity::flag,
                     [](parser &p, auto, auto &) { p.out.inv.trace.follow = true; }},
        option_entry{"--pid", bit(command::trace), false, arity::value,
                     [](parser &p, auto o, auto &v) { take_more(p, o, v, p.out.inv.trace.pids); }},
        option_entry{
            "--thread", bit(command::trace), false, arity::value,
            [](parser &p, auto o, auto &v) { take_more(p, o, v, p.out.inv.trace.threads); }},
        option_entry{
            "--category", bit(command::trace), false, arity::value,
            [](parser &p, auto o, auto &v) { take_more(p, o, v, p.out.inv.trace.categories); }},
        option_entry{
            "--point", bit(command::trace), false, arity::value,
            [](parser &p, auto o, auto &v) { take_more(p, o, v, p.out.inv.trace.points); }},
};

void handle_option(parser &p, std::string_view arg) {
    std::optional<std::string_view> inline_value;
    std::string_view name = arg;
    if (const auto eq = arg.find('='); arg.starts_with("--") && eq != std::string_view::npos) {
        name = arg.substr(0, eq);
        inline_value = arg.substr(eq + 1);
    }
    const command cmd = p.out.inv.cmd;
    if (name == "--user" && (bit(cmd) & selectors)) {
        if (inline_value)
            return p.fail("option --user takes MECH ID as two arguments");
        return p.set_identity('u', name);
    }
    if (name == "--user" && (bit(cmd) & (readers | bit(command::install))))
        return p.fail("--user names a requester; the owner of the file is --owner NAME");
    const auto found = std::find_if(option_table.begin(), option_table.end(),
                                    [&](const option_entry &o) { return name == o.name; });
    const bool allowed = found != option_table.end() &&
                         (cmd == command::none ? found->global : (found->allowed & bit(cmd)) != 0);
    if (!allowed) {
        if (cmd == command::none)
            return p.fail("unknown option " + std::string(name) + " (before the command)");
        return p.fail("unknown option " + std::string(name) + " for " + command_name(cmd));
    }
    if (inline_value && found->takes != arity::value)
        return p.fail("option " + std::string(name) + " takes no value");
    found->handle(p, name, inline_value);
}

void set_command(parser &p, std::string_view word) {
    const auto found = std::find_if(commands.begin(), commands.end(),
                                    [&](const command_entry &c) { return word == c.name; });
    if (found == commands.end())
        return p.fail("unknown command '" + std::string(word) + "'");
    p.out.inv.cmd = found->cmd;
}

// Checks the positional arguments and the combinations of options.
void finish(parser &p) {
    invocation &inv = p.out.inv;
    if (inv.help || inv.version)
        return;
    if (inv.cmd == command::none)
        return p.fail("no command given");
    if (inv.cmd == command::trace) {
        inv.trace.files = std::move(p.positionals);
        return;
    }
    // diff and install take two files, perms one value or none, every other
    // command one file.
    const bool two_files = inv.cmd == command::diff || inv.cmd == command::install;
    const std::size_t wanted = two_files ? 2 : 1;
    if (p.positionals.size() > wanted)
        return p.fail("unexpected argument '" + p.positionals[wanted] + "'");
    if (p.positionals.size() < wanted && inv.cmd != command::perms)
        return p.fail(std::string(command_name(inv.cmd)) +
                      (inv.cmd == command::diff      ? " needs two files, OLD and NEW"
                       : inv.cmd == command::install ? " needs two files, SRC and DEST"
                                                     : " needs a file"));
    if (!p.positionals.empty())
        (inv.cmd == command::perms ? inv.perms_arg : inv.input) = p.positionals[0];
    if (two_files)
        inv.second = p.positionals[1];
    if (inv.cmd == command::perms && p.positionals.empty() && inv.perms_as != perms_mode::detect)
        return p.fail("--string and --mask need an argument");
    if ((bit(inv.cmd) & selectors) && inv.cmd != command::explain && inv.who.type == 0)
        return p.fail(std::string(command_name(inv.cmd)) +
                      " needs one of --unauthenticated, --anyother, --user, --expanded, --group");
    if (inv.cmd != command::check && inv.who.ids.size() > 1)
        return p.fail("--group takes one name here");
    if (!inv.list_mech.empty() && inv.list_type != 'u' && inv.list_type != 'e')
        return p.fail("--mech needs --type user or --type expanded");
    if (!inv.owner.empty() && inv.kind == input_kind::buffer)
        return p.fail("--owner applies to ACL text files, not to buffers");
    if (inv.force && !inv.cache)
        return p.fail("--force goes with --cache");
}

} // namespace

parsed parse_command_line(std::span<const char *const> args) {
    parser p{args, 0, {}, {}};
    bool options_done = false;
    while (p.next < args.size() && !p.failed()) {
        const char *arg = args[p.next++];
        if (arg == nullptr)
            break;
        const std::string_view word = arg;
        if (!options_done && word == "--")
            options_done = true;
        else if (!options_done && word.size() > 1 && word[0] == '-')
            handle_option(p, word);
        else if (p.out.inv.cmd == command::none)
            set_command(p, word);
        else
            p.positionals.emplace_back(word);
    }
    if (!p.failed())
        finish(p);
    return std::move(p.out);
}

std::string parsed::help_hint() const {
    return inv.cmd == command::none ? "kxacl --help"
                                    : "kxacl " + std::string(command_name(inv.cmd)) + " --help";
}

const char *command_name(command cmd) {
    for (const auto &c : commands)
        if (c.cmd == cmd)
            return c.name;
    return "kxacl";
}

char type_letter(const std::string &name) {
    static constexpr std::array<std::pair<std::string_view, char>, 5> names = {
        {{"unauthenticated", 'n'},
         {"anyother", 'o'},
         {"user", 'u'},
         {"expanded", 'e'},
         {"group", 'g'}}};
    for (const auto &[word, letter] : names)
        if (name == word || (name.size() == 1 && (name[0] | 0x20) == letter))
            return letter;
    return 0;
}

} // namespace kxtool
