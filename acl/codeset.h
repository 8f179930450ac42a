// Conversion of texts between the process codeset and UTF-8, through one
// converter per direction that is set up on first use and kept for the life
// of the process.
#ifndef KXACL_CODESET_H
#define KXACL_CODESET_H

#include <cstddef>

#include <kx.h>

namespace kxacl {

// Converts local_string (local_length bytes, its NUL included) into a new
// UTF-8 text at *utf8_string (freed with free) of *utf8_length bytes.
// Returns a status; on failure nothing is handed over.
kx_int32_t acl__convert_to_utf8(const char *local_string, std::size_t *local_length,
                                char **utf8_string, std::size_t *utf8_length);

// The same from UTF-8 into the process codeset.
kx_int32_t acl__convert_from_utf8(const char *utf8_string, std::size_t *utf8_length,
                                  char **local_string, std::size_t *local_length);

} // namespace kxacl

#endif
