// Permission templates, the default set and the two translations.
#include "perms.h"

#include "frame.h"
#include "report.h"

namespace kxacl {

namespace {

sec_perm_desc acl__default_perm_list[13] = {
    {0x00000001, 'r', "read", "general purpose read operation"},
    {0x00000002, 'w', "write", "general purpose write operation"},
    {0x00000004, 'c', "control", "general purpose control operation"},
    {0x00000008, 'x', "execute", "general purpose execute operation"},
    {0x00000010, 'C', "cancel", "general purpose cancel operation"},
    {0x00000020, 'q', "query", "QBT query resource"},
    {0x00000040, 'l', "list", "QBT enumerate resource"},
    {0x00000080, 'e', "event", "QBT event registration/unregistration/quering"},
    {0x00000100, 'd', "define", "QBT define/undefine resource"},
    {0x00000200, 'v', "validate", "QBT validate resource handle"},
    {0x00000400, 's', "set", "QBT set attribute"},
    {0x00000800, 'a', "set", "QBT administrative control"},
    {0x00001000, 'o', "set", "QBT online/offline/reset resource"},
};

// The first template of the set whose field matches, or null. A set with a
// negative count or no templates has none.
template <typename Match> const sec_perm_desc *find_template(sec_perm_set_t set, Match match) {
    if (!set->perms)
        return nullptr;
    for (kx_int32_t i = 0; i < set->count; ++i)
        if (match(set->perms[i]))
            return &set->perms[i];
    return nullptr;
}

} // namespace

// The library never writes the default set; callers see it through a
// non-const pointer type only because the records are plain C.
sec_perm_set_desc acl__default_perm_set = {13, acl__default_perm_list};

kx_int32_t sec__translate_perms(const char *ps, sec_perm_set_t permset, kx_uint32_t *perm) {
    for (const char *c = ps; *c; ++c) {
        const sec_perm_desc *t =
            find_template(permset, [c](const sec_perm_desc &p) { return p.printchar == *c; });
        if (!t)
            return report<MSG_2650_146>(SEC_S_BAD_PERMISSION, static_cast<unsigned char>(*c));
        *perm |= t->code;
    }
    return SEC_S_OK;
}

kx_int32_t sec__translate_bitmask(kx_uint32_t pbm, sec_perm_set_t permset, char *perm) {
    char *out = perm;
    for (int bit = 0; bit < 32; ++bit) {
        kx_uint32_t value = kx_uint32_t{1} << bit;
        if (!(pbm & value))
            continue;
        const sec_perm_desc *t =
            find_template(permset, [value](const sec_perm_desc &p) { return p.code == value; });
        if (!t)
            return report<MSG_2650_178>(SEC_S_BAD_PERMISSION, value);
        *out++ = t->printchar;
    }
    *out = '\0';
    return SEC_S_OK;
}

} // namespace kxacl

using namespace kxacl;

extern "C" ACL_EXTERN kx_int32_t sec_translate_perms(const char *perms, sec_perm_set_t permset,
                                                     kx_uint32_t *bitmask) noexcept {
    using points = api_translate_perms;
    api_enter<points>(clears_record::no, [&] {
        trace<points::entry_data>(text(perms, "<nil>"), num(permset), num(bitmask));
    });
    kx_int32_t status = SEC_S_OK;
    if (!bitmask) {
        status = bad_param("sec_translate_perms", 3, bitmask);
    } else {
        *bitmask = 0;
        if (perms)
            status = sec__translate_perms(perms, perm_set_or_default(permset), bitmask);
    }
    return api_leave<points>(status, [&] { trace<points::exit_ok>(num(status), num(*bitmask)); });
}

extern "C" ACL_EXTERN kx_int32_t sec_translate_bitmask(kx_uint32_t bitmask, sec_perm_set_t permset,
                                                       char *perms) noexcept {
    using points = api_translate_bitmask;
    // The caller's buffer need not hold a text on entry, so its address is
    // recorded instead of its contents.
    api_enter<points>(clears_record::no,
                      [&] { trace<points::entry_data>(num(bitmask), num(permset), num(perms)); });
    kx_int32_t status = SEC_S_OK;
    if (!perms) {
        status = bad_param("sec_translate_mask", 3, perms);
    } else {
        perms[0] = '\0';
        if (bitmask != 0)
            status = sec__translate_bitmask(bitmask, perm_set_or_default(permset), perms);
    }
    return api_leave<points>(status,
                             [&] { trace<points::exit_ok>(num(status), text(perms, "<nil>")); });
}
