/*
 * Host on two functions of the caller, read at a position and get the size, with a user pointer. The library's
 * file_open takes no context argument, so the kit generates a file name by which it finds the functions and the
 * pointer. It also handles opening, positions, the end flag and thread safety.
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
 * Threads: files may be added and removed during any other call. The callbacks of a file run on the thread that uses
 * its instance; when files are played on several threads, their callbacks run concurrently.
 *
 * For C11 and C++17. Link flvdmx-host, which needs only the C library.
 */
#ifndef FLVDMX_CALLBACK_HOST_H
#define FLVDMX_CALLBACK_HOST_H

#include "flvdmx/flvdmx.h"

#ifdef __cplusplus
extern "C" {
#endif

/** Size of a generated name in bytes, including the terminating NUL. */
#define FLVD_CALLBACK_NAME_SIZE 32

/**
 * Reads bytes of a file. Must not call the library.
 *
 * @param user     the file's user pointer
 * @param position file position of the first byte, 0 or more; may be at or past the end
 * @param buffer   receives the bytes
 * @param size     bytes wanted, at least 1
 * @return bytes read. When these are fewer than wanted, the kit calls again for the rest. 0 means the end of the file
 *         or a failure; the two look the same.
 */
typedef uint32_t (*flvd_read_at_fn)(void* user, int64_t position, void* buffer, uint32_t size);

/**
 * Returns the current size of a file. Must not call the library.
 *
 * @param user the file's user pointer
 * @return bytes; negative on failure. A file that is still arriving (FLVD_OPT_PROGRESSIVE) may grow.
 */
typedef int64_t (*flvd_get_size_fn)(void* user);

/**
 * A file that can be opened. The caller owns the record, which must stay in place from adding to removing. What `user`
 * points to must outlive every instance opened on the file, even when the file is removed earlier.
 */
typedef struct flvd_callback_file_t {
    flvd_read_at_fn read_at;            /**< not null */
    flvd_get_size_fn get_size;          /**< not null */
    void* user;                         /**< passed to both functions */
    char name[FLVD_CALLBACK_NAME_SIZE]; /**< private: the generated name */
    struct flvd_callback_file_t* next;  /**< private: next in the list */
} flvd_callback_file_t;

/**
 * Adds a file under a generated name, unique in the process.
 *
 * @param file record with its first three fields set; a file that was added already keeps its name
 * @return the name for flvd_init_t::file_name, stored in the record; null when the record or one of its functions is
 *         null. Opening a null name fails.
 */
const char* flvd_callback_host_add(flvd_callback_file_t* file);

/** Removes a file: its name can no longer be opened. Open instances keep working. Unknown files are ignored. */
void flvd_callback_host_remove(const flvd_callback_file_t* file);

/**
 * Clears the block and sets all host functions in it; the caller then sets file name, options and sizes.
 *
 * @param init block to fill; need not outlive the open
 * @note  Read only: opening fails with errno EACCES for other modes and ENOENT for unknown names, and writes return 0.
 */
void flvd_callback_host_fill(flvd_init_t* init);

#ifdef __cplusplus
}
#endif

#endif /* FLVDMX_CALLBACK_HOST_H */
