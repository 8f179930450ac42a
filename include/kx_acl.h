/**
 * @file kx_acl.h
 * The ACL library: ACL entries, ACL buffers, listing and editing, ACL files,
 * permission templates and permission evaluation.
 *
 * Conventions of every function here:
 * - A kx_int32_t result is a status (SEC_S_* of kx_sec.h); 0 is success.
 * - On failure the calling thread's error record (kx_cu.h) holds a message
 *   of the catalogue "kxseclib.cat", set 1, with its arguments; take it with
 *   cu_get_error_1 and format it with cu_get_errmsg_1.
 * - Most functions clear the thread's error record on entry, so after a
 *   success it is empty. Those that do not clear are marked "keeps the error
 *   record" below.
 * - Everything handed out is allocated with the malloc family and owned by
 *   the caller: ACL buffer bytes (sec_release_acl), entries
 *   (sec_release_acle), entry lists (sec_release_aclelist), texts (free).
 * - Functions may be called from any number of threads. An ACL buffer may be
 *   read (listed, evaluated, dumped) by many threads at once, but must not be
 *   read while it is edited, converted or released.
 * - Nothing throws and nothing aborts; an allocation failure is status
 *   SEC_S_NO_MEMORY with message 2650-102.
 */
#ifndef KX_ACL_H
#define KX_ACL_H

#include <stdio.h>

#include "kx.h"
#include "kx_sec.h"

#define ACL_EXTERN KX_EXPORT

KX_BEGIN_DECL

/* ------------------------------------------------------------------------ */
/* Records                                                                  */
/* ------------------------------------------------------------------------ */

/* Entry types: the same codes in sec_acle_s and in a sub-ACL's type byte. */
#define SEC_ACLE_UNAUTHENTICATED 1 /**< every unauthenticated requester, letter n */
#define SEC_ACLE_ANYOTHER 2        /**< every other authenticated requester, letter o */
#define SEC_ACLE_USER 4            /**< one user of a mechanism, letter u */
#define SEC_ACLE_EXPANDED 8        /**< an expanded identity of a mechanism, letter e */
#define SEC_ACLE_GROUP 16          /**< one group, letter g */

/** Longest mechanism mnemonic, in bytes, without its terminator. */
#define SEC_MECH_MAX 16

/** One ACL entry. */
typedef struct sec_acle_s {
    kx_uint32_t perm;            /**< permission mask */
    char mech[SEC_MECH_MAX + 1]; /**< mechanism of user and expanded entries, else "" */
    unsigned char type;          /**< one of SEC_ACLE_* */
    char *id;                    /**< identity of user, expanded and group entries, else NULL */
} sec_acle_desc, *sec_acle_t;

/** A list of entries, filled by the listing functions. */
typedef struct sec_acle_list_s {
    kx_int32_t count;  /**< number of entries */
    sec_acle_t *acles; /**< count entry pointers, or NULL when count is 0 */
} sec_acle_list_desc, *sec_acle_list_t;

/** A permission template: one permission bit and its character. */
typedef struct sec_perm_s {
    kx_uint32_t code;     /**< the permission's bit value */
    char printchar;       /**< its character in permission strings (case-sensitive) */
    char printstring[14]; /**< its name, NUL-terminated */
    char printhelp[64];   /**< one line of help, NUL-terminated */
} sec_perm_desc, *sec_perm_t;

/** A permission template set; a NULL set stands for the default set. */
typedef struct sec_perm_set_s {
    kx_int32_t count; /**< number of templates */
    sec_perm_t perms; /**< count consecutive templates */
} sec_perm_set_desc, *sec_perm_set_t;

/**
 * An identity handler of a mechanism: called as handler(requester identity,
 * entry identity); 0 when both denote the same client. Handlers of user
 * entries also order the two like a text comparison (negative: the
 * requester's identity sorts first). Called with no library lock held.
 */
typedef kx_int32_t (*sec_acl_id_handler)(char *id, char *acle_id);

