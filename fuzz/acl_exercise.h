// Everything a caller can do with an ACL buffer, run on fuzzed bytes: the
// readers (listing, evaluation, dump) straight on the bytes, which they must
// never read past; conversion with and without validation; and, on copies,
// adding and deleting entries. A buffer that validates must then also list,
// and every edit of it must leave a buffer that validates again.
#ifndef KXACL_FUZZ_ACL_EXERCISE_H
#define KXACL_FUZZ_ACL_EXERCISE_H

#include <algorithm>
#include <string>
#include <vector>

#include "fuzz_support.h"

namespace kxfuzz {

inline bool valid_type(unsigned t) {
    return t == SEC_ACLE_UNAUTHENTICATED || t == SEC_ACLE_ANYOTHER || t == SEC_ACLE_USER ||
           t == SEC_ACLE_EXPANDED || t == SEC_ACLE_GROUP;
}
inline bool has_mech(unsigned t) {
    return t == SEC_ACLE_USER || t == SEC_ACLE_EXPANDED;
}
inline bool has_id(unsigned t) {
    return has_mech(t) || t == SEC_ACLE_GROUP;
}

// One listed entry, copied out of the list.
struct listed {
    unsigned char type;
    std::string mech;
    std::string id;
    kx_uint32_t perm;
};

// Identity handlers of the mechanism "unix", registered once per process,
// so that evaluations take the handler paths too. The user handler orders
// identities as the buffer does.
inline kx_int32_t same_identity(char *id, char *acle_id) {
    return cu_strcasecmp_posix_1(id, acle_id);
}
inline void register_handlers() {
    checked(sec__register_id_handler(SEC_ID_HANDLER_USER, "unix", same_identity),
            "sec__register_id_handler");
    checked(sec__register_id_handler(SEC_ID_HANDLER_EXPANDED, "unix", same_identity),
            "sec__register_id_handler");
}

// What every buffer target does once, from LLVMFuzzerInitialize.
inline void prepare_process() {
    trace_to_null();
    register_handlers();
}

// Readers and edits look at this many listed entries at most, so that a
// long buffer does not make one input run for seconds.
inline constexpr std::size_t entries_examined = 48;

// Checks a list as a listing function handed it out, and copies it.
inline void take_list(const sec_acle_list_s &l, kx_int32_t rc, bool valid,
                      std::vector<listed> *out) {
    if (rc != SEC_S_OK) {
        expect(l.count == 0 && !l.acles, "a failed listing left entries", l.count);
        return;
    }
    expect(l.count >= 0 && (l.count == 0) == (l.acles == nullptr), "list shape", l.count);
    for (kx_int32_t i = 0; i < l.count; ++i) {
        const sec_acle_desc *a = l.acles[i];
        expect(a != nullptr, "null entry in a list", i);
        expect(std::memchr(a->mech, '\0', sizeof a->mech) != nullptr, "unterminated mech", i);
        if (valid) {
            expect(valid_type(a->type), "listed entry of no type", a->type);
            expect((a->id != nullptr) == has_id(a->type), "identity presence", a->type);
            expect(has_mech(a->type) || a->mech[0] == '\0', "mech where none belongs", a->type);
        }
        out->push_back({a->type, a->mech, a->id ? a->id : "", a->perm});
    }
}

inline std::vector<listed> list_everything(sec_buffer_s *acl, bool valid) {
    std::vector<listed> all;
    owned_list list;
    kx_int32_t rc = checked(sec_list_acl(acl, &list.l), "sec_list_acl");
    if (valid)
        expect(rc == SEC_S_OK, "a validated buffer does not list", rc);
    take_list(list.l, rc, valid, &all);
    return all;
}

inline void list_each_type(sec_buffer_s *acl, bool valid, const std::vector<listed> &all) {
    std::vector<std::string> mechs{"unix"};
    for (const listed &e : all)
        if (has_mech(e.type) && !e.mech.empty() && mechs.size() < 4 &&
            std::find(mechs.begin(), mechs.end(), e.mech) == mechs.end())
            mechs.push_back(e.mech);
    for (unsigned char type : {1, 2, 4, 8, 16}) {
        std::vector<const char *> choices{nullptr};
        if (has_mech(type))
            for (const std::string &m : mechs)
                choices.push_back(m.c_str());
        for (const char *mech : choices) {
            owned_list list;
            char *m = const_cast<char *>(mech);
            kx_int32_t rc =
                checked(sec_list_acl_by_type(acl, type, m, &list.l), "sec_list_acl_by_type");
            if (valid)
                expect(rc == SEC_S_OK, "a validated buffer does not list by type", rc);
            std::vector<listed> some;
            take_list(list.l, rc, valid, &some);
            for (const listed &e : some)
                expect(!valid || e.type == type, "listed by type, another type came", e.type);
        }
    }
}

inline void evaluate_one(sec_buffer_s *acl, unsigned char type, const char *mech, const char *zmech,
                         const char *id) {
    kx_uint32_t perm = 0;
    checked(sec__single_acle_perm(acl, type, const_cast<char *>(mech), const_cast<char *>(zmech),
                                  const_cast<char *>(id), &perm),
            "sec__single_acle_perm");
}

// Every kind of evaluation: fixed requests, and one for each listed entry.
inline void evaluate(sec_buffer_s *acl, const std::vector<listed> &all) {
    evaluate_one(acl, SEC_ACLE_UNAUTHENTICATED, nullptr, nullptr, nullptr);
    evaluate_one(acl, SEC_ACLE_ANYOTHER, nullptr, nullptr, nullptr);
    evaluate_one(acl, SEC_ACLE_USER, "unix", nullptr, "bob");
    evaluate_one(acl, SEC_ACLE_USER | SEC_ACLE_HANDLER_BIT, "unix", "krb5", "bob");
    evaluate_one(acl, SEC_ACLE_EXPANDED, "unix", nullptr, "bob@node");
    evaluate_one(acl, SEC_ACLE_GROUP, nullptr, nullptr, "staff");
    std::vector<sec_buffer_s> groups;
    std::size_t n = std::min(all.size(), entries_examined);
    for (std::size_t i = 0; i < n; ++i) {
        const listed &e = all[i];
        evaluate_one(acl, e.type, e.mech.c_str(), nullptr, e.id.c_str());
        if (e.type == SEC_ACLE_USER)
            evaluate_one(acl, e.type | SEC_ACLE_HANDLER_BIT, e.mech.c_str(), nullptr, e.id.c_str());
        if (e.type == SEC_ACLE_GROUP)
            groups.push_back(
                {static_cast<kx_int32_t>(e.id.size() + 1), const_cast<char *>(e.id.c_str())});
    }
    char staff[] = "staff";
    groups.push_back({6, staff});
    kx_uint32_t perm = 0;
    auto count = static_cast<kx_int32_t>(groups.size());
    checked(sec__group_acles_perm(acl, count, groups.data(), &perm), "sec__group_acles_perm");
    checked(sec__group_acles_perm(acl, 0, nullptr, &perm), "sec__group_acles_perm");
}

inline void dump(sec_buffer_s *acl) {
    silenced quiet;
    sec__dump_acl(acl);
}

// Validates a copy of a host-order buffer; true when the bytes pass, which
// leaves them unchanged. A buffer of the other order is not valid as it is.
inline bool validates(const sec_buffer_s &acl) {
    if (acl.length < 3 || static_cast<const unsigned char *>(acl.value)[2] != 2)
        return false;
    owned_acl copy(acl.value, acl.value ? static_cast<std::size_t>(acl.length) : 0);
    kx_int32_t rc = checked(sec_convert_acl_to_host(1, &copy.d), "sec_convert_acl_to_host");
    if (rc == SEC_S_OK && acl.value)
        expect(copy.contents() == owned_acl(acl.value, acl.length).contents(),
               "validation changed the bytes");
    return rc == SEC_S_OK;
}

// One edit of a copy: a failure leaves the bytes as they were (a failed
// allocation aside); an edit of a valid buffer leaves a valid buffer.
template <typename Edit>
inline void edit_copy(const sec_buffer_s &acl, bool valid, const char *what, Edit edit) {
    owned_acl copy(acl.value, acl.value ? static_cast<std::size_t>(acl.length) : 0);
    std::vector<unsigned char> before = copy.contents();
    kx_int32_t rc = checked(edit(&copy.d), what);
    if (rc != SEC_S_OK && rc != SEC_S_NO_MEMORY)
        expect(copy.contents() == before, "a failed edit changed the buffer", rc);
    if (rc == SEC_S_OK && valid) {
        expect(validates(copy.d), "an edit made a valid buffer invalid");
        list_everything(&copy.d, true);
    }
}

inline void edit(const sec_buffer_s &acl, bool valid, const std::vector<listed> &all) {
    sec_acle_desc added[] = {{3, "unix", SEC_ACLE_USER, const_cast<char *>("bob")},
                             {1, "KRB5", SEC_ACLE_USER, const_cast<char *>("admin@REALM")},
                             {5, "", SEC_ACLE_GROUP, const_cast<char *>("Staff")},
                             {7, "", SEC_ACLE_ANYOTHER, nullptr},
                             {9, "unix", SEC_ACLE_EXPANDED, const_cast<char *>("z*@node")}};
    for (sec_acle_desc &a : added) {
        edit_copy(acl, valid, "sec_add_acle_to_acl",
                  [&](sec_buffer_s *b) { return sec_add_acle_to_acl(&a, b); });
        edit_copy(acl, valid, "sec_add_acle_to_acl2",
                  [&](sec_buffer_s *b) { return sec_add_acle_to_acl2(&a, b); });
    }
    edit_copy(acl, valid, "sec_del_acle_from_acl",
              [&](sec_buffer_s *b) { return sec_del_acle_from_acl(&added[0], b); });
    std::size_t n = std::min(all.size(), entries_examined / 4);
    for (std::size_t i = 0; i < n; ++i) {
        sec_acle_desc e{};
        e.type = all[i].type;
        std::strncpy(e.mech, all[i].mech.c_str(), SEC_MECH_MAX);
        std::string id = all[i].id;
        e.id = has_id(e.type) ? id.data() : nullptr;
        edit_copy(acl, valid, "sec_del_acle_from_acl",
                  [&](sec_buffer_s *b) { return sec_del_acle_from_acl(&e, b); });
    }
}

// The bytes as a caller's buffer in host byte order: read them in, use them
// unvalidated, then validated when they pass.
inline void exercise_host_order(const unsigned char *data, std::size_t size) {
    sec_buffer_s acl{0, nullptr};
    if (size > 0) {
        kx_int32_t rc = checked(sec_read_acl_from_data(static_cast<kx_int32_t>(size),
                                                       const_cast<unsigned char *>(data), &acl),
                                "sec_read_acl_from_data");
        expect(rc == SEC_S_OK, "sec_read_acl_from_data", rc);
    }
    owned_acl held(acl.value, acl.value ? size : 0);
    std::free(acl.value);

    // A host-order buffer is left as it is by a conversion without validation.
    owned_acl unverified(held.d.value, size);
    if (checked(sec_convert_acl_to_host(0, &unverified.d), "sec_convert_acl_to_host") == 0 &&
        size > 2 && data[2] == 2)
        expect(unverified.contents() == held.contents(), "conversion changed host-order bytes");

    bool valid = size > 0 && validates(held.d);
    std::vector<listed> all = list_everything(&held.d, valid);
    list_each_type(&held.d, valid, all);
    evaluate(&held.d, all);
    dump(&held.d);
    // The empty ACL is one that edits accept.
    edit(held.d, valid || size == 0, all);
    if (size > 0) {
        checked(sec_release_acl(&held.d), "sec_release_acl");
        expect(!held.d.value || held.contents().at(0) != 0x85, "released ACL still held");
    }
}

} // namespace kxfuzz

#endif
