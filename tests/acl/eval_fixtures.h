// Helpers of the evaluation tests, on top of the shared ACL buffer fixtures:
// identified entry records, two ACLs, group lists, the two evaluation calls
// as values, and identity handlers.
#ifndef KXACL_TEST_EVAL_FIXTURES_H
#define KXACL_TEST_EVAL_FIXTURES_H

#include <atomic>
#include <cstring>
#include <vector>

#include <kx_acl.h>

#include "acl_fixtures.h"

namespace evaltest {

using namespace kxtest;

inline bytes rec(kx_uint32_t perm, const char *id = nullptr) {
    return id ? make_record(perm, text_field(id)) : make_record(perm);
}

// User entries of "unix" (alice 0x3, bob 0x1), group entries (admin 0x4,
// staff 0x2) and an anyother entry 0x1.
inline bytes example_acl() {
    return make_acl(
        {make_subacl(SEC_ACLE_USER, 2, text_field("unix"), {rec(0x3, "alice"), rec(0x1, "bob")}),
         make_subacl(SEC_ACLE_GROUP, 2, {}, {rec(0x4, "admin"), rec(0x2, "staff")}),
         make_subacl(SEC_ACLE_ANYOTHER, 1, {}, {rec(0x1)})});
}

// Entries of every kind but unauthenticated, the expanded ones for a handler.
inline bytes sample_acl() {
    return make_acl(
        {make_subacl(SEC_ACLE_USER, 4, text_field("unix"),
                     {rec(0x1, "alice"), rec(0x2, "bob"), rec(0x4, "carol"), rec(0x8, "dave")}),
         make_subacl(SEC_ACLE_EXPANDED, 3, text_field("krb5"),
                     {rec(0x10, "zed"), rec(0x20, "pat"), rec(0x40, "*")}),
         make_subacl(SEC_ACLE_GROUP, 2, {}, {rec(0x100, "admin"), rec(0x200, "staff")}),
         make_subacl(SEC_ACLE_ANYOTHER, 1, {}, {rec(0x80)})});
}

using group_list = std::vector<sec_buffer_s>;

inline group_list groups_named(const std::vector<const char *> &names) {
    group_list groups;
    for (const char *n : names)
        groups.push_back({0, const_cast<char *>(n)});
    return groups;
}

constexpr kx_uint32_t untouched = 0xdeadbeef;

// The outcome of one evaluation; perm starts as `untouched`.
struct result {
    kx_int32_t status;
    kx_uint32_t perm;
};

inline result single(sec_acl_buffer_t acl, unsigned char type, const char *mech, const char *zmech,
                     const char *id) {
    result r{0, untouched};
    r.status = sec__single_acle_perm(acl, type, const_cast<char *>(mech), const_cast<char *>(zmech),
                                     const_cast<char *>(id), &r.perm);
    return r;
}

// A null list when empty.
inline result groups_of(sec_acl_buffer_t acl, group_list &groups, kx_int32_t count) {
    result r{0, untouched};
    r.status = sec__group_acles_perm(acl, count, groups.empty() ? nullptr : groups.data(), &r.perm);
    return r;
}
inline result groups_of(sec_acl_buffer_t acl, group_list &groups) {
    return groups_of(acl, groups, static_cast<kx_int32_t>(groups.size()));
}

inline std::atomic<int> handler_calls{0};

// Accepts "u:<name>" for the entry <name>, ordering like the plain comparison.
inline kx_int32_t prefixed_user(char *id, char *acle_id) {
    ++handler_calls;
    return std::strncmp(id, "u:", 2) != 0 ? -1 : cu_strcasecmp_posix_1(id + 2, acle_id);
}

// Matches "*" and the identity itself; on a mismatch it leaves a record,
// which evaluation must clear.
inline kx_int32_t wildcard_with_record(char *id, char *acle_id) {
    ++handler_calls;
    if (std::strcmp(acle_id, "*") == 0 || std::strcmp(id, acle_id) == 0)
        return 0;
    cu_set_error_1(99, nullptr, "other.cat", 1, 7, "mismatch");
    return std::strcmp(id, acle_id) < 0 ? -1 : 1;
}

} // namespace evaltest

#endif
