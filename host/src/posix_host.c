/*
 * Host functions on POSIX descriptors, with a read window for each file.
 *
 * The position that the library sees is a number kept here. The descriptor itself moves only with consecutive reads.
 */
#define _FILE_OFFSET_BITS 64    /* 64-bit pread and lseek on 32-bit systems, and an open that accepts large files */
#define _POSIX_C_SOURCE 200809L /* pread, O_CLOEXEC */

#include "flvdmx/posix_host.h"

#include "counted_file.h"

#include <assert.h>
#include <errno.h>
#include <stdlib.h>
#include <string.h>

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/types.h>
#include <unistd.h>

static_assert(sizeof(off_t) == sizeof(int64_t), "positions beyond 2 GiB must be reachable");

enum {
    WINDOW = FLVD_POSIX_HOST_WINDOW,
    BACK_POINTER = 4,
    BETWEEN_LARGE = WINDOW / 4 /* read after a large tag: the tags up to the next large one are small */
};

typedef struct posix_file_t {
    counted_file_t counted;
    int descriptor;
    bool large;            /* the last read bypassed the window */
    int64_t descriptor_at; /* where the descriptor stands */
    int64_t file_end;      /* the size at the last seek from the end */
    int64_t start;         /* file position of the window */
    uint32_t count;        /* bytes in the window */
    char window[WINDOW];
} posix_file_t;

static _Thread_local int open_error;

static uint32_t least_of(uint32_t a, uint32_t b)
{
    return a < b ? a : b;
}

/* open succeeds for a directory; only the reads fail, which would look like an empty file. */
static bool is_directory(int descriptor)
{
    struct stat status;
    return fstat(descriptor, &status) == 0 && S_ISDIR(status.st_mode);
}

static int open_descriptor(const char* path)
{
    int descriptor = -1;
    do
        descriptor = open(path, O_RDONLY | O_CLOEXEC);
    while (descriptor < 0 && errno == EINTR);
    return descriptor;
}

static int64_t size_of(void* handle)
{
    posix_file_t* const file = handle;
    const int64_t size = lseek(file->descriptor, 0, SEEK_END);
    if (size >= 0)
        file->descriptor_at = file->file_end = size;
    return size;
}

/* Stores the reason and returns null. */
static void* refuse(int reason)
{
    open_error = reason;
    errno = reason;
    return NULL;
}

static void* open_file(const char* path, const char* mode)
{
    if (!flvd_counted_only_reads(mode))
        return refuse(EACCES);
    const int descriptor = open_descriptor(path);
    if (descriptor < 0)
        return refuse(errno);
    const bool directory = is_directory(descriptor);
    posix_file_t* const file = directory ? NULL : calloc(1, sizeof *file);
    if (file == NULL) {
        close(descriptor);
        return refuse(directory ? EISDIR : ENOMEM);
    }
    open_error = 0;
    file->counted.size = size_of;
    file->descriptor = descriptor;
    return file;
}

static int32_t close_file(void* handle)
{
    const int descriptor = ((posix_file_t*)handle)->descriptor;
    free(handle);
    return close(descriptor);
}

/*
 * Reads between `least` and `most` bytes at file position `from`; fewer only at the end or after a failure. Continues
 * after signals and short reads. If the descriptor is at another position, it stays there, which saves a seek.
 */
static uint32_t read_at(posix_file_t* file, int64_t from, char* to, uint32_t least, uint32_t most)
{
    const bool here = from == file->descriptor_at;
    uint32_t done = 0;
    while (done < least) {
        const ssize_t got = here ? read(file->descriptor, to + done, most - done)
                                 : pread(file->descriptor, to + done, most - done, from + done);
        if (got < 0 && errno == EINTR)
            continue;
        if (got == 0)
            file->counted.end = true;
        if (got <= 0)
            break;
        done += (uint32_t)got; /* at most `most` */
    }
    if (here)
        file->descriptor_at += done;
    return done;
}

/* Copies up to `wanted` bytes from the window at the position, and moves the position past them. */
static uint32_t take_from_window(posix_file_t* file, char* to, uint32_t wanted)
{
    const int64_t offset = file->counted.position - file->start;
    if (offset < 0 || offset >= file->count)
        return 0;
    const uint32_t at = (uint32_t)offset; /* below WINDOW */
    const uint32_t n = least_of(wanted, file->count - at);
    memcpy(to, file->window + at, n);
    file->counted.position += n;
    return n;
}

/* True when the library seems to step backward: before the window, or near the end of the file. */
static bool is_way_back(const posix_file_t* file)
{
    const int64_t left = file->file_end - file->counted.position;
    return file->counted.position < file->start || (left > 0 && left < WINDOW / 2);
}

/*
 * Moves the window so that it starts at the position or, when the library steps backward, has the position in its
 * middle. The window then holds at least `wanted` bytes (fewer than half a window) from the position on, unless the
 * file ends. If nothing can be read, the window does not change.
 */
static void move_window(posix_file_t* file, uint32_t wanted)
{
    const uint32_t room = file->counted.position < WINDOW / 2 ? (uint32_t)file->counted.position : WINDOW / 2;
    const uint32_t before = is_way_back(file) ? room : 0;
    const uint32_t least = before + wanted;
    const uint32_t between = least > BETWEEN_LARGE ? least : BETWEEN_LARGE;
    const int64_t start = file->counted.position - before;
    const uint32_t got = read_at(file, start, file->window, least, file->large ? between : WINDOW);
    file->large = false;
    if (got == 0)
        return;
    file->start = start;
    file->count = got;
}

/*
 * The library reads elements of 1 byte. A request of half a window or more bypasses the window. So does the read of a
 * back-pointer after a tag larger than the library's cache: the library then returns to the tag, where the window is.
 */
static uint32_t read_file(void* buffer, uint32_t size, uint32_t count, void* handle)
{
    posix_file_t* const file = handle;
    char* const to = buffer;
    const uint32_t wanted = size * count;
    const uint32_t done = take_from_window(file, to, wanted);
    const uint32_t rest = wanted - done;
    if (rest == 0)
        return done;
    const bool is_beyond = wanted <= BACK_POINTER && file->counted.position > file->start + file->count;
    if (rest < WINDOW / 2 && !is_beyond) {
        move_window(file, rest);
        return done + take_from_window(file, to + done, rest);
    }
    const uint32_t got = read_at(file, file->counted.position, to + done, rest, rest);
    file->counted.position += got;
    file->large = !is_beyond;
    return done + got;
}

void flvd_posix_host_fill(flvd_init_t* init)
{
    flvd_counted_fill(init);
    init->file_open = open_file;
    init->file_read = read_file;
    init->file_close = close_file;
}

int flvd_posix_host_open_error(void)
{
    return open_error;
}
