// `flvdmx repair`, `flvdmx index` and `flvdmx cut`: new files from the playable parts of a file.
#include <algorithm>
#include <array>
#include <cstdint>
#include <filesystem>
#include <functional>
#include <limits>
#include <optional>
#include <string>
#include <system_error>
#include <vector>

#include <fmt/core.h>

#include "flvdmx/metadata.hpp"
#include "tools/codecs.h"
#include "tools/commands.h"
#include "tools/flv_writer.h"
#include "tools/input.h"
#include "tools/output_file.h"
#include "tools/played.h"
#include "tools/progress.h"
#include "tools/report.h"
#include "tools/tags.h"
#include "tools/times.h"

namespace tool {

namespace {

using flvdmx::Stream;

// Which frames to copy, and how to change their timestamps. Times count from the file's first timestamp.
struct RemuxOptions {
    bool continuous = false;                              // make timestamps continuous across jumps
    int64_t offsetMs = 0;                                 // added to each time
    int64_t fromMs = std::numeric_limits<int64_t>::min(); // first time to copy
    int64_t toMs = std::numeric_limits<int64_t>::max();   // first time not to copy
    uint32_t firstTimestamp = UINT32_MAX; // of the frames, once known; for the configurations at the beginning

    bool IsWhole() const { return fromMs == RemuxOptions().fromMs && toMs == RemuxOptions().toMs; }
};

// What was copied.
struct RemuxReport {
    std::array<uint64_t, 2> frames{};     // video, audio
    uint32_t firstTimestamp = UINT32_MAX; // smallest of the frames, which may not be that of the first one
    uint64_t jumps = 0;                   // of the timestamps, if they were made continuous
    int64_t bytesSkipped = 0;             // in bytes of the file

    bool IsEmpty() const { return frames[0] + frames[1] == 0; }
};

using TakeTag = std::function<void(const NewTag&)>;
using Pass = std::function<RemuxReport(const TakeTag& take)>;

NewTag MakeTag(const Tag& tag, uint32_t timestamp, std::vector<uint8_t> payload)
{
    return {tag.type(), timestamp, std::move(payload), tag.has_frame(), IsVideoKeyframe(tag)};
}

// Makes a new file's tags from those that are played. Two runs with the same arguments make the same tags;
// `firstTimestamp` changes only the timestamps of some of them.
class Remuxer {
public:
    Remuxer(const Input& input, const RemuxOptions& options, const TakeTag& take)
        : m_input(input), m_options(options), m_take(take), m_played(input)
    {
        if (input.info.video)
            m_tracks[0].config = m_tracks[0].first = input.info.video->config;
        if (input.info.audio)
            m_tracks[1].config = m_tracks[1].first = input.info.audio->config;
    }

    RemuxReport Run()
    {
        m_played.Walk([this](const Tag& tag) {
            if (tag.is_script())
                TakeScript(tag);
            else if (tag.is_config())
                TakeConfig(tag);
            else if (tag.has_frame())
                TakeFrame(tag);
            return !HasEnded(0) || !HasEnded(1);
        });
        m_report.jumps = m_times.Jumps();
        if (m_options.IsWhole())
            m_report.bytesSkipped += m_played.BytesSkipped() + m_input.Rest();
        else
            m_report.bytesSkipped += m_skipped - m_skippedBefore;
        return m_report;
    }

private:
    // A stream of the file.
    struct Track {
        std::vector<uint8_t> first{};   // configuration; empty for codecs without one
        std::vector<uint8_t> config{};  // the current one
        std::vector<uint8_t> written{}; // the last one in the new file
        bool hasEnded = false;
    };

    bool HasEnded(size_t track) const { return !m_input.Has(STREAMS[track]) || m_tracks[track].hasEnded; }
    bool IsWanted(int64_t time) const { return time >= m_options.fromMs && time < m_options.toMs; }

    static uint32_t Timestamp(int64_t time) // 32 bits, wrapping
    {
        return static_cast<uint32_t>(std::max<int64_t>(time, 0));
    }

    void TakeConfig(const Tag& tag)
    {
        std::vector<uint8_t> config = m_played.Reader().Config(tag);
        if (!config.empty())
            m_tracks.at(IndexOf(tag.stream())).config = std::move(config);
    }