/* Handler types of sec__register_id_handler. */
#define SEC_ID_HANDLER_EXPANDED 1 /**< compares expanded entries */
#define SEC_ID_HANDLER_USER 2     /**< compares user entries when asked with SEC_ACLE_HANDLER_BIT */

/** Added to the type of a user request: compare through the user handler. */
#define SEC_ACLE_HANDLER_BIT 0x80

/* Flags of sec_read_acl_file. */
#define SEC_F_ACL_TEXT 0x1    /**< compile the text file, ignoring the cached file */
#define SEC_F_ACL_CACHE 0x2   /**< write the compiled buffer to the cached file */
#define SEC_F_ACL_CONVERT 0x4 /**< validate or convert a buffer from the cached file */

/**
 * Largest ACL text file that sec_read_acl_file compiles, in bytes (64 MiB).
 * A larger one is refused with 2650-139 (SEC_S_FILE_ERROR), whose
 * arguments are 0 bytes read, the file's size and EFBIG. The text is read
 * through a small window, so compiling costs memory in proportion to the
 * entries, not to the file's size.
 */
#define SEC_ACL_TEXT_MAX_SIZE 0x4000000

/* ------------------------------------------------------------------------ */
/* Message catalogue                                                        */
/* ------------------------------------------------------------------------ */

/** Number of entries of the message table. */
#define KXSECLIB_MSG_COUNT 623

/**
 * Default texts of set 1 of the catalogue "kxseclib.cat", indexed by message
 * number. Entries of other components of the family are empty texts.
 */
ACL_EXTERN extern const char *const cu_mesgtbl_kxseclib_msg[KXSECLIB_MSG_COUNT];

/** Text for a message number that the table does not hold. */
ACL_EXTERN extern const char cu_badid_kxseclib_msg[];

/* ------------------------------------------------------------------------ */
/* Permissions                                                              */
/* ------------------------------------------------------------------------ */

/**
 * Translates a permission string into a mask, with permset or the default
 * set (13 templates: r w c x C q l e d v s a o for bits 0 to 12) when NULL.
 * *bitmask is set to 0 first; a NULL perms gives 0. Keeps the error record.
 * @return SEC_S_OK; SEC_S_BAD_PARAM (2650-101) for a NULL bitmask;
 *         SEC_S_BAD_PERMISSION (2650-146) for a character without template,
 *         with the bits of the characters before it left in *bitmask.
 */
ACL_EXTERN kx_int32_t sec_translate_perms(const char *perms, sec_perm_set_t permset,
                                          kx_uint32_t *bitmask) KX_NOTHROW;

/**
 * Writes the permission string of bitmask (one character per set bit, in
 * ascending bit order) into perms, which must hold one byte more than the
 * number of bits set (33 bytes always suffice). Keeps the error record.
 * @return SEC_S_OK; SEC_S_BAD_PARAM (2650-101) for a NULL perms;
 *         SEC_S_BAD_PERMISSION (2650-178) for a bit without template, when
 *         the contents of perms are undefined.
 */
ACL_EXTERN kx_int32_t sec_translate_bitmask(kx_uint32_t bitmask, sec_perm_set_t permset,
                                            char *perms) KX_NOTHROW;

/* ------------------------------------------------------------------------ */
/* Entries                                                                  */
/* ------------------------------------------------------------------------ */

/**
 * Creates an entry. mech (user and expanded entries, 1 to 16 bytes) and id
 * (user, expanded and group entries) are texts in the process codeset and
 * are stored in UTF-8; the other types ignore them. For the mechanisms
 * "unix" and "vgn2" an IPv6 host part after the '@' of the identity is
 * stored in its canonical text form (a user identity needs the '@').
 * @param[out] acle the new entry, released with sec_release_acle; NULL on failure.
 * @return SEC_S_OK, SEC_S_BAD_PARAM (2650-101), SEC_S_NO_MEMORY,
 *         SEC_S_CODESET_ERROR (2650-142, 2650-143), SEC_S_INTERNAL_ERROR.
 */
