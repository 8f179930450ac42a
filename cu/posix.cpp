// Case handling of the POSIX locale: only A..Z fold, whatever the process
// locale says. Permission evaluation compares names with these on every
// request, so they stay plain loops with no table or locale look-up.
#include "cu_internal.h"
#include "posix_case.h"

using kx::posix_case::fold;

namespace {

// A NULL text sorts before every other text, so a caller's missing name
// compares unequal instead of crashing the process.
int compare_nulls(const char *s1, const char *s2) noexcept {
    return s1 == s2 ? 0 : s1 == nullptr ? -1 : 1;
}

} // namespace

extern "C" {

CU_EXTERN int cu_tolower_posix_1(int c) {
    return c >= 'A' && c <= 'Z' ? c + ('a' - 'A') : c;
}

CU_EXTERN int cu_strcasecmp_posix_1(const char *s1, const char *s2) {
    if (s1 == nullptr || s2 == nullptr) [[unlikely]]
        return compare_nulls(s1, s2);
    const auto *a = reinterpret_cast<const unsigned char *>(s1);
    const auto *b = reinterpret_cast<const unsigned char *>(s2);
    for (;; ++a, ++b) {
        const unsigned char ca = fold(*a);
        const unsigned char cb = fold(*b);
        if (ca != cb || ca == '\0')
            return ca - cb;
    }
}

CU_EXTERN int cu_strncasecmp_posix_1(const char *s1, const char *s2, size_t n) {
    if ((s1 == nullptr || s2 == nullptr) && n != 0) [[unlikely]]
        return compare_nulls(s1, s2);
    const auto *a = reinterpret_cast<const unsigned char *>(s1);
    const auto *b = reinterpret_cast<const unsigned char *>(s2);
    for (; n != 0; --n, ++a, ++b) {
        const unsigned char ca = fold(*a);
        const unsigned char cb = fold(*b);
        if (ca != cb || ca == '\0')
            return ca - cb;
    }
    return 0;
}

} // extern "C"