    void TakeFrame(const Tag& tag)
    {
        Track& track = m_tracks.at(IndexOf(tag.stream()));
        int64_t time = m_input.TimeOf(tag);
        track.hasEnded = track.hasEnded || time >= m_options.toMs;
        if (!IsWanted(time))
            return;
        if (tag.is_avc() && track.config.empty()) { // it cannot be decoded
            m_report.bytesSkipped += tag.end() - tag.position;
            return;
        }
        time += m_options.offsetMs;
        if (m_options.continuous) {
            m_times.Take(tag.stream(), time);
            time = m_times.Time();
        }
        const uint32_t timestamp = Timestamp(time);
        const bool isFirst = m_report.IsEmpty();
        if (isFirst)
            for (size_t i = 0; i < m_tracks.size(); ++i)
                PutConfig(i,
                          IsValidConfig(STREAMS.at(i), m_tracks.at(i).config) ? m_tracks.at(i).config
                                                                              : m_tracks.at(i).first,
                          std::min(timestamp, m_options.firstTimestamp));
        PutConfig(IndexOf(tag.stream()), track.config, timestamp);
        m_skipped = m_played.BytesSkipped();
        if (isFirst)
            m_skippedBefore = m_skipped;
        ++m_report.frames.at(IndexOf(tag.stream()));
        m_report.firstTimestamp = std::min(m_report.firstTimestamp, timestamp);
        m_take(MakeTag(tag, timestamp, m_played.Reader().Payload(tag)));
    }

    // Cue points and texts are kept; the metadata is rebuilt.
    void TakeScript(const Tag& tag)
    {
        std::vector<uint8_t> payload = m_played.Reader().Payload(tag);
        const int64_t time = m_input.TimeOf(tag);
        if (!IsWanted(time) || flvdmx::Metadata::copy_properties(payload).has_value())
            return;
        const bool follows = m_options.continuous && !m_report.IsEmpty();
        const int64_t placed = time + m_options.offsetMs;
        m_take(MakeTag(tag, Timestamp(follows ? m_times.Near(placed) : placed), std::move(payload)));
    }

    void PutConfig(size_t track, const std::vector<uint8_t>& config, uint32_t timestamp)
    {
        constexpr uint8_t AVC_KEYFRAME = 0x17;
        if (config == m_tracks.at(track).written)
            return;
        m_tracks.at(track).written = config;
        std::vector<uint8_t> payload = {m_input.audioFormat, 0};
        if (track == 0)
            payload = {AVC_KEYFRAME, 0, 0, 0, 0};
        payload.insert(payload.end(), config.begin(), config.end());
        m_take({track == 0 ? uint8_t{FLVD_TAG_TYPE_VIDEO} : uint8_t{FLVD_TAG_TYPE_AUDIO}, timestamp, payload});
    }

