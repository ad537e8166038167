/*
 * Host for playing: POSIX descriptors with a 64 KiB read window per open file. Reads and seeks inside the window and
 * all position queries need no system call. This is the fastest host of the kit.
 *
 * The window keeps what it has read. Data appended to a file is seen; data changed in place, as in a file that is
 * preallocated and filled later, may be seen late: use the stdio host for such files.
 *
 * For C11 and C++17. Link flvdmx-host, which needs only the C library.
 */
#ifndef FLVDMX_POSIX_HOST_H
#define FLVDMX_POSIX_HOST_H

#include "flvdmx/flvdmx.h"

#ifdef __cplusplus
extern "C" {
#endif

/** Size of the window in bytes: the memory that an open file needs in addition to the library's cache. */
#define FLVD_POSIX_HOST_WINDOW 65536

/**
 * Clears the block and sets all host functions in it; the caller then sets file name, options and sizes.
 *
 * @param init block to fill; need not outlive the open
 * @note  Read only: opening fails for other modes, and writes return 0. Opening a directory fails. Descriptors are
 *        closed on exec. Reads continue after signals and short reads until the request is filled or the end is
 *        reached. Positions have 64 bits on 32-bit systems too; the 32-bit tell fails beyond 2 GiB.
 */
void flvd_posix_host_fill(flvd_init_t* init);

/** @return errno of this thread's last open (EISDIR for a directory, EACCES for a mode that writes), 0 if it succeeded
 */
int flvd_posix_host_open_error(void);

#ifdef __cplusplus
}
#endif

#endif /* FLVDMX_POSIX_HOST_H */
