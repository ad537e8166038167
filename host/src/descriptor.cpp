// Opening and reading POSIX descriptors, and the reason of the last failed open.
#ifndef _FILE_OFFSET_BITS
#define _FILE_OFFSET_BITS 64 // a 32-bit open() refuses files of 2 GiB and more
#endif

#include "host/src/descriptor.h"

#include "host/src/adapter.h"

#include <cerrno>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace flvd_host {

namespace {

thread_local int openError = 0;

constexpr mode_t NEW_FILE_MODE = 0666; // less what the process masks

// The flags that fopen would take for this mode.
int OpenFlags(const char* mode)
{
    const bool both = std::strchr(mode, '+') != nullptr;
    switch (mode[0]) {
    case 'w':
        return (both ? O_RDWR : O_WRONLY) | O_CREAT | O_TRUNC;
    case 'a':
        return (both ? O_RDWR : O_WRONLY) | O_CREAT | O_APPEND;
    default:
        return both ? O_RDWR : O_RDONLY;
    }
}

// A directory opens for reading; only its reads fail, as if the file were empty.
bool IsDirectory(int descriptor)
{
    struct stat status {};
    return fstat(descriptor, &status) == 0 && S_ISDIR(status.st_mode);
}

} // namespace

void SetOpenError(int error)
{
    openError = error;
}

int OpenError()
{
    return openError;
}

int OpenDescriptor(const char* path, const char* mode)
{
    int descriptor = -1;
    do
        descriptor = open(path, OpenFlags(mode) | O_CLOEXEC, NEW_FILE_MODE);
    while (descriptor < 0 && errno == EINTR);
    SetOpenError(descriptor < 0 ? errno : 0);
    if (descriptor < 0 || !IsDirectory(descriptor))
        return descriptor;
    close(descriptor);
    SetOpenError(EISDIR);
    return -1;
}

size_t ReadAtLeast(int descriptor, int64_t from, void* buffer, size_t least, size_t most, bool* end)
{
    size_t done = 0;
    while (done < least) {
        auto* const to = static_cast<char*>(buffer) + done;
        const ssize_t got = from == FROM_HERE ? read(descriptor, to, most - done)
                                              : pread(descriptor, to, most - done, from + static_cast<int64_t>(done));
        if (got < 0 && errno == EINTR)
            continue;
        if (got == 0)
            *end = true;
        if (got <= 0)
            break;
        done += static_cast<size_t>(got);
    }
    return done;
}

} // namespace flvd_host
