/**
 * @file kx_tr.h
 * Tracing: components register their categories, each with a level of
 * detail; trace points record ids and data items to a trace file.
 *
 * Configuration, read when a component registers:
 * - KX_TRACE_LEVELS: levels per component and category, for example
 *   "_SEL:API=8,Perf=2;_XYZ:all=1". Components are separated by ';',
 *   categories by ','; a component is named exactly, a category by its name
 *   in any case, or "all" (or "*") for all of them; levels are 0 to 9 (more
 *   counts as 9). Later settings override earlier ones; categories not named
 *   keep their default level. A part that cannot be read (no component, no
 *   "=", a level that is not a number, a category the component does not
 *   have) is ignored with a warning on standard error that names it, at most
 *   a few per process; settings of components never registered are not
 *   checked for category names.
 * - KX_TRACE_FILE: the file that records are appended to. Without it records
 *   are dropped (the levels still apply, so callers still see them).
 *
 * One record is one text line, written with a single write(2):
 *   <seconds>.<nanoseconds> <thread id> <component> <trace id> [<item> ...]
 * The time is the real-time clock; each data item is its bytes as lowercase
 * hexadecimal pairs, in memory order, or "-" for an item of no bytes.
 *
 * Tracing never changes errno and never touches the error records of the
 * common-utilities library. All functions are safe to call from any thread.
 */
#ifndef KX_TR_H
#define KX_TR_H

#include "kx.h"

#define TR_EXTERN KX_EXPORT

KX_BEGIN_DECL

/** A level of detail, 0 (off) to 9. */
typedef kx_uint8_t tr_detail_level_t;

/** Description of one trace category of a component. */
typedef struct tr_category_description_s {
    kx_uint32_t category_id;             /**< index of the category's level */
    const char *category_name;           /**< name used in KX_TRACE_LEVELS */
    kx_uint32_t default_level_of_detail; /**< level when not configured */
    kx_uint32_t minimum_level_of_detail; /**< lowest level it may be set to */
} tr_category_description_t;

/* Result codes. */
#define TR_OK 0
#define TR_BAD_ARGUMENT 1       /**< NULL or inconsistent argument */
#define TR_NOT_REGISTERED 2     /**< no component of that name */
#define TR_ALREADY_REGISTERED 3 /**< the component is registered already */
#define TR_NO_MEMORY 4          /**< the registration could not be stored */
#define TR_WRITE_FAILED 5       /**< the record could not be written */

/**
 * Registers a component. levels points to count levels that the component
 * reads at its trace points; this library fills them from the categories'
 * defaults and KX_TRACE_LEVELS now, and keeps them current when levels are
 * changed with tr_set_detail_level_1. The arrays must outlive the
 * registration. Each category's category_id must be below count.
 * @return TR_OK, TR_BAD_ARGUMENT, TR_ALREADY_REGISTERED or TR_NO_MEMORY.
 */
TR_EXTERN int tr_register_component_1(const char *component, tr_detail_level_t *levels,
                                      const tr_category_description_t *categories,
                                      kx_uint32_t count) KX_NOTHROW;

/**
 * Forgets a component; its levels array is no longer written.
 * @return TR_OK, TR_BAD_ARGUMENT or TR_NOT_REGISTERED.
 */
TR_EXTERN int tr_unregister_component_1(const char *component) KX_NOTHROW;

/**
 * Changes the level of one category (by name, case-insensitive, or "*" for
 * all) of a registered component at run time. Levels are clamped to the
 * category's minimum and to 9.
 * @return TR_OK, TR_BAD_ARGUMENT or TR_NOT_REGISTERED.
 */
TR_EXTERN int tr_set_detail_level_1(const char *component, const char *category,
                                    tr_detail_level_t level) KX_NOTHROW;

/**
 * Records a trace point without data.
 * @return TR_OK (also when KX_TRACE_FILE is not set), TR_BAD_ARGUMENT or
 *         TR_WRITE_FAILED.
 */
TR_EXTERN int tr_record_id_1(const char *component, kx_uint32_t id) KX_NOTHROW;

/**
 * Records a trace point with count data items. The variadic arguments are
 * count pairs: a pointer (const void *) and a byte length (kx_uint32_t).
 * A NULL pointer records as an item of no bytes.
 * @return as tr_record_id_1; TR_BAD_ARGUMENT also for more than 64 items.
 */
TR_EXTERN int tr_record_data_1(const char *component, kx_uint32_t id, kx_uint32_t count,
                               ...) KX_NOTHROW;

KX_END_DECL

#endif /* KX_TR_H */
