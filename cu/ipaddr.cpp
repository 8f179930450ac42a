// Text form of IPv4 and IPv6 addresses. IPv6 follows RFC 5952 so that every
// address has exactly one text form, whatever the C library would print.
#include "cu_internal.h"

#include <sys/socket.h>

#include <cstring>

namespace kx::cu {
namespace {

// Writes text forms into a fixed buffer of CU_IPADDR_TEXT_MAX bytes.
class text_writer {
  public:
    void put(char c) noexcept { text_[size_++] = c; }

    void put_decimal(unsigned value) noexcept {
        if (value >= 100)
            put(static_cast<char>('0' + value / 100));
        if (value >= 10)
            put(static_cast<char>('0' + value / 10 % 10));
        put(static_cast<char>('0' + value % 10));
    }

    // Lowercase, without leading zeros.
    void put_hex(unsigned value) noexcept {
        static constexpr char hex_digits[] = "0123456789abcdef";
        bool started = false;
        for (int shift = 12; shift >= 0; shift -= 4) {
            const unsigned digit = (value >> shift) & 0xF;
            started = started || digit != 0 || shift == 0;
            if (started)
                put(hex_digits[digit]);
        }
    }

    void put_dotted_quad(const unsigned char *b) noexcept {
        for (int i = 0; i < 4; ++i) {
            if (i != 0)
                put('.');
            put_decimal(b[i]);
        }
    }

    // Copies the text with its NUL into dst when it fits in size bytes.
    int copy_to(char *dst, std::size_t size) noexcept {
        if (size_ >= size)
            return -1;
        std::memcpy(dst, text_, size_);
        dst[size_] = '\0';
        return 0;
    }

  private:
    char text_[CU_IPADDR_TEXT_MAX] = {};
    std::size_t size_ = 0;
};

struct zero_run {
    int start = -1;
    int length = 0;
};

// The first longest run of two or more zero groups; start -1 when none.
zero_run longest_zero_run(const unsigned (&groups)[8]) noexcept {
    zero_run best;
    for (int i = 0; i < 8;) {
        int end = i;
        while (end < 8 && groups[end] == 0)
            ++end;
        if (end - i >= 2 && end - i > best.length)
            best = {i, end - i};
        i = end == i ? i + 1 : end;
    }
    return best;
}

bool is_v4_mapped(const unsigned char *b) noexcept {
    static constexpr unsigned char v4_mapped[12] = {0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0xff, 0xff};
    return std::memcmp(b, v4_mapped, sizeof v4_mapped) == 0;
}

void write_ipv6(text_writer &out, const unsigned char *b) noexcept {
    if (is_v4_mapped(b)) {
        for (const char c : {':', ':', 'f', 'f', 'f', 'f', ':'})
            out.put(c);
        out.put_dotted_quad(b + 12);
        return;
    }
    unsigned groups[8];
    for (std::size_t i = 0; i < 8; ++i)
        groups[i] = static_cast<unsigned>(b[2 * i]) << 8 | b[2 * i + 1];
    const zero_run run = longest_zero_run(groups);
    for (int i = 0; i < 8; ++i) {
        if (i == run.start) {
            out.put(':');
            out.put(':');
            i += run.length - 1;
            continue;
        }
        if (i != 0 && i != run.start + run.length)
            out.put(':');
        out.put_hex(groups[i]);
    }
}

} // namespace
} // namespace kx::cu

using namespace kx::cu;

extern "C" {

CU_EXTERN int cu_ipaddr_ntop_1(int af, const void *addr, char *dst, size_t size) {
    if (addr == nullptr || dst == nullptr)
        return -1;
    const auto *bytes = static_cast<const unsigned char *>(addr);
    text_writer out;
    if (af == AF_INET)
        out.put_dotted_quad(bytes);
    else if (af == AF_INET6)
        write_ipv6(out, bytes);
    else
        return -1;
    return out.copy_to(dst, size);
}

} // extern "C"
