/*
 * Host functions on C streams. This file is self-contained: to write a host for another system, copy it and replace the
 * C library's functions by those of that system.
 */
#define _FILE_OFFSET_BITS 64    /* 64-bit fseeko and ftello on 32-bit systems too */
#define _POSIX_C_SOURCE 200809L /* fseeko, ftello, fileno */

#include "flvdmx/stdio_host.h"

#include <assert.h>
#include <errno.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>

#include <sys/stat.h>
#include <sys/types.h>

static_assert(sizeof(off_t) == sizeof(int64_t), "fseeko and ftello must reach beyond 2 GiB");

enum { UNKNOWN = -1 };

/*
 * An open file. The host counts the position itself, because the library queries it twice per frame, and ftello takes
 * longer than the demultiplexer needs for the whole frame. After a seek or a write it is UNKNOWN until the next tell.
 */
typedef struct stream_t {
    FILE* file;
    int64_t position;
} stream_t;

static _Thread_local int open_error;

static void* allocate(uint32_t size)
{
    return malloc(size);
}

static void* copy(void* destination, const void* source, uint32_t count)
{
    return memcpy(destination, source, count);
}

static void* set(void* destination, int value, uint32_t count)
{
    return memset(destination, value, count);
}

/* fopen succeeds for a directory; only the reads fail, which would look like an empty file. */
static int is_directory(FILE* file)
{
    struct stat status;
    return fstat(fileno(file), &status) == 0 && S_ISDIR(status.st_mode);
}

/* Stores the reason and returns null. */
static void* refuse(int reason)
{
    open_error = reason;
    errno = reason;
    return NULL;
}

static void* open_stream(const char* path, const char* mode)
{
    FILE* const file = fopen(path, mode);
    if (file == NULL)
        return refuse(errno);
    const int directory = is_directory(file);
    stream_t* const stream = directory ? NULL : malloc(sizeof *stream);
    if (stream == NULL) {
        fclose(file);
        return refuse(directory ? EISDIR : ENOMEM);
    }
    open_error = 0;
    setvbuf(file, NULL, _IONBF, 0); /* the library has its own cache */
    *stream = (stream_t){file, UNKNOWN};
    return stream;
}

/* The library reads elements of 1 byte. A read that a signal interrupts continues until the end or a real error. */
static uint32_t read_stream(void* buffer, uint32_t size, uint32_t count, void* handle)
{
    stream_t* const stream = handle;
    uint32_t done = 0;
    for (;;) {
        errno = 0;
        done += (uint32_t)fread((char*)buffer + done, size, count - done, stream->file);
        if (done == count || errno != EINTR)
            break;
        clearerr(stream->file);
    }
    if (stream->position != UNKNOWN)
        stream->position += done;
    return done;
}

/* Leaves the position unknown, because a file opened for appending is written at its end. */
static uint32_t write_stream(const void* buffer, uint32_t size, uint32_t count, void* handle)
{
    stream_t* const stream = handle;
    stream->position = UNKNOWN;
    return (uint32_t)fwrite(buffer, size, count, stream->file);
}

static int32_t seek64(void* handle, int64_t offset, int32_t whence)
{
    stream_t* const stream = handle;
    if (whence != SEEK_SET && whence != SEEK_CUR && whence != SEEK_END)
        return -1; /* some systems define further origins */
    stream->position = UNKNOWN;
    return fseeko(stream->file, offset, whence);
}

static int64_t tell64(void* handle)
{
    stream_t* const stream = handle;
    if (stream->position == UNKNOWN)
        stream->position = ftello(stream->file);
    return stream->position;
}

/* 32-bit versions of the two. A position that does not fit is reported as a failure, never truncated. */
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
    return feof(((stream_t*)handle)->file);
}

static int32_t flush(void* handle)
{
    return fflush(((stream_t*)handle)->file);
}

static int32_t close_stream(void* handle)
{
    FILE* const file = ((stream_t*)handle)->file;
    free(handle);
    return fclose(file);
}

void flvd_stdio_host_fill(flvd_init_t* init)
{
    *init = (flvd_init_t){
        .mem_alloc = allocate,
        .mem_free = free,
        .mem_copy = copy,
        .mem_set = set,
        .file_open = open_stream,
        .file_read = read_stream,
        .file_seek = seek,
        .file_tell = tell,
        .file_close = close_stream,
        .file_eof = is_at_end,
        .file_flush = flush,
        .file_write = write_stream,
        .file_seek64 = seek64,
        .file_tell64 = tell64,
    };
}

int flvd_stdio_host_open_error(void)
{
    return open_error;
}
