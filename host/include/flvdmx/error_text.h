/*
 * Names and texts of the error codes, FLVD_ERR_* as they are recorded in flvd_ctx_t::error and g_flvd_lLastError,
 * and those that flvdmx.hpp adds.
 *
 * Usable from C11 and C++17; link flvdmx-host, which needs the C library alone.
 */
#ifndef FLVDMX_ERROR_TEXT_H
#define FLVDMX_ERROR_TEXT_H

#include "flvdmx/flvdmx.h"

#ifdef __cplusplus
extern "C" {
#endif

/** Error codes of flvdmx.hpp, beside those of flvdmx.h. */
enum {
    FLVD_ERR_HOST_IN_USE = -20001,    /**< a file that was opened through other host functions is still open */
    FLVD_ERR_HOST_INCOMPLETE = -20002 /**< the host lacks a function that the library calls */
};

/** @return the name of an error code, such as "FLVD_ERR_SEEK"; "unknown" for any other number. Never released. */
const char* flvd_error_name(int32_t code);

/** @return what happened, for people, without a full stop; "unknown error" for any other number. Never released. */
const char* flvd_error_text(int32_t code);

#ifdef __cplusplus
}
#endif

#endif /* FLVDMX_ERROR_TEXT_H */
