/* A program built against an installed tree: translates permissions, shows
 * the first line of a failure's message, and checks that the catalogue is
 * found where NLSPATH points and holds that message's text. */
#include <nl_types.h>
#include <stdio.h>
#include <string.h>

#include <kx_acl.h>
#include <kx_cu.h>

int main(void) {
    kx_uint32_t mask = 0;
    cu_error_t *err = NULL;
    char *msg = NULL;
    if (sec_translate_perms("rwx", NULL, &mask) != SEC_S_OK)
        return 1;
    printf("rwx 0x%x\n", (unsigned)mask);
    printf("rwz %d\n", (int)sec_translate_perms("rwz", NULL, &mask));
    cu_get_error_1(&err);
    cu_get_errmsg_1(err, &msg);
    printf("%.*s\n", (int)strcspn(msg, "\n"), msg);

    nl_catd catalogue = catopen(err->cu_msg_cat, NL_CAT_LOCALE);
    const char *text = catalogue == (nl_catd)-1
                           ? NULL
                           : catgets(catalogue, err->cu_msg_set, err->cu_msg_num, NULL);
    int same = text != NULL && strcmp(text, cu_mesgtbl_kxseclib_msg[err->cu_msg_num]) == 0;
    printf("catalogue %s\n", same ? "holds it" : "lacks it");
    if (catalogue != (nl_catd)-1)
        catclose(catalogue);
    cu_rel_errmsg_1(msg);
    cu_rel_error_1(err);
    return 0;
}
