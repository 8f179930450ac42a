// The CACL file writer called directly: forced over a newer CACL file, and
// examining by name an ACL file whose status it is not given.
#include <cerrno>

#include <gtest/gtest.h>

#include "cache.h"
#include "file_helpers.h"

using namespace kxacl;
using namespace kxtest;

namespace {

TEST(CacheAclBuffer, WritesUnlessNothingOrNewerAndReportsAMissingAclFile) {
    owned_acl acl(worked_example), none;
    acl_dir d;
    EXPECT_EQ(sec__cache_aclbuffer(d.acl.c_str(), none.get(), 0), 1);
    EXPECT_EQ(dir_entries(d.dir), (std::vector<std::string>{"acl"}));
    ASSERT_EQ(sec__cache_aclbuffer(d.acl.c_str(), acl.get(), 0), SEC_S_OK);
    EXPECT_EQ(read_file(d.cacl), example_acl());
    EXPECT_EQ(status_of(d.cacl).st_mode, static_cast<mode_t>(S_IFREG | 0644));
    // Newer than the ACL file: kept, unless forced.
    write_file(d.cacl, "x");
    EXPECT_EQ(sec__cache_aclbuffer(d.acl.c_str(), acl.get(), 0), 1);
    EXPECT_EQ(read_file(d.cacl), "x");
    EXPECT_EQ(sec__cache_aclbuffer(d.acl.c_str(), acl.get(), 1), SEC_S_OK);
    EXPECT_EQ(read_file(d.cacl), example_acl());
    const std::string gone = d.dir + "/gone";
    EXPECT_EQ(sec__cache_aclbuffer(gone.c_str(), acl.get(), 1), SEC_S_FILE_ERROR);
    EXPECT_TRUE(record_is(SEC_S_FILE_ERROR, MSG_2650_135, {gone, ENOENT}));
    EXPECT_EQ(dir_entries(d.dir), (std::vector<std::string>{"acl", "acl.cacl"}));
}
} // namespace
