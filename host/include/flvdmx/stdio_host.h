/*
 * Host on the C library: malloc, fopen, fread, fseeko and the like. Works wherever the C library has 64-bit file
 * positions. It caches nothing, so it also suits files that are filled in place. To write your own host, start from a
 * copy of its source.
 *
 *     flvd_init_t init;
 *     flvd_stdio_host_fill(&init);
 *     init.file_name = path;
 *     result = QVX_FLV_DMX(FLVD_OP_OPEN, &handle, &init, &info);
 *
 * For C11 and C++17. Link flvdmx-host, which needs only the C library.
 */
#ifndef FLVDMX_STDIO_HOST_H
#define FLVDMX_STDIO_HOST_H

#include "flvdmx/flvdmx.h"

#ifdef __cplusplus
extern "C" {
#endif

/**
 * Clears the block and sets all host functions in it; the caller then sets file name, options and sizes.
 *
 * @param init block to fill; need not outlive the open
 * @note  All open modes work. Opening a directory fails. Streams are unbuffered, since the library has its own cache. A
 *        read is short only at the end or after an error. Beyond 2 GiB the 32-bit tell fails; the 64-bit functions
 * work.
 */
void flvd_stdio_host_fill(flvd_init_t* init);

/** @return errno of this thread's last open (EISDIR for a directory), 0 if it succeeded */
int flvd_stdio_host_open_error(void);

#ifdef __cplusplus
}
#endif

#endif /* FLVDMX_STDIO_HOST_H */
