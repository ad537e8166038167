// The frames of a file as the tags of a new one.
#include "tools/remux.h"

#include <algorithm>
#include <array>
#include <cstdio>
#include <memory>
#include <optional>
#include <utility>

#include <fmt/core.h>
#include <unistd.h>

#include "tools/codec_config.h"
#include "tools/frame_source.h"
#include "tools/input.h"
#include "tools/report.h"
#include "tools/tags.h"
#include "tools/times.h"

namespace tool {

namespace {

constexpr uint32_t JITTER_MS = 1000;                                     // larger steps back are jumps
constexpr uint32_t SCRIPT_DATA_MAX = 1 << 20;                            // bytes
constexpr int TAGS_BEFORE_METADATA = 102;                                // players search only these
constexpr size_t SMALLEST_TAG = TAG_HEADER_SIZE + 1 + BACK_POINTER_SIZE; // of a frame; includes all codec bytes

// Reads bytes anywhere in a file. Needed for codec headers, which are not delivered with the frames.
class RawFile {
public:
    explicit RawFile(const std::string& file) : m_name(file), m_file(std::fopen(PathOf(file).c_str(), "rb")) {}

    void Read(int64_t position, uint8_t* bytes, size_t size) const
    {
        const bool readable = m_file != nullptr && position >= 0;
        if (!readable || pread(fileno(m_file.get()), bytes, size, position) != static_cast<ssize_t>(size))
            throw FileError(m_name, "cannot be read");
    }

private:
    struct Closer {
        void operator()(std::FILE* file) const { std::fclose(file); }
    };
    const std::string m_name;
    const std::unique_ptr<std::FILE, Closer> m_file;
};

// A stream of the file.
struct Track {
    uint8_t type;
    std::vector<uint8_t> config{};       // in use; empty for codecs without one
    std::vector<uint8_t> configHeader{}; // its codec header
    bool hasEnded = false;
};

// The codec header of a configuration. Its FrameType marks an AVC configuration as a keyframe.
std::vector<uint8_t> ConfigHeader(uint32_t tagType, uint8_t codec)
{
    constexpr uint8_t AVC_KEYFRAME = 0x17;
    return tagType == FLVD_TAG_TYPE_VIDEO ? std::vector<uint8_t>{AVC_KEYFRAME, 0, 0, 0, 0}
                                          : std::vector<uint8_t>{codec, 0};
}

flvdmx::Options OpenOptions(const RemuxOptions& options)
{
    flvdmx::Options open;
    open.restarting_timestamps = options.allFrames;
    return open;
}

class Remuxer {
public:
    Remuxer(const std::string& file, const RemuxOptions& options, const TakeTag& take)
        : m_options(options), m_take(take), m_input(file, OpenOptions(options)), m_raw(file),
          m_losses(m_input, [this](const Tag& tag) { TakeScript(tag); })
    {
        if (m_input.info.video)
            m_video.config = m_input.info.video->config;
        if (m_input.info.audio)
            m_audio.config = m_input.info.audio->config;
        m_video.configHeader = ConfigHeader(m_video.type, 0);
        m_audio.configHeader = ConfigHeader(m_audio.type, static_cast<uint8_t>(m_input.Instance().audio_format_filter));
        FindLateConfig(m_video, flvdmx::Stream::video);
        FindLateConfig(m_audio, flvdmx::Stream::audio);
    }

