// Dumping ACL buffers, sub-ACLs and entries, and the C functions' streams.
#include <cstdio>
#include <cstdlib>
#include <string>
#include <vector>
#include <gtest/gtest.h>
#include "acl_fixtures.h"
#include "buffer_format.h"
#include "dump.h"

using namespace kxacl;
using kxtest::build_acl;
using kxtest::bytes;

namespace {
struct recorded final : dump_sink {
    std::string lines, failures;
    void line(const char *text) noexcept override { lines += text; }
    void failure(const char *text) noexcept override { failures += text; }
};

// An exactly sized heap block, for the address sanitizer.
recorded dump(const bytes &b) {
    kxtest::owned_acl acl(b);
    recorded r;
    dump_acl(acl.get(), r);
    return r;
}

std::string descriptor(int length, int count) {
    return "ACL descriptor: " + std::to_string(length) +
           " byte(s) long\n\tVersion: 1\n\tByte Ordering: 2\n\tNumber of sub-ACLs: " +
           std::to_string(count) + "\n";
}

std::string subacl(const std::string &lead, int length, int type, const std::string &mech,
                   int count) {
    return lead + "Subacl:\n" + lead + "(length = " + std::to_string(length) +
           " byte(s); type = " + std::to_string(type) + "; mech = " + mech +
           "; ACLE count = " + std::to_string(count) + ")\n\n";
}

const std::string admin_line = "type = u; mech = unix; id = admin1; permission = rw\n";

// 5 header bytes and a sub-ACL of 10 + 5 ("unix") + 14 (7 + "admin1").
bytes admin_acl(std::uint16_t subacl_count = 1) {
    bytes b = build_acl({{SEC_ACLE_USER, 0x3, "unix", "admin1"}});
    store_u16(b.data() + layout::at_subacl_count, subacl_count);
    return b;
}

std::string bad_mask_text() {
    char perms[33];
    sec_translate_bitmask(0x2000, nullptr, perms);
    return kxtest::last_error().text;
}

// Each case starts with a record left by a failure, which the dump clears.
TEST(DumpAcl, LinesAndFailuresOfWholeBuffers) {
    const std::string bad_mask = bad_mask_text();
    bytes zero_length = admin_acl(2), bad_count = build_acl({{SEC_ACLE_ANYOTHER, 0x2}});
    store_u32(zero_length.data() + layout::header_size + layout::at_subacl_length, 0);
    store_u32(bad_count.data() + layout::header_size + layout::at_acle_count, 2);
    const std::string not_valid = "The ACL provided is not valid!\n\n";
    struct dump_case {
        bytes acl;
        std::string lines, failure; // the failure's message number
    };
    std::vector<dump_case> cases = {
        {admin_acl(), descriptor(34, 1) + subacl("\t", 29, 4, "unix", 1) + "\t\t" + admin_line, ""},
        // The failure to show admins takes the place of its line.
        {build_acl({{SEC_ACLE_UNAUTHENTICATED, 0x0},
                    {SEC_ACLE_ANYOTHER, 0x2},
                    {SEC_ACLE_EXPANDED, 0x10, "krb5", "x@y"},
                    {SEC_ACLE_GROUP, 0x103, "", "staff"},
                    {SEC_ACLE_GROUP, 0x2000, "", "admins"}}),
         descriptor(102, 4) + subacl("\t", 37, 16, "", 2) + bad_mask +
             "\t\ttype = g; id = staff; permission = rwd\n" + subacl("\t", 26, 8, "krb5", 1) +
             "\t\ttype = e; mech = krb5; id = x@y; permission = C\n" + subacl("\t", 17, 2, "", 1) +
             "\t\ttype = o; permission = w\n" + subacl("\t", 17, 1, "", 1) +
             "\t\ttype = n; permission = \n",
         ""},
        {{0x85, 1, 2, 0, 0}, descriptor(5, 0), ""},
        {{0x84}, not_valid, ""},
        {admin_acl(2), descriptor(34, 2) + subacl("\t", 29, 4, "unix", 1) + "\t\t" + admin_line,
         "2650-110"},
        // Too short for its own header: no records, and it leads on to nothing.
        {zero_length, descriptor(34, 2) + subacl("\t", 0, 4, "unix", 1), "2650-110"},
        {bad_count, descriptor(22, 1) + subacl("\t", 17, 2, "", 2), "2650-111"},
    };
    // Every cut of a buffer fails where its bytes end, and reads no further.
    const bytes whole = admin_acl();
    for (int length = 1; length < static_cast<int>(whole.size()); ++length)
        cases.push_back({bytes(whole.begin(), whole.begin() + length),
                         length < 5    ? ""
                         : length < 20 ? descriptor(length, 1) // the sub-ACL header and mech
                                       : descriptor(length, 1) + subacl("\t", 29, 4, "unix", 1),
                         "2650-110"});
    for (const auto &c : cases) {
        SCOPED_TRACE(testing::PrintToString(c.acl));
        bad_mask_text();
        const recorded r = dump(c.acl);
        EXPECT_EQ(r.lines, c.lines);
        EXPECT_EQ(r.failures.substr(0, 9), c.failure.empty() ? "" : c.failure + " ");
        EXPECT_EQ(kxtest::last_error().id, 0);
    }
}

// sec__dump_acl_to: each channel's stream, none dropped; sec__dump_acl: stderr, stdout.
TEST(DumpAcl, StreamsOfTheCFunctions) {
    struct memory_stream {
        char *data = nullptr;
        std::size_t size = 0;
        std::FILE *file = open_memstream(&data, &size);
        std::string text() { return std::fflush(file) == 0 ? std::string(data, size) : "?"; }
        ~memory_stream() {
            std::fclose(file);
            std::free(data);
        }
    } err, out;
    const recorded expected = dump(admin_acl(2));
    ASSERT_NE(expected.failures, "");
    kxtest::owned_acl acl(admin_acl(2));
    unsigned char byte = 0x85;
    sec_buffer_desc none[] = {{0, nullptr}, {5, nullptr}, {0, &byte}, {-1, &byte}};
    std::FILE *const saved_err = stderr, *const saved_out = stdout;
    stderr = err.file; // the C library's standard streams are variables
    stdout = out.file;
    sec__dump_acl_to(acl.get(), err.file, nullptr);
    sec__dump_acl_to(acl.get(), nullptr, nullptr);
    for (sec_buffer_desc &nothing : none)
        sec__dump_acl_to(&nothing, err.file, err.file);
    sec__dump_acl_to(nullptr, err.file, err.file);
    sec__dump_acl(acl.get());
    stderr = saved_err;
    stdout = saved_out;
    EXPECT_EQ(err.text(), expected.lines + expected.lines);
    EXPECT_EQ(out.text(), expected.failures);
}

TEST(DumpSubacl, LeadSpaceAndNoMemoryForIt) {
    const bytes b = admin_acl();
    const acl_bytes in{b.data(), b.size()};
    subacl_view v;
    ASSERT_TRUE(read_subacl(in, layout::header_size, &v));
    recorded r, failed;
    sec__dump_subacl(in, v, "\t\t\t", r);
    EXPECT_EQ(r.lines, subacl("\t\t\t", 29, 4, "unix", 1) + "\t\t\t\t" + admin_line);
    // The allocations of building the tree come first.
    const unsigned long before = mem_allocations();
    sec_acltree_t tree = nullptr;
    ASSERT_EQ(sec__subacl_to_acltree(in, v, &tree), SEC_S_OK);
    sec__free_acltree(tree);
    mem_fail_after(static_cast<long>(mem_allocations() - before));
    sec__dump_subacl(in, v, "\t", failed);
    mem_fail_after(-1);
    EXPECT_EQ(failed.lines, subacl("\t", 29, 4, "unix", 1));
    EXPECT_EQ(failed.failures.rfind("2650-102", 0), 0u) << failed.failures;
    EXPECT_NE(failed.failures.find("sec__dump_subacl"), std::string::npos);
}

TEST(DumpAcle, TemplatesNullEntryAndAnEntryThatCannotBeDisplayed) {
    sec_perm_desc perms[] = {{0x100, 'z', "zap", ""}};
    sec_perm_set_desc set{1, perms};
    kxtest::entry group(SEC_ACLE_GROUP, 0x100, "", "staff"), unknown(3, 0);
    char *mech = nullptr, *id = nullptr;
    ASSERT_EQ(sec_display_acle_id(unknown.p(), &mech, &id), SEC_S_BAD_ACLE);
    const std::string cannot = kxtest::last_error().text;
    recorded r;
    sec__dump_acle(group.p(), &set, "  ", r);
    sec__dump_acle(nullptr, &set, "  ", r);
    sec__dump_acle(unknown.p(), nullptr, "\t", r);
    EXPECT_EQ(r.lines, "  type = g; id = staff; permission = z\n" + cannot);
    EXPECT_EQ(r.failures, "");
    EXPECT_EQ(kxtest::last_error().id, 0);
}
} // namespace
