/*
 * Host over POSIX descriptors: open, read, lseek, close. One system call for each read and seek of the library, nothing
 * cached beside the library's own cache: what a file holds now is what is read, which suits files that are being
 * written.
 *
 * Usable from C11 and C++17; link flvdmx-host, which needs the C library alone.
 */
#ifndef FLVDMX_POSIX_HOST_H
#define FLVDMX_POSIX_HOST_H

#include "flvdmx/flvdmx.h"

#ifdef __cplusplus
extern "C" {
#endif

/**
 * Clears the block and puts all host functions into it; file name, options and sizes are left to the caller.
 *
 * @param init block to fill; it may go away after the open, the functions are valid for the whole process
 * @note  Descriptors are closed on exec. Reads go on after signals and short reads until the request is filled or the
 *        end is reached. Positions have 64 bits on 32-bit systems too; the 32-bit tell fails beyond 2 GiB. All open
 *        modes work. Directories are refused.
 */
void flvd_posix_host_fill(flvd_init_t* init);

/** @return errno of this thread's newest open (EISDIR for a directory), 0 when it worked */
int flvd_posix_host_open_error(void);

#ifdef __cplusplus
}
#endif

#endif /* FLVDMX_POSIX_HOST_H */
