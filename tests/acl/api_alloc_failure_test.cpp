// Every allocation through the library's allocator fails in turn: 2650-102
// naming a row's routine, outputs as promised, and an exact failure count.
#include <cstdio>
#include <functional>
#include <memory>
#include <set>
#include <gtest/gtest.h>
#include "acl_fixtures.h"
#include "file_helpers.h"

using namespace kxacl;
using namespace kxtest;

namespace {
template <typename Call> kx_int32_t failing_after(long n, Call call) {
    mem_fail_after(n);
    kx_int32_t rc = call();
    mem_fail_after(-1);
    return rc;
}

const auto library_level = [](long n, auto call) { return failing_after(n, call); };

struct row {
    std::string what;
    std::set<std::string> routines; // what its 2650-102 may name
    long failures;                  // negative: at least -failures
    std::function<kx_int32_t(long n)> attempt;
    std::function<void()> finally = [] {};
};

using edit_fn = kx_int32_t (*)(sec_acle_t, sec_acl_buffer_t);

// A failed add leaves the buffer as it was; so does a failed delete, unless
// only its final shrink failed, which leaves the valid ACL without the entry.
row edit_row(edit_fn edit, const bytes &base, entry e) {
    owned_acl done(base);
    EXPECT_EQ(edit(e.p(), done.get()), SEC_S_OK);
    bool del = edit == sec_del_acle_from_acl;
    auto shrink_failed = std::make_shared<bool>(false);
    return {"edit " + e.id,
            {del ? "sec_del_acle_from_acl" : "sec_add_acle_to_acl", "sec__create_acle",
             "sec__add_acle_to_tree", "sec__acltree_to_subacl", "sec__add_acle_to_subacl"},
            -2,
            [=, after = done.contents()](long n) mutable {
                owned_acl acl(base);
                kx_int32_t rc = failing_after(n, [&] { return edit(e.p(), acl.get()); });
                if (rc != SEC_S_OK && del && acl.contents() != base) {
                    *shrink_failed = true;
                    EXPECT_EQ(last_error().str(0), "sec_del_acle_from_acl");
                    EXPECT_EQ(acl.contents(), after);
                } else if (rc != SEC_S_OK) {
                    EXPECT_EQ(acl.contents(), base);
                    EXPECT_EQ(acl.d.value == nullptr, base.empty());
                }
                return rc;
            },
            [=] { EXPECT_EQ(*shrink_failed, del); }};
}

row list_row(unsigned char type, long allocations) {
    return {"listing type " + std::to_string(type),
            {"sec__create_acle", "sec__add_acle_to_tree", "sec__acltree_to_aclelist"},
            allocations,
            [type](long n) { return list_failing(library_level, n, type); }};
}

// Into a tree holding bob: after him nothing, before him 2, a new key 4.
row trees_row(entry added, long allocations) {
    return {"add to trees " + added.id,
            {"sec__add_acle_to_trees", "sec__add_acle_to_tree"},
            allocations,
            [added](long n) mutable {
                owned_trees trees;
                EXPECT_EQ(trees.add({SEC_ACLE_USER, 3, "unix", "bob"}), SEC_S_OK);
                kx_int32_t rc = failing_after(n, [&] { return trees.add(added); });
                std::size_t entries = 0;
                for (int i = 0; i < trees.count; ++i)
                    entries += tree_entry_count(trees.trees[i]);
                EXPECT_EQ(entries, rc == SEC_S_OK ? 2u : 1u);
                return rc;
            }};
}

// A copy of data or the empty ACL: on failure the descriptor keeps its length.
row copy_row(bool create) {
    return {create ? "sec_create_empty_acl" : "sec_read_acl_from_data",
            {create ? "sec_create_empty_acl" : "sec_read_acl_from_data"},
            1,
            [create](long n) {
                bytes b = worked_example;
                sec_buffer_s acl{-3, nullptr};
                kx_int32_t rc = failing_after(n, [&] {
                    return create ? sec_create_empty_acl(&acl)
                                  : sec_read_acl_from_data(71, b.data(), &acl);
                });
                if (rc != SEC_S_OK) {
                    EXPECT_EQ(last_error().num(1), create ? 5 : 71);
                    EXPECT_TRUE(acl.length == -3 && !acl.value);
                }
                std::free(acl.value);
                return rc;
            }};
}

TEST(AllocationFailure, EveryFunctionAndRoutine) {
    owned_acl rich(rich_acl());
    acl_dir cached;
    std::string compiled = acl_read(cached.acl, CACHE).bytes();
    std::unique_ptr<std::FILE, int (*)(std::FILE *)> null_stream(std::fopen("/dev/null", "w"),
                                                                 std::fclose);
    owned_trees two;
    ASSERT_EQ(two.add({SEC_ACLE_USER, 3, "unix", "bob"}), SEC_S_OK);
    ASSERT_EQ(two.add({SEC_ACLE_GROUP, 1, "", "staff"}), SEC_S_OK);

    std::vector<row> rows = {
        {"sec_create_acle",
         {"sec_create_acle", "sec__create_acle"},
         2,
         [](long n) { return create_failing(library_level, n); }},
        copy_row(false),
        copy_row(true),
        list_row(0, 25),
        list_row(SEC_ACLE_USER, 6),
        list_row(SEC_ACLE_GROUP, 3),
        trees_row({SEC_ACLE_USER, 1, "unix", "carol"}, 0),
        trees_row({SEC_ACLE_USER, 1, "unix", "alice"}, 2),
        trees_row({SEC_ACLE_GROUP, 1, "", "x"}, 4),
        {"sec__acltrees_to_acl",
         {"sec__acltrees_to_acl", "sec__acltree_to_subacl", "sec__add_acle_to_subacl"},
         -1,
         [&](long n) {
             owned_acl acl;
             kx_int32_t rc = failing_after(
                 n, [&] { return sec__acltrees_to_acl(two.trees, two.count, acl.get()); });
             EXPECT_TRUE(rc == SEC_S_OK || acl.d.value == nullptr);
             return rc;
         }},
        {"sec_read_acl_file from the CACL file",
         {"sec_read_acl_file"},
         1,
         [&](long n) {
             mem_fail_after(n);
             acl_read r(cached.acl, CACHE | CONVERT);
             mem_fail_after(-1);
             EXPECT_EQ(read_file(cached.cacl), compiled);
             EXPECT_TRUE(r.status == SEC_S_OK ? r.bytes() == compiled : r.empty());
             return r.status;
         }},
        // The dump reports nothing: its outcome is whether it allocated n times.
        {"sec__dump_acl_to",
         {},
         -1,
         [&](long n) {
             unsigned long before = mem_allocations();
             failing_after(n, [&] {
                 return sec__dump_acl_to(rich.get(), null_stream.get(), null_stream.get()), 0;
             });
             EXPECT_EQ(last_error().id, 0) << "the dump leaves no record";
             return mem_allocations() - before <= static_cast<unsigned long>(n) ? SEC_S_OK
                                                                                : SEC_S_NO_MEMORY;
         }},
    };
    rows.push_back(edit_row(sec_add_acle_to_acl, {}, {SEC_ACLE_USER, 1, "unix", "bob"}));
    rows.push_back(
        edit_row(sec_add_acle_to_acl, worked_example, {SEC_ACLE_EXPANDED, 1, "unix", "x*"}));
    // The sub-ACL goes with its only entry, or stays shorter.
    rows.push_back(
        edit_row(sec_del_acle_from_acl, worked_example, {SEC_ACLE_USER, 0, "unix", "bob"}));
    rows.push_back(
        edit_row(sec_del_acle_from_acl, rich_acl(), {SEC_ACLE_EXPANDED, 0, "unix", "z*@node2"}));
    for (const row &r : rows) {
        SCOPED_TRACE(r.what);
        long n = 0;
        for (kx_int32_t rc; (rc = r.attempt(n)) != SEC_S_OK && n < 1000; ++n) {
            if (r.routines.empty())
                continue;
            EXPECT_EQ(rc, SEC_S_NO_MEMORY);
            error_record e = expect_error(SEC_S_NO_MEMORY, MSG_2650_102);
            EXPECT_TRUE(r.routines.count(e.str(0))) << e.str(0);
            EXPECT_GT(e.num(1), 0);
        }
        EXPECT_TRUE(r.failures < 0 ? n >= -r.failures : n == r.failures) << n;
        r.finally();
    }
}
} // namespace
