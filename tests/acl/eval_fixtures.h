// Helpers of the evaluation tests.
#ifndef KXACL_TEST_EVAL_FIXTURES_H
#define KXACL_TEST_EVAL_FIXTURES_H

#include <atomic>
#include <cstring>

#include "acl_fixtures.h"

namespace evaltest {

using namespace kxtest;

inline bytes rec(kx_uint32_t perm, const char *id = nullptr) {
    return id ? make_record(perm, text_field(id)) : make_record(perm);
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
constexpr kx_uint32_t untouched = 0xdeadbeef; // a result's perm before the call
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
inline result groups_of(sec_acl_buffer_t acl, group_list &groups, kx_int32_t count) {
    result r{0, untouched};
    r.status = sec__group_acles_perm(acl, count, groups.empty() ? nullptr : groups.data(), &r.perm);
    return r;
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

// Requests on sample_acl with register_sample_handlers; groups: sample_groups.
struct sample_request {
    unsigned char type;
    const char *mech, *id;
    result answer;
};
inline const sample_request sample_requests[] = {
    {SEC_ACLE_ANYOTHER, nullptr, nullptr, {SEC_S_OK, 0x80}},
    {SEC_ACLE_USER, "unix", "alice", {SEC_S_OK, 0x1}},
    {SEC_ACLE_USER, "UNIX", "Dave", {SEC_S_OK, 0x8}},
    {SEC_ACLE_USER, "unix", "u:bob", {SEC_S_BAD_ACLE, 0}},
    {SEC_ACLE_USER | SEC_ACLE_HANDLER_BIT, "UNIX", "u:carol", {SEC_S_OK, 0x4}},
    {SEC_ACLE_USER | SEC_ACLE_HANDLER_BIT, "unix", "u:aaron", {SEC_S_BAD_ACLE, 0}},
    {SEC_ACLE_EXPANDED, "krb5", "pat", {SEC_S_OK, 0x20}}, // after a rejection
    {SEC_ACLE_EXPANDED, "krb5", "amy", {SEC_S_OK, 0x40}},
    {SEC_ACLE_GROUP, nullptr, nullptr, {SEC_S_OK, 0x300}},
    {SEC_ACLE_USER, "unix", "zed", {SEC_S_BAD_ACLE, 0}},
};
inline const std::vector<const char *> sample_groups = {"wheel", "staff", "nobody", "ADMIN"};
inline kx_int32_t register_sample_handlers() {
    kx_int32_t rc = sec__register_id_handler(SEC_ID_HANDLER_USER, "unix", prefixed_user);
    return rc ? rc
              : sec__register_id_handler(SEC_ID_HANDLER_EXPANDED, "krb5", wildcard_with_record);
}
inline result ask_sample(sec_acl_buffer_t acl, group_list &groups, const sample_request &q) {
    return q.type == SEC_ACLE_GROUP ? groups_of(acl, groups, static_cast<kx_int32_t>(groups.size()))
                                    : single(acl, q.type, q.mech, nullptr, q.id);
}
} // namespace evaltest

#endif
