// Evaluation from many threads at once while other threads register
// handlers, so that the registry's array grows and moves under the
// lookups. Meant to run under ThreadSanitizer as well as plainly.
#include <atomic>
#include <cstdio>
#include <cstring>
#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include <kx_acl.h>
#include <kx_cu.h>

#include "eval.h"
#include "eval_fixtures.h"

using namespace kxacl;
using namespace evaltest;

namespace {

std::atomic<long> user_handler_calls{0};
std::atomic<long> expanded_handler_calls{0};

// Accepts "u:<name>" for the user entry <name>.
kx_int32_t prefixed_user(char *id, char *acle_id) {
    user_handler_calls.fetch_add(1, std::memory_order_relaxed);
    if (std::strncmp(id, "u:", 2) != 0)
        return -1;
    return cu_strcasecmp_posix_1(id + 2, acle_id);
}

// Matches an expanded entry "*" and the identity itself; leaves a record
// behind on a mismatch, which evaluation must clear in its own thread.
kx_int32_t wildcard(char *id, char *acle_id) {
    expanded_handler_calls.fetch_add(1, std::memory_order_relaxed);
    if (std::strcmp(acle_id, "*") == 0 || std::strcmp(id, acle_id) == 0)
        return 0;
    cu_set_error_1(99, nullptr, "other.cat", 1, 7, "mismatch");
    return 1;
}

// Registered while evaluations run: it must never be the handler used.
kx_int32_t late(char *, char *) {
    return 0;
}

kx_int32_t single(sec_acl_buffer_t acl, unsigned char type, const char *mech, const char *id,
                  kx_uint32_t *perm) {
    return sec__single_acle_perm(acl, type, const_cast<char *>(mech), nullptr,
                                 const_cast<char *>(id), perm);
}

// One round of requests; counts the answers that differ from the expected ones.
int evaluate_round(sec_acl_buffer_t acl, sec_buffer_t groups) {
    struct {
        unsigned char type;
        const char *mech;
        const char *id;
        kx_int32_t status;
        kx_uint32_t perm;
    } requests[] = {
        {SEC_ACLE_USER, "unix", "Bob", SEC_S_OK, 0x2},
        {SEC_ACLE_USER, "unix", "u:bob", SEC_S_BAD_ACLE, 0},
        {SEC_ACLE_USER | SEC_ACLE_HANDLER_BIT, "UNIX", "u:carol", SEC_S_OK, 0x4},
        {SEC_ACLE_USER | SEC_ACLE_HANDLER_BIT, "unix", "u:aaron", SEC_S_BAD_ACLE, 0},
        {SEC_ACLE_EXPANDED, "krb5", "pat", SEC_S_OK, 0x20},
        {SEC_ACLE_EXPANDED, "krb5", "amy", SEC_S_OK, 0x40},
        {SEC_ACLE_ANYOTHER, nullptr, nullptr, SEC_S_OK, 0x80},
    };
    int wrong = 0;
    for (const auto &r : requests) {
        kx_uint32_t perm = 0xdeadbeef;
        kx_int32_t status = single(acl, r.type, r.mech, r.id, &perm);
        if (status != r.status || perm != r.perm)
            ++wrong;
    }
    kx_uint32_t perm = 0;
    if (sec__group_acles_perm(acl, 3, groups, &perm) != SEC_S_OK || perm != 0x300)
        ++wrong;
    return wrong;
}

TEST(EvaluationThreads, EvaluateWhileRegistering) {
    owned_acl acl(
        make_acl({make_subacl(SEC_ACLE_USER, 3, text_field("unix"),
                              {rec(0x1, "alice"), rec(0x2, "bob"), rec(0x4, "carol")}),
                  make_subacl(SEC_ACLE_EXPANDED, 3, text_field("krb5"),
                              {rec(0x10, "zed"), rec(0x20, "pat"), rec(0x40, "*")}),
                  make_subacl(SEC_ACLE_GROUP, 2, {}, {rec(0x100, "admin"), rec(0x200, "staff")}),
                  make_subacl(SEC_ACLE_ANYOTHER, 1, {}, {rec(0x80)})}));
    ASSERT_EQ(sec__register_id_handler(SEC_ID_HANDLER_USER, "unix", prefixed_user), SEC_S_OK);
    ASSERT_EQ(sec__register_id_handler(SEC_ID_HANDLER_EXPANDED, "krb5", wildcard), SEC_S_OK);

    constexpr int evaluators = 4, registrars = 2, rounds = 1000, registrations = 500;
    std::atomic<int> wrong{0};
    std::atomic<int> failed_registrations{0};
    std::vector<std::thread> threads;
    for (int t = 0; t < evaluators; ++t)
        threads.emplace_back([&] {
            group_list groups({"staff", "nobody", "ADMIN"});
            for (int i = 0; i < rounds; ++i)
                wrong += evaluate_round(acl.get(), groups.get());
        });
    for (int t = 0; t < registrars; ++t)
        threads.emplace_back([&, t] {
            for (int i = 0; i < registrations; ++i) {
                std::string mech = "m";
                mech += std::to_string(t);
                mech += '-';
                mech += std::to_string(i);
                kx_uint32_t type = i % 2 ? SEC_ID_HANDLER_USER : SEC_ID_HANDLER_EXPANDED;
                // Other mechanisms, and the ones in use, which must stay unreached.
                const char *same = i % 2 ? "UNIX" : "Krb5";
                if (sec__register_id_handler(type, mech.c_str(), late) != SEC_S_OK ||
                    sec__register_id_handler(type, same, late) != SEC_S_OK)
                    ++failed_registrations;
            }
        });
    for (auto &t : threads)
        t.join();

    EXPECT_EQ(wrong, 0);
    EXPECT_EQ(failed_registrations, 0);
    EXPECT_GT(user_handler_calls, 0);
    EXPECT_GT(expanded_handler_calls, 0);
    // No registration was lost while the registry grew.
    for (int t = 0; t < registrars; ++t)
        for (int i = 0; i < registrations; ++i) {
            char mech[32];
            std::snprintf(mech, sizeof mech, "m%d-%d", t, i);
            sec_acl_id_handler h = nullptr;
            EXPECT_EQ(sec__get_id_handler(i % 2 ? SEC_ID_HANDLER_USER : SEC_ID_HANDLER_EXPANDED,
                                          mech, &h),
                      SEC_S_OK);
            EXPECT_EQ(h, late) << mech;
        }
}

} // namespace
