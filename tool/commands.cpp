#include "commands.h"

#include <array>
#include <cerrno>
#include <cinttypes>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include <fcntl.h>
#include <unistd.h>

#include <kx_acl.h>
#include <kx_cu.h>

#include "acl_io.h"
#include "json.h"
#include "templates.h"
#include "trace_command.h"

namespace kxtool {
namespace {

void print(const std::string &text) {
    std::fwrite(text.data(), 1, text.size(), stdout);
}

std::string hex_mask(std::uint32_t mask) {
    char text[16];
    std::snprintf(text, sizeof text, "0x%08" PRIx32, mask);
    return text;
}

unsigned char type_code(char letter) {
    switch (letter) {
    case 'n':
        return SEC_ACLE_UNAUTHENTICATED;
    case 'o':
        return SEC_ACLE_ANYOTHER;
    case 'u':
        return SEC_ACLE_USER;
    case 'e':
        return SEC_ACLE_EXPANDED;
    case 'g':
        return SEC_ACLE_GROUP;
    default:
        return 0;
    }
}

struct type_names {
    unsigned char code;
    char letter;
    const char *name;
};
constexpr std::array<type_names, 5> types = {{{SEC_ACLE_UNAUTHENTICATED, 'n', "unauthenticated"},
                                              {SEC_ACLE_ANYOTHER, 'o', "anyother"},
                                              {SEC_ACLE_USER, 'u', "user"},
                                              {SEC_ACLE_EXPANDED, 'e', "expanded"},
                                              {SEC_ACLE_GROUP, 'g', "group"}}};

const type_names &names_of(unsigned char code) {
    for (const auto &t : types)
        if (t.code == code)
            return t;
    static constexpr type_names unknown{0, '?', "unknown"};
    return unknown;
}

// The permission string of a mask, or nothing when a bit has no template.
std::optional<std::string> perm_string(std::uint32_t mask, template_set &templates) {
    char text[33];
    if (sec_translate_bitmask(mask, templates.get(), text) != SEC_S_OK) {
        cu_set_no_error_1();
        return std::nullopt;
    }
    return std::string(text);
}

// Whether arg is written as a mask: decimal digits, or 0x and hex digits.
bool looks_like_mask(const std::string &arg) {
    const bool hex = arg.starts_with("0x") || arg.starts_with("0X");
    const std::string_view digits = std::string_view(arg).substr(hex ? 2 : 0);
    return !digits.empty() && digits.find_first_not_of(hex ? "0123456789abcdefABCDEF"
                                                           : "0123456789") == std::string::npos;
}

std::uint32_t parse_mask(const std::string &arg) {
    if (!looks_like_mask(arg))
        throw tool_error("'" + arg + "' is not a mask: write decimal digits, or 0x and hex digits");
    const bool hex = arg.size() > 1 && (arg[1] == 'x' || arg[1] == 'X');
    errno = 0;
    const unsigned long long value = std::strtoull(arg.c_str(), nullptr, hex ? 16 : 10);
    if (errno != 0 || value > 0xffffffffull)
        throw tool_error("'" + arg + "' is not a 32-bit mask");
    return static_cast<std::uint32_t>(value);
}

// A mask from a permission string, or from a number when the user gave one.
std::uint32_t parse_perm_argument(const std::string &arg, perms_mode mode,
                                  template_set &templates) {
    if (mode == perms_mode::mask || (mode == perms_mode::detect && looks_like_mask(arg)))
        return parse_mask(arg);
    kx_uint32_t mask = 0;
    check_status(sec_translate_perms(arg.c_str(), templates.get(), &mask));
    return mask;
}

// A text that the library allocated, released with free.
struct owned_text {
    char *p = nullptr;
    ~owned_text() { std::free(p); }
};

// An entry as the listing shows it.
struct shown_entry {
    const type_names *type;
    std::string mech, id;         // the process codeset, for people
    std::string raw_mech, raw_id; // as stored (UTF-8), for JSON
    std::optional<std::string> perms;
    std::uint32_t mask;
};

shown_entry show(const sec_acle_desc &acle, template_set &templates) {
    shown_entry e{&names_of(acle.type), {}, {}, acle.mech, acle.id ? acle.id : "", {}, acle.perm};
    owned_text mech, id;
    if (sec_display_acle_id(const_cast<sec_acle_t>(&acle), &mech.p, &id.p) == SEC_S_OK) {
        e.mech = mech.p ? mech.p : "";
        e.id = id.p ? id.p : "";
    } else {
        cu_set_no_error_1();
        e.mech = e.raw_mech;
        e.id = e.raw_id;
    }
    e.perms = perm_string(acle.perm, templates);
    return e;
}

// An entry list that the library filled, released on destruction.
struct entry_list {
    sec_acle_list_desc list{0, nullptr};
    ~entry_list() { sec_release_aclelist(&list); }
};

std::vector<shown_entry> list_entries(const invocation &inv, acl_buffer &acl,
                                      template_set &templates) {
    entry_list entries;
    if (acl.bytes().length == 0)
        return {};
    if (inv.list_type == 0)
        check_status(sec_list_acl(acl.get(), &entries.list));
    else
        check_status(sec_list_acl_by_type(
            acl.get(), type_code(inv.list_type),
            inv.list_mech.empty() ? nullptr : const_cast<char *>(inv.list_mech.c_str()),
            &entries.list));
    std::vector<shown_entry> shown;
    shown.reserve(static_cast<std::size_t>(entries.list.count));
    for (kx_int32_t i = 0; i < entries.list.count; ++i)
        shown.push_back(show(*entries.list.acles[i], templates));
    return shown;
}

void write_entry(json_writer &json, const shown_entry &e) {
    json.begin_object().key("type").value(e.type->name).key("mech");
    e.raw_mech.empty() ? json.null() : json.value(e.raw_mech);
    json.key("id");
    e.type->code &(SEC_ACLE_UNAUTHENTICATED | SEC_ACLE_ANYOTHER) ? json.null()
                                                                 : json.value(e.raw_id);
    json.key("perms");
    e.perms ? json.value(*e.perms) : json.null();
    json.key("mask").value(static_cast<std::int64_t>(e.mask)).end_object();
}

// Lines of ACL text, columns aligned: the listing reads back as an ACL file
// whenever every mask has templates.
std::string entry_lines(const std::vector<shown_entry> &entries) {
    std::vector<std::array<std::string, 4>> rows;
    std::array<std::size_t, 4> width{};
    for (const auto &e : entries) {
        std::array<std::string, 4> row{std::string(1, e.type->letter), e.mech, e.id,
                                       e.perms ? *e.perms : hex_mask(e.mask)};
        if (e.type->code == SEC_ACLE_GROUP)
            row[1].swap(row[2]); // a group has an identity and no mechanism
        for (std::size_t c = 0; c < row.size(); ++c)
            width[c] = std::max(width[c], row[c].size());
        rows.push_back(std::move(row));
    }
    std::string out;
    for (const auto &row : rows) {
        std::string line;
        for (std::size_t c = 0; c < row.size(); ++c) {
            if (row[c].empty())
                continue;
            line += row[c];
            if (c + 1 < row.size())
                line.append(width[c] - row[c].size() + 1, ' ');
        }
        while (!line.empty() && line.back() == ' ')
            line.pop_back();
        out += line + "\n";
    }
    return out;
}

// Sub-ACLs hold the entries of one type and mechanism, listed together.
std::size_t count_subacls(const std::vector<shown_entry> &entries) {
    std::size_t count = 0;
    for (std::size_t i = 0; i < entries.size(); ++i)
        if (i == 0 || entries[i].type != entries[i - 1].type ||
            cu_strcasecmp_posix_1(entries[i].raw_mech.c_str(), entries[i - 1].raw_mech.c_str()) !=
                0)
            ++count;
    return count;
}

int run_compile(const invocation &inv) {
    if (!inv.output.empty() && is_cache_name(inv.output))
        throw tool_error("refusing to write " + inv.output +
                         ": cached compiled files are written by the library only (use --cache)");
    unsigned rflags = 0;
    invocation text = inv;
    text.kind = input_kind::text;
    acl_input in(text, SEC_F_ACL_TEXT | (inv.cache ? SEC_F_ACL_CACHE : 0u), &rflags);
    acl_buffer &acl = in.acl;
    if (!inv.output.empty())
        write_buffer_file(inv.output, acl.bytes());
    const auto entries = list_entries(invocation{}, acl, in.templates);
    const bool cached = (rflags & SEC_F_ACL_CACHE) != 0;
    if (inv.json) {
        json_writer json;
        json.begin_object().key("file").value(inv.input);
        json.key("entries").value(static_cast<std::int64_t>(entries.size()));
        json.key("subacls").value(static_cast<std::int64_t>(count_subacls(entries)));
        json.key("bytes").value(static_cast<std::int64_t>(acl.bytes().length));
        json.key("cached").value(cached).key("output");
        inv.output.empty() ? json.null() : json.value(inv.output);
        print(json.end_object().str());
        return exit_ok;
    }
    std::string out = inv.input + ": " + std::to_string(entries.size()) + " entries in " +
                      std::to_string(count_subacls(entries)) + " sub-ACLs, " +
                      std::to_string(acl.bytes().length) + " bytes\n";
    if (cached)
        out += "cached in " + inv.input + ".cacl\n";
    else if (inv.cache)
        out += "not cached (a cached file newer than the text exists, or it could not be "
               "written)\n";
    if (!inv.output.empty())
        out += "written to " + inv.output + "\n";
    print(out);
    return exit_ok;
}

int run_list(const invocation &inv) {
    acl_input in(inv, SEC_F_ACL_CONVERT);
    const auto entries = list_entries(inv, in.acl, in.templates);
    if (!inv.json) {
        print(entry_lines(entries));
        return exit_ok;
    }
    json_writer json;
    json.begin_object().key("entries").begin_array();
    for (const auto &e : entries)
        write_entry(json, e);
    print(json.end_array().end_object().str());
    return exit_ok;
}

// The stand-in handler of expanded entries: the same identity, byte for
// byte. The family's daemons register their mechanisms' own handlers.
kx_int32_t same_identity(char *id, char *acle_id) {
    return std::strcmp(id, acle_id) == 0 ? 0 : 1;
}

// The mask that acl grants to the requester; nothing when no entry names it.
std::optional<std::uint32_t> evaluate(const identity &who, acl_buffer &acl) {
    if (acl.bytes().length == 0)
        return std::nullopt;
    kx_uint32_t mask = 0;
    int status = SEC_S_OK;
    auto *mech = const_cast<char *>(who.mech.c_str());
    if (who.type == 'g') {
        std::vector<sec_buffer_s> groups;
        for (const auto &name : who.ids)
            groups.push_back(
                {static_cast<kx_int32_t>(name.size() + 1), const_cast<char *>(name.c_str())});
        status = sec__group_acles_perm(acl.get(), static_cast<kx_int32_t>(groups.size()),
                                       groups.data(), &mask);
    } else {
        if (who.type == 'e')
            check_status(sec__register_id_handler(SEC_ID_HANDLER_EXPANDED, mech, same_identity));
        char *id = who.ids.empty() ? nullptr : const_cast<char *>(who.ids[0].c_str());
        status = sec__single_acle_perm(acl.get(), type_code(who.type), mech, nullptr, id, &mask);
    }
    try {
        check_status(status);
    } catch (const library_error &e) {
        if (e.id == "2650-147") // no entry for the requester
            return std::nullopt;
        throw;
    }
    return mask;
}

int run_check(const invocation &inv) {
    acl_input in(inv, SEC_F_ACL_CONVERT);
    const std::optional<std::uint32_t> mask = evaluate(inv.who, in.acl);
    const std::uint32_t granted = mask.value_or(0);
    const std::optional<std::string> perms = perm_string(granted, in.templates);
    if (inv.json) {
        json_writer json;
        json.begin_object().key("entry").value(mask.has_value());
        json.key("granted").value(granted != 0).key("perms");
        perms ? json.value(*perms) : json.null();
        print(json.key("mask").value(static_cast<std::int64_t>(granted)).end_object().str());
    } else if (!mask) {
        print("no entry for the requester: nothing granted\n");
    } else {
        const std::string shown = perms ? *perms : "?";
        print((granted ? shown : "-") + " " + hex_mask(granted) + "\n");
    }
    return granted ? exit_ok : exit_nothing_granted;
}

// The entry of the invocation, created by the library.
struct created_entry {
    sec_acle_t acle = nullptr;
    ~created_entry() { sec_release_acle(acle); }
};

int run_edit(const invocation &inv) {
    const std::string &target = inv.output.empty() ? inv.input : inv.output;
    if (is_cache_name(target))
        throw tool_error("refusing to write " + target +
                         ": cached compiled files are written by the library only (use -o)");
    template_set templates;
    load_templates(inv, templates);
    acl_buffer acl;
    load_buffer_file(inv.input, acl);
    // Template sets may have digits as characters: only 0x marks a mask here.
    const std::string &perm = inv.perm;
    const std::uint32_t mask = parse_perm_argument(
        perm, perm.starts_with("0x") ? perms_mode::mask : perms_mode::string, templates);
    created_entry entry;
    const char *id = inv.who.ids.empty() ? nullptr : inv.who.ids[0].c_str();
    check_status(sec_create_acle(type_code(inv.who.type), mask,
                                 inv.who.mech.empty() ? nullptr : inv.who.mech.c_str(), id,
                                 &entry.acle));
    if (inv.cmd == command::del)
        check_status(sec_del_acle_from_acl(entry.acle, acl.get()));
    else if (inv.add_only)
        check_status(sec_add_acle_to_acl2(entry.acle, acl.get()));
    else
        check_status(sec_add_acle_to_acl(entry.acle, acl.get()));
    write_buffer_file(target, acl.bytes());
    const char *verb = inv.cmd == command::del ? "deleted" : "added";
    if (inv.json) {
        json_writer json;
        json.begin_object().key(verb);
        write_entry(json, show(*entry.acle, templates));
        json.key("file").value(target);
        json.key("bytes").value(static_cast<std::int64_t>(acl.bytes().length));
        print(json.end_object().str());
    } else {
        print(std::string(verb) + ": " + entry_lines({show(*entry.acle, templates)}));
    }
    return exit_ok;
}

// Runs the dump with its standard error going to a temporary file, and
// gives back what it printed.
std::string capture_dump(acl_buffer &acl) {
    std::FILE *sink = std::tmpfile();
    if (!sink)
        throw tool_error(std::string("cannot create a temporary file: ") + std::strerror(errno));
    std::fflush(stderr);
    const int saved = ::dup(STDERR_FILENO);
    if (saved < 0 || ::dup2(::fileno(sink), STDERR_FILENO) < 0) {
        if (saved >= 0)
            ::close(saved);
        std::fclose(sink);
        throw tool_error(std::string("cannot redirect standard error: ") + std::strerror(errno));
    }
    sec__dump_acl(acl.get());
    std::fflush(stderr);
    ::dup2(saved, STDERR_FILENO);
    ::close(saved);
    std::string text;
    std::rewind(sink);
    char chunk[4096];
    for (std::size_t n; (n = std::fread(chunk, 1, sizeof chunk, sink)) > 0;)
        text.append(chunk, n);
    std::fclose(sink);
    return text;
}

int run_dump(const invocation &inv) {
    acl_input in(inv, SEC_F_ACL_CONVERT);
    const std::string text = capture_dump(in.acl);
    if (!inv.json) {
        print(text);
        return exit_ok;
    }
    json_writer json;
    json.begin_object().key("lines").begin_array();
    for (std::size_t start = 0; start < text.size();) {
        const std::size_t end = text.find('\n', start);
        json.value(std::string_view(text).substr(start, end - start));
        start = end == std::string::npos ? text.size() : end + 1;
    }
    print(json.end_array().end_object().str());
    return exit_ok;
}

int show_templates(const invocation &inv, template_set &templates) {
    sec_perm_set_t set = templates.get();
    std::vector<sec_perm_desc> shown;
    if (set)
        shown.assign(set->perms, set->perms + set->count);
    else
        for (unsigned bit = 0; bit < 32; ++bit) {
            char c[33];
            if (sec_translate_bitmask(1u << bit, nullptr, c) == SEC_S_OK) {
                sec_perm_desc p{};
                p.code = 1u << bit;
                p.printchar = c[0];
                shown.push_back(p);
            }
        }
    cu_set_no_error_1();
    json_writer json;
    std::string out;
    json.begin_object().key("templates").begin_array();
    for (const auto &p : shown) {
        const std::string chr(1, p.printchar);
        json.begin_object().key("char").value(chr);
        json.key("mask").value(static_cast<std::int64_t>(p.code));
        json.key("name").value(p.printstring).key("help").value(p.printhelp).end_object();
        out += chr + " " + hex_mask(p.code) + (p.printstring[0] ? "  " : "") + p.printstring +
               (p.printhelp[0] ? "  " : "") + p.printhelp + "\n";
    }
    print(inv.json ? json.end_array().end_object().str() : out);
    return exit_ok;
}

int run_perms(const invocation &inv) {
    template_set templates;
    load_templates(inv, templates);
    if (inv.perms_arg.empty() && inv.perms_as == perms_mode::detect)
        return show_templates(inv, templates);
    const std::uint32_t mask = parse_perm_argument(inv.perms_arg, inv.perms_as, templates);
    char perms[33];
    check_status(sec_translate_bitmask(mask, templates.get(), perms));
    if (inv.json) {
        json_writer json;
        json.begin_object().key("perms").value(perms);
        print(json.key("mask").value(static_cast<std::int64_t>(mask)).end_object().str());
    } else {
        print((perms[0] ? std::string(perms) : "-") + " " + hex_mask(mask) + "\n");
    }
    return exit_ok;
}

} // namespace

int run_command(const invocation &inv) {
    switch (inv.cmd) {
    case command::compile:
        return run_compile(inv);
    case command::check:
        return run_check(inv);
    case command::list:
        return run_list(inv);
    case command::add:
    case command::del:
        return run_edit(inv);
    case command::dump:
        return run_dump(inv);
    case command::perms:
        return run_perms(inv);
    case command::trace:
        return run_trace(inv);
    case command::none:
        break;
    }
    throw tool_error("no command given");
}

} // namespace kxtool
