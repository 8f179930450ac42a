// Listing the entries of ACL buffers.
#include <gtest/gtest.h>

#include "acl_fixtures.h"

using namespace kxacl;
using namespace kxtest;

namespace {

const texts unix_users = {"4 unix Alice@node1.cluster.example.com 5",
                          "4 unix bob@node1.cluster.example.com 3",
                          "4 unix carol@node1.cluster.example.com 16"};
const char *const krb5_user = "4 krb5 admin/node1.cluster.example.com@REALM 1";

// type 0 lists everything.
texts listed(const bytes &b, unsigned char type = 0, const char *mech = nullptr) {
    owned_acl acl(b);
    owned_list list;
    EXPECT_EQ(type ? sec_list_acl_by_type(acl.get(), type, const_cast<char *>(mech), list.get())
                   : sec_list_acl(acl.get(), list.get()),
              SEC_S_OK);
    return list.described();
}

TEST(ListAcl, OrderAndSpellingAsStored) {
    texts all = {
        "2  - 8191",          "1  - 1",     krb5_user, "8 unix z*@node2 7", "8 unix a*@node3 2",
        "16  b\xc3\xb6rse 4", "16  staff 1"};
    all.insert(all.end(), unix_users.begin(), unix_users.end());
    EXPECT_EQ(listed(rich_acl()), all);
    // Neither the mechanism's case nor non-UTF-8 bytes are touched.
    bytes b = make_acl({make_subacl(
        4, 2, text_field("UniX"),
        {make_record(1, text_field("\xe9t\xe9")), make_record(2, text_field("Zo\xc3\xab"))})});
    EXPECT_EQ(listed(b), (texts{"4 UniX Zo\xc3\xab 2", "4 UniX \xe9t\xe9 1"}));
    // Records of one identity, next to each other or apart, make one entry
    // with the first spelling and the last mask.
    bytes twice = make_acl(
        {make_subacl(16, 4, {},
                     {make_record(1, text_field("Bob")), make_record(2, text_field("BOB")),
                      make_record(4, text_field("carl")), make_record(8, text_field("bob"))})});
    EXPECT_EQ(listed(twice), (texts{"16  Bob 8", "16  carl 4"}));
}

// Found by fuzzing: a sub-ACL of length 0 made a walk of all sub-ACLs read
// the same sub-ACL and its record for every count of the header, 60000
// times for 46 bytes. The records of a sub-ACL that another one follows
// must end where that one starts.
TEST(ListAcl, RecordsOfASubaclEndWhereTheNextStarts) {
    bytes repeated =
        make_acl({make_subacl(4, 1, text_field("unix"), {make_record(1, text_field("bob"))})});
    kxacl::store_u32(&repeated[5], 0);
    repeated[3] = 3;
    for (unsigned char type : {0, SEC_ACLE_USER}) {
        owned_acl acl(repeated);
        owned_list list;
        EXPECT_EQ(type ? sec_list_acl_by_type(acl.get(), type, nullptr, list.get())
                       : sec_list_acl(acl.get(), list.get()),
                  SEC_S_BAD_ACL);
        expect_error(SEC_S_BAD_ACL, MSG_2650_110);
        EXPECT_EQ(list.l.count, 0);
    }
    // Nor can a sub-ACL too short for its own header lead on to another:
    // listing and evaluation stop at the first such, rather than walking
    // the same bytes as many times as the count says.
    bytes zero_lengths = make_acl({make_subacl(2, 0, {}, {})});
    kxacl::store_u32(&zero_lengths[5], 0);
    kxacl::store_u16(&zero_lengths[3], 0xffff);
    owned_acl acl(zero_lengths);
    owned_list list;
    EXPECT_EQ(sec_list_acl(acl.get(), list.get()), SEC_S_BAD_ACL);
    expect_error(SEC_S_BAD_ACL, MSG_2650_110);
    kx_uint32_t perm = 0;
    EXPECT_EQ(sec__single_acle_perm(acl.get(), SEC_ACLE_UNAUTHENTICATED, nullptr, nullptr, nullptr,
                                    &perm),
              SEC_S_BAD_ACL);
    expect_error(SEC_S_BAD_ACL, MSG_2650_110);

    // The last sub-ACL's records may run past its length, as validation allows.
    bytes last_long = make_acl({make_subacl(2, 1, {}, {make_record(1)}),
                                make_subacl(16, 1, {}, {make_record(1, text_field("staff"))}, -7)});
    EXPECT_EQ(listed(last_long), (texts{"2  - 1", "16  staff 1"}));
}

TEST(ListAclByType, MechanismsAndTypes) {
    bytes rich = rich_acl();
    EXPECT_EQ(listed(rich, SEC_ACLE_USER, "UNIX"), unix_users);
    texts users = unix_users;
    users.insert(users.begin(), krb5_user);
    EXPECT_EQ(listed(rich, SEC_ACLE_USER, nullptr), users);
    EXPECT_EQ(listed(rich, SEC_ACLE_UNAUTHENTICATED, "a-mechanism-of-20-ch"), texts{"1  - 1"});
    EXPECT_EQ(listed(rich, SEC_ACLE_EXPANDED, "krb5"), texts{});
    EXPECT_EQ(listed(worked_example, SEC_ACLE_UNAUTHENTICATED), texts{});
}

TEST(ListAcl, EmptyAclsListNothingAndRefusalsLeaveTheList) {
    for (const bytes &b : {bytes{}, empty_acl_bytes}) {
        EXPECT_EQ(listed(b), texts{});
        EXPECT_EQ(listed(b, SEC_ACLE_GROUP), texts{});
    }
    owned_acl foreign(worked_example_swapped);
    sec_acle_list_s list{5, reinterpret_cast<sec_acle_t *>(8)};
    EXPECT_EQ(sec_list_acl(foreign.get(), &list), SEC_S_BAD_ACL);
    expect_error(SEC_S_BAD_ACL, MSG_2650_115);
    EXPECT_EQ(sec_list_acl_by_type(foreign.get(), SEC_ACLE_USER, nullptr, &list), SEC_S_BAD_ACL);
    expect_error(SEC_S_BAD_ACL, MSG_2650_115);
    sec_buffer_s no_value{71, nullptr};
    EXPECT_EQ(sec_list_acl(&no_value, &list), SEC_S_BAD_ACL);
    expect_error(SEC_S_BAD_ACL, MSG_2650_109);
    EXPECT_EQ(list.count, 5);
    EXPECT_EQ(list.acles, reinterpret_cast<sec_acle_t *>(8));
}

TEST(ListAcl, ReleaseEmptiesTheListOnce) {
    owned_acl acl(worked_example);
    sec_acle_list_s list{0, nullptr};
    ASSERT_EQ(sec_list_acl(acl.get(), &list), SEC_S_OK);
    ASSERT_EQ(list.count, 3);
    sec_release_aclelist(&list);
    EXPECT_EQ(list.count, 0);
    EXPECT_EQ(list.acles, nullptr);
    sec_release_aclelist(&list);
    sec_release_aclelist(nullptr);
}

// Every allocation of a listing fails in turn: the list ends empty. Two
// group entries in order take the list and one block per entry; the other
// listings build trees as well.
TEST(AllocationFailure, ListAclAndListAclByType) {
    bytes rich = rich_acl();
    for (auto [type, allocations] :
         {std::pair<unsigned char, long>{0, 10}, {SEC_ACLE_USER, 6}, {SEC_ACLE_GROUP, 3}}) {
        EXPECT_GE(for_each_allocation_failure([&](long n) {
                      owned_acl acl(rich);
                      owned_list list;
                      kx_int32_t rc = failing_after(n, [&] {
                          return type ? sec_list_acl_by_type(acl.get(), type, nullptr, list.get())
                                      : sec_list_acl(acl.get(), list.get());
                      });
                      if (rc != SEC_S_OK) {
                          expect_no_memory(rc, {"sec__create_acle", "sec__add_acle_to_tree",
                                                "sec__acltree_to_aclelist"});
                          EXPECT_EQ(list.l.count, 0);
                          EXPECT_EQ(list.l.acles, nullptr);
                      }
                      return rc;
                  }),
                  allocations);
    }
}

} // namespace
