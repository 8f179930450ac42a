#include "entries.h"

#include <algorithm>
#include <array>
#include <cinttypes>
#include <cstdio>
#include <cstring>

#include <kx_cu.h>

#include "unique_mem.h"

namespace kxtool {
namespace {

constexpr std::array<type_names, 5> types = {{{SEC_ACLE_UNAUTHENTICATED, 'n', "unauthenticated"},
                                              {SEC_ACLE_ANYOTHER, 'o', "anyother"},
                                              {SEC_ACLE_USER, 'u', "user"},
                                              {SEC_ACLE_EXPANDED, 'e', "expanded"},
                                              {SEC_ACLE_GROUP, 'g', "group"}}};

// An entry list that the library filled, released on destruction.
struct entry_list {
    sec_acle_list_desc list{0, nullptr};
    ~entry_list() { sec_release_aclelist(&list); }
};

// The stand-in handler of expanded entries: the same identity, byte for
// byte. The family's daemons register their mechanisms' own handlers.
kx_int32_t same_identity(char *id, char *acle_id) {
    return std::strcmp(id, acle_id) == 0 ? 0 : 1;
}

} // namespace

void print(const std::string &text) {
    std::fwrite(text.data(), 1, text.size(), stdout);
}

std::string hex_mask(std::uint32_t mask) {
    char text[16];
    std::snprintf(text, sizeof text, "0x%08" PRIx32, mask);
    return text;
}

unsigned char type_code(char letter) {
    for (const auto &t : types)
        if (t.letter == letter)
            return t.code;
    return 0;
}

const type_names &names_of(unsigned char code) {
    for (const auto &t : types)
        if (t.code == code)
            return t;
    static constexpr type_names unknown{0, '?', "unknown"};
    return unknown;
}

std::optional<std::string> perm_string(std::uint32_t mask, template_set &templates) {
    char text[33];
    if (sec_translate_bitmask(mask, templates.get(), text) != SEC_S_OK) {
        cu_set_no_error_1();
        return std::nullopt;
    }
    return std::string(text);
}

std::string grant_text(std::uint32_t mask, template_set &templates) {
    const std::optional<std::string> perms = perm_string(mask, templates);
    return (!perms ? "?" : mask == 0 ? "-" : *perms) + " " + hex_mask(mask);
}

void write_grant(json_writer &json, std::uint32_t mask, template_set &templates) {
    const std::optional<std::string> perms = perm_string(mask, templates);
    json.key("perms");
    perms ? json.value(*perms) : json.null();
    json.key("mask").value(static_cast<std::int64_t>(mask));
}

shown_entry show(const sec_acle_desc &acle, template_set &templates) {
    shown_entry e{&names_of(acle.type), {}, {}, acle.mech, acle.id ? acle.id : "", {}, acle.perm};
    char *mech_text = nullptr, *id_text = nullptr;
    const bool displayed =
        sec_display_acle_id(const_cast<sec_acle_t>(&acle), &mech_text, &id_text) == SEC_S_OK;
    const kx::unique_mem<char> mech(mech_text), id(id_text);
    if (displayed) {
        e.mech = mech ? mech.get() : "";
        e.id = id ? id.get() : "";
    } else {
        cu_set_no_error_1();
        e.mech = e.raw_mech;
        e.id = e.raw_id;
    }
    e.perms = perm_string(acle.perm, templates);
    return e;
}

std::vector<shown_entry> list_entries(acl_buffer &acl, template_set &templates, char type,
                                      const std::string &mech) {
    entry_list entries;
    if (acl.bytes().length == 0)
        return {};
    if (type == 0)
        check_status(sec_list_acl(acl.get(), &entries.list));
    else
        check_status(sec_list_acl_by_type(acl.get(), type_code(type),
                                          mech.empty() ? nullptr : const_cast<char *>(mech.c_str()),
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

std::string entry_identity(const shown_entry &e) {
    std::string text(1, e.type->letter);
    for (const std::string *part : {&e.mech, &e.id})
        if (!part->empty())
            text += " " + *part;
    return text;
}

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

} // namespace kxtool
