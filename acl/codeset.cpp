// The two codeset converters of the library.
#include "codeset.h"

#include <langinfo.h>
#include <pthread.h>
#include <cstring>

#include <kx_cu.h>
#include <kx_sec.h>

#include "report.h"

namespace kxacl {

cu_iconv_t acl__to_utf8_hdl;
cu_iconv_t acl__from_utf8_hdl;
pthread_once_t acl__init_to_utf8_once_block = PTHREAD_ONCE_INIT;
pthread_once_t acl__init_from_utf8_once_block = PTHREAD_ONCE_INIT;

namespace {

// Opens the converter of one direction; a failure leaves the handle null
// for good, and every conversion in that direction then reports 2650-142.
void open_converter(kx_uint32_t direction, cu_iconv_t *handle) {
    char codeset[256] = {};
    kx_uint32_t flags = direction;
    const char *name = cu_utf8_is_assumed_1() ? "UTF-8" : nl_langinfo(CODESET);
    std::strncpy(codeset, name ? name : "", sizeof codeset - 1);
    if (cu_utf8_is_not_modified_1())
        flags += CU_ICONV_UTF8_STANDARD;
    if (cu_utf8_is_limited_to_bmp_1())
        flags += CU_ICONV_UTF8_BMP_ONLY;
    (void)cu_iconv_open_1(codeset, flags, handle);
}

extern "C" void acl__init_to_utf8_handle() {
    open_converter(CU_ICONV_TO_UTF8, &acl__to_utf8_hdl);
}

extern "C" void acl__init_from_utf8_handle() {
    open_converter(CU_ICONV_FROM_UTF8, &acl__from_utf8_hdl);
}

// One conversion with the handle of a direction, its failures reported.
kx_int32_t convert(cu_iconv_t handle, const char *routine, const char *in, std::size_t *in_length,
                   char **out, std::size_t *out_length) {
    if (!handle)
        return report<MSG_2650_142>(SEC_S_CODESET_ERROR);
    int rc = cu_iconv_str_1(handle, 0, in, in_length, out, out_length);
    switch (rc) {
    case CU_ICONV_OK:
        return SEC_S_OK;
    case CU_ICONV_BAD_ARGUMENT:
    case CU_ICONV_INTERNAL:
        return internal_error(here(src_utils), rc);
    case CU_ICONV_NO_MEMORY:
        // The record shows what the output length argument held.
        return report<MSG_2650_102>(SEC_S_NO_MEMORY, routine, byte_count(*out_length));
    default:
        return report<MSG_2650_143>(SEC_S_CODESET_ERROR);
    }
}

} // namespace

kx_int32_t acl__convert_to_utf8(const char *local_string, std::size_t *local_length,
                                char **utf8_string, std::size_t *utf8_length) {
    pthread_once(&acl__init_to_utf8_once_block, acl__init_to_utf8_handle);
    return convert(acl__to_utf8_hdl, "acl__convert_to_utf8", local_string, local_length,
                   utf8_string, utf8_length);
}

kx_int32_t acl__convert_from_utf8(const char *utf8_string, std::size_t *utf8_length,
                                  char **local_string, std::size_t *local_length) {
    pthread_once(&acl__init_from_utf8_once_block, acl__init_from_utf8_handle);
    return convert(acl__from_utf8_hdl, "acl__convert_from_utf8", utf8_string, utf8_length,
                   local_string, local_length);
}

} // namespace kxacl
