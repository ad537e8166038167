// What all subcommands print.
#include "tools/report.h"

#include <cerrno>
#include <cstdio>
#include <system_error>

#include <fmt/core.h>

#include "tools/time_text.h"

namespace tool {

void Print(std::string_view text)
{
    if (std::fwrite(text.data(), 1, text.size(), stdout) != text.size())
        throw std::system_error(errno, std::generic_category());
}

void Flush()
{
    if (std::fflush(stdout) != 0)
        throw std::system_error(errno, std::generic_category());
}

void PrintJson(const Json& document, int indent)
{
    // A file name need not be UTF-8, the document has to be.
    Print(document.dump(indent, ' ', false, Json::error_handler_t::replace) + "\n");
}

void Tell(const std::string& text)
{
    std::fputs(text.c_str(), stderr);
}

void Complain(const std::string& file, std::string_view text)
{
    std::fflush(stdout); // what came before is to stand before it on a terminal
    Tell(fmt::format("flvdmx: {}: {}\n", file, text));
}

void WarnIfCutShort(const Demuxer& demuxer)
{
    const flvd_ctx_t& instance = *demuxer.Instance();
    if (instance.file_shorter_than_meta != 0)
        Complain(demuxer.Path(), "warning: the file is cut short: its metadata announces more bytes than it has");
    if (const int64_t bytes = BytesBehindLastTag(instance); bytes > 0)
        Complain(demuxer.Path(), fmt::format("warning: the last {} bytes hold no whole tag and are not played", bytes));
}

void WarnOfSkipped(const Demuxer& demuxer, const TagReader& reader)
{
    if (reader.Skipped() > 0)
        Complain(demuxer.Path(),
                 fmt::format("warning: {} bytes, the first at byte {}, hold no sound tag of the streams "
                             "and are left out",
                             reader.Skipped(), reader.FirstSkipped()));
}

Json ErrorObject(const DemuxError& error)
{
    return {{"message", error.what()}, {"code", error.Code()}, {"line", error.Line()}};
}

const char* StreamName(uint32_t stream)
{
    return stream == FLVD_STREAM_VIDEO ? "video" : "audio";
}

std::string FrameLine(uint64_t number, const Frame& frame)
{
    return fmt::format("{:>7}  {}  {:>12}  {:>8}  {:08x}\n", number, StreamName(frame.stream), FormatTime(frame.timeMs),
                       frame.size, frame.crc);
}

Json FrameObject(uint64_t number, const Frame& frame)
{
    return {{"number", number},
            {"stream", StreamName(frame.stream)},
            {"time_ms", frame.timeMs},
            {"size", frame.size},
            {"crc32", fmt::format("{:08x}", frame.crc)}};
}

} // namespace tool