    RemuxReport Run()
    {
        while (const std::optional<flvdmx::Frame> frame =
                   NextFrame(m_input, flvdmx::Stream::any, LateStreams::delivered)) {
            Track& track = frame->stream == flvdmx::Stream::video ? m_video : m_audio;
            m_losses.Take(*frame);
            track.hasEnded = track.hasEnded || frame->time.count() >= m_options.toMs;
            if ((m_video.hasEnded || !m_input.Has(flvdmx::Stream::video)) &&
                (m_audio.hasEnded || !m_input.Has(flvdmx::Stream::audio)))
                break;
            Take(*frame, track);
        }
        if (m_options.toMs == std::numeric_limits<int64_t>::max()) {
            m_losses.Finish();
            m_report.bytesSkipped += m_losses.Rest();
        }
        m_report.jumps = m_times.Jumps();
        m_report.bytesSkipped += m_losses.Bytes();
        return m_report;
    }

private:
    // A configuration that comes after the first frames is moved to the beginning, where players search for it.
    void FindLateConfig(Track& track, flvdmx::Stream stream)
    {
        TagReader reader(m_input);
        const std::optional<Tag> tag = track.config.empty() ? reader.FindConfig(stream) : std::nullopt;
        if (!tag)
            return;
        const flvdmx::Bytes config = reader.ConfigBytes(*tag);
        track.config.assign(config.begin(), config.end());
        track.configHeader = ConfigHeader(track.type, tag->codec);
    }

    bool IsWanted(int64_t time) const { return time >= m_options.fromMs && time < m_options.toMs; }

    static uint32_t Timestamp(int64_t time) // 32 bits, wrapping
    {
        return static_cast<uint32_t>(std::max<int64_t>(time, 0));
    }

    void Take(const flvdmx::Frame& frame, Track& track)
    {
        std::array<uint8_t, SMALLEST_TAG> header{};
        m_raw.Read(frame.position, header.data(), header.size());
        const Tag tag = Tag::Parse(frame.position, header.data(), header.size());
        const bool repeated = frame.config_changed() && std::equal(track.config.begin(), track.config.end(),
                                                                   frame.new_config.begin(), frame.new_config.end());
        if (frame.config_changed()) {
            track.config.assign(frame.new_config.begin(), frame.new_config.end());
            track.configHeader = ConfigHeader(track.type, tag.codec);
        }
        if (!IsWanted(frame.time.count()))
            return;
        if (tag.IsAvc() && track.config.empty()) { // it cannot be decoded
            m_report.bytesSkipped += tag.End() - tag.position;
            return;
        }
        int64_t time = frame.time.count() + m_options.offsetMs;
        if (m_options.continuous) {
            m_times.Take(frame.stream, time);
            time = m_times.Time();
        }
        if (m_report.videoFrames + m_report.audioFrames == 0) {
            PutConfig(m_video, std::min(Timestamp(time), m_options.firstTimestamp));
            PutConfig(m_audio, std::min(Timestamp(time), m_options.firstTimestamp));
        } else if (frame.config_changed() && !repeated) {
            PutConfig(track, Timestamp(time));
        }
        ++(tag.IsVideo() ? m_report.videoFrames : m_report.audioFrames);
        m_report.firstTimestamp = std::min(m_report.firstTimestamp, Timestamp(time));
        m_take({track.type,
                Timestamp(time),
                {header.data() + TAG_HEADER_SIZE, tag.CodecHeaderSize()},
                frame.data,
                true,
                tag.IsKeyframe()});
    }

    // Cue points and texts are kept; the metadata is rebuilt.
    void TakeScript(const Tag& tag)
    {
        const int64_t time = int64_t{tag.timestamp} - m_input.info.start_time.count();
        std::vector<uint8_t> payload(tag.size);
        m_raw.Read(tag.position + TAG_HEADER_SIZE, payload.data(), payload.size());
        if (!IsWanted(time) || IsMetadata(payload))
            return;
        const bool follows = m_options.continuous && m_report.videoFrames + m_report.audioFrames != 0;
        const int64_t placed = time + m_options.offsetMs;
        m_take({FLVD_TAG_TYPE_SCRIPT, Timestamp(follows ? m_times.Near(placed) : placed), {}, payload});
    }

    void PutConfig(const Track& track, uint32_t timestamp) const
    {
        if (!track.config.empty())
            m_take({track.type, timestamp, track.configHeader, track.config});
    }

