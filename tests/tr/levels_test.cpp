// Registration and levels of detail: defaults, KX_TRACE_LEVELS, run-time
// changes, and the arguments the registry refuses.
#include <array>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include <kx_tr.h>

namespace {

using levels_t = std::array<tr_detail_level_t, 5>; // Errors, API, Perf, Info, Buffer

// Not in id order; Info's default is above 9, Buffer's below its minimum.
constexpr tr_category_description_t categories[] = {
    {2, "Perf", 3, 2}, {0, "Errors", 0, 0}, {3, "Info", 12, 0},
    {1, "API", 1, 0},  {4, "Buffer", 0, 4},
};
constexpr levels_t defaults = {0, 1, 3, 9, 4};
constexpr levels_t minimums = {0, 0, 2, 0, 4};
constexpr levels_t untouched = {0xAA, 0xAA, 0xAA, 0xAA, 0xAA};

class Levels : public ::testing::Test {
  protected:
    void SetUp() override { unsetenv("KX_TRACE_LEVELS"); }
    void TearDown() override { tr_unregister_component_1("_TST"); }
    int register_as(const char *name, levels_t &into) {
        return tr_register_component_1(name, into.data(), categories, 5);
    }
    levels_t levels = untouched;
};

// Settings of other components, and settings that cannot be read, leave
// the levels alone.
TEST_F(Levels, ConfiguredLevelsAreAppliedAtRegistration) {
    const struct {
        const char *configured;
        levels_t expected;
    } cases[] = {
        // clang-format off
        {"", defaults}, {"_TST:api=8,PERF=6", {0, 8, 6, 9, 4}},
        {"_SEL:API=8;_TST:Perf=7;_XYZ:*=1", {0, 1, 7, 9, 4}}, {"_TST:*=1,API=8", {1, 8, 2, 1, 4}},
        {"_TST:API=8,*=1", {1, 1, 2, 1, 4}}, {"_TST:*=0", minimums},
        {"_TST:ALL=3,api=8", {3, 8, 3, 3, 4}}, {"_TST:*=7", {7, 7, 7, 7, 7}},
        {"_TST:API=8;;_TST:,Errors=2,", {2, 8, 3, 9, 4}}, {" _TST : API = 8 ", {0, 8, 3, 9, 4}},
        {"_TST:Unknown=5,API=6,Perf=", {0, 6, 3, 9, 4}}, {"_TST:API=12", {0, 9, 3, 9, 4}},
        {"_TST:API=4294967296", {0, 9, 3, 9, 4}}, {"_TST:API=", defaults}, {"_TST", defaults},
        {":::", defaults}, {"API=8", defaults}, {"_TST:API", defaults}, {"_TST:=5", defaults},
        {"_TST:API=-1", defaults}, {"_TST:API=8x", defaults}, {"_TST:API=8:Perf=2", defaults},
        {"_tst:API=8", defaults}, {"_TST2:API=8", defaults}, {"_TS:API=8", defaults},
        {"_TST:\x01" "API=8,Perf=\xff" "7,\xff=1", defaults},
        {"_T\xffST:API=8;_TST:Info=1\x7f,Errors=5", {5, 1, 3, 9, 4}},
        // clang-format on
    };
    for (const auto &c : cases) {
        setenv("KX_TRACE_LEVELS", c.configured, 1);
        levels = untouched;
        ASSERT_EQ(register_as("_TST", levels), TR_OK) << c.configured;
        EXPECT_EQ(levels, c.expected) << c.configured;
        ASSERT_EQ(tr_unregister_component_1("_TST"), TR_OK);
    }
}

// Each part that cannot be read is named once on standard error: syntax
// once per process, a category the component lacks at its registration; a
// few warnings at most. Empty parts are no mistake.
TEST_F(Levels, UnreadablePartsAreWarnedAboutByName) {
    setenv("KX_TRACE_LEVELS", "_TST:API=8x,Nope=1,all=2,,=5;API=8;;_TST:Perf", 1);
    ::testing::internal::CaptureStderr();
    ASSERT_EQ(register_as("_TST", levels), TR_OK);
    EXPECT_EQ(levels, (levels_t{2, 2, 2, 2, 4})) << "only all=2 is read";
    ASSERT_EQ(tr_unregister_component_1("_TST"), TR_OK);
    setenv("KX_TRACE_LEVELS", "_TST:a=1,b=1,c=1,d=1,e=1", 1);
    ASSERT_EQ(register_as("_TST", levels), TR_OK);
    const std::string prefix = "kx_tr: KX_TRACE_LEVELS: ";
    const std::string all = " (Perf, Errors, Info, API, Buffer, or all)\n";
    EXPECT_EQ(::testing::internal::GetCapturedStderr(),
              prefix + "the level of \"API=8x\" is not a number from 0 to 9\n" + prefix +
                  "\"=5\" names no category\n" + prefix +
                  "\"API=8\" names no component (write COMPONENT:CATEGORY=LEVEL,...)\n" + prefix +
                  "\"Perf\" has no \"=LEVEL\"\n" + prefix + "no category \"Nope\" in _TST" + all +
                  prefix + "no category \"a\" in _TST" + all + prefix +
                  "no category \"b\" in _TST" + all + prefix + "no category \"c\" in _TST" + all +
                  prefix + "further mistakes not shown\n");
}

// Bad registrations are refused without effect, keeping errno; the
// registry keeps its own copies of the names; once unregistered, a
// component's levels are no longer written and its name is free again.
TEST_F(Levels, RegistrationRules) {
    const tr_category_description_t id_too_big[] = {{0, "A", 1, 0}, {2, "B", 1, 0}};
    const tr_category_description_t no_name[] = {{0, nullptr, 1, 0}};
    tr_detail_level_t *into = levels.data();
    errno = 4242;
    for (const char *bad : {static_cast<const char *>(nullptr), "", "_T T", "_T\nT"})
        EXPECT_EQ(tr_register_component_1(bad, into, categories, 5), TR_BAD_ARGUMENT);
    EXPECT_EQ(tr_register_component_1("_TST", nullptr, categories, 5), TR_BAD_ARGUMENT);
    EXPECT_EQ(tr_register_component_1("_TST", into, nullptr, 5), TR_BAD_ARGUMENT);
    EXPECT_EQ(tr_register_component_1("_TST", into, categories, 0), TR_BAD_ARGUMENT);
    EXPECT_EQ(tr_register_component_1("_TST", into, id_too_big, 2), TR_BAD_ARGUMENT);
    EXPECT_EQ(tr_register_component_1("_TST", into, no_name, 1), TR_BAD_ARGUMENT);
    EXPECT_EQ(errno, 4242);
    EXPECT_EQ(levels, untouched);
    EXPECT_EQ(tr_set_detail_level_1("_TST", "*", 1), TR_NOT_REGISTERED);
    EXPECT_EQ(tr_unregister_component_1(nullptr), TR_BAD_ARGUMENT);

    levels_t second = untouched;
    char component[] = "_TST", api[] = "API";
    ASSERT_EQ(register_as(component, levels), TR_OK);
    EXPECT_EQ(register_as("_TST", second), TR_ALREADY_REGISTERED);
    EXPECT_EQ(second, untouched);
    EXPECT_EQ(tr_unregister_component_1("_TST"), TR_OK);
    EXPECT_EQ(tr_unregister_component_1("_TST"), TR_NOT_REGISTERED);
    EXPECT_EQ(tr_set_detail_level_1("_TST", "*", 7), TR_NOT_REGISTERED);
    EXPECT_EQ(levels, defaults); // no longer written
    setenv("KX_TRACE_LEVELS", "_TST:API=5", 1);
    const tr_category_description_t described[] = {{0, api, 1, 0}};
    tr_detail_level_t level = 0xAA;
    ASSERT_EQ(tr_register_component_1(component, &level, described, 1), TR_OK);
    EXPECT_EQ(level, 5);
    std::strcpy(component, "_XXX");
    std::strcpy(api, "XYZ");
    EXPECT_EQ(tr_set_detail_level_1("_TST", "API", 4), TR_OK);
    EXPECT_EQ(level, 4);
}

// A setting far longer than any buffer is read to its end.
TEST_F(Levels, OverlongConfigurationIsReadToItsEnd) {
    std::string overlong = "_TST:";
    for (int i = 0; i < 20000; ++i)
        overlong += "Unknown=1,";
    setenv("KX_TRACE_LEVELS", (overlong + "API=6").c_str(), 1);
    ASSERT_EQ(register_as("_TST", levels), TR_OK);
    EXPECT_EQ(levels, (levels_t{0, 6, 3, 9, 4}));
}

} // namespace
