// Counts every heap allocation of the process while evaluations run, by
// taking the place of the C library's allocation functions (and so of
// operator new, which calls them). Successful evaluations with tracing off
// must allocate nothing at all. An executable of its own because it
// replaces the allocator of the whole process; not built under the
// sanitizers, which bring their own.
#include <atomic>
#include <cstddef>
#include <cstring>

#include <gtest/gtest.h>

#include <kx_acl.h>
#include <kx_cu.h>

#include "alloc.h"
#include "eval_fixtures.h"
#include "heap.h"

namespace {

using namespace evaltest;

// Counts the allocations of work().
template <typename Work> long allocations_of(Work work) {
    kxtest::heap::start_counting();
    work();
    return kxtest::heap::stop_counting();
}

// Handlers that allocate nothing themselves: one compares like the plain
// comparison, the other accepts one identity and rejects the rest.
kx_int32_t same_text(char *id, char *acle_id) {
    return cu_strcasecmp_posix_1(id, acle_id);
}
kx_int32_t only_pat(char *id, char *acle_id) {
    return std::strcmp(id, "pat") == 0 && std::strcmp(acle_id, "pat") == 0 ? 0 : 1;
}

class EvaluationAllocCount : public testing::Test {
  protected:
    void SetUp() override {
        ASSERT_EQ(sec__register_id_handler(SEC_ID_HANDLER_USER, "unix", same_text), SEC_S_OK);
        ASSERT_EQ(sec__register_id_handler(SEC_ID_HANDLER_EXPANDED, "krb5", only_pat), SEC_S_OK);
    }

    kx_int32_t single(unsigned char type, const char *mech, const char *id, kx_uint32_t *perm) {
        return sec__single_acle_perm(acl.get(), type, const_cast<char *>(mech), nullptr,
                                     const_cast<char *>(id), perm);
    }

    owned_acl acl{make_acl(
        {make_subacl(SEC_ACLE_USER, 4, text_field("unix"),
                     {rec(0x1, "alice"), rec(0x2, "bob"), rec(0x4, "carol"), rec(0x8, "dave")}),
         make_subacl(SEC_ACLE_EXPANDED, 2, text_field("krb5"),
                     {rec(0x10, "zed"), rec(0x20, "pat")}),
         make_subacl(SEC_ACLE_GROUP, 2, {}, {rec(0x100, "admin"), rec(0x200, "staff")}),
         make_subacl(SEC_ACLE_ANYOTHER, 1, {}, {rec(0x80)})})};
    group_list groups{{"wheel", "staff", "nobody", "admin"}};
};

TEST_F(EvaluationAllocCount, CounterSeesAllocations) {
    long n = allocations_of([] {
        void *volatile p = std::malloc(16);
        std::free(p);
    });
    EXPECT_EQ(n, 1);
}

TEST_F(EvaluationAllocCount, SuccessfulEvaluationsAllocateNothing) {
    struct {
        const char *what;
        unsigned char type;
        const char *mech;
        const char *id;
        kx_uint32_t perm;
    } requests[] = {
        {"user, first entry", SEC_ACLE_USER, "unix", "alice", 0x1},
        {"user, last entry", SEC_ACLE_USER, "UNIX", "Dave", 0x8},
        {"user through its handler", SEC_ACLE_USER | SEC_ACLE_HANDLER_BIT, "unix", "carol", 0x4},
        {"expanded after a rejection", SEC_ACLE_EXPANDED, "krb5", "pat", 0x20},
        {"anyother", SEC_ACLE_ANYOTHER, nullptr, nullptr, 0x80},
    };
    // The first call of the process registers tracing, which may allocate.
    kx_uint32_t perm = 0;
    ASSERT_EQ(single(SEC_ACLE_ANYOTHER, nullptr, nullptr, &perm), SEC_S_OK);

    unsigned long library_before = kxacl::mem_allocations();
    for (const auto &r : requests) {
        kx_int32_t status = -1;
        long n = allocations_of([&] {
            for (int i = 0; i < 100; ++i)
                status = single(r.type, r.mech, r.id, &perm);
        });
        EXPECT_EQ(n, 0) << r.what;
        EXPECT_EQ(status, SEC_S_OK) << r.what;
        EXPECT_EQ(perm, r.perm) << r.what;
    }
    kx_int32_t status = -1;
    long n = allocations_of([&] {
        for (int i = 0; i < 100; ++i)
            status = sec__group_acles_perm(acl.get(), groups.count(), groups.get(), &perm);
    });
    EXPECT_EQ(n, 0);
    EXPECT_EQ(status, SEC_S_OK);
    EXPECT_EQ(perm, 0x300u);
    EXPECT_EQ(kxacl::mem_allocations(), library_before);
}

// A requester without an entry is refused with an error record; the next
// call clears it, and its block holds the next refusal's record, so that
// refusals after the first allocate nothing either.
TEST_F(EvaluationAllocCount, RepeatedRefusalsAllocateNothing) {
    kx_uint32_t perm = 0;
    ASSERT_EQ(single(SEC_ACLE_USER, "unix", "aaron", &perm), SEC_S_BAD_ACLE);
    kx_int32_t status = -1;
    long n = allocations_of([&] {
        for (int i = 0; i < 100; ++i)
            status = single(SEC_ACLE_USER, "unix", i % 2 ? "zed" : "aaron", &perm);
    });
    EXPECT_EQ(status, SEC_S_BAD_ACLE);
    EXPECT_EQ(n, 0);
    EXPECT_EQ(kxtest::last_error().msg_num, kxacl::MSG_2650_147);
}

} // namespace
