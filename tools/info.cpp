// `flvdmx info`: what is in each file, as aligned text or as one JSON document.
#include <cstddef>
#include <iterator>
#include <utility>

#include <fmt/core.h>

#include "tools/codec_names.h"
#include "tools/commands.h"
#include "tools/demuxer.h"
#include "tools/report.h"
#include "tools/time_text.h"

namespace tool {

namespace {

std::string Hex(const uint8_t* data, uint32_t size)
{
    std::string text;
    for (uint32_t i = 0; i < size; ++i)
        fmt::format_to(std::back_inserter(text), "{:02x}", data[i]);
    return text;
}

// Kilobits a second over the whole file: bits a millisecond.
uint64_t DataRate(const flvd_ctx_t& instance)
{
    return instance.duration_ms == 0 ? 0 : static_cast<uint64_t>(instance.data_end) * 8 / instance.duration_ms;
}

// The count is raised before the arrays are met, so without both arrays it says nothing.
uint32_t IndexEntries(const flvd_ctx_t& instance)
{
    const flvd_keyframe_index_t& index = instance.keyframe_index;
    return index.times_offset != 0 && index.positions_offset != 0 ? index.entry_count : 0;
}

const char* SeekMethodName(uint32_t method)
{
    constexpr const char* NAMES[] = {"none", "index", "scan"};
    return method < std::size(NAMES) ? NAMES[method] : "unknown";
}

const char* SeekMethodText(uint32_t method)
{
    constexpr const char* TEXTS[] = {"none, seeking is not possible", "by the keyframe index", "by scanning"};
    return method < std::size(TEXTS) ? TEXTS[method] : "unknown";
}

// Collects `name  value` lines; a value that the file does not tell is left out.
class Listing {
public:
    void Line(std::string_view name, std::string_view value)
    {
        fmt::format_to(std::back_inserter(m_text), "  {:<18}{}\n", name, value);
    }
    void Number(std::string_view name, double value, std::string_view unit)
    {
        if (value != 0)
            Line(name, fmt::format("{:.7g} {}", value, unit));
    }
    void Config(const uint8_t* data, uint32_t size)
    {
        if (data != nullptr)
            Line("  configuration", fmt::format("{} bytes: {}", size, Hex(data, size)));
    }
    const std::string& Text() const { return m_text; }

private:
    std::string m_text;
};

std::string StreamsText(const Demuxer& demuxer)
{
    if (demuxer.Video() != nullptr)
        return demuxer.Audio() != nullptr ? "video and audio" : "video only";
    return "audio only";
}

void ListVideo(Listing& listing, const flvd_ctx_t& instance, const flvd_video_info_t& video)
{
    listing.Line("video", VideoCodec(instance));
    if (video.width != 0 || video.height != 0)
        listing.Line("  picture size", fmt::format("{} x {}", video.width, video.height));
    listing.Number("  frame rate", video.frame_rate / 1000.0, "frames/s");
    if (video.last_key_time_ms != 0)
        listing.Line("  last keyframe", FormatTime(video.last_key_time_ms));
    listing.Config(video.config, video.config_size);
}

void ListAudio(Listing& listing, const flvd_ctx_t& instance, const flvd_audio_info_t& audio)
{
    listing.Line("audio", AudioCodec(instance));
    listing.Number("  sample rate", audio.sample_rate, "Hz");
    listing.Line("  channels", std::to_string(audio.channels));
    listing.Number("  data rate", audio.data_rate, "kbit/s");
    listing.Config(audio.config, audio.config_size);
}

std::string InfoText(const Demuxer& demuxer)
{
    const flvd_ctx_t& instance = *demuxer.Instance();
    Listing listing;
    listing.Line("container", "FLV");
    listing.Line("size", fmt::format("{} bytes", instance.file_size));
    listing.Line("streams", StreamsText(demuxer));
    listing.Line("duration", instance.duration_ms != 0 ? FormatTime(instance.duration_ms) : "unknown");
    listing.Number("data rate", static_cast<double>(DataRate(instance)), "kbit/s");
    listing.Line("seek method", SeekMethodText(instance.seek_method));
    const uint32_t entries = IndexEntries(instance);
    listing.Line("keyframe index", entries == 0 ? "none" : fmt::format("{} entries", entries));
    if (demuxer.Video() != nullptr)
        ListVideo(listing, instance, *demuxer.Video());
    if (demuxer.Audio() != nullptr)
        ListAudio(listing, instance, *demuxer.Audio());
    return demuxer.Path() + "\n" + listing.Text();
}

Json ConfigObject(const uint8_t* data, uint32_t size)
{
    return data == nullptr ? Json() : Json(Hex(data, size));
}

Json VideoObject(const flvd_ctx_t& instance, const flvd_video_info_t& video)
{
    const std::string fourcc(video.fourcc, strnlen(video.fourcc, sizeof video.fourcc));
    return {{"codec", VideoCodec(instance)},
            {"fourcc", fourcc.empty() ? Json() : Json(fourcc)},
            {"width", video.width},
            {"height", video.height},
            {"frame_rate", video.frame_rate / 1000.0},
            {"last_keyframe_ms", video.last_key_time_ms},
            {"config", ConfigObject(video.config, video.config_size)}};
}

Json AudioObject(const flvd_ctx_t& instance, const flvd_audio_info_t& audio)
{
    return {{"codec", AudioCodec(instance)},
            {"format_tag", audio.format_tag},
            {"sample_rate", audio.sample_rate},
            {"sample_size", audio.sample_size},
            {"channels", audio.channels},
            {"data_rate_kbit", audio.data_rate},
            {"config", ConfigObject(audio.config, audio.config_size)}};
}

Json InfoObject(const Demuxer& demuxer)
{
    const flvd_ctx_t& instance = *demuxer.Instance();
    Json object = {{"file", demuxer.Path()},
                   {"container", "FLV"},
                   {"size", instance.file_size},
                   {"duration_ms", instance.duration_ms},
                   {"data_rate_kbit", DataRate(instance)},
                   {"seek_method", SeekMethodName(instance.seek_method)},
                   {"index_entries", IndexEntries(instance)},
                   {"shorter_than_metadata", instance.file_shorter_than_meta != 0},
                   {"bytes_behind_last_tag", BytesBehindLastTag(instance)}};
    if (demuxer.Video() != nullptr)
        object["video"] = VideoObject(instance, *demuxer.Video());
    if (demuxer.Audio() != nullptr)
        object["audio"] = AudioObject(instance, *demuxer.Audio());
    return object;
}

} // namespace

int RunInfo(const InfoOptions& options)
{
    Json files = Json::array();
    int exitCode = DONE;
    for (const std::string& file : options.files) {
        try {
            const Demuxer demuxer(file, 0);
            WarnIfCutShort(demuxer);
            if (options.json)
                files.push_back(InfoObject(demuxer));
            else
                Print((&file == &options.files.front() ? "" : "\n") + InfoText(demuxer));
        } catch (const DemuxError& error) {
            Complain(file, error.Message());
            files.push_back({{"file", file}, {"error", ErrorObject(error)}});
            exitCode = FAILED;
        }
    }
    if (options.json)
        PrintJson({{"files", std::move(files)}}, 2);
    return exitCode;
}

} // namespace tool
