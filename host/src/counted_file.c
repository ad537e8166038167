/* Seek, tell and end flag for hosts that keep the file position themselves. */
#include "counted_file.h"

#include "flvdmx/stdio_host.h"

#include <string.h>

static int32_t seek64(void* handle, int64_t offset, int32_t whence)
{
    counted_file_t* const file = handle;
    int64_t base = 0;
    if (whence == FIO_SEEK_CUR)
        base = file->position;
    else if (whence == FIO_SEEK_END)
        base = file->size(handle);
    else if (whence != FIO_SEEK_SET)
        return -1;
    if (base < 0 || offset > INT64_MAX - base || base + offset < 0)
        return -1;
    file->position = base + offset;
    file->end = false;
    return 0;
}

static int64_t tell64(void* handle)
{
    return ((counted_file_t*)handle)->position;
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
    return ((counted_file_t*)handle)->end;
}

static int32_t flush(void* handle)
{
    (void)handle;
    return 0;
}

static uint32_t refuse_write(const void* buffer, uint32_t size, uint32_t count, void* handle)
{
    (void)buffer, (void)size, (void)count, (void)handle;
    return 0;
}

bool flvd_counted_only_reads(const char* mode)
{
    return mode[0] == 'r' && strchr(mode, '+') == NULL;
}

void flvd_counted_fill(flvd_init_t* init)
{
    flvd_init_t memory;
    flvd_stdio_host_fill(&memory);
    *init = (flvd_init_t){
        .mem_alloc = memory.mem_alloc,
        .mem_free = memory.mem_free,
        .mem_copy = memory.mem_copy,
        .mem_set = memory.mem_set,
        .file_seek = seek,
        .file_tell = tell,
        .file_eof = is_at_end,
        .file_flush = flush,
        .file_write = refuse_write,
        .file_seek64 = seek64,
        .file_tell64 = tell64,
    };
}
