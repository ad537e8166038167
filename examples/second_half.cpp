// Prints the title and the keyframes of a file, and writes the frames of its second half: second_half FILE OUTPUT
#include "flvdmx/flvdmx.hpp"

#include <cstdio>
#include <cstring>
#include <fstream>
#include <string>

static int complain(const char* what, const flvdmx::error& error)
{
    const char* const reason = error.system_error() != 0 ? std::strerror(error.system_error()) : error.name();
    std::fprintf(stderr, "second_half: %s: %s (%s)\n", what, error.text(), reason);
    return 1;
}

static long long number(flvdmx::Milliseconds time)
{
    return time.count();
}

int main(int argc, char** argv)
{
    if (argc != 3)
        return std::fputs("usage: second_half FILE OUTPUT\n", stderr), 2;
    auto file = flvdmx::File::open(argv[1]);
    if (!file)
        return complain(argv[1], file.error());

    const auto metadata = file->metadata();
    const auto keyframes = file->keyframes();
    if (!metadata || !keyframes)
        return complain(argv[1], metadata ? keyframes.error() : metadata.error());
    const std::string title = metadata->text("title");
    std::printf("title: %s\n", title.empty() ? "none" : title.c_str());
    for (const flvdmx::Keyframe& keyframe : *keyframes)
        std::printf("keyframe: %lld ms, byte %lld\n", number(keyframe.time), static_cast<long long>(keyframe.position));

    const auto reached = file->seek(file->info().duration / 2, flvdmx::SeekMode::backward);
    if (!reached)
        return complain("seek", reached.error());
    std::ofstream output(argv[2], std::ios::binary);
    for (const flvdmx::Frame& frame : file->frames()) {
        std::printf("frame: shown at %lld ms, %zu bytes\n", number(frame.presentation_time()), frame.data.size());
        output.write(reinterpret_cast<const char*>(frame.data.data()), static_cast<std::streamsize>(frame.data.size()));
    }
    if (file->last_error().kind() != flvdmx::Kind::end)
        return complain(argv[1], file->last_error());
    return output.flush() ? 0 : (std::perror(argv[2]), 1);
}
