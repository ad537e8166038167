/*
 * Host over two functions of the caller with a user pointer: read at a position, tell the size. What the library's file
 * functions lack, a context, is put behind a name that the kit generates; opening, positions, the end flag and the way
 * threads get along are the kit's business.
 *
 *     static uint32_t read_at(void* user, int64_t position, void* buffer, uint32_t size);
 *     static int64_t get_size(void* user);
 *
 *     flvd_callback_file_t file = {.read_at = read_at, .get_size = get_size, .user = &stream};
 *     flvd_callback_host_fill(&init);
 *     init.file_name = flvd_callback_host_add(&file);
 *     ... open, play, close ...
 *     flvd_callback_host_remove(&file);
 *
 * Threads: adding and removing may run beside any other call. The callbacks of a file run on the thread that uses its
 * instance; those of files that are played on several threads run at the same time.
 *
 * Usable from C11 and C++17; link flvdmx-host, which needs the C library alone.
 */
#ifndef FLVDMX_CALLBACK_HOST_H
#define FLVDMX_CALLBACK_HOST_H

#include "flvdmx/flvdmx.h"

#ifdef __cplusplus
extern "C" {
#endif

/** Bytes that a generated name takes, its end included. */
#define FLVD_CALLBACK_NAME_SIZE 32

/**
 * Reads bytes of a file. It must not call the library.
 *
 * @param user     what the file was given
 * @param position byte to begin at, 0 or more; may be at or past the end
 * @param buffer   where they go
 * @param size     how many are wanted, at least 1
 * @return how many were read. Fewer than wanted is not the end: the rest is requested next. 0: the end of the file, or
 * a failure, which looks the same.
 */
typedef uint32_t (*flvd_read_at_fn)(void* user, int64_t position, void* buffer, uint32_t size);

/**
 * Tells how large a file is now. It must not call the library.
 *
 * @param user what the file was given
 * @return bytes; negative when it cannot be told. A file that is still arriving (FLVD_OPT_PROGRESSIVE) may grow.
 */
typedef int64_t (*flvd_get_size_fn)(void* user);

/**
 * A file that can be opened. The caller owns the record, which stays where it is from adding to removing. What `user`
 * points to must last until every instance that was opened on it is closed, also after the file was removed.
 */
typedef struct flvd_callback_file_t {
    flvd_read_at_fn read_at;            /**< reads; not null */
    flvd_get_size_fn get_size;          /**< tells the size; not null */
    void* user;                         /**< handed to both, otherwise not looked at */
    char name[FLVD_CALLBACK_NAME_SIZE]; /**< the kit's own: the generated name */
    struct flvd_callback_file_t* next;  /**< the kit's own: the list */
} flvd_callback_file_t;

/**
 * Makes a file known under a new name, which no other file of the process has had.
 *
 * @param file record with its first three fields filled; one that is known already keeps its name
 * @return its name, for flvd_init_t::file_name; lies in the record. Null when the record or a function is missing; the
 * name null opens nothing.
 */
const char* flvd_callback_host_add(flvd_callback_file_t* file);

/** Forgets a file: its name cannot be opened any more. Instances that are open go on. Unknown files are ignored. */
void flvd_callback_host_remove(const flvd_callback_file_t* file);

/**
 * Clears the block and puts all host functions into it; file name, options and sizes are left to the caller.
 *
 * @param init block to fill; it may go away after the open, the functions are valid for the whole process
 * @note  For reading: other open modes (errno EACCES) and unknown names (ENOENT) are refused, writes take nothing.
 */
void flvd_callback_host_fill(flvd_init_t* init);

#ifdef __cplusplus
}
#endif

#endif /* FLVDMX_CALLBACK_HOST_H */
