// Entry trees: identities that share their first bytes, many identities,
// the array of trees and the buffer it makes. The order of entries and the
// refusal or merging of duplicates show through listing and editing
// (buffers_test).
#include <algorithm>
#include <cstdio>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include <kx_cu.h>

#include "acl_fixtures.h"

using namespace kxacl;
using namespace kxtest;

namespace {

struct owned_tree {
    sec_acltree_t t = nullptr;
    owned_tree() = default;
    owned_tree(const owned_tree &) = delete;
    ~owned_tree() { sec__free_acltree(t); }
    kx_int32_t add(sec_boolean_t single, entry e) {
        return sec__add_acle_to_tree(single, e.p(), &t);
    }
    // "id/perm" of each entry, in the order the tree writes them.
    texts walked() const {
        texts out;
        walk_acltree(t, [&](sec_acltree_node_s *n) {
            const sec_acle_desc &a = *n->sat_acle;
            out.push_back(std::string(a.id ? a.id : "-") + "/" + std::to_string(a.perm));
            return SEC_S_OK;
        });
        return out;
    }
};

// Nodes order by the first eight folded bytes and only then by the rest:
// identities that share those bytes, or end within them, still order and
// collide exactly as the comparison says.
TEST(Acltree, IdentitiesSharingTheirFirstEightBytes) {
    owned_tree user;
    for (const char *id : {"prefix-of-Tail-b", "prefix-o", "PREFIX-OF-TAIL", "prefix-of-tail-A",
                           "prefix-", "prefix-of-tail-a-x", "prefix-of"})
        ASSERT_EQ(user.add(1, {SEC_ACLE_USER, 1, "unix", id}), SEC_S_OK) << id;
    EXPECT_EQ(user.walked(),
              (texts{"prefix-/1", "prefix-o/1", "prefix-of/1", "PREFIX-OF-TAIL/1",
                     "prefix-of-tail-A/1", "prefix-of-tail-a-x/1", "prefix-of-Tail-b/1"}));
    for (const char *id : {"Prefix-Of-Tail-B", "PREFIX-O", "prefix-OF"})
        EXPECT_EQ(user.add(1, {SEC_ACLE_USER, 2, "unix", id}), SEC_S_BAD_ACLE) << id;
    entry gone{SEC_ACLE_USER, 0, "unix", "PREFIX-OF-TAIL-a"};
    EXPECT_EQ(sec__del_acle_from_tree(gone.p(), user.t), SEC_S_OK);
    EXPECT_EQ(user.walked().size(), 6u);
}

// One tree per key in order of first occurrence; the worked example and the
// ACL of no trees, byte for byte.
TEST(Acltree, ArrayHoldsOneTreePerKeyInOrderOfFirstOccurrence) {
    EXPECT_EQ(build_acl({{SEC_ACLE_USER, 3, "unix", "bob"},
                         {SEC_ACLE_GROUP, 1, "", "staff"},
                         {SEC_ACLE_USER, 1, "UNIX", "alice"},
                         {SEC_ACLE_ANYOTHER, 1}}),
              make_acl({make_subacl(2, 1, {}, {make_record(1)}),
                        make_subacl(16, 1, {}, {make_record(1, text_field("staff"))}),
                        make_subacl(4, 2, text_field("unix"),
                                    {make_record(1, text_field("alice")),
                                     make_record(3, text_field("bob"))})}));
    EXPECT_EQ(build_acl({{SEC_ACLE_USER, 0x3, "unix", "bob"},
                         {SEC_ACLE_GROUP, 0x1, "", "staff"},
                         {SEC_ACLE_ANYOTHER, 0x1}}),
              worked_example);
    EXPECT_EQ(build_acl({}), empty_acl_bytes);
    EXPECT_EQ(swapped_order(worked_example), worked_example_swapped); // the tests' own helper
}

// Many identities, in order and shuffled: the walk gives them all in order,
// and a repeat in another case is refused.
TEST(Acltree, ManyIdentities) {
    constexpr int count = 100000;
    owned_tree sorted, shuffled;
    char id[16];
    for (int i = 0; i < count; ++i) {
        std::snprintf(id, sizeof id, "u%07d", i);
        ASSERT_EQ(sorted.add(1, {SEC_ACLE_USER, 1, "unix", id}), SEC_S_OK);
        std::snprintf(id, sizeof id, "user-%d", i * 7919 % count); // a permutation
        ASSERT_EQ(shuffled.add(1, {SEC_ACLE_USER, 1, "unix", id}), SEC_S_OK);
    }
    for (owned_tree *t : {&sorted, &shuffled}) {
        texts ids = t->walked();
        EXPECT_EQ(ids.size(), static_cast<std::size_t>(count));
        // Strictly ascending; "/" sorts before the characters of these identities.
        auto not_after = [](const std::string &a, const std::string &b) {
            return cu_strcasecmp_posix_1(a.c_str(), b.c_str()) >= 0;
        };
        EXPECT_EQ(std::adjacent_find(ids.begin(), ids.end(), not_after), ids.end());
    }
    for (const char *again : {"USER-0", "User-99999", "user-25000"})
        EXPECT_EQ(shuffled.add(1, {SEC_ACLE_USER, 1, "unix", again}), SEC_S_BAD_ACLE) << again;
    EXPECT_EQ(sorted.add(1, {SEC_ACLE_USER, 1, "unix", "U0099999"}), SEC_S_BAD_ACLE);
    entry gone{SEC_ACLE_USER, 0, "unix", "USER-12345"};
    EXPECT_EQ(sec__del_acle_from_tree(gone.p(), shuffled.t), SEC_S_OK);
    EXPECT_EQ(sec__del_acle_from_tree(gone.p(), shuffled.t), SEC_S_ACLE_NOT_FOUND);
    EXPECT_EQ(tree_entry_count(shuffled.t), static_cast<std::size_t>(count - 1));
}

} // namespace
