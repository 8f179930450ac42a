// Creating, displaying and releasing entries, across codesets.
#include <clocale>
#include <cstdlib>
#include <cstring>
#include <string>

#include <gtest/gtest.h>

#include <kx_acl.h>

#include "alloc.h"
#include "messages.h"
#include "support.h"

using kxtest::record_is;

namespace {

// Members are initialised in order: the outputs before the call's status.
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

// 2650-101 for the parameter, whose value shows as its low 32 bits.
void expect_bad_param(const char *routine, int position, const void *value) {
    int shown =
        static_cast<int>(static_cast<std::uint32_t>(reinterpret_cast<std::uintptr_t>(value)));
    EXPECT_TRUE(record_is(SEC_S_BAD_PARAM, kxacl::MSG_2650_101, {routine, position, shown}));
}

// Stored and displayed mechanism and identity; null for none.
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
}

TEST(CreateAcle, ArgumentsInParameterOrder) {
    sec_acle_t acle = reinterpret_cast<sec_acle_t>(8);
    EXPECT_EQ(sec_create_acle(3, 0, "unix", "a@b", &acle), SEC_S_BAD_PARAM);
    expect_bad_param("sec_create_acle", 1, reinterpret_cast<void *>(3));
    const char *long_mech = "0123456789abcdefg";
    EXPECT_EQ(sec_create_acle(SEC_ACLE_USER, 0, long_mech, "a@b", &acle), SEC_S_BAD_PARAM);
    expect_bad_param("sec_create_acle", 3, long_mech);
    EXPECT_EQ(sec_create_acle(SEC_ACLE_EXPANDED, 0, nullptr, "x", &acle), SEC_S_BAD_PARAM);
    expect_bad_param("sec_create_acle", 3, nullptr);
    const char *empty = "";
    EXPECT_EQ(sec_create_acle(SEC_ACLE_GROUP, 0, nullptr, empty, &acle), SEC_S_BAD_PARAM);
    expect_bad_param("sec_create_acle", 4, empty);
    EXPECT_EQ(sec_create_acle(SEC_ACLE_GROUP, 0, nullptr, "g", nullptr), SEC_S_BAD_PARAM);
    expect_bad_param("sec_create_acle", 5, nullptr);
    // Nothing was stored through acle by a failed check.
    EXPECT_EQ(acle, reinterpret_cast<sec_acle_t>(8));
}

TEST(CreateAcle, HostIdentitiesOfUnixAndVgn2) {
    const char *no_at = "bob";
    created missing_at(SEC_ACLE_USER, 1, "unix", no_at);
    EXPECT_EQ(missing_at.status, SEC_S_BAD_PARAM);
    expect_bad_param("sec_create_acle", 4, no_at);
    EXPECT_EQ(missing_at.acle, nullptr);
    const char *empty_host = "bob@";
    EXPECT_EQ(created(SEC_ACLE_USER, 1, "vgn2", empty_host).status, SEC_S_BAD_PARAM);
    expect_bad_param("sec_create_acle", 4, empty_host);

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
        {SEC_ACLE_USER, "unix", "bob@host.example.com", "bob@host.example.com"},
        {SEC_ACLE_USER, "unix", "bob@10.1.2.3", "bob@10.1.2.3"},
        {SEC_ACLE_EXPANDED, "unix", "hostname", "hostname"},
        // The mechanism must be spelled exactly for the host rule to apply.
        {SEC_ACLE_USER, "UNIX", "bob@0:0:0:0:0:0:0:1", "bob@0:0:0:0:0:0:0:1"},
        {SEC_ACLE_USER, "UNIX", "bob", "bob"},
        {SEC_ACLE_USER, "krb5", "bob", "bob"},
    };
    for (const auto &c : cases) {
        created e(c.type, 1, c.mech, c.id);
        ASSERT_EQ(e.status, SEC_S_OK) << c.id;
        EXPECT_STREQ(e.acle->id, c.stored);
        EXPECT_STREQ(e.acle->mech, c.mech);
    }
}

