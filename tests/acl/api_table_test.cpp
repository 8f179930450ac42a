// Every exported function's refusals of bad arguments, and the API trace points
// its calls record at each level (each TEST in its own process).
#include <climits>
#include <functional>
#include <string>
#include <vector>
#include <gtest/gtest.h>
#include <kx_acl.h>
#include <kx_tr.h>
#include "acl_fixtures.h"
#include "eval.h"
#include "file_helpers.h"
#include "report.h"

using namespace kxacl;
using namespace kxtest;

namespace {
constexpr kx_uint32_t mark = 0xdeadbeef;
template <typename T> T marked() {
    return reinterpret_cast<T>(8);
}

struct outputs {
    sec_acle_t acle = marked<sec_acle_t>();
    char *mech = marked<char *>(), *id = marked<char *>();
    kx_uint32_t perm = mark, rflags = mark;
    sec_acle_list_s list{5, marked<sec_acle_t *>()};
    sec_buffer_s acl{7, marked<void *>()}; // passed only where it is not read
    bool untouched() const {
        return acle == marked<sec_acle_t>() && mech == marked<char *>() && id == marked<char *>() &&
               perm == mark && rflags == mark && list.count == 5 &&
               list.acles == marked<sec_acle_t *>() && acl.length == 7 &&
               acl.value == marked<void *>();
    }
};
long long shown(const void *p) {
    return static_cast<int>(pointer_value(p));
}
using run_fn = std::function<kx_int32_t(outputs &)>;
struct refusal {
    kx_int32_t status;
    int msg;
    std::vector<arg> args;
    run_fn run;
    std::function<void(const outputs &)> left = nullptr; // else: every output untouched
};
refusal param(const char *routine, int pos, long long value, run_fn run) {
    return {SEC_S_BAD_PARAM, MSG_2650_101, {routine, pos, value}, std::move(run)};
}
kx_int32_t single(sec_acl_buffer_t acl, unsigned char type, const char *mech, const char *id,
                  kx_uint32_t *perm) {
    return sec__single_acle_perm(acl, type, const_cast<char *>(mech), nullptr,
                                 const_cast<char *>(id), perm);
}
kx_int32_t edit_of(kx_int32_t (*edit)(sec_acle_t, sec_acl_buffer_t), entry e, const bytes &b) {
    owned_acl acl(b);
    kx_int32_t rc = edit(e.p(), acl.get());
    EXPECT_EQ(acl.contents(), b);
    return rc;
}
constexpr auto add_fn = &sec_add_acle_to_acl, del_fn = &sec_del_acle_from_acl;
kx_int32_t display(entry e, outputs &o) {
    return sec_display_acle_id(e.p(), &o.mech, &o.id);
}
kx_int32_t read_with(const char *name, const char *user, kx_uint32_t flags, sec_buffer_s *acl,
                     outputs &o) {
    return sec_read_acl_file(name, user, nullptr, flags, acl, &o.rflags);
}
kx_int32_t never_called(char *, char *) {
    return 0;
}
std::vector<refusal> refusals() {
    static owned_acl good(worked_example);
    static bytes bad_type = worked_example, bad_version = worked_example;
    bad_type[0] = 0x84;
    bad_version[1] = 2;
    static owned_acl foreign(worked_example_swapped), typeless(bad_type), unversioned(bad_version),
        cut(bytes(worked_example.begin(), worked_example.begin() + 4));
    static sec_buffer_s empty{0, nullptr}, no_value{71, nullptr};
    static char long_mech[] = "0123456789abcdefg", nothing[] = "", no_at[] = "bob",
                unix_mech[] = "unix";
    const char *reg = "acl__register_id_handler", *one = "sec__single_acle_perm",
               *groups = "sec__group_acles_perm", *create = "sec_create_acle",
               *show = "sec_display_acle_id", *from_data = "sec_read_acl_from_data",
               *by_type = "sec_list_acl_by_type", *add = "sec_add_acle_to_acl",
               *del = "sec_del_acle_from_acl", *read = "sec_read_acl_file";
    const kx_int32_t acl = SEC_S_BAD_ACL, acle = SEC_S_BAD_ACLE, perm = SEC_S_BAD_PERMISSION;
    auto nothing_out = [](const outputs &o) { EXPECT_TRUE(!o.mech && !o.id); };
    auto no_entry = [](const outputs &o) { EXPECT_EQ(o.acle, nullptr); };
    static sec_acl_buffer_t g = good.get();
    static unsigned char *we = const_cast<unsigned char *>(worked_example.data());

    // clang-format off
    std::vector<refusal> rows = {
        param("sec_translate_perms", 3, 0, [](auto &) { return sec_translate_perms("r", 0, 0); }),
        // Case counts; the bits before the refused character stay.
        {perm, MSG_2650_146, {'R'}, [](auto &o) { return sec_translate_perms("rwR", 0, &o.perm); },
         [](const auto &o) {
             EXPECT_EQ(o.perm, 0x3u);
             EXPECT_NE(last_error().text.find("permission ('R') does not"), std::string::npos);
         }},
        param("sec_translate_mask", 3, 0, [](auto &) { return sec_translate_bitmask(1, 0, 0); }),
        // The first unknown bit is named, as an integer and in the text.
        {perm, MSG_2650_178, {INT_MIN},
         [](auto &) { char out[33]; return sec_translate_bitmask(0x80000001u, nullptr, out); },
         [](const auto &) {
             EXPECT_NE(last_error().text.find("(0x80000000)"), std::string::npos);
         }},
        param(create, 1, 3, [](auto &o) { return sec_create_acle(3, 0, "unix", "a@b", &o.acle); }),
        param(create, 3, shown(long_mech),
         [](auto &o) { return sec_create_acle(4, 0, long_mech, "a@b", &o.acle); }),
        param(create, 3, 0, [](auto &o) { return sec_create_acle(8, 0, nullptr, "x", &o.acle); }),
        param(create, 4, shown(nothing),
         [](auto &o) { return sec_create_acle(16, 0, nullptr, nothing, &o.acle); }),
        param(create, 5, 0, [](auto &) { return sec_create_acle(16, 0, nullptr, "g", nullptr); }),
        // A unix or vgn2 user's identity needs a host part: no entry is handed out.
        {SEC_S_BAD_PARAM, MSG_2650_101, {create, 4, shown(no_at)},
         [](auto &o) { return sec_create_acle(4, 1, "unix", no_at, &o.acle); }, no_entry},
        param(show, 1, 0, [](auto &o) { return sec_display_acle_id(nullptr, &o.mech, &o.id); }),
        param(show, 2, 0,
         [](auto &o) { entry e{1, 1}; return sec_display_acle_id(e.p(), nullptr, &o.id); }),
        param(show, 3, 0,
         [](auto &o) { entry e{1, 1}; return sec_display_acle_id(e.p(), &o.mech, nullptr); }),
        // Past the argument checks, a failure leaves both outputs null.
        {acle, MSG_2650_107, {7}, [](auto &o) { return display({7, 1}, o); }, nothing_out},
        {acle, MSG_2650_108, {},
         [](auto &o) { return display({4, 1, "", "joe"}, o); }, nothing_out},
        param("sec_create_empty_acl", 1, 0, [](auto &) { return sec_create_empty_acl(nullptr); }),
        param(from_data, 1, 0, [](auto &o) { return sec_read_acl_from_data(0, we, &o.acl); }),
        param(from_data, 2, 0, [](auto &o) { return sec_read_acl_from_data(5, nullptr, &o.acl); }),
        param(from_data, 3, 0, [](auto &) { return sec_read_acl_from_data(5, we, nullptr); }),
        param("sec_convert_acl_to_host", 1, 0,
         [](auto &) { return sec_convert_acl_to_host(1, nullptr); }),
        // Bytes that are no ACL buffer are not freed (owned_acl frees them).
        {acl, MSG_2650_106, {}, [](auto &) {
             owned_acl a(bad_type);
             void *value = a.d.value;
             kx_int32_t rc = sec_release_acl(a.get());
             EXPECT_TRUE(a.d.value == value && a.d.length == 71);
             return rc;
         }},
        param("sec_list_acl", 1, 0, [](auto &o) { return sec_list_acl(nullptr, &o.list); }),
        param("sec_list_acl", 2, 0, [](auto &) { return sec_list_acl(g, nullptr); }),
        {acl, MSG_2650_115, {}, [](auto &o) { return sec_list_acl(foreign.get(), &o.list); }},
        {acl, MSG_2650_109, {}, [](auto &o) { return sec_list_acl(&no_value, &o.list); }},
        param(by_type, 1, 0,
         [](auto &o) { return sec_list_acl_by_type(nullptr, 4, nullptr, &o.list); }),
        param(by_type, 2, 3, [](auto &o) { return sec_list_acl_by_type(g, 3, nullptr, &o.list); }),
        param(by_type, 3, shown(nothing),
         [](auto &o) { return sec_list_acl_by_type(g, 4, nothing, &o.list); }),
        param(by_type, 4, 0, [](auto &) { return sec_list_acl_by_type(g, 16, nullptr, nullptr); }),
        {acl, MSG_2650_115, {},
         [](auto &o) { return sec_list_acl_by_type(foreign.get(), 4, nullptr, &o.list); }},
        param(add, 1, 0, [](auto &) { return sec_add_acle_to_acl(nullptr, g); }),
        param(add, 2, 0, [](auto &) { entry e{2, 1}; return sec_add_acle_to_acl(e.p(), nullptr); }),
        // The entry checks, shared with deletion, come before the header's.
        {acle, MSG_2650_116, {3}, [](auto &) { return edit_of(add_fn, {3, 1}, bad_type); }},
        {acle, MSG_2650_117, {4},
         [](auto &) { return edit_of(add_fn, {4, 1, "", "bob"}, worked_example); }},
        {acle, MSG_2650_117, {SEC_ACLE_EXPANDED}, [](auto &) { // a mech filling its field
             entry e{SEC_ACLE_EXPANDED, 1, "", "x*"};
             std::memset(e.desc.mech, 'm', sizeof e.desc.mech);
             return edit_of(sec_add_acle_to_acl2, e, worked_example);
         }},
        {acle, MSG_2650_117, {16}, [](auto &) { return edit_of(add_fn, {16, 1}, worked_example); }},
        {acl, MSG_2650_113, {}, [](auto &) { return edit_of(add_fn, {2, 1}, bad_type); }},
        {acl, MSG_2650_114, {}, [](auto &) { return edit_of(add_fn, {2, 1}, bad_version); }},
        {acl, MSG_2650_115, {},
         [](auto &) { return edit_of(add_fn, {2, 1}, worked_example_swapped); }},
        {acl, MSG_2650_106, {},
         [](auto &) { entry e{2, 1}; return sec_add_acle_to_acl(e.p(), &no_value); }},
        param(del, 1, 0, [](auto &) { return sec_del_acle_from_acl(nullptr, g); }),
        param(del, 2, 0,
         [](auto &) { entry e{2, 1}; return sec_del_acle_from_acl(e.p(), nullptr); }),
        {acle, MSG_2650_116, {32}, [](auto &) { return edit_of(del_fn, {32, 1}, {}); }},
        {acl, MSG_2650_106, {}, [](auto &) { return edit_of(del_fn, {2, 1}, {}); }},
        // The ACL is left alone and the flags are handed back as they came.
        {SEC_S_BAD_PARAM, MSG_2650_101, {read, 1, 0},
         [](auto &o) { return read_with(nullptr, nullptr, 0x105, &o.acl, o); },
         [](const auto &o) { EXPECT_TRUE(o.rflags == 0x105 && o.acl.length == 7); }},
        {SEC_S_BAD_PARAM, MSG_2650_101, {read, 5, 0},
         [](auto &o) { return read_with("acl", nullptr, 2, nullptr, o); },
         [](const auto &o) { EXPECT_EQ(o.rflags, 2u); }},
        {SEC_S_BAD_PARAM, MSG_2650_134, {},
         [](auto &o) { return read_with("acl", "", 3, &o.acl, o); },
         [](const auto &o) { EXPECT_TRUE(o.rflags == 3 && o.acl.length == 7); }},
        param(reg, 1, 3, [](auto &) { return sec__register_id_handler(3, nullptr, nullptr); }),
        param(reg, 2, 0, [](auto &) { return sec__register_id_handler(1, nullptr, nullptr); }),
        param(reg, 3, 0, [](auto &) { return sec__register_id_handler(1, "", nullptr); }),
        {SEC_S_BAD_PARAM, MSG_2650_132, {},
         [](auto &) { return sec__register_id_handler(2, long_mech, never_called); }},
        param(one, 1, 0, [](auto &o) { return single(nullptr, 4, "unix", "bob", &o.perm); }),
        param(one, 6, 0, [](auto &) { return single(g, 16, nullptr, nullptr, nullptr); }),
        param(groups, 1, 0,
         [](auto &o) { return sec__group_acles_perm(nullptr, 0, nullptr, &o.perm); }),
        param(groups, 3, 0, [](auto &o) { return sec__group_acles_perm(g, 1, nullptr, &o.perm); }),
        param(groups, 4, 0, [](auto &) { return sec__group_acles_perm(g, 0, nullptr, nullptr); }),
    };
    // Header faults come before the other arguments in both evaluations (a
    // refused type, no groups) and refuse conversion too, except a cut
    // buffer and one of the other order, which convert without validation.
    for (auto [a, m, converts] : {std::tuple{&empty, MSG_2650_109, false},
                                    {&no_value, MSG_2650_109, false},
                                    {cut.get(), MSG_2650_109, true},
                                    {typeless.get(), MSG_2650_109, false},
                                    {unversioned.get(), MSG_2650_109, false},
                                    {foreign.get(), MSG_2650_115, true}}) {
        rows.push_back({acl, m, {},
                        [a](outputs &o) { return single(a, 16, nullptr, nullptr, &o.perm); }});
        rows.push_back({acl, m, {},
                        [a](outputs &o) { return sec__group_acles_perm(a, 0, nullptr, &o.perm); }});
        if (!converts)
            rows.push_back({acl, MSG_2650_109, {},
                            [a](outputs &) { return sec_convert_acl_to_host(0, a); }});
    }
    // The type is shown as its whole byte; user and expanded requests need
    // a mechanism, then an identity.
    for (unsigned type : {0u, 3u, 16u, 0x90u, 0x9fu, 0xe0u})
        rows.push_back({SEC_S_BAD_PARAM, MSG_2650_128, {type}, [type](outputs &o) {
                            auto t = static_cast<unsigned char>(type);
                            return single(good.get(), t, "unix", "bob", &o.perm);
                        }});
    for (unsigned char type : {4, 8, 0x84})
        for (char *none : {static_cast<char *>(nullptr), nothing}) {
            rows.push_back({SEC_S_BAD_PARAM, MSG_2650_129, {}, [=](outputs &o) {
                                return sec__single_acle_perm(good.get(), type, none, unix_mech,
                                                             nullptr, &o.perm);
                            }});
            rows.push_back({SEC_S_BAD_PARAM, MSG_2650_130, {},
                            [=](outputs &o) {
                                return single(good.get(), type, "unix", none, &o.perm);
                            }});
        }
    // clang-format on
    return rows;
}

TEST(ApiTable, BadArguments) {
    int row = 0;
    for (const refusal &r : refusals()) {
        SCOPED_TRACE("row " + std::to_string(row++));
        outputs o;
        EXPECT_EQ(r.run(o), r.status);
        EXPECT_TRUE(record_is(r.status, r.msg, r.args));
        if (r.left)
            r.left(o);
        else
            EXPECT_TRUE(o.untouched());
    }
    sec_acl_id_handler h = never_called; // the refused registration registered nothing
    sec__get_id_handler(SEC_ID_HANDLER_USER, "0123456789abcdefg", &h);
    EXPECT_EQ(h, nullptr);
}

std::string described(unsigned id, const std::vector<std::string> &items) {
    std::string s = std::to_string(id) + ":";
    for (const std::string &i : items)
        s += " " + (i.empty() ? std::string("-") : i);
    return s;
}
struct expected {
    std::vector<std::string> records;
    void at(unsigned id, const std::vector<std::string> &items = {}) {
        records.push_back(described(id, items));
    }
};
const auto u8 = [](std::uint8_t v) { return hex_of(v); };
const auto u32 = [](kx_uint32_t v) { return hex_of(v); };
const auto i32 = [](kx_int32_t v) { return hex_of(v); };
const auto ptr = [](const void *p) { return hex_of(p); };
const auto txt = [](const std::string &s) { return hex_text(s); };
struct world {
    owned_acl acl, from_file, empty;
    sec_acle_t acle = nullptr;
    owned_list list, typed;
    entry carol{SEC_ACLE_USER, 7, "unix", "carol"};
    acl_dir dir{"o r\n# c\ng staff rw\n"};
    kx_uint32_t perm = 0, rflags = 0;
    char text[33] = {}, staff[6] = "staff", unix_mech[5] = "unix";
    sec_buffer_s groups[1] = {{6, staff}};
    char *mech = nullptr, *id = nullptr;
    ~world() {
        std::free(mech);
        std::free(id);
    }
};

std::vector<std::string> edit_items(world &w) {
    return {ptr(w.carol.p()),
            u32(4),
            u32(7),
            txt("unix"),
            txt("carol"),
            ptr(w.acl.get()),
            i32(w.acl.d.length),
            ptr(w.acl.d.value)};
}

// One call: the bare ids it records at API level 1 (none: 0), whether it
// clears the error record on entry, whether it is a release (whose exit is
// recorded at every level but 0); run makes it and states its level-8 records.
enum call_kind { keeps = 0, clears = 1, release = 2 };
struct traced_call {
    const char *call;
    unsigned enter, exit;
    int kind;
    std::function<kx_int32_t(world &, expected &)> run;
};

constexpr kx_int32_t ok = SEC_S_OK;

std::vector<traced_call> traced_calls() {
    // clang-format off
    return {
        {"sec_translate_perms failing", 91, 94, keeps, [](world &w, expected &x) {
             x.at(93, {txt("rz"), ptr(nullptr), ptr(&w.perm)});
             x.at(95, {i32(SEC_S_BAD_PERMISSION)});
             return sec_translate_perms("rz", nullptr, &w.perm); }},
        {"sec_translate_bitmask", 97, 100, keeps, [](world &w, expected &x) {
             x.at(99, {u32(3), ptr(nullptr), ptr(w.text)}), x.at(102, {i32(ok), txt("rw")});
             return sec_translate_bitmask(3, nullptr, w.text); }},
        {"sec_create_acle", 40, 43, clears, [](world &w, expected &x) {
             x.at(42, {u32(4), u32(3), txt("unix"), txt("bob@host"), ptr(&w.acle)});
             x.at(44, {i32(ok)});
             return sec_create_acle(SEC_ACLE_USER, 3, "unix", "bob@host", &w.acle); }},
        {"sec_display_acle_id", 49, 52, clears, [](world &w, expected &x) {
             x.at(51, {ptr(w.acle), u32(4), u32(3), txt("unix"), txt("bob@host"), ptr(&w.mech),
                       ptr(&w.id)});
             x.at(54, {i32(ok), txt("unix"), txt("bob@host")});
             return sec_display_acle_id(w.acle, &w.mech, &w.id); }},
        {"sec_release_acle", 45, 48, release, [](world &w, expected &x) {
             x.at(47, {ptr(w.acle), u8(4), u32(3), txt("unix"), txt("bob@host")}), x.at(48);
             sec_release_acle(w.acle);
             return ok; }},
        {"sec_create_empty_acl records nothing", 0, 0, keeps, [](world &w, expected &) {
             return sec_create_empty_acl(w.empty.get()); }},
        {"sec_read_acl_from_data", 15, 18, clears, [](world &w, expected &x) {
             auto *b = const_cast<unsigned char *>(worked_example.data());
             x.at(17, {i32(71), ptr(b), ptr(w.acl.get())}), x.at(19, {i32(ok)});
             return sec_read_acl_from_data(71, b, w.acl.get()); }},
        {"sec_convert_acl_to_host", 55, 58, clears, [](world &w, expected &x) {
             x.at(57, {u32(1), ptr(w.acl.get()), i32(71), ptr(w.acl.d.value)}), x.at(59, {i32(ok)});
             return sec_convert_acl_to_host(1, w.acl.get()); }},
        {"sec_list_acl", 20, 25, clears, [](world &w, expected &x) {
             x.at(24, {i32(71), ptr(w.acl.d.value), ptr(w.list.get())});
             x.at(27, {i32(ok), i32(3)});
             return sec_list_acl(w.acl.get(), w.list.get()); }},
        // A null ACL has entry points of its own, and the failure's exit.
        {"sec_list_acl of no ACL", 20, 25, clears, [](world &w, expected &x) {
             x.at(22, {ptr(nullptr), ptr(w.typed.get())}), x.at(26, {i32(SEC_S_BAD_PARAM)});
             return sec_list_acl(nullptr, w.typed.get()); }},
        {"sec_list_acl_by_type", 28, 33, clears, [](world &w, expected &x) {
             x.at(32, {i32(71), ptr(w.acl.d.value), u32(16), txt(""), ptr(w.typed.get())});
             x.at(35, {i32(ok), i32(1)});
             return sec_list_acl_by_type(w.acl.get(), SEC_ACLE_GROUP, nullptr, w.typed.get()); }},
        {"sec_list_acl_by_type of no ACL", 28, 33, clears, [](world &w, expected &x) {
             x.at(30, {ptr(nullptr), u32(4), txt("unix"), ptr(w.list.get())});
             x.at(34, {i32(SEC_S_BAD_PARAM)});
             return sec_list_acl_by_type(nullptr, SEC_ACLE_USER, w.unix_mech, w.list.get()); }},
        {"sec_release_aclelist", 36, 39, release, [](world &w, expected &x) {
             x.at(38, {ptr(w.list.get()), i32(3)}), x.at(39);
             sec_release_aclelist(w.list.get());
             return ok; }},
        {"sec_add_acle_to_acl", 60, 63, clears, [](world &w, expected &x) {
             x.at(62, edit_items(w)), x.at(64, {i32(ok)});
             return sec_add_acle_to_acl(w.carol.p(), w.acl.get()); }},
        {"sec_del_acle_from_acl", 65, 68, clears, [](world &w, expected &x) {
             x.at(67, edit_items(w)), x.at(69, {i32(ok)});
             return sec_del_acle_from_acl(w.carol.p(), w.acl.get()); }},
        {"sec__register_id_handler", 74, 77, clears, [](world &, expected &x) {
             sec_acl_id_handler h = never_called;
             x.at(76, {u32(SEC_ID_HANDLER_USER), txt("unix"), hex_of(h)}), x.at(78, {i32(ok)});
             return sec__register_id_handler(SEC_ID_HANDLER_USER, "unix", never_called); }},
        {"sec__single_acle_perm", 79, 82, clears, [](world &w, expected &x) {
             x.at(81, {ptr(w.acl.get()), i32(71), ptr(w.acl.d.value), u32(4), txt("unix"),
                       txt("bob"), ptr(&w.perm)});
             x.at(84, {i32(ok), u32(3)});
             return single(w.acl.get(), SEC_ACLE_USER, "unix", "bob", &w.perm); }},
        {"sec__group_acles_perm", 85, 88, clears, [](world &w, expected &x) {
             x.at(87, {ptr(w.acl.get()), i32(71), ptr(w.acl.d.value), i32(1), ptr(w.groups),
                       ptr(&w.perm)});
             x.at(90, {i32(ok), u32(1)});
             return sec__group_acles_perm(w.acl.get(), 1, w.groups, &w.perm); }},
        // The exit carries the line reached.
        {"sec_read_acl_file", 9, 12, clears, [](world &w, expected &x) {
             x.at(11, {txt(w.dir.acl), txt(""), ptr(nullptr), u32(TEXT), ptr(w.from_file.get())});
             x.at(14, {i32(ok), i32(4)});
             return sec_read_acl_file(w.dir.acl.c_str(), nullptr, nullptr, TEXT, w.from_file.get(),
                                      &w.rflags); }},
        {"sec_release_acl", 70, 73, clears | release, [](world &w, expected &x) {
             x.at(72, {ptr(w.acl.get()), i32(71), ptr(w.acl.d.value)}), x.at(73);
             return sec_release_acl(w.acl.get()); }},
    };
    // clang-format on
}

// Levels 8, 1, 4, 0: records with data, bare entry and exit, a release's exit,
// nothing. Perf 5 is not announced.
TEST(ApiTrace, EveryLevel) {
    std::string file = start_tracing("_SEL:API=8,Perf=5");
    for (tr_detail_level_t level : {8, 1, 4, 0}) {
        if (level != 8) { // the component registered at the first call
            ASSERT_EQ(tr_set_detail_level_1("_SEL", "API", level), TR_OK);
        }
        world w;
        for (const traced_call &c : traced_calls()) {
            SCOPED_TRACE(std::string(c.call) + " at level " + std::to_string(level));
            std::size_t before = read_trace(file).size();
            expected x, bare;
            bad_param("caller", 7, 0x1234u);
            kx_int32_t rc = c.run(w, x);
            if (rc == SEC_S_OK && (c.kind & clears)) {
                EXPECT_EQ(last_error().id, 0);
            } else if (rc == SEC_S_OK) {
                EXPECT_TRUE(record_is(SEC_S_BAD_PARAM, MSG_2650_101, {"caller", 7, 0x1234}));
            }
            if (level == 1 && c.enter)
                bare.at(c.enter), bare.at(c.exit);
            else if (level == 4 && (c.kind & release))
                bare.at(c.exit);
            std::vector<std::string> got;
            std::vector<trace_record> all = read_trace(file);
            for (std::size_t i = before; i < all.size(); ++i)
                got.push_back(described(all[i].id, all[i].items));
            EXPECT_EQ(got, level == 8 ? x.records : bare.records);
        }
    }
    for (unsigned id : trace_ids(file))
        EXPECT_NE(id, 0u);
}

TEST(ApiTrace, PerfLevelIsAnnouncedAtRegistration) {
    std::string file = start_tracing("_SEL:Perf=2");
    kx_uint32_t mask;
    sec_translate_perms("r", nullptr, &mask);
    ASSERT_EQ(trace_ids(file), (std::vector<unsigned>{0}));
    EXPECT_EQ(read_trace(file)[0].items, (std::vector<std::string>{i32(2)}));
}
// A registration that the trace library refuses leaves the caller's record.
TEST(ApiTrace, FailedRegistrationKeepsTheCallersRecord) {
    static tr_detail_level_t levels[1];
    static const tr_category_description_t cats[1] = {{0, "Other", 0, 0}};
    ASSERT_EQ(tr_register_component_1("_SEL", levels, cats, 1), TR_OK);
    bad_param("caller", 7, 0x1234u);
    kx_uint32_t mask;
    EXPECT_EQ(sec_translate_perms("r", nullptr, &mask), SEC_S_OK);
    EXPECT_TRUE(record_is(SEC_S_BAD_PARAM, MSG_2650_101, {"caller", 7, 0x1234}));
}

} // namespace
