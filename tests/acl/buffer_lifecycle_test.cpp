// Creating, copying, converting and releasing ACL buffers.
#include <gtest/gtest.h>

#include "acl_fixtures.h"

using namespace kxacl;
using namespace kxtest;

namespace {

// Converts (verifying) a copy of b made by sec_read_acl_from_data.
kx_int32_t convert_copy_of(bytes b) {
    owned_acl acl;
    EXPECT_EQ(sec_read_acl_from_data(static_cast<kx_int32_t>(b.size()), b.data(), acl.get()), 0);
    EXPECT_EQ(acl.contents(), b);
    return sec_convert_acl_to_host(1, acl.get());
}

TEST(AclLifecycle, CreateReadConvertRelease) {
    owned_acl acl;
    ASSERT_EQ(sec_create_empty_acl(acl.get()), SEC_S_OK);
    EXPECT_EQ(acl.contents(), empty_acl_bytes);
    EXPECT_EQ(sec_convert_acl_to_host(1, acl.get()), SEC_S_OK);
    EXPECT_EQ(acl.contents(), empty_acl_bytes);

    EXPECT_EQ(sec_read_acl_from_data(0, acl.contents().data(), acl.get()), SEC_S_BAD_PARAM);
    error_record e = expect_error(SEC_S_BAD_PARAM, MSG_2650_101);
    EXPECT_EQ(e.num(1), 1);
    EXPECT_EQ(e.num(2), 0);
    // Three bytes are taken unchecked; only the header's start passes 2650-109.
    for (bytes b : {bytes{'a', 'b', 'c'}, bytes{0x85, 2, 2}, bytes{1, 1, 2}}) {
        EXPECT_EQ(convert_copy_of(b), SEC_S_BAD_ACL);
        expect_error(SEC_S_BAD_ACL, MSG_2650_109);
    }
    EXPECT_EQ(convert_copy_of({0x85, 1, 2}), SEC_S_BAD_ACL);
    EXPECT_EQ(expect_error(SEC_S_BAD_ACL, MSG_2650_119).num(0), 3);

    sec_buffer_s released{0, nullptr};
    EXPECT_EQ(sec_release_acl(nullptr), SEC_S_OK);
    EXPECT_EQ(sec_release_acl(&released), SEC_S_OK);
    ASSERT_EQ(sec_create_empty_acl(&released), SEC_S_OK);
    EXPECT_EQ(sec_release_acl(&released), SEC_S_OK);
    EXPECT_EQ(released.value, nullptr);
    EXPECT_EQ(sec_release_acl(&released), SEC_S_OK);
    EXPECT_EQ(last_error().id, 0);
}

TEST(AclLifecycle, ReleaseFreesOnlyAclBuffers) {
    owned_acl acl(bytes{0x84, 1, 2, 0, 0});
    void *value = acl.d.value;
    EXPECT_EQ(sec_release_acl(acl.get()), SEC_S_BAD_ACL);
    expect_error(SEC_S_BAD_ACL, MSG_2650_106);
    EXPECT_EQ(acl.d.value, value); // freed again by owned_acl: no double free
    EXPECT_EQ(acl.d.length, 5);
}

TEST(ConvertAclToHost, OtherByteOrderBecomesTheWorkedExample) {
    for (unsigned char mark : {0, 1, 0xff}) {
        bytes foreign = worked_example_swapped;
        foreign[2] = mark;
        owned_acl acl(foreign);
        ASSERT_EQ(sec_convert_acl_to_host(0, acl.get()), SEC_S_OK);
        EXPECT_EQ(acl.contents(), worked_example);
    }
    owned_acl rich(swapped_order(rich_acl()));
    ASSERT_EQ(sec_convert_acl_to_host(1, rich.get()), SEC_S_OK);
    EXPECT_EQ(rich.contents(), rich_acl());
}

TEST(ConvertAclToHost, OnlyHostOrderIsValidated) {
    bytes foreign = worked_example_swapped;
    foreign[60] = 7; // ACLE version of bob's record
    owned_acl acl(foreign);
    EXPECT_EQ(sec_convert_acl_to_host(1, acl.get()), SEC_S_OK);
    EXPECT_EQ(sec_convert_acl_to_host(1, acl.get()), SEC_S_BAD_ACLE);
    EXPECT_EQ(expect_error(SEC_S_BAD_ACLE, MSG_2650_125).num(0), 7);
}

// Each makes one allocation; on failure the descriptor keeps its length.
TEST(AllocationFailure, ReadAclFromDataAndCreateEmptyAcl) {
    bytes b = worked_example;
    for (bool create : {false, true}) {
        EXPECT_EQ(for_each_allocation_failure([&](long n) {
                      owned_acl acl;
                      acl.d.length = -3;
                      kx_int32_t rc = failing_after(n, [&] {
                          return create ? sec_create_empty_acl(acl.get())
                                        : sec_read_acl_from_data(71, b.data(), acl.get());
                      });
                      if (rc != SEC_S_OK) {
                          expect_no_memory(
                              rc, {create ? "sec_create_empty_acl" : "sec_read_acl_from_data"});
                          EXPECT_EQ(last_error().num(1), create ? 5 : 71);
                          EXPECT_EQ(acl.d.length, -3);
                          EXPECT_EQ(acl.d.value, nullptr);
                      }
                      return rc;
                  }),
                  1);
    }
}

} // namespace
