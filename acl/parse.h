// The ACL text format and its line parser.
#ifndef KXACL_PARSE_H
#define KXACL_PARSE_H

#include <cstddef>

#include <kx_acl.h>

namespace kxacl {

// Longest line of an ACL file, counted with the character that ends it.
inline constexpr std::size_t max_line_length = 1096;

// LF, FF and CR each end one line; NUL ends the text.
inline bool ends_line(char c) {
    return c == '\n' || c == '\f' || c == '\r' || c == '\0';
}

// Consumes one line of the text at *tacl (a modifiable text followed by a
// NUL; *length counts the bytes from the cursor to that NUL, the NUL
// included; *lineno is the 1-based number of the line at the cursor) and
// fills acle from it. Identities of the entry point into the text.
// Returns 0 when the text is used up, 1 when a line was consumed (acle->type
// is 0 for a line without entry), or a failure status with the error record
// set and the cursor past the bad line.
kx_int32_t sec__read_acle_from_text(sec_perm_set_t permset, char **tacl, std::size_t *length,
                                    int *lineno, sec_acle_t acle);

// The bytes that the process locale counts as white space, where tokens
// end: asked of the locale once for a whole text rather than per byte.
class space_bytes {
  public:
    space_bytes();
    bool operator()(char c) const { return space_[static_cast<unsigned char>(c)]; }

  private:
    bool space_[256];
};

// sec__read_acle_from_text with the locale's white space already known,
// for a caller that reads a whole text line by line.
kx_int32_t read_acle_from_text(const space_bytes &spaces, sec_perm_set_t permset, char **tacl,
                               std::size_t *length, int *lineno, sec_acle_t acle);

} // namespace kxacl

#endif
