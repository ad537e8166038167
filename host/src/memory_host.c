/* Host functions over the caller's memory. */
#include "flvdmx/memory_host.h"

#include "counted_file.h"

#include <stdlib.h>
#include <string.h>

typedef struct open_buffer_t {
    counted_file_t counted;
    const flvd_memory_file_t* file;
} open_buffer_t;

static flvd_memory_file_t* first_file;

static int64_t size_of(void* handle)
{
    return (int64_t)((open_buffer_t*)handle)->file->size; /* memory is smaller than that */
}

static void* open_buffer(const char* path, const char* mode)
{
    const flvd_memory_file_t* file = first_file;
    while (file != NULL && strcmp(file->name, path) != 0)
        file = file->next;
    const bool found = file != NULL && flvd_counted_only_reads(mode);
    open_buffer_t* const buffer = found ? malloc(sizeof *buffer) : NULL;
    if (buffer != NULL)
        *buffer = (open_buffer_t){{size_of, 0, false}, file};
    return buffer;
}

static int32_t close_buffer(void* handle)
{
    free(handle);
    return 0;
}

/* Elements are single bytes. */
static uint32_t read_buffer(void* to, uint32_t size, uint32_t count, void* handle)
{
    open_buffer_t* const buffer = handle;
    const uint32_t wanted = size * count;
    const uint64_t at = (uint64_t)buffer->counted.position; /* no seek makes it negative */
    const uint64_t left = at < buffer->file->size ? buffer->file->size - at : 0;
    const uint32_t n = left < wanted ? (uint32_t)left : wanted;
    if (n != 0)
        memcpy(to, (const char*)buffer->file->data + at, n);
    buffer->counted.position += n;
    buffer->counted.end = buffer->counted.end || n < wanted;
    return n;
}

void flvd_memory_host_add(flvd_memory_file_t* file)
{
    file->next = first_file;
    first_file = file;
}

void flvd_memory_host_remove(const flvd_memory_file_t* file)
{
    flvd_memory_file_t** link = &first_file;
    while (*link != NULL && *link != file)
        link = &(*link)->next;
    if (*link != NULL)
        *link = file->next;
}

void flvd_memory_host_fill(flvd_init_t* init)
{
    flvd_counted_fill(init);
    init->file_open = open_buffer;
    init->file_read = read_buffer;
    init->file_close = close_buffer;
}
