// `flvdmx frames`: one line a frame, of a complete file or of one that is still being written.
#include <algorithm>
#include <chrono>
#include <cstring>
#include <filesystem>
#include <memory>
#include <optional>
#include <system_error>
#include <thread>

#include <fmt/core.h>

#include "tools/commands.h"
#include "tools/demuxer.h"
#include "tools/frame_source.h"
#include "tools/progress.h"
#include "tools/report.h"
#include "tools/tags.h"

namespace tool {

namespace {

constexpr std::chrono::milliseconds POLL_INTERVAL{50};

int64_t FileSize(const std::string& path)
{
    std::error_code failure;
    const auto size = std::filesystem::file_size(path, failure);
    return failure ? 0 : static_cast<int64_t>(size);
}

// Watches the size of a file that is being written.
class Growth {
public:
    Growth(const std::string& path, double timeoutSeconds)
        : m_path(path), m_timeout(timeoutSeconds), m_size(FileSize(path))
    {
    }

    // Waits until the file is larger than it was the last time; false when it did not grow for the timeout.
    bool Wait()
    {
        const auto start = std::chrono::steady_clock::now();
        for (;;) {
            if (const int64_t size = FileSize(m_path); size > m_size) {
                m_size = size;
                return true;
            }
            if (std::chrono::steady_clock::now() - start >= m_timeout)
                return false;
            std::this_thread::sleep_for(POLL_INTERVAL);
        }
    }

    int64_t Size() const { return m_size; }

private:
    const std::string m_path;
    const std::chrono::duration<double> m_timeout;
    int64_t m_size;
};

// Prints the frames up to the end of the wanted range, and knows when no more of them can come.
class FramePrinter {
public:
    FramePrinter(const FramesOptions& options, uint32_t streams) : m_options(options), m_open(streams) {}

    bool Done() const { return m_open == 0 || m_number >= m_options.count; }

    void Take(const Frame& frame)
    {
        if (m_options.toMs && frame.timeMs > *m_options.toMs) {
            m_open &= ~frame.stream;
            return;
        }
        ++m_number;
        if (m_options.json)
            PrintJson(FrameObject(m_number, frame));
        else
            Print(FrameLine(m_number, frame));
        if (m_options.follow)
            Flush();
        m_progress.Show(m_number, frame.timeMs);
    }

private:
    const FramesOptions& m_options;
    uint32_t m_open; // streams that have not passed the end of the range
    uint64_t m_number = 0;
    Progress m_progress;
};

uint32_t OpenBits(const FramesOptions& options)
{
    return BitsIf(options.separateAudio, FLVD_OPT_SEPARATE_AUDIO_READER) | BitsIf(options.follow, FLVD_OPT_PROGRESSIVE);
}

void SeekToStart(Demuxer& demuxer, const FramesOptions& options)
{
    if (options.fromMs)
        demuxer.Seek(*options.fromMs, FLVD_SEEK_BACKWARD);
}

// The entry point does not tell what it passes over: that takes a walk of its own.
void WarnOfLoss(const Demuxer& demuxer)
{
    TagReader reader(demuxer);
    while (reader.Next())
        ;
    WarnOfSkipped(demuxer, reader);
}

void PrintComplete(const FramesOptions& options)
{
    Demuxer demuxer(options.file, OpenBits(options));
    WarnIfCutShort(demuxer);
    const uint32_t streams = options.streams & demuxer.Streams();
    if (streams == 0)
        throw DemuxError(fmt::format("the file has no {} stream", StreamName(options.streams)));
    SeekToStart(demuxer, options);
    demuxer.AcceptAllTimes();
    FrameSource source(demuxer, streams);
    FramePrinter printer(options, streams);
    while (!printer.Done()) {
        const std::optional<Frame> frame = source.Next();
        if (!frame)
            break;
        printer.Take(*frame);
    }
    if (!printer.Done() && !options.fromMs)
        WarnOfLoss(demuxer);
}

// The streams that the file header promises. Read through the library's own reader, which is put back.
uint32_t AnnouncedStreams(const Demuxer& demuxer)
{
    constexpr char SIGNATURE[] = {'F', 'L', 'V'};
    constexpr uint32_t FLAGS_OFFSET = 4;
    constexpr uint8_t VIDEO_FLAG = 0x01;
    constexpr uint8_t AUDIO_FLAG = 0x04;
    fio_file_t* const reader = demuxer.Reader(FLVD_STREAM_VIDEO);
    const uint8_t* bytes = nullptr;
    uint32_t streams = 0;
    if (__FLV_DMX__fioSeek64(reader, 0, FIO_SEEK_SET) == 0 &&
        __FLV_DMX__fioShowBytesByPtr(&bytes, FLAGS_OFFSET + 1, reader) == FLAGS_OFFSET + 1 &&
        std::memcmp(bytes, SIGNATURE, sizeof SIGNATURE) == 0) {
        streams = BitsIf((bytes[FLAGS_OFFSET] & VIDEO_FLAG) != 0, FLVD_STREAM_VIDEO) |
                  BitsIf((bytes[FLAGS_OFFSET] & AUDIO_FLAG) != 0, FLVD_STREAM_AUDIO);
    }
    __FLV_DMX__fioSeek64(reader, demuxer.Instance()->data_offset, FIO_SEEK_SET);
    return streams;
}

// Opens as soon as the file holds enough. With two readers a stream that was not found at the open is never played,
// so that open waits for all streams that the file header promises.
std::unique_ptr<Demuxer> OpenGrowing(const FramesOptions& options, Growth& growth)
{
    for (;;) {
        try {
            auto demuxer = std::make_unique<Demuxer>(options.file, OpenBits(options));
            const bool complete = (AnnouncedStreams(*demuxer) & ~demuxer->Streams()) == 0;
            if (complete || !options.separateAudio || !growth.Wait())
                return demuxer;
        } catch (const DemuxError& error) {
            if (error.Code() == FLVD_ERR_OPEN_MAIN || error.Code() == FLVD_ERR_OPEN_AUDIO || !growth.Wait())
                throw;
        }
    }
}

void WarnOfRest(const Demuxer& demuxer, const Growth& growth)
{
    const int64_t rest =
        growth.Size() - std::max(demuxer.Position(FLVD_STREAM_VIDEO), demuxer.Position(FLVD_STREAM_AUDIO));
    if (rest > 0)
        Complain(demuxer.Path(), fmt::format("warning: the last {} bytes hold no whole frame", rest));
}

void PrintGrowing(const FramesOptions& options)
{
    Growth growth(options.file, options.timeoutSeconds);
    const std::unique_ptr<Demuxer> demuxer = OpenGrowing(options, growth);
    FramePrinter printer(options, options.streams & (AnnouncedStreams(*demuxer) | demuxer->Streams()));
    SeekToStart(*demuxer, options);
    FrameSource source(*demuxer, options.streams);
    while (!printer.Done()) {
        if (const std::optional<Frame> frame = source.Next()) {
            printer.Take(*frame);
        } else if (growth.Wait()) {
            source.Refresh();
        } else {
            WarnOfRest(*demuxer, growth);
            return;
        }
    }
}

} // namespace

int RunFrames(const FramesOptions& options)
{
    try {
        if (options.follow)
            PrintGrowing(options);
        else
            PrintComplete(options);
        return DONE;
    } catch (const DemuxError& error) {
        Complain(options.file, error.Message());
        return FAILED;
    }
}

} // namespace tool
