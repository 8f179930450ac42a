// Known ACL buffers, buffer pieces, entries and descriptors for the tests.
#ifndef KXACL_TEST_ACL_FIXTURES_H
#define KXACL_TEST_ACL_FIXTURES_H

#include <algorithm>
#include <cstdlib>
#include <cstring>
#include <initializer_list>
#include <string>
#include <vector>
#include <gtest/gtest.h>
#include <kx_acl.h>
#include "alloc.h"
#include "byteorder.h"
#include "convert.h"
#include "messages.h"
#include "support.h"
#include "tree.h"

namespace kxtest {
using bytes = std::vector<unsigned char>;
using texts = std::vector<std::string>;

// clang-format off
// anyother r, group staff r, user "unix" bob rw: 71 bytes, little-endian.
inline const bytes worked_example = {
    0x85, 1, 2, 3, 0,
    0x11, 0, 0, 0, 2,    1, 0, 0, 0, 0,  1, 1, 0, 0, 0, 0, 0,
    0x17, 0, 0, 0, 0x10, 1, 0, 0, 0, 0,  1, 1, 0, 0, 0, 6, 0, 's', 't', 'a', 'f', 'f', 0,
    0x1a, 0, 0, 0, 4,    1, 0, 0, 0, 5, 'u', 'n', 'i', 'x', 0,
                                         1, 3, 0, 0, 0, 4, 0, 'b', 'o', 'b', 0};

// The same ACL as a big-endian host writes it, with a mark other than 2.
inline const bytes worked_example_swapped = {
    0x85, 1, 1, 0, 3,
    0, 0, 0, 0x11, 2,    0, 0, 0, 1, 0,  1, 0, 0, 0, 1, 0, 0,
    0, 0, 0, 0x17, 0x10, 0, 0, 0, 1, 0,  1, 0, 0, 0, 1, 0, 6, 's', 't', 'a', 'f', 'f', 0,
    0, 0, 0, 0x1a, 4,    0, 0, 0, 1, 5, 'u', 'n', 'i', 'x', 0,
                                         1, 0, 0, 0, 3, 0, 4, 'b', 'o', 'b', 0};
// clang-format on

inline const bytes empty_acl_bytes = {0x85, 1, 2, 0, 0};

// Pieces of little-endian buffers, sized whole before their parts are copied
// in: gcc 12 at -O3 takes vector::insert on a short vector for a copy out of
// bounds (-Warray-bounds). A text field with its NUL:
inline bytes text_field(const char *s) {
    return bytes(s, s + std::strlen(s) + 1);
}

inline bytes make_record(kx_uint32_t perm, const bytes &id = {}, unsigned char version = 1) {
    bytes r(7 + id.size(), 0);
    r[0] = version;
    kxacl::store_u32(&r[1], perm);
    kxacl::store_u16(&r[5], static_cast<std::uint16_t>(id.size()));
    std::copy(id.begin(), id.end(), r.begin() + 7);
    return r;
}

// A sub-ACL whose length field says its size plus extra.
inline bytes make_subacl(unsigned char type, std::uint32_t count, const bytes &mech,
                         std::initializer_list<bytes> records, int extra = 0) {
    std::size_t size = 10 + mech.size();
    for (const bytes &r : records)
        size += r.size();
    bytes s(size, 0);
    s[4] = type;
    kxacl::store_u32(&s[5], count);
    s[9] = static_cast<unsigned char>(mech.size());
    auto at = std::copy(mech.begin(), mech.end(), s.begin() + 10);
    for (const bytes &r : records)
        at = std::copy(r.begin(), r.end(), at);
    kxacl::store_u32(&s[0], static_cast<std::uint32_t>(static_cast<int>(s.size()) + extra));
    return s;
}

inline bytes make_acl(std::initializer_list<bytes> subacls) {
    std::size_t size = 5;
    for (const bytes &s : subacls)
        size += s.size();
    bytes b(size);
    b[0] = 0x85;
    b[1] = 1;
    b[2] = 2;
    b[3] = static_cast<unsigned char>(subacls.size());
    auto at = b.begin() + 5;
    for (const bytes &s : subacls)
        at = std::copy(s.begin(), s.end(), at);
    return b;
}

// An entry whose strings the test owns; p() gives the record to pass.
struct entry {
    sec_acle_desc desc{};
    std::string id;
    bool has_id;
    entry(unsigned char type, kx_uint32_t perm, const char *mech = "", const char *id_ = nullptr)
        : id(id_ ? id_ : ""), has_id(id_ != nullptr) {
        desc.type = type;
        desc.perm = perm;
        std::strncpy(desc.mech, mech, SEC_MECH_MAX);
    }
    sec_acle_t p() {
        desc.id = has_id ? id.data() : nullptr;
        return &desc;
    }
};

// A descriptor owning an exactly-sized copy of b (so that AddressSanitizer
// sees any access past length), freed at the end. No bytes: the empty ACL.
struct owned_acl {
    sec_buffer_s d{0, nullptr};
    owned_acl() = default;
    explicit owned_acl(const bytes &b) {
        if (b.empty())
            return;
        d.value = std::malloc(b.size());
        std::memcpy(d.value, b.data(), b.size());
        d.length = static_cast<kx_int32_t>(b.size());
    }
    owned_acl(const owned_acl &) = delete;
    ~owned_acl() { std::free(d.value); }
    sec_acl_buffer_t get() { return &d; }
    bytes contents() const {
        auto *p = static_cast<const unsigned char *>(d.value);
        return p && d.length > 0 ? bytes(p, p + d.length) : bytes{};
    }
};

struct owned_list {
    sec_acle_list_s l{0, nullptr};
    owned_list() = default;
    owned_list(const owned_list &) = delete;
    ~owned_list() { sec_release_aclelist(&l); }
    sec_acle_list_t get() { return &l; }
    texts described() const { // "type mech id perm" of each entry
        texts out;
        for (kx_int32_t i = 0; i < l.count; ++i) {
            const sec_acle_desc &a = *l.acles[i];
            out.push_back(std::to_string(a.type) + " " + a.mech + " " + (a.id ? a.id : "-") + " " +
                          std::to_string(a.perm));
        }
        return out;
    }
};

struct owned_trees {
    kxacl::sec_acltree_t *trees = nullptr;
    int count = 0;
    owned_trees() = default;
    owned_trees(const owned_trees &) = delete;
    ~owned_trees() { kxacl::free_acltrees(trees, count); }
    kx_int32_t add(entry e) { return kxacl::sec__add_acle_to_trees(e.p(), &trees, &count); }
};

inline bytes build_acl(std::initializer_list<entry> entries) {
    owned_trees t;
    for (entry e : entries)
        EXPECT_EQ(t.add(e), SEC_S_OK) << e.id;
    owned_acl acl;
    EXPECT_EQ(kxacl::sec__acltrees_to_acl(t.trees, t.count, acl.get()), SEC_S_OK);
    return acl.contents();
}

// Every entry type, two user mechanisms, long and non-ASCII identifiers.
inline bytes rich_acl() {
    return build_acl({{SEC_ACLE_USER, 3, "unix", "bob@node1.cluster.example.com"},
                      {SEC_ACLE_GROUP, 1, "", "staff"},
                      {SEC_ACLE_EXPANDED, 7, "unix", "z*@node2"},
                      {SEC_ACLE_USER, 1, "krb5", "admin/node1.cluster.example.com@REALM"},
                      {SEC_ACLE_USER, 5, "unix", "Alice@node1.cluster.example.com"},
                      {SEC_ACLE_EXPANDED, 2, "unix", "a*@node3"},
                      {SEC_ACLE_GROUP, 4, "", "b\xc3\xb6rse"},
                      {SEC_ACLE_UNAUTHENTICATED, 1},
                      {SEC_ACLE_ANYOTHER, 0x1fff},
                      {SEC_ACLE_USER, 16, "unix", "carol@node1.cluster.example.com"}});
}

// A well-formed buffer as a host of the other byte order writes it.
inline bytes swapped_order(bytes b) {
    using namespace kxacl;
    b[2] = 1;
    std::size_t at = 5, count = load_u16(&b[3]);
    reverse_u16(&b[3]);
    for (std::size_t i = 0; i < count; ++i) {
        std::size_t next = at + load_u32(&b[at]), record = at + 10 + b[at + 9];
        for (std::uint32_t n = 0, entries = load_u32(&b[at + 5]); n < entries; ++n) {
            std::size_t id_length = load_u16(&b[record + 5]);
            reverse_u32(&b[record + 1]);
            reverse_u16(&b[record + 5]);
            record += 7 + id_length;
        }
        reverse_u32(&b[at]);
        reverse_u32(&b[at + 5]);
        at = next;
    }
    return b;
}

// Calls both allocation failure tests make through fail(n, call).
template <typename Fail> kx_int32_t create_failing(Fail fail, long n) {
    sec_acle_t made = reinterpret_cast<sec_acle_t>(1);
    kx_int32_t rc = fail(
        n, [&] { return sec_create_acle(SEC_ACLE_USER, 3, "unix", "bob@0:0:0:0:0:0:0:1", &made); });
    if (rc == SEC_S_OK)
        EXPECT_STREQ(made->id, "bob@::1");
    else
        EXPECT_EQ(made, nullptr);
    sec_release_acle(rc == SEC_S_OK ? made : nullptr);
    return rc;
}

// A listing of rich_acl() of one type, or all (0), fails with an empty list.
template <typename Fail> kx_int32_t list_failing(Fail fail, long n, unsigned char type) {
    owned_acl acl(rich_acl());
    owned_list list;
    kx_int32_t rc = fail(n, [&] {
        return type ? sec_list_acl_by_type(acl.get(), type, nullptr, list.get())
                    : sec_list_acl(acl.get(), list.get());
    });
    EXPECT_TRUE(rc == SEC_S_OK || (list.l.count == 0 && !list.l.acles));
    return rc;
}

inline error_record expect_error(kx_int32_t status, int msg) {
    error_record e = last_error();
    EXPECT_EQ(e.id, status);
    EXPECT_EQ(e.msg_num, msg);
    return e;
}
} // namespace kxtest

#endif
