// Counts every heap allocation of the process while evaluations run, by
// taking the place of the C library's allocation functions (and so of
// operator new). Evaluations with tracing off allocate nothing, but for a
// thread's first refusal record. An executable of its own because it
// replaces the whole process's allocator; not built under the sanitizers.
#include <cstring>

#include <gtest/gtest.h>

#include <kx_acl.h>

#include "alloc.h"
#include "eval_fixtures.h"
#include "heap.h"
#include "messages.h"

namespace {

using namespace evaltest;

template <typename Work> long allocations_of(Work work) {
    kxtest::heap::start_counting();
    work();
    return kxtest::heap::stop_counting();
}

// Accepts "pat" alone, allocating nothing (nor any record) for the others.
kx_int32_t only_pat(char *id, char *acle_id) {
    return std::strcmp(id, "pat") == 0 && std::strcmp(acle_id, "pat") == 0 ? 0 : 1;
}

TEST(EvaluationAllocCount, EvaluationsAllocateNothing) {
    ASSERT_EQ(sec__register_id_handler(SEC_ID_HANDLER_USER, "unix", prefixed_user), SEC_S_OK);
    ASSERT_EQ(sec__register_id_handler(SEC_ID_HANDLER_EXPANDED, "krb5", only_pat), SEC_S_OK);
    owned_acl acl(sample_acl());
    group_list groups = groups_named({"wheel", "staff", "nobody", "admin"});
    const struct {
        unsigned char type;
        const char *mech, *id;
        result answer;
    } requests[] = {
        {SEC_ACLE_ANYOTHER, nullptr, nullptr, {SEC_S_OK, 0x80}},
        {SEC_ACLE_USER, "unix", "alice", {SEC_S_OK, 0x1}},
        {SEC_ACLE_USER, "UNIX", "Dave", {SEC_S_OK, 0x8}},
        {SEC_ACLE_USER | SEC_ACLE_HANDLER_BIT, "unix", "u:carol", {SEC_S_OK, 0x4}},
        {SEC_ACLE_EXPANDED, "krb5", "pat", {SEC_S_OK, 0x20}}, // after a rejection
        {SEC_ACLE_GROUP, nullptr, nullptr, {SEC_S_OK, 0x300}},
        // A refusal's record takes the block of the record the call cleared:
        // shorter, then longer than the one before.
        {SEC_ACLE_USER, "unix", "zed", {SEC_S_BAD_ACLE, 0}},
        {SEC_ACLE_USER, "unix", "aaron", {SEC_S_BAD_ACLE, 0}},
    };
    auto ask = [&](const auto &q) {
        return q.type == SEC_ACLE_GROUP ? groups_of(acl.get(), groups)
                                        : single(acl.get(), q.type, q.mech, nullptr, q.id);
    };
    // The first call of the process registers tracing, which may allocate;
    // the first refusal of a thread makes its record block.
    ASSERT_EQ(ask(requests[0]).status, SEC_S_OK);
    EXPECT_GT(allocations_of([&] { ask(requests[7]); }), 0);

    const unsigned long library_before = kxacl::mem_allocations();
    for (const auto &q : requests) {
        SCOPED_TRACE(testing::Message() << int(q.type) << " " << (q.id ? q.id : "-"));
        result r{};
        EXPECT_EQ(allocations_of([&] {
                      for (int i = 0; i < 100; ++i)
                          r = ask(q);
                  }),
                  0);
        EXPECT_EQ(r.status, q.answer.status);
        EXPECT_EQ(r.perm, q.answer.perm);
    }
    EXPECT_EQ(kxtest::last_error().msg_num, kxacl::MSG_2650_147);
    EXPECT_EQ(kxacl::mem_allocations(), library_before);
}

} // namespace
