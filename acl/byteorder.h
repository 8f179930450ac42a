// Unaligned access to the multi-byte fields of ACL buffers. Every 16- and
// 32-bit field of a buffer is read and written through these helpers, in
// host order, or reversed in place when a buffer comes from a host of the
// other byte order; nothing casts a buffer pointer to a wider type.
#ifndef KXACL_BYTEORDER_H
#define KXACL_BYTEORDER_H

#include <cstdint>
#include <cstring>

namespace kxacl {

inline std::uint16_t load_u16(const unsigned char *p) {
    std::uint16_t v;
    std::memcpy(&v, p, sizeof v);
    return v;
}

inline std::uint32_t load_u32(const unsigned char *p) {
    std::uint32_t v;
    std::memcpy(&v, p, sizeof v);
    return v;
}

inline void store_u16(unsigned char *p, std::uint16_t v) {
    std::memcpy(p, &v, sizeof v);
}

inline void store_u32(unsigned char *p, std::uint32_t v) {
    std::memcpy(p, &v, sizeof v);
}

inline void reverse_u16(unsigned char *p) {
    store_u16(p, __builtin_bswap16(load_u16(p)));
}

inline void reverse_u32(unsigned char *p) {
    store_u32(p, __builtin_bswap32(load_u32(p)));
}

} // namespace kxacl

#endif
