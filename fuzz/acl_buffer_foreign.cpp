// Fuzz target: arbitrary bytes as an ACL buffer marked as written by a host
// of the other byte order. The readers and edits must refuse it as it is;
// a conversion that succeeds gives host-order bytes that everything must
// then take as in the host-order target; and a valid buffer turned into the
// other order by hand must convert back to exactly its bytes.
#include "acl_exercise.h"

#include "byteorder.h"

namespace {

using kxfuzz::owned_acl;

constexpr unsigned char host_mark = 2, other_mark = 1;

// The bytes of a validated host-order buffer as the other byte order
// writes them, walked by its host-order counts and lengths.
std::vector<unsigned char> other_order(std::vector<unsigned char> b) {
    using namespace kxacl;
    unsigned count = load_u16(&b[3]);
    reverse_u16(&b[3]);
    std::size_t offset = 5;
    for (unsigned i = 0; i < count; ++i) {
        std::size_t next = offset + load_u32(&b[offset]);
        std::uint32_t entries = load_u32(&b[offset + 5]);
        reverse_u32(&b[offset]);
        reverse_u32(&b[offset + 5]);
        std::size_t record = offset + 10 + b[offset + 9];
        for (std::uint32_t n = 0; n < entries; ++n) {
            std::size_t id_length = load_u16(&b[record + 5]);
            reverse_u32(&b[record + 1]);
            reverse_u16(&b[record + 5]);
            record += 7 + id_length;
        }
        offset = next;
    }
    b[2] = other_mark;
    return b;
}

void convert_back_and_forth(std::vector<unsigned char> host) {
    host[2] = host_mark;
    owned_acl valid(host.data(), host.size());
    if (!kxfuzz::validates(valid.d))
        return;
    std::vector<unsigned char> other = other_order(host);
    owned_acl converted(other.data(), other.size());
    kx_int32_t rc = kxfuzz::checked(sec_convert_acl_to_host(1, &converted.d), "convert back");
    kxfuzz::expect(rc == SEC_S_OK, "a valid buffer in the other order does not convert", rc);
    kxfuzz::expect(converted.contents() == host, "conversion did not restore the bytes");
}

} // namespace

extern "C" int LLVMFuzzerInitialize(int *, char ***) {
    kxfuzz::prepare_process();
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
    kxfuzz::trace_levels_for(size);
    std::vector<unsigned char> bytes(data, data + size);
    if (size > 2 && bytes[2] == host_mark)
        bytes[2] = other_mark;

    // As it is, every reader and edit must refuse it, leaving it untouched.
    owned_acl foreign(bytes.data(), size);
    std::vector<kxfuzz::listed> all = kxfuzz::list_everything(&foreign.d, false);
    if (size > 0) {
        kxfuzz::owned_list list;
        kx_int32_t rc = kxfuzz::checked(sec_list_acl(&foreign.d, &list.l), "sec_list_acl");
        kxfuzz::expect(rc == SEC_S_BAD_ACL, "a buffer of the other order was listed", rc);
    }
    kxfuzz::evaluate(&foreign.d, all);
    kxfuzz::dump(&foreign.d);
    kxfuzz::edit(foreign.d, false, all);

    for (sec_boolean_t verify : {0u, 1u}) {
        owned_acl converted(bytes.data(), size);
        kx_int32_t rc =
            kxfuzz::checked(sec_convert_acl_to_host(verify, &converted.d), "convert to host");
        if (rc == SEC_S_OK && size > 2 && verify == 0) {
            kxfuzz::expect(converted.contents()[2] == host_mark, "converted without the host mark");
            std::vector<unsigned char> host = converted.contents();
            kxfuzz::exercise_host_order(host.data(), host.size());
        }
    }
    if (size >= 5)
        convert_back_and_forth(std::vector<unsigned char>(data, data + size));
    return 0;
}
