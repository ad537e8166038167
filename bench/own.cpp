// Opens and plays a file in memory, through the C entry point and through flvdmx.hpp. Each runs in a separate function,
// so that a profiler can count the library's own instructions. Usage: flvdmx-own FILE. Prints the number of frames.

#include "flvdmx/flvdmx.hpp"
#include "flvdmx/memory_host.h"

#include <cinttypes>
#include <cstdio>
#include <fstream>
#include <iterator>
#include <vector>

extern "C" {

[[gnu::noinline]] int32_t OpenFile(flvd_ctx_t** instance, const flvd_init_t* init)
{
    flvd_open_info_t info;
    return QVX_FLV_DMX(FLVD_OP_OPEN, instance, init, &info);
}

[[gnu::noinline]] uint32_t PlayAll(flvd_ctx_t** instance)
{
    const flvd_frame_request_t request{};
    flvd_frame_t frame;
    uint32_t frames = 0;
    while (QVX_FLV_DMX(FLVD_OP_GET_FRAME, instance, &request, &frame) == 0)
        ++frames;
    return frames;
}

[[gnu::noinline]] uint32_t PlayByHeader(flvdmx::File* file)
{
    uint32_t frames = 0;
    for (const flvdmx::Frame& frame : file->frames())
        frames += frame.data.empty() ? 0U : 1U;
    return frames;
}
}

int main(int argc, char** argv)
{
    if (argc != 2)
        return 2;
    std::ifstream in(argv[1], std::ios::binary);
    const std::vector<char> bytes{std::istreambuf_iterator<char>(in), {}};
    flvd_memory_file_t file = {"file", bytes.data(), bytes.size(), nullptr};
    flvd_memory_host_add(&file);
    flvd_init_t init;
    flvd_memory_host_fill(&init);
    init.file_name = file.name;
    flvd_ctx_t* instance = nullptr;
    if (OpenFile(&instance, &init) != 0)
        return 1;
    const uint32_t frames = PlayAll(&instance);
    QVX_FLV_DMX(FLVD_OP_CLOSE, &instance, nullptr, nullptr);
    auto opened = flvdmx::File::open(file.name, flvdmx::Host(init));
    const bool same = PlayByHeader(&*opened) == frames;
    opened->close();
    flvd_memory_host_remove(&file);
    std::printf("%" PRIu32 "\n", frames);
    return same ? 0 : 1;
}
