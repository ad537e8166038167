/* Host functions over the caller's memory. */
#include "flvdmx/memory_host.h"

#include "flvdmx/stdio_host.h"

#include <stdbool.h>
#include <stdlib.h>
#include <string.h>

typedef struct open_buffer_t {
    const flvd_memory_file_t* file;
    int64_t position;
    bool end; /* a read met the end and no seek followed */
} open_buffer_t;

static flvd_memory_file_t* first_file;

static void* open_buffer(const char* path, const char* mode)
{
    const flvd_memory_file_t* file = first_file;
    while (file != NULL && strcmp(file->name, path) != 0)
        file = file->next;
    const bool reads = mode[0] == 'r' && strchr(mode, '+') == NULL;
    open_buffer_t* const buffer = file != NULL && reads ? malloc(sizeof *buffer) : NULL;
    if (buffer != NULL)
        *buffer = (open_buffer_t){file, 0, false};
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
    const uint64_t at = (uint64_t)buffer->position; /* no seek makes it negative */
    const uint64_t left = at < buffer->file->size ? buffer->file->size - at : 0;
    const uint32_t n = left < wanted ? (uint32_t)left : wanted;
    if (n != 0)
        memcpy(to, (const char*)buffer->file->data + at, n);
    buffer->position += n;
    buffer->end = buffer->end || n < wanted;
    return n;
}

static uint32_t write_buffer(const void* from, uint32_t size, uint32_t count, void* handle)
{
    (void)from, (void)size, (void)count, (void)handle;
    return 0;
}

static int32_t seek64(void* handle, int64_t offset, int32_t whence)
{
    open_buffer_t* const buffer = handle;
    int64_t base = 0;
    if (whence == FIO_SEEK_CUR)
        base = buffer->position;
    else if (whence == FIO_SEEK_END)
        base = (int64_t)buffer->file->size; /* memory is smaller than that */
    else if (whence != FIO_SEEK_SET)
        return -1;
    if (offset > INT64_MAX - base || base + offset < 0)
        return -1;
    buffer->position = base + offset;
    buffer->end = false;
    return 0;
}

static int64_t tell64(void* handle)
{
    return ((open_buffer_t*)handle)->position;
}

static int32_t seek(void* handle, int32_t offset, int32_t whence)
{
    return seek64(handle, offset, whence);
}

static int32_t tell(void* handle)
{
    const int64_t position = tell64(handle);
    return position > INT32_MAX ? -1 : (int32_t)position;
}

static int32_t is_at_end(void* handle)
{
    return ((open_buffer_t*)handle)->end;
}

static int32_t flush(void* handle)
{
    (void)handle;
    return 0;
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
    flvd_stdio_host_fill(init); /* for the memory functions; all file functions are replaced */
    init->file_open = open_buffer;
    init->file_read = read_buffer;
    init->file_seek = seek;
    init->file_tell = tell;
    init->file_close = close_buffer;
    init->file_eof = is_at_end;
    init->file_flush = flush;
    init->file_write = write_buffer;
    init->file_seek64 = seek64;
    init->file_tell64 = tell64;
}
