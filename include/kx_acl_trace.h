/**
 * @file kx_acl_trace.h
 * The trace points of the ACL library: one table that the library's trace
 * calls are checked against when it is built, and that decoders of the
 * trace file (kxacl trace) read, so that the two cannot drift apart.
 *
 * The library traces under the component KX_ACL_TRACE_COMPONENT ("_SEL")
 * of libkx_tr (kx_tr.h), with five categories, each with its own level of
 * detail (KX_TRACE_LEVELS, e.g. "_SEL:API=8,Perf=2"). A record is a trace
 * id and data items, each item the bytes of one value in the memory order
 * of the host that wrote it: a text with its terminating NUL, a number in
 * 1, 4 or 8 bytes, a pointer as its 8-byte address.
 *
 * The table is a list macro, usable from C and C++ alike:
 *
 *   KX_ACL_TRACE_POINTS(POINT, ITEM)
 *
 * expands POINT(row, id, category, level, rule, where, event, items) once
 * per point, where
 * - row is the point's name as an identifier (KX_ACL_TP_<row> below),
 * - id the trace id it is recorded with; one id may have several rows when
 *   it is recorded with different items on different paths,
 * - category a kx_acl_trace_category, level and rule (kx_acl_trace_rule)
 *   the category's levels at which it is recorded,
 * - where the exported function, or the step of the library (read: the
 *   file reader, cache: the cached file's writer, parse, tree, trace), and
 *   event what happened there, both texts,
 * - items a sequence of ITEM(kind, name), kind a kx_acl_trace_item_kind and
 *   name a text, one per data item in recorded order (at most
 *   KX_ACL_TRACE_MAX_ITEMS); empty for a bare id. The sequence passes
 *   through the arguments of other macros, so ITEM must expand to nothing
 *   with a comma outside parentheses: "+ item(kind, name)" will do, as the
 *   library's own uses show.
 *
 * Ids and their items never change meaning; new points take new ids.
 */
#ifndef KX_ACL_TRACE_H
#define KX_ACL_TRACE_H

/** The most items a point has. */
#define KX_ACL_TRACE_MAX_ITEMS 8

/** The component the library registers with libkx_tr. */
#define KX_ACL_TRACE_COMPONENT "_SEL"

/** The categories, in the order of their levels. */
typedef enum kx_acl_trace_category {
    KX_TRC_ERRORS = 0,
    KX_TRC_INFO = 1,
    KX_TRC_API = 2,
    KX_TRC_BUFFER = 3, /**< registered; no point records in it */
    KX_TRC_PERF = 4
} kx_acl_trace_category;

/** CATEGORY(category, name) for each category, in level order. */
#define KX_ACL_TRACE_CATEGORIES(CATEGORY)                                                          \
    CATEGORY(KX_TRC_ERRORS, "Errors")                                                              \
    CATEGORY(KX_TRC_INFO, "Info")                                                                  \
    CATEGORY(KX_TRC_API, "API")                                                                    \
    CATEGORY(KX_TRC_BUFFER, "Buffer")                                                              \
    CATEGORY(KX_TRC_PERF, "Perf")

/** When a point is recorded, given its category's level and the row's level. */
typedef enum kx_acl_trace_rule {
    KX_TRL_AT_LEAST = 0, /**< the category's level is the row's level or above */
    KX_TRL_EXACTLY = 1,  /**< the category's level is the row's level */
    KX_TRL_ANNOUNCED = 2 /**< the Perf level is one of 1, 2, 3, 4, 7 and 8 */
} kx_acl_trace_rule;

