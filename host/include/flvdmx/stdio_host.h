/*
 * Host over the C library's streams: malloc and friends, fopen, fread, fseeko. Runs wherever the C library has files
 * with 64-bit positions. Nothing is cached besides the library's own cache, so it also suits files that are filled in
 * place. Its source is the one to copy for a host of your own.
 *
 *     flvd_init_t init;
 *     flvd_stdio_host_fill(&init);
 *     init.file_name = path;
 *     result = QVX_FLV_DMX(FLVD_OP_OPEN, &handle, &init, &info);
 *
 * Usable from C11 and C++17; link flvdmx-host, which needs the C library alone.
 */
#ifndef FLVDMX_STDIO_HOST_H
#define FLVDMX_STDIO_HOST_H

#include "flvdmx/flvdmx.h"

#ifdef __cplusplus
extern "C" {
#endif

/**
 * Clears the block and puts all host functions into it; file name, options and sizes are left to the caller.
 *
 * @param init block to fill; it may go away after the open, the functions are valid for the whole process
 * @note  Files are read without a buffer of stdio's own, since the library caches. Reads fill the request or have
 *        reached the end; seeks and tells reach beyond 2 GiB through the 64-bit slots, the 32-bit tell fails there.
 *        All open modes work. Directories are refused.
 */
void flvd_stdio_host_fill(flvd_init_t* init);

/** @return errno of this thread's newest open (EISDIR for a directory), 0 when it worked */
int flvd_stdio_host_open_error(void);

#ifdef __cplusplus
}
#endif

#endif /* FLVDMX_STDIO_HOST_H */
