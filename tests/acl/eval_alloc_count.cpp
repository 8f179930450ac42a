// Once each request has been made, evaluations allocate nothing: records
// reuse the cleared record's block. Its own executable (malloc replaced).
#include "eval_fixtures.h"
#include "heap.h"

namespace {

using namespace evaltest;

template <typename Work> long allocations_of(Work work) {
    kxtest::heap::start_counting();
    work();
    return kxtest::heap::stop_counting();
}

TEST(EvaluationAllocCount, EvaluationsAllocateNothing) {
    ASSERT_EQ(register_sample_handlers(), SEC_S_OK);
    owned_acl acl(sample_acl());
    group_list groups = groups_named(sample_groups);
    // The first round registers tracing and makes the thread's record.
    EXPECT_GT(allocations_of([&] {
                  for (const sample_request &q : sample_requests)
                      ask_sample(acl.get(), groups, q);
              }),
              0);
    const unsigned long library_before = kxacl::mem_allocations();
    for (const sample_request &q : sample_requests) {
        SCOPED_TRACE(testing::Message() << int(q.type) << " " << (q.id ? q.id : "-"));
        result r{};
        EXPECT_EQ(allocations_of([&] {
                      for (int i = 0; i < 100; ++i)
                          r = ask_sample(acl.get(), groups, q);
                  }),
                  0);
        EXPECT_EQ(r.status, q.answer.status);
        EXPECT_EQ(r.perm, q.answer.perm);
    }
    EXPECT_EQ(kxtest::last_error().msg_num, kxacl::MSG_2650_147);
    EXPECT_EQ(kxacl::mem_allocations(), library_before);
}
} // namespace
