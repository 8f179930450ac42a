/* Links a C99 program against the shared libraries and calls through them. */
#include <stdio.h>
#include <string.h>

#include <kx_acl.h>

int kx_all_headers_translate(const char *perms, kx_uint32_t *mask);

int main(void) {
    kx_uint32_t mask = 0;
    char text[33];
    if (kx_all_headers_translate("rw", &mask) != SEC_S_OK || mask != 0x3) {
        fprintf(stderr, "translate rw gave 0x%x\n", (unsigned)mask);
        return 1;
    }
    if (sec_translate_bitmask(0x83, NULL, text) != SEC_S_OK || strcmp(text, "rwe") != 0) {
        fprintf(stderr, "translate 0x83 gave %s\n", text);
        return 1;
    }
    if (strcmp(cu_mesgtbl_kxseclib_msg[0], "Reserved: DO NOT USE!") != 0)
        return 1;
    return 0;
}
