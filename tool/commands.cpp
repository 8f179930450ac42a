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

#include <kx_acl.h>
#include <kx_cu.h>

#include "acl_io.h"
#include "cache_state.h"
#include "entries.h"
#include "json.h"
#include "templates.h"
#include "text_lines.h"
#include "trace_command.h"

namespace kxtool {
namespace {

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
    const auto entries = list_entries(acl, in.templates);
    // With an owner the text lies in the owner's home directory.
    const std::string path = text_path(inv);
    cache_outcome cache;
    if (inv.cache)
        cache = settle_cache(path, in.templates.get(), rflags, inv.force);
    if (!cache.problem.empty() && inv.json)
        throw tool_error(cache.problem);
    if (inv.json) {
        json_writer json;
        json.begin_object().key("file").value(inv.input);
        json.key("entries").value(static_cast<std::int64_t>(entries.size()));
        json.key("subacls").value(static_cast<std::int64_t>(count_subacls(entries)));
        json.key("bytes").value(static_cast<std::int64_t>(acl.bytes().length));
        json.key("cached").value(cache.written || cache.current).key("output");
        inv.output.empty() ? json.null() : json.value(inv.output);
        json.key("note");
        cache.note.empty() ? json.null() : json.value(cache.note);
        print(json.end_object().str());
        return exit_ok;
    }
    std::string out = inv.input + ": " + std::to_string(entries.size()) + " entries in " +
                      std::to_string(count_subacls(entries)) + " sub-ACLs, " +
                      std::to_string(acl.bytes().length) + " bytes\n";
    if (cache.written)
        out += "cached in " + path + ".cacl\n";
    else if (cache.current)
        out += path + ".cacl is current already\n";
    if (!cache.note.empty())
        out += "note: " + cache.note + "\n";
    if (!inv.output.empty())
        out += "written to " + inv.output + "\n";
    print(out);
    if (!cache.problem.empty())
        throw tool_error(cache.problem);
    return exit_ok;
}

int run_list(const invocation &inv) {
    acl_input in(inv, SEC_F_ACL_CONVERT);
    const auto entries = list_entries(in.acl, in.templates, inv.list_type, inv.list_mech);
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

// A stream whose bytes are kept in memory.
class memory_stream {
  public:
    memory_stream() : file_(::open_memstream(&data_, &size_)) {
        if (!file_)
            throw tool_error(std::string("cannot open a memory stream: ") + std::strerror(errno));
    }
    memory_stream(const memory_stream &) = delete;
    memory_stream &operator=(const memory_stream &) = delete;
    ~memory_stream() {
        std::fclose(file_);
        std::free(data_);
    }
    std::FILE *get() { return file_; }
    // What was written so far; a write that ran out of memory is a failure.
    std::string text() {
        if (std::fflush(file_) != 0 || std::ferror(file_))
            throw tool_error(std::string("cannot keep the dump in memory: ") +
                             std::strerror(errno));
        return data_ ? std::string(data_, size_) : std::string();
    }

  private:
    char *data_ = nullptr;
    std::size_t size_ = 0;
    std::FILE *file_;
};

int run_dump(const invocation &inv) {
    acl_input in(inv, SEC_F_ACL_CONVERT);
    memory_stream lines, failures;
    sec__dump_acl_to(in.acl.get(), lines.get(), failures.get());
    // The buffer passed the library's validation, so a failure is not
    // expected; were there one, it comes first, as it always has.
    const std::string text = failures.text() + lines.text();
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
    const template_set defaults = default_templates();
    const std::vector<sec_perm_desc> &shown = templates.get() ? templates.perms : defaults.perms;
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
    case command::explain:
        return run_explain(inv);
    case command::lint:
        return run_lint(inv);
    case command::diff:
        return run_diff(inv);
    case command::install:
        return run_install(inv);
    case command::trace:
        return run_trace(inv);
    case command::none:
        break;
    }
    throw tool_error("no command given");
}

} // namespace kxtool