ACL_EXTERN kx_int32_t sec_create_acle(unsigned char type, kx_uint32_t perm, const char *mech,
                                      const char *id, sec_acle_t *acle) KX_NOTHROW;

/** Releases an entry and its identity. NULL is ignored. Keeps the error record.
 *  Returns nothing. */
ACL_EXTERN void sec_release_acle(sec_acle_t acle) KX_NOTHROW;

/**
 * Gives the entry's mechanism and identity as new texts in the process
 * codeset (released with free), or NULL where the entry has none.
 * Both outputs are NULL after any failure that follows the argument checks.
 * @return SEC_S_OK, SEC_S_BAD_PARAM (2650-101), SEC_S_BAD_ACLE (2650-107,
 *         2650-108), SEC_S_NO_MEMORY, SEC_S_CODESET_ERROR, SEC_S_INTERNAL_ERROR.
 */
ACL_EXTERN kx_int32_t sec_display_acle_id(sec_acle_t acle, char **mech, char **id) KX_NOTHROW;

/* ------------------------------------------------------------------------ */
/* ACL buffers                                                              */
/* ------------------------------------------------------------------------ */

/**
 * Makes acl own a new ACL without entries (5 bytes). Whatever acl held is
 * overwritten, not released. Records no trace points and keeps the error
 * record except on failure.
 * @return SEC_S_OK, SEC_S_BAD_PARAM, SEC_S_NO_MEMORY (acl->value NULL).
 */
ACL_EXTERN kx_int32_t sec_create_empty_acl(sec_acl_buffer_t acl) KX_NOTHROW;

/**
 * Makes acl own a copy of the length bytes at buffer, unchecked; follow with
 * sec_convert_acl_to_host to validate bytes from elsewhere.
 * @return SEC_S_OK, SEC_S_BAD_PARAM, SEC_S_NO_MEMORY (acl untouched).
 */
ACL_EXTERN kx_int32_t sec_read_acl_from_data(kx_int32_t length, unsigned char *buffer,
                                             sec_acl_buffer_t acl) KX_NOTHROW;

/**
 * Brings the buffer into host byte order in place; a buffer already in host
 * order is validated when verify is true.
 * @return SEC_S_OK, SEC_S_BAD_PARAM, SEC_S_BAD_ACL, SEC_S_BAD_ACLE. After a
 *         failed conversion the buffer's byte order is undefined: release it.
 */
ACL_EXTERN kx_int32_t sec_convert_acl_to_host(sec_boolean_t verify,
                                              sec_acl_buffer_t acl) KX_NOTHROW;

/**
 * Frees the buffer and leaves acl as the empty ACL. NULL and the empty ACL
 * are accepted.
 * @return SEC_S_OK, or SEC_S_BAD_ACL (2650-106) when the bytes are not an
 *         ACL buffer (nothing is then freed).
 */
ACL_EXTERN kx_int32_t sec_release_acl(sec_acl_buffer_t acl) KX_NOTHROW;

/* ------------------------------------------------------------------------ */
/* Listing and editing                                                      */
/* ------------------------------------------------------------------------ */

/**
 * Lists every entry of acl into aclelist (overwritten, not released): sub-ACL
 * by sub-ACL in buffer order; user and group entries in ascending identity
 * order, expanded entries in stored order. Identities are copied as stored.
 * @return SEC_S_OK; SEC_S_BAD_PARAM (2650-101); SEC_S_BAD_ACL (2650-109,
 *         2650-115, and 2650-110, 2650-111, 2650-123 for a corrupt buffer);
 *         SEC_S_NO_MEMORY. After a failure past the checks the list is empty.
 */
ACL_EXTERN kx_int32_t sec_list_acl(sec_acl_buffer_t acl, sec_acle_list_t aclelist) KX_NOTHROW;

/**
 * Lists the entries of one type; for user and expanded entries of mechanism
 * mech (case-insensitive), or of every mechanism when mech is NULL.
 * @return as sec_list_acl, and SEC_S_BAD_PARAM (2650-101) for an unknown
 *         type (position 2) or an empty or too long mech (position 3).
 */
