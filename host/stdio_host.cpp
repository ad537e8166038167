// Host functions over the C library's streams.
#ifndef _FILE_OFFSET_BITS
#define _FILE_OFFSET_BITS 64 // fseeko and ftello take and give 64 bits on 32-bit systems too
#endif

#include "flvdmx/stdio_host.h"

#include "host/adapter.h"

#include <cerrno>
#include <cstdio>

#include <sys/stat.h>
#include <sys/types.h>

namespace {

static_assert(sizeof(off_t) == sizeof(int64_t), "fseeko and ftello must reach beyond 2 GiB");

// fopen opens a directory for reading without complaint; every read then fails as if the file were empty.
bool IsDirectory(std::FILE* file)
{
    struct stat status {};
    return fstat(fileno(file), &status) == 0 && S_ISDIR(status.st_mode);
}

struct StdioFiles {
    using Handle = std::FILE;

    static Handle* Open(const char* path, const char* mode)
    {
        std::FILE* const file = std::fopen(path, mode);
        flvd_host::SetOpenError(file == nullptr ? errno : 0);
        if (file == nullptr)
            return nullptr;
        if (IsDirectory(file)) {
            std::fclose(file);
            flvd_host::SetOpenError(EISDIR);
            return nullptr;
        }
        std::setvbuf(file, nullptr, _IONBF, 0);
        return file;
    }

    // A signal may cut a read short; only the end of the file or a real failure ends the request.
    static size_t Read(Handle* file, void* buffer, size_t wanted)
    {
        size_t done = 0;
        while (done < wanted) {
            errno = 0;
            done += std::fread(static_cast<char*>(buffer) + done, 1, wanted - done, file);
            if (done < wanted && errno != EINTR)
                break;
            std::clearerr(file);
        }
        return done;
    }

    static size_t Write(Handle* file, const void* buffer, size_t count) { return std::fwrite(buffer, 1, count, file); }
    static int Seek(Handle* file, int64_t offset, int whence) { return fseeko(file, offset, whence); }
    static int64_t Tell(Handle* file) { return ftello(file); }
    static bool AtEnd(const Handle* file) { return std::feof(const_cast<Handle*>(file)) != 0; }
    static int Flush(Handle* file) { return std::fflush(file); }
    static int Close(Handle* file) { return std::fclose(file); }
};

} // namespace

void flvd_stdio_host_fill(flvd_init_t* init)
{
    flvd_host::FillTables<StdioFiles>(init);
}

int flvd_stdio_host_open_error(void)
{
    return flvd_host::OpenError();
}
