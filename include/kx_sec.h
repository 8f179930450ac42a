/**
 * @file kx_sec.h
 * Security types and status codes shared by the family's security libraries.
 */
#ifndef KX_SEC_H
#define KX_SEC_H

#include "kx.h"

/** A truth value: 0 is false, any other value true. */
typedef kx_uint32_t sec_boolean_t;

/**
 * A counted block of bytes. An ACL buffer is a sec_buffer_s whose bytes have
 * the ACL buffer layout; length 0 with value NULL is the empty ACL.
 * In a group list for evaluation, value points to a NUL-terminated name and
 * length is not read.
 */
typedef struct sec_buffer_s {
    kx_int32_t length; /**< number of bytes at value */
    void *value;       /**< the bytes, from the malloc family when owned */
} sec_buffer_desc, *sec_buffer_t;

typedef struct sec_buffer_s sec_acl_buffer_desc;
typedef struct sec_buffer_s *sec_acl_buffer_t;

/* Status codes. The values are part of the interface and never change. */
#define SEC_S_OK 0              /**< success */
#define SEC_S_BAD_PARAM 4       /**< an argument is missing, empty or out of range */
#define SEC_S_NO_MEMORY 6       /**< a memory allocation failed */
#define SEC_S_USER_NOT_FOUND 15 /**< the user is not configured on this host */
#define SEC_S_ACLE_NOT_FOUND 18 /**< the entry to delete is not in the ACL */
#define SEC_S_INTERNAL_ERROR 23 /**< a lock failed or a callee returned the unexpected */
#define SEC_S_CODESET_ERROR 26  /**< a text could not be converted to or from UTF-8 */
#define SEC_S_BAD_PERMISSION 36 /**< a permission has no template, or wrong file owner/mode */
#define SEC_S_FILE_ERROR 37     /**< an ACL or cached ACL file cannot be used */
#define SEC_S_BAD_ACL 42        /**< an ACL buffer or ACL text line is not valid */
#define SEC_S_BAD_ACLE 43       /**< an ACL entry is not valid, duplicated or unmatched */
#define SEC_S_NO_ACL_FILE 105   /**< the ACL file name cannot be resolved */

#endif /* KX_SEC_H */
