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

#include "tools/frame_source.h"
#include "tools/input.h"
#include "tools/report.h"
#include "tools/tags.h"
#include "tools/times.h"

namespace tool {

namespace {

constexpr uint32_t SCRIPT_DATA_MAX = 1 << 20; // bytes
constexpr int TAGS_BEFORE_METADATA = 102;     // as far as players look
constexpr size_t MOST_CODEC_BYTES = 5;
constexpr uint8_t AVC_KEYFRAME = 0x17; // FrameType 1, CodecID 7

// Bytes anywhere in a file. The codec's bytes before a frame are not delivered with it.
class RawFile {
public:
    explicit RawFile(const std::string& file) : m_name(file), m_file(std::fopen(PathOf(file).c_str(), "rb")) {}

    void Read(int64_t position, uint8_t* bytes, size_t size) const
    {
        const bool readable = m_file != nullptr && position >= 0;
        if (!readable || pread(fileno(m_file.get()), bytes, size, position) != static_cast<ssize_t>(size))
            throw FileError(m_name, "the file cannot be read");
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
    uint8_t type = 0;
    size_t codecBytes = 1;              // before each frame
    std::vector<uint8_t> configBytes{}; // before each configuration
    std::vector<uint8_t> config{};      // in force; empty for codecs without one
    bool isPresent = false;
    bool hasEnded = false;
};

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
          m_losses(m_input), m_video{FLVD_TAG_TYPE_VIDEO}, m_audio{FLVD_TAG_TYPE_AUDIO}
    {
        const flvdmx::Info& info = m_input.info;
        m_video.isPresent = info.video.has_value();
        m_audio.isPresent = info.audio.has_value();
        if (info.video && info.video->codec == flvdmx::VideoCodec::avc) {
            m_video.codecBytes = MOST_CODEC_BYTES;
            m_video.configBytes = {AVC_KEYFRAME, 0, 0, 0, 0};
            m_video.config = info.video->config;
        }
        if (info.audio && info.audio->codec == flvdmx::AudioCodec::aac) {
            m_audio.codecBytes = 2;
            m_audio.configBytes = {static_cast<uint8_t>(m_input.Instance().audio_format_filter), 0};
            m_audio.config = info.audio->config;
        }
    }

    RemuxReport Run()
    {
        while (const std::optional<flvdmx::Frame> frame = NextFrame(m_input, flvdmx::Stream::any)) {
            Track& track = frame->stream == flvdmx::Stream::video ? m_video : m_audio;
            m_losses.Take(*frame);
            if (frame->config_changed())
                track.config.assign(frame->new_config.begin(), frame->new_config.end());
            const int64_t time = frame->time.count();
            track.hasEnded = track.hasEnded || time >= m_options.toMs;
            if (HasEnded(m_video) && HasEnded(m_audio))
                break;
            if (time >= m_options.fromMs && time < m_options.toMs)
                Take(*frame, track);
        }
        if (m_options.toMs == std::numeric_limits<int64_t>::max())
            m_losses.Finish();
        m_report.jumps = m_times.Jumps();
        m_report.bytesLeftOut = m_losses.Bytes();
        return m_report;
    }

private:
    static bool HasEnded(const Track& track) { return track.hasEnded || !track.isPresent; }

    void Take(const flvdmx::Frame& frame, const Track& track)
    {
        int64_t time = frame.time.count() + m_options.offsetMs;
        if (m_options.continuous) {
            m_times.Take(frame.stream, time);
            time = m_times.Time();
        }
        const auto timestamp = static_cast<uint32_t>(std::max<int64_t>(time, 0)); // 32 bits, wrapping
        if (m_report.videoFrames + m_report.audioFrames == 0) {
            PutConfig(m_video, timestamp);
            PutConfig(m_audio, timestamp);
        } else if (frame.config_changed()) {
            PutConfig(track, timestamp);
        }
        const bool isVideo = track.type == FLVD_TAG_TYPE_VIDEO;
        ++(isVideo ? m_report.videoFrames : m_report.audioFrames);
        std::array<uint8_t, MOST_CODEC_BYTES> codecBytes{};
        m_raw.Read(frame.position + TAG_HEADER_SIZE, codecBytes.data(), track.codecBytes);
        m_take({track.type, timestamp, {codecBytes.data(), track.codecBytes}, frame.data, isVideo && frame.keyframe});
    }

    void PutConfig(const Track& track, uint32_t timestamp) const
    {
        if (!track.config.empty())
            m_take({track.type, timestamp, track.configBytes, track.config, false});
    }

    const RemuxOptions m_options;
    const TakeTag& m_take;
    Input m_input;
    const RawFile m_raw;
    Losses m_losses;
    Track m_video;
    Track m_audio;
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
    std::vector<uint8_t> bytes; // payload and back-pointer
    for (int64_t position = FirstTag(input); position < reader.FileSize();) {
        const std::optional<Tag> tag = reader.At(position);
        if (!tag || tag->End() > reader.FileSize())
            throw FileError(file, fmt::format("the file is damaged at byte {}: use 'flvdmx repair'", position));
        bytes.resize(size_t{tag->size} + BACK_POINTER_SIZE);
        raw.Read(position + TAG_HEADER_SIZE, bytes.data(), bytes.size());
        if (BigEndian(&bytes[tag->size], BACK_POINTER_SIZE) != tag->size + TAG_HEADER_SIZE)
            throw FileError(file,
                            fmt::format("the size after the tag at byte {} is wrong: use 'flvdmx repair'", position));
        if (position != metadata)
            take({static_cast<uint8_t>(tag->type), tag->timestamp, {}, {bytes.data(), tag->size}, tag->IsKeyframe()});
        report.videoFrames += tag->IsVideo() && tag->IsFrame() ? 1U : 0U;
        report.audioFrames += tag->IsAudio() && tag->IsFrame() ? 1U : 0U;
        position = tag->End();
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
        add("width", input.info.video->width);
        add("height", input.info.video->height);
        add("videocodecid", static_cast<double>(input.info.video->codec));
    }
    if (input.info.audio)
        add("audiocodecid", static_cast<double>(input.info.audio->codec));
    return properties;
}

} // namespace tool
