#include "templates.h"

#include <cstring>
#include <string>

namespace kxtool {
namespace {

constexpr std::size_t max_name = sizeof(sec_perm_desc::printstring) - 1;
constexpr std::size_t max_help = sizeof(sec_perm_desc::printhelp) - 1;

bool is_blank(char c) {
    return c == ' ' || c == '\t' || c == '\v' || c == '\r' || c == '\f';
}

std::string_view trim(std::string_view s) {
    while (!s.empty() && is_blank(s.front()))
        s.remove_prefix(1);
    while (!s.empty() && is_blank(s.back()))
        s.remove_suffix(1);
    return s;
}

// Takes the next blank-delimited word off the front of s.
std::string_view next_word(std::string_view &s) {
    s = trim(s);
    std::size_t end = 0;
    while (end < s.size() && !is_blank(s[end]))
        ++end;
    const std::string_view word = s.substr(0, end);
    s.remove_prefix(end);
    return word;
}

bool parse_bit(std::string_view word, unsigned &bit) {
    if (word.empty() || word.size() > 2)
        return false;
    bit = 0;
    for (const char c : word) {
        if (c < '0' || c > '9')
            return false;
        bit = bit * 10 + static_cast<unsigned>(c - '0');
    }
    return bit < 32;
}

// Parses one template line; returns the reason it is bad, or "".
std::string parse_line(std::string_view line, const std::vector<sec_perm_desc> &seen,
                       sec_perm_desc &perm) {
    const std::string_view chr = next_word(line), bit_word = next_word(line),
                           name = next_word(line), help = trim(line);
    unsigned bit = 0;
    if (name.empty())
        return "expected CHAR BIT NAME [HELP]";
    if (chr.size() != 1 || chr[0] < '!' || chr[0] > '~')
        return "the permission character must be one printable character";
    if (!parse_bit(bit_word, bit))
        return "the bit must be a number from 0 to 31";
    if (name.size() > max_name)
        return "the name is longer than " + std::to_string(max_name) + " bytes";
    if (help.size() > max_help)
        return "the help text is longer than " + std::to_string(max_help) + " bytes";
    perm = sec_perm_desc{};
    perm.code = 1u << bit;
    perm.printchar = chr[0];
    std::memcpy(perm.printstring, name.data(), name.size());
    std::memcpy(perm.printhelp, help.data(), help.size());
    for (const auto &other : seen) {
        if (other.printchar == perm.printchar)
            return std::string("the character '") + perm.printchar + "' is used twice";
        if (other.code == perm.code)
            return "bit " + std::to_string(bit) + " is used twice";
    }
    return {};
}

// The default set of the library, position by position (bit 0 upwards).
struct default_template {
    char printchar;
    const char *name, *help;
};
constexpr default_template default_set[] = {
    {'r', "read", "general purpose read operation"},
    {'w', "write", "general purpose write operation"},
    {'c', "control", "general purpose control operation"},
    {'x', "execute", "general purpose execute operation"},
    {'C', "cancel", "general purpose cancel operation"},
    {'q', "query", "QBT query resource"},
    {'l', "list", "QBT enumerate resource"},
    {'e', "event", "QBT event registration/unregistration/quering"},
    {'d', "define", "QBT define/undefine resource"},
    {'v', "validate", "QBT validate resource handle"},
    {'s', "set", "QBT set attribute"},
    {'a', "set", "QBT administrative control"},
    {'o', "set", "QBT online/offline/reset resource"},
};

} // namespace

template_set default_templates() {
    template_set set;
    unsigned bit = 0;
    for (const auto &t : default_set) {
        sec_perm_desc perm{};
        perm.code = 1u << bit++;
        perm.printchar = t.printchar;
        std::strncpy(perm.printstring, t.name, max_name);
        std::strncpy(perm.printhelp, t.help, max_help);
        set.perms.push_back(perm);
    }
    return set;
}

sec_perm_set_t template_set::get() {
    if (perms.empty())
        return nullptr;
    set.count = static_cast<kx_int32_t>(perms.size());
    set.perms = perms.data();
    return &set;
}

bool parse_templates(std::string_view text, template_set &set, std::string &error) {
    set.perms.clear();
    if (text.find('\0') != std::string_view::npos) {
        error = "the file holds a NUL byte";
        return false;
    }
    unsigned lineno = 0;
    while (!text.empty()) {
        ++lineno;
        const std::size_t end = text.find('\n');
        const std::string_view raw = text.substr(0, end);
        text.remove_prefix(end == std::string_view::npos ? text.size() : end + 1);
        const std::string_view line = trim(raw);
        if (line.empty() || line.front() == '#')
            continue;
        sec_perm_desc perm{};
        if (std::string why = parse_line(line, set.perms, perm); !why.empty()) {
            error = "line " + std::to_string(lineno) + ": " + why;
            set.perms.clear();
            return false;
        }
        set.perms.push_back(perm);
    }
    if (set.perms.empty()) {
        error = "no permission template in the file";
        return false;
    }
    return true;
}

} // namespace kxtool
