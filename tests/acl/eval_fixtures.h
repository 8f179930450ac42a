// Helpers of the evaluation tests, on top of the shared ACL buffer fixtures:
// shorthand for identified entry records, the ACL of the evaluation
// examples, and group lists as the evaluation takes them.
#ifndef KXACL_TEST_EVAL_FIXTURES_H
#define KXACL_TEST_EVAL_FIXTURES_H

#include <vector>

#include <kx_acl.h>

#include "acl_fixtures.h"

namespace evaltest {

using kxtest::bytes;
using kxtest::make_acl;
using kxtest::make_record;
using kxtest::make_subacl;
using kxtest::owned_acl;
using kxtest::text_field;

// An entry record with an identity; an anyother or unauthenticated one.
inline bytes rec(kx_uint32_t perm, const char *id) {
    return make_record(perm, text_field(id));
}
inline bytes rec(kx_uint32_t perm) {
    return make_record(perm);
}

// User entries of "unix" (alice 0x3, bob 0x1), group entries (admin 0x4,
// staff 0x2) and an anyother entry 0x1.
inline bytes example_acl() {
    return make_acl(
        {make_subacl(SEC_ACLE_USER, 2, text_field("unix"), {rec(0x3, "alice"), rec(0x1, "bob")}),
         make_subacl(SEC_ACLE_GROUP, 2, {}, {rec(0x4, "admin"), rec(0x2, "staff")}),
         make_subacl(SEC_ACLE_ANYOTHER, 1, {}, {rec(0x1)})});
}

// The first length bytes of b: a buffer cut short. owned_acl holds it in a
// block of exactly that size (none at all for length 0, the empty ACL).
inline bytes prefix(const bytes &b, std::size_t length) {
    return bytes(b.begin(), b.begin() + static_cast<std::ptrdiff_t>(length));
}

class group_list {
  public:
    explicit group_list(std::vector<const char *> names) {
        for (const char *n : names)
            groups_.push_back({0, const_cast<char *>(n)});
    }
    kx_int32_t count() const { return static_cast<kx_int32_t>(groups_.size()); }
    sec_buffer_t get() { return groups_.data(); }

  private:
    std::vector<sec_buffer_s> groups_;
};

} // namespace evaltest

#endif
