/* Host functions over two callbacks of the caller. */
#include "flvdmx/callback_host.h"

#include "callback_file.h"
#include "counted_file.h"

#include <errno.h>
#include <stdatomic.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>

typedef struct open_callbacks_t {
    counted_file_t counted;
    flvd_read_at_fn read_at;
    flvd_get_size_fn get_size;
    void* user;
} open_callbacks_t;

/* All files that can be opened, under the lock. It is held for a few comparisons. */
static flvd_callback_file_t* first_file;
static unsigned long names;
static atomic_flag lock = ATOMIC_FLAG_INIT;

static void take_lock(void)
{
    while (atomic_flag_test_and_set_explicit(&lock, memory_order_acquire))
        ;
}

static void release_lock(void)
{
    atomic_flag_clear_explicit(&lock, memory_order_release);
}

/* A copy of the file of that name, so that the record may go; false when there is none. */
static bool find_file(const char* name, flvd_callback_file_t* found)
{
    if (name == NULL)
        return false;
    take_lock();
    const flvd_callback_file_t* file = first_file;
    while (file != NULL && strcmp(file->name, name) != 0)
        file = file->next;
    if (file != NULL)
        *found = *file;
    release_lock();
    return file != NULL;
}

static int64_t size_of(void* handle)
{
    const open_callbacks_t* const file = handle;
    return file->get_size(file->user);
}

void* flvd_callback_file_open(const flvd_callback_file_t* file, const char* mode)
{
    const bool opens = file != NULL && flvd_counted_only_reads(mode);
    open_callbacks_t* const opened = opens ? malloc(sizeof *opened) : NULL;
    if (opened == NULL)
        errno = file == NULL ? ENOENT : opens ? ENOMEM : EACCES;
    else
        *opened = (open_callbacks_t){{size_of, 0, false}, file->read_at, file->get_size, file->user};
    return opened;
}

static void* open_file(const char* path, const char* mode)
{
    flvd_callback_file_t file;
    return flvd_callback_file_open(find_file(path, &file) ? &file : NULL, mode);
}

static int32_t close_file(void* handle)
{
    free(handle);
    return 0;
}

/* Elements are single bytes. */
static uint32_t read_file(void* buffer, uint32_t size, uint32_t count, void* handle)
{
    open_callbacks_t* const file = handle;
    const uint32_t wanted = size * count;
    uint32_t done = 0;
    while (done < wanted) {
        const uint32_t left = wanted - done;
        const uint32_t got = file->read_at(file->user, file->counted.position, (char*)buffer + done, left);
        if (got == 0 || got > left) { /* a function that claims more than it was asked for has failed */
            file->counted.end = true;
            break;
        }
        done += got;
        file->counted.position += got;
    }
    return done;
}

const char* flvd_callback_host_add(flvd_callback_file_t* file)
{
    if (file == NULL || file->read_at == NULL || file->get_size == NULL)
        return NULL;
    take_lock();
    const flvd_callback_file_t* known = first_file;
    while (known != NULL && known != file)
        known = known->next;
    if (known == NULL) {
        snprintf(file->name, sizeof file->name, "callbacks:%lu", ++names);
        file->next = first_file;
        first_file = file;
    }
    release_lock();
    return file->name;
}

void flvd_callback_host_remove(const flvd_callback_file_t* file)
{
    take_lock();
    flvd_callback_file_t** link = &first_file;
    while (*link != NULL && *link != file)
        link = &(*link)->next;
    if (*link != NULL)
        *link = file->next;
    release_lock();
}

void flvd_callback_host_fill(flvd_init_t* init)
{
    flvd_counted_fill(init);
    init->file_open = open_file;
    init->file_read = read_file;
    init->file_close = close_file;
}
