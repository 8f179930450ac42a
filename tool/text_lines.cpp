#include "text_lines.h"

#include <cctype>
#include <cstring>

#include <pwd.h>

#include <kx_cu.h>

#include "acl_io.h"

namespace kxtool {
namespace {

bool ends_line(char c) {
    return c == '\n' || c == '\f' || c == '\r';
}
bool is_blank(char c) {
    return c == ' ' || c == '\t' || c == '\v';
}

// The tokens of one line up to a comment.
std::vector<std::string> tokens_of(std::string_view line) {
    std::vector<std::string> tokens;
    std::size_t i = 0;
    while (true) {
        while (i < line.size() && is_blank(line[i]))
            ++i;
        if (i == line.size() || line[i] == '#')
            return tokens;
        const std::size_t start = i;
        while (i < line.size() && std::isspace(static_cast<unsigned char>(line[i])) == 0)
            ++i;
        tokens.emplace_back(line.substr(start, i - start));
    }
}

std::string lowered(std::string s) {
    for (char &c : s)
        c = static_cast<char>(cu_tolower_posix_1(static_cast<unsigned char>(c)));
    return s;
}

// The entry of one line's tokens; type 0 when they are not one.
text_entry entry_of(const std::vector<std::string> &tokens, unsigned line) {
    text_entry e;
    if (tokens.empty() || tokens[0].size() != 1 ||
        std::strchr("nNoOuUeEgG", tokens[0][0]) == nullptr)
        return e;
    const char type = static_cast<char>(cu_tolower_posix_1(tokens[0][0]));
    const std::size_t named = type == 'u' || type == 'e' ? 2 : type == 'g' ? 1 : 0;
    if (tokens.size() < 1 + named || tokens.size() > 2 + named)
        return e;
    e.line = line;
    e.type = type;
    if (named == 2)
        e.mech = lowered(tokens[1]);
    if (named > 0)
        e.id = tokens[named];
    if (tokens.size() == 2 + named)
        e.perms = tokens[1 + named];
    return e;
}

} // namespace

std::vector<text_entry> text_entries(std::string_view text) {
    std::vector<text_entry> entries;
    unsigned line = 1;
    for (std::size_t start = 0; start < text.size() && text[start] != '\0'; ++line) {
        std::size_t end = start;
        while (end < text.size() && !ends_line(text[end]) && text[end] != '\0')
            ++end;
        if (text_entry e = entry_of(tokens_of(text.substr(start, end - start)), line); e.type)
            entries.push_back(std::move(e));
        if (end == text.size() || text[end] == '\0')
            break;
        start = end + 1;
    }
    return entries;
}

std::string text_path(const invocation &inv) {
    if (inv.owner.empty())
        return inv.input;
    const passwd *pw = ::getpwnam(inv.owner.c_str());
    return pw ? std::string(pw->pw_dir) + "/" + inv.input : inv.input;
}

std::vector<text_entry> text_entries_of(const invocation &inv) {
    try {
        const std::vector<unsigned char> bytes = read_file(text_path(inv));
        return text_entries(
            std::string_view(reinterpret_cast<const char *>(bytes.data()), bytes.size()));
    } catch (const tool_error &) {
        return {};
    }
}

bool same_entry(const text_entry &t, const shown_entry &e) {
    if (t.type != e.type->letter || cu_strcasecmp_posix_1(t.mech.c_str(), e.raw_mech.c_str()) != 0)
        return false;
    // Expanded identities are kept as written; users and groups are one
    // entry whatever the case of their letters.
    return t.type == 'e' ? t.id == e.raw_id
                         : cu_strcasecmp_posix_1(t.id.c_str(), e.raw_id.c_str()) == 0;
}

unsigned line_of(const std::vector<text_entry> &lines, const shown_entry &e) {
    for (const auto &t : lines)
        if (same_entry(t, e))
            return t.line;
    return 0;
}

} // namespace kxtool
