// `flvdmx extract`: elementary streams as players take them.
#include <cstdint>
#include <filesystem>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include <fmt/core.h>

#include "tools/adts.h"
#include "tools/annexb.h"
#include "tools/codec_names.h"
#include "tools/commands.h"
#include "tools/demuxer.h"
#include "tools/output_file.h"
#include "tools/progress.h"
#include "tools/report.h"
#include "tools/tags.h"

namespace tool {

namespace {

constexpr uint32_t SOUND_FORMAT_MP3 = 2;
constexpr uint32_t SOUND_FORMAT_MP3_8K = 14;

using Bytes = std::vector<uint8_t>;

// How the frames of a codec become a stream.
struct Format {
    std::string extension;
    std::function<std::string(const Bytes& config)> configure;                  // why that is not possible, or nothing
    std::function<bool(const Bytes& frame, bool keyframe, Bytes& out)> convert; // false: part of it is left out
    const char* fault;                                                          // what is wrong with such a frame
};

Format AvcFormat()
{
    const auto annexB = std::make_shared<AnnexB>();
    const auto configure = [annexB](const Bytes& config) -> std::string {
        return annexB->Configure(config) ? "" : "the AVC configuration is damaged";
    };
    const auto convert = [annexB](const Bytes& frame, bool keyframe, Bytes& out) {
        return annexB->Convert(frame, keyframe, out);
    };
    return {"h264", configure, convert, "NAL units that do not fit their frame"};
}

Format AacFormat()
{
    const auto adts = std::make_shared<Adts>();
    const auto configure = [adts](const Bytes& config) { return adts->Configure(config); };
    const auto convert = [adts](const Bytes& frame, bool /*keyframe*/, Bytes& out) {
        return adts->Convert(frame, out);
    };
    return {"aac", configure, convert, "more data than ADTS takes"};
}

Format RawFormat(const char* extension)
{
    const auto configure = [](const Bytes& /*config*/) { return std::string(); };
    const auto convert = [](const Bytes& frame, bool /*keyframe*/, Bytes& out) {
        out = frame;
        return true;
    };
    return {extension, configure, convert, ""};
}

Format FormatOf(const flvd_ctx_t& instance, uint32_t stream)
{
    if (stream == FLVD_STREAM_VIDEO)
        return VideoCodecId(instance) == CODEC_ID_AVC ? AvcFormat() : RawFormat("video");
    const uint32_t sound = AudioSoundFormat(instance);
    if (sound == SOUND_FORMAT_AAC)
        return AacFormat();
    return RawFormat(sound == SOUND_FORMAT_MP3 || sound == SOUND_FORMAT_MP3_8K ? "mp3" : "audio");
}

Bytes ConfigOf(const Demuxer& demuxer, uint32_t stream)
{
    const bool video = stream == FLVD_STREAM_VIDEO;
    const uint8_t* const config = video ? demuxer.Video()->config : demuxer.Audio()->config;
    const uint32_t size = video ? demuxer.Video()->config_size : demuxer.Audio()->config_size;
    return config == nullptr ? Bytes() : Bytes(config, config + size);
}

// One stream on its way into its file.
class StreamWriter {
public:
    StreamWriter(const ExtractOptions& options, const Demuxer& demuxer, uint32_t stream)
        : m_file(options.file), m_stream(stream), m_format(FormatOf(*demuxer.Instance(), stream))
    {
        if (const std::string refusal = m_format.configure(ConfigOf(demuxer, stream)); !refusal.empty())
            throw DemuxError(refusal);
    }

    uint32_t Stream() const { return m_stream; }

    // A folder takes files named as the input; otherwise two streams need two names.
    void Open(const std::string& out, bool both)
    {
        const std::string folderName = std::filesystem::path(m_file).stem().string() + "." + m_format.extension;
        std::error_code failure;
        if (std::filesystem::is_directory(out, failure))
            m_out = std::make_unique<OutputFile>(std::filesystem::path(out) / folderName, m_file);
        else
            m_out = std::make_unique<OutputFile>(both ? out + "." + m_format.extension : out, m_file);
        if (m_format.extension == StreamName(m_stream))
            Complain(m_file,
                     fmt::format("note: the {} is written raw, its frames one behind the other", StreamName(m_stream)));
    }

    void Begin() { m_out->Begin(); }

    void Take(const Tag& tag, const Bytes& data)
    {
        if (tag.IsConfig()) {
            if (const std::string refusal = m_format.configure(data); !refusal.empty())
                Complain(m_file, fmt::format("warning: byte {}: {}; the one before is kept", tag.position, refusal));
            return;
        }
        m_bytes.clear();
        if (!m_format.convert(data, tag.IsKeyframe(), m_bytes) && m_faults++ == 0)
            m_firstFault = tag.position;
        m_out->Write(m_bytes.data(), m_bytes.size());
    }

    void Finish()
    {
        m_out->Close();
        if (m_faults > 0)
            Complain(m_file, fmt::format("warning: {} in {} frames, the first at byte {}, left out", m_format.fault,
                                         m_faults, m_firstFault));
    }

private:
    const std::string m_file;
    const uint32_t m_stream;
    const Format m_format;
    std::unique_ptr<OutputFile> m_out;
    Bytes m_bytes;
    uint64_t m_faults = 0;
    int64_t m_firstFault = 0;
};

void Extract(const ExtractOptions& options)
{
    Demuxer demuxer(options.file, 0);
    WarnIfCutShort(demuxer);
    std::vector<StreamWriter> writers;
    for (const uint32_t stream : {FLVD_STREAM_VIDEO, FLVD_STREAM_AUDIO}) {
        if ((options.streams & demuxer.Streams() & stream) != 0)
            writers.emplace_back(options, demuxer, stream);
    }
    if (writers.empty())
        throw DemuxError(fmt::format("the file has no {} stream", StreamName(options.streams)));
    ProgressBar progress(options.file, demuxer.Instance()->data_end);
    for (StreamWriter& writer : writers) // only now, and all before the first one is touched
        writer.Open(options.out, writers.size() > 1);
    for (StreamWriter& writer : writers)
        writer.Begin();
    demuxer.AcceptAllTimes();
    TagReader reader(demuxer);
    while (const std::optional<Tag> tag = reader.Next()) {
        progress.ShowDone(tag->position);
        for (StreamWriter& writer : writers) {
            if (writer.Stream() == tag->Stream() && (tag->IsFrame() || tag->IsConfig()))
                writer.Take(*tag, reader.Data(*tag));
        }
    }
    for (StreamWriter& writer : writers)
        writer.Finish();
    WarnOfSkipped(demuxer, reader);
}

} // namespace

int RunExtract(const ExtractOptions& options)
{
    try {
        Extract(options);
        return DONE;
    } catch (const DemuxError& error) {
        Complain(options.file, error.Message());
        return FAILED;
    }
}

} // namespace tool
