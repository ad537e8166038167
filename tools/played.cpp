// Which tags of a file are played, and why the others are not.
#include "tools/played.h"

#include <algorithm>
#include <array>
#include <cctype>
#include <string_view>
#include <utility>

#include <fmt/core.h>

#include "tools/codecs.h"
#include "tools/report.h"

namespace tool {

namespace {

constexpr int PROBED_TAGS = 102;         // tags that the library searches for streams
constexpr uint8_t MOST_FRAME_TYPE = 5;   // of video
constexpr uint32_t MOST_SET_BYTES = 128; // of AVC parameter sets, for which the library has room

// False for a tag that only looks enhanced, because its codec byte is damaged.
bool HasFourcc(const Tag& tag)
{
    const std::string_view name = tag.fourcc();
    return tag.is_enhanced() &&
           std::all_of(name.begin(), name.end(), [](unsigned char c) { return std::isalnum(c) != 0; });
}

std::string CodecOf(const Tag& tag)
{
    constexpr std::array<std::array<std::string_view, 2>, 4> NAMES = {
        {{"hvc1", "HEVC, "}, {"av01", "AV1, "}, {"vp09", "VP9, "}, {"avc1", "AVC, "}}};
    if (!HasFourcc(tag))
        return tag.is_video() ? CodecName(tag.video_codec()) : CodecName(tag.audio_codec());
    const auto* const named =
        std::find_if(NAMES.begin(), NAMES.end(), [&](const auto& name) { return name[0] == tag.fourcc(); });
    return fmt::format("enhanced FLV ({}FourCC '{}')", named == NAMES.end() ? "" : (*named)[1], tag.fourcc());
}

// The first tag of a stream that has data, if it is near the beginning, and the number of tags before it.
struct FirstTag {
    std::optional<Tag> tag;
    int number;
};

FirstTag FindFirst(TagReader& reader, flvdmx::Stream stream)
{
    constexpr int MOST_TAGS = 10000; // several minutes
    std::optional<Tag> tag = reader.At(reader.FirstTag());
    for (int number = 0; tag && number < MOST_TAGS; ++number, tag = reader.At(tag->end()))
        if (tag->stream() == stream && tag->data_size() > 0)
            return {tag, number};
    return {std::nullopt, 0};
}

// What is wrong with an AVC configuration that the library rejects.
std::string AvcConfigFault(TagReader& reader, const Tag& tag)
{
    constexpr uint32_t SETS_OFFSET = 6; // of the first set's length in the record
    const uint32_t size = tag.codec_header_size() + SETS_OFFSET + 2;
    const uint8_t* const bytes = tag.data_size() < size ? nullptr : reader.Bytes(tag.data_position(), size);
    if (bytes == nullptr)
        return "its AVC configuration is cut short";
    if (BigEndian(bytes + size - 2, 2) > MOST_SET_BYTES || tag.data_size() > MOST_SET_BYTES + tag.codec_header_size())
        return fmt::format("its AVC parameter sets are larger than the supported {} bytes", MOST_SET_BYTES);
    return "its AVC configuration is damaged";
}

std::string WhyNotFound(TagReader& reader, const FirstTag& first)
{
    const Tag& tag = *first.tag;
    if (tag.end() > reader.FileSize())
        return "its first tag is cut short";
    const uint8_t* const back = reader.Bytes(tag.data_end(), Tag::back_pointer_size);
    if (back == nullptr || BigEndian(back, Tag::back_pointer_size) != tag.data_size() + Tag::header_size)
        return "the back-pointer of its first tag is wrong";
    if (tag.is_enhanced())
        return HasFourcc(tag) ? "it is " + CodecOf(tag)
                              : fmt::format("its first tag has an invalid codec byte: 0x{:02x}", tag.codec_byte());
    if (first.number >= PROBED_TAGS)
        return fmt::format("it starts after the first {} tags, the only ones that are searched for streams",
                           PROBED_TAGS);
    if (!tag.is_avc())
        return fmt::format("its first tag, {}, has no valid codec header", CodecOf(tag));
    return tag.is_config() ? AvcConfigFault(reader, tag) : "it does not start with its AVC configuration";
}

} // namespace

Played::Played(const Input& input, TagReader::Progress progress)
    : m_input(input), m_reader(input.name, input.file.instance(), std::move(progress)), m_end(m_reader.FirstTag())
{
}

void Played::Walk(const std::function<bool(const Tag&)>& see)
{
    m_reader.Walk(m_reader.FirstTag(), m_input.Instance().data_end,
                  [&](const Part& part) { return CountIfSkipped(part) || see(part.tag); });
}

void Played::Take(const flvdmx::Frame& frame)
{
    if (frame.position < 0)
        return;
    Inspect(frame.position);
    m_end = m_input.file.position();
}

// Usually there is nothing between two frames; otherwise there are configurations, script data, tags that are not
// played, or damage.
void Played::Inspect(int64_t end)
{
    m_reader.Walk(m_end, end, [this](const Part& part) {
        if (!CountIfSkipped(part) && part.tag.has_frame()) // a long damage before it has confused the library
            m_damage.Add(part, "");
        return true;
    });
}

void Played::Loss::Add(const Part& part, const std::string& reason)
{
    if (bytes == 0) {
        first = part.begin;
        why = reason;
    }
    bytes += part.Size();
}

// A wrong back-pointer does not matter after script data at the beginning.
bool Played::CountIfSkipped(const Part& part)
{
    const bool isFirstScript =
        part.kind == Part::Kind::unlinked && part.begin == m_reader.FirstTag() && part.tag.is_script();
    if (part.kind != Part::Kind::tag && !isFirstScript) {
        m_damage.Add(part, "");
        return true;
    }
    const std::string why = WhyNot(part.tag);
    if (!why.empty())
        m_unplayed.Add(part, why);
    return !why.empty();
}

void Played::Warn() const
{
    const auto bytes = [](const Loss& loss) { return Plural(static_cast<uint64_t>(loss.bytes), "byte"); };
    if (m_damage.bytes > 0)
        Complain(m_input.name, fmt::format("warning: skipped {} without a valid tag, the first at byte {}",
                                           bytes(m_damage), m_damage.first));
    if (m_unplayed.bytes > 0)
        Complain(m_input.name, fmt::format("warning: skipped {} of tags, the first at byte {}: {}", bytes(m_unplayed),
                                           m_unplayed.first, m_unplayed.why));
}

std::string Played::WhyNot(const Tag& tag)
{
    if (tag.is_script())
        return "";
    if (!m_input.Has(tag.stream())) {
        const std::string& why = WhyNoStream(tag.stream());
        return fmt::format("the {} is not played{}{}", StreamName(tag.stream()), why.empty() ? "" : ": ", why);
    }
    return tag.data_size() == 0 ? "it is empty" : WhyNotInStream(tag);
}

std::string Played::WhyNotInStream(const Tag& tag) const
{
    const uint8_t codec = tag.codec_byte();
    const bool sameCodec = tag.is_video() ? tag.video_codec() == m_input.info.video->codec
                                          : tag.audio_codec() == m_input.info.audio->codec;
    if (tag.is_video() && codec >> 4 > MOST_FRAME_TYPE && !HasFourcc(tag))
        return fmt::format("its codec byte is invalid: 0x{:02x}", codec);
    if (!sameCodec || tag.is_enhanced())
        return fmt::format("it has another codec than the {} stream: {}", StreamName(tag.stream()), CodecOf(tag));
    if (tag.is_audio() && codec != m_input.audioFormat)
        return fmt::format("it has another codec byte than the audio stream: 0x{:02x} instead of 0x{:02x}", codec,
                           m_input.audioFormat);
    if (m_input.Instance().last_ts != 0 && tag.timestamp() > m_input.Instance().last_ts)
        return "it is later than the last timestamp of the file";
    return tag.data_size() < tag.codec_header_size() ? "it is too short for a frame" : "";
}

const std::string& Played::WhyNoStream(flvdmx::Stream stream)
{
    std::optional<std::string>& why = m_noStream.at(IndexOf(stream));
    if (!why) {
        const FirstTag first = m_input.Has(stream) ? FirstTag{} : FindFirst(m_reader, stream);
        why = first.tag ? WhyNotFound(m_reader, first) : "";
    }
    return *why;
}

// Tests AVC as the library tests the first configuration, without which it does not find the stream.
bool IsValidConfig(flvdmx::Stream stream, flvdmx::Bytes config)
{
    constexpr auto AVC = static_cast<int32_t>(flvdmx::VideoCodec::avc);
    if (stream == flvdmx::Stream::audio)
        return config.size() > 1;
    const std::vector<uint8_t> sets = AvcParameterSets(config);
    flvd_video_info_t picture{};
    return !sets.empty() && sets.size() <= MOST_SET_BYTES &&
           FLVD_ParseVideoHeader(AVC, sets.data(), static_cast<int32_t>(sets.size()), &picture) == 0;
}

std::optional<Tag> FindStart(TagReader& reader, flvdmx::Stream stream)
{
    std::optional<Tag> start;
    bool found = false;
    reader.Walk(reader.FirstTag(), reader.FileSize(), [&](const Part& part) {
        const Tag& tag = part.tag;
        if (part.kind != Part::Kind::tag || tag.stream() != stream || tag.data_size() == 0 || tag.is_enhanced())
            return true;
        const bool needsConfig = tag.is_avc() || tag.is_aac();
        found = !needsConfig || (tag.is_config() && IsValidConfig(stream, reader.Config(tag)));
        if (found || (!start && tag.is_aac()))
            start = tag;
        return !found;
    });
    return start;
}

// AVC needs no check here: without its configuration, the stream is not found at all.
std::string ConfigFault(const Input& input)
{
    const bool missing =
        input.info.audio && input.info.audio->codec == flvdmx::AudioCodec::aac && input.info.audio->config.empty();
    return missing ? "the audio does not start with its AAC configuration, without which it cannot be decoded" : "";
}

std::string UndefinedCodec(const Input& input)
{
    std::string codec;
    if (input.info.video && flvdmx::name(input.info.video->codec) == std::string("unknown"))
        codec = "video's codec, " + CodecName(input.info.video->codec);
    else if (input.info.audio && flvdmx::name(input.info.audio->codec) == std::string("unknown"))
        codec = "audio's codec, " + CodecName(input.info.audio->codec);
    return codec.empty()
               ? codec
               : fmt::format("the {}, is not defined by FLV: its frames contain everything after the codec byte",
                             codec);
}

// FLAGS of the file header (FLV file format, version 10.1, annex E.2).
uint32_t AnnouncedStreams(TagReader& reader)
{
    constexpr uint32_t FLAGS_OFFSET = 4;
    constexpr uint8_t VIDEO_FLAG = 0x01;
    constexpr uint8_t AUDIO_FLAG = 0x04;
    const uint8_t* const bytes = reader.Bytes(FLAGS_OFFSET, 1);
    const uint8_t flags = bytes != nullptr ? *bytes : 0;
    return ((flags & VIDEO_FLAG) != 0 ? uint32_t{FLVD_STREAM_VIDEO} : 0) |
           ((flags & AUDIO_FLAG) != 0 ? uint32_t{FLVD_STREAM_AUDIO} : 0);
}

void RequireStream(const Input& input, uint32_t streams)
{
    if ((input.Streams() & streams) != 0)
        return;
    const auto stream = static_cast<flvdmx::Stream>(streams);
    const std::string why = Played(input).WhyNoStream(stream);
    throw FileError(input.name, fmt::format("the file has no {} stream{}", StreamName(stream),
                                            why.empty() ? "" : " that is played: " + why));
}

void WarnOfUnplayed(const Input& input, uint32_t streams)
{
    Played played(input);
    for (const flvdmx::Stream stream : STREAMS)
        if (const std::string& why = played.WhyNoStream(stream);
            !why.empty() && (streams & static_cast<uint32_t>(stream)) != 0)
            Complain(input.name, fmt::format("warning: the {} is not played: {}", StreamName(stream), why));
}

// Without a restart, the times of each stream rise through the file and do not exceed the last one.
bool SeemsToRestart(const Input& input)
{
    constexpr int64_t SAMPLES = 16;
    constexpr int64_t NEAR = 1 << 20; // bytes; inside a larger tag, no sample is found
    constexpr uint32_t JITTER_MS = 2000;
    flvdmx::Options options;
    options.restarting_timestamps = true;
    const Input any(input.name, options);
    TagReader reader(any.name, any.file.instance());
    std::array<uint32_t, 2> latest{}; // of video and audio
    for (int64_t i = 1; i < SAMPLES; ++i) {
        const int64_t position = input.info.size / SAMPLES * i;
        const std::optional<Tag> tag = reader.Find(position, position + NEAR);
        if (!tag || tag->is_script())
            continue;
        uint32_t& time = latest.at(IndexOf(tag->stream()));
        if (tag->timestamp() + JITTER_MS < time || tag->timestamp() > input.Instance().last_ts + JITTER_MS)
            return true;
        time = std::max(time, tag->timestamp());
    }
    return false;
}

void WarnOfRestarts(const Input& input)
{
    if (SeemsToRestart(input))
        Complain(input.name, "warning: the timestamps jump, so a seek may land in the wrong part of the file: 'flvdmx "
                             "repair' makes them continuous");
}

// If no stream was found, there is a reason for each. If a stream was found but none of its frames, the file is
// enhanced FLV, or damaged in a way that is not known here.
std::string WhyNothingIsPlayed(const std::string& name, int32_t code)
{
    std::string text;
    if (code != FLVD_ERR_NO_STREAM && code != FLVD_ERR_EXTENT)
        return text;
    TagReader reader(name);
    for (const flvdmx::Stream stream : STREAMS) {
        const FirstTag first = FindFirst(reader, stream);
        if (first.tag && (code == FLVD_ERR_NO_STREAM || first.tag->is_enhanced()))
            text += fmt::format("; {}: {}", StreamName(stream), WhyNotFound(reader, first));
    }
    return text.empty() ? text : "no stream can be played" + text;
}

} // namespace tool
