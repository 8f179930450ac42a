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
constexpr unsigned every_command = bit(command::compile) | bit(command::check) |
                                   bit(command::list) | bit(command::add) | bit(command::del) |
                                   bit(command::dump) | bit(command::perms) | bit(command::trace);
constexpr unsigned readers =
    bit(command::compile) | bit(command::check) | bit(command::list) | bit(command::dump);
constexpr unsigned selectors = bit(command::check) | bit(command::add) | bit(command::del);

struct command_entry {
    const char *name;
    command cmd;
};
constexpr std::array<command_entry, 8> commands = {{{"compile", command::compile},
                                                    {"check", command::check},
                                                    {"list", command::list},
                                                    {"add", command::add},
                                                    {"del", command::del},
                                                    {"dump", command::dump},
                                                    {"perms", command::perms},
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
    void set_identity(char type, std::string_view opt) {
        if (out.inv.who.type != 0 && !(type == 'g' && out.inv.who.type == 'g'))
            return fail("give one of --unauthenticated, --anyother, --user, --expanded, --group");
        out.inv.who.type = type;
        if (type == 'u' || type == 'e') {
            std::string mech, id;
            if (!take_value(opt, std::nullopt, mech) || !take_value(opt, std::nullopt, id))
                return;
            out.inv.who.mech = mech;
            out.inv.who.ids = {id};
        }
    }
    // --group NAME...: every following argument up to the next option.
    void take_groups(const std::optional<std::string_view> &inline_value) {
        set_identity('g', "--group");
        std::string name;
        if (failed() || !take_value("--group", inline_value, name))
            return;
        out.inv.who.ids.push_back(name);
        while (next < args.size() && args[next][0] != '-')
            out.inv.who.ids.emplace_back(args[next++]);
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
        option_entry{"--owner", readers, false, arity::value,
                     [](parser &p, auto o, auto &v) { take_string(p, o, v, p.out.inv.owner); }},
        option_entry{"--cache", bit(command::compile), false, arity::flag,
                     [](parser &p, auto, auto &) { p.out.inv.cache = true; }},
        option_entry{"-o", bit(command::compile) | bit(command::add) | bit(command::del), false,
                     arity::value,
                     [](parser &p, auto o, auto &v) { take_string(p, o, v, p.out.inv.output); }},
        option_entry{"--output", bit(command::compile) | bit(command::add) | bit(command::del),
                     false, arity::value,
                     [](parser &p, auto o, auto &v) { take_string(p, o, v, p.out.inv.output); }},
        option_entry{"--text", bit(command::check) | bit(command::list) | bit(command::dump), false,
                     arity::flag,
                     [](parser &p, auto, auto &) { p.out.inv.kind = input_kind::text; }},
        option_entry{"--buffer", bit(command::check) | bit(command::list) | bit(command::dump),
                     false, arity::flag,
                     [](parser &p, auto, auto &) { p.out.inv.kind = input_kind::buffer; }},
        option_entry{"--unauthenticated", selectors, false, arity::flag,
                     [](parser &p, auto o, auto &) { p.set_identity('n', o); }},
        option_entry{"--anyother", selectors, false, arity::flag,
                     [](parser &p, auto o, auto &) { p.set_identity('o', o); }},
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
        option_entry{"--mech", bit(command::list), false, arity::value,
                     [](parser &p, auto o, auto &v) { take_string(p, o, v, p.out.inv.list_mech); }},
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

// --user is two options in one: the file's owner for compile, a requester
// or an entry (MECH ID) for the commands that take an identity.
void handle_user(parser &p, std::string_view opt, const std::optional<std::string_view> &v) {
    if (p.out.inv.cmd == command::compile)
        p.take_value(opt, v, p.out.inv.owner);
    else
        p.set_identity('u', opt);
}

void handle_option(parser &p, std::string_view arg) {
    std::optional<std::string_view> inline_value;
    std::string_view name = arg;
    if (const auto eq = arg.find('='); arg.starts_with("--") && eq != std::string_view::npos) {
        name = arg.substr(0, eq);
        inline_value = arg.substr(eq + 1);
    }
    const command cmd = p.out.inv.cmd;
    if (name == "--user" && (cmd == command::compile || (bit(cmd) & selectors))) {
        if (inline_value && cmd != command::compile)
            return p.fail("option --user takes MECH ID as two arguments");
        return handle_user(p, name, inline_value);
    }
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
    // Every command takes one file or value; only perms may go without.
    const bool optional_arg = inv.cmd == command::perms;
    if (p.positionals.size() > 1)
        return p.fail("unexpected argument '" + p.positionals[1] + "'");
    if (p.positionals.empty() && !optional_arg)
        return p.fail(std::string(command_name(inv.cmd)) + " needs a file");
    if (!p.positionals.empty())
        (inv.cmd == command::perms ? inv.perms_arg : inv.input) = p.positionals[0];
    if (inv.cmd == command::perms && p.positionals.empty() && inv.perms_as != perms_mode::detect)
        return p.fail("--string and --mask need an argument");
    if ((bit(inv.cmd) & selectors) && inv.who.type == 0)
        return p.fail(std::string(command_name(inv.cmd)) +
                      " needs one of --unauthenticated, --anyother, --user, --expanded, --group");
    if (inv.cmd != command::check && inv.who.ids.size() > 1)
        return p.fail("--group takes one name here");
    if (!inv.list_mech.empty() && inv.list_type != 'u' && inv.list_type != 'e')
        return p.fail("--mech needs --type user or --type expanded");
    if (!inv.owner.empty() && inv.kind == input_kind::buffer)
        return p.fail("--owner applies to ACL text files, not to buffers");
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
