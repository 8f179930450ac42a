// Creating, displaying and releasing entries, across codesets.
#include <clocale>
#include <cstdlib>
#include <cstring>
#include <string>
#include <gtest/gtest.h>
#include <kx_acl.h>
#include "messages.h"
#include "support.h"

using kxtest::record_is;

namespace {
struct created {
    sec_acle_t acle = nullptr;
    kx_int32_t status;
    created(unsigned char type, kx_uint32_t perm, const char *mech, const char *id)
        : status(sec_create_acle(type, perm, mech, id, &acle)) {}
    ~created() { sec_release_acle(acle); }
};

struct displayed {
    char *mech = reinterpret_cast<char *>(1);
    char *id = reinterpret_cast<char *>(1);
    kx_int32_t status;
    explicit displayed(sec_acle_t acle) : status(sec_display_acle_id(acle, &mech, &id)) {}
    ~displayed() {
        if (status == SEC_S_OK) {
            free(mech);
            free(id);
        }
    }
};

TEST(CreateAcle, StoresOnlyWhatTheTypeCarries) {
    const struct {
        unsigned char type;
        const char *mech, *id, *stored_mech, *stored_id, *shown_mech;
    } cases[] = {
        {SEC_ACLE_UNAUTHENTICATED, "unix", "someone", "", nullptr, nullptr},
        {SEC_ACLE_GROUP, "ignored", "staff", "", "staff", nullptr},
        {SEC_ACLE_USER, "0123456789abcdef", "joe", "0123456789abcdef", "joe", "0123456789abcdef"},
    };
    for (const auto &c : cases) {
        created e(c.type, 5, c.mech, c.id);
        ASSERT_EQ(e.status, SEC_S_OK);
        EXPECT_EQ(e.acle->type, c.type);
        EXPECT_EQ(e.acle->perm, 5u);
        EXPECT_STREQ(e.acle->mech, c.stored_mech);
        EXPECT_STREQ(e.acle->id, c.stored_id);
        displayed d(e.acle);
        ASSERT_EQ(d.status, SEC_S_OK);
        EXPECT_STREQ(d.mech, c.shown_mech);
        EXPECT_STREQ(d.id, c.stored_id);
    }
    // A mechanism field filled to the last byte is read as 16 characters.
    char joe[] = "joe";
    sec_acle_desc full{0, {}, SEC_ACLE_USER, joe};
    std::memset(full.mech, 'm', sizeof full.mech);
    displayed d(&full);
    ASSERT_EQ(d.status, SEC_S_OK);
    EXPECT_EQ(std::string(d.mech), std::string(16, 'm'));
}

// Host parts of unix and vgn2 identities in canonical form.
TEST(CreateAcle, HostIdentitiesOfUnixAndVgn2) {
    struct {
        unsigned char type;
        const char *mech, *id, *stored;
    } cases[] = {
        {SEC_ACLE_EXPANDED, "unix", "0:0:0:0:0:0:0:1", "::1"},
        {SEC_ACLE_USER, "unix", "bob@0000:0000:0000:0000:0000:0000:0000:0001", "bob@::1"},
        {SEC_ACLE_USER, "vgn2", "bob@2001:DB8:0:0:1:0:0:1", "bob@2001:db8::1:0:0:1"},
        // The host part starts after the first @, and this one is no address.
        {SEC_ACLE_USER, "unix", "a@b@::FFFF:10.0.0.1", "a@b@::FFFF:10.0.0.1"},
        {SEC_ACLE_USER, "unix", "a@::FFFF:10.0.0.1", "a@::ffff:10.0.0.1"},
        {SEC_ACLE_EXPANDED, "unix", "hostname", "hostname"},
        // The mechanism must be spelled exactly for the host rule to apply.
        {SEC_ACLE_USER, "UNIX", "bob@0:0:0:0:0:0:0:1", "bob@0:0:0:0:0:0:0:1"},
    };
    for (const auto &c : cases) {
        created e(c.type, 1, c.mech, c.id);
        ASSERT_EQ(e.status, SEC_S_OK) << c.id;
        EXPECT_STREQ(e.acle->id, c.stored);
        EXPECT_STREQ(e.acle->mech, c.mech);
    }
}

TEST(Codesets, Latin1IsStoredAsUtf8AndDisplayedBack) {
    ASSERT_TRUE(kxtest::use_build_locale("en_US.ISO-8859-1")) << "the test locale was not built";
    const char latin1[] = "j\xe9r\xf4me";
    created g(SEC_ACLE_GROUP, 1, nullptr, latin1);
    ASSERT_EQ(g.status, SEC_S_OK);
    EXPECT_STREQ(g.acle->id, "j\xc3\xa9r\xc3\xb4me");
    displayed d(g.acle);
    ASSERT_EQ(d.status, SEC_S_OK);
    EXPECT_STREQ(d.id, latin1);

    // Sixteen Latin-1 bytes become seventeen UTF-8 bytes.
    const char mech[] = "\xe9"
                        "bcdefghijklmnop";
    ASSERT_EQ(std::strlen(mech), 16u);
    created u(SEC_ACLE_USER, 1, mech, "joe@host");
    EXPECT_EQ(u.status, SEC_S_BAD_PARAM);
    EXPECT_EQ(u.acle, nullptr);
    auto shown =
        static_cast<int>(static_cast<std::uint32_t>(reinterpret_cast<std::uintptr_t>(mech)));
    EXPECT_TRUE(record_is(SEC_S_BAD_PARAM, kxacl::MSG_2650_101, {"sec_create_acle", 3, shown}));
}

TEST(Codesets, UnconvertibleTextsFail) {
    ASSERT_NE(std::setlocale(LC_ALL, "C.UTF-8"), nullptr);
    created bad(SEC_ACLE_GROUP, 1, nullptr, "caf\xe9");
    EXPECT_EQ(bad.status, SEC_S_CODESET_ERROR);
    EXPECT_EQ(bad.acle, nullptr);
    EXPECT_TRUE(record_is(SEC_S_CODESET_ERROR, kxacl::MSG_2650_143, {}));
    // A stored text that is not UTF-8 cannot be displayed, and nothing leaks.
    char stored[] = "caf\xe9";
    sec_acle_desc acle{};
    acle.type = SEC_ACLE_USER;
    std::strcpy(acle.mech, "unix");
    acle.id = stored;
    displayed d(&acle);
    EXPECT_EQ(d.status, SEC_S_CODESET_ERROR);
    EXPECT_EQ(d.mech, nullptr);
    EXPECT_EQ(d.id, nullptr);
}
} // namespace
