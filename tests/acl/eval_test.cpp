// Evaluation and the identity handler registry; argument refusals and API
// points are in api_table_test.
#include <optional>
#include <tuple>
#include <utility>

#include <kx_tr.h>

#include "eval.h"
#include "eval_fixtures.h"

using namespace kxacl;
using namespace evaltest;

namespace {

// A group request (type 16) asks for groups, any other for one entry.
struct request {
    bytes acl;
    unsigned char type;
    const char *mech, *zmech, *id;
    std::vector<const char *> groups;
    kx_int32_t status;
    kx_uint32_t perm;
    const char *shown = nullptr;          // the identity in 2650-147
    int msg = MSG_2650_110;               // of a damaged sub-ACL
    std::optional<kx_int32_t> count = {}; // of groups, when not the list's
};
constexpr int ok = SEC_S_OK, no = SEC_S_BAD_ACLE, bad = SEC_S_BAD_ACL;
result ask(sec_acl_buffer_t acl, const request &q) {
    if (q.type != SEC_ACLE_GROUP)
        return single(acl, q.type, q.mech, q.zmech, q.id);
    group_list groups = groups_named(q.groups);
    return groups_of(acl, groups, q.count.value_or(static_cast<kx_int32_t>(groups.size())));
}

void expect_answer(const request &q, result r) {
    EXPECT_EQ(r.status, q.status);
    EXPECT_EQ(r.perm, q.perm);
    auto e = kxtest::last_error();
    if (q.status == SEC_S_OK) {
        EXPECT_EQ(e.id, 0) << e.text;
    } else if (q.status == SEC_S_BAD_ACLE) {
        EXPECT_TRUE(kxtest::record_is(
            q.status, MSG_2650_147,
            {q.type, q.type == SEC_ACLE_GROUP || !q.mech ? "" : q.mech, q.shown ? q.shown : ""}));
    } else {
        EXPECT_EQ(e.msg_num, q.msg) << e.text;
        EXPECT_TRUE(e.id == q.status && e.args.size() == 2 && e.str(0) == "kxacl_acl" &&
                    e.num(1) > 0)
            << e.text;
    }
}
std::vector<request> requests() {
    const bytes s = sample_acl();
    const bytes two_users =
        make_acl({make_subacl(SEC_ACLE_USER, 1, text_field("unix"), {rec(0x1, "carol")}),
                  make_subacl(SEC_ACLE_USER, 1, text_field("vgn2"), {rec(0x2, "carol")})});
    const bytes n_and_o = make_acl({make_subacl(SEC_ACLE_UNAUTHENTICATED, 1, {}, {rec(0x40)}),
                                    make_subacl(SEC_ACLE_ANYOTHER, 1, {}, {rec(0x9)})});
    const bytes accented =
        make_acl({make_subacl(SEC_ACLE_USER, 1, text_field("unix"), {rec(0x1, "\xc3\xa9mile")})});
    bytes groups = make_acl({make_subacl(16, 2, {}, {rec(0x4, "admin"), rec(0x2, "staff")})});
    bytes counted_on = groups, id_past_end = groups, unterminated = groups,
          header_counts_more = groups;
    counted_on[10] = 3;                      // 3 entries where there are 2
    id_past_end[id_past_end.size() - 8] = 7; // the last identity runs one byte past
    unterminated.back() = 'x';               // the last identity has no NUL
    header_counts_more[3] = 2;               // a sub-ACL that is not there
    const char nul_inside[] = "bob\0xyz";    // bytes after the NUL do not count
    const bytes ids = make_acl({make_subacl(
        SEC_ACLE_USER, 5, text_field("unix"),
        {rec(0x1, "administrator"), rec(0x2, "administrators"),
         make_record(0x4, bytes(nul_inside, nul_inside + sizeof nul_inside)),
         rec(0x8, "operator@node1.cluster"), rec(0x10, "zz")})}); // the last ends the buffer
    const bytes unordered = make_acl({make_subacl(SEC_ACLE_USER, 2, text_field("unix"),
                                                  {rec(0x1, "carol"), rec(0x2, "alice")})});
    bytes one_other = make_acl({make_subacl(SEC_ACLE_ANYOTHER, 1, {}, {rec(0x1)})});
    one_other.pop_back();
    bytes too_short = make_acl({make_subacl(2, 0, {}, {})}); // leads on to no other
    store_u32(&too_short[5], 0);
    store_u16(&too_short[3], 0xffff);
    // clang-format off
    std::vector<request> rows = {
        // Every kind of entry; misses before, between and after the entries.
        {s, 4, "UNIX", {}, "ALICE", {}, ok, 0x1}, {s, 4, "unix", {}, "Carol", {}, ok, 0x4},
        {s, 4, "unix", {}, "aaron", {}, no, 0, "aaron"}, {s, 4, "unix", {}, "bobby", {}, no, 0, "bobby"},
        {s, 4, "unix", {}, "zed", {}, no, 0, "zed"}, {s, 4, "vgn2", {}, "bob", {}, no, 0},
        {s, 2, {}, {}, {}, {}, ok, 0x80}, {s, 1, {}, {}, {}, {}, no, 0},
        {s, 16, {}, {}, {}, {"Staff", "wheel", "admin"}, ok, 0x300},
        // Bits 0x20 and 0x40 of the type are ignored, 0x80 is the handler bit.
        {s, 0xe4, "unix", {}, "BOB", {}, ok, 0x2}, {s, 0x62, {}, {}, {}, {}, ok, 0x80},
        {s, 0x81, "unix", {}, "bob", {}, no, 0},
        // Unauthenticated and anyother entries ignore mech and id, which show when given.
        {n_and_o, 1, "", "nonsense", "", {}, ok, 0x40}, {n_and_o, 2, {}, {}, {}, {}, ok, 0x9},
        {make_acl({make_subacl(2, 2, {}, {rec(0x1), rec(0x2)})}), 2, {}, {}, {}, {}, bad, 0, {},
         MSG_2650_122},
        {make_acl({make_subacl(2, 0, {}, {})}), 2, {}, {}, {}, {}, no, 0},
        // Past eight bytes, up to the NUL, at the buffer's end; the walk stops early.
        {ids, 4, "unix", {}, "ADMINISTRATOR", {}, ok, 0x1}, {ids, 4, "unix", {}, "administrators", {}, ok, 0x2},
        {ids, 4, "unix", {}, "administratorz", {}, no, 0, "administratorz"},
        {ids, 4, "unix", {}, "administrato", {}, no, 0, "administrato"}, {ids, 4, "unix", {}, "bob", {}, ok, 0x4},
        {ids, 4, "unix", {}, "Operator@Node1.Cluster", {}, ok, 0x8}, {ids, 4, "unix", {}, "ZZ", {}, ok, 0x10},
        {ids, 4, "unix", {}, "zzz", {}, no, 0, "zzz"}, {ids, 4, "unix", {}, "bobs", {}, no, 0, "bobs"},
        {unordered, 4, "unix", {}, "carol", {}, ok, 0x1}, {unordered, 4, "unix", {}, "alice", {}, no, 0, "alice"},
        // Only A to Z fold: other letters' bytes compare as they are.
        {accented, 4, "unix", {}, "\xc3\x89MILE", {}, no, 0, "\xc3\x89MILE"},
        {accented, 4, "unix", {}, "\xc3\xa9MILE", {}, ok, 0x1},
        // zmech selects the sub-ACL; the messages name mech.
        {two_users, 4, "unix", "VGN2", "carol", {}, ok, 0x2}, {two_users, 4, "unix", "krb5", "carol", {}, no, 0},
        {two_users, 4, "unix", "vgn2", "dave", {}, no, 0, "dave"}, {two_users, 4, "unix", "", "carol", {}, no, 0},
        // Group lists: repeats add nothing, misses and null names do not fail the call.
        {s, 16, {}, {}, {}, {"staff", "STAFF"}, ok, 0x200}, {s, 16, {}, {}, {}, {"nobody", "Admin"}, ok, 0x100},
        {s, 16, {}, {}, {}, {nullptr, "admin", nullptr}, ok, 0x100},
        {s, 16, {}, {}, {}, {"zzz", "aaa", "bob"}, no, 0}, {s, 16, {}, {}, {}, {nullptr}, no, 0},
        {two_users, 16, {}, {}, {}, {"carol"}, no, 0}, // user entries are no groups
        // A count below zero asks for no group; zero grants and fails nothing.
        {s, 16, {}, {}, {}, {"staff"}, no, 0, {}, 0, -2}, {make_acl({}), 16, {}, {}, {}, {}, ok, 0},
        // Counts and lengths past the end: what lies before them is still found.
        {counted_on, 16, {}, {}, {}, {"staff"}, ok, 0x2}, {counted_on, 16, {}, {}, {}, {"zoe"}, bad, 0},
        {id_past_end, 16, {}, {}, {}, {"admin"}, ok, 0x4}, {id_past_end, 16, {}, {}, {}, {"staff"}, bad, 0},
        {unterminated, 16, {}, {}, {}, {"staffx"}, bad, 0}, {too_short, 1, {}, {}, {}, {}, bad, 0},
        {header_counts_more, 2, {}, {}, {}, {}, bad, 0}, {one_other, 2, {}, {}, {}, {}, bad, 0},
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
                                        << " in " << hex_of(q.acl.data(), q.acl.size()));
        owned_acl acl(q.acl);
        expect_answer(q, ask(acl.get(), q));
    }
}

