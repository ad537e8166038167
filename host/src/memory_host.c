/* Host functions over the caller's memory: callback files that have the names of the caller. */
#include "flvdmx/memory_host.h"

#include "callback_file.h"

#include <string.h>

static flvd_memory_file_t* first_file;

static int64_t get_size(void* user)
{
    return (int64_t)((const flvd_memory_file_t*)user)->size; /* memory is smaller than that */
}

static uint32_t read_at(void* user, int64_t position, void* buffer, uint32_t size)
{
    const flvd_memory_file_t* const file = user;
    const uint64_t at = (uint64_t)position; /* never negative */
    const uint64_t left = at < file->size ? file->size - at : 0;
    const uint32_t n = left < size ? (uint32_t)left : size;
    if (n != 0)
        memcpy(buffer, (const char*)file->data + at, n);
    return n;
}

static void* open_buffer(const char* path, const char* mode)
{
    flvd_memory_file_t* file = path != NULL ? first_file : NULL;
    while (file != NULL && strcmp(file->name, path) != 0)
        file = file->next;
    const flvd_callback_file_t callbacks = {.read_at = read_at, .get_size = get_size, .user = file};
    return flvd_callback_file_open(file != NULL ? &callbacks : NULL, mode);
}

void flvd_memory_host_remove(const flvd_memory_file_t* file)
{
    flvd_memory_file_t** link = &first_file;
    while (*link != NULL && *link != file)
        link = &(*link)->next;
    if (*link != NULL)
        *link = file->next;
}

void flvd_memory_host_add(flvd_memory_file_t* file)
{
    flvd_memory_host_remove(file); /* a file that is known moves to the front */
    file->next = first_file;
    first_file = file;
}

void flvd_memory_host_fill(flvd_init_t* init)
{
    flvd_callback_host_fill(init);
    init->file_open = open_buffer;
}
