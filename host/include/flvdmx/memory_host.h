/*
 * Host over the caller's memory: any number of buffers, each with a name that takes the place of a path. The library's
 * file functions carry no context, so the names are one list for the process:
 *
 *     flvd_memory_file_t file = {"clip", bytes, byte_count, NULL};
 *     flvd_memory_host_add(&file);
 *     flvd_memory_host_fill(&init);
 *     init.file_name = "clip";
 *     ... open, play, close ...
 *     flvd_memory_host_remove(&file);
 *
 * Threads: adding and removing count as opens; they must not run beside any other call.
 *
 * Usable from C11 and C++17; link flvdmx-host, which needs the C library alone.
 */
#ifndef FLVDMX_MEMORY_HOST_H
#define FLVDMX_MEMORY_HOST_H

#include "flvdmx/flvdmx.h"

#ifdef __cplusplus
extern "C" {
#endif

/**
 * A buffer that can be opened. The caller owns the record, the name and the bytes; all three stay where they are from
 * adding to removing. Between two calls of the library `size` may grow: open instances see it at once, which plays a
 * file that is still arriving (FLVD_OPT_PROGRESSIVE); `data` may change as well when the old bytes moved along.
 */
typedef struct flvd_memory_file_t {
    const char* name;                /**< what flvd_init_t::file_name must say */
    const void* data;                /**< the bytes; may be null when size is 0 */
    uint64_t size;                   /**< their number */
    struct flvd_memory_file_t* next; /**< the list's own */
} flvd_memory_file_t;

/** Makes a buffer known; of two with one name the one added last is opened. A record that is known already becomes the
 * last one. */
void flvd_memory_host_add(flvd_memory_file_t* file);

/** Forgets a buffer; every instance that was opened on it must be closed by then. Unknown ones are ignored. */
void flvd_memory_host_remove(const flvd_memory_file_t* file);

/**
 * Clears the block and puts all host functions into it; file name, options and sizes are left to the caller.
 *
 * @param init block to fill; it may go away after the open, the functions are valid for the whole process
 * @note  For reading: other open modes and unknown names are refused, writes take nothing.
 */
void flvd_memory_host_fill(flvd_init_t* init);

#ifdef __cplusplus
}
#endif

#endif /* FLVDMX_MEMORY_HOST_H */
