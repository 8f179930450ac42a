// Permission evaluation and the identity handler registry: the worked
// example, every failure with its message and arguments, the handler rules,
// buffers whose counts run past their end, and the trace points.
#include <algorithm>
#include <atomic>
#include <functional>
#include <cstring>
#include <random>
#include <string>
#include <variant>
#include <vector>

#include <gtest/gtest.h>

#include <kx_acl.h>

#include "alloc.h"
#include "eval.h"
#include "messages.h"
#include "support.h"
#include "eval_fixtures.h"

using namespace kxacl;
using namespace evaltest;
using kxtest::hex_of;
using kxtest::hex_text;

namespace {

using kxtest::arg;
using kxtest::record_is;
using items = std::vector<std::string>;
constexpr kx_uint32_t untouched = 0xdeadbeef;

// The outcome of one evaluation; perm starts as `untouched`.
struct result {
    kx_int32_t status;
    kx_uint32_t perm;
};

result single(sec_acl_buffer_t acl, unsigned char type, const char *mech, const char *zmech,
              const char *id) {
    result r{0, untouched};
    r.status = sec__single_acle_perm(acl, type, const_cast<char *>(mech), const_cast<char *>(zmech),
                                     const_cast<char *>(id), &r.perm);
    return r;
}

result groups_of(sec_acl_buffer_t acl, std::vector<const char *> names) {
    group_list list(std::move(names));
    result r{0, untouched};
    r.status = sec__group_acles_perm(acl, list.count(), list.get(), &r.perm);
    return r;
}

// The same for the messages that end in a source position.
testing::AssertionResult record_at_source(kx_int32_t status, msg m) {
    auto e = kxtest::last_error();
    if (e.id == status && e.msg_num == m && e.args.size() == 2 && e.str(0) == "kxacl_acl" &&
        e.num(1) > 0)
        return testing::AssertionSuccess();
    return testing::AssertionFailure()
           << "record has status " << e.id << ", message " << e.msg_num << ": " << e.text;
}

bool no_record() {
    return kxtest::last_error().id == 0;
}

// Granted perm, leaving no record.
void expect_ok(result r, kx_uint32_t perm) {
    EXPECT_EQ(r.status, SEC_S_OK);
    EXPECT_EQ(r.perm, perm);
    EXPECT_TRUE(no_record());
}

// No entry for the request: mask 0 and 2650-147 with these arguments.
void expect_no_entry(result r, long long type, std::string mech, std::string id) {
    EXPECT_EQ(r.status, SEC_S_BAD_ACLE);
    EXPECT_EQ(r.perm, 0u);
    EXPECT_TRUE(record_is(SEC_S_BAD_ACLE, MSG_2650_147, {type, std::move(mech), std::move(id)}));
}

// Refused before any search: the mask is not stored.
void expect_refused(result r, kx_int32_t status, msg m, const std::vector<arg> &args = {}) {
    EXPECT_EQ(r.status, status);
    EXPECT_EQ(r.perm, untouched);
    EXPECT_TRUE(record_is(status, m, args));
}

// A search that meets a damaged sub-ACL: mask 0 and 2650-110.
void expect_corrupt(result r) {
    EXPECT_EQ(r.status, SEC_S_BAD_ACL);
    EXPECT_EQ(r.perm, 0u);
    EXPECT_TRUE(record_at_source(SEC_S_BAD_ACL, MSG_2650_110));
}

// ---- the worked example ----------------------------------------------------

TEST(WorkedExample, EveryRow) {
    owned_acl acl(example_acl());
    expect_ok(single(acl.get(), 4, "unix", nullptr, "Alice"), 0x3);
    expect_no_entry(single(acl.get(), 4, "unix", nullptr, "aaron"), 4, "unix", "aaron");
    expect_ok(single(acl.get(), 2, nullptr, nullptr, nullptr), 0x1);
    expect_ok(groups_of(acl.get(), {"Staff", "wheel", "admin"}), 0x6);
    expect_no_entry(single(acl.get(), 4, "vgn2", nullptr, "alice"), 4, "vgn2", "");
}

// ---- sec__single_acle_perm -------------------------------------------------

TEST(SingleAclePerm, ArgumentFailuresInParameterOrder) {
    owned_acl acl(example_acl());
    kx_uint32_t perm = untouched;
    char unix_mech[] = "unix", bob[] = "bob";
    EXPECT_EQ(sec__single_acle_perm(nullptr, 4, unix_mech, nullptr, bob, &perm), SEC_S_BAD_PARAM);
    EXPECT_TRUE(record_is(SEC_S_BAD_PARAM, MSG_2650_101, {"sec__single_acle_perm", 1, 0}));
    EXPECT_EQ(sec__single_acle_perm(acl.get(), 16, nullptr, nullptr, nullptr, nullptr),
              SEC_S_BAD_PARAM);
    EXPECT_TRUE(record_is(SEC_S_BAD_PARAM, MSG_2650_101, {"sec__single_acle_perm", 6, 0}));
    EXPECT_EQ(perm, untouched);
}

// Header faults are found before the other arguments are looked at, by
// both evaluations, and even when no group is asked for.
TEST(SingleAclePerm, HeaderFailuresComeBeforeTheType) {
    bytes good = example_acl();
    sec_buffer_s empty{0, nullptr};
    sec_buffer_s no_value{static_cast<kx_int32_t>(good.size()), nullptr};
    owned_acl short_acl(prefix(good, 4));
    bytes wrong_type = good, wrong_version = good, foreign = good;
    wrong_type[0] = 0x84;
    wrong_version[1] = 2;
    foreign[2] = 1;
    owned_acl bad_type(wrong_type), bad_version(wrong_version), bad_order(foreign);

    for (auto [acl, m] : {std::pair{&empty, MSG_2650_109},
                          {&no_value, MSG_2650_109},
                          {short_acl.get(), MSG_2650_109},
                          {bad_type.get(), MSG_2650_109},
                          {bad_version.get(), MSG_2650_109},
                          {bad_order.get(), MSG_2650_115}}) {
        expect_refused(single(acl, 16, nullptr, nullptr, nullptr), SEC_S_BAD_ACL, m);
        kx_uint32_t perm = untouched;
        EXPECT_EQ(sec__group_acles_perm(acl, 0, nullptr, &perm), SEC_S_BAD_ACL);
        EXPECT_TRUE(record_is(SEC_S_BAD_ACL, m, {}));
        EXPECT_EQ(perm, untouched);
    }
}

TEST(SingleAclePerm, TypeIsCheckedAndShownWholeByte) {
    owned_acl acl(example_acl());
    for (unsigned type : {0u, 3u, 16u, 0x90u, 0x9fu, 0xe0u})
        expect_refused(single(acl.get(), static_cast<unsigned char>(type), "unix", nullptr, "bob"),
                       SEC_S_BAD_PARAM, MSG_2650_128, {static_cast<long long>(type)});
    // Bits 0x20 and 0x40 are ignored, 0x80 is the handler bit.
    for (unsigned type : {0x24u, 0x44u, 0x84u, 0xe4u})
        expect_ok(single(acl.get(), static_cast<unsigned char>(type), "unix", nullptr, "BOB"), 0x1);
    expect_ok(single(acl.get(), 0x62, nullptr, nullptr, nullptr), 0x1);
}

TEST(SingleAclePerm, UserAndExpandedNeedMechanismThenIdentity) {
    owned_acl acl(example_acl());
    for (unsigned char type : {4, 8, 0x84}) {
        for (const char *empty : {static_cast<const char *>(nullptr), ""}) {
            expect_refused(single(acl.get(), type, empty, "unix", nullptr), SEC_S_BAD_PARAM,
                           MSG_2650_129);
            expect_refused(single(acl.get(), type, "unix", nullptr, empty), SEC_S_BAD_PARAM,
                           MSG_2650_130);
        }
    }
}

TEST(SingleAclePerm, UnauthenticatedAndAnyother) {
    owned_acl acl(make_acl({make_subacl(SEC_ACLE_UNAUTHENTICATED, 1, {}, {rec(0x40)}),
                            make_subacl(SEC_ACLE_ANYOTHER, 1, {}, {rec(0x9)})}));
    expect_ok(single(acl.get(), 1, "", "nonsense", ""), 0x40);
    expect_ok(single(acl.get(), 2, nullptr, nullptr, nullptr), 0x9);

    // No unauthenticated entry: the mechanism, when given, is shown.
    owned_acl example(example_acl());
    expect_no_entry(single(example.get(), 1, nullptr, nullptr, nullptr), 1, "", "");
    expect_no_entry(single(example.get(), 0x81, "unix", nullptr, "bob"), 0x81, "unix", "");

    // An anyother sub-ACL must hold exactly one entry.
    owned_acl two(make_acl({make_subacl(SEC_ACLE_ANYOTHER, 2, {}, {rec(0x1), rec(0x2)})}));
    result r = single(two.get(), 2, nullptr, nullptr, nullptr);
    EXPECT_EQ(r.status, SEC_S_BAD_ACL);
    EXPECT_EQ(r.perm, 0u);
    EXPECT_TRUE(record_at_source(SEC_S_BAD_ACL, MSG_2650_122));
    owned_acl none(make_acl({make_subacl(SEC_ACLE_ANYOTHER, 0, {}, {})}));
    expect_no_entry(single(none.get(), 2, nullptr, nullptr, nullptr), 2, "", "");
}

TEST(SingleAclePerm, UserWalk) {
    owned_acl acl(make_acl(
        {make_subacl(SEC_ACLE_USER, 4, text_field("unix"),
                     {rec(0x1, "alice"), rec(0x2, "bob"), rec(0x4, "carol"), rec(0x8, "dave")})}));
    // Found entries fold case; misses lie before, between and after them.
    for (auto [id, perm] : {std::pair{"ALICE", 0x1u}, {"Carol", 0x4u}, {"dave", 0x8u}})
        expect_ok(single(acl.get(), 4, "UNIX", nullptr, id), perm);
    for (const char *id : {"aaron", "bobby", "zed"})
        expect_no_entry(single(acl.get(), 4, "UNIX", nullptr, id), 4, "UNIX", id);
    // Only A to Z fold: the bytes of other letters are compared as they are.
    owned_acl accented(
        make_acl({make_subacl(SEC_ACLE_USER, 1, text_field("unix"), {rec(0x1, "\xc3\xa9mile")})}));
    EXPECT_EQ(single(accented.get(), 4, "unix", nullptr, "\xc3\x89MILE").status, SEC_S_BAD_ACLE);
    EXPECT_EQ(single(accented.get(), 4, "unix", nullptr, "\xc3\xa9MILE").perm, 0x1u);
}

// Walks with eight-byte comparisons give what the specified walk with
// cu_strcasecmp_posix_1 gives, entry by entry: identities that share long
// prefixes, differ in case or in one byte, stop inside the first eight
// bytes, hold a NUL inside their field, or end the buffer; in any order.
TEST(SingleAclePerm, WalksAsTheTextComparisonDoes) {
    std::mt19937 random(11);
    const std::string alphabet("aAzZ@[`{09-\x80\xe9");
    auto text = [&](std::size_t length) {
        std::string t;
        while (t.size() < length)
            t += alphabet[random() % alphabet.size()];
        return t;
    };
    for (int round = 0; round < 300; ++round) {
        std::string stem = text(random() % 12);
        std::vector<std::string> fields; // identifier bytes, NUL included
        for (std::size_t n = 1 + random() % 12; n > 0; --n) {
            std::string id = stem.substr(0, random() % (stem.size() + 1)) + text(random() % 6);
            id += '\0';
            if (random() % 8 == 0)
                id += text(1 + random() % 9) + '\0'; // bytes after a NUL do not count
            fields.push_back(id);
        }
        if (random() % 2) // mostly ordered, as writers leave them
            std::sort(fields.begin(), fields.end(), [](const std::string &a, const std::string &b) {
                return cu_strcasecmp_posix_1(a.c_str(), b.c_str()) < 0;
            });
        bytes records;
        for (std::size_t i = 0; i < fields.size(); ++i) {
            bytes field(fields[i].begin(), fields[i].end());
            bytes r = make_record(1u << i, field);
            records.insert(records.end(), r.begin(), r.end());
        }
        bytes sub = make_subacl(SEC_ACLE_USER, static_cast<std::uint32_t>(fields.size()),
                                text_field("unix"), {});
        sub.insert(sub.end(), records.begin(), records.end());
        kxacl::store_u32(&sub[0], static_cast<std::uint32_t>(sub.size()));
        owned_acl acl(make_acl({sub}));
        for (int ask = 0; ask < 8; ++ask) {
            std::string id = ask % 2 ? fields[random() % fields.size()].c_str() : text(1);
            if (ask % 4 == 1)
                for (char &c : id)
                    c = static_cast<char>(c >= 'a' && c <= 'z' ? c - 32 : c);
            if (ask % 4 == 3)
                id = stem + text(random() % 4);
            if (id.empty())
                id = "a";
            result expected{SEC_S_BAD_ACLE, 0};
            for (std::size_t i = 0; i < fields.size(); ++i) {
                int r = cu_strcasecmp_posix_1(id.c_str(), fields[i].c_str());
                if (r == 0)
                    expected = {SEC_S_OK, 1u << i};
                if (r <= 0)
                    break;
            }
            result got = single(acl.get(), SEC_ACLE_USER, "unix", nullptr, id.c_str());
            ASSERT_EQ(got.status, expected.status) << round << " " << id;
            ASSERT_EQ(got.perm, expected.perm) << round << " " << id;
        }
    }
}

TEST(SingleAclePerm, ZmechSelectsTheSubacl) {
    owned_acl acl(
        make_acl({make_subacl(SEC_ACLE_USER, 1, text_field("unix"), {rec(0x1, "carol")}),
                  make_subacl(SEC_ACLE_USER, 1, text_field("vgn2"), {rec(0x2, "carol")})}));
    expect_ok(single(acl.get(), 4, "unix", "VGN2", "carol"), 0x2);
    // Messages name mech, not zmech.
    expect_no_entry(single(acl.get(), 4, "unix", "krb5", "carol"), 4, "unix", "");
    expect_no_entry(single(acl.get(), 4, "unix", "vgn2", "dave"), 4, "unix", "dave");
    expect_no_entry(single(acl.get(), 4, "unix", "", "carol"), 4, "unix", "");
}

// ---- sec__group_acles_perm -------------------------------------------------

TEST(GroupAclesPerm, ArgumentFailuresInParameterOrder) {
    owned_acl acl(example_acl());
    group_list staff({"staff"});
    kx_uint32_t perm = untouched;
    EXPECT_EQ(sec__group_acles_perm(nullptr, 1, staff.get(), &perm), SEC_S_BAD_PARAM);
    EXPECT_TRUE(record_is(SEC_S_BAD_PARAM, MSG_2650_101, {"sec__group_acles_perm", 1, 0}));
    EXPECT_EQ(sec__group_acles_perm(acl.get(), 1, nullptr, nullptr), SEC_S_BAD_PARAM);
    EXPECT_TRUE(record_is(SEC_S_BAD_PARAM, MSG_2650_101, {"sec__group_acles_perm", 3, 0}));
    EXPECT_EQ(sec__group_acles_perm(acl.get(), -1, nullptr, &perm), SEC_S_BAD_PARAM);
    EXPECT_TRUE(record_is(SEC_S_BAD_PARAM, MSG_2650_101, {"sec__group_acles_perm", 3, 0}));
    EXPECT_EQ(sec__group_acles_perm(acl.get(), 0, nullptr, nullptr), SEC_S_BAD_PARAM);
    EXPECT_TRUE(record_is(SEC_S_BAD_PARAM, MSG_2650_101, {"sec__group_acles_perm", 4, 0}));
    EXPECT_EQ(perm, untouched);
}

TEST(GroupAclesPerm, Matching) {
    owned_acl acl(example_acl());
    struct {
        std::vector<const char *> names;
        kx_uint32_t perm; // 0: no entry
    } rows[] = {
        {{"staff", "STAFF"}, 0x2},          // twice adds nothing
        {{"nobody", "Admin"}, 0x4},         // one miss does not fail the call
        {{nullptr, "admin", nullptr}, 0x4}, // names that are missing are skipped
        {{"zzz", "aaa", "bob"}, 0},         // after, before and between the entries
        {{nullptr}, 0},
    };
    for (const auto &row : rows) {
        if (row.perm)
            expect_ok(groups_of(acl.get(), row.names), row.perm);
        else
            expect_no_entry(groups_of(acl.get(), row.names), 16, "", "");
    }
    group_list staff({"staff"});
    kx_uint32_t perm = untouched;
    EXPECT_EQ(sec__group_acles_perm(acl.get(), -2, staff.get(), &perm), SEC_S_BAD_ACLE);
    EXPECT_EQ(perm, 0u);
    EXPECT_TRUE(record_is(SEC_S_BAD_ACLE, MSG_2650_147, {16, "", ""}));

    // A user entry of the same name is no group entry.
    owned_acl users(
        make_acl({make_subacl(SEC_ACLE_USER, 1, text_field("unix"), {rec(0x1, "staff")})}));
    expect_no_entry(groups_of(users.get(), {"staff"}), 16, "", "");
}

TEST(Evaluation, AclWithoutSubaclsAnswersNothing) {
    owned_acl acl(make_acl({}));
    EXPECT_EQ(acl.get()->length, 5);
    for (unsigned char type : {1, 2, 4, 8, 0x84})
        EXPECT_EQ(single(acl.get(), type, "unix", nullptr, "bob").status, SEC_S_BAD_ACLE);
    EXPECT_EQ(groups_of(acl.get(), {"staff"}).status, SEC_S_BAD_ACLE);
    // No groups asked is mask zero, not a failure.
    kx_uint32_t perm = untouched;
    EXPECT_EQ(sec__group_acles_perm(acl.get(), 0, nullptr, &perm), SEC_S_OK);
    EXPECT_EQ(perm, 0u);
    EXPECT_TRUE(no_record());
}

// ---- the registry ----------------------------------------------------------

kx_int32_t handler_a(char *, char *) {
    return 0;
}
kx_int32_t handler_b(char *, char *) {
    return 0;
}

sec_acl_id_handler lookup(kx_uint32_t type, const char *mech) {
    sec_acl_id_handler h = handler_b;
    EXPECT_EQ(sec__get_id_handler(type, mech, &h), SEC_S_OK);
    return h;
}

TEST(Registry, LookupIgnoresCaseButNotType) {
    EXPECT_EQ(lookup(SEC_ID_HANDLER_USER, "unix"), nullptr);
    EXPECT_EQ(lookup(SEC_ID_HANDLER_EXPANDED, "unix"), nullptr);
    EXPECT_EQ(sec__register_id_handler(SEC_ID_HANDLER_USER, "unix", handler_a), SEC_S_OK);
    EXPECT_TRUE(no_record());
    EXPECT_EQ(lookup(SEC_ID_HANDLER_USER, "UNIX"), handler_a);
    EXPECT_EQ(lookup(SEC_ID_HANDLER_USER, "Unix"), handler_a);
    EXPECT_EQ(lookup(SEC_ID_HANDLER_EXPANDED, "unix"), nullptr);
    EXPECT_EQ(lookup(SEC_ID_HANDLER_USER, "unix2"), nullptr);
    EXPECT_EQ(lookup(SEC_ID_HANDLER_USER, "uni"), nullptr);
}

TEST(Registry, FirstRegistrationWins) {
    EXPECT_EQ(sec__register_id_handler(SEC_ID_HANDLER_USER, "unix", handler_a), SEC_S_OK);
    EXPECT_EQ(sec__register_id_handler(SEC_ID_HANDLER_USER, "UNIX", handler_b), SEC_S_OK);
    EXPECT_EQ(sec__register_id_handler(SEC_ID_HANDLER_EXPANDED, "unix", handler_b), SEC_S_OK);
    EXPECT_EQ(acl__state.count, 3);
    EXPECT_EQ(lookup(SEC_ID_HANDLER_USER, "unix"), handler_a);
    EXPECT_EQ(lookup(SEC_ID_HANDLER_EXPANDED, "unix"), handler_b);
}

TEST(Registry, ArgumentsInParameterOrder) {
    // Sixteen bytes is the longest mechanism.
    EXPECT_EQ(sec__register_id_handler(SEC_ID_HANDLER_USER, "abcdefghijklmnop", handler_a),
              SEC_S_OK);
    EXPECT_EQ(lookup(SEC_ID_HANDLER_USER, "ABCDEFGHIJKLMNOP"), handler_a);
    const std::string routine = "acl__register_id_handler";
    struct {
        kx_uint32_t type;
        const char *mech;
        sec_acl_id_handler handler;
        msg m;
        std::vector<arg> args;
    } refused[] = {
        {0, nullptr, nullptr, MSG_2650_101, {routine, 1, 0}},
        {3, "", handler_a, MSG_2650_101, {routine, 1, 3}},
        {SEC_ID_HANDLER_EXPANDED, nullptr, nullptr, MSG_2650_101, {routine, 2, 0}},
        {SEC_ID_HANDLER_EXPANDED, "", nullptr, MSG_2650_101, {routine, 3, 0}},
        {SEC_ID_HANDLER_USER, "abcdefghijklmnopq", handler_b, MSG_2650_132, {}},
        {SEC_ID_HANDLER_USER, "", handler_b, MSG_2650_132, {}},
    };
    for (const auto &r : refused) {
        EXPECT_EQ(sec__register_id_handler(r.type, r.mech, r.handler), SEC_S_BAD_PARAM);
        EXPECT_TRUE(record_is(SEC_S_BAD_PARAM, r.m, r.args));
    }
    EXPECT_EQ(acl__state.count, 1);
}

TEST(Registry, AllocationFailureLeavesTheRegistryAsItWas) {
    long long row = sizeof(acl__id_handler_s);
    mem_fail_after(0);
    EXPECT_EQ(sec__register_id_handler(SEC_ID_HANDLER_USER, "unix", handler_a), SEC_S_NO_MEMORY);
    mem_fail_after(-1);
    EXPECT_TRUE(record_is(SEC_S_NO_MEMORY, MSG_2650_102, {"acl__register_id_handler", row}));
    EXPECT_EQ(acl__state.count, 0);
    EXPECT_EQ(acl__state.id_handlers, nullptr);

    EXPECT_EQ(sec__register_id_handler(SEC_ID_HANDLER_USER, "unix", handler_a), SEC_S_OK);
    mem_fail_after(0);
    EXPECT_EQ(sec__register_id_handler(SEC_ID_HANDLER_EXPANDED, "krb5", handler_b),
              SEC_S_NO_MEMORY);
    mem_fail_after(-1);
    EXPECT_TRUE(record_is(SEC_S_NO_MEMORY, MSG_2650_102, {"acl__register_id_handler", 2 * row}));
    EXPECT_EQ(acl__state.count, 1);
    EXPECT_EQ(lookup(SEC_ID_HANDLER_USER, "unix"), handler_a);
    EXPECT_EQ(lookup(SEC_ID_HANDLER_EXPANDED, "krb5"), nullptr);
}

// ---- evaluation through handlers -------------------------------------------

std::atomic<int> calls{0};

// Accepts "u:<name>" for the entry <name>, ordering like the plain comparison.
kx_int32_t prefixed_user(char *id, char *acle_id) {
    ++calls;
    if (std::strncmp(id, "u:", 2) != 0)
        return -1;
    return cu_strcasecmp_posix_1(id + 2, acle_id);
}

// Matches only "bob", and says every other entry sorts after the requester.
kx_int32_t says_before_unless_bob(char *id, char *acle_id) {
    ++calls;
    return std::strcmp(id, acle_id) == 0 && std::strcmp(acle_id, "bob") == 0 ? 0 : -1;
}

// Matches "*" and the identity itself; on a mismatch it leaves a record.
kx_int32_t wildcard_with_record(char *id, char *acle_id) {
    ++calls;
    if (std::strcmp(acle_id, "*") == 0 || std::strcmp(id, acle_id) == 0)
        return 0;
    cu_set_error_1(99, nullptr, "other.cat", 1, 7, "mismatch");
    return std::strcmp(id, acle_id) < 0 ? -1 : 1;
}

bytes handler_acl() {
    return make_acl(
        {make_subacl(SEC_ACLE_USER, 2, text_field("unix"), {rec(0x1, "alice"), rec(0x2, "bob")}),
         make_subacl(SEC_ACLE_EXPANDED, 4, text_field("krb5"),
                     {rec(0x10, "zed"), rec(0x20, "pat"), rec(0x40, "*"), rec(0x80, "pat")}),
         make_subacl(SEC_ACLE_USER, 1, text_field("vgn2"), {rec(0x4, "carol")})});
}

TEST(Handlers, UserHandlerOnlyWithTheHandlerBit) {
    owned_acl acl(handler_acl());
    ASSERT_EQ(sec__register_id_handler(SEC_ID_HANDLER_USER, "unix", prefixed_user), SEC_S_OK);
    EXPECT_EQ(single(acl.get(), 4, "unix", nullptr, "u:bob").status, SEC_S_BAD_ACLE);
    EXPECT_EQ(single(acl.get(), 4, "unix", nullptr, "Bob").perm, 0x2u);
    EXPECT_EQ(calls, 0);
    expect_ok(single(acl.get(), 0x84, "unix", nullptr, "u:bob"), 0x2);
    EXPECT_EQ(calls, 2);
    expect_no_entry(single(acl.get(), 0x84, "unix", nullptr, "bob"), 0x84, "unix", "bob");
}

TEST(Handlers, HandlerBitWithoutUserHandlerComparesTexts) {
    owned_acl acl(handler_acl());
    ASSERT_EQ(sec__register_id_handler(SEC_ID_HANDLER_EXPANDED, "unix", prefixed_user), SEC_S_OK);
    ASSERT_EQ(sec__register_id_handler(SEC_ID_HANDLER_USER, "vgn2", prefixed_user), SEC_S_OK);
    expect_ok(single(acl.get(), 0x84, "unix", nullptr, "BOB"), 0x2);
    EXPECT_EQ(calls, 0);
}

TEST(Handlers, NegativeResultStopsTheUserWalk) {
    owned_acl acl(handler_acl());
    ASSERT_EQ(sec__register_id_handler(SEC_ID_HANDLER_USER, "unix", says_before_unless_bob),
              SEC_S_OK);
    expect_no_entry(single(acl.get(), 0x84, "unix", nullptr, "bob"), 0x84, "unix", "bob");
    EXPECT_EQ(calls, 1);
}

TEST(Handlers, ZmechSubaclWithTheHandlerOfMech) {
    owned_acl acl(handler_acl());
    ASSERT_EQ(sec__register_id_handler(SEC_ID_HANDLER_USER, "unix", prefixed_user), SEC_S_OK);
    ASSERT_EQ(sec__register_id_handler(SEC_ID_HANDLER_USER, "vgn2", says_before_unless_bob),
              SEC_S_OK);
    expect_ok(single(acl.get(), 0x84, "unix", "vgn2", "u:carol"), 0x4);
    EXPECT_EQ(calls, 1);
}

TEST(Handlers, ExpandedEntriesNeedTheirHandler) {
    owned_acl acl(handler_acl());
    // An identical identity does not match without a handler of type 1.
    ASSERT_EQ(sec__register_id_handler(SEC_ID_HANDLER_USER, "krb5", wildcard_with_record),
              SEC_S_OK);
    expect_no_entry(single(acl.get(), 8, "krb5", nullptr, "pat"), 8, "krb5", "pat");
    EXPECT_EQ(calls, 0);

    ASSERT_EQ(sec__register_id_handler(SEC_ID_HANDLER_EXPANDED, "KRB5", wildcard_with_record),
              SEC_S_OK);
    // "zed" sorts after "pat", yet the walk goes on; the first of the two
    // matching entries decides, and the rejections leave no record.
    expect_ok(single(acl.get(), 8, "krb5", nullptr, "pat"), 0x20);
    expect_ok(single(acl.get(), 8, "krb5", nullptr, "amy"), 0x40);
}

TEST(Handlers, RecordOfARejectingUserHandlerIsCleared) {
    owned_acl acl(handler_acl());
    ASSERT_EQ(sec__register_id_handler(SEC_ID_HANDLER_USER, "unix", wildcard_with_record),
              SEC_S_OK);
    expect_ok(single(acl.get(), 0x84, "unix", nullptr, "bob"), 0x2);
    expect_no_entry(single(acl.get(), 0x84, "unix", nullptr, "zoe"), 0x84, "unix", "zoe");
}

// Calls back into the library: registration takes the registry's mutex.
kx_int32_t reentrant(char *id, char *acle_id) {
    kx_uint32_t mask = 0;
    if (sec_translate_perms("rw", nullptr, &mask) != SEC_S_OK || mask != 0x3)
        return -1;
    if (sec__register_id_handler(SEC_ID_HANDLER_USER, acle_id, handler_a) != SEC_S_OK)
        return -1;
    return cu_strcasecmp_posix_1(id, acle_id);
}

TEST(Handlers, HandlerMayCallIntoTheLibrary) {
    owned_acl acl(handler_acl());
    ASSERT_EQ(sec__register_id_handler(SEC_ID_HANDLER_USER, "unix", reentrant), SEC_S_OK);
    expect_ok(single(acl.get(), 0x84, "unix", nullptr, "bob"), 0x2);
    EXPECT_EQ(lookup(SEC_ID_HANDLER_USER, "alice"), handler_a);
    EXPECT_EQ(lookup(SEC_ID_HANDLER_USER, "bob"), handler_a);
}

// ---- buffers whose counts run past their end -------------------------------

bytes every_kind_acl() {
    return make_acl(
        {make_subacl(SEC_ACLE_UNAUTHENTICATED, 1, {}, {rec(0x1)}),
         make_subacl(SEC_ACLE_USER, 2, text_field("unix"), {rec(0x2, "alice"), rec(0x4, "bob")}),
         make_subacl(SEC_ACLE_EXPANDED, 2, text_field("krb5"), {rec(0x8, "pat"), rec(0x10, "*")}),
         make_subacl(SEC_ACLE_GROUP, 2, {}, {rec(0x20, "admin"), rec(0x40, "staff")}),
         make_subacl(SEC_ACLE_ANYOTHER, 1, {}, {rec(0x80)})});
}

// The requests of the truncation test, and what each gave: its result and
// the message of its record (0 for none).
struct answer {
    result r;
    int msg_num;
};

std::vector<answer> evaluate_all(sec_acl_buffer_t acl) {
    std::vector<std::function<result()>> requests = {
        [&] { return single(acl, 1, nullptr, nullptr, nullptr); },
        [&] { return single(acl, 2, nullptr, nullptr, nullptr); },
        [&] { return single(acl, 4, "unix", nullptr, "alice"); },
        [&] { return single(acl, 4, "unix", nullptr, "bob"); },
        [&] { return single(acl, 4, "unix", nullptr, "zed"); },
        [&] { return single(acl, 0x84, "unix", nullptr, "bob"); },
        [&] { return single(acl, 8, "krb5", nullptr, "pat"); },
        [&] { return single(acl, 8, "krb5", nullptr, "amy"); },
        [&] { return single(acl, 4, "vgn2", nullptr, "bob"); },
        [&] {
            return groups_of(acl, {"staff", "admin", "x"});
        },
        [&] { return groups_of(acl, {"nobody"}); },
    };
    std::vector<answer> answers;
    for (auto &request : requests) {
        result r = request();
        answers.push_back({r, kxtest::last_error().msg_num});
    }
    return answers;
}

TEST(CorruptBuffers, TruncatedAtEveryLength) {
    ASSERT_EQ(sec__register_id_handler(SEC_ID_HANDLER_EXPANDED, "krb5", wildcard_with_record),
              SEC_S_OK);
    bytes full = every_kind_acl();
    owned_acl whole(full);
    std::vector<answer> expected = evaluate_all(whole.get());
    std::vector<kx_int32_t> statuses;
    for (const answer &a : expected)
        statuses.push_back(a.r.status);
    ASSERT_EQ(statuses, (std::vector<kx_int32_t>{0, 0, 0, 0, 43, 0, 0, 0, 43, 0, 43}));

    // A cut buffer gives the whole buffer's answer where the sub-ACL asked
    // for is whole, and is refused otherwise; it is never read past its end.
    for (std::size_t length = 0; length < full.size(); ++length) {
        owned_acl cut(prefix(full, length));
        std::vector<answer> got = evaluate_all(cut.get());
        for (std::size_t i = 0; i < got.size(); ++i) {
            SCOPED_TRACE("length " + std::to_string(length) + ", request " + std::to_string(i));
            const answer &a = got[i];
            if (a.r.status != SEC_S_BAD_ACL) {
                EXPECT_EQ(a.r.status, expected[i].r.status);
                EXPECT_EQ(a.r.perm, expected[i].r.perm);
                EXPECT_EQ(a.msg_num, expected[i].msg_num);
            } else if (length < 5) {
                EXPECT_EQ(a.msg_num, MSG_2650_109);
                EXPECT_EQ(a.r.perm, untouched);
            } else {
                EXPECT_EQ(a.msg_num, MSG_2650_110);
                EXPECT_EQ(a.r.perm, 0u);
            }
        }
    }
}

TEST(CorruptBuffers, CountsAndLengthsPastTheEnd) {
    bytes b =
        make_acl({make_subacl(SEC_ACLE_GROUP, 2, {}, {rec(0x4, "admin"), rec(0x2, "staff")})});
    // The entry count says 3 where there are 2.
    bytes more = b;
    more[5 + 5] = 3;
    owned_acl counted(more);
    expect_ok(groups_of(counted.get(), {"staff"}), 0x2);
    expect_corrupt(groups_of(counted.get(), {"zoe"}));
    // The last identifier's length runs one byte past the end.
    bytes longer = b;
    longer[longer.size() - 8] = 7;
    owned_acl overlong(longer);
    expect_ok(groups_of(overlong.get(), {"admin"}), 0x4);
    expect_corrupt(groups_of(overlong.get(), {"staff"}));
    // The last identifier does not end in its NUL.
    bytes unterminated = b;
    unterminated.back() = 'x';
    expect_corrupt(groups_of(owned_acl(unterminated).get(), {"staffx"}));
    // The header counts a sub-ACL that is not there.
    bytes extra = b;
    extra[3] = 2;
    expect_corrupt(single(owned_acl(extra).get(), 2, nullptr, nullptr, nullptr));
    // An anyother entry cut off.
    bytes whole = make_acl({make_subacl(SEC_ACLE_ANYOTHER, 1, {}, {rec(0x1)})});
    expect_corrupt(
        single(owned_acl(prefix(whole, whole.size() - 1)).get(), 2, nullptr, nullptr, nullptr));
}

// ---- trace points ----------------------------------------------------------

TEST(EvaluationTrace, ApiLevelEight) {
    std::string file = kxtest::start_tracing("_SEL:API=8");
    owned_acl acl(example_acl());
    ASSERT_EQ(sec__register_id_handler(SEC_ID_HANDLER_USER, "unix", handler_a), SEC_S_OK);
    kx_uint32_t perm = 0;
    char unix_mech[] = "unix", bob[] = "bob";
    ASSERT_EQ(sec__single_acle_perm(acl.get(), 4, unix_mech, nullptr, bob, &perm), SEC_S_OK);
    ASSERT_EQ(sec__single_acle_perm(acl.get(), 8, unix_mech, nullptr, bob, &perm), SEC_S_BAD_ACLE);
    group_list staff({"staff"});
    ASSERT_EQ(sec__group_acles_perm(acl.get(), 1, staff.get(), &perm), SEC_S_OK);

    auto r = kxtest::read_trace(file);
    ASSERT_EQ(kxtest::trace_ids(file), (std::vector<unsigned>{76, 78, 81, 84, 81, 83, 87, 90}));
    kx_uint32_t user = 2, four = 4, eight = 8, mask_bob = 1, mask_staff = 2;
    kx_int32_t ok = 0, no_entry = SEC_S_BAD_ACLE, one = 1;
    sec_acl_id_handler h = handler_a;
    sec_acl_buffer_t d = acl.get();
    kx_uint32_t *result_ptr = &perm;
    sec_buffer_t g = staff.get();
    EXPECT_EQ(r[0].items, (items{hex_of(user), hex_text("unix"), hex_of(h)}));
    EXPECT_EQ(r[1].items, (items{hex_of(ok)}));
    EXPECT_EQ(r[2].items, (items{hex_of(d), hex_of(d->length), hex_of(d->value), hex_of(four),
                                 hex_text("unix"), hex_text("bob"), hex_of(result_ptr)}));
    EXPECT_EQ(r[3].items, (items{hex_of(ok), hex_of(mask_bob)}));
    EXPECT_EQ(r[4].items[3], hex_of(eight));
    EXPECT_EQ(r[5].items, (items{hex_of(no_entry)}));
    EXPECT_EQ(r[6].items, (items{hex_of(d), hex_of(d->length), hex_of(d->value), hex_of(one),
                                 hex_of(g), hex_of(result_ptr)}));
    EXPECT_EQ(r[7].items, (items{hex_of(ok), hex_of(mask_staff)}));
}

TEST(EvaluationTrace, PerfLevelTwoTimesBothEvaluations) {
    std::string file = kxtest::start_tracing("_SEL:Perf=2");
    owned_acl acl(example_acl());
    single(acl.get(), 0x84, "unix", nullptr, "bob");
    single(acl.get(), 4, "unix", nullptr, nullptr);
    groups_of(acl.get(), {"staff"});

    auto r = kxtest::read_trace(file);
    ASSERT_EQ(kxtest::trace_ids(file), (std::vector<unsigned>{0, 7, 7, 8}));
    std::uint32_t entries = 2, none = 0, type = 0x84, user = 4;
    ASSERT_EQ(r[1].items.size(), 7u);
    EXPECT_EQ(items(r[1].items.begin(), r[1].items.begin() + 4),
              (items{hex_of(entries), hex_of(type), hex_text("unix"), hex_text("bob")}));
    // An argument failure is timed too; it searched no sub-ACL.
    EXPECT_EQ(items(r[2].items.begin(), r[2].items.begin() + 4),
              (items{hex_of(none), hex_of(user), hex_text("unix"), hex_text("")}));
    EXPECT_EQ(r[3].items.size(), 3u);
}

TEST(EvaluationTrace, OtherPerfLevelsTimeNothing) {
    std::string file = kxtest::start_tracing("_SEL:Perf=1");
    owned_acl acl(example_acl());
    single(acl.get(), 4, "unix", nullptr, "bob");
    groups_of(acl.get(), {"staff"});
    EXPECT_EQ(kxtest::trace_ids(file), (std::vector<unsigned>{0}));
}

} // namespace