ACL_EXTERN kx_int32_t sec_list_acl_by_type(sec_acl_buffer_t acl, unsigned char type, char *mech,
                                           sec_acle_list_t aclelist) KX_NOTHROW;

/** Releases every entry of the list and empties it; NULL is ignored. Keeps the
 *  error record. Returns nothing. */
ACL_EXTERN void sec_release_aclelist(sec_acle_list_t aclelist) KX_NOTHROW;

/**
 * Adds acle to acl; an entry of the same identity takes acle's mask. The
 * empty ACL is accepted. acl->value may move. On failure acl is unchanged.
 * @return SEC_S_OK; SEC_S_BAD_PARAM (2650-101); SEC_S_BAD_ACLE (2650-116
 *         unknown type, 2650-117 missing mechanism or identity);
 *         SEC_S_BAD_ACL (2650-113, 2650-114, 2650-115, 2650-110 and other
 *         messages of a corrupt buffer); SEC_S_NO_MEMORY; SEC_S_INTERNAL_ERROR.
 */
ACL_EXTERN kx_int32_t sec_add_acle_to_acl(sec_acle_t acle, sec_acl_buffer_t acl) KX_NOTHROW;

/**
 * As sec_add_acle_to_acl, but an entry of the same identity is a failure.
 * @return as sec_add_acle_to_acl, and SEC_S_BAD_ACLE (2650-157, 2650-174,
 *         2650-175) for an entry of the same identity.
 */
ACL_EXTERN kx_int32_t sec_add_acle_to_acl2(sec_acle_t acle, sec_acl_buffer_t acl) KX_NOTHROW;

/**
 * Deletes the entry of acle's identity (the mask is not compared); an emptied
 * sub-ACL is removed. acl->value may move.
 * @return SEC_S_OK; SEC_S_ACLE_NOT_FOUND (2650-118) when no entry has that
 *         identity; SEC_S_BAD_PARAM (2650-101); SEC_S_BAD_ACLE (2650-116,
 *         2650-117); SEC_S_BAD_ACL (2650-106 for the empty ACL, 2650-113,
 *         2650-114, 2650-115, corrupt buffers); SEC_S_NO_MEMORY.
 */
ACL_EXTERN kx_int32_t sec_del_acle_from_acl(sec_acle_t acle, sec_acl_buffer_t acl) KX_NOTHROW;

/* ------------------------------------------------------------------------ */
/* ACL files                                                                */
/* ------------------------------------------------------------------------ */

/**
 * Reads the ACL of an ACL file: from its cached compiled file (the path plus
 * ".cacl") when that is current, else by compiling the text.
 * @param filename  a path, or with username a simple name in the user's home
 * @param username  NULL, or the user who must own the file
 * @param permtmpl  the templates of the file's permissions; NULL for the default
 * @param flags     SEC_F_ACL_TEXT, SEC_F_ACL_CACHE, SEC_F_ACL_CONVERT
 * @param[out] acl  the ACL buffer (release with sec_release_acl); the empty
 *                  ACL when the file holds no entry or on failure
 * @param[out] rflags NULL, or the flags as the call ended: SEC_F_ACL_TEXT when
 *                  the text was compiled, SEC_F_ACL_CACHE only when the cached
 *                  file was written, SEC_F_ACL_CONVERT only when cached bytes
 *                  were validated; flags unchanged for an empty file
 * @return SEC_S_OK; SEC_S_BAD_PARAM (2650-101, 2650-134, 2650-165);
 *         SEC_S_USER_NOT_FOUND (2650-140); SEC_S_NO_ACL_FILE (2650-135,
 *         2650-166, 2650-167) for a name that leads to no regular file;
 *         SEC_S_BAD_PERMISSION (2650-141 owner or mode, 2650-180 permission
 *         of a line); SEC_S_FILE_ERROR (2650-135, 2650-137, 2650-139,
 *         2650-158); SEC_S_BAD_ACL (2650-144, 2650-145, 2650-172, 2650-173,
 *         2650-179) for a line that cannot be parsed; SEC_S_BAD_ACLE
 *         (2650-157, 2650-174, 2650-175) for duplicate entries;
 *         SEC_S_NO_MEMORY. A cached file that cannot be used or written is
 *         never a failure.
 */
