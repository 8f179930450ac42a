/* How a daemon authorizes requests with the ACL library: read the ACL of a
 * resource from its ACL file (through the cached compiled file when that is
 * current), then ask what it grants to each requester. Public interface only.
 *
 *   kxacl_example [ACL-FILE]
 *
 * The default ACL file is resource.acl beside the program's sources when
 * CMake builds it, in the current folder otherwise.
 */
#include <stdio.h>
#include <stdlib.h>

#include <kx_acl.h>
#include <kx_cu.h>

#ifndef KXACL_EXAMPLE_ACL
#define KXACL_EXAMPLE_ACL "resource.acl"
#endif

/* Prints the thread's error message after a failed call. */
static void print_failure(const char *what, kx_int32_t status) {
    cu_error_t *err = NULL;
    char *msg = NULL;
    cu_get_error_1(&err);
    cu_get_errmsg_1(err, &msg);
    fprintf(stderr, "%s failed with status %d:\n%s", what, (int)status, msg ? msg : "");
    cu_rel_errmsg_1(msg);
    cu_rel_error_1(err);
}

/* Prints what the ACL grants to a user; a missing entry is status 43. */
static void authorize_user(sec_buffer_t acl, const char *mech, const char *id) {
    kx_uint32_t mask = 0;
    char perms[33] = "";
    kx_int32_t rc =
        sec__single_acle_perm(acl, SEC_ACLE_USER, (char *)mech, NULL, (char *)id, &mask);
    if (rc == SEC_S_BAD_ACLE) {
        printf("%-40s no entry\n", id);
        return;
    }
    if (rc == SEC_S_OK)
        rc = sec_translate_bitmask(mask, NULL, perms);
    if (rc != SEC_S_OK) {
        print_failure("authorizing a user", rc);
        return;
    }
    printf("%-40s %-14s (0x%08x)\n", id, perms, (unsigned)mask);
}

/* Prints what the ACL grants to a requester that belongs to these groups. */
static void authorize_groups(sec_buffer_t acl, const char *first, const char *second) {
    sec_buffer_desc groups[2] = {{0, (void *)first}, {0, (void *)second}};
    kx_uint32_t mask = 0;
    char perms[33] = "";
    kx_int32_t rc = sec__group_acles_perm(acl, 2, groups, &mask);
    if (rc == SEC_S_OK)
        rc = sec_translate_bitmask(mask, NULL, perms);
    if (rc == SEC_S_OK)
        printf("groups %s, %-24s %-14s (0x%08x)\n", first, second, perms, (unsigned)mask);
    else
        print_failure("authorizing groups", rc);
}

int main(int argc, char **argv) {
    const char *file = argc > 1 ? argv[1] : KXACL_EXAMPLE_ACL;
    sec_buffer_desc acl = {0, NULL};
    kx_uint32_t rflags = 0;
    kx_int32_t rc = sec_read_acl_file(file, NULL, NULL, SEC_F_ACL_CONVERT, &acl, &rflags);
    if (rc != SEC_S_OK) {
        print_failure("sec_read_acl_file", rc);
        return 1;
    }
    printf("%s: %d bytes, %s\n", file, (int)acl.length,
           (rflags & SEC_F_ACL_TEXT) ? "compiled from the text" : "from the cached file");

    authorize_user(&acl, "unix", "root@node2.cluster.example");
    authorize_user(&acl, "UNIX", "OpsBot@node1.cluster.example");
    authorize_user(&acl, "unix", "mallory@node9.cluster.example");
    authorize_groups(&acl, "auditors", "clusterops");

    sec_release_acl(&acl);
    return 0;
}