/** What one data item holds, and so its size in bytes. */
typedef enum kx_acl_trace_item_kind {
    KX_TRI_TEXT = 1,   /**< a text with its NUL; any length */
    KX_TRI_POINTER,    /**< an address (8) */
    KX_TRI_STATUS,     /**< a SEC_S_ status (4, signed) */
    KX_TRI_PERMS,      /**< a permission mask (4) */
    KX_TRI_TYPE,       /**< an entry type, SEC_ACLE_ (4) */
    KX_TRI_TYPE_BYTE,  /**< an entry type as the entry record holds it (1) */
    KX_TRI_FLAGS,      /**< flags of sec_read_acl_file, SEC_F_ (4) */
    KX_TRI_BOOL,       /**< a sec_boolean_t (4) */
    KX_TRI_INT,        /**< a count, length, line number or level (4, signed) */
    KX_TRI_ERRNO,      /**< a system error number (4) */
    KX_TRI_OWNER,      /**< a user or group id (4) */
    KX_TRI_MODE,       /**< a file mode (4) */
    KX_TRI_SIZE,       /**< a byte count of a file; -1 for a failed read (8, signed) */
    KX_TRI_TICKS,      /**< elapsed ticks of the time-base counter (8) */
    KX_TRI_SECONDS,    /**< elapsed whole seconds (8, signed) ... */
    KX_TRI_NANOSECONDS /**< ... and nanoseconds, always right after them (8, signed) */
} kx_acl_trace_item_kind;

/** The bytes of an item of a kind; 0 for a text, whose length varies. */
#define KX_ACL_TRACE_ITEM_SIZE(kind)                                                               \
    ((kind) == KX_TRI_TEXT          ? 0u                                                           \
     : (kind) == KX_TRI_POINTER     ? (unsigned)sizeof(void *)                                     \
     : (kind) == KX_TRI_TYPE_BYTE   ? 1u                                                           \
     : (kind) == KX_TRI_SIZE        ? 8u                                                           \
     : (kind) == KX_TRI_TICKS       ? 8u                                                           \
     : (kind) == KX_TRI_SECONDS     ? 8u                                                           \
     : (kind) == KX_TRI_NANOSECONDS ? 8u                                                           \
                                    : 4u)

/* The items that recur: an ACL descriptor's fields, an entry's, a time. */
#define KX_ACL_TRACE_ACL_FIELDS(ITEM) ITEM(KX_TRI_INT, "length") ITEM(KX_TRI_POINTER, "value")
#define KX_ACL_TRACE_ENTRY_FIELDS(ITEM, TYPE)                                                      \
    ITEM(TYPE, "type") ITEM(KX_TRI_PERMS, "perm") ITEM(KX_TRI_TEXT, "mech") ITEM(KX_TRI_TEXT, "i"  \
                                                                                              "d")
#define KX_ACL_TRACE_ELAPSED(ITEM)                                                                 \
    ITEM(KX_TRI_TICKS, "ticks")                                                                    \
    ITEM(KX_TRI_SECONDS, "seconds") ITEM(KX_TRI_NANOSECONDS, "nanoseconds")
#define KX_ACL_TRACE_STATUS(ITEM) ITEM(KX_TRI_STATUS, "status")

/* An exported function's five API points: bare entry and exit at level 1,
   entry with data, exit on failure and exit on success at level 8. */
