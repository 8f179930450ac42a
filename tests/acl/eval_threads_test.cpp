// Evaluation from many threads while others register handlers, so that
// the registry's array moves under the lookups. Also for TSan.
#include <thread>

#include "eval.h"
#include "eval_fixtures.h"

using namespace kxacl;
using namespace evaltest;

namespace {

// Registered while evaluations run: it must never be the handler used.
kx_int32_t late(char *, char *) {
    return 0;
}
std::string mech_of(int registrar, int i) {
    return std::to_string(registrar) + '-' + std::to_string(i);
}
kx_uint32_t type_of(int i) {
    return i % 2 ? SEC_ID_HANDLER_USER : SEC_ID_HANDLER_EXPANDED;
}

TEST(EvaluationThreads, EvaluateWhileRegistering) {
    owned_acl acl(sample_acl());
    ASSERT_EQ(register_sample_handlers(), SEC_S_OK);
    constexpr int evaluators = 4, registrars = 2, rounds = 1000, registrations = 500;
    std::atomic<int> wrong{0}, failed_registrations{0};
    std::vector<std::thread> threads;
    // The expanded handler leaves records that each thread must clear.
    for (int t = 0; t < evaluators; ++t)
        threads.emplace_back([&] {
            group_list groups = groups_named(sample_groups);
            for (int i = 0; i < rounds; ++i)
                for (const sample_request &q : sample_requests) {
                    result r = ask_sample(acl.get(), groups, q);
                    wrong += r.status != q.answer.status || r.perm != q.answer.perm;
                }
        });
    // Other mechanisms, and the ones in use, which must stay unreached.
    for (int t = 0; t < registrars; ++t)
        threads.emplace_back([&, t] {
            for (int i = 0; i < registrations; ++i)
                failed_registrations +=
                    sec__register_id_handler(type_of(i), mech_of(t, i).c_str(), late) != SEC_S_OK ||
                    sec__register_id_handler(type_of(i), i % 2 ? "UNIX" : "Krb5", late) != SEC_S_OK;
        });
    for (auto &t : threads)
        t.join();
    EXPECT_EQ(wrong, 0);
    EXPECT_EQ(failed_registrations, 0);
    // No registration was lost while the registry grew.
    for (int t = 0; t < registrars; ++t)
        for (int i = 0; i < registrations; ++i) {
            sec_acl_id_handler h = nullptr;
            EXPECT_EQ(sec__get_id_handler(type_of(i), mech_of(t, i).c_str(), &h), SEC_S_OK);
            EXPECT_EQ(h, late) << mech_of(t, i);
        }
}
} // namespace
