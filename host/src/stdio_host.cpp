// Host functions over the C library's streams.
#ifndef _FILE_OFFSET_BITS
#define _FILE_OFFSET_BITS 64 // fseeko and ftello take and give 64 bits on 32-bit systems too
#endif

#include "flvdmx/stdio_host.h"

#include "host/src/adapter.h"

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
    struct Handle {
        std::FILE* stream;
        flvd_host::CountedPosition position;
    };

    static Handle* Open(const char* path, const char* mode)
    {
        std::FILE* const stream = std::fopen(path, mode);
        flvd_host::SetOpenError(stream == nullptr ? errno : 0);
        if (stream == nullptr)
            return nullptr;
        const bool directory = IsDirectory(stream);
        auto* const file = directory ? nullptr : flvd_host::NewHandle<Handle>();
        if (file == nullptr) {
            flvd_host::SetOpenError(directory ? EISDIR : ENOMEM);
            std::fclose(stream);
            return nullptr;
        }
        std::setvbuf(stream, nullptr, _IONBF, 0);
        file->stream = stream;
        return file;
    }

    // A signal may cut a read short; only the end of the file or a real failure ends the request.
    static size_t Read(Handle* file, void* buffer, size_t wanted)
    {
        size_t done = 0;
        while (done < wanted) {
            errno = 0;
            done += std::fread(static_cast<char*>(buffer) + done, 1, wanted - done, file->stream);
            if (done < wanted && errno != EINTR)
                break;
            std::clearerr(file->stream);
        }
        file->position.Pass(done);
        return done;
    }

    static size_t Write(Handle* file, const void* buffer, size_t count)
    {
        file->position.Forget(); // a file that is appended to is written at its end
        return std::fwrite(buffer, 1, count, file->stream);
    }

    static int Seek(Handle* file, int64_t offset, int whence)
    {
        file->position.Forget();
        return fseeko(file->stream, offset, whence);
    }

    static int64_t Tell(Handle* file)
    {
        if (!file->position.known)
            file->position.Learn(ftello(file->stream));
        return file->position.at;
    }

    static bool AtEnd(const Handle* file) { return std::feof(file->stream) != 0; }
    static int Flush(Handle* file) { return std::fflush(file->stream); }

    static int Close(Handle* file)
    {
        std::FILE* const stream = file->stream;
        std::free(file);
        return std::fclose(stream);
    }
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
