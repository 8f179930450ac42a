/*
 * Private to libkx_cu: the placeholder grammar that the error record
 * functions and the message formatter share, and small helpers.
 *
 * The exported functions cannot be declared noexcept, as the C header
 * declares them without it; everything they call here is noexcept instead.
 */
#ifndef KX_CU_INTERNAL_H
#define KX_CU_INTERNAL_H

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <memory>

#include <kx_cu.h>

namespace kx::cu {

// Placeholder numbers run from 1 to this; larger ones are not placeholders.
inline constexpr unsigned kMaxArgs = 99;

// Widths and precisions above this are not placeholders: a hostile text must
// not make one placeholder expand into megabytes.
inline constexpr int kMaxField = 4096;

enum FlagBits : unsigned {
    kFlagMinus = 1u << 0,
    kFlagPlus = 1u << 1,
    kFlagSpace = 1u << 2,
    kFlagHash = 1u << 3,
    kFlagZero = 1u << 4,
};

enum class Length : std::uint8_t { none, hh, h, l, ll, z, j, t, L };

// One conversion of a message text, such as "%2$-8.3lx".
struct Placeholder {
    unsigned number = 0; // 1..kMaxArgs once resolved; 0 while unnumbered
    unsigned flags = 0;  // FlagBits
    int width = -1;      // -1 when absent
    int precision = -1;  // -1 when absent
    Length length = Length::none;
    char conversion = 0;
    kx_int32_t kind = CU_ERROR_ARG_INT; // the CU_ERROR_ARG_* it formats
};

// A run of a message text: literal bytes, or one placeholder.
struct Piece {
    const char *text = nullptr; // the bytes as they stand in the message
    std::size_t size = 0;
    bool is_placeholder = false;
    Placeholder ph; // valid when is_placeholder; number resolved
};

// Splits a message text into pieces. "%%" comes out as a literal "%";
// anything after a '%' that is not a placeholder stays literal text.
// Unnumbered placeholders are numbered 1, 2, ... in the order they appear.
class PlaceholderScanner {
  public:
    explicit PlaceholderScanner(const char *text) noexcept : next_(text) {}

    // Fills piece with the next run; false at the end of the text.
    bool next(Piece &piece) noexcept;

  private:
    const char *next_;
    unsigned unnumbered_ = 0;
};

struct FreeDeleter {
    void operator()(void *p) const noexcept { std::free(p); }
};
template <typename T> using MallocPtr = std::unique_ptr<T, FreeDeleter>;

} // namespace kx::cu

#endif // KX_CU_INTERNAL_H