const sec_acl_id_handler handler_a = [](char *, char *) -> kx_int32_t { return 0; };
const sec_acl_id_handler handler_b = [](char *, char *) -> kx_int32_t { return 1; };
sec_acl_id_handler lookup(kx_uint32_t type, const char *mech) {
    sec_acl_id_handler h = handler_b;
    EXPECT_EQ(sec__get_id_handler(type, mech, &h), SEC_S_OK);
    return h;
}

// A failed registration changes nothing; lookup ignores case, not the
// type; the first registration wins; mechanisms have up to sixteen bytes.
TEST(Registry, FirstRegistrationWinsAndFailuresChangeNothing) {
    const long long row = sizeof(acl__id_handler_s);
    for (long long rows : {1, 2}) { // into an empty registry, then one of one row
        mem_fail_after(0);
        EXPECT_EQ(sec__register_id_handler(SEC_ID_HANDLER_EXPANDED, "unix", handler_b),
                  SEC_S_NO_MEMORY);
        mem_fail_after(-1);
        EXPECT_TRUE(kxtest::record_is(SEC_S_NO_MEMORY, MSG_2650_102,
                                      {"acl__register_id_handler", rows * row}));
        EXPECT_EQ(lookup(SEC_ID_HANDLER_EXPANDED, "unix"), nullptr);
        EXPECT_EQ(lookup(SEC_ID_HANDLER_USER, "unix"), rows == 1 ? nullptr : handler_a);
        EXPECT_EQ(sec__register_id_handler(SEC_ID_HANDLER_USER, "unix", handler_a), SEC_S_OK);
        EXPECT_EQ(kxtest::last_error().id, 0);
    }
    for (auto [type, mech] : {std::pair{SEC_ID_HANDLER_USER, "UNIX"},
                              {SEC_ID_HANDLER_EXPANDED, "unix"},
                              {SEC_ID_HANDLER_USER, "abcdefghijklmnop"}})
        EXPECT_EQ(sec__register_id_handler(type, mech, handler_b), SEC_S_OK) << mech;
    EXPECT_EQ(lookup(SEC_ID_HANDLER_USER, "Unix"), handler_a);
    EXPECT_EQ(lookup(SEC_ID_HANDLER_EXPANDED, "UNIX"), handler_b);
    EXPECT_EQ(lookup(SEC_ID_HANDLER_USER, "ABCDEFGHIJKLMNOP"), handler_b);
    for (const char *other : {"unix2", "uni", "krb5"})
        EXPECT_EQ(lookup(SEC_ID_HANDLER_USER, other), nullptr) << other;
}

