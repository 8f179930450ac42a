// Case folding of the POSIX locale, whatever the process locale says: only
// the letters A..Z fold, to a..z; every other byte stands for itself, and
// texts order by their folded bytes taken as unsigned. libkx_cu's exported
// comparisons are built on this header; libkx_acl includes it too, so that
// its hot paths (evaluation, compiling ACL files) compare exactly as
// cu_strcasecmp_posix_1 does without a call per identifier, and eight
// bytes at a time where the lengths are known.
#ifndef KX_CU_POSIX_CASE_H
#define KX_CU_POSIX_CASE_H

#include <bit>
#include <cstddef>
#include <cstdint>
#include <cstring>

namespace kx::posix_case {

constexpr unsigned char fold(unsigned char c) noexcept {
    return static_cast<unsigned char>(static_cast<unsigned>(c - 'A') < 26u ? c + ('a' - 'A') : c);
}

namespace detail {

inline constexpr std::uint64_t ones = 0x0101010101010101ull;
inline constexpr std::uint64_t highs = 0x8080808080808080ull;

// Eight bytes, the first in the lowest bits.
inline std::uint64_t load8(const char *p) noexcept {
    std::uint64_t w;
    std::memcpy(&w, p, sizeof w);
    if constexpr (std::endian::native == std::endian::big)
        w = __builtin_bswap64(w);
    return w;
}

// fold() on each byte of w. Bytes with the high bit set are left alone; for
// the others, adding to the low seven bits sets bit 7 from 'A' on and from
// past 'Z' on, and never carries into the next byte.
constexpr std::uint64_t fold8(std::uint64_t w) noexcept {
    std::uint64_t low = w & ~highs;
    std::uint64_t from_a = low + (0x80 - 'A') * ones;
    std::uint64_t past_z = low + (0x80 - 'Z' - 1) * ones;
    std::uint64_t upper = from_a & ~past_z & ~w & highs;
    return w | (upper >> 2); // 0x80 >> 2 is the case bit 0x20
}

// Bit 7 set in the byte of every NUL of w. Bytes above the first NUL may be
// marked wrongly (a borrow), so only the lowest mark is exact.
constexpr std::uint64_t nul_marks(std::uint64_t w) noexcept {
    return (w - ones) & ~w & highs;
}

constexpr int byte_at(std::uint64_t w, int index) noexcept {
    return static_cast<int>((w >> (8 * index)) & 0xff);
}

// The comparison's result from two folded words of a and b that have a
// difference or a NUL of a somewhere (stop != 0): the lowest such byte
// decides. A NUL of b where a has none is a difference too.
constexpr int decide(std::uint64_t fa, std::uint64_t fb, std::uint64_t stop) noexcept {
    int index = std::countr_zero(stop) / 8;
    return byte_at(fa, index) - byte_at(fb, index);
}

} // namespace detail

// Compares the texts a and b as cu_strcasecmp_posix_1 does, with the same
// result. a_avail and b_avail are the bytes that may be read at a and at b;
// each text must end with a NUL within them, and bytes after that NUL but
// within them may be read (and do not count).
inline int compare(const char *a, std::size_t a_avail, const char *b,
                   std::size_t b_avail) noexcept {
    using namespace detail;
    std::size_t i = 0;
    for (; a_avail - i >= 8 && b_avail - i >= 8; i += 8) {
        std::uint64_t fa = fold8(load8(a + i)), fb = fold8(load8(b + i));
        std::uint64_t stop = (fa ^ fb) | nul_marks(fa);
        if (stop)
            return decide(fa, fb, stop);
    }
    // Both texts end further on; each read below is at or before the
    // first NUL of both, so it stays within both bounds.
    for (;; ++i) {
        int ca = fold(static_cast<unsigned char>(a[i]));
        int cb = fold(static_cast<unsigned char>(b[i]));
        if (ca != cb || ca == 0)
            return ca - cb;
    }
}

// The first eight folded bytes of a text of size bytes (its NUL included),
// with zeros after its NUL, as a number that orders like the texts: keys
// that differ order two texts as compare() does, and equal keys of a text
// that ends within them mean equal texts.
inline std::uint64_t sort_key(const char *text, std::size_t size) noexcept {
    // The first byte lowest, as load8 gives it; a shorter text is put
    // together byte by byte, so that nothing past its end is read.
    std::uint64_t head = 0;
    if (size >= 8)
        head = detail::load8(text);
    else
        for (std::size_t i = 0; i < size; ++i)
            head |= std::uint64_t{static_cast<unsigned char>(text[i])} << (8 * i);
    // In a key the first byte must weigh most.
    return __builtin_bswap64(detail::fold8(head));
}

// A hash of a text of size bytes (its NUL included, none before it) that
// texts comparing equal share: it mixes their folded bytes.
inline std::uint64_t folded_hash(const char *text, std::size_t size) noexcept {
    constexpr std::uint64_t odd = 0x9e3779b97f4a7c15ull;
    std::uint64_t h = size * odd;
    std::size_t i = 0;
    for (; size - i >= 8; i += 8)
        h = (std::rotl(h, 23) ^ detail::fold8(detail::load8(text + i))) * odd;
    std::uint64_t tail = 0;
    for (std::size_t k = 0; i + k < size; ++k)
        tail |= std::uint64_t{static_cast<unsigned char>(text[i + k])} << (8 * k);
    h = (std::rotl(h, 23) ^ detail::fold8(tail)) * odd;
    return h ^ (h >> 29);
}

// A text folded once to be ordered against many others, as evaluation does
// with one requester and the entries of a sub-ACL: most comparisons are
// decided by its first eight bytes, taken as one number.
class prepared_text {
  public:
    // size: the text's length with its NUL.
    prepared_text(const char *text, std::size_t size) noexcept
        : text_(text), size_(size), key_(sort_key(text, size)), ends_in_key_(size <= 8),
          kept_(size < 8 ? ~std::uint64_t{0} >> (8 * (8 - size)) : ~std::uint64_t{0}) {}

    // Negative, zero or positive as the text sorts before, equal to or after
    // other: the sign of compare(text, size, other, other_avail).
    int order(const char *other, std::size_t other_avail) const noexcept {
        using namespace detail;
        if (other_avail < 8)
            return compare(text_, size_, other, other_avail);
        // Bytes of other past the text's own end do not count.
        std::uint64_t key = __builtin_bswap64(fold8(load8(other)) & kept_);
        if (key != key_)
            return key_ < key ? -1 : 1;
        if (ends_in_key_)
            return 0;
        // Eight equal bytes without NUL: both texts go on.
        return compare(text_ + 8, size_ - 8, other + 8, other_avail - 8);
    }

  private:
    const char *text_;
    std::size_t size_;
    std::uint64_t key_;
    bool ends_in_key_;
    std::uint64_t kept_; // the bytes of a word up to the text's NUL
};

} // namespace kx::posix_case

#endif
