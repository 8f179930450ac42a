// kxacl trace: every trace point is decoded by name, those of the file
// reader as the library records them, and the decoder's forms of each kind
// of item.
#include <gtest/gtest.h>
#include <nlohmann/json.hpp>

#include <set>
#include <sstream>
#include <string>
#include <tuple>
#include <utility>

#include <sys/stat.h>
#include <unistd.h>

#include <kx_acl.h>
#include <kx_acl_trace.h>
#include <kx_tr.h>

#include "alloc.h"
#include "file_helpers.h"
#include "run_kxacl.h"
#include "support.h"
#include "syscalls.h"
#include "trace_decode.h"

using kxtest::run_kxacl;
using nlohmann::json;

namespace {

// One record line as the trace library writes it.
std::string record(unsigned id, const std::string &items, const char *component = "_SEL") {
    return "1795490249.353813164 17558 " + std::string(component) + " " + std::to_string(id) +
           (items.empty() ? "" : " " + items);
}

// Each point's record, its items zero bytes of their kind's size (a text
// "a"), and the "<category> where:event" its decoded line shows.
#define KXTEST_ITEM(kind, name)                                                                    \
    +(KX_ACL_TRACE_ITEM_SIZE(kind) ? " " + std::string(2 * KX_ACL_TRACE_ITEM_SIZE(kind), '0')      \
                                   : std::string(" 6100"))
#define KXTEST_POINT(row, id, category, level, rule, where, event, items)                          \
    {id, std::string(where) + ":" + event, std::string() items, category},
const std::tuple<unsigned, std::string, std::string, int> every_point[] = {
    KX_ACL_TRACE_POINTS(KXTEST_POINT, KXTEST_ITEM)};
#undef KXTEST_POINT
#undef KXTEST_ITEM

kx_int32_t read(const std::string &path, kx_uint32_t flags) {
    sec_buffer_s acl{0, nullptr};
    const kx_int32_t status =
        sec_read_acl_file(path.c_str(), nullptr, nullptr, flags, &acl, nullptr);
    sec_release_acl(&acl);
    return status;
}

// The file reader, the cache writer and the entry tree along each path
// that has a point, at Info 8, Errors 1 and Perf 2.
void read_along_every_path(const std::string &dir) {
    using kxacl::sys_call;
    const std::string text = dir + "/r.acl", cacl = text + ".cacl";
    kxtest::write_file(text, kxtest::example_text);
    kxtest::shift_mtime(text, -100);
    read(text, SEC_F_ACL_CACHE); // no cached file yet: written
    read(text, 0);               // read from the cached file
    kxtest::shift_mtime(cacl, -200);
    read(text, 0); // stale
    chmod(cacl.c_str(), 0600);
    kxtest::shift_mtime(cacl, 300);
    read(text, SEC_F_ACL_CACHE); // another mode: neither read nor replaced
    if (geteuid() == 0) {
        chmod(cacl.c_str(), 0644);
        EXPECT_EQ(chown(cacl.c_str(), 1, 1), 0);
        read(text, SEC_F_ACL_CACHE);
    }
    unlink(cacl.c_str());
    read(text, SEC_F_ACL_CACHE);
    kxacl::mem_fail_after(0);
    read(text, 0); // no memory for the cached file's bytes
    kxacl::mem_fail_after(-1);
    kxacl::sys_fail_nth(sys_call::read, 0, 0);
    read(text, 0); // a short read of the cached file
    for (const auto &[call, err] :
         {std::pair{sys_call::open, EACCES}, std::pair{sys_call::fstat, EIO},
          std::pair{sys_call::lstat, EACCES}}) {
        kxacl::sys_fail_nth(call, 0, err);
        read(text, SEC_F_ACL_TEXT | SEC_F_ACL_CACHE);
        EXPECT_TRUE(kxacl::sys_fault_fired());
    }
    kxtest::write_file(dir + "/empty.acl", "");
    read(dir + "/empty.acl", 0);
    kxtest::write_file(dir + "/long.acl", "u unix " + std::string(2000, 'x') + " r\n");
    read(dir + "/long.acl", SEC_F_ACL_TEXT);
    const std::string deep = kxtest::path_of_length(dir, 4090);
    kxtest::write_file(deep, kxtest::example_text);
    read(deep, SEC_F_ACL_TEXT | SEC_F_ACL_CACHE); // too long a name for a cached file
    sec_acle_t group = nullptr;
    sec_buffer_s acl{0, nullptr};
    sec_create_acle(SEC_ACLE_GROUP, 1, nullptr, "staff", &group);
    sec_add_acle_to_acl(group, &acl);
    sec_add_acle_to_acl(group, &acl); // the same entry again: its mask is replaced
    sec_release_acle(group);
    sec_release_acl(&acl);
}

// The points of the library's steps (all but the exported functions' own)
// are recorded where it takes those paths, and come back by name from a
// real trace file.
TEST(TraceDecode, EveryReadingPointIsRecordedAndDecoded) {
    const std::string trace = kxtest::start_tracing("_SEL:Errors=1,Info=8,Perf=2");
    const std::string dir = kxtest::temp_dir();
    read_along_every_path(dir);
    // Perf 1, and Info 1's report of a cache that was not written.
    for (const char *category : {"Info", "Perf"})
        ASSERT_EQ(tr_set_detail_level_1("_SEL", category, 1), TR_OK);
    kxtest::write_file(dir + "/r.acl.cacl", "not written by the library", 0600);
    read(dir + "/r.acl", SEC_F_ACL_CACHE);

    std::set<std::string> expected;
    for (const auto &[id, name, items, category] : every_point)
        if (!name.starts_with("sec_") && (geteuid() == 0 || name != "cache:owner-differs"))
            expected.insert(std::to_string(id) + " " + name);
    const auto r = run_kxacl({"trace", "--json", trace});
    EXPECT_EQ(r.exit_code, 0) << r.err;
    std::set<std::string> seen;
    std::istringstream lines(r.out);
    for (std::string line; std::getline(lines, line);) {
        const json record = json::parse(line, nullptr, false);
        EXPECT_FALSE(record.is_discarded() || record.contains("raw")) << line;
        seen.insert(std::to_string(record.value("id", 0u)) + " " + record.value("point", ""));
    }
    EXPECT_EQ(seen, expected);
    const auto text = run_kxacl({"trace", trace});
    EXPECT_EQ(text.exit_code, 0);
    EXPECT_EQ(text.out.find("raw:"), std::string::npos);
    EXPECT_EQ(text.err, "");
}

TEST(TraceDecode, ItemsAreShownByTheirKind) {
    kxtool::perm_letters letters{};
    letters[0] = 'r';
    letters[1] = 'w';
    kxtool::trace_decoder decoder(false, {}, letters);
    const struct {
        std::string line, shown; // shown: after the local time
    } cases[] = {
        {record(84, "24000000 03000080"),
         "17558 API sec__single_acle_perm:exit status=SEC_S_BAD_PERMISSION "
         "perm=0x80000003(rw+0x80000000)"},
        {record(76, "84000000 7522785c0a00 0000000000000000"),
         "17558 API sec__register_id_handler:enter type=user+handler mech=\"u\\\"x\\\\\\n\" "
         "handler=0x0"},
        {record(11, "2f6100 00 0100000000000000 05000000 ffffffffffffff7f"),
         "17558 API sec_read_acl_file:enter file=\"/a\" user=\"\" templates=0x1 "
         "flags=SEC_F_ACL_TEXT|SEC_F_ACL_CONVERT acl=0x7fffffffffffffff"},
        {record(111, "6300 a4010000 80010000"), "17558 Errors cache:mode-differs cacl=\"c\" "
                                                "acl_mode=0644 cacl_mode=0600"},
        {record(122, "ff00 0d000000"), "17558 Info read:open-failed file=\"\\xff\" errno=EACCES"},
        {record(8, "e803000000000000 0100000000000000 0500000000000000"),
         "17558 Perf sec__group_acles_perm:timed ticks=1000 elapsed=1000000.005us"},
        {record(114, "03000000 00000000 00 00 00000000"),
         "17558 Info parse:line line=3 type=none mech=\"\" id=\"\" perm=0x00000000()"},
        {record(47, "0000000000000000 10 01000000 00 7300"),
         "17558 API sec_release_acle:enter entry=0x0 type=group perm=0x00000001(r) mech=\"\" "
         "id=\"s\""},
    };
    for (const auto &c : cases) {
        const std::string out = decoder.decode_line(c.line);
        ASSERT_GT(out.size(), 27u) << c.line;
        EXPECT_EQ(out.substr(27), c.shown + "\n") << c.line; // past the local time
    }
    EXPECT_EQ(decoder.undecoded(), 0u);
}

// A line that is not a record the table describes is shown whole, counted,
// and kept by the filters that cannot judge it.
TEST(TraceDecode, UnknownRecordsAreShownRawAndCounted) {
    kxtool::perm_letters letters{};
    std::string error;
    auto filter = kxtool::make_trace_filter({}, {"api"}, {"sec_translate_perms:exit"}, error);
    ASSERT_TRUE(filter) << error;
    kxtool::trace_decoder decoder(false, *filter, letters);
    for (const std::string &raw : {
             record(84, "24000000"),               // an item too few
             record(84, "2400000000 03000000"),    // an item of the wrong size
             record(11, "2f61 00 01 05000000 00"), // a text without its NUL
             record(0, "-"),                       // no bytes for a number
             record(5, ""),                        // an id of no point
             record(79, "", "_XYZ"),               // another component
             record(79, "0g"),                     // not hex
             std::string("1795490249.35381316 17558 _SEL 79"),
             std::string("garbage"),
             std::string(""),
         })
        EXPECT_EQ(decoder.decode_line(raw), "raw: " + raw + "\n");
    EXPECT_EQ(decoder.decode_line(record(79, "")), "") << "another point";
    EXPECT_EQ(decoder.decode_line(record(104, "")), "") << "another category";
    EXPECT_NE(decoder.decode_line(record(95, "24000000")), "");
    EXPECT_EQ(decoder.undecoded(), 10u);
    for (const auto &[threads, categories, points, why] :
         {std::tuple{"12x", "", "", "not a thread id: '12x'"},
          std::tuple{"", "api,Trace", "",
                     "unknown category 'Trace' (Errors, Info, API, Buffer or Perf)"},
          std::tuple{"", "", "read:nothing", "unknown trace point 'read:nothing'"}}) {
        const auto list = [](const char *v) {
            return *v ? std::vector<std::string>{v} : std::vector<std::string>{};
        };
        error.clear();
        EXPECT_FALSE(
            kxtool::make_trace_filter(list(threads), list(categories), list(points), error));
        EXPECT_EQ(error, why);
    }
}

} // namespace
