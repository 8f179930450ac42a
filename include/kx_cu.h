/**
 * @file kx_cu.h
 * Common utilities of the family: the per-thread error record and its
 * message formatting, codeset converters, POSIX-locale case handling, the
 * text form of IPv6 addresses and a high-resolution time base.
 *
 * Every function here is safe to call from any number of threads at once.
 * No function of this library ever aborts on a failed allocation: the error
 * record functions fall back to static records and texts, documented below.
 */
#ifndef KX_CU_H
#define KX_CU_H

#include <stddef.h>
#include "kx.h"

#define CU_EXTERN KX_EXPORT

KX_BEGIN_DECL

/* ------------------------------------------------------------------------ */
/* Error records                                                            */
/* ------------------------------------------------------------------------ */

/* Kinds of a placeholder argument (cu_arg_type). */
#define CU_ERROR_ARG_INT 0
#define CU_ERROR_ARG_LONG 1
#define CU_ERROR_ARG_LONG_LONG 2
#define CU_ERROR_ARG_DOUBLE 3
#define CU_ERROR_ARG_RESERVED 4
#define CU_ERROR_ARG_CHAR_STR 5
#define CU_ERROR_ARG_VOID_PTR 6

/** One placeholder argument of an error record. */
typedef struct cu_error_arg_s {
    kx_int32_t cu_arg_type; /**< one of CU_ERROR_ARG_* */
    union {
        int cu_arg_int;
        long cu_arg_long;
        long long cu_arg_long_long;
        double cu_arg_double;
        char *cu_arg_char_str; /**< a copy owned by the record; never NULL */
        void *cu_arg_void_ptr;
    } cu_arg_value;
} cu_error_arg_t;

/** An error record: a catalogue message with its arguments. */
typedef struct cu_error_s {
    kx_int32_t cu_error_id;  /**< the failing status; 0 when no error is set */
    char *cu_ffdc_id;        /**< first-failure data capture id, or NULL */
    char *cu_msg_cat;        /**< message catalogue name, or NULL */
    kx_int32_t cu_msg_set;   /**< message set in the catalogue */
    kx_int32_t cu_msg_num;   /**< message number in the set */
    char *cu_msg_default;    /**< default (untranslated) message text, or NULL */
    kx_uint32_t cu_arg_cnt;  /**< number of elements of cu_args */
    cu_error_arg_t *cu_args; /**< placeholder arguments 1..cu_arg_cnt, or NULL */
} cu_error_t;

/**
 * Error id of the static record that cu_get_error_1 hands out when it cannot
 * allocate a copy of the thread's record, and that cu_set_error_1 leaves as
 * the thread's record when it cannot store the record it was given.
 */
#define CU_ERROR_ID_NO_MEMORY 6

/**
 * Replaces the calling thread's error record.
 *
 * The number and kinds of the variadic arguments are read from the
 * placeholders of msg_default (%N$d, %N$i, %N$c, %N$u, %N$x, %N$X, %N$o with
 * optional flags and width are int; an l or ll length modifier makes them
 * long or long long; %N$f, %N$e, %N$g are double; %N$s is a NUL-terminated
 * text, copied into the record (NULL is stored as "(null)"); %N$p a pointer).
 * Arguments are passed in the order of the placeholder numbers, 1 upwards; a
 * number that the text skips still takes one argument of int kind.
 * Placeholders without a number take the arguments in the order they appear.
 * All texts are copied; the caller keeps its own.
 *
 * @return 0 when the record was stored; CU_ERROR_ID_NO_MEMORY when memory ran
 *         out (the thread's record is then the static no-memory record).
 */
CU_EXTERN int cu_set_error_1(kx_int32_t error_id, const char *ffdc_id, const char *msg_cat,
                             kx_int32_t msg_set, kx_int32_t msg_num, const char *msg_default, ...);

/**
 * Hands out a copy of the calling thread's error record in *err; the caller
 * releases it with cu_rel_error_1. With no error set the copy has
 * cu_error_id 0, cu_arg_cnt 0 and NULL texts. When no memory is left for the
 * copy, *err points to a static record with cu_error_id CU_ERROR_ID_NO_MEMORY
 * (cu_rel_error_1 accepts it). Does nothing when err is NULL.
 */
