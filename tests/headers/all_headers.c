/* Every public header together, as a C99 consumer sees them. */
#include <kx.h>
#include <kx_sec.h>
#include <kx_cu.h>
#include <kx_tr.h>
#include <kx_acl.h>
#include <kx_acl_trace.h>

/* The record layouts C callers rely on. */
typedef char check_acle_mech[sizeof(((sec_acle_desc *)0)->mech) == 17 ? 1 : -1];
typedef char check_perm_name[sizeof(((sec_perm_desc *)0)->printstring) == 14 ? 1 : -1];
typedef char check_perm_help[sizeof(((sec_perm_desc *)0)->printhelp) == 64 ? 1 : -1];
typedef char check_status[SEC_S_NO_ACL_FILE == 105 ? 1 : -1];

int kx_all_headers_translate(const char *perms, kx_uint32_t *mask) {
    struct sec_acle_s tag_form;
    sec_acle_desc desc_form;
    sec_acle_t pointer_form = &desc_form;
    (void)tag_form;
    (void)pointer_form;
    return (int)sec_translate_perms(perms, (sec_perm_set_t)0, mask);
}
