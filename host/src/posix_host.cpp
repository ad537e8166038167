// Host functions over POSIX descriptors.
#ifndef _FILE_OFFSET_BITS
#define _FILE_OFFSET_BITS 64 // lseek takes and gives 64 bits on 32-bit systems too
#endif

#include "flvdmx/posix_host.h"

#include "host/src/adapter.h"
#include "host/src/descriptor.h"

#include <cerrno>

#include <sys/types.h>
#include <unistd.h>

namespace {

static_assert(sizeof(off_t) == sizeof(int64_t), "lseek must reach beyond 2 GiB");

struct PosixFiles {
    struct Handle {
        int descriptor;
        bool end; // a read met the end of the file and no seek followed
        flvd_host::CountedPosition position;
    };

    static Handle* Open(const char* path, const char* mode) { return flvd_host::OpenHandle<Handle>(path, mode); }

    static int Close(Handle* file) { return flvd_host::CloseHandle(file); }

    static size_t Read(Handle* file, void* buffer, size_t wanted)
    {
        const size_t got =
            flvd_host::ReadAtLeast(file->descriptor, flvd_host::FROM_HERE, buffer, wanted, wanted, &file->end);
        file->position.Pass(got);
        return got;
    }

    static size_t Write(Handle* file, const void* buffer, size_t count)
    {
        file->position.Forget(); // a file that is appended to is written at its end
        size_t done = 0;
        while (done < count) {
            const ssize_t put = write(file->descriptor, static_cast<const char*>(buffer) + done, count - done);
            if (put < 0 && errno == EINTR)
                continue;
            if (put <= 0)
                break;
            done += static_cast<size_t>(put);
        }
        return done;
    }

    static int Seek(Handle* file, int64_t offset, int whence)
    {
        const int64_t position = lseek(file->descriptor, offset, whence);
        if (position < 0)
            return -1;
        file->position.Learn(position);
        file->end = false;
        return 0;
    }

    static int64_t Tell(Handle* file)
    {
        if (!file->position.known)
            file->position.Learn(lseek(file->descriptor, 0, SEEK_CUR));
        return file->position.at;
    }

    static bool AtEnd(const Handle* file) { return file->end; }
    static int Flush(Handle*) { return 0; } // nothing waits here
};

} // namespace

void flvd_posix_host_fill(flvd_init_t* init)
{
    flvd_host::FillTables<PosixFiles>(init);
}

int flvd_posix_host_open_error(void)
{
    return flvd_host::OpenError();
}