CU_EXTERN void cu_get_error_1(cu_error_t **err);

/**
 * Formats the message of err into a new text *msg, released with
 * cu_rel_errmsg_1. The text is taken from the catalogue named by cu_msg_cat
 * (catopen/catgets with set cu_msg_set and number cu_msg_num) when it is
 * installed, else from cu_msg_default. Positional placeholders are replaced
 * by the record's arguments with their conversion, width and flags ("%%" is a
 * percent sign); a placeholder whose argument is missing, or whose conversion
 * does not suit the argument's kind, is copied as it stands, so a translated
 * catalogue can never make formatting read a wrong argument.
 * With err NULL or no text, *msg is an empty text. When memory runs out *msg
 * is a static text that cu_rel_errmsg_1 accepts. Does nothing when msg is NULL.
 */
CU_EXTERN void cu_get_errmsg_1(const cu_error_t *err, char **msg);

/** Releases a record from cu_get_error_1. NULL is ignored. */
CU_EXTERN void cu_rel_error_1(cu_error_t *err);

/** Releases a text from cu_get_errmsg_1. NULL is ignored. */
CU_EXTERN void cu_rel_errmsg_1(char *msg);

/** Clears the calling thread's error record. Never allocates. */
CU_EXTERN void cu_set_no_error_1(void);

/**
 * Makes a copy of err the calling thread's record; err NULL, or a record with
 * cu_error_id 0, clears it. Same memory rule as cu_set_error_1.
 * @return 0, or CU_ERROR_ID_NO_MEMORY as cu_set_error_1.
 */
CU_EXTERN int cu_pset_error_1(const cu_error_t *err);

/* ------------------------------------------------------------------------ */
/* Codeset conversion                                                       */
/* ------------------------------------------------------------------------ */

/** A converter between a codeset and UTF-8 (opaque). */
typedef struct cu_iconv_s *cu_iconv_t;

/* Open flags of cu_iconv_open_1. */
#define CU_ICONV_TO_UTF8 0x00       /**< convert from the named codeset to UTF-8 */
#define CU_ICONV_FROM_UTF8 0x01     /**< convert from UTF-8 to the named codeset */
#define CU_ICONV_UTF8_STANDARD 0x08 /**< UTF-8 is the standard, unmodified form: */
                                    /**< an encoded NUL (C0 80) is refused        */
#define CU_ICONV_UTF8_BMP_ONLY 0x20 /**< refuse characters beyond U+FFFF in UTF-8 */

/* Result codes of the converter functions. */
#define CU_ICONV_OK 0
#define CU_ICONV_NO_MEMORY 15     /**< the output could not be allocated */
#define CU_ICONV_BAD_SEQUENCE 16  /**< the input holds an invalid byte sequence */
#define CU_ICONV_BAD_ARGUMENT 17  /**< an argument is NULL or out of range */
#define CU_ICONV_INCOMPLETE 18    /**< the input ends inside a character */
#define CU_ICONV_NOT_SUPPORTED 19 /**< the codeset is unknown to the system */
#define CU_ICONV_INTERNAL 20      /**< the system converter failed unexpectedly */
#define CU_ICONV_UNMAPPABLE 21    /**< a character has no form in the target */

/**
 * Opens a converter between codeset (a name the system iconv knows, such as
 * "UTF-8" or "ISO-8859-1") and UTF-8, in the direction that flags select.
 * On success *handle is the new converter, kept for the life of the process
 * or released with cu_iconv_close_1; on failure *handle is NULL.
 * @return CU_ICONV_OK, CU_ICONV_BAD_ARGUMENT, CU_ICONV_NOT_SUPPORTED or
 *         CU_ICONV_NO_MEMORY.
 */
CU_EXTERN int cu_iconv_open_1(const char *codeset, kx_uint32_t flags, cu_iconv_t *handle);

/** Releases a converter. NULL is ignored. */
CU_EXTERN void cu_iconv_close_1(cu_iconv_t handle);

