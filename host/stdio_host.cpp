// Host functions over the C library. Positions are 64 bits wide also where `long` has 32.
#ifndef _FILE_OFFSET_BITS
#define _FILE_OFFSET_BITS 64
#endif

#include "host/stdio_host.h"

#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include <sys/stat.h>
#include <sys/types.h>

namespace {

static_assert(sizeof(off_t) == sizeof(int64_t), "fseeko and ftello must reach beyond 2 GiB");

thread_local int openError = 0;

void* Allocate(uint32_t size)
{
    return std::malloc(size);
}

void Release(void* memory)
{
    std::free(memory);
}

void* Copy(void* destination, const void* source, uint32_t count)
{
    return std::memcpy(destination, source, count);
}

void* Fill(void* destination, int value, uint32_t count)
{
    return std::memset(destination, value, count);
}

std::FILE* AsFile(void* handle)
{
    return static_cast<std::FILE*>(handle);
}

// fopen opens a directory for reading without complaint; every read then fails as if the file were empty.
bool IsDirectory(std::FILE* file)
{
    struct stat status {};
    return fstat(fileno(file), &status) == 0 && S_ISDIR(status.st_mode);
}

void* Open(const char* path, const char* mode)
{
    std::FILE* const file = std::fopen(path, mode);
    if (file == nullptr) {
        openError = errno;
        return nullptr;
    }
    if (IsDirectory(file)) {
        std::fclose(file);
        openError = EISDIR;
        return nullptr;
    }
    std::setvbuf(file, nullptr, _IONBF, 0);
    openError = 0;
    return file;
}

int32_t Close(void* handle)
{
    return std::fclose(AsFile(handle));
}

// A signal may cut a read short; only the end of the file or a real failure ends the request.
uint32_t Read(void* buffer, uint32_t size, uint32_t count, void* handle)
{
    std::FILE* const file = AsFile(handle);
    const size_t wanted = size_t{size} * count;
    size_t done = 0;
    while (done < wanted) {
        errno = 0;
        done += std::fread(static_cast<char*>(buffer) + done, 1, wanted - done, file);
        if (done < wanted && errno != EINTR)
            break;
        std::clearerr(file);
    }
    return static_cast<uint32_t>(size == 0 ? 0 : done / size); // at most `count`
}

uint32_t Write(const void* buffer, uint32_t size, uint32_t count, void* handle)
{
    return static_cast<uint32_t>(std::fwrite(buffer, size, count, AsFile(handle))); // at most `count`
}

int32_t Seek64(void* handle, int64_t offset, int32_t whence)
{
    return fseeko(AsFile(handle), offset, whence);
}

int64_t Tell64(void* handle)
{
    return ftello(AsFile(handle));
}

int32_t Seek(void* handle, int32_t offset, int32_t whence)
{
    return Seek64(handle, offset, whence);
}

int32_t Tell(void* handle)
{
    const int64_t position = Tell64(handle);
    return position > INT32_MAX ? -1 : static_cast<int32_t>(position);
}

int32_t IsEof(void* handle)
{
    return std::feof(AsFile(handle));
}

int32_t Flush(void* handle)
{
    return std::fflush(AsFile(handle));
}

} // namespace

void flvd_stdio_host_fill(flvd_init_t* init)
{
    *init = {};
    init->mem_alloc = Allocate;
    init->mem_free = Release;
    init->mem_copy = Copy;
    init->mem_set = Fill;
    init->file_open = Open;
    init->file_read = Read;
    init->file_seek = Seek;
    init->file_tell = Tell;
    init->file_close = Close;
    init->file_eof = IsEof;
    init->file_flush = Flush;
    init->file_write = Write;
    init->file_seek64 = Seek64;
    init->file_tell64 = Tell64;
}

int flvd_stdio_host_open_error(void)
{
    return openError;
}
