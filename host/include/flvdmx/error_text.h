/*
 * Names and texts of the error codes: the FLVD_ERR_* recorded in flvd_ctx_t::error and g_flvd_lLastError, and those
 * that flvdmx.hpp adds.
 *
 * For C11 and C++17. Link flvdmx-host, which needs only the C library.
 */
#ifndef FLVDMX_ERROR_TEXT_H
#define FLVDMX_ERROR_TEXT_H

#include "flvdmx/flvdmx.h"

#ifdef __cplusplus
extern "C" {
#endif

/** Error codes of flvdmx.hpp, in addition to those of flvdmx.h. */
enum {
    FLVD_ERR_HOST_IN_USE = -20001,    /**< a file opened with other host functions is still open */
    FLVD_ERR_HOST_INCOMPLETE = -20002 /**< the host lacks a function that the library calls */
};

/** @return the name of an error code, such as "FLVD_ERR_SEEK"; "unknown" for any other number. A static string. */
const char* flvd_error_name(int32_t code);

/** @return a message for users, without a full stop; "unknown error" for any other number. A static string. */
const char* flvd_error_text(int32_t code);

#ifdef __cplusplus
}
#endif

#endif /* FLVDMX_ERROR_TEXT_H */
