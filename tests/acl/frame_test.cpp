// The API frame: trace points at API levels 1 and 8, registration, and the
// Perf announcement. Each test runs in its own process, so the levels set
// before the first library call are the ones registration reads.
#include <cstdint>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include <kx_acl.h>
#include <kx_tr.h>

#include "report.h"
#include "support.h"

using kxtest::hex_of;
using kxtest::hex_text;
using kxtest::read_trace;
using kxtest::trace_ids;
using ids = std::vector<unsigned>;

namespace {

TEST(Frame, LevelZeroRecordsNothing) {
    std::string file = kxtest::start_tracing("");
    kx_uint32_t mask;
    sec_translate_perms("rz", nullptr, &mask);
    sec_acle_t acle = nullptr;
    sec_create_acle(SEC_ACLE_GROUP, 1, nullptr, "staff", &acle);
    sec_release_acle(acle);
    EXPECT_TRUE(trace_ids(file).empty());
    // Registration happened all the same: the component is known.
    EXPECT_EQ(tr_set_detail_level_1("_SEL", "API", 0), TR_OK);
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
    auto r = read_trace(file);
    ASSERT_EQ(r.size(), 4u);
    EXPECT_EQ(r[0].id, 93u);
    sec_perm_set_t no_set = nullptr;
    kx_uint32_t *result = &mask;
    EXPECT_EQ(r[0].items,
              (std::vector<std::string>{hex_text("rz"), hex_of(no_set), hex_of(result)}));
    EXPECT_EQ(r[1].id, 95u);
    kx_int32_t failed = SEC_S_BAD_PERMISSION, ok = 0;
    EXPECT_EQ(r[1].items, (std::vector<std::string>{hex_of(failed)}));
    // A null permission text records as "<nil>".
    EXPECT_EQ(r[2].items[0], hex_text("<nil>"));
    EXPECT_EQ(r[3].id, 96u);
    kx_uint32_t zero = 0;
    EXPECT_EQ(r[3].items, (std::vector<std::string>{hex_of(ok), hex_of(zero)}));
}

TEST(Frame, LevelEightEntryItemsOfCreateAndRelease) {
    std::string file = kxtest::start_tracing("_SEL:API=8");
    sec_acle_t acle = nullptr;
    ASSERT_EQ(sec_create_acle(SEC_ACLE_USER, 0x3, "unix", "bob@host", &acle), SEC_S_OK);
    sec_release_acle(acle);
    sec_release_acle(nullptr);
    auto r = read_trace(file);
    ASSERT_EQ(r.size(), 6u);
    kx_uint32_t type = 4, perm = 3;
    sec_acle_t *where = &acle;
    EXPECT_EQ(r[0].id, 42u);
    EXPECT_EQ(r[0].items, (std::vector<std::string>{hex_of(type), hex_of(perm), hex_text("unix"),
                                                    hex_text("bob@host"), hex_of(where)}));
    EXPECT_EQ(r[1].id, 44u);
    EXPECT_EQ(r[2].id, 47u);
    unsigned char type_byte = 4;
    EXPECT_EQ(r[2].items[1], hex_of(type_byte));
    EXPECT_EQ(r[2].items[3], hex_text("unix"));
    // Release functions record their bare exit id at level 8 too.
    EXPECT_EQ(r[3].id, 48u);
    EXPECT_TRUE(r[3].items.empty());
    // A null entry records a zeroed one.
    EXPECT_EQ(r[4].id, 47u);
    sec_acle_t null_acle = nullptr;
    EXPECT_EQ(r[4].items, (std::vector<std::string>{hex_of(null_acle), "00", hex_of(kx_uint32_t{0}),
                                                    hex_text(""), hex_text("")}));
}

TEST(Frame, OtherLevelsRecordOnlyReleaseExits) {
    std::string file = kxtest::start_tracing("_SEL:API=4");
    sec_acle_t acle = nullptr;
    kx_uint32_t mask;
    sec_translate_perms("r", nullptr, &mask);
    sec_create_acle(SEC_ACLE_ANYOTHER, 1, nullptr, nullptr, &acle);
    sec_release_acle(acle);
    EXPECT_EQ(trace_ids(file), (ids{48}));
}

TEST(Frame, LevelsChangeBetweenCalls) {
    std::string file = kxtest::start_tracing("_SEL:API=0");
    kx_uint32_t mask;
    sec_translate_perms("r", nullptr, &mask);
    ASSERT_EQ(tr_set_detail_level_1("_SEL", "API", 1), TR_OK);
    sec_translate_perms("r", nullptr, &mask);
    EXPECT_EQ(trace_ids(file), (ids{91, 94}));
}

TEST(Frame, PerfLevelIsAnnouncedAtRegistration) {
    std::string file = kxtest::start_tracing("_SEL:Perf=2");
    kx_uint32_t mask;
    sec_translate_perms("r", nullptr, &mask);
    auto r = read_trace(file);
    ASSERT_EQ(r.size(), 1u);
    EXPECT_EQ(r[0].id, 0u);
    kx_int32_t level = 2;
    EXPECT_EQ(r[0].items, (std::vector<std::string>{hex_of(level)}));
}

TEST(Frame, PerfLevelFiveIsNotAnnounced) {
    std::string file = kxtest::start_tracing("_SEL:Perf=5");
    kx_uint32_t mask;
    sec_translate_perms("r", nullptr, &mask);
    EXPECT_TRUE(trace_ids(file).empty());
}

// A registration that the trace library refuses leaves the caller's record.
TEST(Frame, FailedRegistrationKeepsTheCallersRecord) {
    static tr_detail_level_t levels[1];
    static const tr_category_description_t cats[1] = {{0, "Other", 0, 0}};
    ASSERT_EQ(tr_register_component_1("_SEL", levels, cats, 1), TR_OK);
    kxacl::bad_param("caller", 7, 0x1234u);
    kx_uint32_t mask;
    EXPECT_EQ(sec_translate_perms("r", nullptr, &mask), SEC_S_OK);
    auto e = kxtest::last_error();
    EXPECT_EQ(e.str(0), "caller");
    EXPECT_EQ(e.num(2), 0x1234);
}

} // namespace