#define KX_ACL_TRACE_API(POINT, ITEM, row, fn, entry, entry_data, exit, exit_fail, exit_ok,        \
                         entry_items, exit_ok_items)                                               \
    POINT(row##_ENTER, entry, KX_TRC_API, 1, KX_TRL_EXACTLY, fn, "enter", )                        \
    POINT(row##_ENTER_DATA, entry_data, KX_TRC_API, 8, KX_TRL_EXACTLY, fn, "enter", entry_items)   \
    POINT(row##_EXIT, exit, KX_TRC_API, 1, KX_TRL_EXACTLY, fn, "exit", )                           \
    POINT(row##_EXIT_FAIL, exit_fail, KX_TRC_API, 8, KX_TRL_EXACTLY, fn, "exit",                   \
          KX_ACL_TRACE_STATUS(ITEM))                                                               \
    POINT(row##_EXIT_OK, exit_ok, KX_TRC_API, 8, KX_TRL_EXACTLY, fn, "exit", exit_ok_items)

/* The same for a function with one exit data point on both outcomes. */
#define KX_ACL_TRACE_API_STATUS(POINT, ITEM, row, fn, entry, entry_data, exit, exit_data,          \
                                entry_items)                                                       \
    POINT(row##_ENTER, entry, KX_TRC_API, 1, KX_TRL_EXACTLY, fn, "enter", )                        \
    POINT(row##_ENTER_DATA, entry_data, KX_TRC_API, 8, KX_TRL_EXACTLY, fn, "enter", entry_items)   \
    POINT(row##_EXIT, exit, KX_TRC_API, 1, KX_TRL_EXACTLY, fn, "exit", )                           \
    POINT(row##_EXIT_DATA, exit_data, KX_TRC_API, 8, KX_TRL_EXACTLY, fn, "exit",                   \
          KX_ACL_TRACE_STATUS(ITEM))

/* The release functions: their exit is bare at every non-zero level. */
#define KX_ACL_TRACE_API_RELEASE(POINT, ITEM, row, fn, entry, entry_data, exit, entry_items)       \
    POINT(row##_ENTER, entry, KX_TRC_API, 1, KX_TRL_EXACTLY, fn, "enter", )                        \
    POINT(row##_ENTER_DATA, entry_data, KX_TRC_API, 8, KX_TRL_EXACTLY, fn, "enter", entry_items)   \
    POINT(row##_EXIT, exit, KX_TRC_API, 1, KX_TRL_AT_LEAST, fn, "exit", )

/** The trace points. */
#define KX_ACL_TRACE_POINTS(POINT, ITEM)                                                           \
    POINT(PERF_LEVEL, 0, KX_TRC_PERF, 1, KX_TRL_ANNOUNCED, "trace", "perf-level",                  \
          ITEM(KX_TRI_INT, "level"))                                                               \
    POINT(READ_RESOLVED, 1, KX_TRC_PERF, 1, KX_TRL_EXACTLY, "read", "resolved",                    \
          ITEM(KX_TRI_TEXT, "file") KX_ACL_TRACE_ELAPSED(ITEM))                                    \
    POINT(READ_LOADED, 2, KX_TRC_PERF, 1, KX_TRL_EXACTLY, "read", "loaded",                        \
          ITEM(KX_TRI_TEXT, "file") KX_ACL_TRACE_ELAPSED(ITEM))                                    \
    POINT(READ_COMPILED, 3, KX_TRC_PERF, 1, KX_TRL_EXACTLY, "read", "compiled",                    \
          ITEM(KX_TRI_TEXT, "file") ITEM(KX_TRI_INT, "line") KX_ACL_TRACE_ELAPSED(ITEM))           \
    POINT(READ_OPENED, 4, KX_TRC_PERF, 2, KX_TRL_EXACTLY, "read", "opened",                        \
          ITEM(KX_TRI_TEXT, "file") KX_ACL_TRACE_ELAPSED(ITEM))                                    \
    POINT(READ_BYTES, 6, KX_TRC_PERF, 2, KX_TRL_EXACTLY, "read", "bytes-read",                     \
          KX_ACL_TRACE_ELAPSED(ITEM))                                                              \
    POINT(SINGLE_ACLE_PERM_TIMED, 7, KX_TRC_PERF, 2, KX_TRL_EXACTLY, "sec__single_acle_perm",      \
          "timed",                                                                                 \
          ITEM(KX_TRI_INT, "searched") ITEM(KX_TRI_TYPE, "type") ITEM(KX_TRI_TEXT, "mech")         \
              ITEM(KX_TRI_TEXT, "id") KX_ACL_TRACE_ELAPSED(ITEM))                                  \
    POINT(GROUP_ACLES_PERM_TIMED, 8, KX_TRC_PERF, 2, KX_TRL_EXACTLY, "sec__group_acles_perm",      \
          "timed", KX_ACL_TRACE_ELAPSED(ITEM))                                                     \
    KX_ACL_TRACE_API(POINT, ITEM, READ_ACL_FILE, "sec_read_acl_file", 9, 11, 12, 13, 14,           \
                     ITEM(KX_TRI_TEXT, "file") ITEM(KX_TRI_TEXT, "user")                           \
                         ITEM(KX_TRI_POINTER, "templates") ITEM(KX_TRI_FLAGS, "flags")             \
                             ITEM(KX_TRI_POINTER, "acl"),                                          \
                     KX_ACL_TRACE_STATUS(ITEM) ITEM(KX_TRI_INT, "line"))                           \
    KX_ACL_TRACE_API_STATUS(                                                                       \
        POINT, ITEM, READ_ACL_FROM_DATA, "sec_read_acl_from_data", 15, 17, 18, 19,                 \
        ITEM(KX_TRI_INT, "length") ITEM(KX_TRI_POINTER, "buffer") ITEM(KX_TRI_POINTER, "acl"))     \
    KX_ACL_TRACE_API(POINT, ITEM, LIST_ACL, "sec_list_acl", 20, 24, 25, 26, 27,                    \
                     KX_ACL_TRACE_ACL_FIELDS(ITEM) ITEM(KX_TRI_POINTER, "list"),                   \
                     KX_ACL_TRACE_STATUS(ITEM) ITEM(KX_TRI_INT, "count"))                          \
    POINT(LIST_ACL_ENTER_NULL, 22, KX_TRC_API, 8, KX_TRL_EXACTLY, "sec_list_acl", "enter",         \
          ITEM(KX_TRI_POINTER, "acl") ITEM(KX_TRI_POINTER, "list"))                                \
    KX_ACL_TRACE_API(POINT, ITEM, LIST_ACL_BY_TYPE, "sec_list_acl_by_type", 28, 32, 33, 34, 35,    \
                     KX_ACL_TRACE_ACL_FIELDS(ITEM) ITEM(KX_TRI_TYPE, "type")                       \
                         ITEM(KX_TRI_TEXT, "mech") ITEM(KX_TRI_POINTER, "list"),                   \
                     KX_ACL_TRACE_STATUS(ITEM) ITEM(KX_TRI_INT, "count"))                          \
    POINT(LIST_ACL_BY_TYPE_ENTER_NULL, 30, KX_TRC_API, 8, KX_TRL_EXACTLY, "sec_list_acl_by_type",  \
          "enter",                                                                                 \
          ITEM(KX_TRI_POINTER, "acl") ITEM(KX_TRI_TYPE, "type") ITEM(KX_TRI_TEXT, "mech")          \
              ITEM(KX_TRI_POINTER, "list"))                                                        \
    KX_ACL_TRACE_API_RELEASE(POINT, ITEM, RELEASE_ACLELIST, "sec_release_aclelist", 36, 38, 39,    \
                             ITEM(KX_TRI_POINTER, "list") ITEM(KX_TRI_INT, "count"))               \
    KX_ACL_TRACE_API_STATUS(POINT, ITEM, CREATE_ACLE, "sec_create_acle", 40, 42, 43, 44,           \
                            KX_ACL_TRACE_ENTRY_FIELDS(ITEM, KX_TRI_TYPE)                           \
                                ITEM(KX_TRI_POINTER, "result"))                                    \
    KX_ACL_TRACE_API_RELEASE(POINT, ITEM, RELEASE_ACLE, "sec_release_acle", 45, 47, 48,            \
                             ITEM(KX_TRI_POINTER, "entry")                                         \
                                 KX_ACL_TRACE_ENTRY_FIELDS(ITEM, KX_TRI_TYPE_BYTE))                \
    KX_ACL_TRACE_API(POINT, ITEM, DISPLAY_ACLE_ID, "sec_display_acle_id", 49, 51, 52, 53, 54,      \
                     ITEM(KX_TRI_POINTER, "entry") KX_ACL_TRACE_ENTRY_FIELDS(ITEM, KX_TRI_TYPE)    \
                         ITEM(KX_TRI_POINTER, "mech_result") ITEM(KX_TRI_POINTER, "id_result"),    \
                     KX_ACL_TRACE_STATUS(ITEM) ITEM(KX_TRI_TEXT, "mech") ITEM(KX_TRI_TEXT, "id"))  \
    KX_ACL_TRACE_API_STATUS(                                                                       \
        POINT, ITEM, CONVERT_ACL_TO_HOST, "sec_convert_acl_to_host", 55, 57, 58, 59,               \
        ITEM(KX_TRI_BOOL, "verify") ITEM(KX_TRI_POINTER, "acl") KX_ACL_TRACE_ACL_FIELDS(ITEM))     \
    KX_ACL_TRACE_API_STATUS(POINT, ITEM, ADD_ACLE_TO_ACL, "sec_add_acle_to_acl", 60, 62, 63, 64,   \
                            ITEM(KX_TRI_POINTER, "entry")                                          \
                                KX_ACL_TRACE_ENTRY_FIELDS(ITEM, KX_TRI_TYPE)                       \
                                    ITEM(KX_TRI_POINTER, "acl") KX_ACL_TRACE_ACL_FIELDS(ITEM))     \
    KX_ACL_TRACE_API_STATUS(                                                                       \
        POINT, ITEM, DEL_ACLE_FROM_ACL, "sec_del_acle_from_acl", 65, 67, 68, 69,                   \
        ITEM(KX_TRI_POINTER, "entry") KX_ACL_TRACE_ENTRY_FIELDS(ITEM, KX_TRI_TYPE)                 \
            ITEM(KX_TRI_POINTER, "acl") KX_ACL_TRACE_ACL_FIELDS(ITEM))                             \
    KX_ACL_TRACE_API_RELEASE(POINT, ITEM, RELEASE_ACL, "sec_release_acl", 70, 72, 73,              \
                             ITEM(KX_TRI_POINTER, "acl") KX_ACL_TRACE_ACL_FIELDS(ITEM))            \
    KX_ACL_TRACE_API_STATUS(                                                                       \
        POINT, ITEM, REGISTER_ID_HANDLER, "sec__register_id_handler", 74, 76, 77, 78,              \
        ITEM(KX_TRI_TYPE, "type") ITEM(KX_TRI_TEXT, "mech") ITEM(KX_TRI_POINTER, "handler"))       \
    KX_ACL_TRACE_API(POINT, ITEM, SINGLE_ACLE_PERM, "sec__single_acle_perm", 79, 81, 82, 83, 84,   \
                     ITEM(KX_TRI_POINTER, "acl") KX_ACL_TRACE_ACL_FIELDS(ITEM)                     \
                         ITEM(KX_TRI_TYPE, "type") ITEM(KX_TRI_TEXT, "mech")                       \
                             ITEM(KX_TRI_TEXT, "id") ITEM(KX_TRI_POINTER, "result"),               \
                     KX_ACL_TRACE_STATUS(ITEM) ITEM(KX_TRI_PERMS, "perm"))                         \
    KX_ACL_TRACE_API(POINT, ITEM, GROUP_ACLES_PERM, "sec__group_acles_perm", 85, 87, 88, 89, 90,   \
                     ITEM(KX_TRI_POINTER, "acl") KX_ACL_TRACE_ACL_FIELDS(ITEM)                     \
                         ITEM(KX_TRI_INT, "count") ITEM(KX_TRI_POINTER, "groups")                  \
                             ITEM(KX_TRI_POINTER, "result"),                                       \
                     KX_ACL_TRACE_STATUS(ITEM) ITEM(KX_TRI_PERMS, "perm"))                         \
    KX_ACL_TRACE_API(POINT, ITEM, TRANSLATE_PERMS, "sec_translate_perms", 91, 93, 94, 95, 96,      \
                     ITEM(KX_TRI_TEXT, "perms") ITEM(KX_TRI_POINTER, "templates")                  \
                         ITEM(KX_TRI_POINTER, "result"),                                           \
                     KX_ACL_TRACE_STATUS(ITEM) ITEM(KX_TRI_PERMS, "mask"))                         \
    KX_ACL_TRACE_API(POINT, ITEM, TRANSLATE_BITMASK, "sec_translate_bitmask", 97, 99, 100, 101,    \
                     102,                                                                          \
                     ITEM(KX_TRI_PERMS, "mask") ITEM(KX_TRI_POINTER, "templates")                  \
                         ITEM(KX_TRI_POINTER, "result"),                                           \
                     KX_ACL_TRACE_STATUS(ITEM) ITEM(KX_TRI_TEXT, "perms"))                         \
    POINT(CONVERT_HOST_ORDER, 104, KX_TRC_INFO, 1, KX_TRL_AT_LEAST, "sec_convert_acl_to_host",     \
          "in-host-order", )                                                                       \
    POINT(CONVERT_SWAP, 106, KX_TRC_INFO, 1, KX_TRL_AT_LEAST, "sec_convert_acl_to_host",           \
          "byte-swap", )                                                                           \
    POINT(CACHE_NOT_WRITTEN, 107, KX_TRC_INFO, 1, KX_TRL_EXACTLY, "cache", "not-written",          \
          ITEM(KX_TRI_TEXT, "file"))                                                               \
    POINT(CACHE_NAME_TOO_LONG, 108, KX_TRC_ERRORS, 1, KX_TRL_AT_LEAST, "cache", "name-too-long",   \
          ITEM(KX_TRI_TEXT, "file") ITEM(KX_TRI_INT, "length"))                                    \
    POINT(CACHE_STAT_FAILED, 109, KX_TRC_ERRORS, 1, KX_TRL_AT_LEAST, "cache", "stat-failed",       \
          ITEM(KX_TRI_TEXT, "file") ITEM(KX_TRI_TEXT, "call") ITEM(KX_TRI_ERRNO, "errno"))         \
    POINT(CACHE_NEW_FILE, 110, KX_TRC_INFO, 1, KX_TRL_AT_LEAST, "cache", "new-file",               \
          ITEM(KX_TRI_TEXT, "cacl"))                                                               \
    POINT(CACHE_OWNER_DIFFERS, 111, KX_TRC_ERRORS, 1, KX_TRL_AT_LEAST, "cache", "owner-differs",   \
          ITEM(KX_TRI_TEXT, "cacl") ITEM(KX_TRI_OWNER, "acl_uid") ITEM(KX_TRI_OWNER, "acl_gid")    \
              ITEM(KX_TRI_OWNER, "cacl_uid") ITEM(KX_TRI_OWNER, "cacl_gid"))                       \
    POINT(CACHE_MODE_DIFFERS, 111, KX_TRC_ERRORS, 1, KX_TRL_AT_LEAST, "cache", "mode-differs",     \
          ITEM(KX_TRI_TEXT, "cacl") ITEM(KX_TRI_MODE, "acl_mode") ITEM(KX_TRI_MODE, "cacl_mode"))  \
    POINT(TREE_DUPLICATE, 113, KX_TRC_INFO, 1, KX_TRL_AT_LEAST, "tree", "duplicate",               \
          ITEM(KX_TRI_TEXT, "type") ITEM(KX_TRI_TEXT, "mech") ITEM(KX_TRI_TEXT, "id"))             \
    POINT(PARSE_LINE, 114, KX_TRC_INFO, 8, KX_TRL_AT_LEAST, "parse", "line",                       \
          ITEM(KX_TRI_INT, "line") KX_ACL_TRACE_ENTRY_FIELDS_LINE(ITEM))                           \
    POINT(PARSE_LINE_TOO_LONG, 115, KX_TRC_ERRORS, 1, KX_TRL_AT_LEAST, "parse", "line-too-long",   \
          ITEM(KX_TRI_INT, "line") ITEM(KX_TRI_INT, "length"))                                     \
    POINT(READ_EMPTY, 116, KX_TRC_INFO, 1, KX_TRL_AT_LEAST, "read", "empty",                       \
          ITEM(KX_TRI_TEXT, "file"))                                                               \
    POINT(READ_CACL_CHECK, 117, KX_TRC_INFO, 1, KX_TRL_AT_LEAST, "read", "cacl-check",             \
          ITEM(KX_TRI_TEXT, "cacl"))                                                               \
    POINT(READ_CACL_UNEXAMINABLE, 118, KX_TRC_INFO, 1, KX_TRL_AT_LEAST, "read",                    \
          "cacl-unexaminable", ITEM(KX_TRI_TEXT, "cacl") ITEM(KX_TRI_ERRNO, "errno"))              \
    POINT(READ_CACL_STALE, 119, KX_TRC_INFO, 1, KX_TRL_AT_LEAST, "read", "cacl-stale",             \
          ITEM(KX_TRI_TEXT, "cacl"))                                                               \
    POINT(READ_CACL_FOREIGN, 120, KX_TRC_INFO, 1, KX_TRL_AT_LEAST, "read", "cacl-foreign",         \
          ITEM(KX_TRI_TEXT, "file") ITEM(KX_TRI_OWNER, "acl_uid") ITEM(KX_TRI_OWNER, "acl_gid")    \
              ITEM(KX_TRI_OWNER, "cacl_uid") ITEM(KX_TRI_OWNER, "cacl_gid")                        \
                  ITEM(KX_TRI_MODE, "acl_mode") ITEM(KX_TRI_MODE, "cacl_mode"))                    \
    POINT(READ_OPEN, 121, KX_TRC_INFO, 1, KX_TRL_AT_LEAST, "read", "open",                         \
          ITEM(KX_TRI_TEXT, "file"))                                                               \
    POINT(READ_OPEN_FAILED, 122, KX_TRC_INFO, 1, KX_TRL_AT_LEAST, "read", "open-failed",           \
          ITEM(KX_TRI_TEXT, "file") ITEM(KX_TRI_ERRNO, "errno"))                                   \
    POINT(READ_FSTAT_FAILED, 123, KX_TRC_INFO, 1, KX_TRL_AT_LEAST, "read", "stat-failed",          \
          ITEM(KX_TRI_TEXT, "file") ITEM(KX_TRI_ERRNO, "errno"))                                   \
    POINT(READ_NO_MEMORY, 125, KX_TRC_INFO, 1, KX_TRL_AT_LEAST, "read", "no-memory",               \
          ITEM(KX_TRI_TEXT, "file") ITEM(KX_TRI_SIZE, "size"))                                     \
    POINT(READ_SHORT, 127, KX_TRC_INFO, 1, KX_TRL_AT_LEAST, "read", "short-read",                  \
          ITEM(KX_TRI_TEXT, "file") ITEM(KX_TRI_SIZE, "size") ITEM(KX_TRI_SIZE, "got"))

/* A parsed line: the type is 0 when the line held no entry. */
#define KX_ACL_TRACE_ENTRY_FIELDS_LINE(ITEM)                                                       \
    ITEM(KX_TRI_TYPE, "type")                                                                      \
    ITEM(KX_TRI_TEXT, "mech") ITEM(KX_TRI_TEXT, "id") ITEM(KX_TRI_PERMS, "perm")

/** KX_ACL_TP_<row>: the rows of the table, in its order. */
#define KX_ACL_TRACE_ROW_NAME(row, id, category, level, rule, where, event, items) KX_ACL_TP_##row,
typedef enum kx_acl_trace_point {
    KX_ACL_TRACE_POINTS(KX_ACL_TRACE_ROW_NAME, ) KX_ACL_TP_COUNT
} kx_acl_trace_point;
#undef KX_ACL_TRACE_ROW_NAME

#endif /* KX_ACL_TRACE_H */
