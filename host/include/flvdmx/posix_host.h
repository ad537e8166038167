/*
 * Host for playing: POSIX descriptors with a window of 64 KiB over each open file. Whatever lies inside the window is
 * answered without a system call: reads, seeks there, and every position query. The fastest of the hosts.
 *
 * The window keeps what it has read. Bytes appended to a file are seen; bytes that are changed in place, as in a file
 * that is given its size first and filled later, may be seen late: take the stdio host there.
 *
 * Usable from C11 and C++17; link flvdmx-host, which needs the C library alone.
 */
#ifndef FLVDMX_POSIX_HOST_H
#define FLVDMX_POSIX_HOST_H

#include "flvdmx/flvdmx.h"

#ifdef __cplusplus
extern "C" {
#endif

/** Bytes of memory that an open file takes besides the library's cache. */
#define FLVD_POSIX_HOST_WINDOW 65536

/**
 * Clears the block and puts all host functions into it; file name, options and sizes are left to the caller.
 *
 * @param init block to fill; it may go away after the open, the functions are valid for the whole process
 * @note  For reading: other open modes are refused and writes take nothing. Descriptors are closed on exec. Reads
 *        continue after signals and short reads until the request is filled or the end is reached. Positions have
 *        64 bits on 32-bit systems too; the 32-bit tell fails beyond 2 GiB. Directories are refused.
 */
void flvd_posix_host_fill(flvd_init_t* init);

/** @return errno of this thread's newest open (EISDIR for a directory, EACCES for a mode that writes), 0 when it
 *          worked */
int flvd_posix_host_open_error(void);

#ifdef __cplusplus
}
#endif

#endif /* FLVDMX_POSIX_HOST_H */
