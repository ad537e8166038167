// A file to read.
#include "tools/input.h"

#include <array>
#include <cerrno>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <utility>

#include <fmt/core.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>

#include "flvdmx/posix_host.h"
#include "tools/played.h"
#include "tools/progress.h"
#include "tools/report.h"

namespace tool {

namespace {

// Standard input as a seekable descriptor: itself if it is a file, otherwise a copy in memory.
int SeekableStandardInput()
{
    struct stat status {};
    if (fstat(STDIN_FILENO, &status) == 0 && S_ISREG(status.st_mode))
        return STDIN_FILENO;
    const int copy = memfd_create("standard input", MFD_CLOEXEC);
    std::array<char, 65536> block{};
    uint64_t total = 0;
    for (ssize_t got = 0; (got = read(STDIN_FILENO, block.data(), block.size())) > 0;) {
        total += static_cast<uint64_t>(got);
        if (total > STANDARD_INPUT_MAX)
            throw FileError(STANDARD_STREAM, fmt::format("it is larger than the {} MiB that are kept in memory: "
                                                         "write it to a file first",
                                                         STANDARD_INPUT_MAX >> 20));
        if (write(copy, block.data(), static_cast<size_t>(got)) != got)
            throw FileError(STANDARD_STREAM, fmt::format("cannot be copied to memory: {}", std::strerror(errno)));
    }
    return copy;
}

// The library reports only that there is no valid header. The first bytes of the file explain more.
std::string HeaderFailureText(const std::string& path)
{
    std::error_code failure;
    const auto size = std::filesystem::file_size(path, failure);
    if (failure)
        return "not an FLV file";
    if (size == 0)
        return "not an FLV file: the file is empty";
    if (HasSignature(path))
        return fmt::format("the FLV file header is damaged or cut short (the file has {} bytes)", size);
    return "not an FLV file: it does not start with the signature FLV";
}

const flvd_init_t& PosixFunctions()
{
    static const flvdmx::Host host = flvdmx::make_host(flvd_posix_host_fill);
    return host.functions();
}

uint32_t ReadAndShow(void* buffer, uint32_t size, uint32_t count, void* handle)
{
    ReadProgress::ShowRead(PosixFunctions().file_tell64(handle));
    return PosixFunctions().file_read(buffer, size, count, handle);
}

flvdmx::Host MakeHost()
{
    flvd_init_t functions = PosixFunctions();
    functions.file_read = ReadAndShow;
    return flvdmx::Host(functions);
}

} // namespace

const flvdmx::Host& Host()
{
    static const flvdmx::Host host = MakeHost();
    return host;
}

bool HasSignature(const std::string& path)
{
    constexpr std::array SIGNATURE = {'F', 'L', 'V'};
    std::array<char, SIGNATURE.size()> bytes{};
    std::ifstream(path, std::ios::binary).read(bytes.data(), bytes.size());
    return bytes == SIGNATURE;
}

std::string PathOf(const std::string& name)
{
    if (name == STANDARD_STREAM) {
        static const int descriptor = SeekableStandardInput();
        return fmt::format("/proc/self/fd/{}", descriptor);
    }
    struct stat status {};
    const bool special = stat(name.c_str(), &status) == 0 && !S_ISREG(status.st_mode) && !S_ISBLK(status.st_mode) &&
                         !S_ISDIR(status.st_mode);
    if (special) // opening a pipe that nobody writes to would block
        throw FileError(name,
                        "cannot be opened: a pipe or device is not seekable; 'flvdmx COMMAND - <FILE' "
                        "reads a pipe into memory",
                        {flvdmx::Kind::failed, FLVD_ERR_OPEN_MAIN, 0});
    return name;
}

std::string OpenFailureText(const std::string& name, const flvdmx::error& error)
{
    if (error.code() == FLVD_ERR_OPEN_MAIN || error.code() == FLVD_ERR_OPEN_AUDIO)
        return fmt::format("cannot be opened: {}",
                           error.system_error() != 0 ? std::strerror(error.system_error()) : "out of memory");
    if (error.code() == FLVD_ERR_FILE_HEADER)
        return HeaderFailureText(PathOf(name));
    const std::string why = WhyNothingIsPlayed(name, error.code());
    return why.empty() ? error.text() : why;
}

Input::Input(const std::string& file_name, flvdmx::File&& opened)
    : name(file_name), file(std::move(opened)), info(file.info()),
      audioFormat(static_cast<uint8_t>(Instance().audio_format_filter))
{
    constexpr uint32_t ENHANCED = 0x80; // no frame is delivered
    if (info.video && (Instance().video_codec_filter & ENHANCED) != 0)
        info.video.reset();
}

Input::Input(const std::string& file_name, const flvdmx::Options& options) : name(file_name)
{
    flvdmx::result<flvdmx::File> opened = flvdmx::File::open(PathOf(name), Host(), options);
    if (!opened)
        throw FileError(name, OpenFailureText(name, opened.error()), opened.error());
    *this = Input(name, std::move(*opened));
}

uint32_t Input::Streams() const
{
    return (info.video ? uint32_t{FLVD_STREAM_VIDEO} : 0) | (info.audio ? uint32_t{FLVD_STREAM_AUDIO} : 0);
}

flvdmx::result<flvdmx::Milliseconds> Input::Seek(flvdmx::Milliseconds time, flvdmx::SeekMode mode)
{
    const auto reached = file.seek(time, mode);
    if (reached.error().kind() != flvdmx::Kind::failed || Instance().seek_method != FLVD_SEEK_BY_INDEX)
        return reached;
    file.ignore_index();
    const auto scanned = file.seek(time, mode);
    if (scanned.error().kind() != flvdmx::Kind::failed)
        Complain(name, "warning: the keyframe index leads to no keyframe there, so the tags were searched instead");
    return scanned;
}

flvdmx::result<flvdmx::Milliseconds> Input::SeekToStart(int32_t ms)
{
    const auto reached = Seek(flvdmx::Milliseconds(ms), flvdmx::SeekMode::backward);
    if (reached.error().kind() == flvdmx::Kind::miss)
        throw FileError(
            name,
            fmt::format("there is no frame at {}: the last one is at {}", FormatTime(ms), FormatTime(info.duration)),
            reached.error());
    return reached;
}

int64_t Input::Rest() const
{
    return Instance().data_end < info.size ? info.size - Instance().data_end : 0;
}

void Input::WarnIfCutShort() const
{
    if (Instance().file_shorter_than_meta != 0)
        Complain(name, "warning: the file is cut short: its metadata announces a larger file");
    if (Rest() > 0)
        Complain(name, fmt::format("warning: the last {} bytes are not a complete tag and are not played", Rest()));
}

} // namespace tool
