// Every heap allocation of the process (libkx_cu's and the C library's too)
// fails in turn; not built under the sanitizers, which bring their own.
#include <cstdio>
#include <functional>
#include <gtest/gtest.h>
#include "acl_fixtures.h"
#include "file_helpers.h"
#include "heap.h"

namespace {
using namespace kxtest;

template <typename F> kx_int32_t failing(long n, F f) {
    heap::fail_nth(n);
    kx_int32_t rc = f();
    heap::disarm();
    return rc;
}

const auto process_level = [](long n, auto call) { return failing(n, call); };

using row = std::pair<const char *, std::function<kx_int32_t(long n)>>;

TEST(ProcessAllocationFailure, EveryAllocationOfEachCall) {
    // The converters open once per process: open them before anything fails.
    sec_acle_t user = nullptr;
    ASSERT_EQ(sec_create_acle(SEC_ACLE_USER, 3, "unix", "bob@node", &user), SEC_S_OK);
    char *m = nullptr, *i = nullptr;
    ASSERT_EQ(sec_display_acle_id(user, &m, &i), SEC_S_OK);
    std::free(m);
    std::free(i);
    bytes rich = rich_acl();
    acl_dir d;
    std::string compiled = acl_read(d.acl, TEXT).bytes();

    const std::vector<row> rows = {
        {"sec_create_acle", [](long n) { return create_failing(process_level, n); }},
        {"sec_display_acle_id",
         [&](long n) {
             char *mech = nullptr, *id = nullptr;
             kx_int32_t rc = failing(n, [&] { return sec_display_acle_id(user, &mech, &id); });
             EXPECT_TRUE(rc == SEC_S_OK || (!mech && !id));
             std::free(mech);
             std::free(id);
             return rc;
         }},
        {"sec_list_acl", [](long n) { return list_failing(process_level, n, 0); }},
        // The CACL file is written whole or not at all, and nothing else stays.
        {"sec_read_acl_file",
         [&](long n) {
             unlink(d.cacl.c_str());
             owned_acl acl;
             kx_uint32_t rflags = 0;
             kx_int32_t rc = failing(n, [&] {
                 return sec_read_acl_file(d.acl.c_str(), nullptr, nullptr, CACHE, acl.get(),
                                          &rflags);
             });
             bytes got = acl.contents();
             EXPECT_EQ(std::string(got.begin(), got.end()), rc == SEC_S_OK ? compiled : "");
             EXPECT_TRUE(rc == SEC_S_OK || !acl.d.value);
             std::string cacl = read_file(d.cacl);
             EXPECT_TRUE(cacl == "<missing>" || cacl == compiled);
             for (const std::string &name : dir_entries(d.dir))
                 EXPECT_TRUE(name == "acl" || name == "acl.cacl") << name;
             return rc;
         }},
    };
    for (const auto &[function, call] : rows) {
        SCOPED_TRACE(function);
        long n = 0;
        for (;; ++n) {
            kx_int32_t rc = call(n);
            if (!heap::fired())
                break;
            EXPECT_TRUE(rc == SEC_S_OK || rc == SEC_S_NO_MEMORY) << rc << " " << last_error().text;
            EXPECT_TRUE(rc != SEC_S_NO_MEMORY || last_error().msg_num == kxacl::MSG_2650_102);
        }
        EXPECT_GT(n, 0) << "no allocation to fail";
    }
    sec_release_acle(user);
}
} // namespace
