// The API frame: trace points at API levels 1 and 8, registration, and the
// Perf announcement. Each test runs in its own process, so the levels set
// before the first library call are the ones registration reads.
#include <cstdint>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include <kx_acl.h>
#include <kx_tr.h>

#include "messages.h"
#include "report.h"
#include "support.h"

using kxtest::hex_of;
using kxtest::hex_text;
using kxtest::read_trace;
using kxtest::trace_ids;
using ids = std::vector<unsigned>;
using items = std::vector<std::string>;

namespace {

// Level 0 records nothing, yet registers the component; a level set later
// applies to the next call.
TEST(Frame, LevelZeroRecordsNothing) {
    std::string file = kxtest::start_tracing("");
    kx_uint32_t mask;
    sec_translate_perms("rz", nullptr, &mask);
    sec_acle_t acle = nullptr;
    sec_create_acle(SEC_ACLE_GROUP, 1, nullptr, "staff", &acle);
    sec_release_acle(acle);
    EXPECT_TRUE(trace_ids(file).empty());
    ASSERT_EQ(tr_set_detail_level_1("_SEL", "API", 1), TR_OK);
    sec_translate_perms("r", nullptr, &mask);
    EXPECT_EQ(trace_ids(file), (ids{91, 94}));
}

TEST(Frame, LevelOneRecordsBareIds) {
    std::string file = kxtest::start_tracing("_SEL:API=1");
    kx_uint32_t mask;
    EXPECT_EQ(sec_translate_perms("rz", nullptr, &mask), SEC_S_BAD_PERMISSION);
    char out[33];
    sec_translate_bitmask(3, nullptr, out);
    sec_acle_t acle = nullptr;
    sec_create_acle(SEC_ACLE_GROUP, 1, nullptr, "staff", &acle);
    char *m = nullptr, *i = nullptr;
    sec_display_acle_id(acle, &m, &i);
    free(m);
    free(i);
    sec_release_acle(acle);
    EXPECT_EQ(trace_ids(file), (ids{91, 94, 97, 100, 40, 43, 49, 52, 45, 48}));
    for (const auto &r : read_trace(file))
        EXPECT_TRUE(r.items.empty()) << r.id;
}

TEST(Frame, LevelEightRecordsData) {
    std::string file = kxtest::start_tracing("_SEL:API=8");
    kx_uint32_t mask = 0;
    EXPECT_EQ(sec_translate_perms("rz", nullptr, &mask), SEC_S_BAD_PERMISSION);
    EXPECT_EQ(sec_translate_perms(nullptr, nullptr, &mask), SEC_S_OK);
    sec_acle_t acle = nullptr;
    ASSERT_EQ(sec_create_acle(SEC_ACLE_USER, 0x3, "unix", "bob@host", &acle), SEC_S_OK);
    sec_release_acle(acle);
    sec_release_acle(nullptr);
    auto r = read_trace(file);
    ASSERT_EQ(trace_ids(file), (ids{93, 95, 93, 96, 42, 44, 47, 48, 47, 48}));
    sec_perm_set_t no_set = nullptr;
    kx_uint32_t *result = &mask;
    EXPECT_EQ(r[0].items, (items{hex_text("rz"), hex_of(no_set), hex_of(result)}));
    kx_int32_t failed = SEC_S_BAD_PERMISSION, ok = 0;
    EXPECT_EQ(r[1].items, (items{hex_of(failed)}));
    // A null permission text records as "<nil>".
    EXPECT_EQ(r[2].items[0], hex_text("<nil>"));
    kx_uint32_t zero = 0;
    EXPECT_EQ(r[3].items, (items{hex_of(ok), hex_of(zero)}));

    kx_uint32_t type = 4, perm = 3;
    sec_acle_t *where = &acle;
    EXPECT_EQ(r[4].items, (items{hex_of(type), hex_of(perm), hex_text("unix"), hex_text("bob@host"),
                                 hex_of(where)}));
    unsigned char type_byte = 4;
    EXPECT_EQ(r[6].items[1], hex_of(type_byte));
    EXPECT_EQ(r[6].items[3], hex_text("unix"));
    // Release functions record their bare exit id at level 8 too.
    EXPECT_TRUE(r[7].items.empty());
    // A null entry records a zeroed one.
    sec_acle_t null_acle = nullptr;
    EXPECT_EQ(r[8].items,
              (items{hex_of(null_acle), "00", hex_of(zero), hex_text(""), hex_text("")}));
}

// API levels other than 0, 1 and 8 record only the release exits; Perf 5
// is not announced.
TEST(Frame, OtherLevelsRecordOnlyReleaseExits) {
    std::string file = kxtest::start_tracing("_SEL:API=4,Perf=5");
    sec_acle_t acle = nullptr;
    kx_uint32_t mask;
    sec_translate_perms("r", nullptr, &mask);
    sec_create_acle(SEC_ACLE_ANYOTHER, 1, nullptr, nullptr, &acle);
    sec_release_acle(acle);
    EXPECT_EQ(trace_ids(file), (ids{48}));
}

TEST(Frame, PerfLevelIsAnnouncedAtRegistration) {
    std::string file = kxtest::start_tracing("_SEL:Perf=2");
    kx_uint32_t mask;
    sec_translate_perms("r", nullptr, &mask);
    ASSERT_EQ(trace_ids(file), (ids{0}));
    kx_int32_t level = 2;
    EXPECT_EQ(read_trace(file)[0].items, (items{hex_of(level)}));
}

// A registration that the trace library refuses leaves the caller's record.
TEST(Frame, FailedRegistrationKeepsTheCallersRecord) {
    static tr_detail_level_t levels[1];
    static const tr_category_description_t cats[1] = {{0, "Other", 0, 0}};
    ASSERT_EQ(tr_register_component_1("_SEL", levels, cats, 1), TR_OK);
    kxacl::bad_param("caller", 7, 0x1234u);
    kx_uint32_t mask;
    EXPECT_EQ(sec_translate_perms("r", nullptr, &mask), SEC_S_OK);
    EXPECT_TRUE(kxtest::record_is(SEC_S_BAD_PARAM, kxacl::MSG_2650_101, {"caller", 7, 0x1234}));
}

} // namespace
