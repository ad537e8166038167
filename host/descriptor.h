// What the hosts over POSIX descriptors have in common.
#ifndef FLVDMX_HOST_DESCRIPTOR_H
#define FLVDMX_HOST_DESCRIPTOR_H

#include <cstddef>

namespace flvd_host {

/** Opens a file, to be closed on exec. @return descriptor, or -1 with the reason in OpenError() */
int OpenDescriptor(const char* path, const char* mode);

/**
 * Reads at least `least` bytes, at most `most`: goes on after signals and short reads.
 *
 * @param end set when the end of the file was met, else left as it is
 * @return bytes read; fewer than `least`: the end was met, or reading failed
 */
size_t ReadAtLeast(int descriptor, void* buffer, size_t least, size_t most, bool* end);

} // namespace flvd_host

#endif
