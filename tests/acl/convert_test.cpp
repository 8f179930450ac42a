// Moving entries between trees, sub-ACLs and whole buffers.
#include <gtest/gtest.h>

#include "acl_fixtures.h"

using namespace kxacl;
using namespace kxtest;

namespace {

// The first sub-ACL of b read into a tree, and the tree written back.
kx_int32_t reread(const bytes &b, bytes *written) {
    acl_bytes in{b.data(), b.size()};
    subacl_view v;
    EXPECT_TRUE(read_subacl(in, 5, &v));
    sec_acltree_t tree = reinterpret_cast<sec_acltree_t>(8);
    kx_int32_t rc = sec__subacl_to_acltree(in, v, &tree);
    unsigned char *subacl = nullptr;
    std::size_t length = 0;
    if (rc == SEC_S_OK && sec__acltree_to_subacl(tree, &subacl, &length) == SEC_S_OK)
        *written = bytes(subacl, subacl + length);
    EXPECT_TRUE(rc == SEC_S_OK || tree == nullptr);
    sec__free_acltree(tree);
    std::free(subacl);
    return rc;
}

TEST(AcltreesToAcl, WorkedExampleAndNoTrees) {
    EXPECT_EQ(build_acl({{SEC_ACLE_USER, 0x3, "unix", "bob"},
                         {SEC_ACLE_GROUP, 0x1, "", "staff"},
                         {SEC_ACLE_ANYOTHER, 0x1}}),
              worked_example);
    EXPECT_EQ(build_acl({}), empty_acl_bytes);
    EXPECT_EQ(swapped_order(worked_example), worked_example_swapped); // the tests' own helper
}

TEST(SubaclToAcltree, MergesAndRefuses) {
    // A later record of an identity gives the earlier one its mask.
    bytes written, bob = make_record(4, text_field("Bob"));
    ASSERT_EQ(reread(make_acl({make_subacl(16, 2, {}, {bob, make_record(1, text_field("bob"))})}),
                     &written),
              SEC_S_OK);
    EXPECT_EQ(written, make_subacl(16, 1, {}, {make_record(1, text_field("Bob"))}));
    EXPECT_EQ(reread(make_acl({make_subacl(2, 2, {}, {make_record(1), make_record(2)})}), &written),
              SEC_S_BAD_ACL);
    expect_error(SEC_S_BAD_ACL, MSG_2650_111);
    // A mnemonic longer than an entry's field is refused, not copied.
    EXPECT_NE(
        reread(make_acl({make_subacl(4, 1, text_field("0123456789abcdefg"), {bob})}), &written),
        SEC_S_OK);
    ASSERT_EQ(
        reread(make_acl({make_subacl(4, 1, text_field("0123456789abcdef"), {bob})}), &written),
        SEC_S_OK);
    EXPECT_EQ(written, make_subacl(4, 1, text_field("0123456789abcdef"), {bob}));
}

TEST(AllocationFailure, AcltreesToAcl) {
    owned_trees trees;
    ASSERT_EQ(trees.add({SEC_ACLE_USER, 0x3, "unix", "bob"}), SEC_S_OK);
    ASSERT_EQ(trees.add({SEC_ACLE_GROUP, 0x1, "", "staff"}), SEC_S_OK);
    EXPECT_GE(for_each_allocation_failure([&](long n) {
                  owned_acl acl;
                  kx_int32_t rc = failing_after(
                      n, [&] { return sec__acltrees_to_acl(trees.trees, trees.count, acl.get()); });
                  if (rc != SEC_S_OK) {
                      expect_no_memory(rc, {"sec__acltrees_to_acl", "sec__acltree_to_subacl",
                                            "sec__add_acle_to_subacl"});
                      EXPECT_EQ(acl.d.value, nullptr);
                  }
                  return rc;
              }),
              1);
}

} // namespace
