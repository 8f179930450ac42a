// Permission evaluation and the identity handler registry: one table of
// requests with their answers and records, the walk against the text
// comparison, the handler rules, buffers cut or counted past their end, and
// the Perf points. Argument refusals and the API points are in the tables
// of api_table_test.
#include <algorithm>
#include <atomic>
#include <cstring>
#include <functional>
#include <random>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include <kx_acl.h>

#include "alloc.h"
#include "eval.h"
#include "eval_fixtures.h"
#include "messages.h"
#include "support.h"

using namespace kxacl;
using namespace evaltest;
using kxtest::arg;
using kxtest::record_is;

namespace {

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

// Whether the record holds m with status and a source position as arguments.
testing::AssertionResult record_at_source(kx_int32_t status, int m) {
    auto e = kxtest::last_error();
    if (e.id == status && e.msg_num == m && e.args.size() == 2 && e.str(0) == "kxacl_acl" &&
        e.num(1) > 0)
        return testing::AssertionSuccess();
    return testing::AssertionFailure()
           << "record " << e.id << ", message " << e.msg_num << ": " << e.text;
}

// Granted perm, leaving no record.
void expect_ok(result r, kx_uint32_t perm) {
    EXPECT_EQ(r.status, SEC_S_OK);
    EXPECT_EQ(r.perm, perm);
    EXPECT_EQ(kxtest::last_error().id, 0);
}

// No entry for the request: mask 0 and 2650-147 with these arguments.
void expect_no_entry(result r, long long type, std::string mech, std::string id) {
    EXPECT_EQ(r.status, SEC_S_BAD_ACLE);
    EXPECT_EQ(r.perm, 0u);
    EXPECT_TRUE(record_is(SEC_S_BAD_ACLE, MSG_2650_147, {type, std::move(mech), std::move(id)}));
}

// ---- requests and their answers --------------------------------------------

bytes walk_acl() {
    return make_acl(
        {make_subacl(SEC_ACLE_USER, 4, text_field("unix"),
                     {rec(0x1, "alice"), rec(0x2, "bob"), rec(0x4, "carol"), rec(0x8, "dave")})});
}

// One request: a group request (type 16) asks for groups, any other one
// entry. A refusal's mask is 0. No entry is 2650-147 with the type, the
// mechanism and the identity shown; a damaged sub-ACL is 2650-110 (2650-122
// for an anyother sub-ACL of several entries) with a source position.
struct request {
    bytes acl;
    unsigned char type;
    const char *mech, *zmech, *id;
    std::vector<const char *> groups;
    kx_int32_t status;
    kx_uint32_t perm;
    const char *shown = nullptr; // the identity in 2650-147
    int msg = MSG_2650_110;      // of a damaged sub-ACL
};

std::vector<request> requests() {
    const bytes ex = example_acl(), walk = walk_acl();
    const bytes two_users =
        make_acl({make_subacl(SEC_ACLE_USER, 1, text_field("unix"), {rec(0x1, "carol")}),
                  make_subacl(SEC_ACLE_USER, 1, text_field("vgn2"), {rec(0x2, "carol")})});
    const bytes n_and_o = make_acl({make_subacl(SEC_ACLE_UNAUTHENTICATED, 1, {}, {rec(0x40)}),
                                    make_subacl(SEC_ACLE_ANYOTHER, 1, {}, {rec(0x9)})});
    const bytes accented =
        make_acl({make_subacl(SEC_ACLE_USER, 1, text_field("unix"), {rec(0x1, "\xc3\xa9mile")})});
    const bytes users_named_staff =
        make_acl({make_subacl(SEC_ACLE_USER, 1, text_field("unix"), {rec(0x1, "staff")})});
    bytes groups = make_acl({make_subacl(16, 2, {}, {rec(0x4, "admin"), rec(0x2, "staff")})});
    bytes counted_on = groups, id_past_end = groups, unterminated = groups,
          header_counts_more = groups;
    counted_on[10] = 3;                      // 3 entries where there are 2
    id_past_end[id_past_end.size() - 8] = 7; // the last identity runs one byte past
    unterminated.back() = 'x';               // the last identity has no NUL
    header_counts_more[3] = 2;               // a sub-ACL that is not there
    const bytes one_other = make_acl({make_subacl(SEC_ACLE_ANYOTHER, 1, {}, {rec(0x1)})});
    bytes too_short = make_acl({make_subacl(2, 0, {}, {})}); // leads on to no other
    store_u32(&too_short[5], 0);
    store_u16(&too_short[3], 0xffff);
    const int ok = SEC_S_OK, no = SEC_S_BAD_ACLE, bad = SEC_S_BAD_ACL;

    // clang-format off
    std::vector<request> rows = {
        // The example: user, anyother and group entries.
        {ex, 4, "unix", {}, "Alice", {}, ok, 0x3}, {ex, 4, "unix", {}, "aaron", {}, no, 0, "aaron"},
        {ex, 2, {}, {}, {}, {}, ok, 0x1},
        {ex, 16, {}, {}, {}, {"Staff", "wheel", "admin"}, ok, 0x6},
        {ex, 4, "vgn2", {}, "alice", {}, no, 0}, // no sub-ACL of the mech: no identity shown
        // Bits 0x20 and 0x40 of the type are ignored, 0x80 is the handler bit.
        {ex, 0x24, "unix", {}, "BOB", {}, ok, 0x1}, {ex, 0x44, "unix", {}, "BOB", {}, ok, 0x1},
        {ex, 0x84, "unix", {}, "BOB", {}, ok, 0x1}, {ex, 0xe4, "unix", {}, "BOB", {}, ok, 0x1},
        {ex, 0x62, {}, {}, {}, {}, ok, 0x1},
        // Unauthenticated and anyother entries ignore mech and id, which show when given.
        {n_and_o, 1, "", "nonsense", "", {}, ok, 0x40}, {n_and_o, 2, {}, {}, {}, {}, ok, 0x9},
        {ex, 1, {}, {}, {}, {}, no, 0}, {ex, 0x81, "unix", {}, "bob", {}, no, 0},
        {make_acl({make_subacl(2, 2, {}, {rec(0x1), rec(0x2)})}), 2, {}, {}, {}, {}, bad, 0, {},
         MSG_2650_122},
        {make_acl({make_subacl(2, 0, {}, {})}), 2, {}, {}, {}, {}, no, 0},
        // The user walk folds case; misses lie before, between and after the entries.
        {walk, 4, "UNIX", {}, "ALICE", {}, ok, 0x1}, {walk, 4, "UNIX", {}, "Carol", {}, ok, 0x4},
        {walk, 4, "UNIX", {}, "dave", {}, ok, 0x8},
        {walk, 4, "UNIX", {}, "aaron", {}, no, 0, "aaron"},
        {walk, 4, "UNIX", {}, "bobby", {}, no, 0, "bobby"},
        {walk, 4, "UNIX", {}, "zed", {}, no, 0, "zed"},
        // Only A to Z fold: other letters' bytes compare as they are.
        {accented, 4, "unix", {}, "\xc3\x89MILE", {}, no, 0, "\xc3\x89MILE"},
        {accented, 4, "unix", {}, "\xc3\xa9MILE", {}, ok, 0x1},
        // zmech selects the sub-ACL; the messages name mech.
        {two_users, 4, "unix", "VGN2", "carol", {}, ok, 0x2},
        {two_users, 4, "unix", "krb5", "carol", {}, no, 0},
        {two_users, 4, "unix", "vgn2", "dave", {}, no, 0, "dave"},
        {two_users, 4, "unix", "", "carol", {}, no, 0},
        // Group lists: repeats add nothing, misses and null names do not fail the call.
        {ex, 16, {}, {}, {}, {"staff", "STAFF"}, ok, 0x2},
        {ex, 16, {}, {}, {}, {"nobody", "Admin"}, ok, 0x4},
        {ex, 16, {}, {}, {}, {nullptr, "admin", nullptr}, ok, 0x4},
        {ex, 16, {}, {}, {}, {"zzz", "aaa", "bob"}, no, 0}, {ex, 16, {}, {}, {}, {nullptr}, no, 0},
        {users_named_staff, 16, {}, {}, {}, {"staff"}, no, 0},
        // Counts and lengths past the end: what lies before them is still found.
        {counted_on, 16, {}, {}, {}, {"staff"}, ok, 0x2},
        {counted_on, 16, {}, {}, {}, {"zoe"}, bad, 0},
        {id_past_end, 16, {}, {}, {}, {"admin"}, ok, 0x4},
        {id_past_end, 16, {}, {}, {}, {"staff"}, bad, 0},
        {unterminated, 16, {}, {}, {}, {"staffx"}, bad, 0},
        {header_counts_more, 2, {}, {}, {}, {}, bad, 0},
        {prefix(one_other, one_other.size() - 1), 2, {}, {}, {}, {}, bad, 0},
        {too_short, 1, {}, {}, {}, {}, bad, 0},
    };
    // clang-format on
    // An ACL without sub-ACLs answers nothing.
    for (unsigned char type : {1, 2, 4, 8, 0x84, 16})
        rows.push_back({make_acl({}), type, "unix", {}, "bob", {"staff"}, no, 0});
    return rows;
}

TEST(Evaluation, Requests) {
    for (const request &q : requests()) {
        SCOPED_TRACE(testing::Message() << "type " << int(q.type) << " " << (q.id ? q.id : "-")
                                        << " in " << kxtest::hex_of(q.acl.data(), q.acl.size()));
        owned_acl acl(q.acl);
        bool group = q.type == SEC_ACLE_GROUP;
        result r = group ? groups_of(acl.get(), q.groups)
                         : single(acl.get(), q.type, q.mech, q.zmech, q.id);
        EXPECT_EQ(r.status, q.status);
        EXPECT_EQ(r.perm, q.perm);
        if (q.status == SEC_S_OK)
            EXPECT_EQ(kxtest::last_error().id, 0);
        else if (q.status == SEC_S_BAD_ACL)
            EXPECT_TRUE(record_at_source(q.status, q.msg));
        else
            EXPECT_TRUE(
                record_is(q.status, MSG_2650_147,
                          {q.type, group || !q.mech ? "" : q.mech, q.shown ? q.shown : ""}));
    }
}

// A count below zero asks for no group and finds none; a count of zero is
// mask 0 and no failure, even without sub-ACLs.
TEST(Evaluation, GroupCounts) {
    owned_acl acl(example_acl()), empty(make_acl({}));
    group_list staff({"staff"});
    kx_uint32_t perm = untouched;
    EXPECT_EQ(sec__group_acles_perm(acl.get(), -2, staff.get(), &perm), SEC_S_BAD_ACLE);
    EXPECT_EQ(perm, 0u);
    EXPECT_TRUE(record_is(SEC_S_BAD_ACLE, MSG_2650_147, {16, "", ""}));
    perm = untouched;
    EXPECT_EQ(sec__group_acles_perm(empty.get(), 0, nullptr, &perm), SEC_S_OK);
    EXPECT_EQ(perm, 0u);
    EXPECT_EQ(kxtest::last_error().id, 0);
}

// Walks with eight-byte comparisons give what a walk with
// cu_strcasecmp_posix_1 gives, entry by entry: identities that share long
// prefixes, differ in case or in one byte, stop inside the first eight
// bytes, hold a NUL inside their field, or end the buffer; in any order.
TEST(Evaluation, WalksAsTheTextComparisonDoes) {
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
        bytes sub = make_subacl(SEC_ACLE_USER, static_cast<std::uint32_t>(fields.size()),
                                text_field("unix"), {});
        for (std::size_t i = 0; i < fields.size(); ++i) {
            bytes r = make_record(1u << i, bytes(fields[i].begin(), fields[i].end()));
            sub.insert(sub.end(), r.begin(), r.end());
        }
        store_u32(&sub[0], static_cast<std::uint32_t>(sub.size()));
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

// Lookup ignores case but not the type; the first registration of a type
// and mechanism wins; sixteen bytes is the longest mechanism.
TEST(Registry, FirstRegistrationOfTypeAndMechanismWins) {
    EXPECT_EQ(lookup(SEC_ID_HANDLER_USER, "unix"), nullptr);
    EXPECT_EQ(sec__register_id_handler(SEC_ID_HANDLER_USER, "unix", handler_a), SEC_S_OK);
    EXPECT_EQ(kxtest::last_error().id, 0);
    EXPECT_EQ(sec__register_id_handler(SEC_ID_HANDLER_USER, "UNIX", handler_b), SEC_S_OK);
    EXPECT_EQ(sec__register_id_handler(SEC_ID_HANDLER_EXPANDED, "unix", handler_b), SEC_S_OK);
    EXPECT_EQ(sec__register_id_handler(SEC_ID_HANDLER_USER, "abcdefghijklmnop", handler_b),
              SEC_S_OK);
    EXPECT_EQ(lookup(SEC_ID_HANDLER_USER, "Unix"), handler_a);
    EXPECT_EQ(lookup(SEC_ID_HANDLER_EXPANDED, "UNIX"), handler_b);
    EXPECT_EQ(lookup(SEC_ID_HANDLER_USER, "ABCDEFGHIJKLMNOP"), handler_b);
    for (const char *other : {"unix2", "uni", "krb5"})
        EXPECT_EQ(lookup(SEC_ID_HANDLER_USER, other), nullptr) << other;
}

TEST(Registry, AllocationFailureLeavesTheRegistryAsItWas) {
    long long row = sizeof(acl__id_handler_s);
    mem_fail_after(0);
    EXPECT_EQ(sec__register_id_handler(SEC_ID_HANDLER_USER, "unix", handler_a), SEC_S_NO_MEMORY);
    mem_fail_after(-1);
    EXPECT_TRUE(record_is(SEC_S_NO_MEMORY, MSG_2650_102, {"acl__register_id_handler", row}));
    EXPECT_EQ(lookup(SEC_ID_HANDLER_USER, "unix"), nullptr);

    EXPECT_EQ(sec__register_id_handler(SEC_ID_HANDLER_USER, "unix", handler_a), SEC_S_OK);
    mem_fail_after(0);
    EXPECT_EQ(sec__register_id_handler(SEC_ID_HANDLER_EXPANDED, "krb5", handler_b),
              SEC_S_NO_MEMORY);
    mem_fail_after(-1);
    EXPECT_TRUE(record_is(SEC_S_NO_MEMORY, MSG_2650_102, {"acl__register_id_handler", 2 * row}));
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

// ---- buffers cut short -----------------------------------------------------

// Each request's result and the message of its record (0 for none).
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
    bytes full = make_acl(
        {make_subacl(SEC_ACLE_UNAUTHENTICATED, 1, {}, {rec(0x1)}),
         make_subacl(SEC_ACLE_USER, 2, text_field("unix"), {rec(0x2, "alice"), rec(0x4, "bob")}),
         make_subacl(SEC_ACLE_EXPANDED, 2, text_field("krb5"), {rec(0x8, "pat"), rec(0x10, "*")}),
         make_subacl(SEC_ACLE_GROUP, 2, {}, {rec(0x20, "admin"), rec(0x40, "staff")}),
         make_subacl(SEC_ACLE_ANYOTHER, 1, {}, {rec(0x80)})});
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

// ---- Perf points -----------------------------------------------------------

TEST(EvaluationTrace, PerfLevelTwoTimesBothEvaluations) {
    std::string file = kxtest::start_tracing("_SEL:Perf=2");
    owned_acl acl(example_acl());
    single(acl.get(), 0x84, "unix", nullptr, "bob");
    single(acl.get(), 4, "unix", nullptr, nullptr);
    groups_of(acl.get(), {"staff"});

    auto r = kxtest::read_trace(file);
    ASSERT_EQ(kxtest::trace_ids(file), (std::vector<unsigned>{0, 7, 7, 8}));
    using items = std::vector<std::string>;
    std::uint32_t entries = 2, none = 0, type = 0x84, user = 4;
    ASSERT_EQ(r[1].items.size(), 7u);
    EXPECT_EQ(items(r[1].items.begin(), r[1].items.begin() + 4),
              (items{kxtest::hex_of(entries), kxtest::hex_of(type), kxtest::hex_text("unix"),
                     kxtest::hex_text("bob")}));
    // An argument failure is timed too; it searched no sub-ACL.
    EXPECT_EQ(items(r[2].items.begin(), r[2].items.begin() + 4),
              (items{kxtest::hex_of(none), kxtest::hex_of(user), kxtest::hex_text("unix"),
                     kxtest::hex_text("")}));
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
