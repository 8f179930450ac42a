// Validation, sub-ACL lookup, and the fuzz targets' exercise on damaged bytes.
#include <string>
#include <gtest/gtest.h>
#include "../../fuzz/acl_exercise.h"
#include "acl_fixtures.h"
#include "buffer_format.h"

using namespace kxacl;
using namespace kxtest;

namespace {
kx_int32_t verify(const bytes &b) {
    owned_acl acl(b);
    return sec_convert_acl_to_host(1, acl.get());
}

error_record expect_invalid(const bytes &b, kx_int32_t status, int msg) {
    EXPECT_EQ(verify(b), status);
    error_record e = expect_error(status, msg);
    EXPECT_EQ(e.str(e.args.size() - 2), "kxacl_acl");
    return e;
}

const bytes unix_mech = text_field("unix");

TEST(CheckAclBuffer, Faults) {
    for (kx_int32_t length : {4, 0, -7}) {
        sec_buffer_s acl{length, const_cast<unsigned char *>(empty_acl_bytes.data())};
        EXPECT_EQ(sec__check_acl_buffer(&acl), SEC_S_BAD_ACL);
        EXPECT_EQ(expect_error(SEC_S_BAD_ACL, MSG_2650_119).num(0), length);
    }
    EXPECT_EQ(expect_invalid(make_acl({make_subacl(4, 0, {0}, {})}), 42, MSG_2650_123).num(0), 1);
    bytes padded = {'u', 'n', 'i', 'x', 0, 0};
    EXPECT_EQ(expect_invalid(make_acl({make_subacl(8, 0, padded, {})}), 42, MSG_2650_124).str(0),
              "unix");
    // Fields without NUL that end the buffer are not read past its end.
    bytes unterminated = {'u', 'n', 'i', 'x', 'x'};
    EXPECT_EQ(
        expect_invalid(make_acl({make_subacl(4, 0, unterminated, {})}), 42, MSG_2650_124).str(0),
        "unixx");
    expect_invalid(make_acl({make_subacl(4, 1, unix_mech, {make_record(1, {'b', 'o', 'b'})})}), 43,
                   MSG_2650_127);
    EXPECT_EQ(expect_invalid(make_acl({make_subacl(16, 0, {'x', 0}, {})}), 42, MSG_2650_121).num(0),
              16);
    expect_invalid(make_acl({make_subacl(2, 2, {}, {make_record(1), make_record(2)})}), 42,
                   MSG_2650_122);
    // Version 2 is reported; the bad type after it is never examined.
    bytes versions =
        make_acl({make_subacl(2, 1, {}, {make_record(1, {}, 2)}), make_subacl(3, 0, {}, {})});
    EXPECT_EQ(expect_invalid(versions, 43, MSG_2650_125).num(0), 2);
    expect_invalid(make_acl({make_subacl(2, 1, {}, {make_record(1, text_field("abc"))})}), 43,
                   MSG_2650_126);
    expect_invalid(make_acl({make_subacl(16, 1, {}, {make_record(1)})}), 43, MSG_2650_127);
    bytes longer = make_subacl(2, 1, {}, {make_record(1)}, 1);
    expect_invalid(make_acl({longer, make_subacl(1, 0, {}, {})}), 42, MSG_2650_110);
    expect_invalid(make_acl({longer}), 42, MSG_2650_110); // past the end
    EXPECT_EQ(verify(make_acl(
                  {make_subacl(16, 3, {},
                               {make_record(1, text_field("a")), make_record(1, text_field("b")),
                                make_record(1, text_field("c"))})})),
              SEC_S_OK);
}

TEST(FindSubacl, AddressOrNull) {
    owned_acl acl(worked_example);
    unsigned char *found = nullptr;
    EXPECT_EQ(sec__find_subacl(acl.get(), 4, "UNIX", &found), SEC_S_OK);
    EXPECT_EQ(found - static_cast<unsigned char *>(acl.d.value), 45);
    EXPECT_EQ(sec__find_subacl(acl.get(), 1, nullptr, &found), SEC_S_OK);
    EXPECT_EQ(found, nullptr);
}

void exercise(const bytes &b) {
    kxfuzz::exercise_host_order(b.data(), b.size());
}

// Bytes of the other order are used as a host's once converted.
void exercise_foreign_order(const bytes &b) {
    owned_acl acl(b);
    if (kxfuzz::checked(sec_convert_acl_to_host(1, acl.get()), "conversion") == SEC_S_OK)
        exercise(acl.contents());
}

// Every prefix of b, and b with each byte replaced by several values.
void damage(const bytes &b, void (*exercise)(const bytes &)) {
    for (std::size_t length = 0; length < b.size() && !::testing::Test::HasFailure(); ++length) {
        SCOPED_TRACE("prefix of " + std::to_string(length));
        exercise(bytes(b.begin(), b.begin() + static_cast<long>(length)));
    }
    for (std::size_t at = 0; at < b.size() && !::testing::Test::HasFailure(); ++at) {
        for (int value : {0x00, 0xff, 0x7f, 0x80, b[at] + 1, b[at] - 1}) {
            SCOPED_TRACE("byte " + std::to_string(at) + " set to " + std::to_string(value));
            bytes damaged = b;
            damaged[at] = static_cast<unsigned char>(value);
            exercise(damaged);
        }
    }
}

TEST(DamagedBuffers, WorkedExampleAndSeveralMechanisms) {
    kxfuzz::register_handlers();
    for (const bytes &b : {worked_example, rich_acl()}) {
        ASSERT_EQ(verify(b), SEC_S_OK);
        damage(b, exercise);
        damage(swapped_order(b), exercise_foreign_order);
    }
}
} // namespace