// Matches only "bob", and says every other entry sorts after the requester.
kx_int32_t says_before_unless_bob(char *id, char *acle_id) {
    ++handler_calls;
    return std::strcmp(id, acle_id) == 0 && std::strcmp(acle_id, "bob") == 0 ? 0 : -1;
}

// Calls back into the library: registration takes the registry's mutex.
kx_int32_t reentrant(char *id, char *acle_id) {
    ++handler_calls;
    kx_uint32_t mask = 0;
    if (sec_translate_perms("rw", nullptr, &mask) != SEC_S_OK || mask != 0x3 ||
        sec__register_id_handler(SEC_ID_HANDLER_USER, acle_id, handler_a) != SEC_S_OK)
        return -1;
    return cu_strcasecmp_posix_1(id, acle_id);
}

// Mechanisms get the case's number: registrations last the process.
struct handler_case {
    std::vector<std::tuple<kx_uint32_t, const char *, sec_acl_id_handler>> registered;
    struct step {
        unsigned char type;
        const char *mech, *zmech, *id;
        kx_int32_t status;
        kx_uint32_t perm;
        int calls;
    };
    std::vector<step> asked;
};
std::string numbered(const char *mech, const std::string &n) {
    return mech ? std::string(mech) += n : std::string();
}
bytes handler_acl(const std::string &n) {
    return make_acl(
        {make_subacl(SEC_ACLE_USER, 2, text_field(numbered("unix", n).c_str()),
                     {rec(0x1, "alice"), rec(0x2, "bob")}),
         make_subacl(SEC_ACLE_EXPANDED, 4, text_field(numbered("krb5", n).c_str()),
                     {rec(0x10, "zed"), rec(0x20, "pat"), rec(0x40, "*"), rec(0x80, "pat")}),
         make_subacl(SEC_ACLE_USER, 1, text_field(numbered("vgn2", n).c_str()),
                     {rec(0x4, "carol")})});
}

