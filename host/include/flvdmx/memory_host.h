/*
 * Host on the caller's memory: any number of buffers, each with a name that takes the place of a path. The library's
 * file_open takes no context argument, so there is one list of names per process:
 *
 *     flvd_memory_file_t file = {"clip", bytes, byte_count, NULL};
 *     flvd_memory_host_add(&file);
 *     flvd_memory_host_fill(&init);
 *     init.file_name = "clip";
 *     ... open, play, close ...
 *     flvd_memory_host_remove(&file);
 *
 * Threads: adding and removing a buffer count as opens; they must not run during any other call.
 *
 * For C11 and C++17. Link flvdmx-host, which needs only the C library.
 */
#ifndef FLVDMX_MEMORY_HOST_H
#define FLVDMX_MEMORY_HOST_H

#include "flvdmx/flvdmx.h"

#ifdef __cplusplus
extern "C" {
#endif

/**
 * A buffer that can be opened. The caller owns the record, the name and the bytes, which must stay in place from adding
 * to removing, with one exception for a file that is still arriving (FLVD_OPT_PROGRESSIVE): between two calls to the
 * library `size` may grow, and `data` may point to a new buffer that begins with the old bytes. Open instances see the
 * change at once.
 */
typedef struct flvd_memory_file_t {
    const char* name;                /**< the value of flvd_init_t::file_name that opens it */
    const void* data;                /**< the bytes; may be null when size is 0 */
    uint64_t size;                   /**< number of bytes */
    struct flvd_memory_file_t* next; /**< private: next in the list */
} flvd_memory_file_t;

/** Adds a buffer. Of several with the same name, the one added last is opened. A record may be added again. */
void flvd_memory_host_add(flvd_memory_file_t* file);

/** Removes a buffer. Close all instances opened on it first. Unknown buffers are ignored. */
void flvd_memory_host_remove(const flvd_memory_file_t* file);

/**
 * Clears the block and sets all host functions in it; the caller then sets file name, options and sizes.
 *
 * @param init block to fill; need not outlive the open
 * @note  Read only: opening fails for other modes and for unknown names, and writes return 0.
 */
void flvd_memory_host_fill(flvd_init_t* init);

#ifdef __cplusplus
}
#endif

#endif /* FLVDMX_MEMORY_HOST_H */
