// ACL entries.
#include "entries.h"

#include <arpa/inet.h>
#include <netinet/in.h>
#include <cstring>

#include <kx_cu.h>

#include "alloc.h"
#include "codeset.h"
#include "frame.h"
#include "report.h"

namespace kxacl {

namespace {

// Mechanisms whose identities name a host after an '@'.
bool mech_has_host_identities(const char *mech) {
    return std::strcmp(mech, "unix") == 0 || std::strcmp(mech, "vgn2") == 0;
}

// Puts an IPv6 host part of id into its one canonical text form, so that
// one address written two ways makes one identity. *normalised stays null
// when id needs no change.
kx_int32_t normalise_host_identity(unsigned char type, const char *id,
                                   unique_mem<char> *normalised) {
    const char *at = std::strchr(id, '@');
    if (!at && type == SEC_ACLE_USER)
        return bad_param("sec_create_acle", 4, id);
    const char *host = at ? at + 1 : id;
    if (*host == '\0')
        return bad_param("sec_create_acle", 4, id);
    unsigned char address[sizeof(struct in6_addr)];
    if (inet_pton(AF_INET6, host, address) != 1)
        return SEC_S_OK;
    char canonical[80];
    if (cu_ipaddr_ntop_1(AF_INET6, address, canonical, sizeof canonical) != 0)
        return internal_error(here(src_acl), -1);
    std::size_t prefix = static_cast<std::size_t>(host - id);
    std::size_t canonical_size = std::strlen(canonical) + 1;
    std::size_t size = prefix + canonical_size;
    normalised->reset(static_cast<char *>(mem_alloc(size)));
    if (!*normalised)
        return no_memory("sec_create_acle", size);
    std::memcpy(normalised->get(), id, prefix);
    std::memcpy(normalised->get() + prefix, canonical, canonical_size);
    return SEC_S_OK;
}

// Copies a converted or given mechanism into the entry's field, refusing one
// that does not fit rather than cutting it.
kx_int32_t store_mech(sec_acle_t acle, const char *mech, std::size_t length,
                      const char *caller_mech) {
    if (length > SEC_MECH_MAX)
        return bad_param("sec_create_acle", 3, caller_mech);
    std::memcpy(acle->mech, mech, length);
    acle->mech[length] = '\0';
    return SEC_S_OK;
}

kx_int32_t fill_translated(sec_acle_t acle, const char *mech, const char *id) {
    if (type_has_mech(acle->type)) {
        std::size_t in_length = std::strlen(mech) + 1, out_length = 0;
        char *converted = nullptr;
        kx_int32_t rc = acl__convert_to_utf8(mech, &in_length, &converted, &out_length);
        if (rc != SEC_S_OK)
            return rc;
        unique_mem<char> owned(converted);
        rc = store_mech(acle, converted, std::strlen(converted), mech);
        if (rc != SEC_S_OK)
            return rc;
    }
    if (type_has_id(acle->type)) {
        std::size_t in_length = std::strlen(id) + 1, out_length = 0;
        return acl__convert_to_utf8(id, &in_length, &acle->id, &out_length);
    }
    return SEC_S_OK;
}

kx_int32_t fill_copied(sec_acle_t acle, const char *mech, const char *id) {
    if (type_has_mech(acle->type)) {
        kx_int32_t rc = store_mech(acle, mech, std::strlen(mech), mech);
        if (rc != SEC_S_OK)
            return rc;
    }
    if (type_has_id(acle->type)) {
        std::size_t length = std::strlen(id);
        acle->id = mem_strndup(id, length);
        if (!acle->id)
            return no_memory("sec__create_acle", length + 1);
    }
    return SEC_S_OK;
}

// Checks the arguments of sec_create_acle in parameter order.
kx_int32_t check_create_args(unsigned char type, const char *mech, const char *id,
                             const sec_acle_t *acle) {
    if (!valid_entry_type(type))
        return bad_param("sec_create_acle", 1, type);
    if (type_has_mech(type) && (!mech || !*mech || std::strlen(mech) > SEC_MECH_MAX))
        return bad_param("sec_create_acle", 3, mech);
    if (type_has_id(type) && (!id || !*id))
        return bad_param("sec_create_acle", 4, id);
    if (!acle)
        return bad_param("sec_create_acle", 5, acle);
    return SEC_S_OK;
}

kx_int32_t create_acle(unsigned char type, kx_uint32_t perm, const char *mech, const char *id,
                       sec_acle_t *acle) {
    kx_int32_t rc = check_create_args(type, mech, id, acle);
    if (rc != SEC_S_OK)
        return rc;
    // No entry on any later failure, the identity's own included.
    *acle = nullptr;
    unique_mem<char> normalised;
    if (type_has_mech(type) && mech_has_host_identities(mech)) {
        rc = normalise_host_identity(type, id, &normalised);
        if (rc != SEC_S_OK)
            return rc;
    }
    return sec__create_acle(type, perm, mech, normalised ? normalised.get() : id, 1, acle);
}

// Converts one stored UTF-8 text into a new text in the process codeset.
kx_int32_t display_text(const char *utf8, char **out) {
    std::size_t in_length = std::strlen(utf8) + 1, out_length = 0;
    return acl__convert_from_utf8(utf8, &in_length, out, &out_length);
}

kx_int32_t display_acle_id(sec_acle_t acle, char **mech, char **id) {
    if (!acle)
        return bad_param("sec_display_acle_id", 1, acle);
    if (!mech)
        return bad_param("sec_display_acle_id", 2, mech);
    if (!id)
        return bad_param("sec_display_acle_id", 3, id);
    *mech = nullptr;
    *id = nullptr;
    unsigned type = acle->type;
    if (type == SEC_ACLE_UNAUTHENTICATED || type == SEC_ACLE_ANYOTHER)
        return SEC_S_OK;
    if (!valid_entry_type(type))
        return report<MSG_2650_107>(SEC_S_BAD_ACLE, type);
    bool mech_missing = type_has_mech(type) && acle->mech[0] == '\0';
    if (mech_missing || !acle->id || !*acle->id)
        return report<MSG_2650_108>(SEC_S_BAD_ACLE);
    if (type == SEC_ACLE_GROUP)
        return display_text(acle->id, id);
    // The field may hold a mechanism without terminator in a caller's record.
    char stored_mech[SEC_MECH_MAX + 1] = {};
    std::memcpy(stored_mech, acle->mech, SEC_MECH_MAX);
    unique_mem<char> shown_mech, shown_id;
    char *out = nullptr;
    kx_int32_t rc = display_text(stored_mech, &out);
    shown_mech.reset(out);
    if (rc == SEC_S_OK) {
        out = nullptr;
        rc = display_text(acle->id, &out);
        shown_id.reset(out);
    }
    if (rc != SEC_S_OK)
        return rc;
    *mech = shown_mech.release();
    *id = shown_id.release();
    return SEC_S_OK;
}

// The entry's fields for trace points; a null entry records a zeroed one.
sec_acle_desc traced_acle(const sec_acle_desc *acle) {
    sec_acle_desc copy{};
    if (acle) {
        copy = *acle;
        copy.mech[SEC_MECH_MAX] = '\0';
    }
    return copy;
}

} // namespace

char type_letter(unsigned type) {
    switch (type) {
    case SEC_ACLE_UNAUTHENTICATED:
        return 'n';
    case SEC_ACLE_ANYOTHER:
        return 'o';
    case SEC_ACLE_USER:
        return 'u';
    case SEC_ACLE_EXPANDED:
        return 'e';
    case SEC_ACLE_GROUP:
        return 'g';
    default:
        return '?';
    }
}

std::size_t one_block_size(std::size_t id_size) {
    return sizeof(sec_acle_desc) + id_size;
}

sec_acle_t copy_acle_in_one_block(const sec_acle_desc &acle, const char *id, std::size_t id_size) {
    auto *copy = static_cast<sec_acle_t>(mem_alloc(one_block_size(id_size)));
    if (!copy)
        return nullptr;
    *copy = sec_acle_desc{};
    copy->perm = acle.perm;
    copy->type = acle.type;
    std::memcpy(copy->mech, acle.mech, SEC_MECH_MAX); // the last byte stays NUL
    if (id_size) {
        copy->id = reinterpret_cast<char *>(copy + 1);
        std::memcpy(copy->id, id, id_size);
    }
    return copy;
}

void release_acle(sec_acle_t acle) {
    if (acle) {
        // An identifier right behind the record shares its block.
        if (acle->id != reinterpret_cast<char *>(acle + 1))
            std::free(acle->id);
        std::free(acle);
    }
}

kx_int32_t sec__create_acle(unsigned char type, kx_uint32_t perm, const char *mech, const char *id,
                            sec_boolean_t translate, sec_acle_t *acle) {
    *acle = nullptr;
    unique_acle entry(static_cast<sec_acle_t>(mem_zalloc(sizeof(sec_acle_desc))));
    if (!entry)
        return no_memory("sec__create_acle", sizeof(sec_acle_desc));
    entry->perm = perm;
    entry->type = type;
    kx_int32_t rc =
        translate ? fill_translated(entry.get(), mech, id) : fill_copied(entry.get(), mech, id);
    if (rc != SEC_S_OK)
        return rc;
    *acle = entry.release();
    return SEC_S_OK;
}

} // namespace kxacl

