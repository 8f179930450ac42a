// ACL buffers through the exported functions.
#include <gtest/gtest.h>
#include "acl_fixtures.h"

using namespace kxacl;
using namespace kxtest;

namespace {
TEST(AclLifecycle, CreateAndRelease) {
    owned_acl acl;
    ASSERT_EQ(sec_create_empty_acl(acl.get()), SEC_S_OK);
    EXPECT_EQ(acl.contents(), empty_acl_bytes);
    sec_buffer_s released{0, nullptr};
    EXPECT_EQ(sec_release_acl(nullptr), SEC_S_OK);
    EXPECT_EQ(sec_release_acl(&released), SEC_S_OK);
    ASSERT_EQ(sec_create_empty_acl(&released), SEC_S_OK);
    EXPECT_EQ(sec_release_acl(&released), SEC_S_OK);
    EXPECT_TRUE(released.value == nullptr && released.length == 0);
    EXPECT_EQ(sec_release_acl(&released), SEC_S_OK);
    EXPECT_EQ(last_error().id, 0);
    // A list is emptied once; releasing it again, or none, does nothing.
    owned_acl three(worked_example);
    sec_acle_list_s list{0, nullptr};
    ASSERT_EQ(sec_list_acl(three.get(), &list), SEC_S_OK);
    ASSERT_EQ(list.count, 3);
    sec_release_aclelist(&list);
    EXPECT_TRUE(list.count == 0 && list.acles == nullptr);
    sec_release_aclelist(&list);
    sec_release_aclelist(nullptr);
}

// Copies converted: three bytes are taken unchecked; a buffer of the other
// order is converted whatever its mark; only host order is validated.
TEST(ConvertAclToHost, Outcomes) {
    bytes bad_version = worked_example_swapped, converted = worked_example;
    bad_version[60] = 7; // the ACLE version of bob's record
    converted[60] = 7;
    const bytes rich = rich_acl();
    struct {
        bytes in;
        sec_boolean_t verify;
        kx_int32_t status;
        int msg;
        std::vector<arg> args; // the first arguments
        bytes out;
    } cases[] = {
        {empty_acl_bytes, 1, SEC_S_OK, 0, {}, empty_acl_bytes},
        {{0x85, 2, 2}, 1, SEC_S_BAD_ACL, MSG_2650_109, {}, {}},
        {{1, 1, 2}, 1, SEC_S_BAD_ACL, MSG_2650_109, {}, {}},
        {{0x85, 1, 2}, 1, SEC_S_BAD_ACL, MSG_2650_119, {3}, {}},
        {worked_example_swapped, 0, SEC_S_OK, 0, {}, worked_example},
        {swapped_order(rich), 1, SEC_S_OK, 0, {}, rich},
        {bad_version, 1, SEC_S_OK, 0, {}, converted},
        {converted, 1, SEC_S_BAD_ACLE, MSG_2650_125, {7}, {}},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(hex_of(c.in.data(), c.in.size()));
        owned_acl acl;
        bytes in = c.in;
        ASSERT_EQ(sec_read_acl_from_data(static_cast<kx_int32_t>(in.size()), in.data(), acl.get()),
                  SEC_S_OK);
        EXPECT_EQ(acl.contents(), c.in);
        EXPECT_EQ(sec_convert_acl_to_host(c.verify, acl.get()), c.status);
        if (c.status == SEC_S_OK) {
            EXPECT_EQ(acl.contents(), c.out);
            EXPECT_EQ(last_error().id, 0);
        } else {
            error_record e = expect_error(c.status, c.msg);
            EXPECT_TRUE(e.args.size() >= c.args.size() &&
                        std::equal(c.args.begin(), c.args.end(), e.args.begin()));
        }
    }
}

texts listed(const bytes &b, unsigned char type, const char *mech, kx_int32_t status) {
    owned_acl acl(b);
    owned_list list;
    EXPECT_EQ(type ? sec_list_acl_by_type(acl.get(), type, const_cast<char *>(mech), list.get())
                   : sec_list_acl(acl.get(), list.get()),
              status);
    EXPECT_TRUE(status == SEC_S_OK || list.l.count == 0);
    return list.described();
}

// Found by fuzzing: a sub-ACL of length 0 made a listing walk the same
// sub-ACL for every count of the header.
bytes zero_length_subacl() {
    bytes b =
        make_acl({make_subacl(4, 1, text_field("unix"), {make_record(1, text_field("bob"))})});
    store_u32(&b[5], 0);
    b[3] = 3;
    return b;
}

TEST(ListAcl, OrderSpellingAndRefusals) {
    const bytes rich = rich_acl();
    const texts unix_users = {"4 unix Alice@node1.cluster.example.com 5",
                              "4 unix bob@node1.cluster.example.com 3",
                              "4 unix carol@node1.cluster.example.com 16"};
    const std::string krb5_user = "4 krb5 admin/node1.cluster.example.com@REALM 1";
    texts all = {
        "2  - 8191",          "1  - 1",     krb5_user, "8 unix z*@node2 7", "8 unix a*@node3 2",
        "16  b\xc3\xb6rse 4", "16  staff 1"};
    all.insert(all.end(), unix_users.begin(), unix_users.end());
    texts users = unix_users;
    users.insert(users.begin(), krb5_user);
    bytes too_short = make_acl({make_subacl(2, 0, {}, {})});
    store_u32(&too_short[5], 0);
    store_u16(&too_short[3], 0xffff);
    const bytes bob = make_record(4, text_field("Bob"));
    const kx_int32_t bad = SEC_S_BAD_ACL;
    // clang-format off
    const struct {
        const char *what;
        bytes acl;
        unsigned char type;
        const char *mech;
        kx_int32_t status;
        int msg;
        texts entries;
    } cases[] = {
        {"every entry", rich, 0, nullptr, SEC_S_OK, 0, all},
        {"users of a mech", rich, SEC_ACLE_USER, "UNIX", SEC_S_OK, 0, unix_users},
        {"users of every mech", rich, SEC_ACLE_USER, nullptr, SEC_S_OK, 0, users},
        {"unauthenticated, any mech", rich, 1, "a-mechanism-of-20-ch", SEC_S_OK, 0, {"1  - 1"}},
        {"the empty ACL", {}, 0, nullptr, SEC_S_OK, 0, {}},
        {"no sub-ACLs", empty_acl_bytes, 0, nullptr, SEC_S_OK, 0, {}},
        // Neither the mechanism's case nor non-UTF-8 bytes are touched.
        {"as stored", make_acl({make_subacl(4, 2, text_field("UniX"),
                                            {make_record(1, text_field("\xe9t\xe9")),
                                             make_record(2, text_field("Zo\xc3\xab"))})}),
         0, nullptr, SEC_S_OK, 0, {"4 UniX Zo\xc3\xab 2", "4 UniX \xe9t\xe9 1"}},
        // Records of one identity, apart or not: the first spelling, the last mask.
        {"one identity twice", make_acl({make_subacl(16, 4, {},
                                                     {bob, make_record(2, text_field("BOB")),
                                                      make_record(4, text_field("carl")),
                                                      make_record(8, text_field("bob"))})}),
         0, nullptr, SEC_S_OK, 0, {"16  Bob 8", "16  carl 4"}},
        {"the last sub-ACL's records past its length",
         make_acl({make_subacl(2, 1, {}, {make_record(1)}),
                   make_subacl(16, 1, {}, {make_record(1, text_field("staff"))}, -7)}),
         0, nullptr, SEC_S_OK, 0, {"2  - 1", "16  staff 1"}},
        {"sub-ACL of length 0", zero_length_subacl(), 0, nullptr, bad, MSG_2650_110, {}},
        {"sub-ACL shorter than its header", too_short, 0, nullptr, bad, MSG_2650_110, {}},
        {"anyother of two records",
         make_acl({make_subacl(2, 2, {}, {make_record(1), make_record(2)})}),
         0, nullptr, bad, MSG_2650_111, {}},
        {"a mnemonic filling the field",
         make_acl({make_subacl(4, 1, text_field("0123456789abcdef"), {bob})}),
         0, nullptr, SEC_S_OK, 0, {"4 0123456789abcdef Bob 4"}},
        {"mnemonic longer than an entry's",
         make_acl({make_subacl(4, 1, text_field("0123456789abcdefg"), {bob})}),
         0, nullptr, bad, MSG_2650_123, {}},
    };
    // clang-format on
    for (const auto &c : cases) {
        SCOPED_TRACE(c.what);
        EXPECT_EQ(listed(c.acl, c.type, c.mech, c.status), c.entries);
        if (c.status != SEC_S_OK)
            expect_error(c.status, c.msg);
    }
}

bytes worked_part(long from, long to) {
    return bytes(worked_example.begin() + from, worked_example.begin() + to);
}
const bytes anyother_r = worked_part(5, 22), group_staff = worked_part(22, 45),
            user_bob = worked_part(45, 71);

kx_int32_t add(owned_acl &acl, entry e) {
    return sec_add_acle_to_acl(e.p(), acl.get());
}
kx_int32_t add_only(owned_acl &acl, entry e) {
    return sec_add_acle_to_acl2(e.p(), acl.get());
}
kx_int32_t del(owned_acl &acl, entry e) {
    return sec_del_acle_from_acl(e.p(), acl.get());
}

TEST(AddAcle, NewEntriesAndSubacls) {
    owned_acl acl;
    ASSERT_EQ(add(acl, {SEC_ACLE_USER, 0x3, "unix", "bob"}), SEC_S_OK);
    EXPECT_EQ(acl.contents(), make_acl({user_bob}));

    owned_acl more(worked_example);
    ASSERT_EQ(add(more, {SEC_ACLE_GROUP, 0x2, "unix", "wheel"}), SEC_S_OK);
    ASSERT_EQ(add(more, {SEC_ACLE_USER, 0x4, "UNIX", ""}), SEC_S_OK);
    ASSERT_EQ(add(more, {SEC_ACLE_USER, 0x1, "KRB5", "bob"}), SEC_S_OK);
    ASSERT_EQ(add(more, {SEC_ACLE_UNAUTHENTICATED, 0x2, "unix", "someone"}), SEC_S_OK);
    EXPECT_EQ(
        more.contents(),
        make_acl({anyother_r,
                  make_subacl(
                      16, 2, {},
                      {make_record(1, text_field("staff")), make_record(2, text_field("wheel"))}),
                  make_subacl(4, 2, text_field("unix"),
                              {make_record(4, text_field("")), make_record(3, text_field("bob"))}),
                  make_subacl(4, 1, text_field("KRB5"), {make_record(1, text_field("bob"))}),
                  make_subacl(1, 1, {}, {make_record(2)})}));
}

// Found by fuzzing: a new sub-ACL goes right after the last one, before
// trailing bytes; if the last one's records overrun its length, it is refused.
TEST(AddAcle, NewSubaclGoesBeforeTrailingBytes) {
    const bytes trailing = {0xde, 0xad};
    bytes base = make_acl({anyother_r});
    base.insert(base.end(), trailing.begin(), trailing.end());
    owned_acl acl(base);
    ASSERT_EQ(add(acl, {SEC_ACLE_USER, 0x3, "unix", "bob"}), SEC_S_OK);
    bytes expected = make_acl({anyother_r, user_bob});
    expected.insert(expected.end(), trailing.begin(), trailing.end());
    EXPECT_EQ(acl.contents(), expected);
    EXPECT_EQ(sec_convert_acl_to_host(1, acl.get()), SEC_S_OK);

    for (int wrong_by : {-3, 2}) {
        bytes last = make_subacl(16, 1, {}, {make_record(1, text_field("staff"))}, wrong_by);
        bytes odd = make_acl({last});
        odd.insert(odd.end(), trailing.begin(), trailing.end());
        owned_acl refused(odd);
        ASSERT_EQ(sec_convert_acl_to_host(1, refused.get()), SEC_S_OK);
        EXPECT_EQ(add(refused, {SEC_ACLE_USER, 0x3, "unix", "bob"}), SEC_S_BAD_ACL);
        expect_error(SEC_S_BAD_ACL, MSG_2650_110);
        EXPECT_EQ(refused.contents(), odd);
    }
}

TEST(AddAcle, SameIdentityUpdatesOrIsRefused) {
    owned_acl acl(worked_example);
    bytes updated = worked_example;
    updated[61] = 0x7;
    updated[16] = 0x5;
    ASSERT_EQ(add(acl, {SEC_ACLE_USER, 0x7, "UNIX", "BOB"}), SEC_S_OK);
    ASSERT_EQ(add(acl, {SEC_ACLE_ANYOTHER, 0x5}), SEC_S_OK);
    EXPECT_EQ(acl.contents(), updated);

    EXPECT_EQ(add_only(acl, {SEC_ACLE_USER, 0x1, "Unix", "Bob"}), SEC_S_BAD_ACLE);
    EXPECT_TRUE(record_is(SEC_S_BAD_ACLE, MSG_2650_157, {'u', "Unix", "Bob"}));
    EXPECT_EQ(add_only(acl, {SEC_ACLE_ANYOTHER, 0x1}), SEC_S_BAD_ACLE);
    EXPECT_TRUE(record_is(SEC_S_BAD_ACLE, MSG_2650_174, {'o'}));
    EXPECT_EQ(add_only(acl, {SEC_ACLE_GROUP, 0x1, "", "STAFF"}), SEC_S_BAD_ACLE);
    EXPECT_TRUE(record_is(SEC_S_BAD_ACLE, MSG_2650_175, {'g', "STAFF"}));
    EXPECT_EQ(acl.contents(), updated);
}

TEST(DelAcle, ByIdentityAndRefusals) {
    owned_acl acl(worked_example);
    ASSERT_EQ(del(acl, {SEC_ACLE_USER, 0xff, "UNIX", "BOB"}), SEC_S_OK);
    EXPECT_EQ(acl.contents(), make_acl({anyother_r, group_staff}));
    EXPECT_EQ(del(acl, {SEC_ACLE_USER, 0xff, "UNIX", "BOB"}), SEC_S_ACLE_NOT_FOUND);
    EXPECT_TRUE(record_is(SEC_S_ACLE_NOT_FOUND, MSG_2650_118, {4, "UNIX", "BOB"}));
    ASSERT_EQ(del(acl, {SEC_ACLE_GROUP, 0, "", "Staff"}), SEC_S_OK);
    ASSERT_EQ(del(acl, {SEC_ACLE_ANYOTHER, 0}), SEC_S_OK);
    EXPECT_EQ(acl.contents(), empty_acl_bytes);

    // Not the last of its sub-ACL's ascending entries; added back, the buffer
    // is as it was.
    const bytes rich = rich_acl();
    owned_acl some(rich);
    ASSERT_EQ(del(some, {SEC_ACLE_USER, 0, "UNIX", "ALICE@node1.cluster.example.com"}), SEC_S_OK);
    EXPECT_LT(some.contents().size(), rich.size());
    ASSERT_EQ(add(some, {SEC_ACLE_USER, 5, "unix", "Alice@node1.cluster.example.com"}), SEC_S_OK);
    EXPECT_EQ(some.contents(), rich);

    owned_acl no_entries(make_acl({make_subacl(16, 0, {}, {})}));
    EXPECT_EQ(del(no_entries, {SEC_ACLE_GROUP, 0, "", "staff"}), SEC_S_BAD_ACLE);
    EXPECT_TRUE(record_is(SEC_S_BAD_ACLE, MSG_2650_118, {16, "", "staff"}));
}
} // namespace
