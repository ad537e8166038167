// `flvdmx frames`: one line per frame, of a complete file or of one that is still being written.
#include <algorithm>
#include <cerrno>
#include <chrono>
#include <filesystem>
#include <optional>
#include <system_error>
#include <thread>
#include <utility>
#include <vector>

#include <fmt/core.h>

#include "tools/commands.h"
#include "tools/frame_source.h"
#include "tools/input.h"
#include "tools/played.h"
#include "tools/progress.h"
#include "tools/report.h"
#include "tools/times.h"

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
    Growth(std::string path, double timeoutSeconds)
        : m_path(std::move(path)), m_timeout(timeoutSeconds), m_size(FileSize(m_path))
    {
    }

    // Waits until the file has grown since the last call. Returns false after the timeout.
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

// Prints the frames of the requested range, and knows when no more can follow.
class FramePrinter {
public:
    FramePrinter(const FramesOptions& options, uint32_t streams)
        : m_options(options), m_streams(streams), m_open(streams), m_started(!options.fromMs)
    {
        if (options.format == Format::csv)
            Print(FrameRecord::CSV_HEADING);
    }

    bool Done() const { return m_open == 0 || m_number >= m_options.count; }

    void Take(const FrameRecord& frame)
    {
        if (!m_started)
            Hold(frame);
        else
            Show(frame);
        m_progress.Show(m_number, frame.timeMs);
    }

    bool Started() const { return m_started; }

    // Erases the progress, and prints a held frame that is exactly at the requested time, if no later one has released
    // it.
    void Finish()
    {
        m_progress.Wipe();
        const auto sought = [this](const FrameRecord& frame) { return frame.timeMs == *m_options.fromMs; };
        if (std::any_of(m_held.begin(), m_held.end(), sought))
            ShowHeld();
    }

private:
    // Until the requested time is reached, keeps the frames from the last keyframe on: the range begins there. Without
    // video, it begins at the requested time.
    void Hold(const FrameRecord& frame)
    {
        const bool video = (m_streams & FLVD_STREAM_VIDEO) != 0;
        m_started = frame.timeMs > *m_options.fromMs || (!video && frame.timeMs == *m_options.fromMs);
        if (!video || (!m_started && frame.IsVideo() && frame.keyframe))
            m_held.clear();
        m_held.push_back(frame);
        if (m_started)
            ShowHeld();
    }

    void ShowHeld()
    {
        for (const FrameRecord& held : std::exchange(m_held, {}))
            Show(held);
    }

    void Show(const FrameRecord& frame)
    {
        m_times.Take(frame.stream, frame.timeMs);
        if (m_options.toMs && m_times.Time() > *m_options.toMs) {
            m_open &= ~static_cast<uint32_t>(frame.stream);
            return;
        }
        if ((m_options.keyframes && !frame.keyframe) || Done())
            return;
        ++m_number;
        switch (m_options.format) {
        case Format::json:
            PrintJson(frame.Object(m_number));
            break;
        case Format::csv:
            Print(frame.Csv(m_number));
            break;
        case Format::text:
            Print((m_number == 1 ? FrameRecord::HEADING : "") + frame.Line(m_number));
        }
        if (m_options.follow)
            Flush();
    }

    const FramesOptions& m_options;
    const uint32_t m_streams;
    uint32_t m_open; // streams that have not passed the end of the range
    bool m_started;
    std::vector<FrameRecord> m_held;
    uint64_t m_number = 0;
    Times m_times; // prevents a single wrong time from ending the range
    Progress m_progress;
};

flvdmx::Options OpenOptions(const FramesOptions& options)
{
    flvdmx::Options open;
    open.separate_audio_reader = options.separateAudio;
    open.growing = options.follow;
    return open;
}

uint32_t WantedStreams(const FramesOptions& options)
{
    return options.keyframes ? options.streams & FLVD_STREAM_VIDEO : options.streams;
}