using namespace kxacl;

extern "C" ACL_EXTERN kx_int32_t sec_create_acle(unsigned char type, kx_uint32_t perm,
                                                 const char *mech, const char *id,
                                                 sec_acle_t *acle) noexcept {
    using points = api_create_acle;
    api_enter<points>(clears_record::yes, [&] {
        kx_uint32_t wide_type = type;
        trace<points::entry_data>(num(wide_type), num(perm), text(mech), text(id), num(acle));
    });
    return api_leave<points>(create_acle(type, perm, mech, id, acle));
}

extern "C" ACL_EXTERN void sec_release_acle(sec_acle_t acle) noexcept {
    using points = api_release_acle;
    api_enter<points>(clears_record::no, [&] {
        sec_acle_desc e = traced_acle(acle);
        trace<points::entry_data>(num(acle), num(e.type), num(e.perm), text(e.mech), text(e.id));
    });
    release_acle(acle);
    api_leave_release<points>();
}

extern "C" ACL_EXTERN kx_int32_t sec_display_acle_id(sec_acle_t acle, char **mech,
                                                     char **id) noexcept {
    using points = api_display_acle_id;
    api_enter<points>(clears_record::yes, [&] {
        sec_acle_desc e = traced_acle(acle);
        kx_uint32_t wide_type = e.type;
        trace<points::entry_data>(num(acle), num(wide_type), num(e.perm), text(e.mech), text(e.id),
                                  num(mech), num(id));
    });
    kx_int32_t status = display_acle_id(acle, mech, id);
    return api_leave<points>(status,
                             [&] { trace<points::exit_ok>(num(status), text(*mech), text(*id)); });
}
