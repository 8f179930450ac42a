// Dumping ACL buffers, sub-ACLs and entries to standard error, and the
// failures that a dump prints on standard output.
#include <cstdio>
#include <string>
#include <unistd.h>
#include <vector>

#include <gtest/gtest.h>

#include <kx_acl.h>

#include "acl_fixtures.h"
#include "buffer_format.h"
#include "dump.h"

using namespace kxacl;
using kxtest::build_acl;
using kxtest::owned_acl;

namespace {

// Standard error and standard output of a call.
struct output {
    std::string err, out;
};

std::string contents(std::FILE *f) {
    std::string s;
    std::rewind(f);
    char chunk[512];
    std::size_t n;
    while ((n = std::fread(chunk, 1, sizeof chunk, f)) > 0)
        s.append(chunk, n);
    std::fclose(f);
    return s;
}

template <typename F> output capture(F f) {
    std::fflush(stdout);
    std::fflush(stderr);
    std::FILE *err = std::tmpfile(), *out = std::tmpfile();
    int saved_err = dup(2), saved_out = dup(1);
    dup2(fileno(err), 2);
    dup2(fileno(out), 1);
    f();
    std::fflush(stdout);
    std::fflush(stderr);
    dup2(saved_err, 2);
    dup2(saved_out, 1);
    close(saved_err);
    close(saved_out);
    return {contents(err), contents(out)};
}

// Dumps bytes from a heap block of exactly their size, so that a read past
// the end is caught by the address sanitizer.
output dump_bytes(const std::vector<unsigned char> &bytes) {
    owned_acl acl(bytes);
    return capture([&] { sec__dump_acl(acl.get()); });
}

std::string descriptor_lines(int length, int count) {
    return "ACL descriptor: " + std::to_string(length) +
           " byte(s) long\n\tVersion: 1\n\tByte Ordering: 2\n\tNumber of sub-ACLs: " +
           std::to_string(count) + "\n";
}

std::string subacl_lines(const std::string &lead, int length, int type, const std::string &mech,
                         int count) {
    return lead + "Subacl:\n" + lead + "(length = " + std::to_string(length) +
           " byte(s); type = " + std::to_string(type) + "; mech = " + mech +
           "; ACLE count = " + std::to_string(count) + ")\n\n";
}

// One user entry of "unix" for admin1 with read and write.
std::vector<unsigned char> admin_acl() {
    return build_acl({{SEC_ACLE_USER, 0x3, "unix", "admin1"}});
}

// The formatted text of the record that a failing call leaves.
template <typename F> std::string failure_text(F f) {
    f();
    return kxtest::last_error().text;
}

TEST(DumpAcl, UserEntryPrintsDescriptorSubaclAndEntryLines) {
    std::vector<unsigned char> bytes = admin_acl();
    // 5 header bytes, a sub-ACL of 10 + 5 ("unix") + 14 (7 + "admin1").
    ASSERT_EQ(bytes.size(), 34u);
    output o = dump_bytes(bytes);
    EXPECT_EQ(o.err, "ACL descriptor: 34 byte(s) long\n"
                     "\tVersion: 1\n"
                     "\tByte Ordering: 2\n"
                     "\tNumber of sub-ACLs: 1\n"
                     "\tSubacl:\n"
                     "\t(length = 29 byte(s); type = 4; mech = unix; ACLE count = 1)\n"
                     "\n"
                     "\t\ttype = u; mech = unix; id = admin1; permission = rw\n");
    EXPECT_EQ(o.out, "");
}

TEST(DumpAcl, EveryTypeInBufferOrder) {
    std::vector<unsigned char> bytes = build_acl({{SEC_ACLE_UNAUTHENTICATED, 0x1},
                                                  {SEC_ACLE_ANYOTHER, 0x2},
                                                  {SEC_ACLE_USER, 0x8, "unix", "bob"},
                                                  {SEC_ACLE_USER, 0x1, "unix", "al"},
                                                  {SEC_ACLE_EXPANDED, 0x10, "krb5", "x@y"},
                                                  {SEC_ACLE_GROUP, 0x3, "", "staff"},
                                                  {SEC_ACLE_GROUP, 0x0, "", "admins"}});
    ASSERT_EQ(bytes.size(), 138u);
    output o = dump_bytes(bytes);
    EXPECT_EQ(o.err, descriptor_lines(138, 5) + subacl_lines("\t", 37, 16, "", 2) +
                         "\t\ttype = g; id = admins; permission = \n"
                         "\t\ttype = g; id = staff; permission = rw\n" +
                         subacl_lines("\t", 26, 8, "krb5", 1) +
                         "\t\ttype = e; mech = krb5; id = x@y; permission = C\n" +
                         subacl_lines("\t", 36, 4, "unix", 2) +
                         "\t\ttype = u; mech = unix; id = al; permission = r\n"
                         "\t\ttype = u; mech = unix; id = bob; permission = x\n" +
                         subacl_lines("\t", 17, 2, "", 1) + "\t\ttype = o; permission = w\n" +
                         subacl_lines("\t", 17, 1, "", 1) + "\t\ttype = n; permission = r\n");
    EXPECT_EQ(o.out, "");
}

// No buffer prints nothing, the empty ACL only the descriptor, and a buffer
// of another type that it is not valid.
TEST(DumpAcl, NullOrEmptyDescriptorPrintsNothing) {
    unsigned char byte = 0x85;
    sec_buffer_desc empty{0, nullptr}, no_value{5, nullptr}, no_length{0, &byte},
        negative{-1, &byte};
    for (sec_buffer_desc *acl :
         {static_cast<sec_buffer_desc *>(nullptr), &empty, &no_value, &no_length, &negative}) {
        output o = capture([&] { sec__dump_acl(acl); });
        EXPECT_EQ(o.err, "");
        EXPECT_EQ(o.out, "");
    }
    const std::string not_valid = "The ACL provided is not valid!\n\n";
    const struct {
        std::vector<unsigned char> bytes;
        std::string err;
    } cases[] = {{{0x85, 1, 2, 0, 0}, descriptor_lines(5, 0)},
                 {{0x84, 1, 2, 0, 0}, not_valid},
                 {{0x84}, not_valid}};
    for (const auto &c : cases) {
        output o = dump_bytes(c.bytes);
        EXPECT_EQ(o.err, c.err);
        EXPECT_EQ(o.out, "");
    }
}

TEST(DumpAcl, MaskBitWithoutTemplatePrintsTheFailureInPlace) {
    std::string expected = failure_text([] {
        char perms[33];
        EXPECT_EQ(sec_translate_bitmask(0x2000, nullptr, perms), SEC_S_BAD_PERMISSION);
    });
    ASSERT_NE(expected.find("0x00002000"), std::string::npos);
    std::vector<unsigned char> bytes =
        build_acl({{SEC_ACLE_USER, 0x2003, "unix", "admin1"}, {SEC_ACLE_USER, 0x1, "unix", "zed"}});
    output o = dump_bytes(bytes);
    EXPECT_EQ(o.err, descriptor_lines(45, 1) + subacl_lines("\t", 40, 4, "unix", 2) + expected +
                         "\t\ttype = u; mech = unix; id = zed; permission = r\n");
}

TEST(DumpAcl, ErrorRecordIsClearedAfterTheDump) {
    char perms[33];
    ASSERT_EQ(sec_translate_bitmask(0x2000, nullptr, perms), SEC_S_BAD_PERMISSION);
    ASSERT_NE(kxtest::last_error().id, 0);
    dump_bytes(admin_acl());
    EXPECT_EQ(kxtest::last_error().id, 0);

    ASSERT_EQ(sec_translate_bitmask(0x2000, nullptr, perms), SEC_S_BAD_PERMISSION);
    dump_bytes({0x85, 1, 2, 1, 0}); // a sub-ACL that is not there
    EXPECT_EQ(kxtest::last_error().id, 0);
}

TEST(DumpAcl, TruncatedBuffersAreNeverReadPastTheirEnd) {
    std::vector<unsigned char> whole = admin_acl();
    std::string corrupt = failure_text([] { report_corrupt(here(src_acl)); });
    // The message ends in a source position, which differs by call site.
    std::string corrupt_start = corrupt.substr(0, corrupt.find('('));
    for (std::size_t length = 1; length < whole.size(); ++length) {
        SCOPED_TRACE(length);
        std::vector<unsigned char> part(whole.begin(), whole.begin() + length);
        output o = dump_bytes(part);
        EXPECT_EQ(o.out.rfind(corrupt_start, 0), 0u) << o.out;
        if (length < layout::header_size)
            EXPECT_EQ(o.err, "");
        else if (length < 20) // the sub-ACL header and its mechanism
            EXPECT_EQ(o.err, descriptor_lines(static_cast<int>(length), 1));
        else
            EXPECT_EQ(o.err, descriptor_lines(static_cast<int>(length), 1) +
                                 subacl_lines("\t", 29, 4, "unix", 1));
    }
}

TEST(DumpAcl, CountsThatRunPastTheBufferStopTheDump) {
    std::vector<unsigned char> bytes = admin_acl();
    std::string entry = "\t\ttype = u; mech = unix; id = admin1; permission = rw\n";
    std::vector<unsigned char> two = bytes;
    store_u16(two.data() + layout::at_subacl_count, 2);
    output o = dump_bytes(two);
    EXPECT_EQ(o.err, descriptor_lines(34, 2) + subacl_lines("\t", 29, 4, "unix", 1) + entry);
    EXPECT_NE(o.out.find("2650-110"), std::string::npos);

    // A sub-ACL length shorter than its own header can neither hold the
    // records of a sub-ACL that another one follows nor lead on.
    std::vector<unsigned char> zero = two;
    store_u32(zero.data() + layout::header_size + layout::at_subacl_length, 0);
    o = dump_bytes(zero);
    EXPECT_EQ(o.err, descriptor_lines(34, 2) + subacl_lines("\t", 0, 4, "unix", 1));
    EXPECT_EQ(o.out.rfind("2650-110", 0), 0u) << o.out;
}

TEST(DumpAcl, SubaclThatCannotBecomeATreePrintsItsFailureOnStandardOutput) {
    std::vector<unsigned char> bytes = build_acl({{SEC_ACLE_ANYOTHER, 0x2}});
    store_u32(bytes.data() + layout::header_size + layout::at_acle_count, 2);
    output o = dump_bytes(bytes);
    EXPECT_EQ(o.err, descriptor_lines(22, 1) + subacl_lines("\t", 17, 2, "", 2));
    EXPECT_EQ(o.out.rfind("2650-111", 0), 0u) << o.out;
    EXPECT_EQ(kxtest::last_error().id, 0);
}

TEST(DumpSubacl, EntryLeadSpaceGrowsWithTheSubaclLeadSpace) {
    std::vector<unsigned char> bytes = admin_acl();
    acl_bytes b{bytes.data(), bytes.size()};
    subacl_view v;
    ASSERT_TRUE(read_subacl(b, layout::header_size, &v));
    std::string lead(8, '\t');
    output o = capture([&] {
        stream_sink sink(stderr, stdout);
        sec__dump_subacl(b, v, lead.c_str(), sink);
    });
    EXPECT_EQ(o.err, subacl_lines(lead, 29, 4, "unix", 1) + lead +
                         "\ttype = u; mech = unix; id = admin1; permission = rw\n");
}

TEST(DumpSubacl, NoMemoryForTheLeadSpaceIsPrintedOnStandardOutput) {
    std::vector<unsigned char> bytes = admin_acl();
    acl_bytes b{bytes.data(), bytes.size()};
    subacl_view v;
    ASSERT_TRUE(read_subacl(b, layout::header_size, &v));
    // The allocations of building the tree come first.
    unsigned long before = mem_allocations();
    sec_acltree_t tree = nullptr;
    ASSERT_EQ(sec__subacl_to_acltree(b, v, &tree), SEC_S_OK);
    sec__free_acltree(tree);
    mem_fail_after(static_cast<long>(mem_allocations() - before));
    output o = capture([&] {
        stream_sink sink(stderr, stdout);
        sec__dump_subacl(b, v, "\t", sink);
    });
    mem_fail_after(-1);
    EXPECT_EQ(o.err, subacl_lines("\t", 29, 4, "unix", 1));
    EXPECT_EQ(o.out.rfind("2650-102", 0), 0u) << o.out;
    EXPECT_NE(o.out.find("sec__dump_subacl"), std::string::npos);
}

TEST(DumpAcle, CallerTemplatesAndNullEntry) {
    sec_perm_desc perms[] = {{0x100, 'z', "zap", ""}};
    sec_perm_set_desc set{1, perms};
    char id[] = "staff";
    sec_acle_desc acle{};
    acle.type = SEC_ACLE_GROUP;
    acle.perm = 0x100;
    acle.id = id;
    output o = capture([&] {
        sec__dump_acle(&acle, &set, "  ");
        sec__dump_acle(nullptr, &set, "  ");
    });
    EXPECT_EQ(o.err, "  type = g; id = staff; permission = z\n");

    // The default templates have no bit 8 character but 'd'.
    o = capture([&] { sec__dump_acle(&acle, nullptr, ""); });
    EXPECT_EQ(o.err, "type = g; id = staff; permission = d\n");
}

TEST(DumpAcle, EntryThatCannotBeDisplayedPrintsItsFailure) {
    sec_acle_desc acle{};
    acle.type = 3;
    std::string expected = failure_text([&] {
        char *mech = nullptr, *id = nullptr;
        EXPECT_EQ(sec_display_acle_id(&acle, &mech, &id), SEC_S_BAD_ACLE);
    });
    output o = capture([&] { sec__dump_acle(&acle, nullptr, "\t"); });
    EXPECT_EQ(o.err, expected);
    EXPECT_EQ(kxtest::last_error().id, 0);
}

} // namespace
