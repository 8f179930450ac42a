// Fuzz target: what kxacl takes from its user before it calls the library:
// the command line, permission template files, and the JSON text of
// whatever identities it prints. The first byte chooses which; the rest is
// the input. Each parser must refuse cleanly or hand back what it promises.
#include <cstdint>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include <kx_acl.h>

#include "fuzz_support.h"
#include "json.h"
#include "options.h"
#include "templates.h"

namespace {

using namespace kxfuzz;
using namespace kxtool;

// Arguments separated by NUL bytes, as the kernel hands them to main.
void fuzz_command_line(std::string_view data) {
    std::vector<std::string> words;
    for (std::size_t start = 0; start <= data.size() && words.size() < 64;) {
        std::size_t end = data.find('\0', start);
        if (end == std::string_view::npos)
            end = data.size();
        words.emplace_back(data.substr(start, end - start));
        start = end + 1;
    }
    std::vector<const char *> args;
    for (const auto &w : words)
        args.push_back(w.c_str());
    const parsed p = parse_command_line(std::span<const char *const>(args.data(), args.size()));
    expect(command_help(p.inv.cmd) != nullptr, "every command has help");
    if (!p.error.empty() || p.inv.help || p.inv.version)
        return;
    const invocation &inv = p.inv;
    expect(inv.cmd != command::none, "a parse without error names a command");
    const std::string_view types = "noueg";
    expect(inv.who.type == 0 || types.find(inv.who.type) != std::string_view::npos,
           "identity type is a type letter", inv.who.type);
    if (inv.who.type == 'u' || inv.who.type == 'e')
        expect(inv.who.ids.size() == 1, "user and expanded identities have one id");
    if (inv.who.type == 'g')
        expect(!inv.who.ids.empty(), "a group identity names a group");
    if (inv.cmd == command::check || inv.cmd == command::add || inv.cmd == command::del)
        expect(inv.who.type != 0, "check, add and del take an identity");
    expect(inv.list_mech.empty() || inv.list_type == 'u' || inv.list_type == 'e',
           "a mechanism filter comes with a type that has mechanisms");
}

// A template file; a set it accepts must work with the library's translators.
void fuzz_templates(std::string_view data) {
    template_set set;
    std::string error;
    if (!parse_templates(data, set, error)) {
        expect(!error.empty() && set.perms.empty(), "a refusal says why and keeps nothing");
        return;
    }
    expect(!set.perms.empty() && set.perms.size() <= 32, "between 1 and 32 templates");
    std::set<char> chars;
    kx_uint32_t all = 0;
    for (const sec_perm_desc &p : set.perms) {
        expect(p.code != 0 && (p.code & (p.code - 1)) == 0, "one bit per template", p.code);
        expect((all & p.code) == 0, "bits are unique", p.code);
        expect(chars.insert(p.printchar).second, "characters are unique", p.printchar);
        expect(std::memchr(p.printstring, '\0', sizeof p.printstring) != nullptr,
               "names are terminated");
        expect(std::memchr(p.printhelp, '\0', sizeof p.printhelp) != nullptr,
               "help texts are terminated");
        all |= p.code;
        char text[33];
        expect(sec_translate_bitmask(p.code, set.get(), text) == SEC_S_OK &&
                   text[0] == p.printchar && text[1] == '\0',
               "each template translates to its character", p.printchar);
    }
    char text[33];
    kx_uint32_t mask = 0;
    expect(sec_translate_bitmask(all, set.get(), text) == SEC_S_OK, "the whole set translates");
    expect(sec_translate_perms(text, set.get(), &mask) == SEC_S_OK && mask == all,
           "and translates back", mask);
}

bool valid_utf8_json(const std::string &s) {
    if (s.size() < 2 || s.front() != '"' || s.back() != '"')
        return false;
    for (unsigned char c : s)
        if (c < 0x20)
            return false;
    return true;
}

void fuzz_json(std::string_view data) {
    const std::string quoted = json_quote(data);
    expect(valid_utf8_json(quoted), "a JSON string has quotes and no raw control bytes");
    // Text that is already valid comes back unchanged inside the quotes, but
    // for the escapes; quoting the quoted text again must also hold.
    expect(valid_utf8_json(json_quote(quoted)), "quoting is stable");
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
    if (size == 0)
        return 0;
    const std::string_view input(reinterpret_cast<const char *>(data) + 1, size - 1);
    switch (data[0] % 3) {
    case 0:
        fuzz_command_line(input);
        break;
    case 1:
        fuzz_templates(input);
        break;
    default:
        fuzz_json(input);
        break;
    }
    return 0;
}
