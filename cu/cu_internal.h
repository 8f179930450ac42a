/*
 * Private to libkx_cu: the placeholder grammar that the error record
 * functions and the message formatter share.
 *
 * The exported functions cannot be declared noexcept, as the C header
 * declares them without it; everything they call here is noexcept instead.
 */
#ifndef KX_CU_INTERNAL_H
#define KX_CU_INTERNAL_H

#include <cstddef>
#include <cstdint>

#include <kx_cu.h>

#include "unique_mem.h"

namespace kx::cu {

// Placeholder numbers run from 1 to this; larger ones are not placeholders.
inline constexpr unsigned max_args = 99;

// Widths and precisions above this are not placeholders: a hostile text must
// not make one placeholder expand into megabytes.
inline constexpr int max_field = 4096;

// The flag bits of a placeholder.
inline constexpr unsigned flag_minus = 1u << 0;
inline constexpr unsigned flag_plus = 1u << 1;
inline constexpr unsigned flag_space = 1u << 2;
inline constexpr unsigned flag_hash = 1u << 3;
inline constexpr unsigned flag_zero = 1u << 4;

enum class length_modifier : std::uint8_t { none, hh, h, l, ll, z, j, t, L };

// One conversion of a message text, such as "%2$-8.3lx".
struct placeholder {
    unsigned number = 0; // 1..max_args once resolved; 0 while unnumbered
    unsigned flags = 0;  // flag_* bits
    int width = -1;      // -1 when absent
    int precision = -1;  // -1 when absent
    length_modifier length = length_modifier::none;
    char conversion = 0;
    kx_int32_t kind = CU_ERROR_ARG_INT; // the CU_ERROR_ARG_* it formats
};

// A run of a message text: literal bytes, or one placeholder.
struct text_piece {
    const char *text = nullptr; // the bytes as they stand in the message
    std::size_t size = 0;
    bool is_placeholder = false;
    placeholder ph; // valid when is_placeholder; number resolved
};

// Splits a message text into pieces. "%%" comes out as a literal "%";
// anything after a '%' that is not a placeholder stays literal text.
// Unnumbered placeholders are numbered 1, 2, ... in the order they appear.
class placeholder_scanner {
  public:
    explicit placeholder_scanner(const char *text) noexcept : next_(text) {}

    // Fills piece with the next run; false at the end of the text.
    bool next(text_piece &piece) noexcept;

  private:
    const char *next_;
    unsigned unnumbered_ = 0;
};

} // namespace kx::cu

#endif // KX_CU_INTERNAL_H
