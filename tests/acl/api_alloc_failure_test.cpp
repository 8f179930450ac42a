// Every allocation of the exported functions fails in turn, one table row
// per function not covered beside its own tests (entries: entries_test;
// buffers from data and the empty ACL: buffer_lifecycle_test; listing:
// list_test; editing: edit_test; compiling an ACL file: readfile_test; the
// handler registry: eval_test). A failure is 2650-102 naming a routine of
// the row, and leaves the caller's outputs as the function promises; the
// functions that must not allocate at all are rows with no failures.
#include <cstdio>
#include <functional>

#include <gtest/gtest.h>

#include "acl_fixtures.h"
#include "file_helpers.h"

using namespace kxacl;
using namespace kxtest;

namespace {

struct api_row {
    const char *function;
    std::set<std::string> routines; // what its 2650-102 may name
    long failures;                  // allocations that can fail, -1 for at least one
    // Runs the function with allocations failing after the first n, checks
    // what it leaves on failure, and gives its status.
    std::function<kx_int32_t(long n)> attempt;
};

kx_uint32_t perm_scratch = 0;

// The dump reports nothing: its outcome is whether it allocated n times.
kx_int32_t dump_with_failures(long n, sec_buffer_s *acl) {
    std::FILE *out = stdout, *err = stderr, *null_stream = std::fopen("/dev/null", "w");
    stdout = stderr = null_stream;
    unsigned long before = mem_allocations();
    failing_after(n, [&] {
        sec__dump_acl(acl);
        return 0;
    });
    bool all_made = mem_allocations() - before <= static_cast<unsigned long>(n);
    stdout = out;
    stderr = err;
    std::fclose(null_stream);
    EXPECT_EQ(last_error().id, 0) << "the dump leaves no record";
    return all_made ? SEC_S_OK : SEC_S_NO_MEMORY;
}

TEST(AllocationFailure, EveryExportedFunction) {
    owned_acl rich(rich_acl()), foreign(worked_example_swapped);
    sec_acle_t user = nullptr;
    ASSERT_EQ(sec_create_acle(SEC_ACLE_USER, 3, "unix", "bob@node", &user), SEC_S_OK);
    acl_dir cached;
    std::string compiled;
    {
        acl_read first(cached.acl, CACHE);
        ASSERT_EQ(first.rflags, TEXT | CACHE);
        compiled = first.bytes();
    }
    char group[] = "staff";
    sec_buffer_s groups[] = {{6, group}};

    const std::vector<api_row> rows = {
        {"sec_display_acle_id",
         {"acl__convert_from_utf8"},
         0,
         [&](long n) {
             char *mech = nullptr, *id = nullptr;
             kx_int32_t rc =
                 failing_after(n, [&] { return sec_display_acle_id(user, &mech, &id); });
             EXPECT_TRUE(rc == SEC_S_OK || (!mech && !id));
             std::free(mech);
             std::free(id);
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
             if (r.status == SEC_S_OK)
                 EXPECT_EQ(r.bytes(), compiled);
             else
                 EXPECT_TRUE(r.empty());
             return r.status;
         }},
        {"sec_convert_acl_to_host",
         {},
         0,
         [&](long n) {
             owned_acl copy(foreign.contents());
             kx_int32_t rc = failing_after(n, [&] {
                 kx_int32_t status = sec_convert_acl_to_host(1, copy.get());
                 return status != SEC_S_OK ? status : sec_convert_acl_to_host(1, copy.get());
             });
             return rc;
         }},
        {"sec__single_acle_perm, sec__group_acles_perm",
         {},
         0,
         [&](long n) {
             return failing_after(n, [&] {
                 char mech[] = "unix", id[] = "bob@node1.cluster.example.com";
                 kx_int32_t rc = sec__single_acle_perm(rich.get(), SEC_ACLE_USER, mech, nullptr, id,
                                                       &perm_scratch);
                 return rc != SEC_S_OK
                            ? rc
                            : sec__group_acles_perm(rich.get(), 1, groups, &perm_scratch);
             });
         }},
        {"sec_translate_perms, sec_translate_bitmask",
         {},
         0,
         [&](long n) {
             char text[33];
             return failing_after(n, [&] {
                 kx_int32_t rc = sec_translate_perms("rwx", nullptr, &perm_scratch);
                 return rc != SEC_S_OK ? rc : sec_translate_bitmask(0x1fff, nullptr, text);
             });
         }},
        {"sec_release_acl, sec_release_acle, sec_release_aclelist",
         {},
         0,
         [&](long n) {
             owned_acl copy(worked_example);
             owned_list list;
             EXPECT_EQ(sec_list_acl(copy.get(), list.get()), SEC_S_OK);
             sec_acle_t entry = nullptr;
             EXPECT_EQ(sec_create_acle(SEC_ACLE_GROUP, 1, nullptr, "staff", &entry), SEC_S_OK);
             return failing_after(n, [&] {
                 sec_release_acle(entry);
                 sec_release_aclelist(list.get());
                 return sec_release_acl(copy.get());
             });
         }},
        {"sec__dump_acl", {}, -1, [&](long n) { return dump_with_failures(n, rich.get()); }},
    };
    for (const api_row &row : rows) {
        SCOPED_TRACE(row.function);
        long failures = for_each_allocation_failure([&](long n) {
            kx_int32_t rc = row.attempt(n);
            if (rc != SEC_S_OK && !row.routines.empty())
                expect_no_memory(rc, row.routines);
            return rc;
        });
        if (row.failures < 0)
            EXPECT_GT(failures, 0);
        else
            EXPECT_EQ(failures, row.failures);
    }
    sec_release_acle(user);
}

} // namespace
