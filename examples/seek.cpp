// Seeks to the keyframe at or before a time and shows the frames that follow: seek FILE SECONDS
#include "flvdmx/flvdmx.hpp"

#include <chrono>
#include <cstdio>
#include <cstdlib>

namespace {

constexpr int SHOWN = 5;

int complain(const char* what, const flvdmx::error& error)
{
    std::fprintf(stderr, "seek: %s: %s (%s)\n", what, error.text(), error.name());
    return 1;
}

void show(const flvdmx::Frame& frame)
{
    const char* const stream = frame.stream == flvdmx::Stream::video ? "video" : "audio";
    std::printf("%8lld ms  %s  %zu bytes\n", static_cast<long long>(frame.time.count()), stream, frame.data.size());
}

} // namespace

int main(int argc, char** argv)
{
    if (argc != 3) {
        std::fprintf(stderr, "usage: seek FILE SECONDS\n");
        return 2;
    }
    auto file = flvdmx::File::open(argv[1]);
    if (!file)
        return complain(argv[1], file.error());

    const std::chrono::seconds target(std::strtol(argv[2], nullptr, 10));
    const auto reached = file->seek(target, flvdmx::SeekMode::backward);
    if (!reached)
        return complain(argv[2], reached.error());
    std::printf("reached %lld ms\n", static_cast<long long>(reached->count()));

    int shown = 0;
    for (const flvdmx::Frame& frame : file->frames()) {
        show(frame);
        if (++shown == SHOWN)
            return 0;
    }
    const flvdmx::error end = file->last_error(); // why the loop ended
    return end.kind() == flvdmx::Kind::end ? 0 : complain(argv[1], end);
}