TEST(DisplayAcle, Failures) {
    sec_acle_desc acle{};
    char *m = nullptr, *i = nullptr;
    EXPECT_EQ(sec_display_acle_id(nullptr, &m, &i), SEC_S_BAD_PARAM);
    expect_bad_param("sec_display_acle_id", 1, nullptr);
    EXPECT_EQ(sec_display_acle_id(&acle, nullptr, &i), SEC_S_BAD_PARAM);
    expect_bad_param("sec_display_acle_id", 2, nullptr);
    EXPECT_EQ(sec_display_acle_id(&acle, &m, nullptr), SEC_S_BAD_PARAM);
    expect_bad_param("sec_display_acle_id", 3, nullptr);

    acle.type = 7;
    displayed bad_type(&acle);
    EXPECT_EQ(bad_type.status, SEC_S_BAD_ACLE);
    EXPECT_TRUE(record_is(SEC_S_BAD_ACLE, kxacl::MSG_2650_107, {7}));
    EXPECT_EQ(bad_type.mech, nullptr);
    EXPECT_EQ(bad_type.id, nullptr);

    char empty[] = "";
    acle.type = SEC_ACLE_GROUP;
    acle.id = empty;
    EXPECT_EQ(displayed(&acle).status, SEC_S_BAD_ACLE);
    EXPECT_TRUE(record_is(SEC_S_BAD_ACLE, kxacl::MSG_2650_108, {}));
    char joe[] = "joe";
    acle.type = SEC_ACLE_USER;
    acle.id = joe;
    EXPECT_EQ(displayed(&acle).status, SEC_S_BAD_ACLE);
    EXPECT_TRUE(record_is(SEC_S_BAD_ACLE, kxacl::MSG_2650_108, {}));
    // A mechanism field filled to the last byte is read as 16 characters.
    std::memset(acle.mech, 'm', sizeof acle.mech);
    displayed full(&acle);
    ASSERT_EQ(full.status, SEC_S_OK);
    EXPECT_EQ(std::string(full.mech), std::string(16, 'm'));
}

// Found by failing each allocation of the process: when the identity's
// host part could not be normalised (no memory, or a user identity without
// '@'), the caller's pointer was left as it was instead of null.
TEST(CreateAcle, FailedIdentityNormalisationLeavesNoEntry) {
    sec_acle_t acle = reinterpret_cast<sec_acle_t>(1);
    kxacl::mem_fail_after(0);
    EXPECT_EQ(sec_create_acle(SEC_ACLE_USER, 3, "unix", "bob@0:0:0:0:0:0:0:1", &acle),
              SEC_S_NO_MEMORY);
    kxacl::mem_fail_after(-1);
    EXPECT_EQ(acle, nullptr);
    acle = reinterpret_cast<sec_acle_t>(1);
    EXPECT_EQ(sec_create_acle(SEC_ACLE_USER, 3, "unix", "bob", &acle), SEC_S_BAD_PARAM);
    EXPECT_EQ(acle, nullptr);
}

// Every allocation of entry creation may fail: the failure is reported
// with its routine and size, and no entry is handed out.
TEST(CreateAcle, EveryAllocationFailureIsReported) {
    int failures = 0;
    for (long n = 0;; ++n) {
        kxacl::mem_fail_after(n);
        sec_acle_t acle = nullptr;
        kx_int32_t rc = sec_create_acle(SEC_ACLE_USER, 3, "unix", "bob@0:0:0:0:0:0:0:1", &acle);
        kxacl::mem_fail_after(-1);
        if (rc == SEC_S_OK) {
            EXPECT_STREQ(acle->id, "bob@::1");
            sec_release_acle(acle);
            break;
        }
        ++failures;
        EXPECT_EQ(rc, SEC_S_NO_MEMORY);
        EXPECT_EQ(acle, nullptr);
        auto e = kxtest::last_error();
        EXPECT_EQ(e.msg_num, 89);
        EXPECT_TRUE(e.str(0) == "sec_create_acle" || e.str(0) == "sec__create_acle") << e.str(0);
        EXPECT_GT(e.num(1), 0);
    }
    EXPECT_EQ(failures, 2);
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
    expect_bad_param("sec_create_acle", 3, mech);
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

TEST(Codesets, AssumedUtf8OverridesTheLocale) {
    setenv("KX_CU_UTF8_ASSUMED", "1", 1);
    ASSERT_TRUE(kxtest::use_build_locale("en_US.ISO-8859-1"));
    // Taken as UTF-8, the Latin-1 byte is invalid.
    EXPECT_EQ(created(SEC_ACLE_GROUP, 1, nullptr, "caf\xe9").status, SEC_S_CODESET_ERROR);
    created ok(SEC_ACLE_GROUP, 1, nullptr, "caf\xc3\xa9");
    ASSERT_EQ(ok.status, SEC_S_OK);
    EXPECT_STREQ(ok.acle->id, "caf\xc3\xa9");
}

} // namespace
