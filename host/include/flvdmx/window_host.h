/*
 * Host for playing: POSIX descriptors with a window of 64 KiB over each open file. Whatever lies inside the window is
 * answered without a system call: reads, seeks there, and every position query. The fastest of the hosts.
 *
 * The window keeps what it has read. Bytes appended to a file are seen; bytes that are changed in place, as in a file
 * that was given its size first and is filled later, may be seen late: take the POSIX host there.
 *
 * Usable from C11 and C++17; link flvdmx-host, which needs the C library alone.
 */
#ifndef FLVDMX_WINDOW_HOST_H
#define FLVDMX_WINDOW_HOST_H

#include "flvdmx/flvdmx.h"

#ifdef __cplusplus
extern "C" {
#endif

/** Bytes of memory that an open file takes beside the library's cache. */
#define FLVD_WINDOW_HOST_SIZE 65536

/**
 * Clears the block and puts all host functions into it; file name, options and sizes are left to the caller.
 *
 * @param init block to fill; it may go away after the open, the functions are valid for the whole process
 * @note  For reading: other open modes are refused and writes take nothing. Otherwise as flvd_posix_host_fill().
 */
void flvd_window_host_fill(flvd_init_t* init);

/** @return errno of this thread's newest open (EISDIR for a directory, EACCES for a mode that writes), 0 when it
 *          worked */
int flvd_window_host_open_error(void);

#ifdef __cplusplus
}
#endif

#endif /* FLVDMX_WINDOW_HOST_H */
