// Adding entries to and deleting entries from ACL buffers.
#include <cctype>

#include <gtest/gtest.h>

#include "acl_fixtures.h"

using namespace kxacl;
using namespace kxtest;

namespace {

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

// Found by fuzzing: validation lets bytes follow the last sub-ACL, and a
// new sub-ACL appended behind them could not be reached by its length walk.
// It goes right after the last sub-ACL; when that one's records do not end
// where its length says (which validation lets pass for the last one only),
// no sub-ACL can follow it and the add is refused.
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
    error_record e = expect_error(SEC_S_BAD_ACLE, MSG_2650_157);
    EXPECT_EQ(e.num(0), 'u');
    EXPECT_EQ(e.str(1) + " " + e.str(2), "Unix Bob");
    EXPECT_EQ(add_only(acl, {SEC_ACLE_ANYOTHER, 0x1}), SEC_S_BAD_ACLE);
    EXPECT_EQ(expect_error(SEC_S_BAD_ACLE, MSG_2650_174).num(0), 'o');
    EXPECT_EQ(acl.contents(), updated);
}

TEST(DelAcle, ByIdentityAndRefusals) {
    owned_acl acl(worked_example);
    ASSERT_EQ(del(acl, {SEC_ACLE_USER, 0xff, "UNIX", "BOB"}), SEC_S_OK);
    EXPECT_EQ(acl.contents(), make_acl({anyother_r, group_staff}));
    EXPECT_EQ(del(acl, {SEC_ACLE_USER, 0xff, "UNIX", "BOB"}), SEC_S_ACLE_NOT_FOUND);
    error_record e = expect_error(SEC_S_ACLE_NOT_FOUND, MSG_2650_118);
    EXPECT_EQ(e.num(0), 4);
    EXPECT_EQ(e.str(1) + " " + e.str(2), "UNIX BOB");
    EXPECT_EQ(del(acl, {SEC_ACLE_GROUP, 0, "", "wheel"}), SEC_S_ACLE_NOT_FOUND);
    ASSERT_EQ(del(acl, {SEC_ACLE_GROUP, 0, "", "Staff"}), SEC_S_OK);
    ASSERT_EQ(del(acl, {SEC_ACLE_ANYOTHER, 0}), SEC_S_OK);
    EXPECT_EQ(acl.contents(), empty_acl_bytes);

    owned_acl empty;
    EXPECT_EQ(del(empty, {SEC_ACLE_ANYOTHER, 0}), SEC_S_BAD_ACL);
    expect_error(SEC_S_BAD_ACL, MSG_2650_106);
    owned_acl no_entries(make_acl({make_subacl(16, 0, {}, {})}));
    EXPECT_EQ(del(no_entries, {SEC_ACLE_GROUP, 0, "", "staff"}), SEC_S_BAD_ACLE);
    expect_error(SEC_S_BAD_ACLE, MSG_2650_118);
}

// Adding an identity that the ACL lacks and deleting it again gives back
// the same bytes, whether its sub-ACL existed or the add made it.
TEST(EditRoundTrip, AddThenDeleteRestoresTheBuffer) {
    bytes rich = rich_acl();
    struct {
        const bytes &base;
        entry added;
    } cases[] = {
        {worked_example, {SEC_ACLE_USER, 1, "unix", "Aaron"}},
        {worked_example, {SEC_ACLE_USER, 1, "krb5", "bob"}},
        {worked_example, {SEC_ACLE_EXPANDED, 1, "unix", "x*"}},
        {worked_example, {SEC_ACLE_GROUP, 1, "", "wheel"}},
        {rich, {SEC_ACLE_EXPANDED, 1, "UNIX", "q*"}},
        {rich, {SEC_ACLE_USER, 1, "unix", "brian@node1.cluster.example.com"}},
        {rich, {SEC_ACLE_GROUP, 1, "", "adm"}},
        {empty_acl_bytes, {SEC_ACLE_GROUP, 1, "", "wheel"}},
    };
    for (auto &c : cases) {
        SCOPED_TRACE(c.added.id);
        owned_acl acl(c.base);
        ASSERT_EQ(add_only(acl, c.added), SEC_S_OK);
        EXPECT_GT(acl.contents().size(), c.base.size());
        entry removed = c.added;
        for (char &ch : removed.id)
            ch = static_cast<char>(std::toupper(static_cast<unsigned char>(ch)));
        removed.desc.perm = 0xdead;
        ASSERT_EQ(del(acl, removed), SEC_S_OK);
        EXPECT_EQ(acl.contents(), c.base);
    }
}

enum class edit { add, add_only, del };

kx_int32_t run(edit how, owned_acl &acl, entry e) {
    return how == edit::add ? add(acl, e) : how == edit::add_only ? add_only(acl, e) : del(acl, e);
}

// Every allocation of an edit fails in turn. A failed add leaves the
// buffer as it was; so does a failed delete, unless only its final shrink
// failed, which leaves the valid ACL without the entry.
void expect_failed_edits_harmless(edit how, const bytes &base, entry e) {
    owned_acl done(base);
    ASSERT_EQ(run(how, done, e), SEC_S_OK);
    bool shrink_failed = false;
    long failures = for_each_allocation_failure([&](long n) {
        owned_acl acl(base);
        kx_int32_t rc = failing_after(n, [&] { return run(how, acl, e); });
        if (rc == SEC_S_OK)
            return rc;
        expect_no_memory(rc, {how == edit::del ? "sec_del_acle_from_acl" : "sec_add_acle_to_acl",
                              "sec__create_acle", "sec__add_acle_to_tree", "sec__acltree_to_subacl",
                              "sec__add_acle_to_subacl"});
        if (how == edit::del && acl.contents() != base) {
            shrink_failed = true;
            EXPECT_EQ(last_error().str(0), "sec_del_acle_from_acl");
            EXPECT_EQ(acl.contents(), done.contents());
        } else {
            EXPECT_EQ(acl.contents(), base);
            EXPECT_EQ(acl.d.value == nullptr, base.empty());
        }
        return rc;
    });
    EXPECT_GE(failures, 2);
    EXPECT_EQ(shrink_failed, how == edit::del);
}

TEST(AllocationFailure, AddAcleToAcl) {
    for (edit how : {edit::add, edit::add_only}) {
        expect_failed_edits_harmless(how, {}, {SEC_ACLE_USER, 1, "unix", "bob"});
        expect_failed_edits_harmless(how, worked_example, {SEC_ACLE_USER, 1, "unix", "carol"});
        expect_failed_edits_harmless(how, worked_example, {SEC_ACLE_EXPANDED, 1, "unix", "x*"});
    }
}

TEST(AllocationFailure, DelAcleFromAcl) {
    // The sub-ACL goes with its only entry, or stays shorter.
    expect_failed_edits_harmless(edit::del, worked_example, {SEC_ACLE_USER, 0, "unix", "bob"});
    expect_failed_edits_harmless(edit::del, rich_acl(), {SEC_ACLE_EXPANDED, 0, "unix", "z*@node2"});
}

} // namespace