ACL_EXTERN kx_int32_t sec_read_acl_file(const char *filename, const char *username,
                                        sec_perm_set_t permtmpl, kx_uint32_t flags,
                                        sec_buffer_t acl, kx_uint32_t *rflags) KX_NOTHROW;

/* ------------------------------------------------------------------------ */
/* Evaluation (for the family's security runtime)                           */
/* ------------------------------------------------------------------------ */

/**
 * Registers an identity handler of type SEC_ID_HANDLER_EXPANDED or
 * SEC_ID_HANDLER_USER for a mechanism (1 to 16 bytes). The first handler
 * registered for a type and mechanism (case-insensitive) is the one used;
 * a later one returns SEC_S_OK and is never used.
 * @return SEC_S_OK; SEC_S_BAD_PARAM (2650-101 with routine name
 *         "acl__register_id_handler", 2650-132 for an empty or too long
 *         mech); SEC_S_NO_MEMORY; SEC_S_INTERNAL_ERROR (2650-131).
 */
ACL_EXTERN kx_int32_t sec__register_id_handler(kx_uint32_t type, const char *mech,
                                               sec_acl_id_handler handler) KX_NOTHROW;

/**
 * The mask that acl grants to one unauthenticated, anyother, user or
 * expanded requester. type is an entry type, for user requests optionally
 * with SEC_ACLE_HANDLER_BIT; zmech, when not NULL, selects the sub-ACL in
 * place of mech. Allocates nothing on success with tracing off.
 * @return SEC_S_OK with the entry's mask in *perm (possibly 0);
 *         SEC_S_BAD_ACLE (2650-147) when no entry answers: no sub-ACL of the
 *         type, no matching entry, or no expanded handler registered;
 *         SEC_S_BAD_PARAM (2650-101, 2650-128, 2650-129, 2650-130);
 *         SEC_S_BAD_ACL (2650-109, also for the empty ACL; 2650-115, 2650-110,
 *         2650-122); SEC_S_INTERNAL_ERROR (2650-131).
 */
ACL_EXTERN kx_int32_t sec__single_acle_perm(sec_acl_buffer_t acl, unsigned char type, char *mech,
                                            char *zmech, char *id, kx_uint32_t *perm) KX_NOTHROW;

/**
 * The OR of the masks that acl's group entries grant to count group names
 * (groups[i].value, NUL-terminated; NULL names are skipped).
 * @return SEC_S_OK, also for count 0 (mask 0); SEC_S_BAD_ACLE (2650-147)
 *         when no group of a non-empty list has an entry; SEC_S_BAD_PARAM
 *         (2650-101); SEC_S_BAD_ACL (2650-109, also for the empty ACL;
 *         2650-115, 2650-110).
 */
ACL_EXTERN kx_int32_t sec__group_acles_perm(sec_acl_buffer_t acl, kx_int32_t count,
                                            sec_buffer_t groups, kx_uint32_t *perm) KX_NOTHROW;

/* ------------------------------------------------------------------------ */
/* Diagnostics                                                              */
/* ------------------------------------------------------------------------ */

/**
 * Prints acl in readable form on standard error, one catalogue message per
 * line. Clears the thread's error record after every line. Returns nothing.
 */
ACL_EXTERN void sec__dump_acl(sec_acl_buffer_t acl) KX_NOTHROW;

/**
 * Dumps acl as sec__dump_acl does, its lines to the stream lines and the
 * failure that ends a dump of a damaged buffer to the stream failures
 * instead; a NULL stream drops what would go to it. Flushes the stream after
 * every piece, so that one reader of both sees them in order.
 */
ACL_EXTERN void sec__dump_acl_to(sec_acl_buffer_t acl, FILE *lines, FILE *failures) KX_NOTHROW;

KX_END_DECL

#endif /* KX_ACL_H */
