// Entry trees; order and duplicates also show through buffers_test.
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

// Nodes order by the first eight folded bytes, then by the rest.
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

TEST(Acltree, ArrayHoldsOneTreePerKeyInOrderOfFirstOccurrence) {
    EXPECT_EQ(build_acl({{SEC_ACLE_USER, 0x3, "unix", "bob"},
                         {SEC_ACLE_GROUP, 0x1, "", "staff"},
                         {SEC_ACLE_ANYOTHER, 0x1}}),
              worked_example);
    EXPECT_EQ(build_acl({}), empty_acl_bytes);
    EXPECT_EQ(swapped_order(worked_example), worked_example_swapped); // the tests' own helper
}

// Many identities, in order and shuffled, walk strictly ascending.
TEST(Acltree, ManyIdentities) {
    constexpr int count = 100000;
    owned_tree sorted, shuffled;
    for (int i = 0; i < count; ++i) {
        char in_order[16], permuted[16]; // snprintf: gcc 12 -O3 warns on "u" + std::string
        std::snprintf(in_order, sizeof in_order, "u%07d", i);
        std::snprintf(permuted, sizeof permuted, "user-%d", i * 7919 % count);
        ASSERT_EQ(sorted.add(1, {SEC_ACLE_USER, 1, "unix", in_order}), SEC_S_OK);
        ASSERT_EQ(shuffled.add(1, {SEC_ACLE_USER, 1, "unix", permuted}), SEC_S_OK);
    }
    auto not_after = [](const std::string &a, const std::string &b) {
        return cu_strcasecmp_posix_1(a.c_str(), b.c_str()) >= 0;
    };
    for (owned_tree *t : {&sorted, &shuffled}) {
        texts ids = t->walked();
        EXPECT_EQ(ids.size(), std::size_t{count});
        EXPECT_EQ(std::adjacent_find(ids.begin(), ids.end(), not_after), ids.end());
    }
    EXPECT_EQ(shuffled.add(1, {SEC_ACLE_USER, 1, "unix", "User-99999"}), SEC_S_BAD_ACLE);
}
} // namespace