    const Input& m_input;
    const RemuxOptions m_options;
    const TakeTag& m_take;
    Played m_played;
    std::array<Track, 2> m_tracks; // video, audio
    Times m_times;
    int64_t m_skippedBefore = 0; // bytes, before the first frame copied
    int64_t m_skipped = 0;       // before the last one
    RemuxReport m_report;
};

struct Metadata {
    int64_t position = -1; // of its tag; -1: the file has none
    std::vector<flvdmx::RawProperty> properties{};
};

Metadata FindMetadata(const Input& input)
{
    constexpr int MOST_TAGS = 102; // players search only these
    Metadata found;
    int tags = 0;
    TagReader reader(input.name, input.file.instance());
    reader.Walk(reader.FirstTag(), reader.FileSize(), [&](const Part& part) {
        if (part.tag.is_script() && part.tag.end() <= reader.FileSize())
            if (auto properties = flvdmx::Metadata::copy_properties(reader.Payload(part.tag));
                properties && !properties->empty())
                found = {part.begin, std::move(*properties)};
        return ++tags < MOST_TAGS && found.position < 0;
    });
    return found;
}

// The properties of the metadata; picture size and codecs are added if missing.
std::vector<flvdmx::RawProperty> PropertiesOf(const Input& input)
{
    std::vector<flvdmx::RawProperty> properties = FindMetadata(input).properties;
    const auto add = [&properties](const char* name, double value) {
        const auto has = [name](const flvdmx::RawProperty& property) { return property.name == name; };
        if (value > 0 && std::none_of(properties.begin(), properties.end(), has))
            properties.push_back(NumberProperty(name, value));
    };
    if (input.info.video) {
        const PictureSize size = PictureSizeOf(*input.info.video);
        add("width", size.width);
        add("height", size.height);
        add("videocodecid", static_cast<double>(input.info.video->codec));
    }
    if (input.info.audio)
        add("audiocodecid", static_cast<double>(input.info.audio->codec));
    return properties;
}

// Copies the tags of an undamaged file unchanged, except its metadata.
RemuxReport CopyTags(const Input& input, const TakeTag& take)
{
    constexpr uint32_t JITTER_MS = 1000; // larger steps back are jumps
    const auto refuse = [&input](const std::string& fault) {
        throw FileError(input.name, fault + ": use 'flvdmx repair'");
    };
    TagReader reader(input.name, input.file.instance());
    const int64_t metadata = FindMetadata(input).position;
    RemuxReport report;
    std::array<uint32_t, 2> latest{}; // timestamps of video and audio
    reader.Walk(reader.FirstTag(), reader.FileSize(), [&](const Part& part) {
        const Tag& tag = part.tag;
        if (part.kind == Part::Kind::damage)
            refuse(fmt::format("the file is damaged at byte {}", part.begin));
        if (part.kind == Part::Kind::unlinked)
            refuse(fmt::format("the back-pointer of the tag at byte {} is wrong", part.begin));
        if (tag.has_frame()) {
            uint32_t& time = latest.at(IndexOf(tag.stream()));
            if (time > tag.timestamp() && time - tag.timestamp() > JITTER_MS)
                refuse(fmt::format("timestamps jump at byte {}", part.begin));
            time = std::max(time, tag.timestamp());
            ++report.frames.at(IndexOf(tag.stream()));
        }
        NewTag copy = MakeTag(tag, tag.timestamp(), reader.Payload(tag));
        copy.streamId = tag.stream_id();
        if (part.begin != metadata)
            take(copy);
        return true;
    });
    return report;
}

// Warns of streams of the file that are not in the new one, and of streams in the new one that players cannot play.
void WarnOfWhatIsNotPlayed(const RewriteOptions& options, const Input& input, const RemuxReport& report)
{
    WarnOfUnplayed(input, (report.frames[0] == 0 ? uint32_t{FLVD_STREAM_VIDEO} : 0) |
                              (report.frames[1] == 0 ? uint32_t{FLVD_STREAM_AUDIO} : 0));
    std::error_code unknown;
    if (options.dryRun || options.out == STANDARD_STREAM || !std::filesystem::is_regular_file(options.out, unknown))
        return;
    try {
        const Input result(options.out);
        WarnOfUnplayed(result);
        if (const std::string fault = ConfigFault(result); !fault.empty())
            Complain(options.out, "warning: " + fault);
    } catch (const FileError& error) {
        Complain(options.out, fmt::format("warning: this new file cannot be played: {}", error.what()));
    }
}

// Runs a pass that measures and, unless it is a dry run, one that writes.
void Write(const RewriteOptions& options, const Input& input, const Pass& pass)
{
    std::optional<OutputFile> out; // first of all, so that output that cannot be written fails at once
    if (!options.dryRun)
        out.emplace(options.out, options.file, options.force);
    ReadProgress progress(options.file, input.info.size, options.dryRun ? 1 : 2);
    FlvLayout layout;
    const RemuxReport report = pass([&](const NewTag& tag) { layout.Add(tag); });
    if (report.IsEmpty())
        throw FileError(options.file, "there are no frames to write");
    if (out) {
        const std::vector<uint8_t> beginning = layout.Beginning(PropertiesOf(input));
        out->Write(beginning.data(), beginning.size());
        const uint64_t size = beginning.size() + layout.Size();
        progress.NextPass();
        pass([&](const NewTag& tag) {
            if (out->Written() < size) // a file that is still being written may have more tags by now
                WriteTag(*out, tag);
        });
        if (out->Written() != size)
            throw FileError(options.file, "the file changed while it was read");
        out->Finish();
    }
    progress.Wipe();
    WarnOfWhatIsNotPlayed(options, input, report);
    const bool hasVideo = report.frames[0] != 0;
    if (options.dryRun || options.out != STANDARD_STREAM)
        Print(fmt::format("{}: {} and {}, {}{}{}\n", out ? Printable(options.out) : "would write",
                          Plural(report.frames[0], "video frame"), Plural(report.frames[1], "audio frame"),
                          FormatTime(layout.Duration()),
                          hasVideo ? fmt::format(", {} in the index", Plural(layout.Keyframes(), "keyframe")) : "",
                          out ? fmt::format(", {} bytes", out->Written()) : ""));
    if (report.jumps != 0)
        Tell(fmt::format("{}: timestamps made continuous in {}\n", Printable(options.file),
                         Plural(report.jumps, "place")));
    if (report.bytesSkipped != 0)
        Tell(fmt::format("{}: {} skipped\n", Printable(options.file),
                         Plural(static_cast<uint64_t>(report.bytesSkipped), "byte")));
}

// The first pass finds the first timestamp for the second one.
Pass RemuxPass(const Input& input, RemuxOptions remux)
{
    return [&input, remux](const TakeTag& take) mutable {
        const RemuxReport report = Remuxer(input, remux, take).Run();
        remux.firstTimestamp = report.firstTimestamp;
        return report;
    };
}

// Players search only the first tags for streams and configurations. Describes a stream that starts later, or whose
// configuration comes later, as if it had been found by the open. Returns true if it has a configuration.
bool AdoptLateStream(Input& input, Stream stream)
{
    const bool known = input.Has(stream);
    if (known && (stream == Stream::video || ConfigFault(input).empty()))
        return false;
    TagReader reader(input.name, input.file.instance());
    const std::optional<Tag> start = FindStart(reader, stream);
    if (!start || (known && !start->is_config()))
        return false;
    const std::vector<uint8_t> config = start->is_config() ? reader.Config(*start) : std::vector<uint8_t>();
    if (stream == Stream::video) {
        input.info.video.emplace().codec = start->video_codec();
        input.info.video->config = config;
    } else {
        input.audioFormat = start->codec_byte();
        input.info.audio.emplace().codec = start->audio_codec();
        input.info.audio->config = config;
    }
    return start->is_config();
}

// The times at which to cut: those of the keyframes at or before the beginning and at or after the end. If timestamps
// jump, a time does not stand for one position; if a stream is not found, neither are its keyframes.
RemuxOptions CutOptions(const RewriteOptions& options, Input& input)
{
    constexpr const char* REMEDY = "use 'flvdmx repair' first";
    if (SeemsToRestart(input))
        throw FileError(input.name, fmt::format("timestamps jump in this file: {}", REMEDY));
    for (const Stream stream : STREAMS)
        if (const bool known = input.Has(stream); AdoptLateStream(input, stream) && !known)
            throw FileError(input.name, fmt::format("the configuration of the {} is not at the beginning: {}",
                                                    StreamName(stream), REMEDY));
    input.file.ignore_index(); // its times may differ from those of the tags
    RemuxOptions remux;
    if (options.fromMs) {
        const auto from = input.SeekToStart(*options.fromMs);
        if (!from)
            throw FileError(options.file, from.error());
        remux.fromMs = from->count();
    }
    remux.continuous = !options.keepTimes;
    const int64_t start = input.info.start_time.count();
    remux.offsetMs = options.keepTimes ? start : -std::max<int64_t>(remux.fromMs, 0);
    if (options.toMs) {
        const auto to = input.Seek(flvdmx::Milliseconds(*options.toMs), flvdmx::SeekMode::forward);
        if (!to && to.error().kind() != flvdmx::Kind::miss) // a miss: no keyframe follows
            throw FileError(options.file, to.error());
        if (to)
            remux.toMs = to->count();
    }
    return remux;
}

} // namespace

int RunRepair(const RewriteOptions& options)
{
    Input input(options.file);
    input.file.accept_all_times();
    for (const Stream stream : STREAMS)
        AdoptLateStream(input, stream);
    RemuxOptions remux;
    remux.continuous = !options.keepTimes;
    remux.offsetMs = input.info.start_time.count();
    Write(options, input, RemuxPass(input, remux));
    return DONE;
}

int RunIndex(const RewriteOptions& options)
{
    const Input input(options.file);
    Write(options, input, [&input](const TakeTag& take) { return CopyTags(input, take); });
    return DONE;
}

int RunCut(const RewriteOptions& options)
{
    Input input(options.file);
    Write(options, input, RemuxPass(input, CutOptions(options, input)));
    return DONE;
}

} // namespace tool
