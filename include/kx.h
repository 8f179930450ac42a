/**
 * @file kx.h
 * Fixed-width integer types shared by every library of the family.
 */
#ifndef KX_H
#define KX_H

#include <stdint.h>

typedef int8_t kx_int8_t;
typedef uint8_t kx_uint8_t;
typedef int16_t kx_int16_t;
typedef uint16_t kx_uint16_t;
typedef int32_t kx_int32_t;
typedef uint32_t kx_uint32_t;
typedef int64_t kx_int64_t;
typedef uint64_t kx_uint64_t;

#ifdef __cplusplus
#define KX_BEGIN_DECL extern "C" {
#define KX_END_DECL }
#else
#define KX_BEGIN_DECL
#define KX_END_DECL
#endif

/* Exported functions never throw; C++ callers may rely on it. */
#ifdef __cplusplus
#define KX_NOTHROW noexcept
#else
#define KX_NOTHROW
#endif

/* Marks a declaration as part of a shared library's exported interface. */
#define KX_EXPORT __attribute__((visibility("default")))

#endif /* KX_H */
