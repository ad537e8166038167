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
    const ReadProgress progress(input.name, input.info.size);
    Played played(input);
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
    std::array<std::string, 2> notPlayed{}; // why no video or audio is, although the file contains or announces it
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

struct SeekMethodText {
    const char* name;
    const char* text;
};

const SeekMethodText& TextOf(flvdmx::SeekMethod method)
{
    static constexpr std::array<SeekMethodText, 3> TEXTS = {
        {{"none", "none: seeking is not possible"}, {"index", "by the keyframe index"}, {"scan", "by scanning"}}};
    return TEXTS.at(std::min<size_t>(static_cast<size_t>(method), TEXTS.size() - 1));
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

// Facts about a file: lines for people and members for programs.
class Facts {
public:
    // Without a text, there is no line.
    void Add(std::string_view name, std::string_view text, const Json& members = Json::object())
    {
        if (!text.empty())
            fmt::format_to(std::back_inserter(m_text), "  {:<23} {}\n", name, text);
        m_object.update(members);
    }
    void AddConfig(const std::vector<uint8_t>& config)
    {
        if (config.empty())
            return Add("", "", {{"config", nullptr}});
        Add("  configuration", fmt::format("{} bytes: {}", config.size(), Hex(config)), {{"config", Hex(config)}});
    }
    // Facts about a part become one member.
    void Add(const char* member, const Facts& part)
    {
        m_text += part.m_text;
        m_object[member] = part.m_object;
    }
    const std::string& Text() const { return m_text; }
    const Json& Object() const { return m_object; }

private:
    std::string m_text;
    Json m_object = Json::object();
};

std::string Quantity(double value, std::string_view unit)
{
    return value != 0 ? fmt::format("{} {}", Number(value), unit) : "";
}

template <typename Value> Json OrNull(bool known, const Value& value)
{
    return known ? Json(value) : Json();
}

Facts VideoFacts(const Subject& subject, const flvdmx::VideoInfo& video)
{
    Facts facts;
    const std::string codec = CodecName(video.codec);
    facts.Add("video", codec, {{"codec", codec}, {"fourcc", OrNull(!video.fourcc.empty(), video.fourcc)}});
    const bool avc = !video.config.empty();
    const std::string profile = AvcProfileName(video.config);
    const std::string level = AvcLevelName(video.config);
    facts.Add("  profile", avc ? fmt::format("{}, level {}", profile, level) : "",
              {{"profile", OrNull(avc, profile)}, {"level", OrNull(avc, level)}});
    const auto [width, height] = PictureSizeOf(video);
    facts.Add("  picture size", width != 0 || height != 0 ? fmt::format("{} x {}", width, height) : "",
              {{"width", width}, {"height", height}});
    facts.Add("  frame rate", Quantity(video.frame_rate, "frames/s"), {{"frame_rate", video.frame_rate}});
    const auto last = LastKeyframe(subject);
    facts.Add("  last keyframe", last ? FormatTime(*last) : "",
              {{"last_keyframe_ms", last ? Json(last->count()) : Json()}});
    if (const auto& scan = subject.scan) {
        facts.Add("  frames", fmt::format("{}, {}", scan->videoFrames, Plural(scan->keyframes, "keyframe")),
                  {{"frames", scan->videoFrames}, {"keyframes", scan->keyframes}});
        const bool known = scan->keyframes > 1;
        const Json distance = {{"average", OrNull(known, scan->averageDistanceMs)},
                               {"longest", OrNull(known, scan->longestDistanceMs)}};
        facts.Add("  keyframe distance",
                  known ? fmt::format("{} s on average, {} s at most", Number(scan->averageDistanceMs / 1000),
                                      Number(static_cast<double>(scan->longestDistanceMs) / 1000))
                        : "",
                  {{"keyframe_distance_ms", distance}});
    }
    facts.AddConfig(video.config);
    return facts;
}

Facts AudioFacts(const Subject& subject, const flvdmx::AudioInfo& audio)
{
    Facts facts;
    const std::string codec = CodecName(audio.codec);
    facts.Add("audio", codec, {{"codec", codec}, {"format_tag", audio.format_tag}});
    if (!audio.config.empty()) {
        const AacConfig aac = ParseAacConfig(audio.config);
        facts.Add("  object type", fmt::format("{} ({})", aac.objectType, AacObjectTypeName(aac.objectType)),
                  {{"object_type", aac.objectType}});
        facts.Add("  output rate", aac.outputSampleRate != aac.sampleRate ? Quantity(aac.outputSampleRate, "Hz") : "",
                  {{"output_sample_rate", aac.outputSampleRate}});
    }
    const uint32_t header = HeaderSampleRate(subject.input);
    const uint32_t rate = SampleRate(audio);
    facts.Add("  sample rate",
              header == rate ? fmt::format("{} Hz", rate)
                             : fmt::format("{} Hz (the tag headers state {} Hz)", rate, header),
              {{"sample_rate", rate}, {"header_sample_rate", header}});
    const uint32_t size = IsPcm(audio.codec) ? subject.input.PcmSampleSize() : audio.sample_size;
    facts.Add("  sample size", IsPcm(audio.codec) ? fmt::format("{} bits", size) : "", {{"sample_size", size}});
    facts.Add("  channels", std::to_string(audio.channels), {{"channels", audio.channels}});
    facts.Add("  stated data rate", Quantity(audio.data_rate, "kbit/s"), {{"data_rate_kbit", audio.data_rate}});
    if (subject.scan)
        facts.Add("  frames", std::to_string(subject.scan->audioFrames), {{"frames", subject.scan->audioFrames}});
    facts.AddConfig(audio.config);
    return facts;
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

Facts MetadataFacts(const flvdmx::Metadata& metadata)
{
    Facts facts;
    if (metadata.size() > 0)
        facts.Add("metadata", fmt::format("{} {}", metadata.size(), metadata.size() == 1 ? "property" : "properties"));
    for (const flvdmx::Property& property : metadata) {
        const bool repeated = facts.Object().contains(property.name);
        facts.Add("  " + Printable(property.name), ValueText(property),
                  repeated ? Json::object() : Json{{property.name, ValueOf(property)}});
    }
    return facts;
}

Facts FileFacts(const Subject& subject)
{
    Facts facts;
    const Input& input = subject.input;
    const flvdmx::Info& info = input.info;
    facts.Add("container", "FLV", {{"file", input.name}, {"container", "FLV"}});
    facts.Add("size", fmt::format("{} bytes", info.size), {{"size", info.size}});
    facts.Add("streams", info.video ? info.audio ? "video and audio" : "video only" : "audio only");
    facts.Add("duration", info.duration.count() != 0 ? FormatTime(info.duration) : "unknown",
              {{"duration_ms", info.duration.count()}});
    if (const auto& scan = subject.scan)
        facts.Add("played duration",
                  scan->jumps == 0
                      ? ""
                      : fmt::format("{}, timestamps jump {}", FormatTime(scan->played), Plural(scan->jumps, "time")),
                  {{"played_duration_ms", scan->played.count()}, {"timestamp_restarts", scan->jumps}});
    facts.Add("first timestamp", FormatTime(info.start_time), {{"first_timestamp_ms", info.start_time.count()}});
    const uint64_t rate = DataRate(subject);
    facts.Add("data rate", Quantity(static_cast<double>(rate), "kbit/s"), {{"data_rate_kbit", rate}});
    facts.Add("seek method", TextOf(info.seek_method).text, {{"seek_method", TextOf(info.seek_method).name}});
    const uint32_t entries = IndexEntries(input);
    facts.Add("keyframe index", entries == 0 ? "none" : fmt::format("{} entries", entries),
              {{"index_entries", entries}});
    facts.Add("", "",
              {{"shorter_than_metadata", input.Instance().file_shorter_than_meta != 0},
               {"bytes_behind_last_tag", input.Rest()}});
    if (subject.scan) {
        const auto skipped = static_cast<uint64_t>(subject.scan->bytesSkipped + input.Rest());
        facts.Add("skipped", Plural(skipped, "byte"), {{"bytes_left_out", skipped}});
    }
    if (info.video)
        facts.Add("video", VideoFacts(subject, *info.video));
    if (info.audio)
        facts.Add("audio", AudioFacts(subject, *info.audio));
    for (size_t i = 0; i < STREAMS.size(); ++i)
        if (!subject.notPlayed.at(i).empty())
            facts.Add("", "", {{fmt::format("{}_not_played", StreamName(STREAMS.at(i))), subject.notPlayed.at(i)}});
    facts.Add("metadata", MetadataFacts(subject.metadata));
    return facts;
}

void Warn(const Subject& subject)
{
    const Input& input = subject.input;
    input.WarnIfCutShort();
    if (subject.scan && subject.scan->jumps > 0)
        Complain(input.name, fmt::format("warning: the timestamps jump: the last one is {}, but the frames play for {}",
                                         FormatTime(input.info.duration), FormatTime(subject.scan->played)));
    for (size_t i = 0; i < STREAMS.size(); ++i)
        if (!subject.notPlayed.at(i).empty())
            Complain(input.name, fmt::format("warning: the {} is not played: {}", StreamName(STREAMS.at(i)),
                                             subject.notPlayed.at(i)));
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
    for (size_t i = 0; i < STREAMS.size(); ++i)
        subject.notPlayed.at(i) = WhyNoStream(played, STREAMS.at(i), input);
    Warn(subject);
    const Facts facts = FileFacts(subject);
    if (!options.json)
        Print((first ? "" : "\n") + DisplayName(name) + "\n" + facts.Text());
    return facts.Object();
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
