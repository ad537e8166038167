// What the hosts over POSIX descriptors have in common.
#ifndef FLVDMX_HOST_DESCRIPTOR_H
#define FLVDMX_HOST_DESCRIPTOR_H

#include "host/src/adapter.h"

#include <cerrno>
#include <cstddef>
#include <cstdlib>

#include <unistd.h>

namespace flvd_host {

/** Opens a file, to be closed on exec. @return descriptor, or -1 with the reason in OpenError() */
int OpenDescriptor(const char* path, const char* mode);

constexpr int64_t FROM_HERE = -1; /**< where the descriptor stands */

/**
 * Reads at least `least` bytes, at most `most`: goes on after signals and short reads.
 *
 * @param from place in the file, which does not move the descriptor; or FROM_HERE, which does
 * @param end set when the end of the file was met, else left as it is
 * @return bytes read; fewer than `least`: the end was met, or reading failed
 */
size_t ReadAtLeast(int descriptor, int64_t from, void* buffer, size_t least, size_t most, bool* end);

/** Opens a file as a handle with a member `descriptor`, the others being zero. @return null as OpenDescriptor() */
template <typename Handle> Handle* OpenHandle(const char* path, const char* mode)
{
    const int descriptor = OpenDescriptor(path, mode);
    if (descriptor < 0)
        return nullptr;
    auto* const file = NewHandle<Handle>();
    if (file == nullptr) {
        close(descriptor);
        SetOpenError(ENOMEM);
        return nullptr;
    }
    file->descriptor = descriptor;
    return file;
}

/** Closes what OpenHandle() opened. @return close()'s result */
template <typename Handle> int CloseHandle(Handle* file)
{
    const int result = close(file->descriptor);
    std::free(file);
    return result;
}

} // namespace flvd_host

#endif
