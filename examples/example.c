/* Creates ACL entries and translates permissions with the ACL library,
 * printing what it gets back. Uses the public interface only. */
#include <stdio.h>
#include <stdlib.h>

#include <kx_acl.h>
#include <kx_cu.h>

/* Prints the thread's error message after a failed call. */
static void print_failure(const char *what, kx_int32_t status) {
    cu_error_t *err = NULL;
    char *msg = NULL;
    cu_get_error_1(&err);
    cu_get_errmsg_1(err, &msg);
    printf("%s failed with status %d:\n%s", what, (int)status, msg);
    cu_rel_errmsg_1(msg);
    cu_rel_error_1(err);
}

static void show_entry(unsigned char type, kx_uint32_t perm, const char *mech, const char *id) {
    sec_acle_t acle = NULL;
    char *shown_mech = NULL, *shown_id = NULL, perms[33];
    kx_int32_t rc = sec_create_acle(type, perm, mech, id, &acle);
    if (rc != SEC_S_OK) {
        print_failure("sec_create_acle", rc);
        return;
    }
    rc = sec_display_acle_id(acle, &shown_mech, &shown_id);
    if (rc == SEC_S_OK)
        rc = sec_translate_bitmask(acle->perm, NULL, perms);
    if (rc == SEC_S_OK)
        printf("entry type %u  mech %-6s  id %-24s  permissions %s\n", (unsigned)acle->type,
               shown_mech ? shown_mech : "-", shown_id ? shown_id : "-", perms);
    else
        print_failure("displaying the entry", rc);
    free(shown_mech);
    free(shown_id);
    sec_release_acle(acle);
}

int main(void) {
    kx_uint32_t mask = 0;
    kx_int32_t rc = sec_translate_perms("rwx", NULL, &mask);
    printf("permissions \"rwx\" are the mask 0x%08x (status %d)\n", (unsigned)mask, (int)rc);

    show_entry(SEC_ACLE_ANYOTHER, 0x1, NULL, NULL);
    show_entry(SEC_ACLE_USER, 0x3, "unix", "bob@host.example.com");
    show_entry(SEC_ACLE_EXPANDED, 0x2, "unix", "0:0:0:0:0:0:0:1");
    show_entry(SEC_ACLE_GROUP, 0x1f, NULL, "staff");

    /* A failure: 'z' is not a permission of the default templates. */
    rc = sec_translate_perms("rwz", NULL, &mask);
    if (rc != SEC_S_OK)
        print_failure("sec_translate_perms(\"rwz\")", rc);
    return 0;
}