void PrintComplete(const FramesOptions& options)
{
    Input input(options.file, OpenOptions(options));
    input.WarnIfCutShort();
    const uint32_t streams = WantedStreams(options) & input.Streams();
    RequireStream(input, WantedStreams(options));
    WarnOfUnplayed(input);
    if (options.fromMs || options.toMs)
        WarnOfRestarts(input);
    ReadProgress progress(input.name, input.info.size);
    if (options.fromMs) // if this fails, as in large damage, the file is read from the beginning up to the time
        static_cast<void>(input.SeekToStart(*options.fromMs));
    input.file.accept_all_times();
    Played played(input);
    FrameSource source(input, streams, &played);
    FramePrinter printer(options, streams);
    while (!printer.Done()) {
        const std::optional<FrameRecord> frame = source.Next();
        progress.Hide(); // it is shown only while nothing is printed
        if (!frame)
            break;
        printer.Take(*frame);
    }
    printer.Finish();
    if (printer.Done() || options.fromMs)
        return;
    if (options.separateAudio)
        played.Walk([](const Tag&) { return true; }); // two readers do not deliver frames in file order
    else
        played.Finish();
    progress.Wipe();
    played.Warn();
}

uint32_t Announced(const Input& input)
{
    TagReader reader(input.name);
    return AnnouncedStreams(reader);
}

// Opens the file as soon as it exists and contains enough. With two readers, a stream that the open did not find is
// never played, so the open waits for all streams that the file header announces.
Input OpenGrowing(const FramesOptions& options, Growth& growth)
{
    for (bool told = false;;) {
        flvdmx::result<flvdmx::File> file = flvdmx::File::open(PathOf(options.file), Host(), OpenOptions(options));
        const flvdmx::error error = file.error();
        if (file) {
            Input input(options.file, std::move(*file));
            const bool complete = (Announced(input) & ~input.Streams()) == 0;
            if (complete || !options.separateAudio || !growth.Wait())
                return input;
            continue;
        }
        const bool absent = error.system_error() == ENOENT;
        if (absent && !std::exchange(told, true))
            Complain(options.file, "note: waiting for the file");
        if ((error.kind() != flvdmx::Kind::not_yet && !absent) || !growth.Wait())
            throw FileError(options.file, OpenFailureText(options.file, error), error);
    }
}

void WarnOfRest(const Input& input, const Growth& growth)
{
    const flvd_ctx_t& instance = input.Instance();
    const int64_t rest = growth.Size() - std::max(__FLV_DMX__fioTell64(instance.main_reader),
                                                  __FLV_DMX__fioTell64(instance.audio_reader));
    if (rest > 0)
        Complain(input.name,
                 fmt::format("warning: the last {} bytes are not a complete frame, or are damaged; without --follow, "
                             "'flvdmx frames' reads across damage",
                             rest));
}

void PrintGrowing(const FramesOptions& options)
{
    if (options.file == STANDARD_STREAM)
        throw FileError(options.file, "cannot be followed: give the name of the file that is being written");
    Growth growth(options.file, options.timeoutSeconds);
    Input input = OpenGrowing(options, growth);
    const uint32_t wanted = WantedStreams(options);
    FramePrinter printer(options, wanted & (Announced(input) | input.Streams()));
    FrameSource source(input, wanted);
    bool told = false;
    while (!printer.Done()) {
        if (const std::optional<FrameRecord> frame = source.Next()) {
            printer.Take(*frame);
        } else {
            if (options.fromMs && !printer.Started() && !std::exchange(told, true))
                Complain(input.name, fmt::format("note: waiting for {}", FormatTime(*options.fromMs)));
            if (growth.Wait()) {
                source.Refresh();
                continue;
            }
            printer.Finish();
            WarnOfRest(input, growth);
            return;
        }
    }
}

} // namespace

int RunFrames(const FramesOptions& options)
{
    if (options.follow)
        PrintGrowing(options);
    else
        PrintComplete(options);
    return DONE;
}

} // namespace tool