/**
 * Converts *in_length bytes at in into a new text. in_length counts a
 * terminating NUL when the input has one, and the output then ends in one too.
 * On success *out is the new text (malloc family; the caller frees it) and
 * *out_length its length in bytes, counted the same way. On failure *out and
 * *out_length are left as they were. flags is reserved and must be 0.
 * One handle may be used by any number of threads at once.
 * @return CU_ICONV_OK or one of the CU_ICONV_* failure codes.
 */
CU_EXTERN int cu_iconv_str_1(cu_iconv_t handle, kx_uint32_t flags, const char *in,
                             size_t *in_length, char **out, size_t *out_length);

/**
 * Settings of the process, read once from the environment on first use:
 * KX_CU_UTF8_ASSUMED, KX_CU_UTF8_STANDARD and KX_CU_UTF8_BMP_ONLY are true
 * when set to "1", "yes" or "true".
 */
/** True when the process codeset is to be taken as UTF-8, whatever the locale. */
CU_EXTERN int cu_utf8_is_assumed_1(void);
/** True when UTF-8 is to be the standard form (CU_ICONV_UTF8_STANDARD). */
CU_EXTERN int cu_utf8_is_not_modified_1(void);
/** True when UTF-8 is limited to the basic multilingual plane. */
CU_EXTERN int cu_utf8_is_limited_to_bmp_1(void);

/* ------------------------------------------------------------------------ */
/* POSIX-locale case handling                                               */
/* ------------------------------------------------------------------------ */

/** Lowercases c when it is one of A..Z; any other value is returned as is. */
CU_EXTERN int cu_tolower_posix_1(int c);

/**
 * Compares two NUL-terminated texts byte by byte as unsigned characters,
 * with only A..Z folded to a..z (whatever the process locale).
 * @return negative, 0 or positive as s1 sorts before, equal to or after s2.
 */
CU_EXTERN int cu_strcasecmp_posix_1(const char *s1, const char *s2);

/** As cu_strcasecmp_posix_1, over at most n bytes. */
CU_EXTERN int cu_strncasecmp_posix_1(const char *s1, const char *s2, size_t n);

/* ------------------------------------------------------------------------ */
/* Addresses                                                                */
/* ------------------------------------------------------------------------ */

/** Size of a buffer that holds any text from cu_ipaddr_ntop_1. */
#define CU_IPADDR_TEXT_MAX 46

/**
 * Writes the canonical text form of an address: for AF_INET the dotted
 * quad; for AF_INET6 the form of RFC 5952 (lowercase hexadecimal without
 * leading zeros, the longest run of two or more zero groups, the first of
 * equal runs, written as "::", and IPv4-mapped addresses as ::ffff:a.b.c.d),
 * so every address has exactly one text form.
 * @return 0, or -1 when af is unknown, an argument is NULL or size is too
 *         small (nothing is then written beyond size bytes).
 */
CU_EXTERN int cu_ipaddr_ntop_1(int af, const void *addr, char *dst, size_t size);

/* ------------------------------------------------------------------------ */
/* Time base                                                                */
/* ------------------------------------------------------------------------ */

/** What cu_cvt_time_1 needs to turn counter values into time. */
typedef struct cu_timeinfo_s {
    kx_uint64_t timeinfo1; /**< counter ticks per second */
    kx_uint64_t timeinfo2; /**< reserved, 0 */
} cu_timeinfo_t;

/** Fills *info with the time base of cu_get_ctr_1. NULL is ignored. */
CU_EXTERN void cu_get_procspeed_1(cu_timeinfo_t *info);

/** Reads the high-resolution counter: monotonic, one tick per nanosecond. */
CU_EXTERN kx_uint64_t cu_get_ctr_1(void);

/**
 * Converts a counter value into seconds and nanoseconds (0..999999999) since
 * the counter's origin, with the time base of cu_get_procspeed_1.
 * NULL outputs are ignored; a NULL or zero time base gives 0 and 0.
 */
CU_EXTERN void cu_cvt_time_1(kx_uint64_t counter, const cu_timeinfo_t *info, kx_int64_t *seconds,
                             kx_int64_t *nanoseconds);

KX_END_DECL

#endif /* KX_CU_H */