TEST(Evaluation, ThroughHandlers) {
    const kx_uint32_t user = SEC_ID_HANDLER_USER, expanded = SEC_ID_HANDLER_EXPANDED;
    // clang-format off
    const handler_case cases[] = {
        // A user handler serves only requests with the handler bit.
        {{{user, "unix", prefixed_user}},
         {{4, "unix", {}, "u:bob", no, 0, 0}, {4, "unix", {}, "Bob", ok, 0x2, 0},
          {0x84, "unix", {}, "u:bob", ok, 0x2, 2}, {0x84, "unix", {}, "bob", no, 0, 1}}},
        // The handler bit without a user handler of the mech compares texts.
        {{{expanded, "unix", prefixed_user}, {user, "vgn2", prefixed_user}},
         {{0x84, "unix", {}, "BOB", ok, 0x2, 0}}},
        // A negative answer stops the walk of user entries.
        {{{user, "unix", says_before_unless_bob}}, {{0x84, "unix", {}, "bob", no, 0, 1}}},
        // zmech's sub-ACL is walked with the handler of mech.
        {{{user, "unix", prefixed_user}, {user, "vgn2", says_before_unless_bob}},
         {{0x84, "unix", "vgn2", "u:carol", ok, 0x4, 1}}},
        // Expanded entries match only through a handler of their type.
        {{{user, "krb5", wildcard_with_record}}, {{8, "krb5", {}, "pat", no, 0, 0}}},
        // "zed" sorts after "pat", yet the walk goes on; rejections' records are cleared.
        {{{expanded, "KRB5", wildcard_with_record}},
         {{8, "krb5", {}, "pat", ok, 0x20, 2}, {8, "krb5", {}, "amy", ok, 0x40, 3}}},
        {{{user, "unix", wildcard_with_record}},
         {{0x84, "unix", {}, "bob", ok, 0x2, 2}, {0x84, "unix", {}, "zoe", no, 0, 2}}},
        {{{user, "unix", reentrant}}, {{0x84, "unix", {}, "bob", ok, 0x2, 2}}},
    };
    // clang-format on
    for (std::size_t i = 0; i < std::size(cases); ++i) {
        const std::string n = std::to_string(i);
        for (auto [type, mech, handler] : cases[i].registered)
            ASSERT_EQ(sec__register_id_handler(type, numbered(mech, n).c_str(), handler), SEC_S_OK);
        owned_acl acl(handler_acl(n));
        for (const handler_case::step &a : cases[i].asked) {
            const std::string mech = numbered(a.mech, n), zmech = numbered(a.zmech, n);
            SCOPED_TRACE(mech + " " + a.id);
            handler_calls = 0;
            const request q{{}, a.type, mech.c_str(), {}, a.id, {}, a.status, a.perm, a.id};
            expect_answer(
                q, single(acl.get(), a.type, q.mech, a.zmech ? zmech.c_str() : nullptr, a.id));
            EXPECT_EQ(handler_calls, a.calls);
        }
    }
    EXPECT_EQ(lookup(SEC_ID_HANDLER_USER, "alice"), handler_a);
    EXPECT_EQ(lookup(SEC_ID_HANDLER_USER, "bob"), handler_a);
}

// Perf 1 times no evaluation; Perf 2 both kinds, an argument failure too.
TEST(EvaluationTrace, PerfPoints) {
    std::string file = start_tracing("_SEL:Perf=1");
    owned_acl acl(sample_acl());
    const request staff{{}, 16, {}, {}, {}, {"staff"}, ok, 0x200};
    for (int level : {1, 2}) {
        ASSERT_TRUE(level == 1 || tr_set_detail_level_1("_SEL", "Perf", 2) == TR_OK);
        single(acl.get(), 0x84, "unix", nullptr, "bob");
        single(acl.get(), 4, "unix", nullptr, nullptr);
        ask(acl.get(), staff);
    }
    auto r = read_trace(file);
    ASSERT_EQ(trace_ids(file), (std::vector<unsigned>{0, 7, 7, 8}));
    ASSERT_EQ(r[1].items.size(), 7u);
    EXPECT_EQ(r[3].items.size(), 3u);
    // The argument failure searched no sub-ACL.
    for (auto [i, entries, type, id] :
         {std::tuple{std::size_t{1}, 4u, 0x84u, "bob"}, {2, 0u, 4u, ""}})
        EXPECT_EQ(std::vector<std::string>(r[i].items.begin(), r[i].items.begin() + 4),
                  (std::vector<std::string>{hex_of(entries), hex_of(type), hex_text("unix"),
                                            hex_text(id)}));
}
} // namespace
