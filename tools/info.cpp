// `flvdmx info`: shows what is in each file, as aligned text or as one JSON document.
#include <algorithm>
#include <array>
#include <cmath>
#include <cstddef>
#include <iterator>
#include <optional>
#include <utility>
#include <variant>

#include <fmt/chrono.h>
#include <fmt/core.h>

#include "tools/codecs.h"
#include "tools/commands.h"
#include "tools/input.h"
#include "tools/played.h"
#include "tools/progress.h"
#include "tools/report.h"
#include "tools/tags.h"
#include "tools/text.h"
#include "tools/times.h"

namespace tool {

namespace {

// What is known only after a walk over all tags.
struct FileScan {
    uint64_t videoFrames = 0;
    uint64_t audioFrames = 0;
    uint64_t keyframes = 0;                             // of video
    std::optional<flvdmx::Milliseconds> lastKeyframe{}; // from the first timestamp
    int64_t longestDistanceMs = 0;                      // from one keyframe to the next
    double averageDistanceMs = 0;                       // both are 0 for fewer than two keyframes
    flvdmx::Milliseconds played{};                      // duration in times made continuous across jumps
    uint64_t jumps = 0;                                 // of the timestamps
    int64_t bytesSkipped = 0;
};

FileScan ScanFile(Input& input)
{
    FileScan scan;
    Times times;
    ProgressBar bar(input.name, input.info.size);
    Played played(input, [&bar](int64_t position) { bar.ShowDone(position); });
    input.file.accept_all_times();
    int64_t first = 0; // keyframes
    int64_t last = 0;
    played.Walk([&](const Tag& tag) {
        if (!tag.has_frame())
            return true;
        const int64_t time = input.TimeOf(tag);
        times.Take(tag.stream(), time);
        ++(tag.is_video() ? scan.videoFrames : scan.audioFrames);
        if (!IsVideoKeyframe(tag))
            return true;
        if (scan.keyframes++ == 0)
            first = last = times.Time();
        scan.longestDistanceMs = std::max(scan.longestDistanceMs, times.Time() - last);
        scan.lastKeyframe = flvdmx::Milliseconds(time);
        last = times.Time();
        return true;
    });
    if (scan.keyframes > 1)
        scan.averageDistanceMs = static_cast<double>(last - first) / static_cast<double>(scan.keyframes - 1);
    scan.bytesSkipped = played.BytesSkipped();
    scan.played = flvdmx::Milliseconds(times.Latest());
    scan.jumps = times.Jumps();
    return scan;
}

// A file and its description.
struct Subject {
    const Input& input;
    flvdmx::Metadata metadata{};
    std::optional<FileScan> scan{};
    std::string noVideo{}; // why none is played, although the file contains or announces it
    std::string noAudio{};
};

// Kilobits per second over the whole file: bits per millisecond.
uint64_t DataRate(const Subject& subject)
{
    const auto duration = subject.scan ? subject.scan->played : subject.input.info.duration;
    const auto bits = static_cast<uint64_t>(subject.input.Instance().data_end) * 8;
    return duration.count() <= 0 ? 0 : bits / static_cast<uint64_t>(duration.count());
}

// The library counts entries before it has found the arrays. Unless it has found both, the count means nothing.
uint32_t IndexEntries(const Input& input)
{
    const flvd_keyframe_index_t& index = input.Instance().keyframe_index;
    return index.times_offset != 0 && index.positions_offset != 0 ? index.entry_count : 0;
}

// Bytes skipped between the frames and after the last tag.
uint64_t BytesSkipped(const Subject& subject)
{
    return static_cast<uint64_t>(subject.scan->bytesSkipped + subject.input.Rest());
}

const char* SeekMethodName(flvdmx::SeekMethod method)
{
    constexpr std::array NAMES = {"none", "index", "scan"};
    return NAMES[std::min<size_t>(static_cast<size_t>(method), NAMES.size() - 1)];
}

const char* SeekMethodText(flvdmx::SeekMethod method)
{
    constexpr std::array TEXTS = {"none: seeking is not possible", "by the keyframe index", "by scanning"};
    return TEXTS[std::min<size_t>(static_cast<size_t>(method), TEXTS.size() - 1)];
}

// The sample rate in the codec byte of the audio tags. AAC and MP3 streams state their own.
uint32_t HeaderSampleRate(const Input& input)
{
    constexpr std::array<uint32_t, 4> RATES = {5500, 11025, 22050, 44100};
    return RATES[input.audioFormat >> 2 & 3];
}

// The codec byte cannot express the rate of codecs that have only one.
uint32_t SampleRate(const flvdmx::AudioInfo& audio)
{
    switch (audio.codec) {
    case flvdmx::AudioCodec::speex:
    case flvdmx::AudioCodec::nellymoser_16khz:
        return 16000;
    case flvdmx::AudioCodec::nellymoser_8khz:
    case flvdmx::AudioCodec::a_law:
    case flvdmx::AudioCodec::mu_law:
        return 8000;
    default:
        return audio.sample_rate;
    }
}

// The last keyframe that a scan found; without a scan, the one that the file states.
std::optional<flvdmx::Milliseconds> LastKeyframe(const Subject& subject)
{
    if (subject.scan)
        return subject.scan->lastKeyframe;
    const flvdmx::Milliseconds stated = subject.input.info.video->last_keyframe;
    return stated.count() != 0 ? std::optional(stated) : std::nullopt;
}

// Collects `name  value` lines, without unknown values.
class Listing {
public:
    void Line(std::string_view name, std::string_view value)
    {
        fmt::format_to(std::back_inserter(m_text), "  {:<23} {}\n", name, value);
    }
    void Quantity(std::string_view name, double value, std::string_view unit)
    {
        if (value != 0)
            Line(name, fmt::format("{} {}", Number(value), unit));
    }
    void Config(const std::vector<uint8_t>& config)
    {
        if (!config.empty())
            Line("  configuration", fmt::format("{} bytes: {}", config.size(), Hex(config)));
    }
    const std::string& Text() const { return m_text; }

private:
    std::string m_text;
};

std::string StreamsText(const Input& input)
{
    if (input.info.video)
        return input.info.audio ? "video and audio" : "video only";
    return "audio only";
}

void ListVideo(Listing& listing, const Subject& subject, const flvdmx::VideoInfo& video)
{
    listing.Line("video", CodecName(video.codec));
    if (!video.config.empty())
        listing.Line("  profile",
                     fmt::format("{}, level {}", AvcProfileName(video.config), AvcLevelName(video.config)));
    const PictureSize size = PictureSizeOf(video);
    if (size.width != 0 || size.height != 0)
        listing.Line("  picture size", fmt::format("{} x {}", size.width, size.height));
    listing.Quantity("  frame rate", video.frame_rate, "frames/s");
    if (const auto last = LastKeyframe(subject))
        listing.Line("  last keyframe", FormatTime(*last));
    if (subject.scan) {
        listing.Line("  frames",
                     fmt::format("{}, {}", subject.scan->videoFrames, Plural(subject.scan->keyframes, "keyframe")));
        if (subject.scan->keyframes > 1)
            listing.Line("  keyframe distance",
                         fmt::format("{} s on average, {} s at most", Number(subject.scan->averageDistanceMs / 1000),
                                     Number(static_cast<double>(subject.scan->longestDistanceMs) / 1000)));
    }
    listing.Config(video.config);
}

void ListAudio(Listing& listing, const Subject& subject, const flvdmx::AudioInfo& audio)
{
    listing.Line("audio", CodecName(audio.codec));
    if (!audio.config.empty()) {
        const AacConfig aac = ParseAacConfig(audio.config);
        listing.Line("  object type", fmt::format("{} ({})", aac.objectType, AacObjectTypeName(aac.objectType)));
        if (aac.outputSampleRate != aac.sampleRate)
            listing.Quantity("  output rate", aac.outputSampleRate, "Hz");
    }
    const uint32_t header = HeaderSampleRate(subject.input);
    const uint32_t rate = SampleRate(audio);
    listing.Line("  sample rate", header == rate ? fmt::format("{} Hz", rate)
                                                 : fmt::format("{} Hz (the tag headers state {} Hz)", rate, header));
    if (IsPcm(audio.codec))
        listing.Line("  sample size", fmt::format("{} bits", subject.input.PcmSampleSize()));
    listing.Line("  channels", std::to_string(audio.channels));
    listing.Quantity("  data rate", audio.data_rate, "kbit/s");
    if (subject.scan)
        listing.Line("  frames", std::to_string(subject.scan->audioFrames));
    listing.Config(audio.config);
}

// The date in ISO 8601 format; null if it is out of range.
struct ToJson {
    Json operator()(const flvdmx::Date& date) const
    {
        constexpr double MOST_SECONDS = 1e11; // the year 5138
        const double seconds = date.milliseconds / 1000;
        if (!(std::abs(seconds) < MOST_SECONDS))
            return {};
        return fmt::format("{:%FT%TZ}", fmt::gmtime(static_cast<time_t>(seconds)));
    }
    template <typename Value> Json operator()(const Value& value) const { return value; }
};

Json ValueOf(const flvdmx::Property& property)
{
    return std::visit(ToJson{}, property.value);
}

std::string ValueText(const flvdmx::Property& property)
{
    if (const auto* const number = std::get_if<double>(&property.value))
        return Number(*number, 10);
    const Json value = ValueOf(property);
    return value.is_string() ? Printable(value.get<std::string>()) : value.dump();
}

std::string InfoText(const Subject& subject)
{
    const Input& input = subject.input;
    Listing listing;
    listing.Line("container", "FLV");
    listing.Line("size", fmt::format("{} bytes", input.info.size));
    listing.Line("streams", StreamsText(input));
    listing.Line("duration", input.info.duration.count() != 0 ? FormatTime(input.info.duration) : "unknown");
    if (subject.scan && subject.scan->jumps > 0)
        listing.Line("played duration", fmt::format("{}, timestamps jump {}", FormatTime(subject.scan->played),
                                                    Plural(subject.scan->jumps, "time")));
    listing.Line("first timestamp", FormatTime(input.info.start_time));
    listing.Quantity("data rate", static_cast<double>(DataRate(subject)), "kbit/s");
    listing.Line("seek method", SeekMethodText(input.info.seek_method));
    const uint32_t entries = IndexEntries(input);
    listing.Line("keyframe index", entries == 0 ? "none" : fmt::format("{} entries", entries));
    if (subject.scan)
        listing.Line("skipped", Plural(BytesSkipped(subject), "byte"));
    if (input.info.video)
        ListVideo(listing, subject, *input.info.video);
    if (input.info.audio)
        ListAudio(listing, subject, *input.info.audio);
    if (subject.metadata.size() > 0)
        listing.Line("metadata", fmt::format("{} {}", subject.metadata.size(),
                                             subject.metadata.size() == 1 ? "property" : "properties"));
    for (const flvdmx::Property& property : subject.metadata)
        listing.Line("  " + Printable(property.name), ValueText(property));
    return DisplayName(input.name) + "\n" + listing.Text();
}

template <typename Value> Json OrNull(bool known, const Value& value)
{
    return known ? Json(value) : Json();
}

Json VideoObject(const Subject& subject, const flvdmx::VideoInfo& video)
{
    const auto last = LastKeyframe(subject);
    const bool avc = !video.config.empty();
    const PictureSize size = PictureSizeOf(video);
    Json object = {{"codec", CodecName(video.codec)},
                   {"fourcc", OrNull(!video.fourcc.empty(), video.fourcc)},
                   {"width", size.width},
                   {"height", size.height},
                   {"frame_rate", video.frame_rate},
                   {"last_keyframe_ms", last ? Json(last->count()) : Json()},
                   {"profile", OrNull(avc, AvcProfileName(video.config))},
                   {"level", OrNull(avc, AvcLevelName(video.config))},
                   {"config", OrNull(avc, Hex(video.config))}};
    if (subject.scan) {
        object["frames"] = subject.scan->videoFrames;
        object["keyframes"] = subject.scan->keyframes;
        const bool known = subject.scan->keyframes > 1;
        object["keyframe_distance_ms"] = {{"average", OrNull(known, subject.scan->averageDistanceMs)},
                                          {"longest", OrNull(known, subject.scan->longestDistanceMs)}};
    }
    return object;
}

Json AudioObject(const Subject& subject, const flvdmx::AudioInfo& audio)
{
    Json object = {{"codec", CodecName(audio.codec)},
                   {"format_tag", audio.format_tag},
                   {"sample_rate", SampleRate(audio)},
                   {"header_sample_rate", HeaderSampleRate(subject.input)},
                   {"sample_size", IsPcm(audio.codec) ? subject.input.PcmSampleSize() : audio.sample_size},
                   {"channels", audio.channels},
                   {"data_rate_kbit", audio.data_rate}};
    if (!audio.config.empty()) {
        const AacConfig aac = ParseAacConfig(audio.config);
        object["object_type"] = aac.objectType;
        object["output_sample_rate"] = aac.outputSampleRate;
    }
    object["config"] = OrNull(!audio.config.empty(), Hex(audio.config));
    if (subject.scan)
        object["frames"] = subject.scan->audioFrames;
    return object;
}

Json InfoObject(const Subject& subject)
{
    const Input& input = subject.input;
    Json object = {{"file", input.name},
                   {"container", "FLV"},
                   {"size", input.info.size},
                   {"duration_ms", input.info.duration.count()},
                   {"first_timestamp_ms", input.info.start_time.count()},
                   {"data_rate_kbit", DataRate(subject)},
                   {"seek_method", SeekMethodName(input.info.seek_method)},
                   {"index_entries", IndexEntries(input)},
                   {"shorter_than_metadata", input.Instance().file_shorter_than_meta != 0},
                   {"bytes_behind_last_tag", input.Rest()}};
    if (subject.scan) {
        object["played_duration_ms"] = subject.scan->played.count();
        object["timestamp_restarts"] = subject.scan->jumps;
        object["bytes_left_out"] = BytesSkipped(subject);
    }
    if (input.info.video)
        object["video"] = VideoObject(subject, *input.info.video);
    if (input.info.audio)
        object["audio"] = AudioObject(subject, *input.info.audio);
    for (const auto& [key, why] :
         {std::pair("video_not_played", subject.noVideo), std::pair("audio_not_played", subject.noAudio)})
        if (!why.empty())
            object[key] = why;
    Json& metadata = object["metadata"] = Json::object();
    for (const flvdmx::Property& property : subject.metadata)
        if (!metadata.contains(property.name))
            metadata[property.name] = ValueOf(property);
    return object;
}

void Warn(const Subject& subject)
{
    const Input& input = subject.input;
    input.WarnIfCutShort();
    if (subject.scan && subject.scan->jumps > 0)
        Complain(input.name, fmt::format("warning: the timestamps jump: the last one is {}, but the frames play for {}",
                                         FormatTime(input.info.duration), FormatTime(subject.scan->played)));
    for (const auto& [stream, why] : {std::pair("video", subject.noVideo), std::pair("audio", subject.noAudio)})
        if (!why.empty())
            Complain(input.name, fmt::format("warning: the {} is not played: {}", stream, why));
    if (const std::string fault = ConfigFault(input); !fault.empty())
        Complain(input.name, "warning: " + fault);
    if (const std::string note = UndefinedCodec(input); !note.empty())
        Complain(input.name, "note: " + note);
}

// Why a stream has no frames. If no tag of it was found, the file header may still announce it.
std::string WhyNoStream(Played& played, flvdmx::Stream stream, const Input& input)
{
    std::string why = played.WhyNoStream(stream);
    if (why.empty() && (AnnouncedStreams(played.Reader()) & ~input.Streams() & static_cast<uint32_t>(stream)) != 0)
        why = "the file header announces it, but none of its tags was found";
    return why;
}

Json Inspect(const std::string& name, const InfoOptions& options, bool first)
{
    Input input(name);
    Subject subject{input};
    if (const auto metadata = input.file.metadata(); metadata)
        subject.metadata = *metadata;
    if (options.scan || SeemsToRestart(input))
        subject.scan = ScanFile(input);
    Played played(input);
    subject.noVideo = WhyNoStream(played, flvdmx::Stream::video, input);
    subject.noAudio = WhyNoStream(played, flvdmx::Stream::audio, input);
    Warn(subject);
    if (!options.json)
        Print((first ? "" : "\n") + InfoText(subject));
    return options.json ? InfoObject(subject) : Json();
}

} // namespace

int RunInfo(const InfoOptions& options)
{
    Json files = Json::array();
    int exitCode = DONE;
    for (const std::string& file : options.files) {
        try {
            files.push_back(Inspect(file, options, &file == &options.files.front()));
        } catch (const FileError& error) {
            Complain(error);
            files.push_back({{"file", file}, {"error", error.Object()}});
            exitCode = FAILED;
        }
    }
    if (options.json)
        PrintJson({{"files", std::move(files)}}, 2);
    return exitCode;
}

} // namespace tool