    const RemuxOptions m_options;
    const TakeTag& m_take;
    Input m_input;
    const RawFile m_raw;
    Losses m_losses;
    Track m_video{FLVD_TAG_TYPE_VIDEO};
    Track m_audio{FLVD_TAG_TYPE_AUDIO};
    Times m_times;
    RemuxReport m_report;
};

int64_t FirstTag(const Input& input)
{
    return int64_t{input.Instance().data_offset} + BACK_POINTER_SIZE;
}

struct Metadata {
    int64_t position = -1; // of its tag; -1: the file has none
    std::vector<ScriptProperty> properties{};
};

Metadata FindMetadata(const Input& input)
{
    const RawFile raw(input.name);
    TagReader reader(input);
    int64_t position = FirstTag(input);
    for (int tags = 0; tags < TAGS_BEFORE_METADATA; ++tags) {
        const std::optional<Tag> tag = reader.At(position);
        if (!tag || tag->DataEnd() > reader.FileSize())
            break;
        if (tag->IsScript()) {
            std::vector<uint8_t> payload(std::min(tag->size, SCRIPT_DATA_MAX));
            raw.Read(position + TAG_HEADER_SIZE, payload.data(), payload.size());
            std::vector<ScriptProperty> properties = ReadScriptProperties(payload);
            if (!properties.empty())
                return {position, std::move(properties)};
        }
        position = tag->End();
    }
    return {};
}

// An undamaged tag; its payload and back-pointer go to `bytes`.
Tag ReadUndamaged(const Input& input, TagReader& reader, const RawFile& raw, int64_t position,
                  std::vector<uint8_t>& bytes)
{
    const std::optional<Tag> tag = reader.At(position);
    if (!tag || tag->End() > reader.FileSize())
        throw FileError(input.name, fmt::format("the file is damaged at byte {}: use 'flvdmx repair'", position));
    bytes.resize(size_t{tag->size} + BACK_POINTER_SIZE);
    raw.Read(position + TAG_HEADER_SIZE, bytes.data(), bytes.size());
    if (BigEndian(&bytes[tag->size], BACK_POINTER_SIZE) != tag->size + TAG_HEADER_SIZE)
        throw FileError(input.name,
                        fmt::format("the back-pointer of the tag at byte {} is wrong: use 'flvdmx repair'", position));
    return *tag;
}

} // namespace

RemuxReport Remux(const std::string& file, const RemuxOptions& options, const TakeTag& take)
{
    return Remuxer(file, options, take).Run();
}

RemuxReport CopyTags(const std::string& file, const TakeTag& take)
{
    const Input input(file);
    const RawFile raw(file);
    const int64_t metadata = FindMetadata(input).position;
    TagReader reader(input);
    RemuxReport report;
    std::array<uint32_t, 2> latest{}; // timestamps of video and audio
    std::vector<uint8_t> bytes;       // payload and back-pointer
    for (int64_t position = FirstTag(input); position < reader.FileSize();) {
        const Tag tag = ReadUndamaged(input, reader, raw, position, bytes);
        if (tag.IsFrame()) {
            ++(tag.IsVideo() ? report.videoFrames : report.audioFrames);
            uint32_t& time = latest.at(tag.IsVideo() ? 0 : 1);
            if (time > tag.timestamp && time - tag.timestamp > JITTER_MS)
                throw FileError(file, fmt::format("timestamps jump at byte {}: use 'flvdmx repair'", position));
            time = std::max(time, tag.timestamp);
        }
        if (position != metadata)
            take({static_cast<uint8_t>(tag.type),
                  tag.timestamp,
                  {},
                  {bytes.data(), tag.size},
                  tag.IsFrame(),
                  tag.IsKeyframe()});
        position = tag.End();
    }
    return report;
}

std::vector<ScriptProperty> MetadataOf(const std::string& file)
{
    const Input input(file);
    std::vector<ScriptProperty> properties = FindMetadata(input).properties;
    const auto add = [&properties](const char* name, double value) {
        const auto has = [name](const ScriptProperty& property) { return property.name == name; };
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

} // namespace tool
